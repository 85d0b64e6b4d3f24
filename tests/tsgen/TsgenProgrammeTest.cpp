// What an independent reader (ffprobe, ffmpeg) finds in tsgen's output: the
// programme, its streams and codecs, their durations, clean decoding.

#include <gtest/gtest.h>

#include <cstdlib>

#include "TsgenTestUtil.h"

namespace TavoPlayer::test {
namespace {

struct ProbeCase {
    const char* name;
    std::string args;
    std::string probe;    // ffprobe's view, as "key=value" items
    uint8_t audioType;    // PMT stream_type of the audio
    double audioSeconds;  // audio in whole frames of 1024 or 1152 samples
};

void PrintTo(const ProbeCase& c, std::ostream* os) {
    *os << c.name;
}

// Three seconds of 320x240 at 29.97 interlaced, with a caption, on the default PIDs.
const std::string kArgs = "-d 3 --size 320x240 --caption 1:Ola --audio ";
const std::string kProgramme =
    "p.program_num=1 p.pmt_pid=4096 p.pcr_pid=273 p.nb_streams=3 0.codec_name=h264 0.id=0x111 "
    "0.width=320 0.height=240 0.field_order=tt 0.r_frame_rate=30000/1001 0.duration=3.003000 "
    "1.id=0x112 2.codec_name=arib_caption 2.id=0x130 ";
const std::string kStereo48k = "1.sample_rate=48000 1.channels=2 ";

const ProbeCase kCases[] = {
    {"Latm", kArgs + "latm", kProgramme + kStereo48k + "1.codec_name=aac_latm", 0x11, 3.0},
    {"Adts", kArgs + "adts", kProgramme + kStereo48k + "1.codec_name=aac", 0x0F, 3.0},
    {"Mp2", kArgs + "mp2", kProgramme + kStereo48k + "1.codec_name=mp2", 0x03, 3.0},
    {"Mp3", kArgs + "mp3", kProgramme + kStereo48k + "1.codec_name=mp3", 0x03, 3.0},
    {"LatmConfigEvery8", kArgs + "latm --latm-config-interval 8",
     kProgramme + kStereo48k + "1.codec_name=aac_latm", 0x11, 3.0},
    {"Adts51", kArgs + "adts --audio-channels 6",
     kProgramme + "1.codec_name=aac 1.sample_rate=48000 1.channels=6", 0x0F, 3.0},
    {"Mp2HalfRate", kArgs + "mp2 --audio-rate 24000",
     kProgramme + "1.codec_name=mp2 1.sample_rate=24000 1.channels=2", 0x04, 3.0},
    {"FullHdInterlacedByDefault", "-d 0.5",
     "0.width=1920 0.height=1080 0.field_order=tt 1.codec_name=aac_latm", 0x11, 0.5},
    {"Configurable",
     "-d 1 --size 352x288 --fps 25 --progressive --program 0x5A1 --tsid 0x2E1 --pmt-pid 0x101 "
     "--video-pid 0x211 --audio-pid 0x212 --caption-pid 0x216 --pcr-pid 0x100 "
     "--audio-rate 24000 --audio-channels 1",
     "p.program_num=1441 p.pmt_pid=257 p.pcr_pid=256 0.id=0x211 0.field_order=progressive "
     "0.r_frame_rate=25/1 0.width=352 1.id=0x212 1.sample_rate=24000 1.channels=1 2.id=0x216",
     0x11, 1.0},
};

class TsgenProbeTest : public ::testing::TestWithParam<ProbeCase> {};

TEST_P(TsgenProbeTest, FfprobeFindsTheProgrammeAndEveryStreamDecodesCleanly) {
    const ProbeCase& c = GetParam();
    const auto& gen = tsgen(c.args);
    ASSERT_TRUE(gen.ok());
    auto probe = ffprobe(gen.file);
    expectProbe(probe, c.probe);
    EXPECT_NEAR(std::atof(probe["1.duration"].c_str()), c.audioSeconds, 0.03);
    const auto pmt = gen.ts.pmt(static_cast<uint16_t>(std::atoi(probe["p.pmt_pid"].c_str())));
    ASSERT_EQ(pmt.size(), 3u);
    EXPECT_EQ(pmt[1].streamType, c.audioType);
    // Not a single complaint from libavcodec.
    EXPECT_EQ(decodeErrors(gen.file), "");
}

INSTANTIATE_TEST_SUITE_P(Streams, TsgenProbeTest, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(TsgenProgrammeTest, PcrPidOfItsOwnCarriesOnlyThePcr) {
    const auto& gen = tsgen(kCases[8].args);
    ASSERT_TRUE(gen.ok());
    const auto pcrPackets = gen.ts.packetsOf(0x100);
    ASSERT_FALSE(pcrPackets.empty());
    for (const auto* p : pcrPackets) {
        EXPECT_EQ(p->adaptationControl, 2);
        EXPECT_TRUE(p->hasPcr);
    }
    for (const auto* p : gen.ts.packetsOf(0x211)) {
        EXPECT_FALSE(p->hasPcr);
    }
}

TEST(TsgenProgrammeTest, PmtDeclaresIsdbTbComponentsAndCaptions) {
    const auto& gen = tsgen("-d 1 --size 320x240");
    ASSERT_TRUE(gen.ok());
    const auto pmt = gen.ts.pmt();
    ASSERT_EQ(pmt.size(), 3u);
    const struct {
        uint8_t type;
        uint16_t pid;
        uint8_t componentTag;
    } kExpected[] = {{0x1B, 0x111, 0x00}, {0x11, 0x112, 0x10}, {0x06, 0x130, 0x30}};
    for (size_t i = 0; i < 3; ++i) {
        EXPECT_EQ(pmt[i].streamType, kExpected[i].type);
        EXPECT_EQ(pmt[i].pid, kExpected[i].pid);
        ASSERT_GE(pmt[i].descriptors.size(), 1u);
        EXPECT_EQ(pmt[i].descriptors[0],
                  (std::vector<uint8_t>{0x52, 0x01, kExpected[i].componentTag}));
    }
    // Captions are declared by data_component_id 0x0008 (ARIB STD-B10).
    ASSERT_EQ(pmt[2].descriptors.size(), 2u);
    EXPECT_EQ(pmt[2].descriptors[1][0], 0xFD);
    EXPECT_EQ((pmt[2].descriptors[1][2] << 8) | pmt[2].descriptors[1][3], 0x0008);
}

TEST(TsgenProgrammeTest, DecodedPicturesShowTheirFrameNumber) {
    const auto& gen = tsgen("-d 3 --size 640x360 --audio none");
    ASSERT_TRUE(gen.ok());
    // libavcodec decodes three pictures, in display order, as 8-bit luma.
    const auto decoded =
        runCommand("ffmpeg -nostdin -v error -i '" + gen.file +
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

TEST(TsgenDeterminismTest, SameSeedSameBytesOnFileAndStandardOutputOtherSeedOtherBytes) {
    const std::string args = "-d 2 --size 320x240 --caption 0.5:Ola --seed ";
    const auto& a = tsgen(args + "7");
    const auto& other = tsgen(args + "8");
    ASSERT_TRUE(a.ok());
    ASSERT_TRUE(other.ok());
    const auto piped = runCommand(std::string(TAVO_TSGEN_PATH) + " -o - " + args + "7");
    ASSERT_EQ(piped.exitCode, 0) << piped.err;
    EXPECT_TRUE(std::vector<uint8_t>(piped.out.begin(), piped.out.end()) == a.bytes);
    EXPECT_FALSE(a.bytes == other.bytes);
}

}  // namespace
}  // namespace TavoPlayer::test
