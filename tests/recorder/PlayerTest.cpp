#include "recorder/Player.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "platform/dtv/Demux.h"
#include "support/ScopedEnv.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

class RecordingPlayerListener : public IPlayerListener {
public:
    void onTimeUpdate(int seconds) override { times.push_back(seconds); }
    void onEndOfContent() override { ++endOfContent; }
    void onError(int code) override { errors.push_back(code); }
    std::vector<int> times;
    int endOfContent = 0;
    std::vector<int> errors;
};

constexpr uint64_t kSecond = 90000;

TEST(PlayerCallbackTest, EventTable) {
    struct Case {
        int event;
        int endOfContent;
        std::vector<int> errors;
    };
    const Case cases[] = {
        {6, 1, {}}, {4, 0, {0x21001}}, {5, 0, {0x21001}}, {3, 0, {}}, {0, 0, {}}, {7, 0, {}},
    };
    for (const Case& c : cases) {
        RecordingPlayerListener listener;
        test::TraceCapture trace;
        playerCallback(c.event, &listener);
        EXPECT_EQ(listener.endOfContent, c.endOfContent) << c.event;
        EXPECT_EQ(listener.errors, c.errors) << c.event;
    }
}

// Every player here talks to the in-process recording service, with a
// recordings folder of the test's own.
class PlayerTimeTest : public ::testing::Test {
protected:
    void SetUp() override {
        player = new Player();
        player->setListener(&listener);
    }
    test::ScopedRecordingsDir dir;
    RecordingPlayerListener listener;
    android::sp<Player> player;
};

// Frames as (PTS, whole seconds the listener must have seen after it); the
// duration is unknown (0), so nothing is clamped.
TEST_F(PlayerTimeTest, ReportsEachNewWholeSecondOnceFromTheAnchor) {
    const uint64_t p = 1'000'000;
    struct Frame {
        uint64_t pts;
        std::vector<int> times;
        uint64_t startPTSAfter;
    };
    const Frame frames[] = {
        {p, {}, p},  // anchors, no report
        {p + kSecond - 1, {}, p},
        {p + kSecond, {1}, p},
        {p + kSecond + 3000, {1}, p},  // same second: once only
        {p + 3 * kSecond + 10, {1, 3}, p},
        {p - 1, {1, 3}, 0},  // went back: anchor dropped
        // Re-anchored 3 s back from this frame, so the count goes on.
        {p + 100 * kSecond, {1, 3}, p + 97 * kSecond},
        {p + 101 * kSecond, {1, 3, 4}, p + 97 * kSecond},
    };
    for (const Frame& f : frames) {
        player->updateCurTime(f.pts);
        EXPECT_EQ(listener.times, f.times) << f.pts;
        EXPECT_EQ(player->getStartPTS(), f.startPTSAfter) << f.pts;
    }
}

TEST_F(PlayerTimeTest, StopFreezesReportsAndStartClearsIt) {
    player->updateCurTime(kSecond);
    player->stop();
    player->updateCurTime(5 * kSecond);
    EXPECT_TRUE(listener.times.empty());
    EXPECT_EQ(player->getStartPTS(), kSecond);
    player->start();  // no clip: the duration stays unknown
    EXPECT_EQ(player->getDuration(), 0u);
    player->updateCurTime(5 * kSecond);
    EXPECT_EQ(listener.times, std::vector<int>{4});
}

// A tsgen clip dropped into the recordings folder: the service catalogues it on
// first use and reports its duration d. The designed boundaries are then d - 1500
// (end of content) and d - 1501 (a reposition).
class PlayerClipTest : public PlayerTimeTest {
protected:
    void SetUp() override {
        PlayerTimeTest::SetUp();
        // Video only, a PCR every 100 ms: a short time index keeps cataloguing quick.
        const std::string& clip = test::tsgenStream(
            35, "--size 160x120 --audio none --no-caption-stream --pcr-interval-ms 100");
        ASSERT_FALSE(clip.empty()) << "tsgen failed";
        std::filesystem::copy_file(clip, dir.path() + "/7.ts");
        // As the URI parser leaves a FILE path: without its last character.
        player->setClipPath(dir.path() + "/7.t");
        setTraceLevel(TRACE_DEBUG);
        player->start();
        duration = static_cast<int>(player->getDuration());
        ASSERT_GT(duration, 32000);
        ASSERT_TRUE(player->isPossibleSeek());
    }
    void TearDown() override {
        setTraceLevel(TRACE_INFO);
        // The service keeps a clip as the demux's source until something else
        // replaces it, and the player has no call that ends that: later tests of this
        // process must find the live source again.
        Demux::instance().setSourceProvider({});
    }
    int duration = 0;
};

TEST_F(PlayerClipTest, SeeksIntoTheLastOneAndAHalfSecondsEndTheContent) {
    struct Case {
        int ms;
        bool endOfContent;
    };
    const Case cases[] = {
        {duration - 1500, true},
        {duration - 1501, false},
        {30000, false},
        {duration + 1000, true},
        {-1, true},
        {0, false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.ms);
        listener.endOfContent = 0;
        test::TraceCapture trace;
        player->updateCurTime(90000);  // an anchor for the seek to drop
        player->seek(c.ms);
        EXPECT_EQ(listener.endOfContent, c.endOfContent ? 1 : 0);
        // The tail never reaches the recording service; a reposition does, and succeeds.
        EXPECT_EQ(trace.count("seek RecPlayerBinder_RepositioningTSPlayer succeeded!"),
                  c.endOfContent ? 0u : 1u)
            << trace.all();
        EXPECT_EQ(player->getElapsedTimeSec(), static_cast<uint32_t>(c.ms / 1000));
        EXPECT_EQ(player->getStartPTS(), 0u);
    }
}

TEST_F(PlayerClipTest, AfterASeekTheNextFrameAnchorsAndTimeIsClampedToTheDuration) {
    player->seek(30000);
    const uint64_t p = 10'000'000;
    player->updateCurTime(p);
    EXPECT_EQ(player->getStartPTS(), p - 2'700'000);
    player->updateCurTime(p + kSecond - 1);
    EXPECT_TRUE(listener.times.empty());
    player->updateCurTime(p + kSecond);
    EXPECT_EQ(listener.times, std::vector<int>{31});
    // Far past the end: reported once as the clip's last whole second.
    player->updateCurTime(p + 60 * kSecond);
    player->updateCurTime(p + 61 * kSecond);
    EXPECT_EQ(listener.times, (std::vector<int>{31, duration / 1000}));
}

}  // namespace
}  // namespace TavoPlayer
