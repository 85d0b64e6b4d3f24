// VideoRenderer: the last module of the video chain. Its thread takes decoded-frame
// records (VideoFrameData) from the input ring, waits until each frame's PTS is due
// on the shared clock, and has the frame shown or dropped through the frame's own
// listener (the decoder that owns the picture buffer). It guards against frames far
// too early or too late (more than 10 s either way resets the clock), against broken
// PTS sequences (a step of 25 times the smallest step seen), and serves capture
// series requested by getFrame.
//
// Threads:
//   - the controller's threads: start, stop, getFrame, the setters and dump; start
//     and stop serialise on mLock; getFrame and the capture fields use mCaptureLock;
//   - "VideoRenderer": render(), one frame per call; the only reader of the input
//     ring, the only caller of the frame listener's renderFrame and captureFrame,
//     and the only user of the PTS-history fields (mLastPTS, mPTSError,
//     mIDRWaitStart, mDetectedDeltaPTS) while it runs.
// The output-enabled flag, the A/V offset and the listener pointers are written by
// the controller and read by the render thread; they are atomics so that a stale
// read is the only risk.
#pragma once

#include <time.h>

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <mutex>

#include <utils/StrongPointer.h>
#include <utils/Thread.h>

#include "common/Module.h"
#include "common/Synchronization.h"
#include "common/Uint33.h"
#include "common/data/VideoFrameData.h"

namespace TavoPlayer {

class CaptureFrameListener;

class VideoRenderer : public Module {
public:
    // Upward reports, implemented by the controller; called on the render thread.
    class FrameRenderedListener {
    public:
        virtual ~FrameRenderedListener() = default;
        // Every frame that was not dropped, whether or not output is enabled.
        virtual void onFrameRendered(int width, int height, Uint33 pts) = 0;
        virtual void onFirstFrameRendered(int width, int height) = 0;
    };

    // A Uint33 or detected delta with every bit set: "none".
    static constexpr Uint33 kNoPTS = ~0ull;
    static constexpr uint64_t kNoDelta = ~0ull;
    // A frame later than this is shown at once rather than dropped (ms, negative).
    static constexpr int32_t kLateShownMs = -999;
    // Waits beyond these are bad rendering times (ms).
    static constexpr int32_t kMaxWaitMs = 10000;
    static constexpr int32_t kHugeWaitMs = 10001;
    // A PTS step of this many times the smallest step seen is a PTS error.
    static constexpr uint64_t kDeltaErrorFactor = 25;
    // Without a key frame, skipping after a PTS error ends after 1 s of PTS.
    static constexpr uint64_t kIDRWaitTicks = 90000;
    static constexpr int kCaptureRetries = 3;
    // Long waits are slept in slices, so that stop is seen within one slice.
    static constexpr int32_t kSleepSliceMs = 100;
    // "Display" priority of the platform, for the render thread.
    static constexpr int kDisplayPriority = -4;

    enum State : uint32_t {
        STATE_CREATED = 0,
        STATE_STOPPED = 1,
        STATE_STARTED = 2,
    };

    explicit VideoRenderer(android::sp<Synchronization>& clock);
    // As above, reading monotonic time (for captures) from `monotonic`, so that a
    // test can control it; the clock's own time source is the clock's business.
    VideoRenderer(android::sp<Synchronization>& clock, Synchronization::MonotonicClock monotonic);
    ~VideoRenderer() override;

    unsigned int start() override;
    unsigned int stop() override;
    // Starts a series of `count` captures `intervalMs` apart, the first with the
    // next frame; ignored while a series runs. Returns 0.
    virtual unsigned int getFrame(int count, int intervalMs);
    unsigned int dump(FILE* stream, int indent) override;

    // Frames are shown only while output is enabled (dropped otherwise).
    void setOutputEnable(bool enable) { mOutputEnabled.store(enable); }
    bool isOutputEnabled() const { return mOutputEnabled.load(); }
    // Added to every wait, in ms (positive: frames are shown later).
    void setAVSync(int offsetMs) { mAVOffsetMs.store(offsetMs); }
    int getAVSync() const { return mAVOffsetMs.load(); }
    // Listeners are not owned: each must outlive the renderer or be replaced by null.
    void setCaptureFrameListener(CaptureFrameListener* listener) {
        mCaptureListener.store(listener);
    }
    void setFrameRenderedListener(FrameRenderedListener* listener) {
        mFrameRenderedListener.store(listener);
    }

    // One frame of the render thread. Public so that a test can drive frames itself
    // while the thread is not running.
    void render();
    // Watches the PTS sequence of the frames in the order they arrive.
    void checkDeltaPTSError(VideoFrameData& frame);

    // State for tests and the dump.
    uint32_t state() const { return mState.load(); }
    bool isPTSError() const { return mPTSError; }
    uint64_t detectedDeltaPTS() const { return mDetectedDeltaPTS; }
    int captureCount();

private:
    class RenderThread : public android::Thread {
    public:
        // The renderer owns this thread and outlives it (stop() joins it).
        explicit RenderThread(VideoRenderer* renderer)
            : android::Thread(false), mRenderer(renderer) {}

    private:
        android::status_t readyToRun() override;
        bool threadLoop() override;
        VideoRenderer* mRenderer;
    };

    // Monotonic time in ms; false when the clock cannot be read.
    bool nowMs(int64_t* ms);
    // Sleeps `ms` in slices; false when stop was requested first.
    bool sleepUnlessStopped(int32_t ms);
    // The capture step for one frame that is about to be shown.
    void captureIfDue(VideoFrameData& frame);
    // Drops what the ring holds after a record that claims more than is readable.
    void discardInconsistent(uint32_t claimed, uint32_t readable);

    android::sp<Synchronization> mClock;
    Synchronization::MonotonicClock mMonotonic;
    android::sp<RenderThread> mRenderThread;  // guarded by mLock
    std::atomic<bool> mStopRequested;
    std::atomic<uint32_t> mState;
    std::mutex mLock;
    std::atomic<bool> mOutputEnabled;
    std::atomic<int32_t> mAVOffsetMs;

    // Capture series: set by getFrame, advanced by the render thread.
    std::mutex mCaptureLock;
    std::atomic<CaptureFrameListener*> mCaptureListener;
    int32_t mCaptureCount;
    int32_t mCaptureRetries;
    int32_t mCaptureIntervalMs;
    int64_t mNextCaptureTimeMs;

    std::atomic<FrameRenderedListener*> mFrameRenderedListener;

    // PTS history; render thread only while it runs, reset by start().
    Uint33 mLastPTS;
    bool mPTSError;
    Uint33 mIDRWaitStart;
    uint64_t mDetectedDeltaPTS;

    // Wakes a sliced sleep at once when stop is requested.
    std::mutex mSleepLock;
    std::condition_variable mSleepWake;
};

}  // namespace TavoPlayer
