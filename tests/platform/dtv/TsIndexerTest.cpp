#include <gtest/gtest.h>

#include <vector>

#include "platform/dtv/TsIndexer.h"
#include "support/TsPacketBuilder.h"

namespace TavoPlayer {
namespace {

TEST(TsIndexerTest, TimeLineSumsPcrIntervalsAcrossWrapsAndNewTimeBases) {
    constexpr uint64_t kWrap = uint64_t{1} << 33;
    struct Step {
        uint16_t pid;
        uint64_t base;
        bool discontinuity;
        bool point;  // becomes an index point
        uint32_t elapsedMs;
    };
    const Step steps[] = {
        {0x100, kWrap - 4500, false, true, 0},  // the first PCR: 0 ms
        {0x200, 99999, false, false, 0},        // another PID's PCR is not the clock
        {0x100, kWrap - 900, false, true, 40},
        {0x100, 2700, false, true, 80},    // wrapped: still 40 ms on
        {0x100, 2700, false, false, 80},   // no new millisecond, no new point
        {0x100, 500000, true, false, 80},  // a new time base adds nothing
        {0x100, 503600, false, true, 120},
        {0x100, 503600 + 5 * 90000, false, true, 5120},    // 5 s without packets: time passed
        {0x100, 503600 + 25 * 90000, false, false, 5120},  // a jump of 20 s: a new time base
        {0x100, 503600 + 25 * 90000 + 9000, false, true, 5220},
    };
    TsIndexer indexer;
    uint64_t offset = 0;
    for (const Step& s : steps) {
        SCOPED_TRACE(offset / 188);
        EXPECT_EQ(indexer.push(test::pcrPacket(s.pid, s.base, 0, s.discontinuity).data(), offset),
                  s.point);
        EXPECT_EQ(indexer.elapsedMs(), s.elapsedMs);
        if (s.point) {
            EXPECT_EQ(indexer.points().back().offset, offset);
            EXPECT_EQ(indexer.points().back().timeMs, s.elapsedMs);
        }
        offset += 188;
    }
    EXPECT_EQ(indexer.pcrPid(), 0x100);
    EXPECT_EQ(indexer.takePoints().size(), 6u);
    EXPECT_TRUE(indexer.points().empty());
}

}  // namespace
}  // namespace TavoPlayer
