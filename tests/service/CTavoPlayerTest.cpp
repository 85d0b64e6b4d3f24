// The player service's state machine, driven in process with a local client that
// records its callbacks. The whole service over sockets is tests/apps.
#include "service/CTavoPlayer.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "service/BnCTavoPlayerClient.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

class RecordingClient : public BnCTavoPlayerClient {
public:
    std::vector<std::string> calls;

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
        calls.push_back(call + ")");
    }
};

// A live URI whose pipeline configures without a source (the demux opens at start).
constexpr const char* kLiveUri =
    "MTV://tuner/live?pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=1;subtitlePid=304;";

using Step = std::function<uint32_t(CTavoPlayer&)>;

TEST(CTavoPlayerTest, CommandsInEachStateGiveTheirResultsCallbacksAndState) {
    const Step openLive = [](CTavoPlayer& p) { return p.openUri(kLiveUri, 5); };
    const struct Case {
        const char* what;
        std::vector<Step> before;
        Step step;
        uint32_t result;
        std::vector<std::string> callbacks;  // those of `step` alone
        uint32_t state;
    } cases[] = {
        {"pause while Closed", {}, [](CTavoPlayer& p) { return p.pause(); }, 1, {"onPaused(1)"}, 1},
        {"pause while Stopped",
         {openLive},
         [](CTavoPlayer& p) { return p.pause(); },
         1,
         {"onPaused(1)"},
         2},
        {"resume while Stopped",
         {openLive},
         [](CTavoPlayer& p) { return p.resume(); },
         1,
         {"onResumed(1)"},
         2},
        {"start while Closed answers through the callback",
         {},
         [](CTavoPlayer& p) { return p.start(); },
         0,
         {"startComplete(1)"},
         1},
        {"seek without a controller is reported as end of content",
         {},
         [](CTavoPlayer& p) { return p.seek(1000); },
         1,
         {"onEndOfContent()"},
         1},
        {"open type 3 is not supported",
         {},
         [](CTavoPlayer& p) { return p.openUri(kLiveUri, 3); },
         1,
         {"openUriComplete(1)"},
         1},
        {"open of a URI that does not parse",
         {},
         [](CTavoPlayer& p) { return p.openUri("no scheme here", 5); },
         1,
         {"openUriComplete(1)"},
         1},
        {"open of a live URI", {}, openLive, 0, {"onBufferingBegin()", "openUriComplete(0)"}, 2},
        {"a second open closes the first",
         {openLive},
         openLive,
         0,
         {"onBufferingBegin()", "openUriComplete(0)"},
         2},
        {"stop while Stopped", {openLive}, [](CTavoPlayer& p) { return p.stop(); }, 0, {}, 2},
        {"close while Stopped", {openLive}, [](CTavoPlayer& p) { return p.close(); }, 0, {}, 1},
        {"setCropRect without a controller",
         {},
         [](CTavoPlayer& p) { return p.setCropRect(0, 0, 1, 1, 0); },
         1,
         {},
         1},
        {"startRecorder of a URI that does not parse",
         {openLive},
         [](CTavoPlayer& p) { return p.startRecorder("no scheme"); },
         0x60003,
         {},
         2},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        android::sp<CTavoPlayer> player = new CTavoPlayer();
        android::sp<RecordingClient> client = new RecordingClient();
        player->registerClient(client);
        for (const Step& step : c.before)
            step(*player);
        client->calls.clear();
        EXPECT_EQ(c.step(*player), c.result);
        EXPECT_EQ(client->calls, c.callbacks);
        EXPECT_EQ(player->getState(), c.state);
        player->close();
    }
}

TEST(CTavoPlayerTest, ANewClientReplacesTheOldAndTheSameOneTwiceChangesNothing) {
    android::sp<CTavoPlayer> player = new CTavoPlayer();
    android::sp<RecordingClient> first = new RecordingClient();
    android::sp<RecordingClient> second = new RecordingClient();
    test::TraceCapture trace;
    player->registerClient(first);
    player->registerClient(second);
    player->registerClient(second);
    EXPECT_EQ(trace.count("Adding notification client!"), 2u);
    player->pause();
    EXPECT_TRUE(first->calls.empty());
    EXPECT_EQ(second->calls, std::vector<std::string>{"onPaused(1)"});
}

TEST(CTavoPlayerTest, ServiceControllerEventsBecomeClientCallbacks) {
    android::sp<CTavoPlayer> player = new CTavoPlayer();
    android::sp<RecordingClient> client = new RecordingClient();
    player->registerClient(client);
    for (uint32_t event = 0; event <= 6; ++event)
        player->onServiceControllerEvent(static_cast<ServiceController::event_t>(event), 1, 2);
    // Event 6 and above go nowhere.
    EXPECT_EQ(client->calls,
              (std::vector<std::string>{"onSignalStatusChanged(1,2)", "onBufferingBegin()",
                                        "onBufferingEnd()", "onBuffering(1)",
                                        "onStartVideoTask(1,2)", "onEndOfContent()"}));
}

// Stopping a service with no open source, and the two unrecoverable codes, end the
// process on purpose; any other code reaches the client.
TEST(CTavoPlayerDeathTest, StopWhileClosedAndFatalCodesEndTheProcess) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_EXIT(
        {
            android::sp<CTavoPlayer> player = new CTavoPlayer();
            player->stop();
        },
        testing::ExitedWithCode(CTavoPlayer::kSuicideExitStatus & 0xFF),
        "Commiting suicide due to unknown error");
    EXPECT_EXIT(
        {
            android::sp<CTavoPlayer> player = new CTavoPlayer();
            player->onError(0x31004u, nullptr);
        },
        testing::ExitedWithCode(CTavoPlayer::kSuicideExitStatus & 0xFF), "<200708>");
    android::sp<CTavoPlayer> player = new CTavoPlayer();
    android::sp<RecordingClient> client = new RecordingClient();
    player->registerClient(client);
    player->onError(0x41003u, nullptr);
    EXPECT_EQ(client->calls, std::vector<std::string>{"onError(266243)"});
}

}  // namespace
}  // namespace TavoPlayer
