#include "common/Synchronization.h"

#include <gtest/gtest.h>

#include <vector>

#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using test::TraceCapture;
using M = Synchronization::module_t;

// A monotonic clock the test moves by hand, in milliseconds.
struct FakeClock {
    uint64_t nowMs = 1'000'000;
    bool readable = true;
    Synchronization::MonotonicClock reader() {
        return [this](timespec* ts) {
            if (!readable)
                return false;
            ts->tv_sec = static_cast<time_t>(nowMs / 1000);
            ts->tv_nsec = static_cast<long>((nowMs % 1000) * 1'000'000);
            return true;
        };
    }
};

class RecordingPCRListener : public Synchronization::PCRListener {
public:
    void onPCRChanged(unsigned long pcr) override { values.push_back(pcr); }
    std::vector<unsigned long> values;
};

class SynchronizationTest : public ::testing::Test {
protected:
    FakeClock clock;
    android::sp<Synchronization> sync = new Synchronization(clock.reader());
    TraceCapture trace;
};

TEST_F(SynchronizationTest, FirstVideoStampLeavesTheClockWithoutSourceAndNoneIsRefused) {
    sync->setBasePCR(1'000'000, M::Video);
    EXPECT_TRUE(sync->isValid(M::Video));
    EXPECT_EQ(M::None, sync->currentModule());
    EXPECT_EQ(0u, sync->getPCR());
    sync->setBasePCR(1'000'000, M::None);  // refused
    EXPECT_FALSE(sync->isValid(M::None));
    clock.readable = false;  // an unreadable clock counts as zero
    EXPECT_EQ(0u, sync->getTimestamp());
}

// The later running stream drives the clock; across the wrap, "smaller" is in
// 33-bit terms.
TEST(SourceChoiceTest, TheLaterRunningStreamDrivesTheClock) {
    const struct {
        uint64_t video, audio;
        M expected;
    } cases[] = {{1'000'000, 1'000'090, M::Video},
                 {1'000'090, 1'000'000, M::Audio},
                 {1'000'000, 1'000'000, M::Video},
                 {0x1FFFFFF00, 0x100, M::Video}};
    for (const auto& c : cases) {
        FakeClock clock;
        android::sp<Synchronization> sync = new Synchronization(clock.reader());
        sync->setBasePCR(c.video, M::Video);
        sync->setBasePCR(c.audio, M::Audio);
        EXPECT_EQ(c.expected, sync->currentModule()) << c.video << " " << c.audio;
    }
}

TEST_F(SynchronizationTest, RealPCRWinsWhenItIsNotBad) {
    sync->setBasePCR(1'000'000, M::Video);
    sync->setBasePCR(1'000'000, M::Audio);
    sync->setBasePCR(1'000'500, M::RealPCR);
    EXPECT_EQ(M::RealPCR, sync->currentModule());
    EXPECT_EQ(1'000'500u, sync->getPCR());
    clock.nowMs += 1000;
    EXPECT_EQ(1'090'500u, sync->getPCR());
}

// Re-basing: a stamp of an already valid source re-bases it only when it differs
// from the extrapolated value by more than 90,000 ticks and arrives at least 11 ms
// after the base.
TEST(RebaseTest, ThresholdAndMinimumInterval) {
    const struct {
        const char* name;
        uint64_t base;
        uint64_t elapsedMs;
        int64_t offsetFromExpected;
        bool rebased;
    } cases[] = {{"exactly 90000 later", 1'000'000, 1000, 90'000, false},
                 {"90001 later", 1'000'000, 1000, 90'001, true},
                 {"exactly 90000 earlier", 1'000'000, 1000, -90'000, false},
                 {"90001 earlier", 1'000'000, 1000, -90'001, true},
                 {"big jump within 10 ms", 1'000'000, 10, 900'000, false},
                 {"big jump at 11 ms", 1'000'000, 11, 900'000, true},
                 // 0x1FFFFFFF0 then 0x10 one second later: a small signed step
                 {"wrap", 0x1FFFFFFF0, 1000, 0x20 - 90'000, false}};
    for (const auto& c : cases) {
        FakeClock clock;
        android::sp<Synchronization> sync = new Synchronization(clock.reader());
        sync->setBasePCR(c.base, M::RealPCR);
        clock.nowMs += c.elapsedMs;
        const uint64_t expected = mask33(c.base + c.elapsedMs * 90);
        const uint64_t stamp = mask33(expected + static_cast<uint64_t>(c.offsetFromExpected));
        sync->setBasePCR(stamp, M::RealPCR);
        EXPECT_EQ(c.rebased ? stamp : expected, sync->getPCR()) << c.name;
    }
}

TEST_F(SynchronizationTest, RealPCRTwentySecondsAwayIsIgnoredUntilItComesBack) {
    sync->setBasePCR(10'000'000, M::Video);
    sync->setBasePCR(10'000'000, M::Audio);
    sync->setBasePCR(10'000'000 + 1'800'000, M::RealPCR);  // exactly 20 s ahead: bad
    EXPECT_EQ(M::Video, sync->currentModule());

    // 1,799,999 ticks is acceptable: a real PCR that near never counts as bad.
    android::sp<Synchronization> near = new Synchronization(clock.reader());
    near->setBasePCR(10'000'000, M::Video);
    near->setBasePCR(10'000'000 + 1'799'999, M::RealPCR);
    EXPECT_EQ(M::RealPCR, near->currentModule());

    clock.nowMs += 100;
    // Re-based 800,000 ticks back: now 1,000,000 ticks from both streams.
    sync->setBasePCR(10'000'000 + 9'000 + 1'000'000, M::RealPCR);
    EXPECT_EQ(M::RealPCR, sync->currentModule());
}

TEST_F(SynchronizationTest, PauseAndResumeContinueWhereTheClockStopped) {
    RecordingPCRListener listener;
    sync->setBasePCR(500'000, M::RealPCR);
    sync->addPCRListener(&listener);
    clock.nowMs += 2000;
    const uint64_t atPause = sync->getPCR();
    EXPECT_EQ(500'000u + 180'000u, atPause);
    sync->pause();
    clock.nowMs += 5000;
    sync->resume();
    EXPECT_EQ(atPause, sync->getPCR());
    ASSERT_EQ(1u, listener.values.size());
    EXPECT_EQ(atPause, listener.values[0]);
    clock.nowMs += 1000;
    EXPECT_EQ(atPause + 90'000, sync->getPCR());
    // A second resume without pause changes nothing.
    sync->resume();
    EXPECT_EQ(atPause + 90'000, sync->getPCR());
}

// The offset bases the source earlier than the stamp, through the 33-bit mask.
TEST_F(SynchronizationTest, OffsetBasesTheSourceEarlierThanTheStamp) {
    for (const uint64_t stamp : {1'000'000ull, 90'000ull}) {
        android::sp<Synchronization> s = new Synchronization(clock.reader());
        s->setOffsetTime(2000, M::RealPCR);
        s->setBasePCR(stamp, M::RealPCR);
        EXPECT_EQ(mask33(stamp - 180'000), s->getPCR()) << stamp;
    }
}

TEST_F(SynchronizationTest, ListenersHearOnlyRebasesOfTheDrivingSource) {
    RecordingPCRListener first, second;
    sync->addPCRListener(&first);
    sync->addPCRListener(&second);
    sync->setBasePCR(1'000'000, M::Video);  // source None: no call
    EXPECT_TRUE(first.values.empty());
    sync->setBasePCR(2'000'000, M::RealPCR);
    ASSERT_EQ(1u, first.values.size());
    EXPECT_EQ(2'000'000u, first.values[0]);
    EXPECT_EQ(first.values, second.values);
    clock.nowMs += 500;
    sync->setBasePCR(5'000'000, M::Video);  // re-bases Video, which does not drive
    EXPECT_EQ(1u, first.values.size());
}

TEST_F(SynchronizationTest, ResetInvalidatesEverySource) {
    sync->setBasePCR(1'000'000, M::Video);
    sync->setBasePCR(1'000'000, M::RealPCR);
    sync->resetPCR();
    EXPECT_FALSE(sync->isValid(M::Video));
    EXPECT_FALSE(sync->isValid(M::RealPCR));
    EXPECT_EQ(M::None, sync->currentModule());
    EXPECT_EQ(0u, sync->getPCR());
    // A stamp after reset bases anew, however close to the old base.
    sync->setBasePCR(1'000'001, M::RealPCR);
    EXPECT_EQ(1'000'001u, sync->getPCR());
}

}  // namespace
}  // namespace TavoPlayer
