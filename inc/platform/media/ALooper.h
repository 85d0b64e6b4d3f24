// ALooper: a named thread that runs posted work in order, as the platform codec's
// looper does. A codec posts its decoding loop here for as long as it is started,
// so one looper serves one started codec at a time.
//
// Threads: post, start and stop may be called from any thread; the work runs on
// the looper's own thread, which is named after the looper.
#pragma once

#include <deque>
#include <functional>

#include <utils/Condition.h>
#include <utils/Errors.h>
#include <utils/Mutex.h>
#include <utils/RefBase.h>
#include <utils/StrongPointer.h>
#include <utils/Thread.h>

#include "platform/media/AString.h"

namespace android {

class ALooper : public RefBase {
public:
    ALooper() = default;
    ~ALooper() override;
    ALooper(const ALooper&) = delete;
    ALooper& operator=(const ALooper&) = delete;

    void setName(const char* name);
    const char* getName() const { return mName.c_str(); }

    // Starts the thread; the two flags and the priority exist for the platform's
    // signature and are not used. INVALID_OPERATION when it already runs.
    status_t start(bool runOnCallingThread = false, bool canCallJava = false, int32_t priority = 0);
    // Runs what is queued, then joins the thread. Work posted later is dropped.
    status_t stop();

    // Queues `work` to run on the looper's thread after everything posted before.
    // INVALID_OPERATION when the looper is not running.
    status_t post(std::function<void()> work);

private:
    class LooperThread : public Thread {
    public:
        // The looper outlives its thread (stop() and the destructor join it).
        explicit LooperThread(ALooper* looper) : Thread(false), mLooper(looper) {}

    private:
        status_t readyToRun() override;
        bool threadLoop() override;
        ALooper* mLooper;
    };

    // One turn of the thread: runs the next work item or waits (at most 100 ms).
    bool loopOnce();

    AString mName{"ALooper"};
    Mutex mLock;
    Condition mQueueChanged;
    std::deque<std::function<void()>> mQueue;  // guarded by mLock
    sp<LooperThread> mThread;                  // set and cleared by start/stop
    bool mStopping = false;                    // guarded by mLock
};

}  // namespace android
