// Transport-level properties of one generated stream, read with the tests' own
// packet reader: counters, clock references, tables, PES timing and contents.

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>

#include "CaptionWriter.h"
#include "TsgenTestUtil.h"

namespace TavoPlayer::test {
namespace {

constexpr int64_t kMuxRate = 2000000;
constexpr int64_t kStartPts = 900000;
constexpr int64_t kTicks27PerPacket = 188 * 8 * 27000000LL / kMuxRate;  // 20304

class TsgenMuxTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        sDir = std::make_unique<TempDir>();
        const auto run = runTsgen(
            sDir->path("mux.ts"),
            "-d 3 --size 320x240 --mux-rate 2000000 --start-pts 900000 --pcr-interval-ms 30 "
            "--caption '1:Olá\\nmundo' --caption '2.5:\\f' --caption-mgmt-interval 1");
        ASSERT_EQ(run.exitCode, 0) << run.err;
        sTs = std::make_unique<TsFile>(readFile(sDir->path("mux.ts")));
    }
    static void TearDownTestSuite() {
        sTs.reset();
        sDir.reset();
    }

    static std::unique_ptr<TempDir> sDir;
    static std::unique_ptr<TsFile> sTs;
};

std::unique_ptr<TempDir> TsgenMuxTest::sDir;
std::unique_ptr<TsFile> TsgenMuxTest::sTs;

TEST_F(TsgenMuxTest, EveryPidKeepsItsContinuityCounter) {
    ASSERT_TRUE(sTs->valid());
    for (uint16_t pid : {0x0000, 0x1000, 0x111, 0x112, 0x130}) {
        EXPECT_FALSE(sTs->packetsOf(pid).empty()) << "PID " << pid;
        EXPECT_TRUE(sTs->continuityErrors(pid).empty()) << "PID " << pid;
    }
    for (const auto& p : sTs->packets()) {
        EXPECT_FALSE(p.tei);
        EXPECT_EQ(p.scrambling, 0);
    }
}

TEST_F(TsgenMuxTest, PcrFollowsTheConstantRateAndItsInterval) {
    const TsPacket* previous = nullptr;
    size_t pcrCount = 0;
    for (const auto& p : sTs->packets()) {
        if (!p.hasPcr) {
            continue;
        }
        ++pcrCount;
        EXPECT_EQ(p.pid, 0x111);
        if (previous != nullptr) {
            const int64_t distance = static_cast<int64_t>(p.position - previous->position);
            // Each slot lasts 188 * 8 / 2 Mbit/s = 752 us; the PCR is exact to a tick.
            EXPECT_NEAR(p.pcr27 - previous->pcr27, distance * kTicks27PerPacket, 1);
            // Asked for every 30 ms; a PCR may wait at most one slot.
            EXPECT_LE(p.pcr27 - previous->pcr27, 30 * 27000 + kTicks27PerPacket);
        }
        previous = &p;
    }
    EXPECT_GT(pcrCount, 3000u / 30u);
}

TEST_F(TsgenMuxTest, TablesComeFirstAndAtTheirPeriod) {
    ASSERT_GE(sTs->packets().size(), 2u);
    EXPECT_EQ(sTs->packets()[0].pid, 0x0000);
    EXPECT_EQ(sTs->packets()[1].pid, 0x1000);
    const auto pats = sTs->packetsOf(0x0000);
    // 100 ms at 752 us per slot is 133 slots; the stream lasts about 3.8 s.
    for (size_t i = 1; i < pats.size(); ++i) {
        EXPECT_NEAR(static_cast<double>(pats[i]->position - pats[i - 1]->position), 133.0, 1.0);
    }
    EXPECT_GE(pats.size(), 35u);
}

TEST_F(TsgenMuxTest, VideoPesCarryOneAccessUnitWithDelimiterAndTimes) {
    const auto pes = sTs->pesOf(0x111);
    ASSERT_EQ(pes.size(), 90u);
    std::vector<int64_t> pts;
    for (size_t i = 0; i < pes.size(); ++i) {
        const Pes& p = pes[i];
        EXPECT_EQ(p.streamId, 0xE0);
        ASSERT_TRUE(p.hasPts);
        const int64_t dts = p.hasDts ? p.dts : p.pts;
        EXPECT_LE(dts, p.pts);
        const auto nals = nalTypes(p.payload);
        ASSERT_FALSE(nals.empty());
        EXPECT_EQ(nals[0], 9) << "PES " << i;  // access unit delimiter first
        const bool idr = std::find(nals.begin(), nals.end(), 5) != nals.end();
        if (i % 15 == 0) {
            // Fixed GOPs of 15: an IDR with its parameter sets, flagged as a
            // random access point in the adaptation field.
            EXPECT_TRUE(idr) << "PES " << i;
            EXPECT_NE(std::find(nals.begin(), nals.end(), 7), nals.end());
            EXPECT_NE(std::find(nals.begin(), nals.end(), 8), nals.end());
            EXPECT_TRUE(sTs->packets()[p.firstPacket].randomAccess);
        }
        pts.push_back(p.pts);
    }
    std::sort(pts.begin(), pts.end());
    for (size_t i = 0; i < pts.size(); ++i) {
        EXPECT_EQ(pts[i], kStartPts + static_cast<int64_t>(i) * 3003);
    }
}

TEST_F(TsgenMuxTest, EveryPesArrivesBeforeItsDecodingTime) {
    // The receiver's clock at a packet is the PCR extrapolated along the rate.
    const auto& packets = sTs->packets();
    const auto firstPcr =
        std::find_if(packets.begin(), packets.end(), [](const TsPacket& p) { return p.hasPcr; });
    ASSERT_NE(firstPcr, packets.end());
    auto clockAt = [&](uint64_t position) {
        return firstPcr->pcr27 +
               (static_cast<int64_t>(position) - static_cast<int64_t>(firstPcr->position)) *
                   kTicks27PerPacket;
    };
    for (uint16_t pid : {0x111, 0x112, 0x130}) {
        const auto pes = sTs->pesOf(pid);
        ASSERT_FALSE(pes.empty());
        for (const auto& p : pes) {
            const int64_t dts = p.hasDts ? p.dts : p.pts;
            EXPECT_LT(clockAt(p.firstPacket), dts * 300) << "PID " << pid;
            // Never sent more than a second early either.
            EXPECT_GT(clockAt(p.firstPacket), dts * 300 - 27000000) << "PID " << pid;
        }
    }
}

TEST_F(TsgenMuxTest, AudioPesFollowOneAnotherByOneFrame) {
    const auto pes = sTs->pesOf(0x112);
    ASSERT_GE(pes.size(), 140u);  // 3 s of 1024-sample frames at 48 kHz
    for (size_t i = 0; i < pes.size(); ++i) {
        EXPECT_EQ(pes[i].streamId, 0xC0);
        EXPECT_EQ(pes[i].pts, kStartPts + static_cast<int64_t>(i) * 1920);
        ASSERT_GE(pes[i].payload.size(), 3u);
        // One LOAS AudioSyncStream per PES: sync word 0x2B7 and its length.
        EXPECT_EQ(pes[i].payload[0], 0x56);
        EXPECT_EQ(pes[i].payload[1] & 0xE0, 0xE0);
        const size_t length = ((pes[i].payload[1] & 0x1F) << 8) | pes[i].payload[2];
        EXPECT_EQ(pes[i].payload.size(), 3 + length);
    }
}

TEST_F(TsgenMuxTest, CaptionStatementsCarryTheTextAtTheirTimes) {
    const auto pes = sTs->pesOf(0x130);
    struct Statement {
        int64_t pts;
        std::vector<uint8_t> unit;
    };
    std::vector<Statement> statements;
    size_t management = 0;
    for (const auto& p : pes) {
        EXPECT_EQ(p.streamId, 0xBD);
        ASSERT_GE(p.payload.size(), 10u);
        EXPECT_EQ(p.payload[0], 0x80);  // data_identifier
        const size_t group = 3 + (p.payload[2] & 0x0F);
        const size_t groupSize = (p.payload[group + 3] << 8) | p.payload[group + 4];
        ASSERT_EQ(p.payload.size(), group + 5 + groupSize + 2);
        EXPECT_EQ(tsgen::CaptionWriter::crc16(p.payload.data() + group, 5 + groupSize + 2), 0);
        const int groupId = p.payload[group] >> 2;
        if (groupId == 0) {
            ++management;
            continue;
        }
        EXPECT_EQ(groupId, 1);
        const uint8_t* d = p.payload.data() + group + 5;
        EXPECT_EQ(d[0] >> 6, 0);  // TMD free: shown at the PTS
        EXPECT_EQ(d[4], 0x1F);    // unit separator
        EXPECT_EQ(d[5], 0x20);    // statement body
        const size_t unitSize = (d[6] << 16) | (d[7] << 8) | d[8];
        statements.push_back({p.pts, std::vector<uint8_t>(d + 9, d + 9 + unitSize)});
    }
    // Management data every second from the start, before the statements.
    EXPECT_EQ(management, 3u);
    ASSERT_EQ(statements.size(), 2u);
    EXPECT_EQ(statements[0].pts, kStartPts + 90000);
    // "Olá" in the Latin set, \n as APR (0x0D).
    EXPECT_EQ(statements[0].unit,
              (std::vector<uint8_t>{'O', 'l', 0xE1, 0x0D, 'm', 'u', 'n', 'd', 'o'}));
    EXPECT_EQ(statements[1].pts, kStartPts + 225000);
    EXPECT_EQ(statements[1].unit, (std::vector<uint8_t>{0x0C}));
}

}  // namespace
}  // namespace TavoPlayer::test
