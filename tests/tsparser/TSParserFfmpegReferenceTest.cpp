// The video PES packets that the TS parser module emits for a stream muxed by
// FFmpeg, compared with what ffprobe reads from the same file: one record per video
// packet (all but the last, which no later unit start finishes), with the same PTS,
// DTS and payload bytes (compared by their CRC-32).
#include <gtest/gtest.h>
#include <zlib.h>

#include <sstream>
#include <string>
#include <vector>

#include "support/ParseTs.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

struct ProbePacket {
    uint64_t pts = 0;
    uint64_t dts = 0;
    size_t size = 0;
    uint32_t crc = 0;
};

// ffprobe's values, one a line, four per packet: pts, dts, size, CRC32:xxxxxxxx.
std::vector<ProbePacket> parseProbe(const std::string& text) {
    std::vector<ProbePacket> packets;
    std::istringstream in(text);
    std::string hash;
    for (ProbePacket p; in >> p.pts >> p.dts >> p.size >> hash;) {
        p.crc = static_cast<uint32_t>(std::stoul(hash.substr(6), nullptr, 16));
        packets.push_back(p);
    }
    return packets;
}

// Parameter: the number of B-frames. With B-frames every PES carries a DTS; without
// them FFmpeg writes the PTS alone and the records repeat the last DTS seen.
class TSParserFfmpegReferenceTest : public ::testing::TestWithParam<int> {
protected:
    void SetUp() override {
        if (test::runCommand("command -v ffmpeg && command -v ffprobe").exitCode != 0)
            GTEST_SKIP() << "ffmpeg/ffprobe not installed: no independent reference";
        mFile = std::string(TAVO_BINARY_DIR) + "/tsparser_reference_bf" +
                std::to_string(GetParam()) + ".ts";
        // H.264 with B-frames (PES with and without DTS), AAC and MPEG-1 Layer II; the
        // PIDs are numbered from 0x100 in the order the streams are mapped.
        const auto made = test::runCommand(
            "ffmpeg -y -v error -f lavfi -i testsrc2=size=320x240:rate=30 "
            "-f lavfi -i sine=frequency=1000:sample_rate=48000 "
            "-f lavfi -i sine=frequency=500:sample_rate=48000 -t 3 "
            "-map 0:v -map 1:a -map 2:a -c:v libx264 -preset ultrafast -g 15 -bf " +
            std::to_string(GetParam()) +
            " -c:a:0 aac -c:a:1 mp2 -mpegts_start_pid 0x100 -f mpegts " + mFile + " 2>&1");
        ASSERT_EQ(made.exitCode, 0) << "ffmpeg could not make the reference stream: " << made.out;
    }
    std::string mFile;
};

TEST_P(TSParserFfmpegReferenceTest, VideoPesMatchesFfprobe) {
    const auto probed = test::runCommand(
        "ffprobe -v error -select_streams v:0 -show_entries packet=pts,dts,size,data_hash "
        "-show_data_hash CRC32 -of default=nw=1:nk=1 " +
        mFile);
    ASSERT_EQ(probed.exitCode, 0) << probed.err;
    const auto probe = parseProbe(probed.out);
    ASSERT_GT(probe.size(), 60u);

    test::TraceCapture trace;  // keeps the clock's lines out of the test output
    const auto records =
        test::parseTs(test::bytesOfPid(test::fileBytes(mFile), 0x100), TSParser::KIND_VIDEO);
    ASSERT_EQ(records.size(), probe.size() - 1) << "every PES but the last";
    uint64_t lastDts = 0;
    for (size_t i = 0; i < records.size(); ++i) {
        const test::PesRecord& r = records[i];
        ASSERT_GE(r.pes.size(), 9u);
        EXPECT_EQ(r.pts, probe[i].pts) << "PES " << i;
        // Only PES headers that carry a DTS give one; the others repeat the last.
        if ((r.pes[7] & 0xC0) == 0xC0) {
            EXPECT_EQ(r.dts, probe[i].dts) << "PES " << i;
            lastDts = r.dts;
        } else {
            EXPECT_EQ(r.dts, lastDts) << "PES " << i;
        }
        ASSERT_EQ(r.sizeES, probe[i].size) << "PES " << i;
        ASSERT_TRUE(r.offsetES >= 40 && r.offsetES + r.sizeES == r.size) << "PES " << i;
        EXPECT_EQ(crc32(0, r.pes.data() + (r.offsetES - 40), r.sizeES), probe[i].crc)
            << "payload of PES " << i << " differs";
    }
}

INSTANTIATE_TEST_SUITE_P(BFrames, TSParserFfmpegReferenceTest, ::testing::Values(0, 2));

}  // namespace
}  // namespace TavoPlayer
