#include "renderer/ClosedCaptionRenderer.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "support/CaptionBuilder.h"
#include "support/CaptionTestDoubles.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using namespace test;

constexpr uint64_t kClockPcr = 900'000;

struct TimingCase {
    const char* name;
    int64_t ahead;    // caption PTS minus the clock, 90 kHz
    int captionSync;  // ms
    std::optional<int64_t> wait;
    uint64_t clockPcr = kClockPcr;
    bool clockRunning = true;
};
void PrintTo(const TimingCase& c, std::ostream* os) {
    *os << c.name;
}

const TimingCase kTimingCases[] = {
    {"TenMsAhead", 900, 0, 10},
    {"TenMsAheadWithSync", 900, 250, 260},
    {"JustUnderThreeSeconds", 269'999, 0, 2999},
    {"ThreeSecondsNotWaited", 270'000, 0, std::nullopt},
    {"FiveSecondsAheadAtOnce", 450'000, 0, std::nullopt},
    {"UnderOneMsAtOnce", 89, 0, std::nullopt},
    {"BehindAtOnce", -9'000, 0, std::nullopt},
    {"SyncPlus2000", 45'000, 2000, 2500},
    {"SyncMinus400", 45'000, -400, 100},
    {"AcrossTheWrap", 900, 0, 10, 0x1FFFFFFFFull - 449},
    {"NoClockSourceAtOnce", 900, 0, std::nullopt, kClockPcr, false},
};

class ClosedCaptionRendererTimingTest : public testing::TestWithParam<TimingCase> {};

TEST_P(ClosedCaptionRendererTimingTest, WaitsThenDelivers) {
    const TimingCase& c = GetParam();
    ManualClock manual;
    android::sp<Synchronization> clock = manual.make();
    if (c.clockRunning)
        clock->setBasePCR(c.clockPcr, Synchronization::RealPCR);
    android::sp<RingBuffer> input = test::makeRing("CCRaw", 1 << 16);
    android::sp<WaitRecordingRenderer> renderer = new WaitRecordingRenderer(clock, manual);
    RecordingListener listener;
    renderer->setInput(input);
    renderer->registerListener(&listener);
    renderer->setEnabled(1);
    renderer->setCaptionSync(c.captionSync);
    const uint64_t pts = (c.clockPcr + static_cast<uint64_t>(c.ahead)) & 0x1FFFFFFFFull;
    ASSERT_TRUE(writeCaption(*input, U"Olá\n", pts));

    renderer->renderFrame();

    EXPECT_EQ(renderer->waits, c.wait ? std::vector<int64_t>{*c.wait} : std::vector<int64_t>{});
    EXPECT_EQ(listener.texts(), std::vector<std::u32string>{U"Olá\n"});
    EXPECT_EQ(input->usedSpace(), 0u);
}

INSTANTIATE_TEST_SUITE_P(Delays, ClosedCaptionRendererTimingTest, testing::ValuesIn(kTimingCases),
                         [](const auto& info) { return std::string(info.param.name); });

// Without a listener, or while disabled, captions are still timed and consumed.
TEST(ClosedCaptionRendererDeliveryTest, ConsumesWithoutDelivery) {
    ManualClock manual;
    android::sp<Synchronization> clock = manual.make();
    clock->setBasePCR(kClockPcr, Synchronization::RealPCR);
    android::sp<RingBuffer> input = test::makeRing("CCRaw", 1 << 16);
    android::sp<WaitRecordingRenderer> renderer = new WaitRecordingRenderer(clock, manual);
    RecordingListener listener;
    renderer->setInput(input);

    ASSERT_TRUE(writeCaption(*input, U"no listener\n", kClockPcr + 900));
    renderer->renderFrame();
    renderer->registerListener(&listener);
    ASSERT_TRUE(writeCaption(*input, U"disabled\n", kClockPcr + 2 * 900));
    renderer->renderFrame();
    renderer->setEnabled(1);
    ASSERT_TRUE(writeCaption(*input, U"shown\n", kClockPcr + 3 * 900));
    renderer->renderFrame();

    EXPECT_EQ(renderer->waits, (std::vector<int64_t>{10, 10, 10}));
    EXPECT_EQ(listener.texts(), std::vector<std::u32string>{U"shown\n"});
    EXPECT_EQ(input->usedSpace(), 0u);
}

TEST(ClosedCaptionRendererLifecycleTest, StartNeedsAnInput) {
    TraceCapture trace;
    setTraceLevel(TRACE_DEBUG);
    android::sp<ClosedCaptionRenderer> renderer = new ClosedCaptionRenderer(new Synchronization());
    EXPECT_EQ(renderer->start(), 1u);
    EXPECT_TRUE(trace.contains("start NULL parameter!")) << trace.all();
    renderer->setCaptionSync(-400);
    EXPECT_TRUE(trace.contains("setCaptionSync: ClosedCaptionRenderer::setCaptionSync -400"));
    setTraceLevel(TRACE_INFO);
}

// The worker's real timed wait: a caption held for 100 s is let go by stop, which
// returns long before that.
TEST(ClosedCaptionRendererLifecycleTest, StopBreaksTheTimedWait) {
    ManualClock manual;
    android::sp<Synchronization> clock = manual.make();
    clock->setBasePCR(kClockPcr, Synchronization::RealPCR);
    android::sp<RingBuffer> input = test::makeRing("CCRaw", 1 << 16);
    android::sp<ClosedCaptionRenderer> renderer = new ClosedCaptionRenderer(clock);
    RecordingListener listener;
    renderer->setInput(input);
    renderer->registerListener(&listener);
    renderer->setEnabled(1);
    renderer->setCaptionSync(100'000);
    ASSERT_TRUE(writeCaption(*input, U"late\n", kClockPcr + 2'900 * 90));
    const int readsBefore = manual.reads.load();

    ASSERT_EQ(renderer->start(), 0u);
    // The worker reads the clock just before it starts waiting.
    ASSERT_TRUE(waitUntil([&] { return manual.reads.load() > readsBefore; }));
    const auto stopAt = std::chrono::steady_clock::now();
    EXPECT_EQ(renderer->stop(), 0u);
    EXPECT_LT(std::chrono::steady_clock::now() - stopAt, kDeadline);
    EXPECT_EQ(input->usedSpace(), 0u);
    EXPECT_EQ(listener.texts(), std::vector<std::u32string>{U"late\n"});
}

}  // namespace
}  // namespace TavoPlayer
