#include "tsparser/TSParser.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <future>
#include <string>
#include <vector>

#include "support/NamedRow.h"
#include "support/PesBuilder.h"
#include "support/TraceCapture.h"
#include "support/TsPacketBuilder.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using namespace test;
using test::PrintTo;

constexpr uint16_t kPid = 0x111;

// A clock whose monotonic time advances 100 ms at every reading, so that every
// setBasePCR far from the current base re-bases (and logs "Setting PCR").
android::sp<Synchronization> steppingClock() {
    auto now = std::make_shared<int64_t>(1'000'000'000);
    return new Synchronization([now](timespec* ts) {
        *now += 100'000'000;
        ts->tv_sec = *now / 1'000'000'000;
        ts->tv_nsec = *now % 1'000'000'000;
        return true;
    });
}

class MockErrorListener : public ErrorListener {
public:
    MOCK_METHOD(void, onError, (unsigned int code, const Module* module), (const, override));
};

// One parser wired to an input ring and one output ring, started by each test.
class TSParserModuleTest : public ::testing::Test {
protected:
    void TearDown() override {
        if (parser != nullptr) {
            EXPECT_EQ(parser->stop(), 0u);
        }
    }
    void startParser(int kind, bool withOutput = true) {
        parser = new TSParser(kind);
        parser->setInput(input);
        if (withOutput)
            parser->addOutput(output, nullptr);
        parser->configure(clock);
        parser->addErrorListener(errors);
        ASSERT_EQ(parser->start(), 0u);
    }
    // Writes the packets as one batch and waits until the parser has taken them.
    void feed(const std::vector<TsPacket>& packets) {
        ASSERT_TRUE(writeAll(*input, concatPackets(packets)));
        ASSERT_TRUE(waitConsumed(*input)) << "the parser did not consume its input";
    }
    void feedPes(const std::vector<uint8_t>& bytes) { feed(pes(bytes)); }
    std::vector<TsPacket> pes(const std::vector<uint8_t>& bytes) {
        return packetizePes(kPid, bytes, &counter);
    }

    TraceCapture trace;
    android::sp<RingBuffer> input = makeRing("VideoTS", 1 << 16);
    android::sp<RingBuffer> output = makeRing("VideoPES", 1 << 16);
    android::sp<Synchronization> clock = steppingClock();
    android::sp<TSParser> parser;
    MockErrorListener errors;
    uint8_t counter = 0;
};

// A PES without time stamps repeats the last ones seen; audio feeds the audio clock.
TEST_F(TSParserModuleTest, MissingTimesRepeatTheLastOnes) {
    startParser(TSParser::KIND_AUDIO);
    const auto timed = PesBuilder(0xC0).pts(900).dts(450).payload(ramp(183)).build();
    const auto untimed = PesBuilder(0xC0).payload(ramp(3)).build();
    for (const auto& unit : {timed, untimed, timed})
        feedPes(unit);
    const auto records = drainRecords(*output);
    ASSERT_EQ(records.size(), 2u);
    EXPECT_EQ(records[1].pes, untimed);
    EXPECT_EQ(records[1].pts, 900u);
    EXPECT_EQ(records[1].dts, 450u);
    EXPECT_TRUE(clock->isValid(Synchronization::Audio));
    EXPECT_FALSE(clock->isValid(Synchronization::Video));
}

// --- what is dropped: a broken PES, then a whole one that must come out alone ---------

struct DropCase {
    const char* name;
    int kind;
    uint32_t outputSize;
    std::function<std::vector<TsPacket>(uint8_t* counter)> broken;
};

class TSParserDropTest : public TSParserModuleTest,
                         public ::testing::WithParamInterface<DropCase> {};

TEST_P(TSParserDropTest, BrokenPesIsDroppedAndTheNextKept) {
    const DropCase& c = GetParam();
    output = makeRing("PES", c.outputSize);
    startParser(c.kind);
    feed(c.broken(&counter));
    const auto kept = PesBuilder(0xE0).pts(2000).payload(ramp(1000)).build();
    feedPes(kept);
    feedPes(PesBuilder(0xE0).pts(3000).payload(ramp(10)).build());
    const auto records = drainRecords(*output);
    ASSERT_EQ(records.size(), 1u) << trace.all();
    EXPECT_EQ(records[0].pes, kept) << "no bytes of the broken PES may precede it";
}

std::vector<TsPacket> videoPes(size_t payload, uint8_t* cc) {
    return packetizePes(kPid, PesBuilder(0xE0).pts(1000).payload(ramp(payload)).build(), cc);
}

// A lost packet is the tsgen stream's case in TSParserContinuityGapTest.
INSTANTIATE_TEST_SUITE_P(
    Faults, TSParserDropTest,
    ::testing::Values(DropCase{"OverlongAdaptationField", TSParser::KIND_VIDEO, 1 << 16,
                               [](uint8_t* cc) {
                                   auto p = videoPes(900, cc);
                                   p[2] = TsPacketBuilder()
                                              .pid(kPid)
                                              .continuity(2)
                                              .adaptationControl(3)
                                              .rawAfterHeader({200})
                                              .build();
                                   return p;
                               }},
                      DropCase{"NoStartCode", TSParser::KIND_AUDIO, 1 << 16,
                               [](uint8_t* cc) { return packetizePes(kPid, ramp(400, 1), cc); }},
                      // Larger than the whole output ring: dropped, not waited for.
                      DropCase{"LargerThanTheOutput", TSParser::KIND_VIDEO, 4096,
                               [](uint8_t* cc) { return videoPes(5000, cc); }}),
    [](const auto& info) { return std::string(info.param.name); });

// --- batches and the clock -----------------------------------------------------------

TEST_F(TSParserModuleTest, PcrParserFeedsTheLastPcrOncePerBatch) {
    startParser(TSParser::KIND_PCR, false);
    std::vector<TsPacket> batch;
    // 10 s apart: each would re-base the clock if it were fed on its own.
    for (uint8_t i = 0; i < 5; ++i)
        batch.push_back(TsPacketBuilder()
                            .pid(0x100)
                            .continuity(i)
                            .unitStart()
                            .pcr(900000ull * (i + 1))
                            .build());
    feed(batch);
    EXPECT_TRUE(clock->isValid(Synchronization::RealPCR));
    EXPECT_EQ(trace.count("(Real PCR)"), 1u) << trace.all();
    EXPECT_EQ(trace.count("Setting PCR: 4500000 "), 1u) << trace.all();
}

// --- the scrambling watchdog -----------------------------------------------------------

struct ScrambleCase {
    const char* name;
    int kind;
    std::string packets;  // S scrambled, E transport error, C clear
    bool expectError;
};

class TSParserScramblingTest : public TSParserModuleTest,
                               public ::testing::WithParamInterface<ScrambleCase> {};

TEST_P(TSParserScramblingTest, TwelfthScrambledVideoPacketEndsTheThread) {
    const ScrambleCase& c = GetParam();
    startParser(c.kind);
    std::vector<TsPacket> packets;
    uint8_t cc = 0;
    for (char k : c.packets) {
        packets.push_back(TsPacketBuilder()
                              .pid(kPid)
                              .continuity(cc++)
                              .scrambling(k == 'S' ? 2 : 0)
                              .transportError(k == 'E')
                              .payload(ramp(184))
                              .build());
    }
    std::promise<void> reported;
    EXPECT_CALL(errors, onError(ERROR_TSPARSER_SCRAMBLED, parser.get()))
        .Times(c.expectError ? 1 : 0)
        .WillRepeatedly([&] { reported.set_value(); });
    ASSERT_TRUE(writeAll(*input, concatPackets(packets)));
    if (c.expectError) {
        ASSERT_EQ(reported.get_future().wait_for(kDeadline), std::future_status::ready);
        // The thread has ended and released the output it held.
        EXPECT_TRUE(writerLockFree(*output));
    } else {
        ASSERT_TRUE(waitConsumed(*input));
        // Still running: another batch is taken.
        feed({TsPacketBuilder().pid(kPid).continuity(cc).payload(ramp(184)).build()});
    }
}

INSTANTIATE_TEST_SUITE_P(
    Watchdog, TSParserScramblingTest,
    ::testing::Values(
        ScrambleCase{"ElevenTolerated", TSParser::KIND_VIDEO, std::string(11, 'S'), false},
        ScrambleCase{"TwelfthReported", TSParser::KIND_VIDEO, std::string(12, 'S'), true},
        ScrambleCase{"TsErrorResetsCount", TSParser::KIND_VIDEO,
                     std::string(6, 'S') + "E" + std::string(11, 'S'), false},
        ScrambleCase{"ClearPacketsDoNotReset", TSParser::KIND_VIDEO,
                     std::string(6, 'S') + std::string(20, 'C') + std::string(6, 'S'), true},
        ScrambleCase{"AudioIsNotWatched", TSParser::KIND_AUDIO, std::string(30, 'S'), false}),
    [](const auto& info) { return std::string(info.param.name); });

// --- waiting for space, and stopping ---------------------------------------------------

class TSParserFullOutputTest : public TSParserModuleTest {
protected:
    void SetUp() override {
        output = makeRing("VideoPES", 4096);
        startParser(TSParser::KIND_VIDEO);
        // Two records of 1540 bytes fit; the third cannot while they are unread.
        for (int i = 0; i < 3; ++i) {
            units.push_back(PesBuilder(0xE0).pts(100 * (i + 1)).payload(ramp(1500 - 14)).build());
            ASSERT_TRUE(writeAll(*input, concatPackets(pes(units.back()))));
        }
        ASSERT_TRUE(
            writeAll(*input, concatPackets(pes(PesBuilder(0xE0).pts(400).payload({1}).build()))));
        ASSERT_TRUE(waitUntil([&] {
            return trace.contains("waiting for free space in PES ring buffer");
        })) << trace.all();
    }
    std::vector<std::vector<uint8_t>> units;
};

TEST_F(TSParserFullOutputTest, WaitsForTheReaderThenGoesOn) {
    EXPECT_EQ(output->usedSpace(), 2u * 1540u);
    auto first = readRecord(*output);
    ASSERT_TRUE(first.has_value());
    EXPECT_EQ(first->pes, units[0]);
    ASSERT_TRUE(waitConsumed(*input));
    auto rest = drainRecords(*output);
    ASSERT_EQ(rest.size(), 2u);
    EXPECT_EQ(rest[0].pes, units[1]);
    EXPECT_EQ(rest[1].pes, units[2]);
}

TEST_F(TSParserFullOutputTest, StopWakesTheBlockedThreadAndReleasesTheOutput) {
    auto stopped = std::async(std::launch::async, [&] { return parser->stop(); });
    ASSERT_EQ(stopped.wait_for(kDeadline), std::future_status::ready) << "stop did not return";
    EXPECT_EQ(stopped.get(), 0u);
    // The record in assembly ends uncommitted; the two finished ones are intact.
    EXPECT_EQ(output->usedSpace(), 2u * 1540u);
    EXPECT_TRUE(writerLockFree(*output));
    parser.clear();
}

// --- lifecycle -----------------------------------------------------------------------

// Video feeds the clock; a restart forgets the PES left unfinished.
TEST_F(TSParserModuleTest, RestartAfterStopStartsClean) {
    startParser(TSParser::KIND_VIDEO);
    feedPes(PesBuilder(0xE0).pts(1).payload(ramp(400)).build());  // never finished
    ASSERT_EQ(parser->stop(), 0u);
    EXPECT_EQ(parser->stop(), 0u) << "a second stop is harmless";
    EXPECT_EQ(output->usedSpace(), 0u);
    ASSERT_EQ(parser->start(), 0u);
    const auto unit = PesBuilder(0xE0).pts(2).payload(ramp(250)).build();
    feedPes(unit);
    feedPes(PesBuilder(0xE0).pts(3).payload(ramp(2)).build());
    const auto records = drainRecords(*output);
    ASSERT_EQ(records.size(), 1u);
    EXPECT_EQ(records[0].pes, unit);
    EXPECT_TRUE(clock->isValid(Synchronization::Video));
    EXPECT_FALSE(clock->isValid(Synchronization::Audio));
}

}  // namespace
}  // namespace TavoPlayer
