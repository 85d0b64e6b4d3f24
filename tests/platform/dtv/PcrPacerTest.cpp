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

// Pushes packets at `now` and reads the pacer's times relative to it.
class PcrPacerTest : public ::testing::Test {
protected:
    void push(const TsPacket& packet) { pacer.push(packet.data(), now); }
    void pushPlain(size_t count) {
        for (size_t i = 0; i < count; ++i)
            push(plainPacket(0x101, static_cast<uint8_t>(i)));
    }
    // Takes what is due `ms` after now; returns how many packets that was.
    size_t takeDue(int64_t ms) { return pacer.takeDue(now + ms * kMs, out); }
    // When the oldest held packet is due, in ns after now; -1 while it has no time.
    int64_t nextDue() const { return pacer.nextKnown() ? pacer.nextDueNs() - now : -1; }
    PcrPacer pacer;
    int64_t now = 5'000 * kMs;
    std::vector<uint8_t> out;
};

TEST_F(PcrPacerTest, PacketsBetweenTwoPcrsAreSpreadEvenlyBetweenTheirTimes) {
    push(pcrPacket(0x100, 90000));  // anchors now
    pushPlain(3);
    // Nothing after the first PCR is timed until the next PCR arrives.
    EXPECT_EQ(takeDue(10'000), 1u);
    EXPECT_EQ(nextDue(), -1);
    push(pcrPacket(0x100, 90000 + 3600));  // 40 ms later in stream time
    EXPECT_EQ(takeDue(10), 1u);
    EXPECT_EQ(nextDue(), 20 * kMs);
    EXPECT_EQ(takeDue(39), 2u);
    EXPECT_EQ(nextDue(), 40 * kMs);  // the second PCR packet itself
    EXPECT_EQ(takeDue(40), 1u);
    EXPECT_EQ(out.size(), 5u * 188);
}

// Packets before the first PCR are due at once; only the first PCR PID drives the
// clock.
TEST_F(PcrPacerTest, FirstPcrPidAnchorsAndDrivesTheClock) {
    pushPlain(2);
    EXPECT_EQ(nextDue(), -1);
    push(pcrPacket(0x100, 0));
    push(pcrPacket(0x200, 9'000'000));  // another programme's clock: ignored
    push(pcrPacket(0x100, 900));        // 10 ms
    EXPECT_EQ(takeDue(0), 3u);
    EXPECT_EQ(nextDue(), 5 * kMs);
}

// A steady 40 ms segment of 4 packets establishes 10 ms per packet; then a second
// segment of 4 ends in a PCR that jumps, or not. A discontinuity re-anchors at the
// last rate, without stall or burst: the second segment's PCR packet is due 80 ms on.
TEST_F(PcrPacerTest, DiscontinuityReanchorsWithoutStallOrBurst) {
    const struct {
        const char* name;
        uint64_t firstBase, secondBase;
        bool indicator, discontinuity;
    } cases[] = {
        {"steady", 90000, 90000 + 7200, false, false},
        // The 33-bit base wraps inside the segment: still 40 ms, no discontinuity.
        {"wrap of 33 bits", (1ull << 33) - 5400, 1800, false, false},
        // Backwards (a loop to the start of a file): continue at the last rate.
        {"backwards", 900000, 1000, false, true},
        // Twenty seconds ahead: a new time base, not a silence to wait out.
        {"far ahead", 90000, 90000 + 1800000, false, true},
        // The discontinuity_indicator says so even for a plausible step.
        {"indicator", 90000, 90000 + 7200, true, true},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        pacer = PcrPacer();
        push(pcrPacket(0x100, c.firstBase));
        pushPlain(3);
        push(pcrPacket(0x100, (c.firstBase + 3600) % (1ull << 33)));
        pushPlain(3);
        push(pcrPacket(0x100, c.secondBase, 0, c.indicator));
        takeDue(40);
        EXPECT_EQ(pacer.discontinuities(), c.discontinuity ? 1u : 0u);
        // The three packets in between and the new PCR packet:
        EXPECT_EQ(nextDue(), 50 * kMs);
        takeDue(79);
        EXPECT_EQ(nextDue(), 80 * kMs);
    }
}

TEST_F(PcrPacerTest, EndOfStreamTimesTheTailAtTheLastRateAndReanchorsTheNextPass) {
    push(pcrPacket(0x100, 0));
    pushPlain(1);
    push(pcrPacket(0x100, 1800));  // 20 ms for 2 packets: 10 ms each
    pushPlain(2);
    pacer.endOfStream(now);
    EXPECT_EQ(takeDue(20), 3u);
    EXPECT_EQ(nextDue(), 30 * kMs);
    EXPECT_EQ(takeDue(40), 2u);
    // The same file again: its first PCR (0) continues the time line.
    push(pcrPacket(0x100, 0));
    EXPECT_EQ(pacer.discontinuities(), 1u);
    EXPECT_EQ(nextDue(), 50 * kMs);
}

TEST_F(PcrPacerTest, StreamWithoutPcrIsNotHeldForever) {
    pushPlain(PcrPacer::kMaxUntimedPackets);
    EXPECT_NE(nextDue(), -1);
    EXPECT_EQ(takeDue(0), PcrPacer::kMaxUntimedPackets);
    EXPECT_EQ(pacer.heldPackets(), 0u);
}

TEST_F(PcrPacerTest, TimeLineFarBehindTheClockMovesToNow) {
    push(pcrPacket(0x100, 0));
    now += 10'000 * kMs;  // the reader stalled for ten seconds
    push(pcrPacket(0x100, 900));
    takeDue(-10'000);
    EXPECT_EQ(nextDue(), 0);
}

}  // namespace
}  // namespace TavoPlayer
