// ClosedCaptionRenderer: the last module of the caption chain. It reads the caption
// records written by the caption decoder, holds each until the stream clock reaches
// its PTS (plus the user's caption delay) and hands the text to the registered
// ClosedCaptionListener while delivery is enabled.
//
// Threads: the controller calls start, stop, setCaptionSync, registerListener and
// setEnabled; the worker "CCWorkerThreadRenderer" runs renderFrame, holding
// mRenderLock for a whole round, timed wait included (the wait releases it).
// mCaptionSync and mListener are written without a lock: a change applies from
// the next caption.
#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <mutex>

#include <utils/StrongPointer.h>
#include <utils/Thread.h>

#include "common/Module.h"
#include "common/Synchronization.h"
#include "platform/os/ThreadName.h"
#include "renderer/ClosedCaptionListener.h"

namespace TavoPlayer {

class ClosedCaptionRenderer : public Module {
public:
    // A caption due this far ahead of the clock, or more, is not waited for.
    static constexpr int64_t kMaxWaitMs = 3000;

    explicit ClosedCaptionRenderer(android::sp<Synchronization> synchronization);
    ~ClosedCaptionRenderer() override;

    unsigned int start() override;
    unsigned int stop() override;
    unsigned int dump(FILE* stream, int indent) override;

    void setCaptionSync(int ms);
    // Not owned: the listener must outlive the renderer or be replaced first.
    void registerListener(ClosedCaptionListener* listener);
    // The delivery switch; while 0, captions are read, timed and discarded.
    void setEnabled(uint32_t enabled) { mEnabled.store(enabled); }
    uint32_t isEnabled() const { return mEnabled.load(); }

    // One round of the worker: at most one caption.
    void renderFrame();

protected:
    // Waits on mWakeCondition for `waitMs` (a deadline on the monotonic clock) or
    // until stop; `lock` holds mRenderLock. Tests replace it to see the waits
    // without sleeping.
    virtual void waitFor_l(std::unique_lock<std::mutex>& lock, int64_t waitMs);

private:
    class WorkerThread : public android::Thread {
    public:
        // The renderer owns this thread and outlives it (stop() joins it).
        explicit WorkerThread(ClosedCaptionRenderer* renderer)
            : android::Thread(false), mRenderer(renderer) {}

    private:
        android::status_t readyToRun() override {
            setCurrentThreadName("CCWorkerThreadRenderer");
            return android::OK;
        }
        bool threadLoop() override {
            mRenderer->renderFrame();
            return true;
        }
        ClosedCaptionRenderer* mRenderer;
    };

    // Milliseconds until `pts` is due on the clock, truncated toward zero; 0 when no
    // source drives the clock.
    int64_t delayUntil(uint64_t pts);

    android::sp<Synchronization> mSynchronization;
    std::atomic<ClosedCaptionListener*> mListener;
    std::atomic<int32_t> mCaptionSync;
    std::condition_variable mWakeCondition;  // steady_clock: the monotonic clock
    std::atomic<uint32_t> mEnabled;
    std::mutex mRenderLock;
    android::sp<WorkerThread> mWorkerThread;
    // Set by stop before it breaks the timed wait, so that a wait about to begin
    // does not begin.
    std::atomic<bool> mStopping;
};

}  // namespace TavoPlayer
