#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/dtv/Demux.h"
#include "platform/dtv/DemuxBinder.h"
#include "platform/dtv/RecPlayerBinder.h"
#include "platform/dtv/RecPlayerService.h"
#include "platform/dtv/RecordingCatalog.h"

#include <sqlite3.h>
#include <functional>
#include "DemuxTestUtil.h"
#include "support/ScopedEnv.h"
#include "support/TsReader.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using namespace std::chrono_literals;
using namespace test;
namespace fs = std::filesystem;

constexpr uint16_t kVideo = 0x111;
constexpr uint16_t kAudio = 0x112;
constexpr uint16_t kCaptions = 0x130;

// A tsgen stream of `seconds` with two captions, made once per test program.
const std::string& tsgenStream(int seconds) {
    return test::tsgenStream(seconds, "--caption 2:Hello --caption 12:World");
}

// Events from the service, as the recorder and the clip player receive them.
struct EventLog : Recorded<int> {
    static void callback(int event, void* userData) {
        static_cast<EventLog*>(userData)->push(event);
    }
    bool waitFor(int event) const {
        return Recorded::waitFor([&](auto& all) { return std::ranges::count(all, event) > 0; });
    }
};

// What ffprobe reads of a file (its codec names unless told), or why it failed.
std::string probe(const std::string& path, const char* entries = "stream=codec_name") {
    const auto run = runCommand(std::string("ffprobe -v error -show_entries ") + entries +
                                " -of csv=p=0 " + path + " 2>&1");
    return run.exitCode == 0 ? run.out : "ffprobe failed: " + run.out;
}

void freeDetails(RecDetails* d) {
    if (d == nullptr)
        return;
    free(d->stationName);
    free(d->prgName);
    free(d);
}
using Details = std::unique_ptr<RecDetails, decltype(&freeDetails)>;

// What the clip player's opening of `path` gives; null when the path opens no clip.
Details clipDetails(const std::string& path) {
    return {RecPlayerBinder_GetRecClipDetails(path.c_str(), 1), freeDetails};
}

// Every test has a recordings folder of its own and leaves the service idle.
class RecordingServiceTest : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_FALSE(dir.empty()); }
    void TearDown() override {
        RecPlayerBinder_DeleteTSRecorder();
        EXPECT_TRUE(RecPlayerService::instance().events().drain(kDeadline));
        EXPECT_FALSE(Demux::instance().sourceStats().open);
    }
    // Creates and starts a recording of the tsgen PIDs; returns its number.
    int record(EventLog& events) {
        EXPECT_EQ(
            RecPlayerBinder_CreateTSRecorder(0, 2, kVideo, kAudio, 1, EventLog::callback, &events),
            1);
        EXPECT_EQ(RecPlayerBinder_AnyMoreRecordings(), 1);
        EXPECT_EQ(RecPlayerBinder_StartTSRecorder(), 1);
        const Details d(RecPlayerBinder_GetCurrTSRecDetails(), freeDetails);
        EXPECT_NE(d, nullptr);
        if (d == nullptr)
            return 0;
        // As the recorder fills it in.
        char station[] = "TV Tavo", programme[] = "News";
        RecDetails copy = *d;
        copy.stationName = station;
        copy.stationNameLength = sizeof station - 1;
        copy.prgName = programme;
        copy.prgNameLength = sizeof programme - 1;
        EXPECT_EQ(RecPlayerBinder_SetCurrTSRecDetails(&copy), 1);
        return d->fileNumName;
    }
    // Records the whole of `source`, unpaced, until the demux ends under the
    // recording; returns the recording's number.
    int recordWhole(const std::string& source) {
        ScopedDemuxSource demux("file:" + source + "?pace=none");
        EventLog events;
        const int number = record(events);
        EXPECT_TRUE(events.waitFor(kRecEventDemuxLost));
        EXPECT_EQ(RecPlayerBinder_StopTSRecorder(), 1);
        EXPECT_EQ(RecPlayerBinder_DeleteTSRecorder(), 1);
        return number;
    }
    std::string file(int number) const { return dir + "/" + std::to_string(number) + ".ts"; }
    std::optional<RecordingCatalog::Entry> row(int number) {
        RecordingCatalog catalog(dir);
        EXPECT_EQ(catalog.open(), RecordingCatalog::Status::kOk);
        return catalog.get(number);
    }
    ScopedRecordingsDir recordings;
    const std::string dir = recordings.path();
};

TEST_F(RecordingServiceTest, RecordsTheLivePacketsOfItsPidsUnchangedInOrderInAPlayableFile) {
    const std::string& source = tsgenStream(20);
    const int number = recordWhole(source);
    ASSERT_GT(number, 0);

    const std::string path = file(number);
    const std::vector<uint8_t> live = fileBytes(source);
    const std::vector<uint8_t> recorded = fileBytes(path);
    ASSERT_EQ(recorded.size() % 188, 0u);
    // PID by PID, the recording holds the live packets from the moment it started
    // to the end, unchanged; the PAT and PMT are the recording's own.
    for (uint16_t pid : {kVideo, kAudio, kCaptions}) {
        const auto want = summary(toPackets(bytesOfPid(live, pid)));
        const auto got = summary(toPackets(bytesOfPid(recorded, pid)));
        ASSERT_FALSE(got.empty()) << "PID " << pid;
        const auto start = std::find(want.begin(), want.end(), got.front());
        ASSERT_NE(start, want.end()) << "PID " << pid;
        // Only what passed before the programme's tables were read is missing.
        EXPECT_LE(start - want.begin(), std::max<long>(2, static_cast<long>(want.size() / 10)))
            << "PID " << pid;
        EXPECT_EQ(got, std::vector<std::string>(start, want.end())) << "PID " << pid;
    }
    std::vector<uint16_t> pids;  // and the recording's own PAT and PMT, and nothing else
    for (const auto& [pid, packets] : packetsByPid(recorded))
        pids.push_back(pid);
    EXPECT_EQ(pids, (std::vector<uint16_t>{0, kVideo, kAudio, kCaptions, 0x1000}));
    EXPECT_EQ(pidOf(recorded.data()), 0) << "the file starts with its PAT";

    EXPECT_NE(probe(path).find("h264\naac_latm\narib_caption\n"), std::string::npos) << probe(path);

    // The names, state, size and duration are checked where a clip is opened, killed or
    // cut short; the caption PID is what the clip's playback takes from here.
    ASSERT_TRUE(row(number).has_value());
    EXPECT_EQ(row(number)->captionPid, kCaptions);
    RecordingCatalog catalog(dir);
    ASSERT_EQ(catalog.open(), RecordingCatalog::Status::kOk);
    const auto index = catalog.loadIndex(number);
    ASSERT_GT(index.size(), 100u);
    for (const IndexPoint& p : index) {
        // Every point leads to the tables or to a PCR of the video PID.
        ASSERT_LE(p.offset + 188, recorded.size());
        const TsFile at({recorded.begin() + p.offset, recorded.begin() + p.offset + 188});
        ASSERT_TRUE(at.valid && (at.packets[0].pid == 0 || at.packets[0].hasPcr)) << p.offset;
    }
}

TEST_F(RecordingServiceTest, CancelLeavesNoFileAndNoRow) {
    ScopedDemuxSource demux("file:" + tsgenStream(20) + "?pace=pcr");
    EventLog events;
    const int number = record(events);
    ASSERT_GT(number, 0);
    ASSERT_TRUE(waitUntil([&] { return fs::exists(file(number)) && fs::file_size(file(number)); }));
    EXPECT_EQ(RecPlayerBinder_CancelTSRecorder(), 1);
    EXPECT_EQ(RecPlayerBinder_DeleteTSRecorder(), 1);
    EXPECT_FALSE(fs::exists(file(number)));
    EXPECT_FALSE(row(number).has_value());
}

// A recording in a child process of its own, started from a demux source. The shell
// prints its process id, which exec hands on to the recording program.
class ChildRecording {
public:
    ChildRecording(const std::string& mode, const std::string& dir, const std::string& source)
        : mOut(popen(("echo $$; exec env TAVOPLAYER_PROP_tavoplayer_recordings_dir='" + dir +
                      "' TAVOPLAYER_PROP_tavoplayer_demux_source='" + source + "' " +
                      TAVO_RECORDING_CHILD_PATH + " " + mode)
                         .c_str(),
                     "r")),
          mPid(std::atoi(line().c_str())) {}
    ~ChildRecording() { killNow(); }
    std::string line() {
        char buffer[256] = {};
        return mOut != nullptr && fgets(buffer, sizeof buffer, mOut) != nullptr ? buffer : "";
    }
    // The exit status.
    int wait() {
        const int status = mOut != nullptr ? pclose(mOut) : -1;
        mOut = nullptr;
        return status;
    }
    void killNow() {
        if (mOut != nullptr && mPid > 0)
            kill(mPid, SIGKILL);
        wait();
    }

private:
    FILE* mOut;
    pid_t mPid;
};

TEST_F(RecordingServiceTest, AKilledRecordingLeavesAPlayableFileMarkedIncomplete) {
    ChildRecording child("kill", dir, "file:" + tsgenStream(20) + "?pace=pcr");
    const int number = std::atoi(child.line().c_str());
    ASSERT_GT(number, 0);
    const std::string path = file(number);
    // A few seconds in: past the first catalog updates.
    ASSERT_TRUE(waitUntil([&] { return fs::exists(path) && fs::file_size(path) > 300'000; }));
    child.killNow();

    const auto e = row(number);  // as the next start of the service opens the catalog
    ASSERT_TRUE(e.has_value());
    EXPECT_EQ(e->state, RecordingCatalog::kIncomplete);
    EXPECT_EQ(e->sizeBytes, fs::file_size(path));
    EXPECT_EQ(fs::file_size(path) % 188, 0u);
    EXPECT_GT(e->playbackDuration, 1000u);
    EXPECT_NEAR(std::atof(probe(path, "format=duration").c_str()) * 1000, e->playbackDuration,
                1000);
}

TEST_F(RecordingServiceTest, AFullDiskStopsTheRecordingCleanlyWithItsEvent) {
    constexpr uint64_t kLimit = 1'000'000;
    ChildRecording child("fsize=" + std::to_string(kLimit), dir,
                         "file:" + tsgenStream(20) + "?pace=none");
    const int number = std::atoi(child.line().c_str());
    ASSERT_GT(number, 0);
    EXPECT_EQ(child.line(), "event " + std::to_string(kRecEventDiskFull) + "\n");
    EXPECT_EQ(WEXITSTATUS(child.wait()), 0) << "the stop after the event succeeds";
    const std::string path = file(number);
    EXPECT_LE(fs::file_size(path), kLimit);
    EXPECT_EQ(fs::file_size(path) % 188, 0u);
    const auto e = row(number);
    ASSERT_TRUE(e.has_value());
    EXPECT_EQ(e->state, RecordingCatalog::kComplete);
    EXPECT_EQ(e->sizeBytes, fs::file_size(path));
    EXPECT_NE(probe(path).find("h264"), std::string::npos);
}

// Packets that reach a filter within `window`.
std::vector<TsPacket> readFor(int handle, std::chrono::milliseconds window) {
    return readFilter(handle, std::numeric_limits<size_t>::max(), window);
}

// The time (ms since the clip's first PCR) of the first packet read that has a PCR.
int64_t firstPcrMs(int handle, uint64_t clipFirstPcr) {
    const auto end = std::chrono::steady_clock::now() + kDeadline;
    while (std::chrono::steady_clock::now() < end) {
        const TsFile read(concatPackets(readFor(handle, 50ms)));
        for (const ParsedPacket& p : read.packets)
            if (p.hasPcr)
                return static_cast<int64_t>((p.pcr27 - clipFirstPcr) / 27000);
    }
    return -1;
}

// A 40-second recording, played back. Pausing is run end to end by the service's
// tests; here, where each reposition lands.
TEST_F(RecordingServiceTest, AClipRepositionsWhileFilteringOrStoppedAndReportsItsEnd) {
    const int number = recordWhole(tsgenStream(40));
    ASSERT_GT(number, 0);
    const std::vector<TsPacket> video = toPackets(bytesOfPid(fileBytes(file(number)), kVideo));
    const TsFile recorded(concatPackets(video));
    const auto withPcr = std::ranges::find_if(recorded.packets, &ParsedPacket::hasPcr);
    ASSERT_NE(withPcr, recorded.packets.end());
    const uint64_t firstPcr = withPcr->pcr27;
    EventLog events;
    ASSERT_EQ(RecPlayerBinder_IsTSPlayerActive(EventLog::callback, &events), 1);
    auto open = [&] {
        // As the URI parser leaves a FILE path: without its last character.
        const Details d = clipDetails(dir + "/" + std::to_string(number) + ".t");
        EXPECT_NE(d, nullptr);
        if (d == nullptr)
            return 0;
        EXPECT_EQ(d->fileNumName, number);
        EXPECT_STREQ(d->stationName, "TV Tavo");
        EXPECT_STREQ(d->prgName, "News");
        return static_cast<int>(d->playbackDuration);
    };
    EXPECT_NEAR(open(), 40000, 1000);
    EXPECT_EQ(RecPlayerBinder_IsPossibleSeek(), 1);
    int handle = DemuxBinder_StartFiltering(kVideo, kDemuxFilterVideo);
    const auto first = readFor(handle, 200ms);
    ASSERT_FALSE(first.empty());
    EXPECT_EQ(summary({first.front()}), summary({video.front()})) << "from the clip's start";
    std::this_thread::sleep_for(300ms);  // packets queue up: the reposition drops them
    EXPECT_EQ(RecPlayerBinder_RepositioningTSPlayer(0, 30000), 1);
    // Within a GOP (15 pictures at 29.97 Hz) of the position.
    EXPECT_NEAR(firstPcrMs(handle, firstPcr), 30000, 500);
    DemuxBinder_StopFiltering(handle);  // the controller stops around a seek

    EXPECT_EQ(RecPlayerBinder_RepositioningTSPlayer(30, 20000), 1);
    open();  // the clip player starts again
    handle = DemuxBinder_StartFiltering(kVideo, kDemuxFilterVideo);
    EXPECT_NEAR(firstPcrMs(handle, firstPcr), 20000, 500);
    EXPECT_TRUE(events.snapshot().empty());
    EXPECT_EQ(RecPlayerBinder_RepositioningTSPlayer(20, 39000), 1);
    EXPECT_TRUE(events.waitFor(kClipEventEnd));
    EXPECT_EQ(RecPlayerBinder_RepositioningTSPlayer(39, 60000), 0) << "beyond the clip";
    DemuxBinder_StopFiltering(handle);

    // Closed without a seek: the next opening is the live source again.
    FileSource live(buildStream({.pids = {0x100}, .rounds = 50}));
    handle = DemuxBinder_StartFiltering(0x100, kDemuxFilterPes);
    EXPECT_EQ(readFor(handle, 300ms).size(), 50u);
    DemuxBinder_StopFiltering(handle);
}

// Bad input: each row the designed result and event, nothing lost.
TEST_F(RecordingServiceTest, BadInputGivesTheDesignedFailure) {
    const std::vector<uint8_t> small =
        buildStream({.pids = {kVideo}, .rounds = 200, .pcrPid = kVideo});
    auto write = [](const std::string& file, const std::vector<uint8_t>& bytes) {
        std::ofstream(file).write(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    };
    auto create = [](EventLog& events) {
        return RecPlayerBinder_CreateTSRecorder(0, 0, kVideo, kAudio, 1, EventLog::callback,
                                                &events);
    };
    auto getClip = [](const std::string& path) { return clipDetails(path) != nullptr ? 1 : 0; };
    sqlite3* lockHolder = nullptr;
    struct Row {
        const char* name;
        std::function<int(const std::string& dir, EventLog&)> act;
        int result;
        int event;  // -1: none
    };
    const Row rows[] = {
        {"folder that cannot be created",
         [&](const std::string& d, EventLog& e) {
             write(d + "/file", {1});
             ScopedEnv env("TAVOPLAYER_PROP_tavoplayer_recordings_dir", d + "/file/recordings");
             return create(e);
         },
         0, kRecEventFileError},
        {"damaged catalog: set aside, rebuilt from the files",
         [&](const std::string& d, EventLog&) {
             write(d + "/4.ts", small);
             write(d + "/" + RecordingCatalog::kFileName, std::vector<uint8_t>(8192, 'x'));
             const int ok = getClip(d + "/4.t");
             const bool asideKept = std::ranges::any_of(fs::directory_iterator(d), [](auto& f) {
                 return f.path().filename().string().find(".damaged-") != std::string::npos;
             });
             return ok == 1 && asideKept && fs::file_size(d + "/4.ts") == small.size() ? 1 : 0;
         },
         1, -1},
        {"catalog locked by another process",
         [&](const std::string& d, EventLog& e) {
             {
                 RecordingCatalog c(d);
                 c.open();
             }
             sqlite3_open((d + "/" + RecordingCatalog::kFileName).c_str(), &lockHolder);
             sqlite3_exec(lockHolder, "BEGIN EXCLUSIVE;", nullptr, nullptr, nullptr);
             ScopedDemuxSource source("file:" + tsgenStream(20) + "?pace=pcr");
             const int created = create(e);
             const int started = RecPlayerBinder_StartTSRecorder();
             sqlite3_exec(lockHolder, "ROLLBACK;", nullptr, nullptr, nullptr);
             sqlite3_close(lockHolder);
             const bool noFile = std::ranges::none_of(
                 fs::directory_iterator(d), [](auto& f) { return f.path().extension() == ".ts"; });
             return created == 1 && noFile ? started : -1;
         },
         0, -1},
        {"clip path matching nothing",
         [&](const std::string& d, EventLog&) { return getClip(d + "/7.t"); }, 0, -1},
        {"clip path matching several",
         [&](const std::string& d, EventLog&) {
             write(d + "/1.ts", small);
             write(d + "/10.ts", small);
             return getClip(d + "/1");
         },
         0, -1},
        {"clip that is not a TS",
         [&](const std::string& d, EventLog&) {
             write(d + "/5.ts", std::vector<uint8_t>(4000, 'a'));
             return getClip(d + "/5.t");
         },
         0, -1},
        {"truncated clip plays to where it ends",
         [&](const std::string& d, EventLog& e) {
             std::vector<uint8_t> cut(small.begin(), small.begin() + 100 * 188 + 77);
             write(d + "/6.ts", cut);
             ScopedEnv pace("TAVOPLAYER_PROP_tavoplayer_recordings_pace", "none");
             RecPlayerBinder_IsTSPlayerActive(EventLog::callback, &e);
             const Details details = clipDetails(d + "/6.t");
             const uint32_t duration = details != nullptr ? details->playbackDuration : 0;
             const int handle = DemuxBinder_StartFiltering(kVideo, kDemuxFilterVideo);
             const size_t got = readFor(handle, 300ms).size();
             e.waitFor(kClipEventEnd);
             DemuxBinder_StopFiltering(handle);
             // 100 whole packets, 40 ms of PCR each.
             return got == 100 && duration == 99 * 40 ? 1 : 0;
         },
         1, kClipEventEnd},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.name);
        const std::string sub = dir + "/" + std::to_string(&row - rows);
        fs::create_directories(sub);
        ScopedEnv env("TAVOPLAYER_PROP_tavoplayer_recordings_dir", sub);
        EventLog events;
        EXPECT_EQ(row.act(sub, events), row.result);
        RecPlayerBinder_DeleteTSRecorder();
        EXPECT_TRUE(RecPlayerService::instance().events().drain(kDeadline));
        if (row.event >= 0) {
            EXPECT_EQ(events.snapshot(), std::vector<int>{row.event});
        } else {
            EXPECT_TRUE(events.snapshot().empty());
        }
    }
}

}  // namespace
}  // namespace TavoPlayer
