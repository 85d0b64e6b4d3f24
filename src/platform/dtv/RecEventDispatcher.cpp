#include "platform/dtv/RecEventDispatcher.h"

#include <pthread.h>

namespace TavoPlayer {

RecEventDispatcher::RecEventDispatcher() : mThread([this] { run(); }) {}

RecEventDispatcher::~RecEventDispatcher() {
    {
        std::lock_guard<std::mutex> lock(mLock);
        mStop = true;
        mChanged.notify_all();
    }
    mThread.join();
}

void RecEventDispatcher::post(RecPlayerEventCallback callback, void* userData, int event) {
    if (callback == nullptr)
        return;
    std::lock_guard<std::mutex> lock(mLock);
    mQueue.push_back({callback, userData, event});
    ++mPosted;
    mChanged.notify_all();
}

bool RecEventDispatcher::drain(std::chrono::milliseconds timeout) {
    std::unique_lock<std::mutex> lock(mLock);
    const uint64_t target = mPosted;
    return mChanged.wait_for(lock, timeout, [&] { return mDelivered >= target; });
}

void RecEventDispatcher::forget(void* userData) {
    std::unique_lock<std::mutex> lock(mLock);
    for (auto it = mQueue.begin(); it != mQueue.end();) {
        if (it->userData == userData) {
            it = mQueue.erase(it);
            ++mDelivered;  // counted as done, so that drain() still finishes
        } else {
            ++it;
        }
    }
    if (std::this_thread::get_id() == mThread.get_id())
        return;
    while (mInFlight == userData && userData != nullptr)
        mChanged.wait_for(lock, std::chrono::milliseconds(100));
}

uint64_t RecEventDispatcher::delivered() const {
    std::lock_guard<std::mutex> lock(mLock);
    return mDelivered;
}

void RecEventDispatcher::run() {
    pthread_setname_np(pthread_self(), "RecPlayerEvents");
    std::unique_lock<std::mutex> lock(mLock);
    for (;;) {
        // 100 ms waits on the monotonic clock, as every wait of the service.
        mChanged.wait_for(lock, std::chrono::milliseconds(100),
                          [this] { return mStop || !mQueue.empty(); });
        if (mQueue.empty()) {
            if (mStop)
                return;
            continue;
        }
        const Event e = mQueue.front();
        mQueue.pop_front();
        mInFlight = e.userData;
        lock.unlock();
        e.callback(e.event, e.userData);
        lock.lock();
        mInFlight = nullptr;
        ++mDelivered;
        mChanged.notify_all();
    }
}

}  // namespace TavoPlayer
