// Variations of the same contents: PES cut at fixed byte counts, 204-byte
// packets, and an announced change of time base.

#include <gtest/gtest.h>

#include "TsgenTestUtil.h"

namespace TavoPlayer::test {
namespace {

const std::string kBase = "-d 2 --size 320x240 --seed 5 --mux-rate 2000000 ";

struct CutCase {
    const char* name;
    const char* codecArgs;  // shared by the cut stream and its reference
    const char* cutArgs;
    uint16_t pid;
};

void PrintTo(const CutCase& c, std::ostream* os) {
    *os << c.name;
}

class TsgenResegmentationTest : public ::testing::TestWithParam<CutCase> {};

TEST_P(TsgenResegmentationTest, SameBytesInOtherPesWithTimesOnlyWhereUnitsStart) {
    const CutCase& c = GetParam();
    const auto& cutGen = tsgen(kBase + c.codecArgs + " " + c.cutArgs);
    const auto& plainGen = tsgen(kBase + c.codecArgs);
    ASSERT_TRUE(cutGen.ok());
    ASSERT_TRUE(plainGen.ok());
    const auto plain = plainGen.ts.pesOf(c.pid);
    const auto cut = cutGen.ts.pesOf(c.pid);
    EXPECT_NE(cut.size(), plain.size());

    // Every PES of the plain stream starts a unit; in the cut stream a PES has
    // the PTS of the first unit that starts in it, or none. Both carry the
    // same elementary stream.
    std::vector<uint8_t> plainEs, cutEs;
    std::vector<size_t> unitStarts;
    for (const auto& p : plain) {
        unitStarts.push_back(plainEs.size());
        plainEs.insert(plainEs.end(), p.payload.begin(), p.payload.end());
    }
    size_t unit = 0;
    for (const auto& p : cut) {
        const size_t offset = cutEs.size();
        cutEs.insert(cutEs.end(), p.payload.begin(), p.payload.end());
        while (unit < unitStarts.size() && unitStarts[unit] < offset) {
            ++unit;
        }
        const bool starts = unit < unitStarts.size() && unitStarts[unit] < cutEs.size();
        EXPECT_EQ(p.hasPts, starts);
        EXPECT_TRUE(!starts || p.pts == plain[unit].pts) << "PES at " << offset;
    }
    EXPECT_EQ(cutEs, plainEs);
    EXPECT_EQ(decodeErrors(cutGen.file), "");
}

INSTANTIATE_TEST_SUITE_P(
    Cuts, TsgenResegmentationTest,
    ::testing::Values(CutCase{"VideoSmall", "", "--video-pes-bytes 777", 0x111},
                      CutCase{"VideoLarge", "", "--video-pes-bytes 5000", 0x111},
                      CutCase{"LatmOdd", "", "--audio-pes-bytes 101", 0x112},
                      CutCase{"LatmSeveralFrames", "", "--audio-pes-bytes 1000", 0x112},
                      CutCase{"AdtsOdd", "--audio adts", "--audio-pes-bytes 250", 0x112},
                      CutCase{"Mp2Odd", "--audio mp2", "--audio-pes-bytes 333", 0x112},
                      CutCase{"LatmThreeFramesPerPes", "", "--audio-frames-per-pes 3", 0x112}),
    [](const auto& info) { return std::string(info.param.name); });

TEST(TsgenVariantTest, PacketsOf204BytesCarryTheSame188) {
    const auto& plain = tsgen(kBase);
    const auto& rs = tsgen(kBase + "--packet-size 204", 204);
    ASSERT_TRUE(plain.ok());
    ASSERT_TRUE(rs.ok());
    ASSERT_EQ(rs.ts.packets().size(), plain.ts.packets().size());
    for (size_t i = 0; i < rs.ts.packets().size(); ++i) {
        ASSERT_TRUE(std::equal(rs.bytes.begin() + i * 204, rs.bytes.begin() + i * 204 + 188,
                               plain.bytes.begin() + i * 188))
            << "packet " << i;
    }
}

TEST(TsgenVariantTest, TimebaseJumpIsAnnouncedAndMovesEveryClock) {
    const auto& plain = tsgen(kBase);
    const auto& jump = tsgen(kBase + "--timebase-jump 1:5000");
    ASSERT_TRUE(plain.ok());
    ASSERT_TRUE(jump.ok());
    ASSERT_EQ(jump.ts.packets().size(), plain.ts.packets().size());

    // Exactly one packet carries discontinuity_indicator, a PCR packet, and
    // there the PCR moves on by 5 s more than the bytes say.
    std::vector<const TsPacket*> marked;
    for (const auto& p : jump.ts.packets()) {
        if (p.discontinuity) {
            marked.push_back(&p);
        }
    }
    ASSERT_EQ(marked.size(), 1u);
    ASSERT_TRUE(marked[0]->hasPcr);
    const auto anomalies = pcrAnomalies(jump.ts, 2000000);
    ASSERT_EQ(anomalies.size(), 1u);
    EXPECT_EQ(anomalies[0].first, marked[0]->position);
    EXPECT_NEAR(anomalies[0].second, 5000 * 27000, 1);

    // PES that start after the mark are on the new time base; those before are not.
    for (uint16_t pid : {0x111, 0x112}) {
        const auto before = plain.ts.pesOf(pid);
        const auto after = jump.ts.pesOf(pid);
        ASSERT_EQ(before.size(), after.size());
        size_t moved = 0;
        for (size_t i = 0; i < before.size(); ++i) {
            const bool late = after[i].firstPacket >= marked[0]->position;
            EXPECT_EQ(after[i].pts - before[i].pts, late ? 450000 : 0)
                << "PID " << pid << " PES " << i;
            moved += late ? 1 : 0;
        }
        EXPECT_GT(moved, 0u);
    }
}

}  // namespace
}  // namespace TavoPlayer::test
