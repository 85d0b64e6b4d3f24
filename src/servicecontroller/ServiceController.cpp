#include "servicecontroller/ServiceController.h"

#include <unistd.h>

#include <algorithm>
#include <climits>

#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

constexpr const char* kThreadName = "PollingThread";

// A signal is late after this long without a frame or audio readiness...
constexpr uint64_t kSignalLateMs = 3000;
// ...and lost when still nothing has come this long after it was declared late.
constexpr uint64_t kSignalLostMs = 5000;

bool readMonotonic(timespec* ts) {
    return clock_gettime(CLOCK_MONOTONIC, ts) == 0;
}

// now + periodMs on the monotonic clock, nanoseconds normalised and seconds
// saturating instead of wrapping.
timespec deadlineAfter(int64_t periodMs) {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    int64_t ns = static_cast<int64_t>(ts.tv_nsec) + (periodMs % 1000) * 1'000'000;
    int64_t sec = periodMs / 1000 + ns / 1'000'000'000;
    ns %= 1'000'000'000;
    if (static_cast<int64_t>(ts.tv_sec) > static_cast<int64_t>(LONG_MAX) - sec) {
        ts.tv_sec = LONG_MAX;
    } else {
        ts.tv_sec += static_cast<time_t>(sec);
    }
    ts.tv_nsec = static_cast<long>(ns);
    return ts;
}

}  // namespace

// --- PollingThread ------------------------------------------------------------

ServiceController::PollingThread::PollingThread(ServiceController* controller, int64_t periodMs)
    : android::Thread(false), mController(controller), mPeriodMs(periodMs) {
    pthread_mutex_init(&mMutex, nullptr);
    pthread_condattr_t attr;
    pthread_condattr_init(&attr);
    pthread_condattr_setclock(&attr, CLOCK_MONOTONIC);
    pthread_cond_init(&mCondition, &attr);
    pthread_condattr_destroy(&attr);
}

ServiceController::PollingThread::~PollingThread() {
    pthread_cond_destroy(&mCondition);
    pthread_mutex_destroy(&mMutex);
}

android::status_t ServiceController::PollingThread::readyToRun() {
    pthread_setname_np(pthread_self(), kThreadName);
    return android::NO_ERROR;
}

bool ServiceController::PollingThread::threadLoop() {
    pthread_mutex_lock(&mMutex);
    // Checked under the mutex that requestExitAndWait takes before waking us, so
    // a stop that comes just before the wait is not missed.
    if (exitPending()) {
        pthread_mutex_unlock(&mMutex);
        return true;
    }
    const timespec deadline = deadlineAfter(mPeriodMs);
    const int rc = pthread_cond_timedwait(&mCondition, &mMutex, &deadline);
    pthread_mutex_unlock(&mMutex);
    // Woken (or woken spuriously): the platform thread ends here when exit was
    // requested, else waits a full period again.
    if (rc != ETIMEDOUT)
        return true;
    return onCheckEvent();
}

void ServiceController::PollingThread::requestExitAndWait() {
    requestExit();
    pthread_mutex_lock(&mMutex);
    pthread_cond_broadcast(&mCondition);
    pthread_mutex_unlock(&mMutex);
    // From the polling thread itself (a listener stopping its checker from an
    // event) there is nothing to join: the thread ends when its pass returns.
    if (join() == android::WOULD_BLOCK)
        return;
    // The thread drops its own reference just after join returns; waiting for
    // that lets the caller's reference be the last one, so the object dies after
    // everything the thread did with it.
    for (int i = 0; i < 10000 && getStrongCount() > 1; ++i)
        usleep(100);
    isRunning();  // takes the thread's lock: orders its last unlock before us
}

bool ServiceController::BufferingThread::onCheckEvent() {
    mController->bufferingProcess();
    return true;
}

bool ServiceController::CheckSignalThread::onCheckEvent() {
    mController->checkSignalStrength();
    return true;
}

bool ServiceController::CheckEndOfContentThread::onCheckEvent() {
    return mController->checkEndOfContent();
}

bool ServiceController::CheckFrameRateThread::onCheckEvent() {
    mController->updateFrameRate();
    return true;
}

// --- ServiceController --------------------------------------------------------

ServiceController::ServiceController() : ServiceController(MonotonicClock(readMonotonic)) {}

ServiceController::ServiceController(MonotonicClock clock)
    : mLastProgress(0),
      mSignalStatus(SIGNAL_GOOD),
      mLastSignalTime(0),
      mListener(nullptr),
      mWaitToRender(0),
      mFrameCount(0),
      mFirstFrame(true),
      mLastFrameCount(0),
      mFrameRate(-1),
      mEmptySeconds(0),
      mClock(clock ? std::move(clock) : MonotonicClock(readMonotonic)) {}

ServiceController::~ServiceController() {
    // The threads point at this object: none may outlive it. No events here, the
    // listener may already be gone.
    std::lock_guard<std::mutex> lock(mThreadLock);
    stopThread_l(&mBufferingThread);
    stopThread_l(&mCheckSignalThread);
    stopThread_l(&mCheckEndOfContentThread);
    stopThread_l(&mCheckFrameRateThread);
}

template <typename T>
void ServiceController::stopThread_l(android::sp<T>* thread) {
    if (*thread == nullptr)
        return;
    (*thread)->requestExitAndWait();
    thread->clear();
}

bool ServiceController::nowMs(uint64_t* ms) {
    timespec ts{};
    if (!mClock(&ts))
        return false;
    *ms = static_cast<uint64_t>(ts.tv_sec) * 1000 + static_cast<uint64_t>(ts.tv_nsec) / 1'000'000;
    return true;
}

void ServiceController::send(event_t event, unsigned int a, unsigned int b) {
    ServiceControllerListener* listener = mListener.load();
    if (listener != nullptr)
        listener->onServiceControllerEvent(event, a, b);
}

// A start while a checker runs stops the old one first (silently): a thread
// left polling on its own would outlive the object it points at.
void ServiceController::startBuffering() {
    std::lock_guard<std::mutex> lock(mThreadLock);
    {
        std::lock_guard<std::mutex> buffering(mBufferingLock);
        mWaitToRender = 0;
        mLastProgress = 0;
    }
    stopThread_l(&mBufferingThread);
    mBufferingThread = new BufferingThread(this);
    mBufferingThread->run(kThreadName);
}

void ServiceController::stopBuffering() {
    std::lock_guard<std::mutex> lock(mThreadLock);
    if (mBufferingThread == nullptr)
        return;
    stopThread_l(&mBufferingThread);
    send(BUFFERING_END_EVENT, 0, 0);
}

void ServiceController::startCheckSignal() {
    std::lock_guard<std::mutex> lock(mThreadLock);
    stopThread_l(&mCheckSignalThread);
    mCheckSignalThread = new CheckSignalThread(this);
    mCheckSignalThread->run(kThreadName);
}

void ServiceController::stopCheckSignal() {
    std::lock_guard<std::mutex> lock(mThreadLock);
    stopThread_l(&mCheckSignalThread);
}

void ServiceController::startCheckEndOfContent() {
    std::lock_guard<std::mutex> lock(mThreadLock);
    stopThread_l(&mCheckEndOfContentThread);
    mLastFrameCount = 0;
    mCheckEndOfContentThread = new CheckEndOfContentThread(this);
    mCheckEndOfContentThread->run(kThreadName);
}

void ServiceController::stopCheckEndOfContent() {
    std::lock_guard<std::mutex> lock(mThreadLock);
    stopThread_l(&mCheckEndOfContentThread);
}

void ServiceController::startCheckFrameRate() {
    std::lock_guard<std::mutex> lock(mThreadLock);
    stopThread_l(&mCheckFrameRateThread);
    mCheckFrameRateThread = new CheckFrameRateThread(this);
    mCheckFrameRateThread->run(kThreadName);
}

void ServiceController::stopCheckFrameRate() {
    std::lock_guard<std::mutex> lock(mThreadLock);
    stopThread_l(&mCheckFrameRateThread);
}

void ServiceController::stopAll() {
    stopBuffering();
    stopCheckSignal();
    stopCheckEndOfContent();
    stopCheckFrameRate();
}

void ServiceController::onFrameRendered(int width, int height, Uint33 /*pts*/) {
    updateSignalTimer();
    if (mFirstFrame.exchange(false))
        send(START_VIDEO_TASK_EVENT, static_cast<unsigned int>(width),
             static_cast<unsigned int>(height));
    mFrameCount.fetch_add(1);
}

void ServiceController::onFirstFrameRendered(int /*width*/, int /*height*/) {}

void ServiceController::onAudioRendered() {}

void ServiceController::onAudioReady(long waitToRender) {
    {
        std::lock_guard<std::mutex> lock(mBufferingLock);
        mWaitToRender = waitToRender;
    }
    updateSignalTimer();
}

void ServiceController::onAudioSessionId(int /*id*/) {}

void ServiceController::updateSignalTimer() {
    std::lock_guard<std::mutex> lock(mSignalLock);
    uint64_t now = 0;
    if (!nowMs(&now)) {
        TAVO_LOGE("%s: Error getting system time.", "updateSignalTimer");
        return;
    }
    mLastSignalTime = now;
    const uint8_t status = mSignalStatus.load();
    if (status != SIGNAL_GOOD) {
        send(SIGNAL_UPDATE_EVENT, status, SIGNAL_GOOD);
        mSignalStatus = SIGNAL_GOOD;
    }
}

void ServiceController::checkSignalStrength() {
    uint64_t now = 0;
    // One message for both causes, as it has always read.
    if (mListener.load() == nullptr || !nowMs(&now)) {
        TAVO_LOGE("%s: Error getting system time", "checkSignalStrength");
        return;
    }
    // The 3 s test comes before the status test on purpose: declaring the signal
    // late restarts the clock, so late turns to lost 5 s later (8 s after the
    // last frame), while a lost signal is re-announced every 3 s.
    const uint64_t late = now - mLastSignalTime.load();
    if (late < kSignalLateMs)
        return;
    const uint8_t status = mSignalStatus.load();
    TAVO_LOGD("%s: Signal timeout: %llu late; status = %d", "checkSignalStrength",
              static_cast<unsigned long long>(late), status);
    switch (status) {
        case SIGNAL_GOOD:
            send(SIGNAL_UPDATE_EVENT, SIGNAL_GOOD, SIGNAL_LATE);
            mSignalStatus = SIGNAL_LATE;
            mLastSignalTime = now;
            break;
        case SIGNAL_LATE:
            if (late < kSignalLostMs)
                return;
            [[fallthrough]];
        case SIGNAL_LOST:
            send(SIGNAL_UPDATE_EVENT, status, SIGNAL_LOST);
            mSignalStatus = SIGNAL_LOST;
            // The next picture announces itself again.
            mFirstFrame = true;
            mLastSignalTime = now;
            break;
        default:
            TAVO_LOGE("%s: Bad signal status: %d", "checkSignalStrength", status);
            break;
    }
}

void ServiceController::bufferingProcess() {
    std::lock_guard<std::mutex> lock(mBufferingLock);
    uint32_t progress = 0;
    if (mWaitToRender >= 1)
        progress = static_cast<uint32_t>(std::min<int64_t>(100, 5000 / mWaitToRender));
    TAVO_LOGD("%s progress = %d mWaitToRender = %lld", "bufferingProcess", progress,
              static_cast<long long>(mWaitToRender));
    // Progress only grows: 100 once the audio renderer has 50 ms or less to wait.
    if (mListener.load() != nullptr && progress > mLastProgress) {
        send(BUFFERING_EVENT, progress, 0);
        mLastProgress = progress;
    }
}

bool ServiceController::checkEndOfContent() {
    const uint32_t count = mFrameCount.load();
    if (count != mLastFrameCount) {
        mLastFrameCount = count;
        return true;
    }
    send(EOC_EVENT, 0, 0);
    return false;
}

void ServiceController::updateFrameRate() {
    const uint32_t count = mFrameCount.exchange(0);
    mFrameRate = static_cast<int32_t>(count);
    if (count > 0) {
        mEmptySeconds = 0;
    } else if (mEmptySeconds * 1000 < 4000) {
        ++mEmptySeconds;
    } else {
        // No video: reported from the fifth consecutive empty second on.
        mFrameRate = -1;
    }
}

}  // namespace TavoPlayer
