// ProcessState: the process's binder state: its live connections and the small pool
// of binder threads that runs incoming transactions and death notifications.
//
// Pool threads are started on demand, up to the maximum (4 unless set), and wait
// for work 100 ms at a time. A thread that calls joinThreadPool() serves as one more
// pool thread until shutdown(). shutdown() hangs up every connection, stops the
// service listeners, lets the pool finish queued work and joins it; afterwards the
// process may use binder again.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <mutex>
#include <set>
#include <thread>
#include <vector>

#include <utils/Errors.h>
#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

namespace android {

class Connection;

class ProcessState : public virtual RefBase {
public:
    static sp<ProcessState> self();

    // Kept for clients written against the platform; threads start on demand.
    void startThreadPool();
    status_t setThreadPoolMaxThreadCount(size_t maxThreads);
    // Serves transactions on the calling thread until shutdown().
    void joinThreadPool();
    void shutdown();

    // Runs `task` on a binder thread. Dropped after shutdown began.
    void post(std::function<void()> task);

    void addConnection(const sp<Connection>& connection);
    void removeConnection(Connection* connection);
    size_t connectionCount() const;

private:
    ProcessState() = default;
    void workerLoop(bool joined);

    mutable std::mutex mLock;  // guards everything below
    std::condition_variable mWork;
    std::deque<std::function<void()>> mTasks;
    std::vector<std::thread> mThreads;
    size_t mMaxThreads = 4;
    size_t mIdle = 0;
    size_t mJoined = 0;
    bool mStopping = false;
    std::set<sp<Connection>> mConnections;
};

}  // namespace android
