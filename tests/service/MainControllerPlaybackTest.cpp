// The whole broadcast pipeline playing tsgen streams from a paced file: what a
// viewer's application is told (first picture, signal, frame rate, captions), what
// reaches the audio output, and the pipeline's threads. Each case is a test of its
// own so that CTest runs them side by side, each in its own process (one demux
// source per process).
#include <dirent.h>
#include <gtest/gtest.h>
#include <time.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "service/MainController.h"

namespace TavoPlayer {
namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

struct Event {
    double atSec;  // since start()
    std::string what;
};

// Everything the controller reports upward, stamped with the time since start.
class Viewer : public ServiceController::ServiceControllerListener,
               public VideoRenderer::FrameRenderedListener,
               public AudioRenderer::AudioRenderedListener,
               public ClosedCaptionListener {
public:
    Clock::time_point started = Clock::now();

    void onServiceControllerEvent(ServiceController::event_t e, unsigned a, unsigned b) override {
        static const char* const kNames[] = {"SIGNAL",    "BUFFERING_BEGIN",  "BUFFERING_END",
                                             "BUFFERING", "START_VIDEO_TASK", "EOC"};
        if (e == ServiceController::BUFFERING_EVENT)
            return;
        add(std::string(kNames[e]) + "(" + std::to_string(a) + "," + std::to_string(b) + ")");
    }
    void onFrameRendered(int, int, Uint33) override {
        std::lock_guard<std::mutex> lock(mLock);
        ++frames;
    }
    void onFirstFrameRendered(int w, int h) override {
        add("FIRST_FRAME(" + std::to_string(w) + "," + std::to_string(h) + ")");
    }
    void onAudioRendered() override {}
    void onAudioReady(long) override {}
    void onAudioSessionId(int) override {}
    void onClosedCaptionReceived(unsigned char* text, int length) override {
        std::string utf8;
        for (int i = 0; i + 4 <= length; i += 4) {
            uint32_t cp;
            memcpy(&cp, text + i, 4);
            if (cp < 0x80)
                utf8 += static_cast<char>(cp);
            else
                utf8 += '?';
        }
        add("CAPTION " + utf8);
    }

    std::vector<Event> events() {
        std::lock_guard<std::mutex> lock(mLock);
        return mEvents;
    }
    // The time of the first event starting with `prefix` at or after `from`, or -1.
    double firstAt(const std::string& prefix, double from = 0) {
        for (const Event& e : events())
            if (e.atSec >= from && e.what.rfind(prefix, 0) == 0)
                return e.atSec;
        return -1;
    }
    size_t frameCount() {
        std::lock_guard<std::mutex> lock(mLock);
        return frames;
    }

private:
    void add(const std::string& what) {
        std::lock_guard<std::mutex> lock(mLock);
        mEvents.push_back({std::chrono::duration<double>(Clock::now() - started).count(), what});
    }
    std::mutex mLock;
    std::vector<Event> mEvents;
    size_t frames = 0;
};

std::vector<std::string> threadNames() {
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator("/proc/self/task")) {
        std::ifstream comm(entry.path() / "comm");
        std::string name;
        std::getline(comm, name);
        names.push_back(name);
    }
    return names;
}

class LivePlayback : public testing::Test {
protected:
    void SetUp() override {
        mDir = fs::temp_directory_path() /
               ("tavo-live-" + std::to_string(getpid()) + "-" +
                testing::UnitTest::GetInstance()->current_test_info()->name());
        fs::create_directories(mDir);
        setenv("TAVOPLAYER_PROP_tavoplayer_video_sink", "null", 1);
        setenv("TAVOPLAYER_PROP_tavoplayer_audio_sink", ("wav:" + wavPath()).c_str(), 1);
    }
    void TearDown() override {
        if (mController != nullptr) {
            mController->stop();
            mController.clear();
        }
        fs::remove_all(mDir);
    }
    std::string wavPath() const { return (mDir / "out.wav").string(); }

    // Makes the stream and starts a controller on it with the PIDs tsgen uses.
    void play(const std::string& tsgenOptions, std::map<std::string, std::string> extra = {}) {
        const std::string ts = (mDir / "s.ts").string();
        ASSERT_EQ(system((std::string(TAVO_TSGEN_PATH) + " -o " + ts + " " + tsgenOptions +
                          " >/dev/null 2>&1")
                             .c_str()),
                  0);
        setenv("TAVOPLAYER_PROP_tavoplayer_demux_source", ("file:" + ts).c_str(), 1);
        std::map<std::string, std::string> config = {{"sourceType", "0"},  {"pcrPid", "273"},
                                                     {"videoPid", "273"},  {"audioPid", "274"},
                                                     {"IsLATMAudio", "1"}, {"subtitlePid", "304"}};
        for (const auto& [key, value] : extra)
            config[key] = value;
        mController = new MainController();
        ASSERT_EQ(mController->configure(config), 0u);
        mController->setServiceControllerListener(&mViewer);
        mController->setVideoRenderedListener(&mViewer);
        mController->setAudioRenderedListener(&mViewer);
        mController->setCaptionListener(&mViewer);
        android::sp<android::Surface> surface = android::Surface::create();
        mController->setSurface(surface);
        mViewer.started = Clock::now();
        ASSERT_EQ(mController->start(), 0u);
    }
    void sleepUntil(double sec) {
        std::this_thread::sleep_until(mViewer.started +
                                      std::chrono::milliseconds(static_cast<int>(sec * 1000)));
    }
    std::string eventLog() {
        std::string log;
        for (const Event& e : mViewer.events())
            log += std::to_string(e.atSec) + " " + e.what + "\n";
        return log;
    }

    fs::path mDir;
    Viewer mViewer;
    android::sp<MainController> mController;
};

// One row per way a programme carries its audio and clock.
struct Carriage {
    const char* name;
    const char* tsgenOptions;
    std::map<std::string, std::string> config;
};
void PrintTo(const Carriage& c, std::ostream* os) {
    *os << c.name;
}

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
                    Carriage{"SeparatePcrPid", "--pcr-pid 0x200", {{"pcrPid", "512"}}}),
    [](const testing::TestParamInfo<Carriage>& info) { return std::string(info.param.name); });

TEST_F(LivePlayback, WithoutAudioThePlaybackTimerEnablesTheOutputs) {
    // An audio PID that no packet carries (PID 0 would feed the PAT to the audio chain).
    play("-d 20 --audio none", {{"audioPid", "8190"}});
    sleepUntil(18.5);
    // Nothing else ends the buffering: the 17 s timer does.
    const double end = mViewer.firstAt("BUFFERING_END");
    EXPECT_GT(end, 16.5) << eventLog();
    EXPECT_LT(end, 18.5) << eventLog();
    EXPECT_GE(mViewer.firstAt("START_VIDEO_TASK(1920,1080)"), 0) << eventLog();
}

TEST_F(LivePlayback, ASignalGapIsReportedLateThenLostThenGoodAgain) {
    // 12 s without packets: the 2 s the pipeline holds, then late after 3 s without
    // pictures or sound, lost 5 s later, good when the packets come back.
    play("-d 19 --gap 3:12000");
    sleepUntil(21);
    const std::string log = eventLog();
    const double late = mViewer.firstAt("SIGNAL(0,1)");
    const double lost = mViewer.firstAt("SIGNAL(1,2)");
    const double good = mViewer.firstAt("SIGNAL(2,0)");
    ASSERT_GT(late, 0) << log;
    // Late 3 s after the last picture, lost 5 s after that, good with the next one,
    // which announces itself again.
    EXPECT_GT(lost - late, 4.0) << log;
    EXPECT_LT(lost - late, 6.5) << log;
    EXPECT_GT(good, lost) << log;
    EXPECT_GE(mViewer.firstAt("START_VIDEO_TASK", good - 0.5), good - 0.5) << log;
}

TEST_F(LivePlayback, TimeStampsWrappingAt2Pow33KeepThePicturesComing) {
    // The first picture 3 s before the wrap.
    play("-d 8 --start-pts 8589664592");
    sleepUntil(4);
    const size_t beforeWrap = mViewer.frameCount();
    sleepUntil(8);
    const size_t afterWrap = mViewer.frameCount() - beforeWrap;
    EXPECT_GT(beforeWrap, 0u) << eventLog();
    // About 4 s of pictures after the wrap, not a stall.
    EXPECT_GT(afterWrap, 80u) << eventLog();
}

TEST_F(LivePlayback, MislabelledAudioStillPlays) {
    // LATM in a stream whose PMT says ADTS, played as the PMT says.
    play("-d 7 --latm-as-adts", {{"IsLATMAudio", "0"}});
    sleepUntil(7);
    mController->stop();
    EXPECT_GT(fs::file_size(wavPath()), 2u * 48000 * 4) << eventLog();
}

TEST_F(LivePlayback, EveryPipelineThreadIsNamedAndNoneOutlivesStop) {
    const std::vector<std::string> before = threadNames();
    play("-d 6");
    sleepUntil(4);
    const std::vector<std::string> playing = threadNames();
    const std::multiset<std::string> names(playing.begin(), playing.end());
    // /proc shows at most 15 characters of a name.
    for (const char* expected :
         {"TSReceiver", "TSParser", "MCInputThread", "MCOutputThread", "VideoRenderer",
          "AudioRenderer", "CCWorkerThread", "CCWorkerThreadR", "OutputDeviceThr", "PollingThread"})
        EXPECT_EQ(names.count(expected) > 0, true) << "no thread named " << expected;
    EXPECT_EQ(names.count("TSParser"), 4u);
    ASSERT_EQ(mController->stop(), 0u);
    mController.clear();
    // Joined threads may linger a moment after their join. glibc keeps one helper
    // thread for SIGEV_THREAD timers (the playback timer) for the process's life.
    std::vector<std::string> after;
    for (int i = 0; i < 50; ++i) {
        after = threadNames();
        if (after.size() <= before.size() + 1)
            break;
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    EXPECT_LE(after.size(), before.size() + 1) << testing::PrintToString(after);
    for (const std::string& name : after)
        EXPECT_EQ(name.rfind("tavo_", 0), 0u) << "left behind: " << name;
}

}  // namespace
}  // namespace TavoPlayer
