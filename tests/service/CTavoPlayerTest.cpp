// The player service's state machine, driven in process with a local client
// that records its callbacks. The whole service over sockets is tests/apps.
#include "service/CTavoPlayer.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "support/RecordingPlayerClient.h"
#include "support/ScopedEnv.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

// A live URI whose pipeline configures without a source (the demux opens at
// start).
constexpr const char* kLiveUri =
    "MTV://tuner/"
    "live?pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=1;subtitlePid=304;";

using Step = std::function<uint32_t(CTavoPlayer&)>;
#define CALL(call) [](CTavoPlayer& p) { return p.call; }

TEST(CTavoPlayerTest, CommandsInEachStateGiveTheirResultsCallbacksAndState) {
    // The rows that play start a pipeline on a source where nothing arrives: no
    // callback of its own comes while a row runs.
    const test::ScopedEnv source("TAVOPLAYER_PROP_tavoplayer_demux_source",
                                 "udp://127.0.0.1:45988");
    const test::ScopedEnv video("TAVOPLAYER_PROP_tavoplayer_video_sink", "null");
    const test::ScopedEnv audio("TAVOPLAYER_PROP_tavoplayer_audio_sink", "null");
    const Step open = CALL(openUri(kLiveUri, 5));
    const std::vector<std::string> opened = {"onBufferingBegin()", "openUriComplete(0)"};
    const struct Case {
        const char* what;
        std::vector<Step> before;
        Step step;
        uint32_t result;
        std::vector<std::string> callbacks;  // those of `step` alone
        uint32_t state;
    } cases[] = {
        {"pause while Closed", {}, CALL(pause()), 1, {"onPaused(1)"}, 1},
        {"pause while Stopped", {open}, CALL(pause()), 1, {"onPaused(1)"}, 2},
        {"resume while Stopped", {open}, CALL(resume()), 1, {"onResumed(1)"}, 2},
        // start answers through the callback.
        {"start while Closed", {}, CALL(start()), 0, {"startComplete(1)"}, 1},
        {"start while Playing", {open, CALL(start())}, CALL(start()), 0, {"startComplete(1)"}, 3},
        {"seek without a controller is the end", {}, CALL(seek(1000)), 1, {"onEndOfContent()"}, 1},
        {"open type 3 is refused", {}, CALL(openUri(kLiveUri, 3)), 1, {"openUriComplete(1)"}, 1},
        {"open of a bad URI", {}, CALL(openUri("no scheme", 5)), 1, {"openUriComplete(1)"}, 1},
        {"open of a live URI", {}, open, 0, opened, 2},
        {"a second open closes the first", {open}, open, 0, opened, 2},
        {"stop while Stopped", {open}, CALL(stop()), 0, {}, 2},
        {"close while Stopped", {open}, CALL(close()), 0, {}, 1},
        {"setCropRect without a controller", {}, CALL(setCropRect(0, 0, 1, 1, 0)), 1, {}, 1},
        {"startRecorder of a bad URI", {open}, CALL(startRecorder("no scheme")), 0x60003, {}, 2},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        android::sp<CTavoPlayer> player = new CTavoPlayer();
        android::sp<test::RecordingPlayerClient> client = new test::RecordingPlayerClient();
        player->registerClient(client);
        for (const Step& step : c.before)
            step(*player);
        client->take();
        EXPECT_EQ(c.step(*player), c.result);
        EXPECT_EQ(client->take(), c.callbacks);
        EXPECT_EQ(player->getState(), c.state);
        player->close();
    }
}

// A viewer's lip-sync setting reaches the picture less its bias of 200 ms, whether
// it was given before the broadcast was opened or while it is open.
TEST(CTavoPlayerTest, AVSyncReachesThePicturesLessItsBias) {
    const test::ScopedEnv video("TAVOPLAYER_PROP_tavoplayer_video_sink", "null");
    const test::ScopedEnv audio("TAVOPLAYER_PROP_tavoplayer_audio_sink", "null");
    android::sp<CTavoPlayer> player = new CTavoPlayer();
    const auto offset = [&] {
        const std::string dump = test::printed([&](FILE* out) {
            player->controller()->dump(out, android::Vector<android::String16>(), 0);
        });
        const size_t at = dump.find("A/V offset: ");
        return at == std::string::npos ? dump : dump.substr(at, dump.find('\n', at) - at);
    };
    player->setAVSync(330);
    ASSERT_EQ(player->openUri(kLiveUri, 5), 0u);
    EXPECT_EQ(offset(), "A/V offset: 130 ms");
    player->setAVSync(150);
    EXPECT_EQ(offset(), "A/V offset: -50 ms");
    player->close();
}

TEST(CTavoPlayerTest, ANewClientReplacesTheOldAndTheSameOneTwiceChangesNothing) {
    android::sp<CTavoPlayer> player = new CTavoPlayer();
    android::sp<test::RecordingPlayerClient> first = new test::RecordingPlayerClient();
    android::sp<test::RecordingPlayerClient> second = new test::RecordingPlayerClient();
    player->registerClient(first);
    player->registerClient(second);
    player->registerClient(second);
    player->pause();
    EXPECT_TRUE(first->take().empty());
    EXPECT_EQ(second->take(), std::vector<std::string>{"onPaused(1)"});
}

TEST(CTavoPlayerTest, ServiceControllerEventsBecomeClientCallbacks) {
    android::sp<CTavoPlayer> player = new CTavoPlayer();
    android::sp<test::RecordingPlayerClient> client = new test::RecordingPlayerClient();
    player->registerClient(client);
    for (uint32_t event = 0; event <= 6; ++event)
        player->onServiceControllerEvent(static_cast<ServiceController::event_t>(event), 1, 2);
    // Event 6 and above go nowhere.
    EXPECT_EQ(client->take(),
              (std::vector<std::string>{"onSignalStatusChanged(1,2)", "onBufferingBegin()",
                                        "onBufferingEnd()", "onBuffering(1)",
                                        "onStartVideoTask(1,2)", "onEndOfContent()"}));
}

// Stopping a service with no open source, and the two unrecoverable codes, end
// the process on purpose; any other code reaches the client.
TEST(CTavoPlayerDeathTest, StopWhileClosedAndFatalCodesEndTheProcess) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    const auto suicide = testing::ExitedWithCode(CTavoPlayer::kSuicideExitStatus & 0xFF);
    EXPECT_EXIT(android::sp<CTavoPlayer>(new CTavoPlayer())->stop(), suicide,
                "Commiting suicide due to unknown error");
    EXPECT_EXIT(android::sp<CTavoPlayer>(new CTavoPlayer())->onError(0x31004u, nullptr), suicide,
                "<200708>");
    android::sp<CTavoPlayer> player = new CTavoPlayer();
    android::sp<test::RecordingPlayerClient> client = new test::RecordingPlayerClient();
    player->registerClient(client);
    player->onError(0x41003u, nullptr);
    EXPECT_EQ(client->take(), std::vector<std::string>{"onError(266243)"});
}

}  // namespace
}  // namespace TavoPlayer
