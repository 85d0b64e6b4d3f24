// Variations of the same contents: PES cut at fixed byte counts, 204-byte
// packets, and an announced change of time base.

#include <gtest/gtest.h>

#include <memory>

#include "TsgenTestUtil.h"

namespace TavoPlayer::test {
namespace {

const std::string kBase = "-d 2 --size 320x240 --seed 5 --mux-rate 2000000 ";

std::vector<uint8_t> elementaryStream(const std::vector<Pes>& pes) {
    std::vector<uint8_t> es;
    for (const auto& p : pes) {
        es.insert(es.end(), p.payload.begin(), p.payload.end());
    }
    return es;
}

class TsgenVariantTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        sDir = std::make_unique<TempDir>();
        const auto run = runTsgen(sDir->path("plain.ts"), kBase);
        ASSERT_EQ(run.exitCode, 0) << run.err;
        sPlain = std::make_unique<TsFile>(readFile(sDir->path("plain.ts")));
    }
    static void TearDownTestSuite() {
        sPlain.reset();
        sDir.reset();
    }
    static std::unique_ptr<TempDir> sDir;
    static std::unique_ptr<TsFile> sPlain;
};

std::unique_ptr<TempDir> TsgenVariantTest::sDir;
std::unique_ptr<TsFile> TsgenVariantTest::sPlain;

struct CutCase {
    const char* name;
    const char* codecArgs;  // shared by the cut stream and its reference
    const char* cutArgs;
    uint16_t pid;
};

class TsgenResegmentationTest : public TsgenVariantTest,
                                public ::testing::WithParamInterface<CutCase> {};

TEST_P(TsgenResegmentationTest, SameBytesInOtherPesWithTimesOnlyWhereUnitsStart) {
    const CutCase& c = GetParam();
    const std::string file = sDir->path(std::string(c.name) + ".ts");
    const std::string reference = sDir->path(std::string(c.name) + "_ref.ts");
    auto run = runTsgen(file, kBase + c.codecArgs + " " + c.cutArgs);
    ASSERT_EQ(run.exitCode, 0) << run.err;
    run = runTsgen(reference, kBase + c.codecArgs);
    ASSERT_EQ(run.exitCode, 0) << run.err;
    TsFile ts(readFile(file));
    TsFile ref(readFile(reference));
    ASSERT_TRUE(ts.valid());
    ASSERT_TRUE(ref.valid());

    const auto plain = ref.pesOf(c.pid);
    const auto cut = ts.pesOf(c.pid);
    EXPECT_EQ(elementaryStream(cut), elementaryStream(plain));
    EXPECT_NE(cut.size(), plain.size());

    // Every PES of the plain stream starts a unit; in the cut stream a PES has
    // the PTS of the first unit that starts in it, or none.
    std::vector<size_t> unitStarts;
    size_t at = 0;
    for (const auto& p : plain) {
        unitStarts.push_back(at);
        at += p.payload.size();
    }
    size_t offset = 0;
    size_t unit = 0;
    for (const auto& p : cut) {
        while (unit < unitStarts.size() && unitStarts[unit] < offset) {
            ++unit;
        }
        const bool starts =
            unit < unitStarts.size() && unitStarts[unit] < offset + p.payload.size();
        EXPECT_EQ(p.hasPts, starts);
        if (starts) {
            EXPECT_EQ(p.pts, plain[unit].pts);
        }
        offset += p.payload.size();
    }
    const auto decode = runCommand("ffmpeg -nostdin -v error -i '" + file + "' -f null -");
    EXPECT_EQ(decode.err, "");
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

TEST_F(TsgenVariantTest, PacketsOf204BytesCarryTheSame188) {
    const std::string file = sDir->path("rs204.ts");
    ASSERT_EQ(runTsgen(file, kBase + "--packet-size 204").exitCode, 0);
    const auto bytes = readFile(file);
    TsFile ts(bytes, 204);
    ASSERT_TRUE(ts.valid());
    ASSERT_EQ(ts.packets().size(), sPlain->packets().size());
    const auto plain = readFile(sDir->path("plain.ts"));
    for (size_t i = 0; i < ts.packets().size(); ++i) {
        ASSERT_TRUE(std::equal(bytes.begin() + i * 204, bytes.begin() + i * 204 + 188,
                               plain.begin() + i * 188))
            << "packet " << i;
    }
}

TEST_F(TsgenVariantTest, TimebaseJumpIsAnnouncedAndMovesEveryClock) {
    const std::string file = sDir->path("jump.ts");
    ASSERT_EQ(runTsgen(file, kBase + "--timebase-jump 1:5000").exitCode, 0);
    TsFile ts(readFile(file));
    ASSERT_TRUE(ts.valid());
    ASSERT_EQ(ts.packets().size(), sPlain->packets().size());

    // Exactly one PCR packet carries discontinuity_indicator, and there the PCR
    // moves on by 5 s more than the bytes say.
    const TsPacket* marked = nullptr;
    for (const auto& p : ts.packets()) {
        if (p.discontinuity) {
            ASSERT_EQ(marked, nullptr);
            marked = &p;
        }
    }
    ASSERT_NE(marked, nullptr);
    ASSERT_TRUE(marked->hasPcr);
    const TsPacket* before = nullptr;
    for (const auto& p : ts.packets()) {
        if (p.hasPcr && p.position < marked->position) {
            before = &p;
        }
    }
    ASSERT_NE(before, nullptr);
    const int64_t slots = static_cast<int64_t>(marked->position - before->position);
    EXPECT_NEAR(marked->pcr27 - before->pcr27 - slots * (188 * 8 * 27000000LL / 2000000),
                5000 * 27000, 1);

    // PES that start after the mark are on the new time base; those before are not.
    for (uint16_t pid : {0x111, 0x112}) {
        const auto plain = sPlain->pesOf(pid);
        const auto jumped = ts.pesOf(pid);
        ASSERT_EQ(plain.size(), jumped.size());
        size_t moved = 0;
        for (size_t i = 0; i < plain.size(); ++i) {
            const int64_t shift = jumped[i].pts - plain[i].pts;
            if (jumped[i].firstPacket >= marked->position) {
                EXPECT_EQ(shift, 450000) << "PID " << pid << " PES " << i;
                ++moved;
            } else {
                EXPECT_EQ(shift, 0) << "PID " << pid << " PES " << i;
            }
        }
        EXPECT_GT(moved, 0u);
    }
}

}  // namespace
}  // namespace TavoPlayer::test
