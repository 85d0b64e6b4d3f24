#include "recorder/Recorder.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "common/Uri.h"
#include "platform/dtv/RecPlayerBinder.h"
#include "support/ScopedEnv.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using test::TraceCapture;

// Errors come on the recording service's thread, the rest on the caller's.
class RecordingRecorderListener : public IRecorderListener {
public:
    void onRecorderStarted(int fileNumName) override { started.push_back(fileNumName); }
    void onRecorderStopped(int result) override { stopped.push_back(result); }
    void onError(int code) override { errors.push(code); }
    std::vector<int> started, stopped;
    test::Recorded<int> errors;
};

TEST(RecorderCallbackTest, EventTable) {
    struct Case {
        int event;
        std::vector<int> errors;
    };
    const Case cases[] = {
        {0, {0x60003}}, {1, {0x60002}}, {2, {0x60001}}, {3, {0x60004}}, {4, {}}, {5, {}}, {-1, {}},
    };
    android::sp<Recorder> recorder = new Recorder();
    for (const Case& c : cases) {
        RecordingRecorderListener listener;
        recorder->setListener(&listener);
        TraceCapture trace;
        Recorder::recorderCallback(c.event, recorder.get());
        EXPECT_EQ(listener.errors.snapshot(), c.errors) << c.event;
    }
    TraceCapture trace;
    Recorder::recorderCallback(0, nullptr);  // neither may crash
    recorder->setListener(nullptr);
    Recorder::recorderCallback(0, recorder.get());
}

// The in-process recording service records a paced tsgen stream from the demux.
class RecorderServiceTest : public ::testing::Test {
protected:
    static constexpr int kVideo = 0x111, kAudio = 0x112, kCaptions = 0x130;

    void SetUp() override {
        const std::string& stream = test::tsgenStream(20);
        ASSERT_FALSE(stream.empty()) << "tsgen failed";
        ASSERT_FALSE(dir.path().empty());
        demux = std::make_unique<test::ScopedDemuxSource>("file:" + stream + "?loop=1");
        recorder = new Recorder();
        recorder->setListener(&listener);
    }
    void TearDown() override { RecPlayerBinder_DeleteTSRecorder(); }

    std::string fileOf(int number) const {
        return dir.path() + "/" + std::to_string(number) + ".ts";
    }

    test::ScopedRecordingsDir dir;
    std::unique_ptr<test::ScopedDemuxSource> demux;
    RecordingRecorderListener listener;
    android::sp<Recorder> recorder;
};

TEST_F(RecorderServiceTest, StartFillsTheDetailsFromTheQueryAndStopKeepsOrCancels) {
    struct Case {
        const char* uri;
        int recLocation;
        const char* station;  // null: no name stored
        const char* programme;
        int stopReason;
        bool fileKept;
    };
    const Case cases[] = {
        {"MTV://rec/x?programName=News;", 0, nullptr, "News", 1, true},
        {"MTV://rec/x?storageType=2;channelName=;programName=;", 2, nullptr, nullptr, 0, false},
        {"MTV://rec/x?storageType=1;channelName=TV Tavo;programName=Jornal;", 1, "TV Tavo",
         "Jornal", 1, true},
        {"MTV://rec/x?storageType=abc;channelName=Canal 5;", 0, "Canal 5", nullptr, 0, false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.uri);
        std::unique_ptr<Uri> uri(Uri::parse(c.uri));
        ASSERT_NE(uri, nullptr);
        listener.started.clear();
        listener.stopped.clear();
        TraceCapture trace;
        recorder->start(uri.get(), kVideo, kAudio, kCaptions, 1);
        ASSERT_EQ(listener.started.size(), 1u) << trace.all();
        const int number = listener.started[0];
        ASSERT_GT(number, 0) << trace.all();
        EXPECT_EQ(trace.count(TRACE_ERROR, "failed"), 0u) << trace.all();

        // What the service now holds is what the recorder set.
        RecDetails* d = RecPlayerBinder_GetCurrTSRecDetails();
        ASSERT_NE(d, nullptr);
        EXPECT_EQ(d->fileNumName, number);
        EXPECT_EQ(d->recLocation, c.recLocation);
        EXPECT_EQ(d->recMode, 0);
        EXPECT_EQ(d->bCanPlay, 1u);
        EXPECT_EQ(d->iV_PID, kVideo);
        EXPECT_EQ(d->iA_PID, kAudio);
        EXPECT_EQ(d->isLATM, 1);
        auto text = [](const char* name) { return std::string(name ? name : "(null)"); };
        EXPECT_EQ(text(d->stationName), text(c.station));
        EXPECT_EQ(d->stationNameLength, c.station ? strlen(c.station) : 0u);
        EXPECT_EQ(text(d->prgName), text(c.programme));
        EXPECT_EQ(d->prgNameLength, c.programme ? strlen(c.programme) : 0u);
        free(d->stationName);
        free(d->prgName);
        free(d);

        recorder->stop(c.stopReason);
        EXPECT_EQ(listener.stopped, std::vector<int>{1});
        EXPECT_EQ(std::filesystem::exists(fileOf(number)), c.fileKept);
    }
}

TEST_F(RecorderServiceTest, ARefusedSecondRecordingReportsZeroOnceAndItsError) {
    std::unique_ptr<Uri> uri(Uri::parse("MTV://rec/x?channelName=A;"));
    recorder->start(uri.get(), kVideo, kAudio, kCaptions, 1);
    ASSERT_EQ(listener.started.size(), 1u);
    ASSERT_GT(listener.started[0], 0);

    RecordingRecorderListener second;
    android::sp<Recorder> refused = new Recorder();
    refused->setListener(&second);
    TraceCapture trace;
    refused->start(uri.get(), kVideo, kAudio, kCaptions, 1);
    EXPECT_EQ(second.started, std::vector<int>{0});
    EXPECT_TRUE(second.errors.waitFor([](auto& all) { return !all.empty(); }));
    EXPECT_EQ(second.errors.snapshot(), std::vector<int>{0x60004});

    // The refused attempt's stop fails: it reports 0 and attempts no delete;
    // the first recording then stops normally.
    trace.clear();
    refused->stop(1);
    EXPECT_EQ(second.stopped, std::vector<int>{0});
    EXPECT_EQ(trace.count("RecPlayerBinder_DeleteTSRecorder"), 0u) << trace.all();
    recorder->stop(1);
    EXPECT_EQ(listener.stopped, std::vector<int>{1});
}

}  // namespace
}  // namespace TavoPlayer
