// What an independent reader (ffprobe, ffmpeg) finds in tsgen's output: the
// programme, its streams and codecs, their durations, clean decoding.

#include <gtest/gtest.h>

#include <cmath>
#include <cstdlib>

#include "TsgenTestUtil.h"

namespace TavoPlayer::test {
namespace {

struct AudioCase {
    const char* name;
    const char* option;
    const char* codecName;  // as ffprobe names it
    uint8_t streamType;
    const char* sampleRate = "48000";
    const char* channels = "2";
};

class TsgenAudioCodecTest : public ::testing::TestWithParam<AudioCase> {};

TEST_P(TsgenAudioCodecTest, FfprobeFindsTheProgrammeAndItsStreams) {
    const AudioCase& c = GetParam();
    TempDir dir;
    const std::string file = dir.path("out.ts");
    const auto run =
        runTsgen(file, std::string("-d 3 --size 320x240 --audio ") + c.option + " --caption 1:Ola");
    ASSERT_EQ(run.exitCode, 0) << run.err;

    auto probe = ffprobe(file);
    EXPECT_EQ(probe["programs.program.0.program_num"], "1");
    EXPECT_EQ(probe["programs.program.0.pmt_pid"], "4096");
    EXPECT_EQ(probe["programs.program.0.pcr_pid"], "273");
    EXPECT_EQ(probe["programs.program.0.nb_streams"], "3");
    EXPECT_EQ(probe["streams.stream.0.codec_name"], "h264");
    EXPECT_EQ(probe["streams.stream.0.id"], "0x111");
    EXPECT_EQ(probe["streams.stream.0.width"], "320");
    EXPECT_EQ(probe["streams.stream.0.height"], "240");
    EXPECT_EQ(probe["streams.stream.0.field_order"], "tt");
    EXPECT_EQ(probe["streams.stream.0.r_frame_rate"], "30000/1001");
    EXPECT_EQ(probe["streams.stream.1.codec_name"], c.codecName);
    EXPECT_EQ(probe["streams.stream.1.id"], "0x112");
    EXPECT_EQ(probe["streams.stream.1.sample_rate"], c.sampleRate);
    EXPECT_EQ(probe["streams.stream.1.channels"], c.channels);
    EXPECT_EQ(probe["streams.stream.2.codec_name"], "arib_caption");
    EXPECT_EQ(probe["streams.stream.2.id"], "0x130");

    // 90 frames of 1001/30000 s; audio in whole frames of 1024 or 1152 samples.
    EXPECT_NEAR(std::atof(probe["streams.stream.0.duration"].c_str()), 3.003, 0.001);
    EXPECT_NEAR(std::atof(probe["streams.stream.1.duration"].c_str()), 3.0, 0.03);

    TsFile ts(readFile(file));
    ASSERT_TRUE(ts.valid());
    Pmt pmt;
    ASSERT_TRUE(ts.pmt(0x1000, pmt));
    ASSERT_EQ(pmt.streams.size(), 3u);
    EXPECT_EQ(pmt.streams[1].streamType, c.streamType);

    // Every stream decodes without a single complaint from libavcodec.
    const auto decode = runCommand("ffmpeg -nostdin -v error -i '" + file + "' -f null -");
    EXPECT_EQ(decode.exitCode, 0);
    EXPECT_EQ(decode.err, "");
}

INSTANTIATE_TEST_SUITE_P(
    Codecs, TsgenAudioCodecTest,
    ::testing::Values(AudioCase{"Latm", "latm", "aac_latm", 0x11},
                      AudioCase{"Adts", "adts", "aac", 0x0F}, AudioCase{"Mp2", "mp2", "mp2", 0x03},
                      AudioCase{"Mp3", "mp3", "mp3", 0x03},
                      AudioCase{"LatmConfigEvery8", "latm --latm-config-interval 8", "aac_latm",
                                0x11},
                      AudioCase{"Adts51", "adts --audio-channels 6", "aac", 0x0F, "48000", "6"},
                      AudioCase{"Mp2HalfRate", "mp2 --audio-rate 24000", "mp2", 0x04, "24000"}),
    [](const auto& info) { return std::string(info.param.name); });

TEST(TsgenProgrammeTest, PidsProgramAndPictureAreConfigurable) {
    TempDir dir;
    const std::string file = dir.path("out.ts");
    const auto run = runTsgen(file,
                              "-d 1 --size 352x288 --fps 25 --progressive --program 0x5A1 "
                              "--tsid 0x2E1 --pmt-pid 0x101 --video-pid 0x211 --audio-pid 0x212 "
                              "--caption-pid 0x216 --pcr-pid 0x100 --audio-rate 24000 "
                              "--audio-channels 1");
    ASSERT_EQ(run.exitCode, 0) << run.err;
    auto probe = ffprobe(file);
    EXPECT_EQ(probe["programs.program.0.program_num"], "1441");
    EXPECT_EQ(probe["programs.program.0.pmt_pid"], "257");
    EXPECT_EQ(probe["programs.program.0.pcr_pid"], "256");
    EXPECT_EQ(probe["streams.stream.0.id"], "0x211");
    EXPECT_EQ(probe["streams.stream.0.field_order"], "progressive");
    EXPECT_EQ(probe["streams.stream.0.r_frame_rate"], "25/1");
    EXPECT_EQ(probe["streams.stream.0.width"], "352");
    EXPECT_EQ(probe["streams.stream.1.id"], "0x212");
    EXPECT_EQ(probe["streams.stream.1.sample_rate"], "24000");
    EXPECT_EQ(probe["streams.stream.1.channels"], "1");
    EXPECT_EQ(probe["streams.stream.2.id"], "0x216");

    TsFile ts(readFile(file));
    ASSERT_TRUE(ts.valid());
    EXPECT_EQ(ts.pat(), (std::map<uint16_t, uint16_t>{{0x5A1, 0x101}}));
    // The PCR PID of its own carries nothing but adaptation fields with a PCR.
    const auto pcrPackets = ts.packetsOf(0x100);
    ASSERT_FALSE(pcrPackets.empty());
    for (const auto* p : pcrPackets) {
        EXPECT_EQ(p->adaptationControl, 2);
        EXPECT_TRUE(p->hasPcr);
    }
    for (const auto* p : ts.packetsOf(0x211)) {
        EXPECT_FALSE(p->hasPcr);
    }
}

TEST(TsgenProgrammeTest, PmtDeclaresIsdbTbComponentsAndCaptions) {
    TempDir dir;
    const std::string file = dir.path("out.ts");
    ASSERT_EQ(runTsgen(file, "-d 1 --size 320x240").exitCode, 0);
    TsFile ts(readFile(file));
    Pmt pmt;
    ASSERT_TRUE(ts.pmt(0x1000, pmt));
    EXPECT_EQ(pmt.programNumber, 1);
    ASSERT_EQ(pmt.streams.size(), 3u);
    const struct {
        uint8_t type;
        uint16_t pid;
        uint8_t componentTag;
    } kExpected[] = {{0x1B, 0x111, 0x00}, {0x11, 0x112, 0x10}, {0x06, 0x130, 0x30}};
    for (size_t i = 0; i < 3; ++i) {
        EXPECT_EQ(pmt.streams[i].streamType, kExpected[i].type);
        EXPECT_EQ(pmt.streams[i].pid, kExpected[i].pid);
        ASSERT_GE(pmt.streams[i].descriptors.size(), 1u);
        EXPECT_EQ(pmt.streams[i].descriptors[0],
                  (std::vector<uint8_t>{0x52, 0x01, kExpected[i].componentTag}));
    }
    // Captions are declared by data_component_id 0x0008 (ARIB STD-B10).
    ASSERT_EQ(pmt.streams[2].descriptors.size(), 2u);
    EXPECT_EQ(pmt.streams[2].descriptors[1][0], 0xFD);
    EXPECT_EQ(pmt.streams[2].descriptors[1][2], 0x00);
    EXPECT_EQ(pmt.streams[2].descriptors[1][3], 0x08);
}

TEST(TsgenProgrammeTest, FullHdInterlacedIsTheDefault) {
    TempDir dir;
    const std::string file = dir.path("out.ts");
    ASSERT_EQ(runTsgen(file, "-d 0.5").exitCode, 0);
    auto probe = ffprobe(file);
    EXPECT_EQ(probe["streams.stream.0.width"], "1920");
    EXPECT_EQ(probe["streams.stream.0.height"], "1080");
    EXPECT_EQ(probe["streams.stream.0.field_order"], "tt");
    EXPECT_EQ(probe["streams.stream.1.codec_name"], "aac_latm");
}

TEST(TsgenProgrammeTest, DecodedPicturesShowTheirFrameNumber) {
    TempDir dir;
    const std::string file = dir.path("out.ts");
    ASSERT_EQ(runTsgen(file, "-d 3 --size 640x360 --audio none").exitCode, 0);
    // libavcodec decodes three pictures, in display order, as 8-bit luma.
    const auto decoded =
        runCommand("ffmpeg -nostdin -v error -i '" + file +
                   "' -map 0:v -vf \"select='eq(n,0)+eq(n,37)+eq(n,89)'\" -vsync 0 -f rawvideo "
                   "-pix_fmt gray -");
    ASSERT_EQ(decoded.exitCode, 0) << decoded.err;
    const size_t frameBytes = 640 * 360;
    ASSERT_EQ(decoded.out.size(), 3 * frameBytes);
    const int expected[] = {0, 37, 89};
    for (int f = 0; f < 3; ++f) {
        // 24 blocks of 16x16 on the second block row, most significant bit first.
        int number = 0;
        for (int bit = 0; bit < 24; ++bit) {
            const size_t x = static_cast<size_t>((bit + 1) * 16 + 8);
            const auto luma = static_cast<uint8_t>(decoded.out[f * frameBytes + 24 * 640 + x]);
            number = (number << 1) | (luma > 128 ? 1 : 0);
        }
        EXPECT_EQ(number, expected[f]);
    }
}

class TsgenDeterminismTest : public ::testing::Test {
protected:
    TempDir mDir;
    const std::string mArgs = "-d 2 --size 320x240 --caption 0.5:Ola ";
};

TEST_F(TsgenDeterminismTest, SameSeedGivesIdenticalBytes) {
    ASSERT_EQ(runTsgen(mDir.path("a.ts"), mArgs + "--seed 7").exitCode, 0);
    ASSERT_EQ(runTsgen(mDir.path("b.ts"), mArgs + "--seed 7").exitCode, 0);
    const auto a = readFile(mDir.path("a.ts"));
    ASSERT_FALSE(a.empty());
    EXPECT_TRUE(a == readFile(mDir.path("b.ts")));
}

TEST_F(TsgenDeterminismTest, OtherSeedGivesOtherContent) {
    ASSERT_EQ(runTsgen(mDir.path("a.ts"), mArgs + "--seed 7").exitCode, 0);
    ASSERT_EQ(runTsgen(mDir.path("b.ts"), mArgs + "--seed 8").exitCode, 0);
    EXPECT_FALSE(readFile(mDir.path("a.ts")) == readFile(mDir.path("b.ts")));
}

TEST_F(TsgenDeterminismTest, StandardOutputGetsTheSameBytesAsAFile) {
    ASSERT_EQ(runTsgen(mDir.path("a.ts"), mArgs).exitCode, 0);
    const auto piped = runCommand(std::string(TAVO_TSGEN_PATH) + " -o - " + mArgs + " > '" +
                                  mDir.path("b.ts") + "'");
    ASSERT_EQ(piped.exitCode, 0) << piped.err;
    EXPECT_TRUE(readFile(mDir.path("a.ts")) == readFile(mDir.path("b.ts")));
}

}  // namespace
}  // namespace TavoPlayer::test
