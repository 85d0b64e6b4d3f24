// BpCTavoPlayerClient: the service's proxy for its client. Every callback is a
// one-way transaction; a failed send is not reported (the client may be gone or
// too slow, and the pipeline must not wait for it).
#pragma once

#include "platform/binder/BpInterface.h"
#include "service/ICTavoPlayerClient.h"

namespace TavoPlayer {

class BpCTavoPlayerClient : public android::BpInterface<ICTavoPlayerClient> {
public:
    explicit BpCTavoPlayerClient(const android::sp<android::IBinder>& impl);

    void openUriComplete(int32_t status) override;
    void startComplete(int32_t status) override;
    // The pixels travel in a shared-memory region named "Frame Pixels" of
    // width x height x (2 when flag is set, else 4) bytes, which the client can
    // only map read-only. Any failure sends nothing.
    void onCaptureFrame(uint8_t* data, int32_t width, int32_t height, int32_t flag) override;
    void onSignalStatusChanged(int32_t previous, int32_t current) override;
    // The length goes twice, then the bytes: the client reads both lengths.
    void closedCaptionText(const uint8_t* text, int32_t length) override;
    void onStopComplete(int32_t status) override;
    void onError(int32_t code) override;
    void onBufferingBegin() override;
    void onBufferingEnd() override;
    void onBuffering(int32_t progress) override;
    void onAudioSessionId(int32_t id) override;
    void onStartVideoTask(int32_t width, int32_t height) override;
    void onTimeUpdate(int32_t time) override;
    void onEndOfContent() override;
    void onRecorderStarted(int32_t status) override;
    void onRecorderStopped(int32_t status) override;
    void onPaused(int32_t status) override;
    void onResumed(int32_t status) override;
    void onSeeked(int32_t ms) override;

private:
    void send(uint32_t code, std::initializer_list<int32_t> values);
};

}  // namespace TavoPlayer
