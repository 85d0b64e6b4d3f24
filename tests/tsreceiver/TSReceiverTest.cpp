#include "tsreceiver/TSReceiver.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <memory>
#include <thread>

#include "platform/dtv/Demux.h"
#include "platform/dtv/DemuxTestUtil.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using namespace std::chrono_literals;
using test::buildStream;
using test::RingDrain;
using test::ScopedDemuxSource;
using test::StreamPlan;
using test::summary;
using test::TempFile;
using test::TraceCapture;
using test::TsPacket;

constexpr auto kDeadline = 20s;

std::vector<uint8_t> readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

// A receiver wired to one ring per PID kind, each drained by its own reader.
class TSReceiverTest : public ::testing::Test {
protected:
    void TearDown() override {
        if (receiver != nullptr) {
            EXPECT_EQ(receiver->stop(), 0u);
        }
        drains.clear();
        EXPECT_FALSE(Demux::instance().sourceStats().open) << "a filter was left started";
    }

    // Adds `count` outputs, in kind order, with readers unless `drained` is false.
    void addOutputs(size_t count, unsigned int log2Size = 16, bool drained = true) {
        for (size_t i = 0; i < count; ++i)
            addOutput(log2Size, drained);
    }
    void addOutput(unsigned int log2Size = 16, bool drained = true) {
        android::sp<RingBuffer> ring =
            test::makeRing("TS" + std::to_string(rings.size()), log2Size);
        rings.push_back(ring);
        receiver->addOutput(ring, nullptr);
        if (drained)
            drains.push_back(std::make_unique<RingDrain>(ring));
    }

    android::sp<TSReceiver> receiver = new TSReceiver();
    std::vector<android::sp<RingBuffer>> rings;
    std::vector<std::unique_ptr<RingDrain>> drains;
};

// --- configuration and start -------------------------------------------------------

TEST_F(TSReceiverTest, ConfigureRefusesAPidCountThatDiffersFromTheOutputs) {
    addOutputs(3, 16, false);
    TraceCapture trace;
    EXPECT_EQ(receiver->configure(
                  {{PCR_PID, 0x100}, {VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}, {CC_PID, 0x130}}),
              0x11003u);
    EXPECT_TRUE(
        trace.contains("configure - number of PIDs (4) and number of outputs (3) are diferent!"))
        << trace.all();
    EXPECT_FALSE(receiver->isPIDSet(0x100));  // the map was not replaced
    EXPECT_EQ(receiver->configure({{PCR_PID, 0x100}, {VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}}), 0u);
    EXPECT_TRUE(receiver->isPIDSet(0x112));
    EXPECT_FALSE(receiver->isPIDSet(0x130));
}

TEST_F(TSReceiverTest, StartRefusesWithoutPidsOrWithTooFewOutputs) {
    TraceCapture trace;
    EXPECT_EQ(receiver->start(), 0x11002u);
    EXPECT_TRUE(trace.contains("start - cannot start TSReceiver: no PID set!"));
    // A map accepted with one output, then a second output: counts differ at start.
    addOutputs(1, 16, false);
    ASSERT_EQ(receiver->configure({{VIDEO_PID, 0x111}}), 0u);
    addOutputs(1, 16, false);
    EXPECT_EQ(receiver->start(), 0x11003u);
    EXPECT_TRUE(
        trace.contains("start - number of PIDs (1) and number of outputs (2) are diferent!"));
}

TEST_F(TSReceiverTest, FilterKindsFollowThePidKinds) {
    const struct {
        TSReceiverPIDType type;
        int kind;
    } table[] = {{PCR_PID, 0}, {VIDEO_PID, 2}, {AUDIO_PID, 1}, {CC_PID, 1}};
    for (const auto& row : table)
        EXPECT_EQ(TSReceiver::filterKindOf(row.type), row.kind);
}

TEST_F(TSReceiverTest, StartFailsWhenAFilterCannotStart) {
    StreamPlan plan;
    plan.pids = {0x100};
    TempFile file(buildStream(plan));
    ScopedDemuxSource source("file:" + file.path() + "?pace=none");
    addOutputs(2, 16, false);
    // 0x2000 is no PID (13 bits, ISO/IEC 13818-1, 2.4.3.2): the demux refuses it.
    ASSERT_EQ(receiver->configure({{PCR_PID, 0x100}, {VIDEO_PID, 0x2000}}), 0u);
    TraceCapture trace;
    EXPECT_EQ(receiver->start(), 0x11004u);
    EXPECT_TRUE(trace.contains("startFiltering Could not start filtering PID 8192!"));
    EXPECT_TRUE(trace.contains("start - could not start filtering!"));
}

// --- request size ------------------------------------------------------------------

TEST(TSReceiverRequestSize, WholePacketsOfTheFreeSpaceButAtLeastOne) {
    const struct {
        uint32_t freeBytes;
        uint32_t request;
    } table[] = {{0, 188},   {100, 188},  {187, 188},   {188, 188},    {375, 188},
                 {376, 376}, {1000, 940}, {4096, 3948}, {65536, 65424}};
    for (const auto& row : table) {
        EXPECT_EQ(TSReceiver::requestSize(row.freeBytes), row.request) << row.freeBytes;
    }
}

// Fills a ring so that exactly `freeBytes` stay free.
void fillRing(RingBuffer& ring, uint32_t freeBytes) {
    const uint32_t used = ring.size() - freeBytes;
    ASSERT_TRUE(ring.waitForSpace(used));
    ring.commitWrite(used);
    ASSERT_EQ(ring.freeSpace(), freeBytes);
}

TEST_F(TSReceiverTest, ReadsWhatFitsAndLeavesTheRestInTheDemux) {
    StreamPlan plan;
    plan.pids = {0x100};
    plan.rounds = 10;
    const std::vector<uint8_t> stream = buildStream(plan);
    TempFile file(stream);
    ScopedDemuxSource source("file:" + file.path() + "?pace=none");
    addOutput(12, false);  // one page, not drained: the test reads it
    RingBuffer& ring = *rings[0];
    fillRing(ring, 1000);
    ASSERT_EQ(receiver->configure({{VIDEO_PID, 0x100}}), 0u);
    TraceCapture trace;
    ASSERT_EQ(receiver->start(), 0u);

    // 1,000 free bytes: five packets (940 bytes) go in at once, and the other five
    // wait in the demux while 60 bytes are free.
    ASSERT_TRUE(
        test::waitUntil([&] { return trace.contains("no room for TS data in RB"); }, kDeadline))
        << trace.all();
    EXPECT_EQ(ring.usedSpace(), 4096u - 1000 + 940);
    EXPECT_TRUE(trace.contains("threadLoop: no room for TS data in RB; free space = 60; PID = 256"))
        << trace.all();

    // The reader frees the ring; the remaining five arrive, in order.
    ASSERT_TRUE(ring.waitForData(4096 - 1000 + 940));
    std::vector<uint8_t> first(ring.readPointer() + 3096, ring.readPointer() + 3096 + 940);
    ring.consume(4096 - 1000 + 940);
    ASSERT_TRUE(test::waitUntil([&] { return ring.usedSpace() == 940; }, kDeadline));
    ASSERT_TRUE(ring.waitForData(940));
    std::vector<uint8_t> second(ring.readPointer(), ring.readPointer() + 940);
    ring.consume(940);
    first.insert(first.end(), second.begin(), second.end());
    EXPECT_EQ(summary(test::toPackets(first)), summary(test::toPackets(stream)));
}

TEST_F(TSReceiverTest, OutputWithAHundredFreeBytesAsksForOnePacketAndReportsNoRoom) {
    StreamPlan plan;
    plan.pids = {0x111};
    plan.rounds = 3;
    TempFile file(buildStream(plan));
    ScopedDemuxSource source("file:" + file.path() + "?pace=none");
    addOutput(12, false);
    fillRing(*rings[0], 100);
    ASSERT_EQ(receiver->configure({{VIDEO_PID, 0x111}}), 0u);
    TraceCapture trace;
    ASSERT_EQ(receiver->start(), 0u);
    ASSERT_TRUE(test::waitUntil(
        [&] { return trace.contains("no room for TS data in RB; free space = 100; PID = 273"); },
        kDeadline))
        << trace.all();
    EXPECT_EQ(rings[0]->freeSpace(), 100u);  // nothing was written
}

// --- end to end ---------------------------------------------------------------------

// Four PIDs into four rings: every packet of each PID arrives, in order, and no
// packet of another PID.
class TSReceiverEndToEnd : public TSReceiverTest {
protected:
    // `reference` holds the packets expected, when they are not those of `stream`.
    void run(const std::vector<uint8_t>& stream, std::map<TSReceiverPIDType, unsigned short> pids,
             const std::vector<uint8_t>* reference = nullptr) {
        TempFile file(stream);
        ScopedDemuxSource source("file:" + file.path() + "?pace=none");
        addOutputs(pids.size());
        ASSERT_EQ(receiver->configure(pids), 0u);
        ASSERT_EQ(receiver->start(), 0u);
        auto expected = test::packetsByPid(reference != nullptr ? *reference : stream);
        size_t i = 0;
        for (const auto& [type, pid] : pids) {
            const size_t want = expected[pid].size();
            ASSERT_GT(want, 0u) << "PID " << pid << " is not in the stream";
            EXPECT_TRUE(drains[i]->waitForPackets(want, kDeadline)) << "PID " << pid;
            // Nothing more comes: wait for the source's end, then look again.
            ASSERT_TRUE(
                test::waitUntil([] { return Demux::instance().sourceStats().ended; }, kDeadline));
            EXPECT_EQ(summary(drains[i]->packets()), summary(expected[pid])) << "PID " << pid;
            ++i;
        }
    }
};

TEST_F(TSReceiverEndToEnd, StreamFromTheByteBuilder) {
    StreamPlan plan;
    plan.pids = {0x0, 0x100, 0x111, 0x1FFF, 0x112, 0x130, 0x1FFF, 0x111};
    plan.rounds = 2000;
    plan.pcrPid = 0x100;
    run(buildStream(plan),
        {{PCR_PID, 0x100}, {VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}, {CC_PID, 0x130}});
}

TEST_F(TSReceiverEndToEnd, StreamFromTsgen) {
#ifndef TAVO_TSGEN_PATH
    GTEST_SKIP() << "tsgen is not built in this tree";
#else
    const std::string path = std::string(TAVO_BINARY_DIR) + "/tsreceiver_tsgen.ts";
    const std::string command = std::string(TAVO_TSGEN_PATH) + " -o " + path +
                                " -d 2 --size 320x240 --pcr-pid 0x100 --caption 0.2:Ola"
                                " --seed 4 2>/dev/null";
    ASSERT_EQ(std::system(command.c_str()), 0) << command;
    const std::vector<uint8_t> stream = readFile(path);
    std::remove(path.c_str());
    ASSERT_GT(stream.size(), 188u * 100);
    run(stream, {{PCR_PID, 0x100}, {VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}, {CC_PID, 0x130}});
#endif
}

TEST_F(TSReceiverEndToEnd, IndependentSampleBroadcast) {
    // A real ISDB-Tb capture: 200 packets, video on 0x111, audio on 0x114 and 0x115.
    const std::string path =
        std::string(TAVO_SHARED_STREAMS_DIR) + "/isdbtb_br_tvintegracao_188_first200pkts.ts";
    if (!std::ifstream(path).good())
        GTEST_SKIP() << "sample streams folder not present";
    run(readFile(path), {{VIDEO_PID, 0x111}, {AUDIO_PID, 0x114}});
}

TEST_F(TSReceiverEndToEnd, IndependentSampleIn204BytePackets) {
    // The same 200 packets as captured, each with its 16-byte ISDB-T trailer: the
    // receiver must get exactly the 188-byte packets of the other file.
    const std::string dir = TAVO_SHARED_STREAMS_DIR;
    const std::vector<uint8_t> rs = readFile(dir + "/isdbtb_br_tvintegracao_rs204_first200pkts.ts");
    const std::vector<uint8_t> plain =
        readFile(dir + "/isdbtb_br_tvintegracao_188_first200pkts.ts");
    if (rs.empty() || plain.empty())
        GTEST_SKIP() << "sample streams folder not present";
    ASSERT_EQ(rs.size(), 200u * 204);
    run(rs, {{VIDEO_PID, 0x111}, {AUDIO_PID, 0x114}, {CC_PID, 0x384}}, &plain);
}

// --- control while running --------------------------------------------------------

// A live source the test writes to: nothing arrives that the test did not send.
class TSReceiverLive : public TSReceiverTest {
protected:
    void SetUp() override {
        pipe = std::make_unique<test::StdinPipe>();
        source = std::make_unique<ScopedDemuxSource>("stdin");
    }
    void TearDown() override {
        TSReceiverTest::TearDown();
        source.reset();
        pipe.reset();
    }
    // Writes `rounds` packets of every PID of `pids`, numbered from `first`; plus
    // one packet of an unrelated PID so that the last packet is not held back.
    void send(std::vector<uint16_t> pids, size_t rounds, uint32_t first) {
        StreamPlan plan;
        plan.pids = std::move(pids);
        plan.rounds = rounds;
        plan.firstSequence = first;
        pipe->write(buildStream(plan));
        StreamPlan tail;
        tail.pids = {0x1FFE};
        tail.rounds = 1;
        pipe->write(buildStream(tail));
    }
    // PID and sequence of every packet a drain has read.
    static std::vector<std::string> seen(const RingDrain& drain) {
        std::vector<std::string> out;
        for (const TsPacket& p : drain.packets()) {
            out.push_back(std::to_string(test::pidOf(p.data())) + "#" +
                          std::to_string(test::sequenceOf(p.data())));
        }
        return out;
    }
    static std::vector<std::string> numbered(uint16_t pid, uint32_t from, uint32_t to) {
        std::vector<std::string> out;
        for (uint32_t s = from; s < to; ++s)
            out.push_back(std::to_string(pid) + "#" + std::to_string(s));
        return out;
    }
    std::unique_ptr<test::StdinPipe> pipe;
    std::unique_ptr<ScopedDemuxSource> source;
};

TEST_F(TSReceiverLive, ChangePidSwitchesTheOutputToTheNewPid) {
    addOutputs(2);
    ASSERT_EQ(receiver->configure({{VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}}), 0u);
    ASSERT_EQ(receiver->start(), 0u);
    send({0x111, 0x112, 0x113}, 10, 0);
    ASSERT_TRUE(drains[1]->waitForPackets(10, kDeadline));

    EXPECT_EQ(receiver->changePID(AUDIO_PID, 0x112, 0x113), 0u);
    EXPECT_TRUE(receiver->isPIDSet(0x113));
    EXPECT_FALSE(receiver->isPIDSet(0x112));
    send({0x111, 0x112, 0x113}, 10, 10);
    ASSERT_TRUE(drains[1]->waitForPackets(20, kDeadline));
    ASSERT_TRUE(drains[0]->waitForPackets(20, kDeadline));

    std::vector<std::string> audio = numbered(0x112, 0, 10);
    const std::vector<std::string> after = numbered(0x113, 10, 20);
    audio.insert(audio.end(), after.begin(), after.end());
    EXPECT_EQ(seen(*drains[1]), audio);
    EXPECT_EQ(seen(*drains[0]), numbered(0x111, 0, 20));  // the other PID did not notice
}

TEST_F(TSReceiverLive, ChangePidRefusals) {
    addOutputs(2);
    TraceCapture trace;
    EXPECT_EQ(receiver->changePID(AUDIO_PID, 0x112, 0x113), 0x11002u);
    EXPECT_TRUE(trace.contains("changePID - no PID set!"));
    ASSERT_EQ(receiver->configure({{VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}}), 0u);
    ASSERT_EQ(receiver->start(), 0u);
    // A PID that is not configured: refused, and nothing changes.
    EXPECT_EQ(receiver->changePID(AUDIO_PID, 0x120, 0x113), 0x11001u);
    EXPECT_TRUE(receiver->isPIDSet(0x112));
    EXPECT_FALSE(receiver->isPIDSet(0x113));
    send({0x111, 0x112, 0x113}, 5, 0);
    ASSERT_TRUE(drains[1]->waitForPackets(5, kDeadline));
    EXPECT_EQ(seen(*drains[1]), numbered(0x112, 0, 5));
}

TEST_F(TSReceiverLive, AFilterThatFailsNeverHoldsBackTheOthers) {
    addOutputs(3);
    ASSERT_EQ(receiver->configure({{VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}, {CC_PID, 0x130}}), 0u);
    ASSERT_EQ(receiver->start(), 0u);
    TraceCapture trace;
    // The new PID cannot be filtered: the old filter stays stopped.
    EXPECT_EQ(receiver->changePID(AUDIO_PID, 0x112, 0x2000), 0x11001u);
    EXPECT_TRUE(trace.contains("changePID Could not start filtering PID 8192!"));
    // Its old handle is now -1 and cannot be changed again.
    EXPECT_EQ(receiver->changePID(AUDIO_PID, 0x112, 0x113), 0x11001u);
    send({0x111, 0x112, 0x130}, 300, 0);
    EXPECT_TRUE(drains[0]->waitForPackets(300, kDeadline));
    EXPECT_TRUE(drains[2]->waitForPackets(300, kDeadline));
    EXPECT_EQ(seen(*drains[0]), numbered(0x111, 0, 300));
    EXPECT_EQ(seen(*drains[2]), numbered(0x130, 0, 300));
    EXPECT_EQ(drains[1]->count(), 0u);
}

TEST_F(TSReceiverLive, StartFilteringNewPidAddsAnOutputWhileRunning) {
    addOutputs(2);
    ASSERT_EQ(receiver->configure({{VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}}), 0u);
    ASSERT_EQ(receiver->start(), 0u);
    TraceCapture trace;
    EXPECT_EQ(receiver->startFilteringNewPID(CC_PID, 0x2000), 0x11001u);
    EXPECT_TRUE(trace.contains("startFilteringNewPID Could not start filtering PID 8192!"));
    EXPECT_FALSE(receiver->isPIDSet(0x2000));

    ASSERT_EQ(receiver->startFilteringNewPID(CC_PID, 0x130), 0u);
    addOutput();  // the caller adds the matching output
    EXPECT_TRUE(receiver->isPIDSet(0x130));
    send({0x111, 0x112, 0x130}, 8, 0);
    ASSERT_TRUE(drains[2]->waitForPackets(8, kDeadline));
    EXPECT_EQ(seen(*drains[2]), numbered(0x130, 0, 8));
    ASSERT_TRUE(drains[0]->waitForPackets(8, kDeadline));
    EXPECT_EQ(seen(*drains[0]), numbered(0x111, 0, 8));
}

// --- stop ---------------------------------------------------------------------------

TEST_F(TSReceiverLive, StopEndsTheThreadAndReleasesEveryFilter) {
    addOutputs(1, 12, false);  // never read: the thread ends up waiting for room
    addOutputs(1);
    ASSERT_EQ(receiver->configure({{VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}}), 0u);
    ASSERT_EQ(receiver->start(), 0u);
    send({0x111, 0x112}, 100, 0);
    ASSERT_TRUE(drains[0]->waitForPackets(100, kDeadline));
    EXPECT_TRUE(Demux::instance().sourceStats().open);
    EXPECT_EQ(test::threadsNamed("TSReceiver"), 1u);
    EXPECT_EQ(test::threadsNamed("DemuxSource"), 1u);
    EXPECT_EQ(receiver->stop(), 0u);
    EXPECT_FALSE(Demux::instance().sourceStats().open);
    // No thread is left behind.
    EXPECT_EQ(test::threadsNamed("TSReceiver"), 0u);
    EXPECT_EQ(test::threadsNamed("DemuxSource"), 0u);
    // The writer lock of the full ring was released by the thread that took it.
    EXPECT_TRUE(rings[0]->waitForSpace(0));
    rings[0]->abortWrite();
    // Started again, it works as before.
    ASSERT_EQ(receiver->start(), 0u);
    send({0x111, 0x112}, 5, 100);
    ASSERT_TRUE(drains[0]->waitForPackets(105, kDeadline));
}

TEST_F(TSReceiverTest, DestroyingARunningReceiverJoinsItsThread) {
    StreamPlan plan;
    plan.pids = {0x111};
    plan.rounds = 50;
    TempFile file(buildStream(plan));
    ScopedDemuxSource source("file:" + file.path() + "?loop=1&pace=none");
    addOutputs(1);
    ASSERT_EQ(receiver->configure({{VIDEO_PID, 0x111}}), 0u);
    ASSERT_EQ(receiver->start(), 0u);
    ASSERT_TRUE(drains[0]->waitForPackets(200, kDeadline));
    receiver.clear();  // no stop(): the destructor must not leave anything behind
    EXPECT_FALSE(Demux::instance().sourceStats().open);
    EXPECT_EQ(test::threadsNamed("TSReceiver"), 0u);
    EXPECT_EQ(test::threadsNamed("DemuxSource"), 0u);
}

// --- bad input ----------------------------------------------------------------------

TEST_F(TSReceiverTest, FileThatIsNoTransportStreamLeavesTheReceiverRunningIdle) {
    std::vector<uint8_t> noise(100 * 1024);
    for (size_t i = 0; i < noise.size(); ++i)
        noise[i] = static_cast<uint8_t>(i * 31 % 0x46);
    TempFile file(noise, ".bin");
    ScopedDemuxSource source("file:" + file.path());
    addOutputs(1);
    ASSERT_EQ(receiver->configure({{VIDEO_PID, 0x111}}), 0u);
    TraceCapture trace;
    ASSERT_EQ(receiver->start(), 0u);
    ASSERT_TRUE(test::waitUntil([&] { return trace.contains("held no TS packets"); }, kDeadline))
        << trace.all();
    EXPECT_EQ(drains[0]->count(), 0u);
}

TEST_F(TSReceiverTest, DumpListsPidsHandlesAndOutputs) {
    addOutputs(2, 16, false);
    ASSERT_EQ(receiver->configure({{PCR_PID, 0x100}, {VIDEO_PID, 0x111}}), 0u);
    char* text = nullptr;
    size_t size = 0;
    FILE* stream = open_memstream(&text, &size);
    receiver->dump(stream, 1);
    fclose(stream);
    const std::string dump(text, size);
    free(text);
    EXPECT_NE(dump.find("\t - Module Name: TS Receiver\n"), std::string::npos) << dump;
    EXPECT_NE(dump.find("\t\tPID type 1: PID 273 (0x111), handle -1\n"), std::string::npos) << dump;
    EXPECT_NE(dump.find("RingBuffer TS1"), std::string::npos) << dump;
}

}  // namespace
}  // namespace TavoPlayer
