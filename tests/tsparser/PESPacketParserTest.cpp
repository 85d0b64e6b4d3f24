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

using test::PrintTo;

using test::PesBuilder;
using test::ramp;
using test::TraceCapture;

// --- where the elementary stream starts, by stream id and header ---------------------

struct LayoutCase {
    const char* name;
    std::vector<uint8_t> pes;
    uint32_t esOffset;
    bool optionalHeaderParsed;
};

class PESPacketParserLayoutTest : public ::testing::TestWithParam<LayoutCase> {};

TEST_P(PESPacketParserLayoutTest, ElementaryStreamPosition) {
    const LayoutCase& c = GetParam();
    TraceCapture trace;  // keeps the parser's lines out of the output
    PESPacketParser parser;
    PESParsedData data;
    ASSERT_EQ(parser.parse(c.pes.data(), c.pes.size(), &data), 1u) << trace.all();
    EXPECT_EQ(data.mStreamId, c.pes[3]);
    EXPECT_EQ(data.mPESPacketLength, (c.pes[4] << 8) | c.pes[5]);
    EXPECT_EQ(data.mElementaryStream, c.pes.data() + c.esOffset);
    EXPECT_EQ(data.mElementaryStreamSize, c.pes.size() - c.esOffset);
    EXPECT_EQ(data.mHeaderDataLength, c.optionalHeaderParsed ? c.pes[8] : 0);
}

PesBuilder pes(uint8_t streamId) {
    return PesBuilder(streamId);
}

// The common layouts (video with PTS and DTS, audio, private_stream_1) are the real
// captures' in TSParserSharedStreamsTest; these rows are the rarer rules.
const LayoutCase kLayouts[] = {
    {"PaddingAtByte6", pes(0xBE).noOptionalHeader().payload(ramp(50, 0xFF)).build(), 6, false},
    {"PrivateStream2AtByte6", pes(0xBF).noOptionalHeader().payload(ramp(50)).build(), 6, false},
    {"StuffingInHeader", pes(0xE0).pts(1).stuffing(7).payload(ramp(20)).build(), 21, true},
    // The header data length alone places the payload, whatever the flags say.
    {"LengthWinsOverFlags", pes(0xE0).pts(1).dts(2).headerDataLength(3).payload(ramp(20)).build(),
     12, true},
    {"BadStartBitsAccepted", pes(0xE0).byte6(0x40).pts(1).payload(ramp(20)).build(), 6, false},
    {"TruncatedOptionalHeader", {0, 0, 1, 0xE0, 0, 2, 0x80, 0x80}, 6, false},
};
INSTANTIATE_TEST_SUITE_P(StreamIds, PESPacketParserLayoutTest, ::testing::ValuesIn(kLayouts),
                         [](const auto& info) { return std::string(info.param.name); });

// --- failures ---------------------------------------------------------------------
// The time stamps are compared with ffprobe's in TSParserFfmpegReferenceTest. The
// optional fields after them (ESCR, ES rate, the extension) are read by nothing
// downstream: the truncation sweep below keeps their parsing inside the packet.

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
    const uint8_t one = 0;
    EXPECT_EQ(parser.parse(nullptr, 10, &data), 0u);
    EXPECT_EQ(parser.parse(&one, 0, &data), 0u);
    EXPECT_EQ(parser.parse(&one, 1, nullptr), 0u);
}

TEST(PESPacketParserFailureTest, HeaderLengthPastThePacketWrapsTheSize) {
    TraceCapture trace;
    const auto pes = PesBuilder(0xE0).pts(1).headerDataLength(200).payload(ramp(10)).build();
    PESPacketParser parser;
    PESParsedData data;
    ASSERT_EQ(parser.parse(pes.data(), pes.size(), &data), 1u);
    EXPECT_EQ(data.mElementaryStreamSize, static_cast<uint32_t>(pes.size() - 209));
    EXPECT_GT(data.mElementaryStreamSize, pes.size()) << "wrapped, as designed";
}

// A packet cut at every byte of a full header is never read past its end (the
// sanitizer builds check) and stays accepted whenever the start code and the
// fixed header are there.
TEST(PESPacketParserFailureTest, TruncatedAtEveryByte) {
    TraceCapture trace;
    // ESCR 6, ES rate 3, trick mode 1, copy info 1, CRC 2; then every extension part.
    std::vector<uint8_t> fields(13, 0x01);
    fields.insert(fields.end(), {0xF1});
    fields.insert(fields.end(), 16 + 1 + 2 + 2 + 2, 0x80);
    const auto full =
        PesBuilder(0xE0).pts(7).dts(3).optionalFields(0x3F, fields).payload(ramp(5)).build();
    PESPacketParser parser;
    for (size_t cut = 1; cut <= full.size(); ++cut) {
        std::vector<uint8_t> bytes(full.begin(),
                                   full.begin() + cut);  // exact size: ASan sees overreads
        PESParsedData data;
        EXPECT_EQ(parser.parse(bytes.data(), cut, &data), cut >= 6 ? 1u : 0u) << cut;
    }
}

}  // namespace
}  // namespace TavoPlayer
