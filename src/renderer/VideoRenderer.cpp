#include "renderer/VideoRenderer.h"

#include <pthread.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string>

#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

bool readMonotonic(timespec* now) {
    return clock_gettime(CLOCK_MONOTONIC, now) == 0;
}

// libutils' thread drops its own strong reference just after join() returns; the
// joiner waits for that so that it, not the exiting thread, destroys the thread
// object (ThreadSanitizer cannot see libutils' reference counts).
// Takes the thread itself: an sp<> of another type made for the call would hold
// a reference of its own.
void waitForLastReference(android::Thread* thread) {
    for (int i = 0; i < 10000 && thread->getStrongCount() > 1; ++i)
        usleep(100);
    thread->isRunning();  // takes the thread's lock: orders its last unlock before us
}

}  // namespace

android::status_t VideoRenderer::RenderThread::readyToRun() {
    pthread_setname_np(pthread_self(), "VideoRenderer");
    // The platform's display priority. Raising a thread's priority needs
    // CAP_SYS_NICE on Linux; without it the thread runs at the normal one.
    if (setpriority(PRIO_PROCESS, static_cast<id_t>(gettid()), kDisplayPriority) != 0)
        TAVO_LOGD("%s: display priority not available: %s\n", __func__, strerror(errno));
    return android::NO_ERROR;
}

bool VideoRenderer::RenderThread::threadLoop() {
    if (exitPending())
        return false;
    mRenderer->render();
    return true;
}

VideoRenderer::VideoRenderer(android::sp<Synchronization>& clock)
    : VideoRenderer(clock, Synchronization::MonotonicClock()) {}

VideoRenderer::VideoRenderer(android::sp<Synchronization>& clock,
                             Synchronization::MonotonicClock monotonic)
    : Module("VideoRenderer"),
      mClock(clock),
      mMonotonic(monotonic ? std::move(monotonic) : Synchronization::MonotonicClock(readMonotonic)),
      mStopRequested(false),
      mState(STATE_CREATED),
      mOutputEnabled(false),
      mAVOffsetMs(0),
      mCaptureListener(nullptr),
      mCaptureCount(0),
      mCaptureRetries(0),
      mCaptureIntervalMs(0),
      mNextCaptureTimeMs(0),
      mFrameRenderedListener(nullptr),
      mLastPTS(kNoPTS),
      mPTSError(false),
      mIDRWaitStart(kNoPTS),
      mDetectedDeltaPTS(kNoDelta) {}

VideoRenderer::~VideoRenderer() {
    stop();
}

unsigned int VideoRenderer::start() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mRenderThread != nullptr)
        return OK;
    // Each start forgets the PTS history, so that the first frame after a resume
    // never counts as a PTS error. Done only while no thread runs, since the render
    // thread owns these fields.
    mPTSError = false;
    mLastPTS = kNoPTS;
    mIDRWaitStart = kNoPTS;
    mDetectedDeltaPTS = kNoDelta;
    mStopRequested.store(false);
    mState.store(STATE_STARTED);
    mRenderThread = new RenderThread(this);
    if (mRenderThread->run("VideoRenderer", kDisplayPriority) != android::OK) {
        TAVO_LOGE("%s unable to start rendering thread\n", "start");
        mRenderThread.clear();
        return REFUSED;
    }
    return OK;
}

unsigned int VideoRenderer::stop() {
    std::lock_guard<std::mutex> lock(mLock);
    if (mRenderThread != nullptr) {
        {
            std::lock_guard<std::mutex> sleepLock(mSleepLock);
            mStopRequested.store(true);
        }
        mSleepWake.notify_all();
        mRenderThread->requestExit();
        // The thread may wait for data on the input ring (at most 100 ms); the
        // wake-ups cut that short.
        if (mInput != nullptr)
            mInput->wakeAll();
        mRenderThread->join();
        waitForLastReference(mRenderThread.get());
        mRenderThread.clear();
    }
    mState.store(STATE_STOPPED);
    return OK;
}

unsigned int VideoRenderer::getFrame(int count, int intervalMs) {
    std::lock_guard<std::mutex> lock(mCaptureLock);
    if (mCaptureCount != 0)
        return OK;
    mCaptureIntervalMs = intervalMs;
    mCaptureRetries = kCaptureRetries;
    mCaptureCount = count;
    int64_t now = 0;
    if (!nowMs(&now)) {
        TAVO_LOGE("%s: Error getting time: %s (%d)\n", "getFrame", strerror(errno), errno);
    } else {
        mNextCaptureTimeMs = now;
    }
    return OK;
}

int VideoRenderer::captureCount() {
    std::lock_guard<std::mutex> lock(mCaptureLock);
    return mCaptureCount;
}

bool VideoRenderer::nowMs(int64_t* ms) {
    timespec now{};
    if (!mMonotonic(&now))
        return false;
    *ms = static_cast<int64_t>(now.tv_sec) * 1000 + now.tv_nsec / 1'000'000;
    return true;
}

bool VideoRenderer::sleepUnlessStopped(int32_t ms) {
    std::unique_lock<std::mutex> lock(mSleepLock);
    while (ms > 0) {
        if (mStopRequested.load())
            return false;
        const int32_t slice = ms > kSleepSliceMs ? kSleepSliceMs : ms;
        mSleepWake.wait_for(lock, std::chrono::milliseconds(slice),
                            [this] { return mStopRequested.load(); });
        ms -= slice;
    }
    return !mStopRequested.load();
}

void VideoRenderer::discardInconsistent(uint32_t claimed, uint32_t readable) {
    // A record longer than what the ring holds (or of no length) cannot be skipped
    // by its size without passing the writer. The writer commits whole records, so
    // everything readable ends on a record boundary: dropping it all resynchronises
    // the reader with the next record written.
    TAVO_LOGE("%s: RingBuffer inconsistency (record of %u bytes, %u readable); dropping %u bytes\n",
              "render", claimed, readable, readable);
    mInput->consume(readable);
}

void VideoRenderer::render() {
    const android::sp<RingBuffer> input = mInput;
    if (input == nullptr) {
        sleepUnlessStopped(kSleepSliceMs);
        return;
    }
    if (!input->waitForData(VideoFrameData::kRecordSize))
        return;

    // Records advance in steps of 4 bytes, so the 8-byte fields of one may sit at
    // an address that is 4 mod 8: fields are read with byte copies.
    const uint8_t* at = input->readPointer();
    uint32_t type = 0;
    uint32_t size = 0;
    memcpy(&type, at + 8, sizeof(type));
    memcpy(&size, at + 12, sizeof(size));
    const uint32_t readable = input->usedSpace();
    if (size == 0 || size > readable) {
        discardInconsistent(size, readable);
        return;
    }
    if (type != Data::TYPE_VIDEO_FRAME || size < VideoFrameData::kRecordSize) {
        TAVO_LOGE("%s: frame is not a video format", "render");
        input->consume(size);
        onError(ERROR_RENDERER_WRONG_RECORD);
        return;
    }

    // The record is copied and released at once, so that the decoder can go on
    // while this frame waits; the picture stays in the decoder's buffer. The copy
    // keeps its own dispatch header: only the fields come from the ring.
    VideoFrameData frame;
    memcpy(reinterpret_cast<uint8_t*>(&frame) + 8, at + 8, VideoFrameData::kRecordSize - 8);
    input->consume(size);

    Uint33 pcr = 0;
    int64_t waitMs = mClock->getPCR(&pcr) ? diff33(frame.mPTS, pcr) / 90 : -1000;
    waitMs += mAVOffsetMs.load();

    checkDeltaPTSError(frame);

    if (waitMs >= kLateShownMs && waitMs <= -1)
        waitMs = 0;

    bool drop = false;
    if (waitMs > kMaxWaitMs || waitMs <= -1000) {
        TAVO_LOGW("%s: discarding frame due to bad rendering time: %d", "render",
                  static_cast<int>(waitMs));
        if (llabs(waitMs) >= kHugeWaitMs) {
            // "interaval" is the program's own spelling, kept.
            TAVO_LOGW(
                "%s: PCR resynchronization forced due to huge difference in wait "
                "interaval: %d\n",
                "render", static_cast<int>(waitMs));
            mClock->resetPCR();
        }
        drop = true;
    } else if (mPTSError) {
        TAVO_LOGW("%s: discarding frame due to (delta) PTS Error", "render");
        drop = true;
    }
    VideoFrameData::VideoListener* listener = frame.mListener;
    if (drop) {
        if (listener != nullptr)
            listener->renderFrame(false, frame);
        return;
    }

    if (waitMs >= 1 && !sleepUnlessStopped(static_cast<int32_t>(waitMs))) {
        // Stopped while waiting: the frame is not shown, but its buffer goes back
        // to the decoder, which would otherwise lose it for good (a pause stops
        // only the renderer, and the decoder has few output buffers).
        if (listener != nullptr)
            listener->renderFrame(false, frame);
        return;
    }

    captureIfDue(frame);

    if (listener != nullptr)
        listener->renderFrame(mOutputEnabled.load(), frame);
    if (FrameRenderedListener* rendered = mFrameRenderedListener.load())
        rendered->onFrameRendered(static_cast<int>(frame.mCropWidth),
                                  static_cast<int>(frame.mCropHeight), frame.mPTS);
}

void VideoRenderer::captureIfDue(VideoFrameData& frame) {
    CaptureFrameListener* captureListener = mCaptureListener.load();
    std::unique_lock<std::mutex> lock(mCaptureLock);
    if (captureListener == nullptr || mCaptureCount == 0)
        return;
    int64_t now = 0;
    if (!nowMs(&now)) {
        TAVO_LOGE("%s: Error getting time: %s (%d)\n", "render", strerror(errno), errno);
        return;
    }
    if (now < mNextCaptureTimeMs)
        return;
    // The copy runs without the lock: getFrame leaves a running series alone, and
    // only this thread changes the count while it is not 0.
    lock.unlock();
    const bool captured =
        frame.mListener != nullptr && frame.mListener->captureFrame(frame, captureListener);
    lock.lock();
    if (captured) {
        --mCaptureCount;
    } else if (--mCaptureRetries <= 0) {
        TAVO_LOGW("%s: capture given up after %d attempts\n", "render", kCaptureRetries);
        mCaptureRetries = kCaptureRetries;
        --mCaptureCount;
    }
    mNextCaptureTimeMs += mCaptureIntervalMs;
}

void VideoRenderer::checkDeltaPTSError(VideoFrameData& frame) {
    if (mLastPTS == kNoPTS) {
        mLastPTS = frame.mPTS;
        return;
    }
    // A forward step across the 33-bit wrap has bit 32 clear and becomes small
    // once masked; a step backwards keeps its full 64-bit (negative) value.
    const uint64_t raw = frame.mPTS - mLastPTS;
    const int64_t delta = static_cast<int64_t>((raw & 0x100000000ull) == 0 ? mask33(raw) : raw);
    if (delta >= 1) {
        const uint64_t step = static_cast<uint64_t>(delta);
        if (step < mDetectedDeltaPTS) {
            TAVO_LOGI("%s: Minimum delta detected: %lld old value: %llu\n", __func__,
                      static_cast<long long>(delta),
                      static_cast<unsigned long long>(mDetectedDeltaPTS));
            mDetectedDeltaPTS = step;
        }
        // step >= 25 x detected, without overflowing the product.
        if (step / kDeltaErrorFactor >= mDetectedDeltaPTS) {
            TAVO_LOGW("%s: error detected - delta PTS = %lld; mDetectedDeltaPTS = %llu", __func__,
                      static_cast<long long>(delta),
                      static_cast<unsigned long long>(mDetectedDeltaPTS));
            mPTSError = true;
            mIDRWaitStart = kNoPTS;
            mDetectedDeltaPTS = kNoDelta;
        }
    }
    if (mPTSError) {
        if (frame.mFlag != 0) {
            mPTSError = false;
            TAVO_LOGI("%s: detected IDR frame; recovering from PTS error", __func__);
        } else if (mIDRWaitStart == kNoPTS) {
            mIDRWaitStart = frame.mPTS;
        } else if (mask33(frame.mPTS - mIDRWaitStart) >= kIDRWaitTicks) {
            // The unbalanced parenthesis is the program's own message.
            TAVO_LOGW("%s: waited too much for IDR frame (%llds); rendering available frames)",
                      __func__,
                      static_cast<long long>((frame.mPTS - mIDRWaitStart) / kIDRWaitTicks));
            mPTSError = false;
            mIDRWaitStart = kNoPTS;
        } else {
            TAVO_LOGW("%s: skip frame; waiting for next IDR frame", __func__);
        }
    }
    mLastPTS = frame.mPTS;
}

unsigned int VideoRenderer::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return OK;
    Module::dump(stream, indent);
    const std::string prefix(indent >= 0 ? static_cast<size_t>(indent) + 1 : 1, '\t');
    fprintf(stream, "%s - State: %u\n", prefix.c_str(), mState.load());
    fprintf(stream, "%s - Output enabled: %s\n", prefix.c_str(),
            mOutputEnabled.load() ? "true" : "false");
    fprintf(stream, "%s - A/V offset: %d ms\n", prefix.c_str(), mAVOffsetMs.load());
    fprintf(stream, "%s - Captures pending: %d\n", prefix.c_str(), captureCount());
    if (mInput != nullptr)
        mInput->dump(stream, indent + 1);
    return OK;
}

}  // namespace TavoPlayer
