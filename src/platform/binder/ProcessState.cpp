#include "platform/binder/ProcessState.h"

#include <pthread.h>

#include <chrono>

#include "platform/binder/Connection.h"
#include "platform/binder/SocketServiceManager.h"

namespace android {

namespace {
constexpr auto kWorkWaitStep = std::chrono::milliseconds(100);
// Set on a thread inside joinThreadPool(): its own shutdown() must not wait for it.
thread_local bool tJoined = false;
}  // namespace

sp<ProcessState> ProcessState::self() {
    // Never destroyed: binder threads may still run while the process exits.
    static ProcessState* const gProcess = [] {
        auto* process = new ProcessState();
        process->incStrong(nullptr);
        return process;
    }();
    return gProcess;
}

void ProcessState::startThreadPool() {}

status_t ProcessState::setThreadPoolMaxThreadCount(size_t maxThreads) {
    if (maxThreads == 0)
        return BAD_VALUE;
    std::lock_guard<std::mutex> lock(mLock);
    mMaxThreads = maxThreads;
    return OK;
}

void ProcessState::post(std::function<void()> task) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mStopping)
        return;
    mTasks.push_back(std::move(task));
    if (mIdle == 0 && mThreads.size() < mMaxThreads)
        mThreads.emplace_back([this] { workerLoop(false); });
    mWork.notify_one();
}

void ProcessState::workerLoop(bool joined) {
    pthread_setname_np(pthread_self(), "BinderThread");
    std::unique_lock<std::mutex> lock(mLock);
    ++mIdle;
    for (;;) {
        if (mTasks.empty()) {
            if (mStopping)
                break;
            mWork.wait_for(lock, kWorkWaitStep);
            continue;
        }
        std::function<void()> task = std::move(mTasks.front());
        mTasks.pop_front();
        --mIdle;
        lock.unlock();
        task();
        task = nullptr;  // its captures go before the lock is taken again
        lock.lock();
        ++mIdle;
    }
    --mIdle;
    if (joined)
        --mJoined;
}

void ProcessState::joinThreadPool() {
    {
        std::lock_guard<std::mutex> lock(mLock);
        ++mJoined;
    }
    tJoined = true;
    workerLoop(true);
    tJoined = false;
}

void ProcessState::shutdown() {
    SocketServiceManager::self()->stopServing();
    std::set<sp<Connection>> connections;
    {
        std::lock_guard<std::mutex> lock(mLock);
        connections = mConnections;
    }
    for (const sp<Connection>& connection : connections)
        connection->hangUp();
    for (const sp<Connection>& connection : connections)
        connection->join();
    connections.clear();
    std::vector<std::thread> threads;
    {
        std::lock_guard<std::mutex> lock(mLock);
        mStopping = true;
        threads.swap(mThreads);
        mWork.notify_all();
    }
    const auto me = std::this_thread::get_id();
    for (std::thread& thread : threads) {
        if (thread.get_id() == me)
            thread.detach();  // shutdown from a binder thread: it ends when it returns
        else
            thread.join();
    }
    // Joined threads leave their loops on their own; wait for them before reuse.
    for (;;) {
        std::unique_lock<std::mutex> lock(mLock);
        if (mJoined == (tJoined ? 1u : 0u)) {
            mStopping = false;
            mIdle = 0;
            break;
        }
        mWork.notify_all();
        lock.unlock();
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
}

void ProcessState::addConnection(const sp<Connection>& connection) {
    std::lock_guard<std::mutex> lock(mLock);
    mConnections.insert(connection);
}

void ProcessState::removeConnection(Connection* connection) {
    sp<Connection> dropped;  // released outside the lock
    std::lock_guard<std::mutex> lock(mLock);
    for (auto it = mConnections.begin(); it != mConnections.end(); ++it) {
        if (it->get() == connection) {
            dropped = *it;
            mConnections.erase(it);
            break;
        }
    }
}

size_t ProcessState::connectionCount() const {
    std::lock_guard<std::mutex> lock(mLock);
    return mConnections.size();
}

}  // namespace android
