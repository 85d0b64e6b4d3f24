#include "tsparser/TSPacketParser.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/NamedRow.h"
#include "support/TraceCapture.h"
#include "support/TsPacketBuilder.h"

namespace TavoPlayer {
namespace {

using test::PrintTo;

using test::ramp;
using test::TraceCapture;
using test::TsPacket;
using test::TsPacketBuilder;

constexpr uint32_t kPayload = TSPacketParser::RESULT_PAYLOAD;
constexpr uint32_t kNewPES = TSPacketParser::RESULT_NEW_PES;
constexpr uint32_t kError = TSPacketParser::RESULT_ERROR;
constexpr uint32_t kSkip = TSPacketParser::RESULT_SKIP;

// --- one packet into a fresh parser: result bits and header codes ----------------

struct SinglePacketCase {
    const char* name;
    TsPacket packet;
    uint32_t result;
    int payloadOffset;  // -1: not checked (no payload reported)
    uint32_t payloadLength;
};

class TSPacketParserSinglePacketTest : public ::testing::TestWithParam<SinglePacketCase> {};

TEST_P(TSPacketParserSinglePacketTest, ResultAndPayload) {
    const SinglePacketCase& c = GetParam();
    TraceCapture trace;  // keeps the parser's lines out of the output
    TSPacketParser parser;
    TSParsedData data;
    EXPECT_EQ(parser.parse(c.packet.data(), &data), c.result);
    if (c.payloadOffset >= 0) {
        EXPECT_EQ(data.mPayload, c.packet.data() + c.payloadOffset);
        EXPECT_EQ(data.mPayloadLength, c.payloadLength);
    }
    if (c.result & kError) {
        EXPECT_FALSE(parser.inPES());
    }
}

TsPacketBuilder start() {
    return TsPacketBuilder().unitStart();
}

const SinglePacketCase kSinglePackets[] = {
    {"LostSync", start().syncByte(0x46).payload({1}).build(), 65, -1, 0},
    {"TransportError", start().transportError().payload({1}).build(), 129, -1, 0},
    {"AdaptationLength184", start().adaptationControl(2).rawAfterHeader({184}).build(), 255, -1, 0},
    {"AdaptationLength255", start().adaptationControl(3).rawAfterHeader({255, 0xFF}).build(), 255,
     -1, 0},
    {"ControlZero", start().adaptationControl(0).payload(ramp(184)).build(), 1, -1, 0},
    {"NoUnitStartYet", TsPacketBuilder().payload(ramp(184)).build(), 8, -1, 0},
    {"FirstStartPayloadOnly", start().payload(ramp(184)).build(), 2, 4, 184},
    {"FirstStartWithAdaptation", start().randomAccess().payload(ramp(100)).build(), 2, 88, 100},
    {"FirstStartAdaptationOnly", start().pcr(1234).build(), 2, 0, 0},
    {"OneStuffingByte", start().payload(ramp(183)).build(), 2, 5, 183},
};
INSTANTIATE_TEST_SUITE_P(Codes, TSPacketParserSinglePacketTest, ::testing::ValuesIn(kSinglePackets),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(TSPacketParserNullTest, NullParametersAreErrors) {
    TraceCapture trace;
    TSPacketParser parser;
    TSParsedData data;
    const TsPacket packet = TsPacketBuilder().unitStart().payload({1}).build();
    EXPECT_EQ(parser.parse(nullptr, &data), kError);
    EXPECT_EQ(parser.parse(packet.data(), nullptr), kError);
    EXPECT_EQ(parser.parseHeader(nullptr, &data), 16);
}

// --- sequences: the continuity counter --------------------------------------------

struct Step {
    uint8_t counter;
    bool unitStart;
    uint8_t control;  // 1 payload, 2 adaptation only, 3 both
    uint32_t result;
};

struct SequenceCase {
    const char* name;
    std::vector<Step> steps;
};

class TSPacketParserSequenceTest : public ::testing::TestWithParam<SequenceCase> {};

TEST_P(TSPacketParserSequenceTest, ResultsFollowTheCounter) {
    const SequenceCase& c = GetParam();
    TraceCapture trace;
    TSPacketParser parser;
    TSParsedData data;
    std::vector<TsPacket> packets;  // kept alive: the record points into them
    for (size_t i = 0; i < c.steps.size(); ++i) {
        const Step& s = c.steps[i];
        TsPacketBuilder b;
        b.pid(0x111).continuity(s.counter).unitStart(s.unitStart);
        if (s.control == 2) {
            b.randomAccess();
        } else if (s.control == 3) {
            b.randomAccess().payload(ramp(50, static_cast<uint8_t>(i)));
        } else {
            b.payload(ramp(184, static_cast<uint8_t>(i)));
        }
        packets.push_back(b.build());
        EXPECT_EQ(parser.parse(packets.back().data(), &data), s.result) << "step " << i;
    }
}

// Steps are {counter, unit start, adaptation_field_control, result}.
// clang-format off
const SequenceCase kSequences[] = {
    {"WrapFifteenToZero", {{14, 1, 1, kPayload}, {15, 0, 1, kPayload}, {0, 0, 1, kPayload}}},
    {"RepeatedCounterIsError", {{14, 1, 1, kPayload}, {14, 0, 1, kError}, {15, 0, 1, kSkip}}},
    {"GapIsErrorThenSkipUntilStart", {{3, 1, 1, kPayload}, {5, 0, 1, kError}, {6, 0, 1, kSkip},
                                      {7, 1, 1, kPayload}, {8, 0, 1, kPayload}}},
    {"AdaptationOnlyDoesNotAdvance", {{3, 1, 1, kPayload}, {3, 0, 2, kPayload},
                                      {3, 0, 2, kPayload}, {4, 0, 3, kPayload}}},
    {"AdaptationOnlyWithNextCounterIsError", {{3, 1, 1, kPayload}, {4, 0, 2, kError}}},
    {"SecondStartIsNewPES", {{5, 1, 1, kPayload}, {6, 1, 1, kPayload | kNewPES}}},
    {"StartAfterGapRestarts", {{5, 1, 1, kPayload}, {9, 1, 1, kError | kPayload},
                               {10, 0, 1, kPayload}, {11, 1, 1, kPayload | kNewPES}}},
    {"SkipsBeforeFirstStart", {{0, 0, 1, kSkip}, {1, 0, 1, kSkip}, {2, 1, 1, kPayload}}},
};
// clang-format on
INSTANTIATE_TEST_SUITE_P(Counters, TSPacketParserSequenceTest, ::testing::ValuesIn(kSequences),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(TSPacketParserContinuityTest, StartAfterGapGivesItsOwnPayload) {
    TraceCapture trace;
    TSPacketParser parser;
    TSParsedData data;
    const TsPacket a = TsPacketBuilder().continuity(1).unitStart().payload(ramp(184, 1)).build();
    const TsPacket b = TsPacketBuilder().continuity(7).unitStart().payload(ramp(100, 9)).build();
    ASSERT_EQ(parser.parse(a.data(), &data), kPayload);
    ASSERT_EQ(parser.parse(b.data(), &data), kError | kPayload);
    // The unit start opens the next PES, so its own payload is reported.
    EXPECT_EQ(data.mPayload, b.data() + 88);
    EXPECT_EQ(data.mPayloadLength, 100u);
    EXPECT_EQ(parser.lastContinuityCounter(), 7u);
}

// --- adaptation field ---------------------------------------------------------------
// Only the PCR and the adaptation field's length are used downstream; the other fields
// (splice countdown, private data, the extension) are kept inside the packet by the
// sweep over every length and flag below.

class TSPacketParserAdaptationTest : public ::testing::Test {
protected:
    uint32_t parse(const TsPacket& packet) {
        mPackets.push_back(packet);
        return parser.parse(mPackets.back().data(), &data);
    }
    TSPacketParser parser;
    TSParsedData data;
    std::vector<TsPacket> mPackets;
};

TEST_F(TSPacketParserAdaptationTest, ClockReferencesAreReadWhole) {
    struct ClockCase {
        uint64_t base;
        uint16_t extension;
        uint16_t storedExtension;  // (byte11 | byte10 << 7) truncated to 8 bits
    };
    const ClockCase cases[] = {
        {0x1FFFFFFFFull, 0x1FF, 0xFF},  {0x1FFFFFFFFull, 0x000, 0x00}, {0, 0x123, 0xA3},
        {0x100000000ull, 0x0AB, 0xAB},  // bit 0 of the base clear: byte10 = 0x7E
        {0x0000000001ull, 0x055, 0x55},
    };
    for (const ClockCase& c : cases) {
        parse(TsPacketBuilder()
                  .unitStart()
                  .pcr(c.base, c.extension)
                  .opcr(c.base ^ 1, c.extension)
                  .build());
        EXPECT_EQ(data.mPCRFlag, 1);
        EXPECT_EQ(data.mPCRBase, c.base);
        EXPECT_EQ(data.mPCRExtension, c.storedExtension) << std::hex << c.base;
        EXPECT_EQ(data.mOPCRFlag, 1);
        EXPECT_EQ(data.mOPCRBase, c.base ^ 1);
    }
}

TEST_F(TSPacketParserAdaptationTest, ValuesOfEarlierPacketsAreKept) {
    parse(TsPacketBuilder().continuity(0).unitStart().pcr(777).payload(ramp(100, 0)).build());
    parse(TsPacketBuilder().continuity(1).payload(ramp(184, 0)).build());
    // No adaptation field: the PCR flag and value stay from the previous packet.
    EXPECT_EQ(data.mPCRFlag, 1);
    EXPECT_EQ(data.mPCRBase, 777u);
    // A field without PCR clears the flag but keeps the old value.
    parse(TsPacketBuilder().continuity(2).randomAccess().payload(ramp(10, 0)).build());
    EXPECT_EQ(data.mPCRFlag, 0);
    EXPECT_EQ(data.mPCRBase, 777u);
    // Length 0 (one stuffing byte) leaves every flag as it was.
    parse(TsPacketBuilder().continuity(3).payload(ramp(183, 0)).build());
    EXPECT_EQ(data.mAdaptationFieldLength, 0);
    EXPECT_EQ(data.mRandomAccessIndicator, 1);
}

// Every adaptation_field_length and every flag combination, with lengths in the
// optional parts at their largest: the parser reads only inside the packet (the
// sanitizer builds check that) and reports the bad lengths.
TEST_F(TSPacketParserAdaptationTest, EveryLengthAndFlagStaysInsideThePacket) {
    TraceCapture trace;
    for (int length = 0; length < 256; ++length) {
        for (int flags = 0; flags < 256; flags += 7) {
            std::vector<uint8_t> raw(184, 0xFF);
            raw[0] = static_cast<uint8_t>(length);
            raw[1] = static_cast<uint8_t>(flags);
            TSPacketParser fresh;
            TSParsedData out;
            const TsPacket packet =
                TsPacketBuilder().unitStart().adaptationControl(3).rawAfterHeader(raw).build();
            const uint32_t r = fresh.parse(packet.data(), &out);
            if (length >= 184) {
                EXPECT_EQ(r, 255u) << length;
            } else {
                EXPECT_EQ(r, kPayload) << length;
                EXPECT_EQ(out.mPayloadLength, 183u - length);
                EXPECT_LE(out.mPayload + out.mPayloadLength, packet.data() + 188);
            }
        }
    }
}

}  // namespace
}  // namespace TavoPlayer
