// A client of the player service that records every callback as a line of text
// ("onError(3)"), for tests that check which callbacks came and tests that only need a
// client to register.
#pragma once

#include <initializer_list>
#include <string>

#include "service/BnCTavoPlayerClient.h"
#include "support/Recorded.h"

namespace TavoPlayer::test {

class RecordingPlayerClient : public BnCTavoPlayerClient, public Recorded<std::string> {
public:
    void openUriComplete(int32_t s) override { add("openUriComplete", {s}); }
    void startComplete(int32_t s) override { add("startComplete", {s}); }
    void onCaptureFrame(uint8_t*, int32_t, int32_t, int32_t) override { add("onCaptureFrame"); }
    void onSignalStatusChanged(int32_t p, int32_t c) override {
        add("onSignalStatusChanged", {p, c});
    }
    void closedCaptionText(const uint8_t*, int32_t n) override { add("closedCaptionText", {n}); }
    void onStopComplete(int32_t s) override { add("onStopComplete", {s}); }
    void onError(int32_t c) override { add("onError", {c}); }
    void onBufferingBegin() override { add("onBufferingBegin"); }
    void onBufferingEnd() override { add("onBufferingEnd"); }
    void onBuffering(int32_t p) override { add("onBuffering", {p}); }
    void onAudioSessionId(int32_t id) override { add("onAudioSessionId", {id}); }
    void onStartVideoTask(int32_t w, int32_t h) override { add("onStartVideoTask", {w, h}); }
    void onTimeUpdate(int32_t t) override { add("onTimeUpdate", {t}); }
    void onEndOfContent() override { add("onEndOfContent"); }
    void onRecorderStarted(int32_t s) override { add("onRecorderStarted", {s}); }
    void onRecorderStopped(int32_t s) override { add("onRecorderStopped", {s}); }
    void onPaused(int32_t s) override { add("onPaused", {s}); }
    void onResumed(int32_t s) override { add("onResumed", {s}); }
    void onSeeked(int32_t ms) override { add("onSeeked", {ms}); }

private:
    void add(const char* name, std::initializer_list<int32_t> args = {}) {
        std::string call = std::string(name) + "(";
        for (int32_t v : args)
            call += (call.back() == '(' ? "" : ",") + std::to_string(v);
        push(call + ")");
    }
};

}  // namespace TavoPlayer::test
