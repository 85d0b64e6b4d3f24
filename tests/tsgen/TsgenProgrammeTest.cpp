// What an independent reader (ffprobe, ffmpeg) finds in tsgen's output: the
// programme, its streams and codecs, their durations, clean decoding; where the
// clock references go; and the command line that asks for them.

#include <gtest/gtest.h>

#include <cstdlib>
#include <sstream>

#include "TsgenTestUtil.h"
#include "support/NamedRow.h"

namespace TavoPlayer::test {
namespace {

using test::PrintTo;

// Checks ffprobe's flat view of `file` against "key=value" items separated by
// spaces, keys shortened: "p." for the first programme, "N." for stream N
// (e.g. "p.pcr_pid", "1.codec_name"); returns the whole view.
std::map<std::string, std::string> expectProbe(const std::string& file,
                                               const std::string& expected) {
    std::istringstream lines(
        runCommand("ffprobe -v error -show_programs -show_streams -of flat '" + file + "'").out);
    std::map<std::string, std::string> values;
    for (std::string line; std::getline(lines, line);) {
        const auto eq = line.find('=');
        std::string key = line.substr(0, eq), value = line.substr(eq + 1);
        key = key.rfind("programs.program.0.", 0) == 0 ? "p." + key.substr(19) : key;
        key = key.rfind("streams.stream.", 0) == 0 ? key.substr(15) : key;
        std::erase(value, '"');
        values[key] = value;
    }
    std::istringstream items(expected);
    for (std::string item; items >> item;) {
        const auto eq = item.find('=');
        EXPECT_EQ(values[item.substr(0, eq)], item.substr(eq + 1)) << item.substr(0, eq);
    }
    return values;
}

struct ProbeCase {
    const char* name;
    std::string args;
    // ffprobe's view as "key=value" items; codec_tag is the PMT's stream_type.
    std::string probe;
    double audioSeconds;  // audio comes in whole frames of 1024 or 1152 samples
};

// Three seconds of 320x240 at 29.97 interlaced, with a caption, on the default PIDs.
const std::string kArgs = "-d 3 --size 320x240 --caption 1:Ola --audio ";
const std::string kProgramme =
    "p.program_num=1 p.pmt_pid=4096 p.pcr_pid=273 p.nb_streams=3 0.codec_name=h264 0.id=0x111 "
    "0.width=320 0.height=240 0.field_order=tt 0.r_frame_rate=30000/1001 0.duration=3.003000 "
    "1.id=0x112 2.codec_name=arib_caption 2.id=0x130 ";
const std::string kLatm = "1.codec_name=aac_latm 1.codec_tag=0x0011 ";
const std::string kStereo48k = "1.sample_rate=48000 1.channels=2 ";

const ProbeCase kCases[] = {
    {"Latm", kArgs + "latm", kProgramme + kLatm + kStereo48k, 3.0},
    {"Adts", kArgs + "adts", kProgramme + kStereo48k + "1.codec_name=aac 1.codec_tag=0x000f", 3.0},
    {"Mp2", kArgs + "mp2", kProgramme + kStereo48k + "1.codec_name=mp2 1.codec_tag=0x0003", 3.0},
    {"Mp3", kArgs + "mp3", kProgramme + kStereo48k + "1.codec_name=mp3 1.codec_tag=0x0003", 3.0},
    {"LatmConfigEvery8", kArgs + "latm --latm-config-interval 8", kProgramme + kLatm + kStereo48k,
     3.0},
    {"Adts51", kArgs + "adts --audio-channels 6",
     kProgramme + "1.codec_name=aac 1.codec_tag=0x000f 1.sample_rate=48000 1.channels=6", 3.0},
    {"Mp2HalfRate", kArgs + "mp2 --audio-rate 24000",
     kProgramme + "1.codec_name=mp2 1.codec_tag=0x0004 1.sample_rate=24000 1.channels=2", 3.0},
    {"FullHdInterlacedByDefault", "-d 0.5", kLatm + "0.width=1920 0.height=1080 0.field_order=tt",
     0.5},
    {"Configurable",
     "-d 1 --size 352x288 --fps 25 --progressive --program 0x5A1 --tsid 0x2E1 --pmt-pid 0x101 "
     "--video-pid 0x211 --audio-pid 0x212 --caption-pid 0x216 --pcr-pid 0x100 "
     "--audio-rate 24000 --audio-channels 1",
     "p.program_num=1441 p.pmt_pid=257 p.pcr_pid=256 0.id=0x211 0.field_order=progressive "
     "0.r_frame_rate=25/1 0.width=352 1.id=0x212 1.sample_rate=24000 1.channels=1 2.id=0x216",
     1.0},
};

class TsgenProbeTest : public ::testing::TestWithParam<ProbeCase> {};

TEST_P(TsgenProbeTest, FfprobeFindsTheProgrammeAndEveryStreamDecodesCleanly) {
    const auto& gen = tsgen(GetParam().args);
    ASSERT_TRUE(gen.ok());
    auto probe = expectProbe(gen.file, GetParam().probe);
    EXPECT_NEAR(std::atof(probe["1.duration"].c_str()), GetParam().audioSeconds, 0.03);
    EXPECT_EQ(decodeErrors(gen.file), "");  // not a single complaint from libavcodec
}

INSTANTIATE_TEST_SUITE_P(Streams, TsgenProbeTest, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(TsgenProgrammeTest, PcrPidOfItsOwnCarriesOnlyThePcr) {
    const auto& gen = tsgen(kCases[8].args);
    ASSERT_TRUE(gen.ok());
    // Every packet of PID 0x100, and no other, carries a PCR in an adaptation
    // field without payload.
    const auto pcrPid = gen.ts.where([](auto& p) { return p.pid == 0x100; });
    ASSERT_EQ(pcrPid.size(), 1u);
    EXPECT_EQ(gen.ts.where([](auto& p) { return p.hasPcr; }), pcrPid);
    EXPECT_EQ(gen.ts.where([](auto& p) { return p.adaptationControl == 2 && p.hasPcr; }), pcrPid);
}

TEST(TsgenProgrammeTest, PcrComesAtTheAskedInterval) {
    const auto& gen = tsgen("-d 3 --size 320x240 --mux-rate 2000000 --pcr-interval-ms 30");
    ASSERT_TRUE(gen.ok());
    std::vector<int64_t> pcrs;
    for (const auto* p : gen.ts.packetsOf(0x111))
        if (p->hasPcr)
            pcrs.push_back(p->pcr27);
    ASSERT_GT(pcrs.size(), 3000u / 30u);
    // A PCR may wait at most one packet slot (752 us at 2 Mbit/s) past its time.
    for (size_t i = 1; i < pcrs.size(); ++i)
        EXPECT_LE(pcrs[i] - pcrs[i - 1], 30 * 27000 + ticks27PerPacket(2000000)) << i;
}

TEST(TsgenDeterminismTest, SameSeedSameBytesOnFileAndStandardOutputOtherSeedOtherBytes) {
    const std::string args = "-d 2 --size 320x240 --caption 0.5:Ola --seed ";
    const auto& a = tsgen(args + "7");
    const auto& other = tsgen(args + "8");
    ASSERT_TRUE(a.ok());
    const auto piped = runCommand(std::string(TAVO_TSGEN_PATH) + " -o - " + args + "7");
    ASSERT_EQ(piped.exitCode, 0) << piped.err;
    EXPECT_TRUE(std::vector<uint8_t>(piped.out.begin(), piped.out.end()) == a.bytes);
    EXPECT_TRUE(other.ok() && other.bytes != a.bytes);
}

// Each row: "arguments|what the message names[|exit status]"; the status is 2
// when the command line is refused, 1 when the output cannot be written.
const char* const kBadOptions[] = {
    "|no output given",
    "-o /dev/null --duration 0|--duration",
    "-o /dev/null --size 321x240|--size",
    "-o /dev/null --video-pid 0x1FFF|--video-pid",
    "-o /dev/null --audio-pid 0x111|must all differ",
    "-o /dev/null --pcr-interval-ms 150|--pcr-interval-ms",
    "-o /dev/null --cc-error 0x111|PID:INDEX",
    "-o /dev/null --start-pts 8589934592|--start-pts",
    "-o /dev/null --latm-as-adts --audio adts|--latm-as-adts",
    "-o /dev/null --caption '1:\xe4\xb8\xad'|no Latin caption code",
    "-o /dev/null --mux-rate 200000|below the contents",
    "-o /dev/null --bogus|unknown option --bogus",
    "-o /dev/null --sync-marks --audio none|--sync-marks needs audio",
    "-o /dev/null stray|unexpected argument 'stray'",
    "-d 0.1 --size 64x64 -o /nonexistent-dir/out.ts|cannot open /nonexistent-dir/out.ts|1"};

class TsgenBadOptionTest : public ::testing::TestWithParam<const char*> {};

TEST_P(TsgenBadOptionTest, FailsWithAClearMessageAndWritesNothing) {
    std::istringstream row(GetParam());
    std::string args, message, status;
    std::getline(std::getline(row, args, '|'), message, '|');
    const auto run = runCommand(std::string(TAVO_TSGEN_PATH) + " " + args);
    EXPECT_EQ(run.exitCode, std::getline(row, status) ? std::stoi(status) : 2);
    EXPECT_NE(run.err.find(message), std::string::npos) << run.err;
    EXPECT_TRUE(run.out.empty());
}

INSTANTIATE_TEST_SUITE_P(Table, TsgenBadOptionTest, ::testing::ValuesIn(kBadOptions));

}  // namespace
}  // namespace TavoPlayer::test
