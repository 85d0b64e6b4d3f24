// Real captures (DVB, FFmpeg-muxed samples) through the TS parser module, one PID at
// a time: every PES that a later unit start closes comes out as one record, its
// header fields agree with the PES bytes it carries (the time stamps are compared
// with ffprobe's in TSParserFfmpegReferenceTest), and nothing is reported as
// broken, because nothing in these files is.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/NamedRow.h"
#include "support/ParseTs.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using test::PrintTo;

struct StreamCase {
    const char* name;
    const char* file;
    uint16_t pid;
    int kind;
    uint8_t streamId;   // expected in every record
    size_t unitStarts;  // PES starts on the PID (counted independently with a script)
};

class TSParserSharedStreamsTest : public ::testing::TestWithParam<StreamCase> {};

TEST_P(TSParserSharedStreamsTest, EveryClosedPesIsOneConsistentRecord) {
    const StreamCase& c = GetParam();
    const auto ts = test::fileBytes(std::string(TAVO_SHARED_STREAMS_DIR) + "/" + c.file);
    if (ts.empty())
        GTEST_SKIP() << "shared sample streams not found at " << TAVO_SHARED_STREAMS_DIR;
    const std::vector<uint8_t> packets = test::bytesOfPid(ts, c.pid);

    test::TraceCapture trace;  // keeps the clock's lines out of the output
    const auto records = test::parseTs(packets, c.kind);
    EXPECT_EQ(records.size(), c.unitStarts - 1);
    const bool optionalHeader = PESPacketParser::hasOptionalHeader(c.streamId);
    for (size_t i = 0; i < records.size(); ++i) {
        const auto& r = records[i];
        ASSERT_GE(r.pes.size(), optionalHeader ? 9u : 6u) << i;
        EXPECT_EQ(r.pes[3], c.streamId) << i;
        EXPECT_EQ(r.size, 40u + r.pes.size()) << i;
        EXPECT_EQ(r.offsetES, optionalHeader ? 40u + 9u + r.pes[8] : 46u) << i;
        EXPECT_EQ(r.offsetES + r.sizeES, r.size) << i;
        const uint16_t length = static_cast<uint16_t>((r.pes[4] << 8) | r.pes[5]);
        if (length != 0) {
            // Where the muxer gave a length, the assembled packet has exactly it.
            EXPECT_EQ(r.pes.size(), 6u + length) << i;
        }
    }
}

constexpr const char* kDvb = "dvb_h264_1080_mpeg1audio_0x03.ts";
constexpr const char* kDvbInterlaced = "dvb_h264_1080i_picstruct_sei_ac3_teletext.ts";
const StreamCase kCaptures[] = {
    {"DvbH264Video", kDvb, 0x100, TSParser::KIND_VIDEO, 0xE0, 299},
    {"DvbMpeg1Audio", kDvb, 0x101, TSParser::KIND_AUDIO, 0xC0, 209},
    {"DvbInterlacedVideo", kDvbInterlaced, 0x78, TSParser::KIND_VIDEO, 0xE0, 29},
    {"DvbAc3PrivateStream1", kDvbInterlaced, 0x82, TSParser::KIND_AUDIO, 0xBD, 6},
    // A PID that carries nothing but 7-byte padding PES (stream id 0xBE).
    {"DvbPaddingOnly", kDvbInterlaced, 0x8E, TSParser::KIND_CLOSED_CAPTION, 0xBE, 3},
    {"FfmpegH264", "exoplayer_sample_h264_mpeg_audio.ts", 0x100, TSParser::KIND_VIDEO, 0xE0, 3},
};
INSTANTIATE_TEST_SUITE_P(Captures, TSParserSharedStreamsTest, ::testing::ValuesIn(kCaptures),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace TavoPlayer
