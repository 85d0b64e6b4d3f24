// The video renderer against the real clock (with a monotonic time the test
// controls) and a real ring: the timing rules, the PTS-sequence guard, capture
// series, bad records, and a stop that cuts a long wait short.
#include <chrono>
#include <cstring>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "common/ErrorListener.h"
#include "renderer/VideoRenderer.h"
#include "support/CaptionTestDoubles.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

constexpr Uint33 kBasePCR = 900000;  // 10 s

struct Shown {
    bool render;
    Uint33 pts;
};

struct FakeVideoListener : VideoFrameData::VideoListener {
    void renderFrame(bool render, VideoFrameData& frame) override {
        calls.push({render, frame.mPTS});
    }
    bool captureFrame(VideoFrameData& frame, CaptureFrameListener*) override {
        captures.push_back(frame.mPTS);
        return captureSucceeds;
    }
    test::Recorded<Shown> calls;
    std::vector<Uint33> captures;
    bool captureSucceeds = true;
};

struct FakeRenderedListener : VideoRenderer::FrameRenderedListener, ErrorListener {
    void onFrameRendered(int width, int height, Uint33 pts) override {
        EXPECT_EQ(width, 1920);
        EXPECT_EQ(height, 1080);
        reports.push_back(pts);
    }
    void onFirstFrameRendered(int, int) override {}
    void onError(unsigned int code, const Module*) const override { errors.push_back(code); }
    std::vector<Uint33> reports;
    mutable std::vector<unsigned int> errors;
};

// One renderer on a ring, its clock driven by the real PCR, and fake listeners.
class Harness {
public:
    Harness() {
        mClock = mManual.make();
        mRing = new RingBuffer();
        EXPECT_EQ(mRing->configure("VideoRaw", 16), 0u);
        mRenderer = new VideoRenderer(mClock, mManual.reader());
        mRenderer->setInput(mRing);
        mRenderer->setOutputEnable(true);
        mRenderer->setFrameRenderedListener(&mRendered);
        mRenderer->addErrorListener(mRendered);
        mClock->setBasePCR(kBasePCR, Synchronization::RealPCR);
    }
    ~Harness() { mRenderer->stop(); }

    // Moves time on so that the clock has just reached `pts` (a frame due now).
    void presentAt(Uint33 pts) {
        mManual.nowMs.store(mBaseTimeMs + (diff33(pts, mBasePCR) + 89) / 90);
    }
    // The real PCR starts again from `pcr` now.
    void rebase(Uint33 pcr) {
        mClock->resetPCR();
        mClock->setBasePCR(pcr, Synchronization::RealPCR);
        mBasePCR = pcr;
        mBaseTimeMs = mManual.nowMs.load();
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
        const size_t before = mVideo.calls.snapshot().size();
        mRenderer->render();
        return mVideo.calls.snapshot().size() == before + 1 &&
               mVideo.calls.snapshot().back().render;
    }

    FakeVideoListener mVideo;
    FakeRenderedListener mRendered;
    android::sp<Synchronization> mClock;
    android::sp<RingBuffer> mRing;
    android::sp<VideoRenderer> mRenderer;

private:
    test::ManualClock mManual;
    Uint33 mBasePCR = kBasePCR;
    int64_t mBaseTimeMs = mManual.nowMs.load();
};

struct TimingCase {
    const char* name;
    int64_t lateMs;  // PCR minus PTS
    int avOffsetMs;
    bool outputEnabled;
    bool clockSource;
    bool shown;     // renderFrame(true)
    bool reported;  // onFrameRendered
    bool clockReset;
};

TEST(VideoRendererTimingTest, LateAndEarlyFramesAgainstTheClock) {
    const TimingCase cases[] = {
        {"999 ms late: shown at once", 999, 0, true, true, true, true, false},
        {"1000 ms late", 1000, 0, true, true, false, false, false},
        {"10,000 ms late", 10000, 0, true, true, false, false, false},
        {"10,001 ms late", 10001, 0, true, true, false, false, true},
        {"10,001 ms early", -10001, 0, true, true, false, false, true},
        {"offset brings 1500 ms late in reach", 1500, 600, true, true, true, true, false},
        {"offset makes a due frame late", 0, -1000, true, true, false, false, false},
        {"output disabled", 0, 0, false, true, false, true, false},
        {"no clock source", 0, 0, true, false, false, false, false},
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
        ASSERT_EQ(h.mVideo.calls.snapshot().size(), 1u);
        EXPECT_EQ(h.mVideo.calls.snapshot()[0].render, c.shown);
        EXPECT_EQ(h.mRendered.reports,
                  c.reported ? std::vector<Uint33>{pts} : std::vector<Uint33>{});
        Uint33 pcr = 0;
        EXPECT_EQ(h.mClock->getPCR(&pcr), c.clockSource && !c.clockReset);
        EXPECT_EQ(h.mRing->usedSpace(), 0u);
    }
}

// `head`, then `repeats` steps of one frame at 29.97 Hz (3003 ticks), then `tail`.
std::vector<int64_t> steps(std::vector<int64_t> head, int repeats, std::vector<int64_t> tail = {}) {
    head.insert(head.end(), repeats, 3003);
    head.insert(head.end(), tail.begin(), tail.end());
    return head;
}

struct PTSCase {
    const char* name;
    Uint33 first;
    std::vector<int64_t> steps;  // PTS of each further frame, from the one before
    int keyFrame;                // index of the frame flagged as key frame, or -1
    int firstDropped, lastDropped;
};

TEST(VideoRendererPTSTest, StepsOf25TimesTheSpacingSkipUntilAKeyFrameOrOneSecond) {
    const PTSCase cases[] = {
        {"75,074 is no error, 75,075 is", kBasePCR, {3003, 3003, 3003, 75074, 75075}, -1, 5, 5},
        // The frame that raised the error and 29 more are skipped: the 30th after it is
        // 90,090 ticks on.
        {"one second without a key frame", kBasePCR, steps({3003, 3003, 75075}, 31), -1, 3, 32},
        {"a key frame ends the skipping", kBasePCR, steps({3003, 3003, 75075}, 3), 5, 3, 4},
        // Across 2^33 the step is still 3003; a step back is no step at all.
        {"wrap, a step back", 0x1FFFFFFFFull - 3 * 3003, steps({}, 7, {-6005, 3003}), -1, -1, -1},
    };
    for (const PTSCase& c : cases) {
        SCOPED_TRACE(c.name);
        Harness h;
        test::TraceCapture trace;
        h.rebase(c.first);
        Uint33 pts = c.first;
        for (size_t i = 0; i <= c.steps.size(); ++i) {
            const bool dropped =
                static_cast<int>(i) >= c.firstDropped && static_cast<int>(i) <= c.lastDropped;
            ASSERT_EQ(h.renderDue(pts, static_cast<int>(i) == c.keyFrame), !dropped)
                << "frame " << i;
            if (i < c.steps.size())
                pts = mask33(pts + c.steps[i]);
        }
    }
}

TEST(VideoRendererCaptureTest, SeriesTakeOneFramePerIntervalAndGiveUpAfterThreeFailures) {
    struct {
        bool succeeds;
        int count, intervalMs;
        std::vector<int> capturedFrames;  // of frames 100 ms apart
    } cases[] = {{true, 3, 500, {0, 5, 10}}, {false, 1, 100, {0, 1, 2}}};
    for (const auto& c : cases) {
        Harness h;
        int token = 0;
        h.mVideo.captureSucceeds = c.succeeds;
        h.mRenderer->setCaptureFrameListener(reinterpret_cast<CaptureFrameListener*>(&token));
        h.presentAt(kBasePCR);
        h.mRenderer->getFrame(c.count, c.intervalMs);
        std::vector<Uint33> expected;
        for (int i = 0; i <= 15; ++i) {
            if (i == 1)
                h.mRenderer->getFrame(5, 100);  // ignored: a series runs
            ASSERT_TRUE(h.renderDue(kBasePCR + i * 9000ull));
        }
        for (int frame : c.capturedFrames)
            expected.push_back(kBasePCR + frame * 9000ull);
        EXPECT_EQ(h.mVideo.captures, expected);
        EXPECT_EQ(h.mRenderer->captureCount(), 0);
    }
}

TEST(VideoRendererRecordTest, BadRecordsAreSkippedAndTheNextFrameIsShown) {
    struct {
        const char* name;
        uint32_t type, claimed, written;
        bool reported;  // else an inconsistent ring
    } cases[] = {
        {"PES record", Data::TYPE_PES, 120, 120, true},
        {"audio record", Data::TYPE_AUDIO_FRAGMENT, 4000, 4000, true},
        {"short video record", Data::TYPE_VIDEO_FRAME, 40, 40, true},
        {"size beyond the data", Data::TYPE_VIDEO_FRAME, 4096, 80, false},
        {"size zero", Data::TYPE_PES, 0, 80, false},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        Harness h;
        test::TraceCapture trace;
        h.writeRaw(c.type, c.claimed, c.written);
        h.writeFrame(kBasePCR);
        h.mRenderer->render();
        EXPECT_EQ(h.mRendered.errors,
                  c.reported ? std::vector<unsigned int>{0x41003} : std::vector<unsigned int>{});
        // An inconsistent ring is emptied, so the frame written after it was lost too.
        if (!c.reported)
            h.writeFrame(kBasePCR);
        h.mRenderer->render();
        ASSERT_EQ(h.mVideo.calls.snapshot().size(), 1u);
        EXPECT_TRUE(h.mVideo.calls.snapshot()[0].render);
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
        const std::vector<Shown> calls = h.mVideo.calls.snapshot();
        ASSERT_EQ(calls.size(), 1u);
        EXPECT_FALSE(calls[0].render);
        EXPECT_TRUE(h.mRendered.reports.empty());
    }
}

}  // namespace
}  // namespace TavoPlayer
