// Packets lost just before a unit start break only the PES they belonged to: the PES
// that starts in the packet after the gap comes out whole. A tsgen stream is run
// through the TS parser module twice, intact and with such gaps cut into it; the
// damaged run must give exactly the intact run's records less the broken ones.
#include <gtest/gtest.h>

#include <set>
#include <string>
#include <vector>

#include "support/NamedRow.h"
#include "support/ParseTs.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using test::PrintTo;

struct GapCase {
    const char* name;
    uint16_t pid;
    int kind;
};

class TSParserContinuityGapTest : public ::testing::TestWithParam<GapCase> {};

TEST_P(TSParserContinuityGapTest, OnlyThePesWithALostPacketIsMissing) {
    const GapCase& c = GetParam();
    const std::string& stream = test::tsgenStream(3, "--seed 7");
    ASSERT_FALSE(stream.empty()) << "tsgen failed";
    const std::vector<uint8_t> intact = test::bytesOfPid(test::fileBytes(stream), c.pid);
    const size_t count = intact.size() / 188;
    auto unitStart = [&](size_t i) { return (intact[i * 188 + 1] & 0x40) != 0; };
    // A packet without payload (a PCR alone) does not advance the continuity
    // counter (ISO/IEC 13818-1, 2.4.3.3): losing one is not a gap.
    auto hasPayload = [&](size_t i) { return (intact[i * 188 + 3] & 0x10) != 0; };

    // PES m spans the packets from its unit start up to the next one. Cut the packet
    // just before every third unit start (when it carries payload and is not a unit
    // start itself): PES m, the one that packet belonged to, breaks; PES m + 1 must
    // survive.
    std::vector<size_t> starts;
    for (size_t i = 0; i < count; ++i)
        if (unitStart(i))
            starts.push_back(i);
    std::set<size_t> broken, cut;
    for (size_t m = 2; m + 1 < starts.size(); m += 3) {
        if (!unitStart(starts[m + 1] - 1) && hasPayload(starts[m + 1] - 1)) {
            cut.insert(starts[m + 1] - 1);
            broken.insert(m);
        }
    }
    ASSERT_GE(broken.size(), 3u);
    std::vector<uint8_t> damaged;
    for (size_t i = 0; i < count; ++i)
        if (!cut.count(i))
            damaged.insert(damaged.end(), intact.begin() + i * 188, intact.begin() + (i + 1) * 188);

    const auto reference = test::parseTs(intact, c.kind);
    test::TraceCapture trace;
    const auto records = test::parseTs(damaged, c.kind);

    // The last PES has no later unit start to close it, in either run.
    ASSERT_EQ(reference.size(), starts.size() - 1);
    std::vector<const test::PesRecord*> expected;
    for (size_t m = 0; m < reference.size(); ++m)
        if (!broken.count(m))
            expected.push_back(&reference[m]);
    ASSERT_EQ(records.size(), expected.size()) << trace.all();
    for (size_t i = 0; i < records.size(); ++i) {
        EXPECT_EQ(records[i].pts, expected[i]->pts) << i;
        EXPECT_EQ(records[i].pes, expected[i]->pes) << i;
    }
}

INSTANTIATE_TEST_SUITE_P(Tsgen, TSParserContinuityGapTest,
                         ::testing::Values(GapCase{"Video", 0x111, TSParser::KIND_VIDEO},
                                           GapCase{"Audio", 0x112, TSParser::KIND_AUDIO}),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace TavoPlayer
