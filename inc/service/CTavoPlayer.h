// CTavoPlayer: the "TavoPlayer" binder service, the one object the client
// application talks to. It keeps the single registered client, runs the player
// state machine over the client's commands, owns the current controller
// (MainController for broadcast and recorded clips, MP4Controller for media files)
// and turns every listener call that comes up from the pipeline into a one-way
// callback to the client.
//
// Threads: commands arrive on binder threads and are serialised by mLock, held
// across the controller calls they make (open holds it across the whole pipeline
// construction). getState, getPCRValue and setAudioPathForce take no lock. The
// listener calls arrive on pipeline threads without the command lock; they copy the
// client reference under a lock of its own. onError may end the process from any
// thread.
#pragma once

#include <cstdint>
#include <map>
#include <mutex>
#include <string>

#include <utils/StrongPointer.h>

#include "decoder/CaptureFrameListener.h"
#include "platform/binder/IBinder.h"
#include "service/BnCTavoPlayer.h"
#include "service/ControllerInterface.h"

namespace TavoPlayer {

class CTavoPlayer : public BnCTavoPlayer,
                    public android::IBinder::DeathRecipient,
                    public CaptureFrameListener,
                    public ClosedCaptionListener,
                    public ErrorListener,
                    public AudioRenderer::AudioRenderedListener,
                    public VideoRenderer::FrameRenderedListener,
                    public IPlayerListener,
                    public IRecorderListener,
                    public virtual ServiceController::ServiceControllerListener {
public:
    enum : uint32_t {
        TAVOPLAYER_STATE_NONE = 0,
        TAVOPLAYER_STATE_CLOSED = 1,
        TAVOPLAYER_STATE_STOPPED = 2,
        TAVOPLAYER_STATE_PLAYING = 3,
        TAVOPLAYER_STATE_PAUSED = 4,
    };
    // Source types kept from the last open.
    enum : uint32_t { SOURCE_LIVE = 0, SOURCE_MEDIA_PLAYER = 1, SOURCE_CLIP = 2 };
    // The exit status of a deliberate process end (the 32-bit pattern 0x80000000).
    static constexpr int kSuicideExitStatus = static_cast<int>(0x80000000u);

    // Creates the one instance and registers it as "TavoPlayer". A second call
    // only logs.
    static void instantiate();
    // The instance made by instantiate(), or null.
    static android::sp<CTavoPlayer> self();
    // The state's display name ("None", "Closed", "Stopped", "Playing", "Paused").
    static const char* stateName(uint32_t state);

    CTavoPlayer();
    ~CTavoPlayer() override;

    // ICTavoPlayer.
    uint32_t registerClient(const android::sp<ICTavoPlayerClient>& client) override;
    uint32_t start() override;
    uint32_t stop() override;
    uint32_t getState() override;
    uint32_t pause() override;
    uint32_t resume() override;
    uint32_t seek(int32_t ms) override;
    uint32_t openUri(const char* uri, int32_t type) override;
    uint32_t close() override;
    uint32_t setSurface(const android::sp<android::Surface>& surface) override;
    uint32_t getFrame(int32_t width, int32_t height) override;
    uint32_t setSoundEffect(int32_t effect, int32_t option) override;
    uint32_t startRecorder(const char* uri) override;
    uint32_t stopRecorder(int32_t flag) override;
    uint32_t setAVSync(int32_t value) override;
    uint32_t setCaptionSync(int32_t value) override;
    uint32_t setAudioEnable(int32_t on) override;
    uint32_t setCaptionLanguage(int32_t language) override;
    uint32_t setAudioPID(int32_t pid) override;
    int32_t setAudioPathForce(int32_t mode) override;
    uint32_t setCCPID(int32_t pid) override;
    int32_t getFrameRate() override;
    uint32_t setCropRect(int32_t a, int32_t b, int32_t c, int32_t d, int32_t e) override;
    uint32_t setAudioOnlyMode(int32_t on) override;
    int64_t getPCRValue() override;

    // Callers without "android.permission.DUMP" get the permission message.
    android::status_t dump(int fd, const android::Vector<android::String16>& args) override;

    // IBinder::DeathRecipient: the client's process has gone.
    void binderDied(const android::wp<android::IBinder>& who) override;

    // Listener side: pipeline threads, no lock.
    void onCaptureFrame(unsigned char* pixels, unsigned int width, unsigned int height,
                        bool flag) override;
    void onClosedCaptionReceived(unsigned char* text, int length) override;
    void onError(unsigned int code, const Module* module) const override;
    void onError(int code) override;
    void onAudioRendered() override {}
    void onAudioReady(long /*waitMs*/) override {}
    void onAudioSessionId(int id) override;
    void onFrameRendered(int /*width*/, int /*height*/, Uint33 /*pts*/) override {}
    void onFirstFrameRendered(int width, int height) override;
    void onTimeUpdate(int ms) override;
    void onEndOfContent() override;
    void onRecorderStarted(int status) override;
    void onRecorderStopped(int status) override;
    void onServiceControllerEvent(ServiceController::event_t event, unsigned int a,
                                  unsigned int b) override;

    // The controller of the open source, for the daemon's shutdown and for dumps.
    android::sp<ControllerInterface> controller();

private:
    // Both expect mLock held.
    uint32_t performStop_l();
    uint32_t performClose_l();
    // Builds and configures the controller for `uri`; the status of configure, or 1.
    uint32_t createController_l(const char* uri, int32_t type);
    // A copy of the client reference. Pipeline threads read it while a binder thread
    // may replace it; copying an sp<> during its assignment would race on the
    // object's reference count, so the copy and the assignment take mClientLock.
    android::sp<ICTavoPlayerClient> currentClient() const;
    void logClient(const char* func, const android::sp<ICTavoPlayerClient>& client,
                   bool warning) const;

    std::mutex mLock;
    uint32_t mState;
    uint32_t mSourceType;
    android::sp<android::IBinder> mClientBinder;
    mutable std::mutex mClientLock;  // guards mClient only; never held across a call
    android::sp<ICTavoPlayerClient> mClient;
    android::sp<ControllerInterface> m_pPlayer;
    android::sp<android::Surface> mSurface;
    bool mAudioEnable;
    bool mAudioOnlyMode;
    int8_t mSoundEffect;
    int32_t mCaptionSync;
    int32_t mAVSync;

    static android::sp<CTavoPlayer> m_pSelf;
};

}  // namespace TavoPlayer
