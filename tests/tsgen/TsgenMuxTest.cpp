// Transport-level properties of one generated stream, read with the tests' own
// packet reader: clock references, tables, PES timing and contents. The
// access unit delimiters are checked beside the fault that removes them.

#include <gtest/gtest.h>

#include <algorithm>

#include "CaptionWriter.h"
#include "TsgenTestUtil.h"

namespace TavoPlayer::test {
namespace {

using tsgen::CaptionWriter;

constexpr int64_t kMuxRate = 2000000;
constexpr int64_t kStartPts = 900000;
constexpr int64_t kSlot27 = ticks27PerPacket(kMuxRate);  // 752 us per packet

class TsgenMuxTest : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_TRUE(mGen.ok()); }
    const Generated& mGen = tsgen(
        "-d 3 --size 320x240 --mux-rate 2000000 --start-pts 900000 --pcr-interval-ms 30 "
        "--caption '1:Olá\\nmundo' --caption '2.5:\\f' --caption-mgmt-interval 1");
    const TsFile& mTs = mGen.ts;
};

TEST_F(TsgenMuxTest, CountersRunUnbrokenAndNoPacketIsFlagged) {
    EXPECT_TRUE(mTs.continuityErrors().empty());
    EXPECT_TRUE(mTs.where([](auto& p) { return p.tei || p.scrambling != 0; }).empty());
}

TEST_F(TsgenMuxTest, PcrFollowsTheConstantRateAndItsInterval) {
    // The PCR is exact to a tick at the constant rate, and only on the video PID.
    EXPECT_TRUE(pcrAnomalies(mTs, kMuxRate).empty());
    const auto pcr = mTs.where([](auto& p) { return p.hasPcr; });
    ASSERT_EQ(pcr.size(), 1u);
    const auto& at = pcr.at(0x111);
    const auto video = mTs.packetsOf(0x111);
    EXPECT_GT(at.size(), 3000u / 30u);
    // Asked for every 30 ms; a PCR may wait at most one slot.
    for (size_t i = 1; i < at.size(); ++i)
        EXPECT_LE(video[at[i]]->pcr27 - video[at[i - 1]]->pcr27, 30 * 27000 + kSlot27) << i;
}

TEST_F(TsgenMuxTest, TablesComeFirstAndAtTheirPeriod) {
    EXPECT_EQ(mTs.packets[0].pid, 0x0000);
    EXPECT_EQ(mTs.packets[1].pid, 0x1000);
    const auto pats = mTs.packetsOf(0x0000);
    // 100 ms at 752 us per slot is 133 slots; the stream lasts about 3.8 s.
    for (size_t i = 1; i < pats.size(); ++i)
        EXPECT_NEAR(static_cast<double>(pats[i]->position - pats[i - 1]->position), 133.0, 1.0);
    EXPECT_GE(pats.size(), 35u);
}

// The presentation times' spacing from --start-pts is checked beside the fault
// that makes them wrap.
TEST_F(TsgenMuxTest, VideoPesCarryOneAccessUnitAndGopsOf15) {
    const auto pes = mTs.pesOf(0x111);
    ASSERT_EQ(pes.size(), 90u);
    for (size_t i = 0; i < pes.size(); ++i) {
        const Pes& p = pes[i];
        EXPECT_EQ(p.streamId, 0xE0);
        ASSERT_TRUE(p.hasPts);
        EXPECT_LE(p.hasDts ? p.dts : p.pts, p.pts);
        const auto nals = nalTypes(p.payload);
        auto has = [&](int type) { return std::count(nals.begin(), nals.end(), type) > 0; };
        // Fixed GOPs of 15: an IDR with its parameter sets, flagged as a random
        // access point in the adaptation field.
        EXPECT_TRUE(i % 15 != 0 || (has(5) && has(7) && has(8))) << "PES " << i;
        EXPECT_TRUE(i % 15 != 0 || mTs.packets[p.firstPacket].randomAccess) << "PES " << i;
    }
}

TEST_F(TsgenMuxTest, EveryPesArrivesBeforeItsDecodingTime) {
    // The receiver's clock at a packet is the PCR extrapolated along the rate.
    const auto pcr =
        std::find_if(mTs.packets.begin(), mTs.packets.end(), [](auto& p) { return p.hasPcr; });
    ASSERT_NE(pcr, mTs.packets.end());
    for (uint16_t pid : {0x111, 0x112, 0x130}) {
        const auto pes = mTs.pesOf(pid);
        ASSERT_FALSE(pes.empty());
        for (const auto& p : pes) {
            const int64_t clock =
                pcr->pcr27 + (static_cast<int64_t>(p.firstPacket - pcr->position)) * kSlot27;
            const int64_t dts = p.hasDts ? p.dts : p.pts;
            EXPECT_LT(clock, dts * 300) << "PID " << pid;
            // Never sent more than a second early either.
            EXPECT_GT(clock, dts * 300 - 27000000) << "PID " << pid;
        }
    }
}

TEST_F(TsgenMuxTest, AudioPesFollowOneAnotherByOneFrame) {
    const auto pes = mTs.pesOf(0x112);
    ASSERT_GE(pes.size(), 140u);  // 3 s of 1024-sample frames at 48 kHz
    for (size_t i = 0; i < pes.size(); ++i) {
        const auto& payload = pes[i].payload;
        EXPECT_EQ(pes[i].streamId, 0xC0);
        EXPECT_EQ(pes[i].pts, kStartPts + static_cast<int64_t>(i) * 1920);
        ASSERT_GE(payload.size(), 3u);
        // One LOAS AudioSyncStream per PES: sync word 0x2B7 and its length.
        EXPECT_EQ((payload[0] << 3) | (payload[1] >> 5), 0x2B7);
        EXPECT_EQ(payload.size(), 3 + (((payload[1] & 0x1F) << 8) | payload[2]));
    }
}

TEST_F(TsgenMuxTest, CaptionStatementsCarryTheTextAtTheirTimes) {
    // The data groups' layout is checked byte by byte with the caption writer;
    // here the PES carry them whole and consistent, at their times.
    const auto management = CaptionWriter::managementPayload();
    using Timed = std::vector<std::pair<int64_t, std::vector<uint8_t>>>;  // PTS, PES payload
    Timed statements;
    size_t managementCount = 0;
    for (const auto& p : mTs.pesOf(0x130)) {
        EXPECT_EQ(p.streamId, 0xBD);
        // PES data header of 3 bytes, then one data group: 5 header bytes, its
        // data_group_size, and a CRC_16 that leaves no remainder (ARIB STD-B24).
        ASSERT_GE(p.payload.size(), 10u);
        EXPECT_EQ(p.payload.size(), 3 + 5 + ((p.payload[6] << 8) | p.payload[7]) + 2u);
        EXPECT_EQ(CaptionWriter::crc16(p.payload.data() + 3, p.payload.size() - 3), 0);
        managementCount += p.payload == management ? 1 : 0;
        if (p.payload != management)
            statements.emplace_back(p.pts, p.payload);
    }
    // Management data every second from the start, before the statements.
    EXPECT_EQ(managementCount, 3u);
    // "Olá" in the Latin set, \n as APR (0x0D); \f as CS (0x0C).
    EXPECT_EQ(statements, (Timed{{kStartPts + 90000, CaptionWriter::statementPayload(
                                                         hex("4F 6C E1 0D 6D 75 6E 64 6F"))},
                                 {kStartPts + 225000, CaptionWriter::statementPayload({0x0C})}}));
}

}  // namespace
}  // namespace TavoPlayer::test
