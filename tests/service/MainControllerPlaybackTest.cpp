// The whole broadcast pipeline playing tsgen streams from a paced file: what a
// viewer's application is told (first picture, signal, frame rate, captions), what
// reaches the audio output, and the pipeline's threads. Each case is a test of its
// own so that CTest runs them side by side, each in its own process (one demux
// source per process).
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "service/MainController.h"
#include "support/NamedRow.h"
#include "support/Sanitizers.h"
#include "support/ScopedEnv.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

namespace fs = std::filesystem;
using test::PrintTo;
using Clock = std::chrono::steady_clock;

struct Event {
    double atSec;  // since start()
    std::string what;
};

// Everything the controller reports upward, stamped with the time since start.
class Viewer : public ServiceController::ServiceControllerListener,
               public VideoRenderer::FrameRenderedListener,
               public ClosedCaptionListener,
               public test::Recorded<Event> {
public:
    Clock::time_point started = Clock::now();

    void onServiceControllerEvent(ServiceController::event_t e, unsigned a, unsigned b) override {
        static const char* const kNames[] = {"SIGNAL",    "BUFFERING_BEGIN",  "BUFFERING_END",
                                             "BUFFERING", "START_VIDEO_TASK", "EOC"};
        if (e == ServiceController::BUFFERING_EVENT)
            return;
        add(std::string(kNames[e]) + "(" + std::to_string(a) + "," + std::to_string(b) + ")");
    }
    void onFrameRendered(int, int, Uint33) override { ++frames; }
    void onFirstFrameRendered(int, int) override {}
    // The text comes as 4-byte code points; the captions here are ASCII.
    void onClosedCaptionReceived(unsigned char* text, int length) override {
        std::string utf8;
        for (int i = 0; i + 4 <= length; i += 4) {
            uint32_t cp;
            memcpy(&cp, text + i, 4);
            utf8 += cp < 0x80 ? static_cast<char>(cp) : '?';
        }
        add("CAPTION " + utf8);
    }

    // The time of the first event starting with `prefix` at or after `from`, or -1.
    double firstAt(const std::string& prefix, double from = 0) {
        for (const Event& e : snapshot())
            if (e.atSec >= from && e.what.rfind(prefix, 0) == 0)
                return e.atSec;
        return -1;
    }
    std::atomic<size_t> frames{0};

private:
    void add(const std::string& what) {
        push({std::chrono::duration<double>(Clock::now() - started).count(), what});
    }
};

class LivePlayback : public testing::Test {
protected:
    void SetUp() override {
        ASSERT_FALSE(mDir.path().empty());
        setenv("TAVOPLAYER_PROP_tavoplayer_video_sink", "null", 1);
        setenv("TAVOPLAYER_PROP_tavoplayer_audio_sink", ("wav:" + wavPath()).c_str(), 1);
    }
    void TearDown() override {
        if (mController != nullptr) {
            mController->stop();
            mController.clear();
        }
    }
    std::string wavPath() const { return mDir / "out.wav"; }

    static bool tsgen(const std::string& path, const std::string& options) {
        return test::runCommand(std::string(TAVO_TSGEN_PATH) + " -o " + path + " " + options)
                   .exitCode == 0;
    }
    // Makes the stream and starts a controller on it with the PIDs tsgen uses.
    void play(const std::string& tsgenOptions, std::map<std::string, std::string> extra = {}) {
        const std::string ts = mDir / "s.ts";
        ASSERT_TRUE(tsgen(ts, tsgenOptions));
        ASSERT_EQ(startOn("file:" + ts, std::move(extra)), 0u);
    }
    // Configures a controller on `source` and starts it: start's result.
    unsigned int startOn(const std::string& source, std::map<std::string, std::string> extra) {
        setenv("TAVOPLAYER_PROP_tavoplayer_demux_source", source.c_str(), 1);
        std::map<std::string, std::string> config = {{"sourceType", "0"},  {"pcrPid", "273"},
                                                     {"videoPid", "273"},  {"audioPid", "274"},
                                                     {"IsLATMAudio", "1"}, {"subtitlePid", "304"}};
        for (const auto& [key, value] : extra)
            config[key] = value;
        mController = new MainController();
        EXPECT_EQ(mController->configure(config), 0u);
        mController->setServiceControllerListener(&mViewer);
        mController->setVideoRenderedListener(&mViewer);
        mController->setCaptionListener(&mViewer);
        android::sp<android::Surface> surface = android::Surface::create();
        mController->setSurface(surface);
        mViewer.started = Clock::now();
        return mController->start();
    }
    void sleepUntil(double sec) {
        std::this_thread::sleep_until(mViewer.started +
                                      std::chrono::milliseconds(static_cast<int>(sec * 1000)));
    }
    std::string eventLog() {
        std::string log;
        for (const Event& e : mViewer.snapshot())
            log += std::to_string(e.atSec) + " " + e.what + "\n";
        return log;
    }

    test::TempDir mDir{"tavo-live"};
    Viewer mViewer;
    android::sp<MainController> mController;
};

// Test names from the rows' names.
const auto kByName = [](const auto& info) { return std::string(info.param.name); };

// One row per way a programme carries its audio and clock.
struct Carriage {
    const char* name;
    const char* tsgenOptions;
    std::map<std::string, std::string> config;
};

class LiveCarriage : public LivePlayback, public testing::WithParamInterface<Carriage> {};

TEST_P(LiveCarriage, ShowsPicturesPlaysSoundAndCaptionsInOrder) {
    play(std::string("-d 9 --caption '2:Um' --caption '4:Dois' ") + GetParam().tsgenOptions,
         GetParam().config);
    sleepUntil(6);
    const int fps = mController->getFrameRate();
    sleepUntil(9);
    EXPECT_GE(mViewer.firstAt("START_VIDEO_TASK(1920,1080)"), 0) << eventLog();
    // Field pairs count as one frame: 29.97 Hz.
    EXPECT_GE(fps, 25);
    EXPECT_LE(fps, 35);
    const double one = mViewer.firstAt("CAPTION Um");
    const double two = mViewer.firstAt("CAPTION Dois");
    EXPECT_GT(one, 0) << eventLog();
    EXPECT_GT(two, one) << eventLog();
    // 2 s apart in the stream, 2 s apart on screen.
    EXPECT_NEAR(two - one, 2.0, 0.5);
    mController->stop();
    // The tone reached the output: seconds of 48 kHz stereo 16-bit PCM.
    EXPECT_GT(fs::file_size(wavPath()), 3u * 48000 * 4) << eventLog();
}

INSTANTIATE_TEST_SUITE_P(
    Tsgen, LiveCarriage,
    testing::Values(Carriage{"Latm", "", {}},
                    Carriage{"Adts", "--audio adts", {{"IsLATMAudio", "0"}}},
                    Carriage{"Mp2", "--audio mp2", {{"IsLATMAudio", "0"}, {"isMPEG2Audio", "1"}}},
                    Carriage{"SeparatePcrPid", "--pcr-pid 0x200", {{"pcrPid", "512"}}},
                    // AAC whose PMT names the other transport, played as the PMT says:
                    // the extractor finds the real one.
                    Carriage{"LatmAsAdts", "--latm-as-adts", {{"IsLATMAudio", "0"}}},
                    Carriage{"AdtsAsLatm", "--audio adts --adts-as-latm", {{"IsLATMAudio", "1"}}}),
    kByName);

TEST_F(LivePlayback, WithoutAudioThePlaybackTimerEnablesTheOutputs) {
    SKIP_IF_TIMERS_UNSUPPORTED();
    // An audio PID that no packet carries (PID 0 would feed the PAT to the audio chain).
    play("-d 20 --audio none", {{"audioPid", "8190"}});
    sleepUntil(18.5);
    // Nothing else ends the buffering: the 17 s timer does.
    const double end = mViewer.firstAt("BUFFERING_END");
    EXPECT_GT(end, 16.5) << eventLog();
    EXPECT_LT(end, 18.5) << eventLog();
    EXPECT_GE(mViewer.firstAt("START_VIDEO_TASK(1920,1080)"), 0) << eventLog();
}

// One row per stream fault that the pipeline must ride out: pictures and sound go on
// after it, and the viewer is not told of a signal loss. Every fault lands 2 s into
// the stream, shown about 4.7 s after start (0.7 s of multiplex lead plus the 2 s
// offset); frames are counted over the 5 s after that.
struct Fault {
    const char* name;
    const char* tsgenOptions;
};

class LiveFault : public LivePlayback, public testing::WithParamInterface<Fault> {};

TEST_P(LiveFault, PicturesAndSoundCarryOnWithoutASignalLoss) {
    play(std::string("-d 11 ") + GetParam().tsgenOptions);
    sleepUntil(6);
    const size_t before = mViewer.frames.load();
    sleepUntil(11);
    // 29.97 pictures a second: 150 in 5 s; a stall of a second or more falls short.
    EXPECT_GT(mViewer.frames.load() - before, 110u) << eventLog();
    // The signal check may call the signal late once at 0.3 s, before the first sound
    // has reported; from 3 s on (the fault is shown at about 4.7 s) nothing may.
    EXPECT_LT(mViewer.firstAt("SIGNAL", 3.0), 0) << eventLog();
    mController->stop();
    EXPECT_GT(fs::file_size(wavPath()), 6u * 48000 * 4) << eventLog();
}

// Video runs at about 5,300 packets a second and audio at about 90 in tsgen's
// default multiplex: the indices below fall near 2 s.
INSTANTIATE_TEST_SUITE_P(
    Tsgen, LiveFault,
    testing::Values(
        // The PCR alone runs 25 s ahead of the PTS for 3 s, with no discontinuity
        // announced (ISO/IEC 13818-1, 2.4.3.5): the clock ignores it while it is more
        // than 20 s off and takes it back once it is near the PTS again.
        Fault{"PcrJump25s", "--pcr-jump 2:25000 --pcr-jump 5:-25000"},
        // An announced new time base: PCR and PTS move together.
        Fault{"AnnouncedTimeBaseJump", "--timebase-jump 2:5000"},
        Fault{"ContinuityErrors", "--cc-error 0x111:13000:3 --cc-error 0x112:230:2"},
        Fault{"DroppedPackets", "--drop 0x111:13500:40 --drop 0x112:240:3"},
        // The time stamps wrap at 2^33 (ISO/IEC 13818-1, 2.4.3.7) 3 s into the stream.
        Fault{"PtsWrapsAt2Pow33", "--start-pts 8589664592"}),
    kByName);

// The audio that reaches the output is FFmpeg's decode of the same frames: from 2 s to
// 6 s of the stream every sample is FFmpeg's, give or take the last bit of its float to
// 16-bit rounding, and none is missing (the renderer may only add silence before the
// first frame and cut frames that are late at the start).
TEST_F(LivePlayback, TheSoundIsFFmpegsDecodeOfTheStream) {
    play("-d 8 --no-caption-stream");
    sleepUntil(10.5);
    ASSERT_EQ(mController->stop(), 0u);
    const std::string reference = mDir / "ref.pcm";
    const test::CommandResult ffmpeg =
        test::runCommand("ffmpeg -v error -i " + (mDir / "s.ts") +
                         " -map 0:a:0 -f s16le -acodec pcm_s16le " + reference);
    ASSERT_EQ(ffmpeg.exitCode, 0) << ffmpeg.err;
    auto samples = [](const std::string& path, size_t skip) {
        const std::string bytes = test::fileText(path);
        std::vector<int16_t> out((bytes.size() - std::min(skip, bytes.size())) / 2);
        memcpy(out.data(), bytes.data() + skip, out.size() * 2);
        return out;
    };
    const std::vector<int16_t> played = samples(wavPath(), 44);
    const std::vector<int16_t> expected = samples(reference, 0);
    constexpr size_t kSecond = 48000 * 2;
    ASSERT_GE(expected.size(), 6 * kSecond);
    // Align on the first 32 samples from 2 s on that stand in the output exactly.
    std::ptrdiff_t shift = -1;
    for (size_t at = 2 * kSecond; shift < 0 && at < 3 * kSecond; at += 64) {
        auto hit = std::search(played.begin(), played.end(), expected.begin() + at,
                               expected.begin() + at + 32);
        if (hit != played.end())
            shift = (hit - played.begin()) - static_cast<std::ptrdiff_t>(at);
    }
    ASSERT_GE(shift, 0) << "FFmpeg's PCM is nowhere in the output";
    ASSERT_GE(played.size(), shift + 6 * kSecond);
    size_t off = 0;
    for (size_t i = 2 * kSecond; i < 6 * kSecond; ++i)
        off += std::abs(played[shift + i] - expected[i]) > 1;
    EXPECT_EQ(off, 0u) << "samples more than 1 off FFmpeg's";
}

// The viewer switches the audio to a PID that carries sound and turns captions on for
// a programme that had none, both while playing.
TEST_F(LivePlayback, AudioAndCaptionPidsChangeWhilePlaying) {
    // Caption management every second, as broadcasters send it: the caption's PES is
    // handed on when the next one starts.
    play("-d 8 --caption-mgmt-interval 1 --caption '5:Cinco'",
         {{"audioPid", "8190"}, {"subtitlePid", "8189"}});
    sleepUntil(1);
    EXPECT_EQ(mController->setAudioPID(274), 0u);
    EXPECT_EQ(mController->setCCPID(304), 0u);
    sleepUntil(9);
    mController->stop();
    EXPECT_GT(mViewer.firstAt("CAPTION Cinco"), 0) << eventLog();
    EXPECT_GT(fs::file_size(wavPath()), 3u * 48000 * 4) << eventLog();
}

// A tsgen stream dropped into the recordings folder plays as a recorded clip: the
// service catalogues it on first use.
TEST_F(LivePlayback, RecordedClipPausesSeeksAndEndsOnce) {
    test::ScopedRecordingsDir scoped;
    const std::string& recordings = scoped.path();
    ASSERT_TRUE(tsgen(recordings + "/1.ts", "-d 8 --pcr-interval-ms 100"));
    // As the URI parser leaves a FILE path: without its last character.
    play("-d 1", {{"sourceType", "2"}, {"filePath", recordings + "/1.t"}});
    sleepUntil(3);
    // The clock stands still while paused, and the clip with it.
    const int64_t paused = mController->getPCRValue();
    ASSERT_EQ(mController->pause(), 0u);
    std::this_thread::sleep_for(std::chrono::milliseconds(1500));
    ASSERT_EQ(mController->resume(), 0u);
    const int64_t resumed = mController->getPCRValue();
    EXPECT_GT(paused, 0);
    EXPECT_LT(std::llabs(resumed - paused), 27000) << "more than 0.3 s moved during the pause";
    ASSERT_EQ(mController->seek(1000), 0u);
    sleepUntil(16);
    size_t ends = 0;
    for (const Event& e : mViewer.snapshot())
        ends += e.what == "EOC(0,0)";
    EXPECT_EQ(ends, 1u) << eventLog();
}

// Start/stop and whole controllers over and over: no descriptor, thread or mapping
// may be left behind.
TEST_F(LivePlayback, RepeatedCyclesLeaveNothingBehind) {
    auto count = [](const char* path) {
        return static_cast<size_t>(std::distance(fs::directory_iterator(path), {}));
    };
    // The rings' shared memory: libcutils backs each region with an unlinked file
    // named android-ashmem-*, mapped twice.
    auto sharedMappings = [] {
        std::ifstream maps("/proc/self/maps");
        size_t n = 0;
        for (std::string line; std::getline(maps, line);)
            n += line.find("android-ashmem") != std::string::npos;
        return n;
    };
    const size_t threadsBefore = count("/proc/self/task");
    play("-d 2 --size 320x240 --mux-rate 1500000");
    ASSERT_EQ(mController->stop(), 0u);
    const size_t fds = count("/proc/self/fd");
    const size_t whilePlaying = sharedMappings();
    for (int i = 0; i < 100; ++i) {
        ASSERT_EQ(mController->start(), 0u);
        ASSERT_EQ(mController->stop(), 0u);
    }
    mController.clear();
    for (int i = 0; i < 100; ++i) {
        android::sp<MainController> controller = new MainController();
        std::map<std::string, std::string> config = {{"pcrPid", "273"}, {"videoPid", "273"}};
        ASSERT_EQ(controller->configure(config), 0u);
    }
    // The controller's own rings and threads are gone with it.
    EXPECT_LE(count("/proc/self/fd"), fds);
    EXPECT_EQ(sharedMappings(), 0u);
    EXPECT_GT(whilePlaying, 0u);  // the count sees the rings at all
    // glibc keeps one SIGEV_THREAD helper for the playback timer; ThreadSanitizer's
    // runtime starts a thread of its own with the first thread it sees.
    const size_t kept = 1 + (test::kThreadSanitizer ? 1 : 0);
    EXPECT_TRUE(test::waitUntil([&] { return count("/proc/self/task") <= threadsBefore + kept; }))
        << count("/proc/self/task") << " threads, " << threadsBefore << " before";
}

// What a viewer's application may hand over or tune to that cannot play: each row
// gives the designed result of start and leaves a controller that stops and goes away
// without a hang or a leaked descriptor.
struct BadInput {
    const char* name;
    const char* source;  // "" for a tsgen stream, "nulls" for a file of null packets
    std::map<std::string, std::string> config;
    unsigned int started;
};

class LiveBadInput : public LivePlayback, public testing::WithParamInterface<BadInput> {};

TEST_P(LiveBadInput, StartGivesTheDesignedResultAndTheControllerGoesAway) {
    const size_t fds = std::distance(fs::directory_iterator("/proc/self/fd"), {});
    std::string source = GetParam().source;
    if (source.empty() || source == "nulls") {
        const std::string ts = mDir / "s.ts";
        if (source.empty()) {
            ASSERT_TRUE(tsgen(ts, "-d 3 --size 320x240 --mux-rate 1500000"));
        } else {
            // Null packets only (ISO/IEC 13818-1, 2.4.3.3: PID 0x1FFF).
            std::string nulls;
            for (int i = 0; i < 10000; ++i)
                nulls += std::string("\x47\x1F\xFF\x10", 4) + std::string(184, '\xFF');
            std::ofstream(ts, std::ios::binary) << nulls;
        }
        source = "file:" + ts;
    }
    EXPECT_EQ(startOn(source, GetParam().config), GetParam().started);
    sleepUntil(3);
    // Nothing that plays was there to show.
    if (GetParam().started != 0 || GetParam().source[0] != '\0') {
        EXPECT_LT(mViewer.firstAt("START_VIDEO_TASK"), 0) << eventLog();
    }
    mController->stop();
    mController.clear();
    EXPECT_LE(std::distance(fs::directory_iterator("/proc/self/fd"), {}), fds);
}

INSTANTIATE_TEST_SUITE_P(Tsgen, LiveBadInput,
                         testing::Values(
                             // PIDs are 13 bits: the receiver's filter refuses a larger one.
                             BadInput{"VideoPidAbove8191", "", {{"videoPid", "9000"}}, 0x11004},
                             BadInput{"NegativeCaptionPid", "", {{"subtitlePid", "-5"}}, 0x11004},
                             // Numbers are read with atoi: a word or nothing reads 0 and plays on.
                             BadInput{"AudioPidNotANumber", "", {{"audioPid", "abc"}}, 0},
                             BadInput{"EmptySourceType", "", {{"sourceType", ""}}, 0},
                             BadInput{"SourceWithoutPackets", "udp://127.0.0.1:45987", {}, 0},
                             BadInput{"OnlyNullPackets", "nulls", {}, 0}),
                         kByName);

// Streams that no one here wrote, from ../shared/streams: every packet of their video
// and audio PIDs reaches the receiver's rings (a capture's 16-byte ISDB-T trailers
// dropped), and whatever complete pictures and sound they carry reach the outputs.
struct Capture {
    const char* name;  // the file
    size_t packetSize;
    std::map<std::string, std::string> config;
    const char* picture;  // the first picture's announcement, or nullptr when none is whole
};

class LiveCapture : public LivePlayback, public testing::WithParamInterface<Capture> {
protected:
    // Packets of `pid` in the capture.
    size_t packetsOf(const std::string& path, int pid) {
        const std::string bytes = test::fileText(path);
        size_t n = 0;
        for (size_t at = 0; at + 188 <= bytes.size(); at += GetParam().packetSize)
            n += ((bytes[at + 1] & 0x1F) << 8 | static_cast<uint8_t>(bytes[at + 2])) == pid;
        return n;
    }
    // Bytes ever written into the named ring, from its dump's head counter.
    uint64_t writtenInto(const char* ring) {
        for (const auto& r : mController->rings()) {
            if (r->name() != ring)
                continue;
            const std::string dump = test::printed([&](FILE* out) { r->dump(out, 0); });
            const size_t head = dump.find("Head: ");
            return head == std::string::npos ? 0 : std::stoull(dump.substr(head + 6));
        }
        return 0;
    }
};

TEST_P(LiveCapture, EveryPacketReachesItsRingAndWholeUnitsReachTheOutputs) {
    const std::string path = std::string(TAVO_SHARED_STREAMS_DIR) + "/" + GetParam().name;
    if (!fs::exists(path))
        GTEST_SKIP() << "no " << path << " (the shared sample streams are not beside the checkout)";
    ASSERT_EQ(startOn("file:" + path, GetParam().config), 0u);
    sleepUntil(13);  // the longest capture lasts 10 s
    const int video = atoi(GetParam().config.at("videoPid").c_str());
    const int audio = atoi(GetParam().config.at("audioPid").c_str());
    EXPECT_EQ(writtenInto("VideoTS"), 188 * packetsOf(path, video));
    EXPECT_EQ(writtenInto("AudioTS"), 188 * packetsOf(path, audio));
    if (GetParam().picture != nullptr) {
        EXPECT_GE(mViewer.firstAt(GetParam().picture), 0) << eventLog();
        mController->stop();
        EXPECT_GT(fs::file_size(wavPath()), 5u * 48000 * 4) << eventLog();
    } else {
        EXPECT_LT(mViewer.firstAt("START_VIDEO_TASK"), 0) << eventLog();
    }
}

INSTANTIATE_TEST_SUITE_P(
    SharedStreams, LiveCapture,
    testing::Values(
        // TV Integração (ISDB-Tb), 204-byte packets: 156 video packets without a whole
        // access unit, one LATM PES start.
        Capture{"isdbtb_br_tvintegracao_rs204_pcap_329pkts.ts",
                204,
                {{"pcrPid", "256"},
                 {"videoPid", "273"},
                 {"audioPid", "274"},
                 {"IsLATMAudio", "1"},
                 {"subtitlePid", "278"}},
                nullptr},
        // 10 s of 1080p H.264 with MPEG-1 Layer II audio, PCR on the video PID.
        Capture{"dvb_h264_1080_mpeg1audio_0x03.ts",
                188,
                {{"pcrPid", "256"},
                 {"videoPid", "256"},
                 {"audioPid", "257"},
                 {"IsLATMAudio", "0"},
                 {"isMPEG2Audio", "1"},
                 {"subtitlePid", "8189"}},
                "START_VIDEO_TASK(1920,1080)"}),
    [](const testing::TestParamInfo<Capture>& info) {
        return std::string(info.param.name).substr(0, std::string(info.param.name).find('.'));
    });

}  // namespace
}  // namespace TavoPlayer
