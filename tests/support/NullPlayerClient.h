// A client of the player service that takes every callback and does nothing with it,
// so that a test overrides only the callbacks it watches.
#pragma once

#include "service/BnCTavoPlayerClient.h"

namespace TavoPlayer::test {

class NullPlayerClient : public BnCTavoPlayerClient {
public:
    void openUriComplete(int32_t) override {}
    void startComplete(int32_t) override {}
    void onCaptureFrame(uint8_t*, int32_t, int32_t, int32_t) override {}
    void onSignalStatusChanged(int32_t, int32_t) override {}
    void closedCaptionText(const uint8_t*, int32_t) override {}
    void onStopComplete(int32_t) override {}
    void onError(int32_t) override {}
    void onBufferingBegin() override {}
    void onBufferingEnd() override {}
    void onBuffering(int32_t) override {}
    void onAudioSessionId(int32_t) override {}
    void onStartVideoTask(int32_t, int32_t) override {}
    void onTimeUpdate(int32_t) override {}
    void onEndOfContent() override {}
    void onRecorderStarted(int32_t) override {}
    void onRecorderStopped(int32_t) override {}
    void onPaused(int32_t) override {}
    void onResumed(int32_t) override {}
    void onSeeked(int32_t) override {}
};

}  // namespace TavoPlayer::test
