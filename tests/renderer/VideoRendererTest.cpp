// The video renderer against the real clock (with a monotonic time the test
// controls) and a real ring: the timing rules, the PTS-sequence guard, capture
// series, bad records, and a stop that cuts a long wait short.
#include <chrono>
#include <cstring>
#include <mutex>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "common/ErrorListener.h"
#include "renderer/VideoRenderer.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

constexpr Uint33 kBasePCR = 900000;  // 10 s
constexpr int64_t kBaseTimeMs = 5000;

struct Shown {
    bool render;
    Uint33 pts;
};

class FakeVideoListener : public VideoFrameData::VideoListener {
public:
    void renderFrame(bool render, VideoFrameData& frame) override {
        std::lock_guard<std::mutex> lock(mLock);
        mCalls.push_back({render, frame.mPTS});
    }
    bool captureFrame(VideoFrameData& frame, CaptureFrameListener*) override {
        std::lock_guard<std::mutex> lock(mLock);
        mCaptures.push_back(frame.mPTS);
        return mCaptureSucceeds;
    }
    std::vector<Shown> calls() {
        std::lock_guard<std::mutex> lock(mLock);
        return mCalls;
    }
    std::mutex mLock;
    std::vector<Shown> mCalls;
    std::vector<Uint33> mCaptures;
    bool mCaptureSucceeds = true;
};

class FakeRenderedListener : public VideoRenderer::FrameRenderedListener {
public:
    void onFrameRendered(int width, int height, Uint33 pts) override {
        mReports.push_back({width, height, pts});
    }
    void onFirstFrameRendered(int, int) override {}
    struct Report {
        int width;
        int height;
        Uint33 pts;
    };
    std::vector<Report> mReports;
};

class FakeErrorListener : public ErrorListener {
public:
    void onError(unsigned int code, const Module*) const override { mCodes.push_back(code); }
    mutable std::vector<unsigned int> mCodes;
};

// One renderer on a ring, its clock driven by the real PCR, and fake listeners.
class Harness {
public:
    Harness() {
        mClock = new Synchronization([this](timespec* now) { return readNow(now); });
        mRing = new RingBuffer();
        EXPECT_EQ(mRing->configure("VideoRaw", 16), 0u);
        mRenderer = new VideoRenderer(mClock, [this](timespec* now) { return readNow(now); });
        mRenderer->setInput(mRing);
        mRenderer->setOutputEnable(true);
        mRenderer->setFrameRenderedListener(&mRendered);
        mRenderer->addErrorListener(mErrors);
        mClock->setBasePCR(kBasePCR, Synchronization::RealPCR);
    }
    ~Harness() { mRenderer->stop(); }

    // Moves time on so that the clock has just reached `pts` (a frame due now).
    void presentAt(Uint33 pts) { mNowMs.store(mBaseTimeMs + (diff33(pts, mBasePCR) + 89) / 90); }
    // The real PCR starts again from `pcr` now.
    void rebase(Uint33 pcr) {
        mClock->resetPCR();
        mClock->setBasePCR(pcr, Synchronization::RealPCR);
        mBasePCR = pcr;
        mBaseTimeMs = mNowMs.load();
    }

    void writeFrame(Uint33 pts, uint8_t keyFrame = 0) {
        VideoFrameData frame;
        frame.mPTS = pts;
        frame.mListener = &mVideo;
        frame.mFlag = keyFrame;
        frame.mCropWidth = 1920;
        frame.mCropHeight = 1080;
        ASSERT_TRUE(mRing->waitForSpace(VideoFrameData::kRecordSize));
        memcpy(mRing->writePointer(), static_cast<const void*>(&frame),
               VideoFrameData::kRecordSize);
        mRing->commitWrite(VideoFrameData::kRecordSize);
    }
    void writeRaw(uint32_t type, uint32_t claimedSize, uint32_t bytes) {
        ASSERT_TRUE(mRing->waitForSpace(bytes));
        uint8_t* at = mRing->writePointer();
        memset(at, 0, bytes);
        memcpy(at + 8, &type, 4);
        memcpy(at + 12, &claimedSize, 4);
        mRing->commitWrite(bytes);
    }
    // Writes a frame due now and renders it; returns whether it was shown.
    bool renderDue(Uint33 pts, uint8_t keyFrame = 0) {
        presentAt(pts);
        writeFrame(pts, keyFrame);
        const size_t before = mVideo.calls().size();
        mRenderer->render();
        const std::vector<Shown> calls = mVideo.calls();
        return calls.size() == before + 1 && calls.back().render;
    }
    bool clockRunning() {
        Uint33 pcr = 0;
        return mClock->getPCR(&pcr);
    }

    FakeVideoListener mVideo;
    FakeRenderedListener mRendered;
    FakeErrorListener mErrors;
    android::sp<Synchronization> mClock;
    android::sp<RingBuffer> mRing;
    android::sp<VideoRenderer> mRenderer;

private:
    bool readNow(timespec* now) {
        const int64_t ms = mNowMs.load();
        now->tv_sec = ms / 1000;
        now->tv_nsec = (ms % 1000) * 1'000'000;
        return true;
    }
    std::atomic<int64_t> mNowMs{kBaseTimeMs};
    Uint33 mBasePCR = kBasePCR;
    int64_t mBaseTimeMs = kBaseTimeMs;
};

struct TimingCase {
    const char* name;
    int64_t lateMs;  // PCR minus PTS
    int avOffsetMs;
    bool outputEnabled;
    bool clockSource;
    bool shown;     // renderFrame(true) and reported
    bool reported;  // onFrameRendered
    const char* warning;
    bool clockReset;
};

TEST(VideoRendererTimingTest, LateAndEarlyFramesAgainstTheClock) {
    const TimingCase cases[] = {
        {"500 ms late: shown at once", 500, 0, true, true, true, true, nullptr, false},
        {"999 ms late: shown at once", 999, 0, true, true, true, true, nullptr, false},
        {"1000 ms late: dropped", 1000, 0, true, true, false, false, "bad rendering time: -1000",
         false},
        {"10,000 ms late: dropped", 10000, 0, true, true, false, false, "rendering time: -10000",
         false},
        {"10,001 ms late: dropped, clock reset", 10001, 0, true, true, false, false,
         "interaval: -10001", true},
        {"10,001 ms early: dropped, clock reset", -10001, 0, true, true, false, false,
         "interaval: 10001", true},
        {"offset brings 1500 ms late within reach", 1500, 600, true, true, true, true, nullptr,
         false},
        {"offset makes a due frame 1000 ms late", 0, -1000, true, true, false, false,
         "rendering time: -1000", false},
        {"output disabled: released but reported", 0, 0, false, true, false, true, nullptr, false},
        {"no clock source: dropped", 0, 0, true, false, false, false, "rendering time: -1000",
         false},
    };
    for (const TimingCase& c : cases) {
        SCOPED_TRACE(c.name);
        Harness h;
        test::TraceCapture trace;
        if (!c.clockSource)
            h.mClock->resetPCR();
        h.mRenderer->setAVSync(c.avOffsetMs);
        h.mRenderer->setOutputEnable(c.outputEnabled);
        const Uint33 pts = mask33(kBasePCR - c.lateMs * 90);
        h.writeFrame(pts);
        h.mRenderer->render();
        const std::vector<Shown> calls = h.mVideo.calls();
        ASSERT_EQ(calls.size(), 1u);
        EXPECT_EQ(calls[0].render, c.shown);
        ASSERT_EQ(h.mRendered.mReports.size(), c.reported ? 1u : 0u);
        if (c.reported) {
            EXPECT_EQ(h.mRendered.mReports[0].width, 1920);
            EXPECT_EQ(h.mRendered.mReports[0].height, 1080);
            EXPECT_EQ(h.mRendered.mReports[0].pts, pts);
        }
        if (c.warning != nullptr)
            EXPECT_EQ(trace.count(TRACE_WARNING, c.warning), 1u) << trace.all();
        else
            EXPECT_EQ(trace.count(TRACE_WARNING, "discarding"), 0u) << trace.all();
        EXPECT_EQ(h.clockRunning(), c.clockSource && !c.clockReset);
        EXPECT_EQ(h.mRing->usedSpace(), 0u);
    }
}

class VideoRendererPTSTest : public testing::Test {
protected:
    // Frames 3003 ticks apart (29.97 Hz), each due when rendered.
    void renderSteps(Uint33 from, int count) {
        for (int i = 0; i < count; ++i)
            ASSERT_TRUE(h.renderDue(mask33(from + i * 3003ull)));
    }
    Harness h;
    test::TraceCapture trace;
};

TEST_F(VideoRendererPTSTest, AStepOf25TimesTheFrameSpacingIsAnError) {
    renderSteps(kBasePCR, 4);
    const Uint33 last = kBasePCR + 3 * 3003;
    ASSERT_TRUE(h.renderDue(last + 75074));  // 25 x 3003 - 1
    EXPECT_EQ(h.mRenderer->detectedDeltaPTS(), 3003u);
    EXPECT_FALSE(h.renderDue(last + 75074 + 75075));  // exactly 25 x 3003
    EXPECT_TRUE(h.mRenderer->isPTSError());
    EXPECT_EQ(trace.count("error detected - delta PTS = 75075; mDetectedDeltaPTS = 3003"), 1u)
        << trace.all();
    EXPECT_EQ(trace.count("discarding frame due to (delta) PTS Error"), 1u);
}

TEST_F(VideoRendererPTSTest, SkipsForOneSecondOfPTSWithoutAKeyFrame) {
    renderSteps(kBasePCR, 3);
    const Uint33 errorPTS = kBasePCR + 2 * 3003 + 25 * 3003;
    EXPECT_FALSE(h.renderDue(errorPTS));
    int skipped = 1;
    Uint33 pts = errorPTS;
    while (true) {
        pts += 3003;
        if (h.renderDue(pts))
            break;
        ASSERT_LT(++skipped, 100);
    }
    // The frame that raised the error and 29 more: the 30th is 90,090 ticks on.
    EXPECT_EQ(skipped, 30);
    EXPECT_EQ(trace.count("waited too much for IDR frame (1s); rendering available frames)"), 1u);
    EXPECT_EQ(trace.count("skip frame; waiting for next IDR frame"), 29u);
    renderSteps(pts + 3003, 3);
}

TEST_F(VideoRendererPTSTest, AKeyFrameEndsTheSkipping) {
    renderSteps(kBasePCR, 3);
    const Uint33 errorPTS = kBasePCR + 2 * 3003 + 30 * 3003;
    EXPECT_FALSE(h.renderDue(errorPTS));
    EXPECT_FALSE(h.renderDue(errorPTS + 3003));
    EXPECT_TRUE(h.renderDue(errorPTS + 6006, 1));
    EXPECT_EQ(trace.count("detected IDR frame; recovering from PTS error"), 1u);
}

TEST_F(VideoRendererPTSTest, WrapsAndBackwardJumpsAreNoErrors) {
    // Across 2^33 the step is still 3003; a jump back is not a step at all.
    h.rebase(0x1FFFFFFFFull - 3 * 3003);
    renderSteps(0x1FFFFFFFFull - 3 * 3003, 8);
    ASSERT_TRUE(h.renderDue(3003 * 2));
    ASSERT_TRUE(h.renderDue(3003 * 3));
    EXPECT_FALSE(h.mRenderer->isPTSError());
    EXPECT_EQ(h.mRenderer->detectedDeltaPTS(), 3003u);
}

TEST(VideoRendererCaptureTest, SeriesOfThreeFramesHalfASecondApart) {
    Harness h;
    int token = 0;
    h.mRenderer->setCaptureFrameListener(reinterpret_cast<CaptureFrameListener*>(&token));
    h.presentAt(kBasePCR);
    h.mRenderer->getFrame(3, 500);
    EXPECT_EQ(h.mRenderer->captureCount(), 3);
    for (int i = 0; i <= 15; ++i) {
        if (i == 3)
            h.mRenderer->getFrame(5, 100);    // ignored: a series runs
        h.renderDue(kBasePCR + i * 9000ull);  // 100 ms apart
    }
    EXPECT_EQ(h.mVideo.mCaptures,
              (std::vector<Uint33>{kBasePCR, kBasePCR + 45000, kBasePCR + 90000}));
    EXPECT_EQ(h.mRenderer->captureCount(), 0);
}

TEST(VideoRendererCaptureTest, ACaptureThatFailsThreeTimesIsGivenUp) {
    Harness h;
    int token = 0;
    h.mVideo.mCaptureSucceeds = false;
    h.mRenderer->setCaptureFrameListener(reinterpret_cast<CaptureFrameListener*>(&token));
    h.presentAt(kBasePCR);
    h.mRenderer->getFrame(1, 100);
    for (int i = 0; i < 5; ++i)
        h.renderDue(kBasePCR + i * 9000ull);
    EXPECT_EQ(h.mVideo.mCaptures.size(), 3u);
    EXPECT_EQ(h.mRenderer->captureCount(), 0);
    EXPECT_EQ(h.mVideo.calls().size(), 5u);  // the frames themselves were all shown
}

TEST(VideoRendererRecordTest, BadRecordsAreSkippedAndTheNextFrameIsShown) {
    struct BadRecord {
        const char* name;
        uint32_t type;
        uint32_t claimed;
        uint32_t written;
        const char* message;
        bool reported;
    } cases[] = {
        {"PES record", Data::TYPE_PES, 120, 120, "frame is not a video format", true},
        {"audio record", Data::TYPE_AUDIO_FRAGMENT, 4000, 4000, "frame is not a video format",
         true},
        {"video record too short", Data::TYPE_VIDEO_FRAME, 40, 40, "frame is not a video format",
         true},
        {"size beyond the data", Data::TYPE_VIDEO_FRAME, 4096, 80, "RingBuffer inconsistency",
         false},
        {"size zero", Data::TYPE_PES, 0, 80, "RingBuffer inconsistency", false},
    };
    for (const BadRecord& c : cases) {
        SCOPED_TRACE(c.name);
        Harness h;
        test::TraceCapture trace;
        h.writeRaw(c.type, c.claimed, c.written);
        if (c.written < VideoFrameData::kRecordSize)
            h.writeFrame(kBasePCR);  // waitForData(80) needs more than the short record
        h.mRenderer->render();
        EXPECT_EQ(trace.count(c.message), 1u) << trace.all();
        EXPECT_EQ(h.mErrors.mCodes,
                  c.reported ? std::vector<unsigned int>{0x41003} : std::vector<unsigned int>{});
        EXPECT_TRUE(h.mVideo.calls().empty());
        if (c.written >= VideoFrameData::kRecordSize)
            h.writeFrame(kBasePCR);
        h.mRenderer->render();
        ASSERT_EQ(h.mVideo.calls().size(), 1u);
        EXPECT_TRUE(h.mVideo.calls()[0].render);
        EXPECT_EQ(h.mRing->usedSpace(), 0u);
    }
}

TEST(VideoRendererThreadTest, StopCutsALongWaitShort) {
    for (const int64_t earlyMs : {5000, 10000}) {
        SCOPED_TRACE(earlyMs);
        Harness h;
        test::TraceCapture trace;
        ASSERT_EQ(h.mRenderer->start(), 0u);
        EXPECT_EQ(h.mRenderer->state(), VideoRenderer::STATE_STARTED);
        h.writeFrame(kBasePCR + earlyMs * 90);
        // The record leaves the ring before the wait begins.
        for (int i = 0; i < 500 && h.mRing->usedSpace() != 0; ++i)
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        ASSERT_EQ(h.mRing->usedSpace(), 0u);
        const auto before = std::chrono::steady_clock::now();
        EXPECT_EQ(h.mRenderer->stop(), 0u);
        // A generous bound on behaviour: well under the frame's wait.
        EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(2));
        EXPECT_EQ(h.mRenderer->state(), VideoRenderer::STATE_STOPPED);
        // Neither shown nor reported; its buffer goes back to the decoder.
        const std::vector<Shown> calls = h.mVideo.calls();
        ASSERT_EQ(calls.size(), 1u);
        EXPECT_FALSE(calls[0].render);
        EXPECT_TRUE(h.mRendered.mReports.empty());
        EXPECT_EQ(trace.count("discarding"), 0u) << trace.all();
    }
}

}  // namespace
}  // namespace TavoPlayer
