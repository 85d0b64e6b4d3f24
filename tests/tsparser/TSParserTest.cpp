#include "tsparser/TSParser.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <future>
#include <random>
#include <string>
#include <vector>

#include "platform/dtv/RecPlayerBinder.h"
#include "support/NamedRow.h"
#include "support/PesBuilder.h"
#include "support/TraceCapture.h"
#include "support/TsPacketBuilder.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using test::PrintTo;

using namespace std::chrono_literals;
using namespace test;

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
    void create(int kind, bool withOutput = true) {
        parser = new TSParser(kind);
        parser->setInput(input);
        if (withOutput)
            parser->addOutput(output, nullptr);
        parser->configure(clock);
        parser->addErrorListener(errors);
    }
    void startParser(int kind, bool withOutput = true) {
        create(kind, withOutput);
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

// The record reaches the first output and a copy every further one.
TEST_F(TSParserModuleTest, PesAcrossTenPacketsIsWrittenAtTheEleventhToEveryOutput) {
    auto second = makeRing("copy1", 1 << 16);
    auto third = makeRing("copy2", 1 << 16);
    create(TSParser::KIND_VIDEO);
    parser->addOutput(second, nullptr);
    parser->addOutput(third, nullptr);
    ASSERT_EQ(parser->start(), 0u);
    // 19 header bytes + 1821 = 1840 = 10 x 184: exactly ten full packets.
    const auto first =
        PesBuilder(0xE0).pts(0x1ABCDEF01ull).dts(0x1ABCD0000ull).payload(ramp(1821)).build();
    const auto packets = pes(first);
    ASSERT_EQ(packets.size(), 10u);
    feed(packets);
    EXPECT_EQ(output->usedSpace(), 0u) << "nothing may be written before the next unit start";

    feedPes(PesBuilder(0xE0).pts(5).payload(ramp(10)).build());
    for (auto* ring : {output.get(), second.get(), third.get()}) {
        auto record = readRecord(*ring);
        ASSERT_TRUE(record.has_value()) << ring->name();
        EXPECT_EQ(record->type, 0u);
        EXPECT_EQ(record->size, 40u + 1840u);
        EXPECT_EQ(record->pts, 0x1ABCDEF01ull);
        EXPECT_EQ(record->dts, 0x1ABCD0000ull);
        EXPECT_EQ(record->sizeES, 1821u);
        EXPECT_EQ(record->offsetES, 40u + 19u);
        EXPECT_EQ(record->pes, first) << ring->name();
        EXPECT_EQ(record->es(), ramp(1821));
        EXPECT_EQ(ring->usedSpace(), 0u) << "exactly one record";
    }
    EXPECT_TRUE(clock->isValid(Synchronization::Video));
    EXPECT_FALSE(clock->isValid(Synchronization::Audio));
}

// Records of odd sizes advance the ring by multiples of four; a PES without time
// stamps repeats the last ones seen.
TEST_F(TSParserModuleTest, OddSizesAndMissingTimes) {
    startParser(TSParser::KIND_CLOSED_CAPTION);
    std::vector<std::vector<uint8_t>> units;
    std::vector<uint64_t> pts;
    std::vector<uint64_t> dts;
    for (size_t n : {1u, 2u, 3u, 183u, 185u, 367u, 1000u}) {
        PesBuilder b(0xBD);
        const bool timed = n % 3 != 0;
        if (timed)
            b.pts(90 * n).dts(45 * n);
        pts.push_back(timed ? 90 * n : pts.back());
        dts.push_back(timed ? 45 * n : dts.back());
        units.push_back(b.payload(ramp(n, static_cast<uint8_t>(n))).build());
        feedPes(units.back());
    }
    const auto records = drainRecords(*output);
    ASSERT_EQ(records.size(), units.size() - 1);
    for (size_t i = 0; i < records.size(); ++i) {
        EXPECT_EQ(records[i].pes, units[i]) << i;
        EXPECT_EQ(records[i].pts, pts[i]) << i;
        EXPECT_EQ(records[i].dts, dts[i]) << i;
        EXPECT_EQ(records[i].offsetES + records[i].sizeES, records[i].size) << i;
    }
    EXPECT_FALSE(clock->isValid(Synchronization::Video)) << "captions feed no clock";
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

INSTANTIATE_TEST_SUITE_P(
    Faults, TSParserDropTest,
    // A lost packet is the tsgen stream's case in TSParserContinuityGapTest.
    ::testing::Values(DropCase{"OverlongAdaptationField", TSParser::KIND_VIDEO, 1 << 16,
                               [](uint8_t* cc) {
                                   auto p = packetizePes(
                                       kPid, PesBuilder(0xE0).pts(1000).payload(ramp(900)).build(),
                                       cc);
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
                               [](uint8_t* cc) {
                                   return packetizePes(
                                       kPid, PesBuilder(0xE0).pts(1).payload(ramp(5000)).build(),
                                       cc);
                               }}),
    [](const auto& info) { return std::string(info.param.name); });

// Random bytes, lost sync and broken headers in the input never stop the thread;
// once whole PES packets follow, they come out intact.
TEST_F(TSParserModuleTest, RandomInputThenCleanStream) {
    startParser(TSParser::KIND_VIDEO);
    std::mt19937 random(1234);
    for (int round = 0; round < 20; ++round) {
        std::vector<uint8_t> junk(188 * 40);
        for (auto& b : junk)
            b = static_cast<uint8_t>(random());
        // Every few packets a real sync byte and no transport error, so that the
        // adaptation and PES paths see random bytes too.
        for (size_t i = 0; i < junk.size(); i += 188 * 3) {
            junk[i] = 0x47;
            junk[i + 1] &= 0x5F;
        }
        ASSERT_TRUE(writeAll(*input, junk));
        ASSERT_TRUE(waitConsumed(*input));
    }
    std::vector<std::vector<uint8_t>> units;
    for (int i = 0; i < 4; ++i) {
        units.push_back(PesBuilder(0xE0).pts(1000 * i).payload(ramp(300 + i)).build());
        feedPes(units.back());
    }
    auto records = drainRecords(*output);
    ASSERT_GE(records.size(), 2u);
    // The last two are the 2nd and 3rd clean units; anything before is left-over
    // junk that happened to begin with a start code.
    EXPECT_EQ(records[records.size() - 2].pes, units[1]);
    EXPECT_EQ(records[records.size() - 1].pes, units[2]);
}

// --- batches and the clock -----------------------------------------------------------

TEST_F(TSParserModuleTest, PcrParserFeedsTheLastPcrOncePerBatch) {
    startParser(TSParser::KIND_PCR, false);
    // A batch that ends in a partial packet is consumed whole.
    auto bytes = concatPackets({TsPacketBuilder().pid(0x100).unitStart().pcr(900000).build()});
    bytes.resize(375, 0x47);
    ASSERT_TRUE(writeAll(*input, bytes));
    ASSERT_TRUE(waitConsumed(*input));
    EXPECT_EQ(input->tail(), 376u);
    EXPECT_EQ(input->head(), 376u);
    EXPECT_TRUE(clock->isValid(Synchronization::RealPCR));
    EXPECT_EQ(trace.count("Setting PCR: 900000 "), 1u) << trace.all();

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
    EXPECT_EQ(trace.count("(Real PCR)"), 2u) << trace.all();
    EXPECT_EQ(trace.count("Setting PCR: 4500000 "), 1u) << trace.all();

    feed({TsPacketBuilder().pid(0x100).continuity(5).unitStart().pcr(90000000).build(),
          TsPacketBuilder().pid(0x100).continuity(6).payload(ramp(184)).build()});
    EXPECT_EQ(trace.count("(Real PCR)"), 3u) << trace.all();
    EXPECT_EQ(trace.count("Setting PCR: 90000000 "), 1u) << trace.all();
    EXPECT_EQ(output->usedSpace(), 0u);
}

TEST_F(TSParserModuleTest, AudioPtsIsNotifiedOnlyWithTheFlag) {
    create(TSParser::KIND_AUDIO);
    parser->setNotifyFlag(true);
    ASSERT_EQ(parser->start(), 0u);
    const uint64_t before = RecPlayerBinder_GetAudioPTSNotificationCount();
    for (uint64_t pts : {900000ull, 0x1FFFFFFFFull, 3ull})
        feedPes(PesBuilder(0xC0).pts(pts).payload(ramp(100)).build());
    EXPECT_EQ(RecPlayerBinder_GetAudioPTSNotificationCount(), before + 2);
    EXPECT_EQ(RecPlayerBinder_GetLastNotifiedAudioPTS(), 0x1FFFFFFFFull / 90);
    EXPECT_TRUE(clock->isValid(Synchronization::Audio));
    EXPECT_FALSE(clock->isValid(Synchronization::Video));

    ASSERT_EQ(parser->stop(), 0u);
    parser->setNotifyFlag(false);
    ASSERT_EQ(parser->start(), 0u);
    feedPes(PesBuilder(0xC0).pts(900).payload(ramp(100)).build());
    feedPes(PesBuilder(0xC0).pts(1800).payload(ramp(100)).build());
    EXPECT_EQ(RecPlayerBinder_GetAudioPTSNotificationCount(), before + 2);
}

// --- further outputs ---------------------------------------------------------------

TEST_F(TSParserModuleTest, CopyToOtherOutputsReportsAFullOne) {
    auto roomy = makeRing("roomy", 1 << 16);
    auto full = makeRing("full", 4096);
    std::vector<uint8_t> record(1001, 0x5A);
    const struct {
        const char* name;
        std::vector<android::sp<RingBuffer>> extra;
        bool expected;
    } cases[] = {{"OnlyFirst", {}, true},
                 {"OneRoomy", {roomy}, true},
                 {"FullThenRoomy", {full, roomy}, false}};
    ASSERT_TRUE(writeAll(*full, std::vector<uint8_t>(3500, 0)));
    for (const auto& c : cases) {
        android::sp<TSParser> p = new TSParser(TSParser::KIND_VIDEO);
        p->addOutput(output, nullptr);
        for (const auto& ring : c.extra)
            p->addOutput(ring, nullptr);
        const uint32_t roomyBefore = roomy->head();
        EXPECT_EQ(p->copyPEStoOtherOutputs(record.data(), 1001), c.expected) << c.name;
        EXPECT_EQ(output->head(), 0u) << "the first output is never copied to";
        EXPECT_EQ(roomy->head(), roomyBefore + (c.extra.empty() ? 0 : 1004)) << c.name;
    }
    EXPECT_EQ(full->head(), 3500u);
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

TEST_F(TSParserModuleTest, StartIsRefusedWithoutInputOrRoomForARecord) {
    parser = new TSParser(TSParser::KIND_VIDEO);
    parser->addOutput(output, nullptr);
    EXPECT_EQ(parser->start(), ERROR_TSPARSER_NO_INPUT);

    output = makeRing("VideoPES", 4096);
    ASSERT_TRUE(writeAll(*output, std::vector<uint8_t>(4096 - 36, 0)));
    create(TSParser::KIND_VIDEO);
    EXPECT_EQ(parser->start(), ERROR_TSPARSER_START_STOP);
}

TEST_F(TSParserModuleTest, DumpThenRestartAfterStopStartsClean) {
    startParser(TSParser::KIND_VIDEO);
    feedPes(PesBuilder(0xE0).pts(1).payload(ramp(400)).build());  // never finished
    // The dump shows the 414 bytes in assembly.
    const std::string dump = printed([&](FILE* f) { EXPECT_EQ(parser->dump(f, 1), 0u); });
    for (const std::string& line :
         {std::string("\t - Module Name: TS Parser\n"), std::string("\t\t - mpPESWriter: 0x"),
          std::string("\t\t - mpPESData: 0x"), std::string("\t\t - mPESSize: 414\n"),
          "\t\t - mRBFreeSpace: " + std::to_string(65536 - 40 - 414) + "\n"}) {
        EXPECT_NE(dump.find(line), std::string::npos) << line << "\n" << dump;
    }
    EXPECT_EQ(parser->dump(nullptr, 0), 0u);
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
}

}  // namespace
}  // namespace TavoPlayer
