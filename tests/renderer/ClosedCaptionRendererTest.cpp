#include "renderer/ClosedCaptionRenderer.h"

#include <gtest/gtest.h>

#include <chrono>
#include <optional>
#include <string>
#include <vector>

#include "support/CaptionBuilder.h"
#include "support/CaptionTestDoubles.h"
#include "support/NamedRow.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using namespace test;
using test::PrintTo;

constexpr uint64_t kClockPcr = 900'000;

// A renderer on a ring and a clock that moves only through the renderer's waits.
class CaptionRendererFixture {
protected:
    void setUpClock(uint64_t pcr = kClockPcr) { clock->setBasePCR(pcr, Synchronization::RealPCR); }

    ManualClock manual;
    android::sp<Synchronization> clock = manual.make();
    android::sp<RingBuffer> input = test::makeRing("CCRaw", 1 << 16);
    android::sp<WaitRecordingRenderer> renderer = new WaitRecordingRenderer(clock, manual);
    RecordingListener listener;
};

struct TimingCase {
    const char* name;
    int64_t ahead;  // caption PTS minus the clock, 90 kHz
    int captionSync;
    std::optional<int64_t> wait;                   // ms; none: delivered at once
    std::optional<uint64_t> clockPcr = kClockPcr;  // none: no source drives the clock
};

const TimingCase kTimingCases[] = {
    {"TenMsAheadWithSync", 900, 250, 260},
    {"JustUnderThreeSeconds", 269'999, 0, 2999},
    {"ThreeSecondsNotWaited", 270'000, 0, std::nullopt},
    {"UnderOneMsAtOnce", 89, 0, std::nullopt},
    {"BehindAtOnce", -9'000, 0, std::nullopt},
    {"SyncPlus2000", 45'000, 2000, 2500},
    {"SyncMinus400", 45'000, -400, 100},
    {"AcrossTheWrap", 900, 0, 10, 0x1FFFFFFFFull - 449},
    {"NoClockSourceAtOnce", 900, 0, std::nullopt, std::nullopt},
};

class ClosedCaptionRendererTimingTest : public CaptionRendererFixture,
                                        public testing::TestWithParam<TimingCase> {};

TEST_P(ClosedCaptionRendererTimingTest, WaitsThenDelivers) {
    const TimingCase& c = GetParam();
    if (c.clockPcr)
        setUpClock(*c.clockPcr);
    renderer->setInput(input);
    renderer->registerListener(&listener);
    renderer->setEnabled(1);
    renderer->setCaptionSync(c.captionSync);
    const uint64_t pts = (c.clockPcr.value_or(0) + static_cast<uint64_t>(c.ahead)) & 0x1FFFFFFFFull;
    ASSERT_TRUE(writeCaption(*input, U"Olá\n", pts));

    renderer->renderFrame();

    EXPECT_EQ(renderer->waits, c.wait ? std::vector<int64_t>{*c.wait} : std::vector<int64_t>{});
    EXPECT_EQ(listener.texts(), std::vector<std::u32string>{U"Olá\n"});
    EXPECT_EQ(input->usedSpace(), 0u);
}

INSTANTIATE_TEST_SUITE_P(Delays, ClosedCaptionRendererTimingTest, testing::ValuesIn(kTimingCases),
                         [](const auto& info) { return std::string(info.param.name); });

class ClosedCaptionRendererTest : public CaptionRendererFixture, public testing::Test {};

// Without a listener, or while disabled, captions are still timed and consumed.
TEST_F(ClosedCaptionRendererTest, ConsumesWithoutDelivery) {
    setUpClock();
    renderer->setInput(input);
    const char32_t* texts[] = {U"no listener\n", U"disabled\n", U"shown\n"};
    for (int i = 0; i < 3; ++i) {
        if (i == 1)
            renderer->registerListener(&listener);
        if (i == 2)
            renderer->setEnabled(1);
        ASSERT_TRUE(writeCaption(*input, texts[i], kClockPcr + 900 * (i + 1)));
        renderer->renderFrame();
    }
    EXPECT_EQ(renderer->waits, (std::vector<int64_t>{10, 10, 10}));
    EXPECT_EQ(listener.texts(), std::vector<std::u32string>{U"shown\n"});
    EXPECT_EQ(input->usedSpace(), 0u);
}

// The real timed wait: a caption held for 100 s is let go by stop, which returns
// long before that.
TEST_F(ClosedCaptionRendererTest, StopBreaksTheTimedWait) {
    setUpClock();
    android::sp<ClosedCaptionRenderer> real = new ClosedCaptionRenderer(clock);
    real->setInput(input);
    real->registerListener(&listener);
    real->setEnabled(1);
    real->setCaptionSync(100'000);
    ASSERT_TRUE(writeCaption(*input, U"late\n", kClockPcr + 2'900 * 90));
    const int readsBefore = manual.reads.load();

    ASSERT_EQ(real->start(), 0u);
    // The worker reads the clock just before it starts waiting.
    ASSERT_TRUE(waitUntil([&] { return manual.reads.load() > readsBefore; }));
    const auto stopAt = std::chrono::steady_clock::now();
    EXPECT_EQ(real->stop(), 0u);
    EXPECT_LT(std::chrono::steady_clock::now() - stopAt, kDeadline);
    EXPECT_EQ(input->usedSpace(), 0u);
    EXPECT_EQ(listener.texts(), std::vector<std::u32string>{U"late\n"});
}

}  // namespace
}  // namespace TavoPlayer
