#include "platform/dtv/PcrPacer.h"

#include <gtest/gtest.h>

#include "support/TsPacketBuilder.h"

namespace TavoPlayer {
namespace {

using test::pcrPacket;
using test::TsPacket;
using test::TsPacketBuilder;

constexpr int64_t kMs = 1'000'000;

TsPacket plainPacket(uint16_t pid, uint8_t tag) {
    return TsPacketBuilder().pid(pid).payload(std::vector<uint8_t>(184, tag)).build();
}

struct PcrCase {
    const char* name;
    TsPacket packet;
    bool has;
    uint64_t ticks;
    bool discontinuity;
};

TEST(PcrPacerReadPcr, ReadsBaseAndExtensionOnlyWhereTheFlagsSayThereIsOne) {
    const PcrCase cases[] = {
        {"payload only", plainPacket(0x100, 1), false, 0, false},
        {"base and extension", pcrPacket(0x100, 12345, 299), true, 12345ull * 300 + 299, false},
        {"largest base", pcrPacket(0x100, (1ull << 33) - 1, 0), true, ((1ull << 33) - 1) * 300,
         false},
        {"discontinuity", pcrPacket(0x100, 90000, 0, true), true, 90000ull * 300, true},
        {"flag without room",
         TsPacketBuilder().pid(0x100).rawAfterHeader({1, 0x10}).adaptationControl(2).build(), false,
         0, false},
    };
    for (const PcrCase& c : cases) {
        uint64_t ticks = 77;
        bool discontinuity = false;
        EXPECT_EQ(PcrPacer::readPcr(c.packet.data(), &ticks, &discontinuity), c.has) << c.name;
        if (c.has) {
            EXPECT_EQ(ticks, c.ticks) << c.name;
            EXPECT_EQ(discontinuity, c.discontinuity) << c.name;
        }
    }
}

// Pushes packets and records, for each one taken, the time at which it was due.
class PcrPacerTest : public ::testing::Test {
protected:
    void push(const TsPacket& packet) { pacer.push(packet.data(), now); }
    PcrPacer pacer;
    int64_t now = 5'000 * kMs;
};

TEST_F(PcrPacerTest, PacketsBetweenTwoPcrsAreSpreadEvenlyBetweenTheirTimes) {
    push(pcrPacket(0x100, 90000));  // anchors now
    for (int i = 0; i < 3; ++i)
        push(plainPacket(0x101, static_cast<uint8_t>(i)));
    // Nothing after the first PCR is timed until the next PCR arrives.
    std::vector<uint8_t> out;
    EXPECT_EQ(pacer.takeDue(now + 10'000 * kMs, out), 1u);
    EXPECT_FALSE(pacer.nextKnown());
    push(pcrPacket(0x100, 90000 + 3600));  // 40 ms later in stream time
    ASSERT_TRUE(pacer.nextKnown());
    EXPECT_EQ(pacer.takeDue(now + 10 * kMs, out), 1u);
    EXPECT_EQ(pacer.nextDueNs(), now + 20 * kMs);
    EXPECT_EQ(pacer.takeDue(now + 39 * kMs, out), 2u);
    EXPECT_EQ(pacer.nextDueNs(), now + 40 * kMs);  // the second PCR packet itself
    EXPECT_EQ(pacer.takeDue(now + 40 * kMs, out), 1u);
    EXPECT_EQ(out.size(), 5u * 188);
}

// Packets before the first PCR are due at once; only the first PCR PID drives the
// clock.
TEST_F(PcrPacerTest, FirstPcrPidAnchorsAndDrivesTheClock) {
    push(plainPacket(0x101, 1));
    push(plainPacket(0x101, 2));
    EXPECT_FALSE(pacer.nextKnown());
    push(pcrPacket(0x100, 0));
    push(pcrPacket(0x200, 9'000'000));  // another programme's clock: ignored
    push(pcrPacket(0x100, 900));        // 10 ms
    std::vector<uint8_t> out;
    EXPECT_EQ(pacer.takeDue(now, out), 3u);
    EXPECT_EQ(pacer.nextDueNs(), now + 5 * kMs);
}

// A steady 40 ms segment of 4 packets establishes 10 ms per packet; then a second
// segment of 4 ends in a PCR that jumps, or not. A discontinuity re-anchors at the
// last rate, without stall or burst.
TEST(PcrPacerJumps, DiscontinuityReanchorsWithoutStallOrBurst) {
    const struct {
        const char* name;
        uint64_t firstBase, secondBase;
        bool indicator, discontinuity;
        int64_t secondDueMs;  // from the anchor
    } cases[] = {
        // In step: the next 40 ms.
        {"steady", 90000, 90000 + 7200, false, false, 80},
        // The 33-bit base wraps inside the segment: still 40 ms, no discontinuity.
        {"wrap of 33 bits", (1ull << 33) - 5400, 1800, false, false, 80},
        // Backwards (a loop to the start of a file): continue at the last rate.
        {"backwards", 900000, 1000, false, true, 80},
        // Twenty seconds ahead: a new time base, not a silence to wait out.
        {"far ahead", 90000, 90000 + 1800000, false, true, 80},
        // The discontinuity_indicator says so even for a plausible step.
        {"indicator", 90000, 90000 + 7200, true, true, 80},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        PcrPacer pacer;
        const int64_t now = 1'000 * kMs;
        pacer.push(pcrPacket(0x100, c.firstBase).data(), now);
        for (int i = 0; i < 3; ++i)
            pacer.push(plainPacket(0x101, 0).data(), now);
        pacer.push(pcrPacket(0x100, (c.firstBase + 3600) % (1ull << 33)).data(), now);
        for (int i = 0; i < 3; ++i)
            pacer.push(plainPacket(0x101, 0).data(), now);
        pacer.push(pcrPacket(0x100, c.secondBase, 0, c.indicator).data(), now);
        std::vector<uint8_t> out;
        pacer.takeDue(now + 40 * kMs, out);
        ASSERT_TRUE(pacer.nextKnown());
        EXPECT_EQ(pacer.discontinuities(), c.discontinuity ? 1u : 0u);
        // The three packets in between and the new PCR packet:
        EXPECT_EQ(pacer.nextDueNs(), now + 50 * kMs);
        pacer.takeDue(now + 79 * kMs, out);
        EXPECT_EQ(pacer.nextDueNs(), now + c.secondDueMs * kMs);
    }
}

TEST_F(PcrPacerTest, EndOfStreamTimesTheTailAtTheLastRateAndReanchorsTheNextPass) {
    push(pcrPacket(0x100, 0));
    push(plainPacket(0x101, 0));
    push(pcrPacket(0x100, 1800));  // 20 ms for 2 packets: 10 ms each
    push(plainPacket(0x101, 0));
    push(plainPacket(0x101, 0));
    pacer.endOfStream(now);
    std::vector<uint8_t> out;
    EXPECT_EQ(pacer.takeDue(now + 20 * kMs, out), 3u);
    EXPECT_EQ(pacer.nextDueNs(), now + 30 * kMs);
    EXPECT_EQ(pacer.takeDue(now + 40 * kMs, out), 2u);
    // The same file again: its first PCR (0) continues the time line.
    push(pcrPacket(0x100, 0));
    EXPECT_EQ(pacer.discontinuities(), 1u);
    ASSERT_TRUE(pacer.nextKnown());
    EXPECT_EQ(pacer.nextDueNs(), now + 50 * kMs);
}

TEST_F(PcrPacerTest, StreamWithoutPcrIsNotHeldForever) {
    for (size_t i = 0; i < PcrPacer::kMaxUntimedPackets; ++i)
        push(plainPacket(0x101, 0));
    ASSERT_TRUE(pacer.nextKnown());
    std::vector<uint8_t> out;
    EXPECT_EQ(pacer.takeDue(now, out), PcrPacer::kMaxUntimedPackets);
    EXPECT_EQ(pacer.heldPackets(), 0u);
}

TEST_F(PcrPacerTest, TimeLineFarBehindTheClockMovesToNow) {
    push(pcrPacket(0x100, 0));
    now += 10'000 * kMs;  // the reader stalled for ten seconds
    push(pcrPacket(0x100, 900));
    std::vector<uint8_t> out;
    pacer.takeDue(now - 10'000 * kMs, out);
    ASSERT_TRUE(pacer.nextKnown());
    EXPECT_EQ(pacer.nextDueNs(), now);
}

}  // namespace
}  // namespace TavoPlayer
