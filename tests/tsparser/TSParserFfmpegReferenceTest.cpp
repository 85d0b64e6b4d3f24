// The video PES packets that the TS parser module emits for a stream muxed by
// FFmpeg, compared with what ffprobe reads from the same file: one record per video
// packet (all but the last, which no later unit start finishes), with the same PTS,
// DTS and payload bytes
// (compared by their CRC-32).
#include <gtest/gtest.h>

#include <sstream>
#include <string>
#include <vector>

#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"
#include "tsparser/TSParser.h"

namespace TavoPlayer {
namespace {

using test::PesRecord;

struct ProbePacket {
    uint64_t pts = 0;
    uint64_t dts = 0;
    size_t size = 0;
    uint32_t crc = 0;
};

// ffprobe's key=value lines, four per packet: pts, dts, size, data_hash=CRC32:xxxxxxxx.
std::vector<ProbePacket> parseProbe(const std::string& text) {
    std::vector<ProbePacket> packets;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) {
        const std::string key = line.substr(0, line.find('='));
        const std::string value = line.substr(line.find('=') + 1);
        if (key == "pts")
            packets.emplace_back().pts = std::stoull(value);
        else if (key == "dts" && !packets.empty())
            packets.back().dts = std::stoull(value);
        else if (key == "size" && !packets.empty())
            packets.back().size = std::stoul(value);
        else if (key == "data_hash" && !packets.empty())
            packets.back().crc = static_cast<uint32_t>(std::stoul(value.substr(6), nullptr, 16));
    }
    return packets;
}

// The CRC-32 of ISO 3309 (reflected, as zlib and FFmpeg's "CRC32" hash compute it).
uint32_t crc32(const uint8_t* bytes, size_t size) {
    uint32_t crc = 0xFFFFFFFFu;
    for (size_t i = 0; i < size; ++i) {
        crc ^= bytes[i];
        for (int k = 0; k < 8; ++k)
            crc = (crc >> 1) ^ (0xEDB88320u & (0u - (crc & 1)));
    }
    return ~crc;
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
        // H.264 with B-frames (PES with and without DTS), AAC and MPEG-1 Layer II.
        const auto made = test::runCommand(
            "ffmpeg -y -v error -f lavfi -i testsrc2=size=320x240:rate=30 "
            "-f lavfi -i sine=frequency=1000:sample_rate=48000 "
            "-f lavfi -i sine=frequency=500:sample_rate=48000 -t 3 "
            "-map 0:v -map 1:a -map 2:a -c:v libx264 -preset ultrafast -g 15 -bf " +
            std::to_string(GetParam()) + " -c:a:0 aac -c:a:1 mp2 -f mpegts " + mFile + " 2>&1");
        ASSERT_EQ(made.exitCode, 0) << "ffmpeg could not make the reference stream: " << made.out;
    }
    std::string mFile;
};

TEST_P(TSParserFfmpegReferenceTest, VideoPesMatchesFfprobe) {
    const auto pidText = test::runCommand(
        "ffprobe -v error -select_streams v:0 -show_entries stream=id -of csv=p=0 " + mFile);
    ASSERT_EQ(pidText.exitCode, 0) << pidText.err;
    const uint16_t pid = static_cast<uint16_t>(std::stoul(pidText.out, nullptr, 16));
    const auto probed = test::runCommand(
        "ffprobe -v error -select_streams v:0 -show_entries packet=pts,dts,size,data_hash "
        "-show_data_hash CRC32 -of default=nw=1 " +
        mFile);
    ASSERT_EQ(probed.exitCode, 0) << probed.err;
    const auto probe = parseProbe(probed.out);
    ASSERT_GT(probe.size(), 60u);

    const std::vector<uint8_t> ts = test::fileBytes(mFile);
    ASSERT_EQ(ts.size() % 188, 0u);
    const std::vector<uint8_t> videoPackets = test::bytesOfPid(ts, pid);

    test::TraceCapture trace;  // keeps the clock's lines out of the test output
    auto input = test::makeRing("VideoTS", 1 << 16);
    auto output = test::makeRing("VideoPES", 1 << 20);
    android::sp<TSParser> parser = new TSParser(TSParser::KIND_VIDEO);
    parser->setInput(input);
    parser->addOutput(output, nullptr);
    ASSERT_EQ(parser->start(), 0u);

    // Fed in uneven batches while the records are read, as a decoder would.
    std::vector<PesRecord> records;
    size_t at = 0;
    size_t step = 1;
    while (at < videoPackets.size()) {
        const size_t bytes = std::min(videoPackets.size() - at, 188 * step);
        ASSERT_TRUE(test::writeAll(
            *input,
            std::vector<uint8_t>(videoPackets.begin() + at, videoPackets.begin() + at + bytes)));
        at += bytes;
        step = step % 37 + 3;
        for (auto& r : test::drainRecords(*output))
            records.push_back(std::move(r));
    }
    ASSERT_TRUE(test::waitConsumed(*input));
    for (auto& r : test::drainRecords(*output))
        records.push_back(std::move(r));
    EXPECT_EQ(parser->stop(), 0u);

    ASSERT_EQ(records.size(), probe.size() - 1) << "every PES but the last";
    uint64_t lastDts = 0;
    for (size_t i = 0; i < records.size(); ++i) {
        const PesRecord& r = records[i];
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
        EXPECT_EQ(crc32(r.pes.data() + (r.offsetES - 40), r.sizeES), probe[i].crc)
            << "payload of PES " << i << " differs";
    }
}

INSTANTIATE_TEST_SUITE_P(BFrames, TSParserFfmpegReferenceTest, ::testing::Values(0, 2));

}  // namespace
}  // namespace TavoPlayer
