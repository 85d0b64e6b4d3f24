// MP4Controller: plays an ordinary media file (open type 0) through the platform media
// player behind the same controller interface as the broadcast pipeline. Most
// broadcast-only operations are refused (1) or ignored. The media player's
// notifications become the service's listener calls, and a POSIX timer reports the
// playback position every 100 ms.
//
// Threads: the service calls every operation under its lock. notify runs on the media
// player's callback thread, the time trigger on a thread of the timer's own; both only
// read the listener pointers (atomics, since the service may set them from its
// thread) and the stored video size (touched by notify alone).
#pragma once

#include <signal.h>
#include <time.h>

#include <atomic>
#include <cstdint>
#include <map>
#include <string>

#include <utils/StrongPointer.h>

#include "platform/media/MediaPlayer.h"
#include "service/ControllerInterface.h"

namespace TavoPlayer {

class MP4Controller : public android::MediaPlayerListener, public virtual ControllerInterface {
public:
    MP4Controller();
    // Drives `player` instead of a platform media player of its own.
    explicit MP4Controller(const android::sp<android::MediaPlayer>& player);
    ~MP4Controller() override;

    unsigned int configure(std::map<std::string, std::string>& config) override;
    unsigned int start() override;
    unsigned int stop() override;
    unsigned int pause() override;
    unsigned int resume() override;
    unsigned int seek(int ms) override;
    unsigned int setSurface(android::sp<android::Surface>& surface) override;
    unsigned int dump(FILE* stream, const android::Vector<android::String16>& args,
                      int indent) override;
    unsigned int getFrame(int count, int intervalMs) override;
    int getFrameRate() override;
    int64_t getPCRValue() override;
    unsigned int setAudioPID(int pid) override;
    unsigned int setCCPID(int pid) override;
    unsigned int startRecord(Uri* uri) override;
    unsigned int stopRecord(bool keep) override;
    unsigned int setSoundEffect(int effect) override;
    unsigned int setCropRect(int a, int b, int c, int d, int e) override;
    unsigned int setAVSync(int offsetMs) override;
    unsigned int setAudioEnable(int enable) override;
    unsigned int setAudioOnlyMode(int audioOnly) override;
    unsigned int setCaptionSync(int offsetMs) override;
    // There is no TS receiver here: nothing to stop.
    unsigned int stopTSReceiver();

    unsigned int setErrorListener(ErrorListener* listener) override;
    unsigned int setCaptureFrameListener(CaptureFrameListener* listener) override;
    unsigned int setCaptionListener(ClosedCaptionListener* listener) override;
    unsigned int setAudioRenderedListener(AudioRenderer::AudioRenderedListener* listener) override;
    unsigned int setVideoRenderedListener(VideoRenderer::FrameRenderedListener* listener) override;
    unsigned int setServiceControllerListener(
        ServiceController::ServiceControllerListener* listener) override;
    unsigned int setPlayerListener(IPlayerListener* listener) override;
    unsigned int setRecorderListener(IRecorderListener* listener) override;

    // The media player's callback thread.
    void notify(int msg, int ext1, int ext2, const android::Parcel* obj) override;

    // The interval of the time trigger, first expiry included.
    static constexpr long kTimeUpdateIntervalNs = 100'000'000;

private:
    static void timeTrigger(union sigval value);
    void createInternalTimer();
    void startInternalTimer();
    void stopInternalTimer(const char* caller);

    // Non-owning: the service owns the listeners and outlives the controller.
    std::atomic<IPlayerListener*> mPlayerListener{nullptr};
    std::atomic<ErrorListener*> mErrorListener{nullptr};
    std::atomic<AudioRenderer::AudioRenderedListener*> mAudioRenderedListener{nullptr};
    std::atomic<VideoRenderer::FrameRenderedListener*> mVideoRenderedListener{nullptr};
    bool mMuted = true;        // until the service enables audio
    int32_t mVideoWidth = 0;   // notify's thread only
    int32_t mVideoHeight = 0;  // notify's thread only
    android::sp<android::MediaPlayer> mMediaPlayer;
    timer_t mTimer{};
    bool mTimerCreated = false;
    struct sigevent mTimerEvent {};
};

}  // namespace TavoPlayer
