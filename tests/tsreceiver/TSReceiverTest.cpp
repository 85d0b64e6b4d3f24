#include "tsreceiver/TSReceiver.h"

#include <gtest/gtest.h>

#include <memory>

#include "platform/dtv/Demux.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using namespace test;
using Pids = std::map<TSReceiverPIDType, unsigned short>;

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
    void addOutputs(size_t count, uint32_t sizeBytes = 1 << 16, bool drained = true) {
        for (size_t i = 0; i < count; ++i) {
            rings.push_back(makeRing("TS" + std::to_string(rings.size()), sizeBytes));
            receiver->addOutput(rings.back(), nullptr);
            if (drained)
                drains.push_back(std::make_unique<RingDrain>(rings.back()));
        }
    }
    void configureAndStart(const Pids& pids) {
        ASSERT_EQ(receiver->configure(pids), 0u);
        ASSERT_EQ(receiver->start(), 0u);
    }

    TraceCapture trace;
    android::sp<TSReceiver> receiver = new TSReceiver();
    std::vector<android::sp<RingBuffer>> rings;
    std::vector<std::unique_ptr<RingDrain>> drains;
};

// --- configuration and start -------------------------------------------------------

TEST_F(TSReceiverTest, StartFailsWhenAFilterCannotStart) {
    FileSource source(buildStream({.pids = {0x100}}));
    addOutputs(2, 1 << 16, false);
    // 0x2000 is no PID (13 bits, ISO/IEC 13818-1, 2.4.3.2): the demux refuses it.
    ASSERT_EQ(receiver->configure({{PCR_PID, 0x100}, {VIDEO_PID, 0x2000}}), 0u);
    EXPECT_EQ(receiver->start(), 0x11004u);
}

TEST_F(TSReceiverTest, ReadsWhatFitsAndLeavesTheRestInTheDemux) {
    const auto stream = buildStream({.pids = {0x100}});
    FileSource source(stream);
    addOutputs(1, 4096, false);  // one page, not drained: the test reads it
    RingBuffer& ring = *rings[0];
    ASSERT_TRUE(ring.waitForSpace(4096 - 1000));
    ring.commitWrite(4096 - 1000);
    configureAndStart({{VIDEO_PID, 0x100}});

    // 1,000 free bytes: five packets (940 bytes) go in at once, and the other five
    // wait in the demux while 60 bytes are free.
    ASSERT_TRUE(waitUntil([&] { return ring.usedSpace() == 4096u - 1000 + 940; }));

    // The reader frees the ring; the remaining five arrive, in order.
    ASSERT_TRUE(ring.waitForData(4096 - 1000 + 940));
    std::vector<uint8_t> got(ring.readPointer() + 3096, ring.readPointer() + 3096 + 940);
    ring.consume(4096 - 1000 + 940);
    ASSERT_TRUE(waitUntil([&] { return ring.usedSpace() == 940; }));
    ASSERT_TRUE(ring.waitForData(940));
    got.insert(got.end(), ring.readPointer(), ring.readPointer() + 940);
    ring.consume(940);
    EXPECT_EQ(summary(toPackets(got)), summary(toPackets(stream)));
}

// --- end to end: every packet of each PID arrives, in order, and no other -----------

TEST_F(TSReceiverTest, IndependentSampleIn204BytePackets) {
    // A real ISDB-Tb capture of 200 packets, each with its 16-byte ISDB-T trailer: the
    // receiver must get exactly the 188-byte packets of the same capture without them.
    const std::string samples = std::string(TAVO_SHARED_STREAMS_DIR) + "/isdbtb_br_tvintegracao_";
    const auto rs = fileBytes(samples + "rs204_first200pkts.ts");
    const auto plain = fileBytes(samples + "188_first200pkts.ts");
    if (rs.empty() || plain.empty())
        GTEST_SKIP() << "sample streams folder not present";
    ASSERT_EQ(rs.size(), 200u * 204);
    FileSource source(rs);
    const Pids pids{{VIDEO_PID, 0x111}, {AUDIO_PID, 0x114}, {CC_PID, 0x384}};
    addOutputs(pids.size());
    configureAndStart(pids);
    auto expected = packetsByPid(plain);
    size_t i = 0;
    for (const auto& [type, pid] : pids) {
        ASSERT_GT(expected[pid].size(), 0u) << "PID " << pid << " is not in the stream";
        EXPECT_TRUE(drains[i]->waitForPackets(expected[pid].size())) << "PID " << pid;
        // Nothing more comes: wait for the source's end, then look again.
        ASSERT_TRUE(waitUntil([] { return Demux::instance().sourceStats().ended; }));
        EXPECT_EQ(summary(drains[i++]->packets()), summary(expected[pid])) << "PID " << pid;
    }
}

// --- control while running: a live source that carries only what the test sends ----

class TSReceiverLive : public TSReceiverTest {
protected:
    // Writes `rounds` packets of every PID of `pids`, numbered from `first`, then
    // one packet of an unrelated PID so that the last packet is not held back.
    // Returns the packets of each PID written.
    std::map<uint16_t, std::vector<TsPacket>> send(std::vector<uint16_t> pids, size_t rounds,
                                                   uint32_t first) {
        const auto stream = buildStream({.pids = pids, .rounds = rounds, .firstSequence = first});
        pipe.write(stream);
        pipe.write(buildStream({.pids = {0x1FFE}, .rounds = 1}));
        return packetsByPid(stream);
    }
    StdinPipe pipe;
    ScopedDemuxSource source{"stdin"};
};

// Filters that cannot start never hold back the others; a PID added while running
// reaches the output the caller adds for it.
TEST_F(TSReceiverLive, FailedFiltersAndAPidAddedWhileRunning) {
    addOutputs(2);
    EXPECT_EQ(receiver->changePID(AUDIO_PID, 0x112, 0x113), 0x11002u);  // not started
    configureAndStart({{VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}});
    EXPECT_EQ(receiver->changePID(AUDIO_PID, 0x120, 0x113), 0x11001u);  // not configured
    // 0x2000 cannot be filtered: the old filter stays stopped, its handle is now -1
    // and cannot be changed again.
    EXPECT_EQ(receiver->changePID(AUDIO_PID, 0x112, 0x2000), 0x11001u);
    EXPECT_EQ(receiver->changePID(AUDIO_PID, 0x112, 0x113), 0x11001u);
    EXPECT_EQ(receiver->startFilteringNewPID(CC_PID, 0x2000), 0x11001u);
    EXPECT_FALSE(receiver->isPIDSet(0x2000));
    ASSERT_EQ(receiver->startFilteringNewPID(CC_PID, 0x130), 0u);
    addOutputs(1);
    EXPECT_TRUE(receiver->isPIDSet(0x130));
    auto sent = send({0x111, 0x112, 0x130}, 300, 0);
    EXPECT_TRUE(drains[0]->waitForPackets(300));
    EXPECT_TRUE(drains[2]->waitForPackets(300));
    EXPECT_EQ(summary(drains[0]->packets()), summary(sent[0x111]));
    EXPECT_EQ(summary(drains[2]->packets()), summary(sent[0x130]));
    EXPECT_EQ(drains[1]->count(), 0u);
}

// --- stop ---------------------------------------------------------------------------

void expectNoThreadLeft() {
    EXPECT_FALSE(Demux::instance().sourceStats().open);
    // libutils' threads are detached: a joined thread's task can outlive join() by a
    // moment, so the count is waited for; a thread that really stays still fails.
    EXPECT_TRUE(waitUntil([] { return threadsNamed("TSReceiver") == 0; }));
    EXPECT_TRUE(waitUntil([] { return threadsNamed("DemuxSource") == 0; }));
}

TEST_F(TSReceiverLive, StopEndsTheThreadAndReleasesEveryFilter) {
    addOutputs(1, 4096, false);  // never read: the thread ends up waiting for room
    addOutputs(1);
    configureAndStart({{VIDEO_PID, 0x111}, {AUDIO_PID, 0x112}});
    send({0x111, 0x112}, 100, 0);
    ASSERT_TRUE(drains[0]->waitForPackets(100));
    EXPECT_TRUE(Demux::instance().sourceStats().open);
    EXPECT_EQ(threadsNamed("TSReceiver"), 1u);
    EXPECT_EQ(threadsNamed("DemuxSource"), 1u);
    EXPECT_EQ(receiver->stop(), 0u);
    expectNoThreadLeft();
    // The writer lock of the full ring was released by the thread that took it.
    EXPECT_TRUE(writerLockFree(*rings[0]));
    // Started again, it works as before.
    ASSERT_EQ(receiver->start(), 0u);
    send({0x111, 0x112}, 5, 100);
    ASSERT_TRUE(drains[0]->waitForPackets(105));
}

TEST_F(TSReceiverTest, DestroyingARunningReceiverJoinsItsThread) {
    FileSource source(buildStream({.pids = {0x111}, .rounds = 50}), "?loop=1&pace=none");
    addOutputs(1);
    configureAndStart({{VIDEO_PID, 0x111}});
    ASSERT_TRUE(drains[0]->waitForPackets(200));
    receiver.clear();  // no stop(): the destructor must not leave anything behind
    expectNoThreadLeft();
}

}  // namespace
}  // namespace TavoPlayer
