#include "tsparser/PESPacketParser.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/NamedRow.h"
#include "support/PesBuilder.h"
#include "support/TraceCapture.h"
#include "support/TsPacketBuilder.h"

namespace TavoPlayer {
namespace {

using namespace test;
using test::PrintTo;

// --- where the elementary stream starts, by stream id and header ---------------------

struct LayoutCase {
    const char* name;
    std::vector<uint8_t> pes;
    uint32_t esOffset;
};

class PESPacketParserLayoutTest : public ::testing::TestWithParam<LayoutCase> {};

TEST_P(PESPacketParserLayoutTest, ElementaryStreamPosition) {
    const LayoutCase& c = GetParam();
    TraceCapture trace;  // keeps the parser's lines out of the output
    PESPacketParser parser;
    PESParsedData data;
    ASSERT_EQ(parser.parse(c.pes.data(), c.pes.size(), &data), 1u) << trace.all();
    EXPECT_EQ(data.mElementaryStream, c.pes.data() + c.esOffset);
    EXPECT_EQ(data.mElementaryStreamSize, c.pes.size() - c.esOffset);
}

// The common layouts (video with PTS and DTS, audio, private_stream_1) are the real
// captures' in TSParserSharedStreamsTest, padding (0xBE) too; these rows are the
// rarer rules.
const LayoutCase kLayouts[] = {
    {"PrivateStream2AtByte6", PesBuilder(0xBF).noOptionalHeader().payload(ramp(50)).build(), 6},
    {"StuffingInHeader", PesBuilder(0xE0).pts(1).stuffing(7).payload(ramp(20)).build(), 21},
    // The header data length alone places the payload, whatever the flags say.
    {"LengthWinsOverFlags",
     PesBuilder(0xE0).pts(1).dts(2).headerDataLength(3).payload(ramp(20)).build(), 12},
    {"BadStartBitsAccepted", PesBuilder(0xE0).byte6(0x40).pts(1).payload(ramp(20)).build(), 6},
    {"TruncatedOptionalHeader", {0, 0, 1, 0xE0, 0, 2, 0x80, 0x80}, 6},
};
INSTANTIATE_TEST_SUITE_P(StreamIds, PESPacketParserLayoutTest, ::testing::ValuesIn(kLayouts),
                         [](const auto& info) { return std::string(info.param.name); });

// The time stamps are compared with ffprobe's in TSParserFfmpegReferenceTest; reads
// past the end of broken headers are the PES fuzz target's to find.
TEST(PESPacketParserFailureTest, RefusedInputs) {
    TraceCapture trace;
    const std::vector<uint8_t> cases[] = {
        {0, 0, 2, 0xE0, 0, 0, 0x80, 0, 0},  // no start code
        {0, 0},
        {0, 0, 1, 0xE0, 0},  // fixed header cut
    };
    PESPacketParser parser;
    PESParsedData data;
    for (const auto& bytes : cases)
        EXPECT_EQ(parser.parse(bytes.data(), bytes.size(), &data), 0u) << bytes.size();
}

}  // namespace
}  // namespace TavoPlayer
