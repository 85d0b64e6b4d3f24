#include "service/MP4Controller.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "support/MediaTestFiles.h"
#include "support/NamedRow.h"
#include "support/Sanitizers.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer::test {
namespace {

using android::sp;

// Every listener the controller reports to, recording what arrives on any thread by
// kind: "time", "end", "error", "session", "frame" (width, then height).
class Listeners : public IPlayerListener,
                  public ErrorListener,
                  public AudioRenderer::AudioRenderedListener,
                  public VideoRenderer::FrameRenderedListener {
public:
    void onTimeUpdate(int seconds) override { add("time", seconds); }
    void onEndOfContent() override { add("end", 1); }
    void onError(unsigned int code, const Module*) const override { add("error", int(code)); }
    void onAudioRendered() override {}
    void onAudioReady(long) override {}
    void onAudioSessionId(int id) override { add("session", id); }
    void onFrameRendered(int, int, Uint33) override {}
    void onFirstFrameRendered(int width, int height) override {
        add("frame", width);
        add("frame", height);
    }
    std::vector<int> operator[](const std::string& kind) const {
        std::vector<int> values;
        for (const auto& [k, value] : mValues.snapshot())
            if (k == kind)
                values.push_back(value);
        return values;
    }

private:
    void add(const std::string& kind, int value) const { mValues.push({kind, value}); }
    mutable test::Recorded<std::pair<std::string, int>> mValues;
};

void attach(MP4Controller& controller, Listeners& listeners) {
    controller.setPlayerListener(&listeners);
    controller.setErrorListener(&listeners);
    controller.setAudioRenderedListener(&listeners);
    controller.setVideoRenderedListener(&listeners);
}

class MP4ControllerFileTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { sFiles = new MediaTestFiles(); }
    static void TearDownTestSuite() { delete sFiles; }
    void SetUp() override {
        SKIP_IF_TIMERS_UNSUPPORTED();
        ASSERT_TRUE(sFiles->ok()) << sFiles->error();
        mController = new MP4Controller();
        attach(*mController, mListeners);
    }
    void TearDown() override {
        if (mController != nullptr)
            mController->stop();
    }
    // Opens the H.264 + AAC file as the service does (audio enabled right after) and
    // plays it.
    void play() {
        std::map<std::string, std::string> config = {{"path", sFiles->mp4()}};
        ASSERT_EQ(mController->configure(config), 0u);
        mController->setAudioEnable(1);
        ASSERT_EQ(mController->start(), 0u);
    }

    static inline MediaTestFiles* sFiles = nullptr;
    TraceCapture mTrace;
    Listeners mListeners;
    sp<MP4Controller> mController;
};

TEST_F(MP4ControllerFileTest, PlaysAFileAndReportsFrameTimeAndEnd) {
    ASSERT_NO_FATAL_FAILURE(play());
    ASSERT_TRUE(waitUntil([&] { return !mListeners["end"].empty(); }));
    EXPECT_EQ(mListeners["session"].size(), 1u);
    EXPECT_GT(mListeners["session"].at(0), 0);
    EXPECT_EQ(mListeners["frame"], (std::vector<int>{320, 240}));
    // Seconds rounded up, never going back, up to the file's length.
    const std::vector<int> times = mListeners["time"];
    ASSERT_FALSE(times.empty());
    EXPECT_TRUE(std::ranges::is_sorted(times)) << testing::PrintToString(times);
    EXPECT_EQ(times.back(), MediaTestFiles::kSeconds);
    EXPECT_TRUE(mListeners["error"].empty());
}

TEST_F(MP4ControllerFileTest, PauseStopsTheTimeAndResumeAndSeekMoveIt) {
    ASSERT_NO_FATAL_FAILURE(play());
    ASSERT_TRUE(waitUntil([&] { return !mListeners["time"].empty(); }));
    ASSERT_EQ(mController->pause(), 0u);
    std::this_thread::sleep_for(std::chrono::milliseconds(150));  // a trigger under way ends
    const size_t paused = mListeners["time"].size();
    std::this_thread::sleep_for(std::chrono::milliseconds(400));
    EXPECT_EQ(mListeners["time"].size(), paused) << "no time update while paused";
    ASSERT_EQ(mController->resume(), 0u);
    ASSERT_TRUE(waitUntil([&] { return mListeners["time"].back() == 2; }));
    // Back to the start: the time goes back to 1 s or less, then the end still comes.
    ASSERT_EQ(mController->seek(0), 0u);
    EXPECT_TRUE(waitUntil([&] { return mListeners["time"].back() <= 1; }));
    EXPECT_TRUE(waitUntil([&] { return !mListeners["end"].empty(); }));
}

struct BadPathCase {
    const char* name;
    std::string (MediaTestFiles::*path)() const;  // null: no path key at all
};

class MP4ControllerBadPathTest : public MP4ControllerFileTest,
                                 public ::testing::WithParamInterface<BadPathCase> {};

TEST_P(MP4ControllerBadPathTest, ConfigureAcceptsAndStartEndsInErrorOne) {
    std::map<std::string, std::string> config;
    if (GetParam().path != nullptr)
        config["path"] = (sFiles->*GetParam().path)();
    EXPECT_EQ(mController->configure(config), 0u);
    EXPECT_EQ(mController->start(), 0u);
    ASSERT_TRUE(waitUntil([&] { return !mListeners["error"].empty(); }));
    EXPECT_EQ(mListeners["error"], std::vector<int>{1});
    EXPECT_TRUE(mListeners["frame"].empty());
}

INSTANTIATE_TEST_SUITE_P(Paths, MP4ControllerBadPathTest,
                         ::testing::Values(BadPathCase{"Missing", &MediaTestFiles::missing},
                                           BadPathCase{"NoPathKey", nullptr},
                                           BadPathCase{"NotMedia", &MediaTestFiles::notMedia}),
                         [](const auto& info) { return std::string(info.param.name); });

// A media player that plays nothing: it records the calls made to it and reports the
// position it is given.
class FakeMediaPlayer : public android::MediaPlayer, public test::Recorded<std::string> {
public:
    android::status_t prepare() override { return record("prepare"); }
    android::status_t start() override { return record("start"); }
    android::status_t stop() override { return record("stop"); }
    android::status_t pause() override { return record("pause"); }
    android::status_t seekTo(int ms, android::MediaPlayerSeekMode) override {
        return record("seekTo " + std::to_string(ms));
    }
    android::status_t setVolume(float left, float) override {
        return record(left > 0 ? "volume on" : "volume off");
    }
    android::status_t setListener(const sp<android::MediaPlayerListener>& l) override {
        return record(l != nullptr ? "listener" : "no listener");
    }
    android::status_t getCurrentPosition(int* msec) override {
        *msec = positionMs;
        return android::OK;
    }
    std::atomic<int> positionMs{0};

private:
    android::status_t record(std::string call) {
        push(std::move(call));
        return android::OK;
    }
};

class MP4ControllerFakeTest : public ::testing::Test {
protected:
    void SetUp() override { attach(*mController, mListeners); }
    // The controller goes before the listeners it reports to.
    void TearDown() override { mController->stop(); }
    TraceCapture mTrace;
    Listeners mListeners;
    sp<FakeMediaPlayer> mPlayer = new FakeMediaPlayer();
    sp<MP4Controller> mController = new MP4Controller(mPlayer);
};

// The calls reach the player in order: muted until audio is enabled, the listener
// cleared on stop, and a seek to the position asked for (the file test only seeks
// back to the start).
TEST_F(MP4ControllerFakeTest, StartsMutedUntilAudioIsEnabledStopClearsTheListenerAndSeeks) {
    SKIP_IF_TIMERS_UNSUPPORTED();
    mController->start();
    mController->stop();
    mController->setAudioEnable(1);
    mController->start();
    mController->setAudioEnable(0);
    EXPECT_EQ(mController->seek(1500), 0u);
    EXPECT_EQ(mPlayer->snapshot(),
              (std::vector<std::string>{"listener", "volume off", "prepare", "start", "stop",
                                        "no listener", "volume on", "listener", "volume on",
                                        "prepare", "start", "volume off", "seekTo 1500"}));
}

class MP4ControllerTimeTest : public MP4ControllerFakeTest,
                              public ::testing::WithParamInterface<std::pair<int, int>> {};

TEST_P(MP4ControllerTimeTest, ReportsWholeSecondsRoundedUp) {
    SKIP_IF_TIMERS_UNSUPPORTED();
    mPlayer->positionMs = GetParam().first;
    mController->start();
    ASSERT_TRUE(waitUntil([&] { return mListeners["time"].size() >= 2; }));
    for (int seconds : mListeners["time"])
        EXPECT_EQ(seconds, GetParam().second);
}

INSTANTIATE_TEST_SUITE_P(PositionsMs, MP4ControllerTimeTest,
                         ::testing::Values(std::pair{0, 0}, std::pair{1, 1}, std::pair{999, 1},
                                           std::pair{1000, 1}, std::pair{1001, 2},
                                           std::pair{59999, 60}, std::pair{60000, 60}));

struct Notification {
    int msg, ext1, ext2;
};

using test::PrintTo;

struct NotifyCase {
    const char* name;
    std::vector<Notification> notifications;
    std::vector<int> firstFrames = {}, ends = {}, errors = {};
};

class MP4ControllerNotifyTest : public MP4ControllerFakeTest,
                                public ::testing::WithParamInterface<NotifyCase> {};

TEST_P(MP4ControllerNotifyTest, TurnsNotificationsIntoListenerCalls) {
    for (const Notification& n : GetParam().notifications)
        mController->notify(n.msg, n.ext1, n.ext2, nullptr);
    EXPECT_EQ(mListeners["frame"], GetParam().firstFrames);
    EXPECT_EQ(mListeners["end"], GetParam().ends);
    EXPECT_EQ(mListeners["error"], GetParam().errors);
}

INSTANTIATE_TEST_SUITE_P(Messages, MP4ControllerNotifyTest,
                         ::testing::Values(
                             // The first size is reported once, and again only when it changes.
                             NotifyCase{"SizeReportedWhenItChanges",
                                        {{5, 320, 240}, {5, 320, 240}, {5, 640, 480}, {200, 3, 0}},
                                        {640, 480}},
                             NotifyCase{"EmptySizeOfAudioOnly", {{5, 0, 0}, {200, 3, 0}}, {0, 0}},
                             // Info, buffering and unknown messages are only logged.
                             NotifyCase{"InfoBufferingAndOthers",
                                        {{200, 701, 0}, {3, 42, 0}, {7, 1, 2}}},
                             NotifyCase{"ErrorIsFatal", {{100, 1, -1004}}, {}, {}, {1}}),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace TavoPlayer::test
