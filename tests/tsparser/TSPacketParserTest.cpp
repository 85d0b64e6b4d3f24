#include "tsparser/TSPacketParser.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/NamedRow.h"
#include "support/TraceCapture.h"
#include "support/TsPacketBuilder.h"

namespace TavoPlayer {
namespace {

using namespace test;
using test::PrintTo;

constexpr uint32_t kPayload = TSPacketParser::RESULT_PAYLOAD;
constexpr uint32_t kNewPES = TSPacketParser::RESULT_NEW_PES;
constexpr uint32_t kError = TSPacketParser::RESULT_ERROR;
constexpr uint32_t kSkip = TSPacketParser::RESULT_SKIP;

// --- one packet into a fresh parser: result bits and header codes ----------------
// Where the payload lies is checked end to end (the FFmpeg reference and the real
// captures); these are the refusals and the first unit start.

struct SinglePacketCase {
    const char* name;
    TsPacket packet;
    uint32_t result;
};

class TSPacketParserSinglePacketTest : public ::testing::TestWithParam<SinglePacketCase> {};

TEST_P(TSPacketParserSinglePacketTest, Result) {
    TraceCapture trace;  // keeps the parser's lines out of the output
    TSPacketParser parser;
    TSParsedData data;
    EXPECT_EQ(parser.parse(GetParam().packet.data(), &data), GetParam().result);
}

TsPacketBuilder start() {
    return TsPacketBuilder().unitStart();
}

const SinglePacketCase kSinglePackets[] = {
    {"LostSync", start().syncByte(0x46).payload({1}).build(), 65},
    {"TransportError", start().transportError().payload({1}).build(), 129},
    {"AdaptationLength184", start().adaptationControl(2).rawAfterHeader({184}).build(), 255},
    {"ControlZero", start().adaptationControl(0).payload(ramp(184)).build(), 1},
    {"FirstStartAdaptationOnly", start().pcr(1234).build(), 2},
};
INSTANTIATE_TEST_SUITE_P(Codes, TSPacketParserSinglePacketTest, ::testing::ValuesIn(kSinglePackets),
                         [](const auto& info) { return std::string(info.param.name); });

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
        // An adaptation field (a random access flag) for controls 2 and 3, a payload
        // for 1 and 3.
        TsPacketBuilder b;
        b.pid(0x111).continuity(s.counter).unitStart(s.unitStart).randomAccess(s.control != 1);
        if (s.control != 2)
            b.payload(ramp(s.control == 3 ? 50 : 184, static_cast<uint8_t>(i)));
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

}  // namespace
}  // namespace TavoPlayer
