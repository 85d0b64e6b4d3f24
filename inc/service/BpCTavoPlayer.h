// BpCTavoPlayer: a client's proxy for the player service (tavoctl, tests). Every
// call is a two-way transaction. Operations whose reply is empty return the
// transaction status (0 once the service has taken the call; their outcome
// arrives as a callback); the others return the service's reply, or the
// transaction status when the call failed.
#pragma once

#include "platform/binder/BpInterface.h"
#include "service/ICTavoPlayer.h"

namespace TavoPlayer {

class BpCTavoPlayer : public android::BpInterface<ICTavoPlayer> {
public:
    explicit BpCTavoPlayer(const android::sp<android::IBinder>& impl);

    uint32_t registerClient(const android::sp<ICTavoPlayerClient>& client) override;
    uint32_t start() override;
    uint32_t stop() override;
    uint32_t getState() override;
    uint32_t pause() override;
    uint32_t resume() override;
    uint32_t seek(int32_t ms) override;
    uint32_t openUri(const char* uri, int32_t type) override;
    uint32_t close() override;
    // Writes the surface as the platform's surface object does; a client on this
    // system has no producer of its own, so a non-null surface is sent as a token
    // binder and the service shows pictures on its own video sink.
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

private:
    // Sends `code` with the token and `args`; *reply32 (when given) gets the reply
    // integer. Returns the transaction status.
    android::status_t call(uint32_t code, std::initializer_list<int32_t> args,
                           int32_t* reply32 = nullptr);
    android::sp<android::IBinder> mSurfaceToken;
};

}  // namespace TavoPlayer
