#include "platform/media/MediaPlayer.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <pthread.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <future>
#include <vector>

#include "platform/media/MediaPlayerOutputs.h"
#include "support/MediaTestFiles.h"
#include "support/NamedRow.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer::test {
namespace {

using test::PrintTo;

using android::MediaPlayer;
using android::sp;

struct Note {
    int msg, ext1, ext2;
    std::string thread;
};

// Notes `msg`, and `ext1` unless it is -1.
auto matching(int msg, int ext1) {
    return [=](const Note& note) { return note.msg == msg && (ext1 == -1 || note.ext1 == ext1); };
}

class RecordingListener : public android::MediaPlayerListener, public test::Recorded<Note> {
public:
    void notify(int msg, int ext1, int ext2, const android::Parcel*) override {
        char name[16] = {};
        pthread_getname_np(pthread_self(), name, sizeof name);
        push({msg, ext1, ext2, name});
    }
    // Index of the first note `msg` (and `ext1` unless -1) so far; -1 if none.
    int find(int msg, int ext1 = -1) {
        const std::vector<Note> all = snapshot();
        const auto it = std::ranges::find_if(all, matching(msg, ext1));
        return it == all.end() ? -1 : static_cast<int>(it - all.begin());
    }
    // The same, once it has come.
    int waitFor(int msg) {
        int found = -1;
        waitUntil([&] { return (found = find(msg)) >= 0; });
        return found;
    }
    int count(int msg, int ext1 = -1) {
        return static_cast<int>(std::ranges::count_if(snapshot(), matching(msg, ext1)));
    }
};

class MediaPlayerTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { sFiles = new MediaTestFiles(); }
    static void TearDownTestSuite() { delete sFiles; }
    void SetUp() override {
        ASSERT_TRUE(sFiles->ok()) << sFiles->error();
        mPlayer = new MediaPlayer();
        mListener = new RecordingListener();
        mPlayer->setListener(mListener);
    }
    void TearDown() override { mPlayer->disconnect(); }
    void open(const std::string& url) {
        ASSERT_EQ(mPlayer->setDataSource(nullptr, url.c_str(), nullptr), android::OK);
    }

    static MediaTestFiles* sFiles;
    sp<MediaPlayer> mPlayer;
    sp<RecordingListener> mListener;
};
MediaTestFiles* MediaPlayerTest::sFiles = nullptr;

struct PlaybackCase {
    const char* name;
    std::string (MediaTestFiles::*file)() const;
    int width, height;  // 0: no video
    bool intact;        // the whole file is there: its duration is the encoded one
};

class MediaPlayerPlaybackTest : public MediaPlayerTest,
                                public ::testing::WithParamInterface<PlaybackCase> {};

TEST_P(MediaPlayerPlaybackTest, PreparesPlaysToTheEndAndNotifiesInOrder) {
    const PlaybackCase& c = GetParam();
    open((sFiles->*c.file)());
    ASSERT_EQ(mPlayer->prepare(), android::OK);
    const int size = mListener->waitFor(android::MEDIA_SET_VIDEO_SIZE);
    ASSERT_GE(size, 0);
    EXPECT_EQ(mListener->snapshot()[size].ext1, c.width);
    EXPECT_EQ(mListener->snapshot()[size].ext2, c.height);
    int durationMs = 0;
    ASSERT_EQ(mPlayer->getDuration(&durationMs), android::OK);
    if (c.intact) {
        EXPECT_NEAR(durationMs, MediaTestFiles::kSeconds * 1000, 100);
    }
    EXPECT_EQ(mListener->count(android::MEDIA_INFO, android::MEDIA_INFO_RENDERING_START), 0)
        << "nothing is rendered before start";

    ASSERT_EQ(mPlayer->start(), android::OK);
    EXPECT_TRUE(mPlayer->isPlaying());
    const int complete = mListener->waitFor(android::MEDIA_PLAYBACK_COMPLETE);
    ASSERT_GE(complete, 0);
    EXPECT_FALSE(mPlayer->isPlaying());
    // Delivered in order: a first frame shown is reported before the end is.
    const int rendering = mListener->find(android::MEDIA_INFO, android::MEDIA_INFO_RENDERING_START);
    if (c.width > 0) {
        EXPECT_GT(rendering, size);
        EXPECT_LT(rendering, complete);
        EXPECT_EQ(mListener->count(android::MEDIA_INFO, android::MEDIA_INFO_RENDERING_START), 1);
    } else {
        EXPECT_EQ(rendering, -1);
    }
    EXPECT_EQ(mListener->count(android::MEDIA_SET_VIDEO_SIZE), 1);
    EXPECT_EQ(mListener->count(android::MEDIA_ERROR), 0);
    int positionMs = -1;
    EXPECT_EQ(mPlayer->getCurrentPosition(&positionMs), android::OK);
    if (c.intact) {
        EXPECT_NEAR(positionMs, durationMs, 100);
    }
    for (const Note& note : mListener->snapshot())
        EXPECT_EQ(note.thread, "MediaPlayerCB") << "message " << note.msg;
    EXPECT_EQ(mPlayer->stop(), android::OK);
}

INSTANTIATE_TEST_SUITE_P(
    Files, MediaPlayerPlaybackTest,
    ::testing::Values(PlaybackCase{"Mp4", &MediaTestFiles::mp4, 320, 240, true},
                      PlaybackCase{"AudioOnly", &MediaTestFiles::audioOnly, 0, 0, true},
                      PlaybackCase{"Truncated", &MediaTestFiles::truncated, 320, 240, false}),
    [](const auto& info) { return std::string(info.param.name); });

// A server that accepts the connection and never answers: prepare waits on it.
struct SilentServer {
    SilentServer() {
        sockaddr_in addr{};
        addr.sin_family = AF_INET;
        addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t len = sizeof addr;
        bind(listenFd, reinterpret_cast<sockaddr*>(&addr), len);
        listen(listenFd, 4);
        getsockname(listenFd, reinterpret_cast<sockaddr*>(&addr), &len);
        url = "http://127.0.0.1:" + std::to_string(ntohs(addr.sin_port)) + "/a.mp4";
    }
    ~SilentServer() {
        if (client >= 0)
            close(client);
        close(listenFd);
    }
    void acceptOne() { client = accept(listenFd, nullptr, nullptr); }
    int listenFd = socket(AF_INET, SOCK_STREAM, 0);
    int client = -1;
    std::string url;
};

class MediaPlayerInterruptTest : public MediaPlayerTest,
                                 public ::testing::WithParamInterface<bool> {};

TEST_P(MediaPlayerInterruptTest, StopOrDisconnectEndsAPrepareThatWaitsOnTheNetwork) {
    const bool disconnect = GetParam();
    TraceCapture trace;
    SilentServer server;
    open(server.url);
    auto prepared = std::async(std::launch::async, [&] { return mPlayer->prepare(); });
    server.acceptOne();  // the player is connected and waiting for an answer
    if (disconnect)
        mPlayer->disconnect();
    else
        EXPECT_EQ(mPlayer->stop(), android::OK);
    ASSERT_EQ(prepared.wait_for(kDeadline), std::future_status::ready);
    EXPECT_EQ(prepared.get(), android::INVALID_OPERATION);
    EXPECT_EQ(mListener->count(android::MEDIA_ERROR), 0);
    EXPECT_EQ(mPlayer->start(), disconnect ? android::NO_INIT : android::INVALID_OPERATION);
}

INSTANTIATE_TEST_SUITE_P(By, MediaPlayerInterruptTest, ::testing::Values(false, true),
                         [](const auto& info) { return info.param ? "Disconnect" : "Stop"; });

// The outputs on one line: "vo ao [option=value ...] [note]".
std::string describe(const android::MediaPlayerOutputs& out) {
    std::string text = out.vo + " " + out.ao;
    for (const auto& [name, value] : out.options)
        text += " " + name + "=" + value;
    return text + (out.note.empty() ? "" : " note");
}

TEST(MediaPlayerOutputsTest, FollowTheSinksAndTheMachine) {
    const struct {
        const char* videoSink;
        const char* audioSink;
        bool surface, display, soundCard;
        const char* outputs;  // "note": a sink had no counterpart and null stands in
    } cases[] = {
        {"", "", true, false, false, "null null"},
        {"", "", true, true, true, "sdl alsa"},
        {"sdl", "", false, true, true, "null alsa"},
        {"sdl", "alsa", true, false, false, "null null note"},
        {"null", "alsa:hw:1,0", true, true, true, "null alsa audio-device=alsa/hw:1,0"},
        {"null", "wav:/tmp/a.wav", true, false, false,
         "null pcm ao-pcm-file=/tmp/a.wav ao-pcm-waveheader=yes"},
        {"y4m:/tmp/v.y4m", "null", true, true, false, "null null note"},
        {"vga", "alsamixer", true, true, true, "null null note"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(std::string(c.videoSink) + " " + c.audioSink);
        EXPECT_EQ(describe(android::MediaPlayerOutputs::choose(c.videoSink, c.audioSink, c.surface,
                                                               c.display, c.soundCard)),
                  c.outputs);
    }
}

}  // namespace
}  // namespace TavoPlayer::test
