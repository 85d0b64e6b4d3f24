// ServiceController: watches a running broadcast pipeline from outside and turns
// what it sees into service events: whether frames or audio keep arriving (signal
// status), how far the initial buffering has gone, the first picture and its size,
// the end of a recorded clip, and the current frame rate.
//
// Up to four "PollingThread"s wake at fixed periods (buffering 50 ms, signal
// 300 ms, end of content 100 ms, frame rate 1000 ms); the controller starts and
// stops them and feeds the rendering events in.
//
// Threads and locks: start/stop calls come from the controller's threads and are
// serialised by mThreadLock. onFrameRendered and onAudioReady come from the
// renderers' threads. mWaitToRender and mLastProgress are guarded by
// mBufferingLock; updateSignalTimer holds mSignalLock over mLastSignalTime and
// mSignalStatus, while checkSignalStrength (signal thread only) reads and writes
// them without it: a race the design accepts, the fields being single words, so
// they are atomics here. The frame counter is shared without a lock by the
// renderer and the two ticks; a reset by the frame-rate tick can delay an
// end-of-content detection by one tick, which is accepted. Events go out on
// whichever thread detects them.
#pragma once

#include <pthread.h>
#include <time.h>

#include <atomic>
#include <cstdint>
#include <functional>
#include <mutex>

#include <utils/RefBase.h>
#include <utils/Thread.h>

#include "common/Uint33.h"
#include "renderer/AudioRenderer.h"
#include "renderer/VideoRenderer.h"

namespace TavoPlayer {

class ServiceController : public virtual android::RefBase,
                          public VideoRenderer::FrameRenderedListener,
                          public AudioRenderer::AudioRenderedListener {
public:
    enum event_t : uint32_t {
        SIGNAL_UPDATE_EVENT = 0,
        BUFFERING_BEGIN_EVENT = 1,  // not raised here
        BUFFERING_END_EVENT = 2,
        BUFFERING_EVENT = 3,
        START_VIDEO_TASK_EVENT = 4,
        EOC_EVENT = 5,
    };

    // Signal status: 0 good, 1 late (nothing for 3 s), 2 lost (still nothing 5 s
    // after being declared late).
    enum : uint8_t { SIGNAL_GOOD = 0, SIGNAL_LATE = 1, SIGNAL_LOST = 2 };

    class ServiceControllerListener {
    public:
        virtual ~ServiceControllerListener() = default;
        virtual void onServiceControllerEvent(event_t event, unsigned int a, unsigned int b) = 0;
    };

    // Reads the monotonic clock; false when it cannot be read. Tests pass their
    // own; the default reads CLOCK_MONOTONIC. The polling threads' waits always use
    // the real monotonic clock.
    using MonotonicClock = std::function<bool(timespec*)>;

    class PollingThread : public android::Thread {
    public:
        PollingThread(ServiceController* controller, int64_t periodMs);
        ~PollingThread() override;
        // Requests exit, wakes the wait and joins.
        void requestExitAndWait();

    protected:
        // One tick's work; false ends the thread.
        virtual bool onCheckEvent() = 0;
        ServiceController* const mController;

    private:
        android::status_t readyToRun() override;
        bool threadLoop() override;

        const int64_t mPeriodMs;
        pthread_mutex_t mMutex;
        pthread_cond_t mCondition;
    };

    class BufferingThread : public PollingThread {
    public:
        explicit BufferingThread(ServiceController* c) : PollingThread(c, 50) {}

    private:
        bool onCheckEvent() override;
    };

    class CheckSignalThread : public PollingThread {
    public:
        explicit CheckSignalThread(ServiceController* c) : PollingThread(c, 300) {}

    private:
        bool onCheckEvent() override;
    };

    class CheckEndOfContentThread : public PollingThread {
    public:
        explicit CheckEndOfContentThread(ServiceController* c) : PollingThread(c, 100) {}

    private:
        bool onCheckEvent() override;
    };

    class CheckFrameRateThread : public PollingThread {
    public:
        explicit CheckFrameRateThread(ServiceController* c) : PollingThread(c, 1000) {}

    private:
        bool onCheckEvent() override;
    };

    ServiceController();
    explicit ServiceController(MonotonicClock clock);
    ~ServiceController() override;

    // Not owned: the listener must outlive this object (or be reset first).
    void setListener(ServiceControllerListener* listener) { mListener = listener; }
    ServiceControllerListener* getListener() const { return mListener; }

    void startBuffering();
    void stopBuffering();
    void startCheckSignal();
    void stopCheckSignal();
    void startCheckEndOfContent();
    void stopCheckEndOfContent();
    void startCheckFrameRate();
    void stopCheckFrameRate();
    void stopAll();
    int getFrameRate() const { return mFrameRate.load(); }

    // From the video renderer's thread, for every shown frame.
    void onFrameRendered(int width, int height, Uint33 pts) override;
    void onFirstFrameRendered(int width, int height) override;
    // From the audio renderer's thread.
    void onAudioRendered() override;
    void onAudioReady(long waitToRender) override;
    void onAudioSessionId(int id) override;

    // One pass of each polling thread's work. The threads call them; they are
    // public so that a pass can be run on its own.
    void bufferingProcess();
    void checkSignalStrength();
    // false once EOC_EVENT was sent.
    bool checkEndOfContent();
    void updateFrameRate();
    void updateSignalTimer();

    uint8_t getSignalStatus() const { return mSignalStatus.load(); }
    // Set at construction and when the signal is lost: the next shown frame
    // announces itself with START_VIDEO_TASK_EVENT.
    bool isFirstFrameFlagSet() const { return mFirstFrame.load(); }

private:
    // Monotonic now in ms (seconds x 1000 + nanoseconds / 10^6, truncated).
    bool nowMs(uint64_t* ms);
    // Stops and releases a checker without raising any event.
    template <typename T>
    static void stopThread_l(android::sp<T>* thread);
    void send(event_t event, unsigned int a, unsigned int b);

    std::mutex mThreadLock;
    uint32_t mLastProgress;
    std::atomic<uint8_t> mSignalStatus;
    std::atomic<uint64_t> mLastSignalTime;
    std::atomic<ServiceControllerListener*> mListener;
    android::sp<BufferingThread> mBufferingThread;
    android::sp<CheckSignalThread> mCheckSignalThread;
    android::sp<CheckEndOfContentThread> mCheckEndOfContentThread;
    android::sp<CheckFrameRateThread> mCheckFrameRateThread;
    int64_t mWaitToRender;
    std::mutex mBufferingLock;
    std::mutex mSignalLock;
    std::atomic<uint32_t> mFrameCount;
    std::atomic<bool> mFirstFrame;
    uint32_t mLastFrameCount;
    std::atomic<int32_t> mFrameRate;
    uint32_t mEmptySeconds;

    MonotonicClock mClock;
};

}  // namespace TavoPlayer
