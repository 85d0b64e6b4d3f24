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

const LayoutCase kLayouts[] = {
    {"VideoPtsDts", pes(0xE0).pts(1).dts(2).payload(ramp(100)).build(), 19, true},
    {"VideoPtsOnly", pes(0xE3).pts(1).payload(ramp(100)).build(), 14, true},
    {"AudioNoTimes", pes(0xC0).payload(ramp(10)).build(), 9, true},
    {"AudioHighId", pes(0xDF).pts(5).payload(ramp(10)).build(), 14, true},
    {"PrivateStream1Captions", pes(0xBD).pts(5).payload(ramp(30)).build(), 14, true},
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

// --- time stamps ---------------------------------------------------------------------

TEST(PESPacketParserTimeTest, PtsBytesAtTheirPositions) {
    struct TimeCase {
        uint8_t bytes[5];
        uint64_t value;
    };
    const TimeCase cases[] = {
        {{0x21, 0x00, 0x01, 0x00, 0x01}, 0},
        {{0x3F, 0xFF, 0xFF, 0xFF, 0xFF}, 0x1FFFFFFFFull},
        {{0x31, 0x00, 0x05, 0xBF, 0x21}, 90000},  // one second
        {{0x2F, 0x00, 0x01, 0x00, 0x01}, 0x1C0000000ull},
    };
    PESPacketParser parser;
    for (const TimeCase& c : cases) {
        std::vector<uint8_t> pes{0, 0, 1, 0xE0, 0, 0, 0x80, 0x80, 5};
        pes.insert(pes.end(), c.bytes, c.bytes + 5);
        pes.insert(pes.end(), {0xAA, 0xBB});
        PESParsedData data;
        ASSERT_EQ(parser.parse(pes.data(), pes.size(), &data), 1u);
        EXPECT_EQ(data.mPTS, c.value);
        EXPECT_EQ(data.mPTSDTSFlags, 2);
        EXPECT_EQ(data.mElementaryStreamSize, 2u);
    }
}

// --- the remaining optional fields ----------------------------------------------------

TEST(PESPacketParserFieldsTest, EscrEsRateCopyInfoAndCrc) {
    // ISO/IEC 13818-1, 2.4.3.7: ESCR 0x123456789 extension 0x1A5 with its reserved and
    // marker bits; ES_rate 0x2ABCDE between markers; DSM trick mode 0x55 (skipped);
    // additional copy info 0x42 after its marker; previous PES CRC 0xBEEF.
    const std::vector<uint8_t> fields{0x26, 0x34, 0x57, 0x3C, 0x4F, 0x4B, 0xD5,
                                      0x79, 0xBD, 0x55, 0xC2, 0xBE, 0xEF};
    const uint64_t escr = 0x123456789ull;
    const uint16_t escrExt = 0x1A5;
    const uint32_t rate = 0x2ABCDE;
    // Flags: ESCR 0x20, ES rate 0x10, trick mode 0x08, copy info 0x04, CRC 0x02.
    const auto pes =
        PesBuilder(0xC0).pts(900).optionalFields(0x3E, fields).payload(ramp(4)).build();
    PESPacketParser parser;
    PESParsedData data;
    ASSERT_EQ(parser.parse(pes.data(), pes.size(), &data), 1u);
    EXPECT_EQ(data.mPTS, 900u);
    EXPECT_EQ(data.mESCRBase, escr);
    EXPECT_EQ(data.mESCRExtension, escrExt);
    EXPECT_EQ(data.mESRate, rate);
    EXPECT_EQ(data.mDSMTrickMode, 0);
    EXPECT_EQ(data.mAdditionalCopyInfo, 0x42);
    EXPECT_EQ(data.mPreviousPESCRC, 0xBEEF);
    EXPECT_EQ(data.mElementaryStreamSize, 4u);
}

TEST(PESPacketParserFieldsTest, ExtensionFields) {
    std::vector<uint8_t> fields{0xB1};  // private data, sequence counter, P-STD, extension 2
    const auto priv = ramp(16, 0x40);
    fields.insert(fields.end(), priv.begin(), priv.end());
    fields.insert(fields.end(), {0xA5, 0x9F});  // counter 0x25; identifier bit 7 = 1; stuff 0x1F
    fields.insert(fields.end(), {0x7A, 0xBC});  // '01' scale 1, size 0x1ABC
    fields.insert(fields.end(), {0x85, 0x33});  // field length 5; flag 0, extension 0x33
    const auto pes = PesBuilder(0xE0).optionalFields(0x01, fields).payload(ramp(8)).build();
    PESPacketParser parser;
    PESParsedData data;
    ASSERT_EQ(parser.parse(pes.data(), pes.size(), &data), 1u);
    EXPECT_EQ(data.mExtensionFlag, 1);
    EXPECT_EQ(data.mPESPrivateDataFlag, 1);
    EXPECT_EQ(data.mPackHeaderFieldFlag, 0);
    EXPECT_EQ(data.mProgramPacketSequenceCounterFlag, 1);
    EXPECT_EQ(data.mPSTDBufferFlag, 1);
    EXPECT_EQ(data.mPESExtensionFlag2, 1);
    EXPECT_EQ(std::vector<uint8_t>(data.mPESPrivateData, data.mPESPrivateData + 16), priv);
    EXPECT_EQ(data.mProgramPacketSequenceCounter, 0x25);
    EXPECT_EQ(data.mMPEG1MPEG2Identifier, 1);
    EXPECT_EQ(data.mOriginalStuffLength, 0x1F);
    EXPECT_EQ(data.mPSTDBufferScale, 1);
    EXPECT_EQ(data.mPSTDBufferSize, 0x1ABC);
    EXPECT_EQ(data.mPESExtensionFieldLength, 5);
    EXPECT_EQ(data.mStreamIdExtensionFlag, 0);
    EXPECT_EQ(data.mStreamIdExtension, 0x33);
    EXPECT_EQ(data.mElementaryStreamSize, 8u);
}

// --- failures ---------------------------------------------------------------------

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
