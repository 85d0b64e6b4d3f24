#include "service/MP4Controller.h"

#include <errno.h>

#include <chrono>
#include <cmath>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <unordered_map>

#include "platform/os/Trace.h"

namespace TavoPlayer {
namespace {

// A timer's notification thread may already be on its way when the timer is deleted,
// holding the controller's address. Controllers alive are listed here with the number
// of triggers running on them: a trigger runs only on a listed controller, and the
// destructor unlists its controller and waits for its running triggers before the
// members go.
std::mutex gTriggerLock;
std::condition_variable gTriggerDone;
std::unordered_map<const MP4Controller*, int> gTriggersRunning;

}  // namespace

MP4Controller::MP4Controller() : MP4Controller(new android::MediaPlayer()) {}

MP4Controller::MP4Controller(const android::sp<android::MediaPlayer>& player)
    : mMediaPlayer(player) {
    {
        std::lock_guard<std::mutex> lock(gTriggerLock);
        gTriggersRunning[this] = 0;
    }
    createInternalTimer();
}

MP4Controller::~MP4Controller() {
    if (mTimerCreated && timer_delete(mTimer) != 0)
        TAVO_LOGE("%s: Unable to delete internal timer\n", "~MP4Controller");
    {
        std::unique_lock<std::mutex> lock(gTriggerLock);
        while (gTriggersRunning[this] != 0)
            gTriggerDone.wait_for(lock, std::chrono::milliseconds(100));
        gTriggersRunning.erase(this);
    }
    if (mMediaPlayer != nullptr) {
        mMediaPlayer->disconnect();
        mMediaPlayer.clear();
    }
}

void MP4Controller::createInternalTimer() {
    mTimerEvent.sigev_notify = SIGEV_THREAD;
    mTimerEvent.sigev_value.sival_ptr = this;
    mTimerEvent.sigev_notify_function = &MP4Controller::timeTrigger;
    mTimerEvent.sigev_notify_attributes = nullptr;
    if (timer_create(CLOCK_MONOTONIC, &mTimerEvent, &mTimer) != 0) {
        TAVO_LOGE("%s: Could not create timer!\n", "MP4Controller");
        return;
    }
    mTimerCreated = true;
}

void MP4Controller::startInternalTimer() {
    struct itimerspec period {};
    period.it_value.tv_nsec = kTimeUpdateIntervalNs;
    period.it_interval.tv_nsec = kTimeUpdateIntervalNs;
    if (!mTimerCreated || timer_settime(mTimer, 0, &period, nullptr) != 0) {
        const int error = mTimerCreated ? errno : EINVAL;
        TAVO_LOGE("%s: Error starting timer to update UI: %d (%s)\n", __func__, error,
                  strerror(error));
    }
}

void MP4Controller::stopInternalTimer(const char* caller) {
    struct itimerspec period {};
    if (!mTimerCreated || timer_settime(mTimer, 0, &period, nullptr) != 0) {
        const int error = mTimerCreated ? errno : EINVAL;
        TAVO_LOGE("%s: Error stopping timer to update UI: %d (%s)\n", caller, error,
                  strerror(error));
    }
}

void MP4Controller::timeTrigger(union sigval value) {
    auto* controller = static_cast<MP4Controller*>(value.sival_ptr);
    {
        std::lock_guard<std::mutex> lock(gTriggerLock);
        auto found = gTriggersRunning.find(controller);
        if (controller == nullptr || found == gTriggersRunning.end())
            return;
        ++found->second;
    }
    IPlayerListener* listener = controller->mPlayerListener.load();
    if (listener != nullptr && controller->mMediaPlayer != nullptr) {
        int positionMs = 0;
        controller->mMediaPlayer->getCurrentPosition(&positionMs);
        // Whole seconds rounded up (1,001 ms is 2 s, 1,000 ms is 1 s); the product in
        // double precision is how the position has always been turned into seconds.
        listener->onTimeUpdate(static_cast<int>(std::ceil(positionMs * 0.001)));
    }
    std::lock_guard<std::mutex> lock(gTriggerLock);
    --gTriggersRunning[controller];
    gTriggerDone.notify_all();
}

unsigned int MP4Controller::configure(std::map<std::string, std::string>& config) {
    if (mMediaPlayer == nullptr)
        return 1;
    // The player's status is not looked at: a bad path shows when it is prepared.
    mMediaPlayer->setDataSource(nullptr, config["path"].c_str(), nullptr);
    return 0;
}

unsigned int MP4Controller::setSurface(android::sp<android::Surface>& surface) {
    if (mMediaPlayer == nullptr)
        return 1;
    // The surface is what the player draws to; it is its own buffer producer here.
    const android::status_t status = mMediaPlayer->setVideoSurfaceTexture(surface);
    if (status != android::OK) {
        TAVO_LOGE("%s: Error setting surface %d\n", __func__, status);
        return 1;
    }
    return 0;
}

unsigned int MP4Controller::start() {
    if (mMediaPlayer == nullptr)
        return 1;
    mMediaPlayer->setListener(this);
    if (AudioRenderer::AudioRenderedListener* audio = mAudioRenderedListener.load())
        audio->onAudioSessionId(mMediaPlayer->getAudioSessionId());
    const float volume = mMuted ? 0.0f : 1.0f;
    mMediaPlayer->setVolume(volume, volume);
    // A failure here reaches the error listener as MEDIA_ERROR.
    mMediaPlayer->prepare();
    mMediaPlayer->start();
    startInternalTimer();
    return 0;
}

unsigned int MP4Controller::stop() {
    if (mMediaPlayer == nullptr)
        return 1;
    mMediaPlayer->stop();
    mMediaPlayer->setListener(nullptr);
    stopInternalTimer(__func__);
    return 0;
}

unsigned int MP4Controller::pause() {
    if (mMediaPlayer == nullptr)
        return 1;
    stopInternalTimer(__func__);
    mMediaPlayer->pause();
    return 0;
}

unsigned int MP4Controller::resume() {
    if (mMediaPlayer == nullptr)
        return 1;
    startInternalTimer();
    mMediaPlayer->start();
    return 0;
}

unsigned int MP4Controller::seek(int ms) {
    if (mMediaPlayer == nullptr)
        return 1;
    mMediaPlayer->seekTo(ms);
    return 0;
}

unsigned int MP4Controller::setAudioEnable(int enable) {
    if (mMediaPlayer == nullptr)
        return 1;
    mMuted = enable == 0;
    const float volume = enable != 0 ? 1.0f : 0.0f;
    mMediaPlayer->setVolume(volume, volume);
    return 0;
}

int MP4Controller::getFrameRate() {
    return -1;
}

int64_t MP4Controller::getPCRValue() {
    return 0;
}

unsigned int MP4Controller::setSoundEffect(int) {
    return 0;
}

unsigned int MP4Controller::stopTSReceiver() {
    return 0;
}

// Broadcast-only operations: refused, with nothing done.
unsigned int MP4Controller::dump(FILE*, const android::Vector<android::String16>&, int) {
    return 1;
}
unsigned int MP4Controller::getFrame(int, int) {
    return 1;
}
unsigned int MP4Controller::setAudioPID(int) {
    return 1;
}
unsigned int MP4Controller::setCCPID(int) {
    return 1;
}
unsigned int MP4Controller::startRecord(Uri*) {
    return 1;
}
unsigned int MP4Controller::stopRecord(bool) {
    return 1;
}
unsigned int MP4Controller::setCropRect(int, int, int, int, int) {
    return 1;
}
unsigned int MP4Controller::setAVSync(int) {
    return 1;
}
unsigned int MP4Controller::setAudioOnlyMode(int) {
    return 1;
}
unsigned int MP4Controller::setCaptionSync(int) {
    return 1;
}

unsigned int MP4Controller::setErrorListener(ErrorListener* listener) {
    mErrorListener = listener;
    return 0;
}
unsigned int MP4Controller::setAudioRenderedListener(
    AudioRenderer::AudioRenderedListener* listener) {
    mAudioRenderedListener = listener;
    return 0;
}
unsigned int MP4Controller::setVideoRenderedListener(
    VideoRenderer::FrameRenderedListener* listener) {
    mVideoRenderedListener = listener;
    return 0;
}
unsigned int MP4Controller::setPlayerListener(IPlayerListener* listener) {
    mPlayerListener = listener;
    return 0;
}
unsigned int MP4Controller::setCaptureFrameListener(CaptureFrameListener*) {
    return 0;
}
unsigned int MP4Controller::setCaptionListener(ClosedCaptionListener*) {
    return 0;
}
unsigned int MP4Controller::setServiceControllerListener(
    ServiceController::ServiceControllerListener*) {
    return 0;
}
unsigned int MP4Controller::setRecorderListener(IRecorderListener*) {
    return 0;
}

void MP4Controller::notify(int msg, int ext1, int ext2, const android::Parcel*) {
    TAVO_LOGI("%s: msg %d, ext1 %d, ext2 %d\n", __func__, msg, ext1, ext2);
    switch (msg) {
        case android::MEDIA_PLAYBACK_COMPLETE:
            TAVO_LOGI("%s: Received MEDIA_PLAYBACK_COMPLETE\n", __func__);
            if (IPlayerListener* listener = mPlayerListener.load())
                listener->onEndOfContent();
            break;
        case android::MEDIA_BUFFERING_UPDATE:
            TAVO_LOGI("%s: Received MEDIA_BUFFERING_UPDATE\n", __func__);
            TAVO_LOGI("%s: Buffering at: %d\n", __func__, ext1);
            break;
        case android::MEDIA_SET_VIDEO_SIZE:
            TAVO_LOGI("%s: Received MEDIA_SET_VIDEO_SIZE\n", __func__);
            if (ext1 != mVideoWidth || ext2 != mVideoHeight) {
                TAVO_LOGI("%s: Video size: %d x %d\n", __func__, ext1, ext2);
                mVideoWidth = ext1;
                mVideoHeight = ext2;
            }
            break;
        case android::MEDIA_ERROR:
            TAVO_LOGE("%s: Received MEDIA_ERROR\n", __func__);
            // Code 1 makes the service end the process: a player that failed is
            // restarted with it rather than left half-working.
            if (ErrorListener* listener = mErrorListener.load())
                listener->onError(1, nullptr);
            break;
        case android::MEDIA_INFO:
            TAVO_LOGI("%s: Received MEDIA_INFO\n", __func__);
            if (ext1 == android::MEDIA_INFO_RENDERING_START) {
                TAVO_LOGI("%s: MEDIA_INFO: MEDIA_INFO_RENDERING_START\n", __func__);
                if (VideoRenderer::FrameRenderedListener* listener = mVideoRenderedListener.load())
                    listener->onFirstFrameRendered(mVideoWidth, mVideoHeight);
            }
            break;
        default:
            break;
    }
}

}  // namespace TavoPlayer
