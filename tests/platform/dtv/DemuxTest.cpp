#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <chrono>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <thread>

#include "DemuxTestUtil.h"
#include "platform/dtv/Demux.h"
#include "platform/dtv/DemuxBinder.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using namespace std::chrono_literals;
using namespace test;

bool sourceEnded() {
    return waitUntil([] { return Demux::instance().sourceStats().ended; });
}

// Every test leaves the demux with no filter, so the next one opens its own source.
class DemuxTest : public ::testing::Test {
protected:
    void TearDown() override {
        for (int handle : handles)
            DemuxBinder_StopFiltering(handle);
        EXPECT_FALSE(Demux::instance().sourceStats().open);
    }
    int start(uint16_t pid, int kind = kDemuxFilterPes) {
        const int handle = DemuxBinder_StartFiltering(pid, kind);
        EXPECT_GE(handle, 0) << "PID " << pid;
        if (handle >= 0)
            handles.push_back(handle);
        return handle;
    }
    std::vector<int> handles;
};

TEST(DemuxHandleSetTest, IsAValueOf132BytesWithOneBitPerHandle) {
    static_assert(sizeof(DemuxHandleSet) == 132);
    DemuxHandleSet set;
    std::memset(&set, 0xAB, sizeof set);
    DemuxBinder_HandleZERO(&set);
    for (int h : {0, 31, 32, 1055}) {
        EXPECT_FALSE(DemuxBinder_HandleISSET(h, &set)) << h;
        DemuxBinder_HandleSET(h, &set);
        EXPECT_TRUE(DemuxBinder_HandleISSET(h, &set)) << h;
    }
    const DemuxHandleSet copy = set;  // copied by value
    DemuxBinder_HandleSET(-1, &set);  // a failed filter's handle changes nothing
    DemuxBinder_HandleSET(1056, &set);
    EXPECT_EQ(std::memcmp(&copy, &set, sizeof set), 0);
    for (int h : {-1, 1, 1056})
        EXPECT_FALSE(DemuxBinder_HandleISSET(h, &set)) << h;
}

TEST_F(DemuxTest, SelectReportsOnlyReadyHandlesAndTimesOutWithZero) {
    FileSource source(buildStream({.pids = {0x100}, .rounds = 3}));
    const int busy = start(0x100);
    const int idle = start(0x200);
    DemuxHandleSet set;
    DemuxBinder_HandleZERO(&set);
    DemuxBinder_HandleSET(busy, &set);
    DemuxBinder_HandleSET(idle, &set);
    DemuxBinder_HandleSET(1000, &set);  // not open: never ready
    // Packets flow from the first select on; wait until the whole file is in.
    ASSERT_TRUE(waitUntil([&] {
        DemuxHandleSet probe = set;
        return DemuxBinder_Select(&probe, 30) > 0 && Demux::instance().sourceStats().packets == 3;
    }));
    DemuxHandleSet ready = set;
    EXPECT_EQ(DemuxBinder_Select(&ready, 30), 1);
    EXPECT_TRUE(DemuxBinder_HandleISSET(busy, &ready));
    EXPECT_FALSE(DemuxBinder_HandleISSET(idle, &ready));
    EXPECT_FALSE(DemuxBinder_HandleISSET(1000, &ready));

    std::vector<uint8_t> buffer(188 * 10);
    EXPECT_EQ(DemuxBinder_ReadData(busy, buffer.data(), 188 * 2 + 100), 188 * 2);  // whole only
    EXPECT_EQ(DemuxBinder_ReadData(busy, buffer.data(), 187), -EINVAL);
    EXPECT_EQ(DemuxBinder_ReadData(busy, buffer.data(), 188), 188);
    EXPECT_EQ(DemuxBinder_ReadData(busy, buffer.data(), 188), 0);
    EXPECT_LT(DemuxBinder_ReadData(1000, buffer.data(), 188), 0);
    EXPECT_LT(DemuxBinder_Select(nullptr, 30), 0);

    // All read: nothing is ready, and the set comes back empty.
    EXPECT_EQ(DemuxBinder_Select(&set, 30), 0);
    EXPECT_FALSE(DemuxBinder_HandleISSET(busy, &set));
}

TEST_F(DemuxTest, StdinSourceWakesSelectWhenDataArrivesAndEndsAtEndOfFile) {
    StdinPipe pipe;
    ScopedDemuxSource source("stdin");
    const int handle = start(0x100);
    const auto stream = buildStream({.pids = {0x100, 0x101}, .rounds = 40});
    std::thread writer([&] {
        std::this_thread::sleep_for(100ms);
        pipe.write(std::vector<uint8_t>(stream.begin(), stream.begin() + 188 * 20));
    });
    DemuxHandleSet set;
    DemuxBinder_HandleZERO(&set);
    DemuxBinder_HandleSET(handle, &set);
    // The time-out is far longer than the deadline; only the data can end this wait.
    const auto before = std::chrono::steady_clock::now();
    EXPECT_EQ(DemuxBinder_Select(&set, 60'000), 1);
    EXPECT_LT(std::chrono::steady_clock::now() - before, kDeadline);
    writer.join();
    // The last packet waits for the sync byte of the next one (or the end of the
    // stream), so that a packet cut short is never delivered: 10 of 0x100 are whole.
    EXPECT_EQ(readFilter(handle, 10).size(), 10u);
    pipe.write(std::vector<uint8_t>(stream.begin() + 188 * 20, stream.end()));
    pipe.closeWriter();
    const auto expected = packetsByPid(stream)[0x100];
    EXPECT_EQ(readFilter(handle, 30), std::vector<TsPacket>(expected.begin() + 10, expected.end()));
    EXPECT_TRUE(sourceEnded());
}

TEST_F(DemuxTest, SlowFilterDropsItsOldestPacketsWithoutHoldingBackTheOthers) {
    // One second at its PCR pace (a PCR every 10 ms): a reader keeps up easily.
    const auto stream =
        buildStream({.pids = {0x100, 0x101}, .rounds = 100, .pcrPid = 0x101, .pcrIntervalMs = 10});
    FileSource source(stream, "?queue=16");
    const int slow = start(0x100);
    const int fast = start(0x101);
    auto expected = packetsByPid(stream);
    // The fast one reads as it goes; it gets everything in order.
    EXPECT_EQ(summary(readFilter(fast, 100)), summary(expected[0x101]));
    ASSERT_TRUE(sourceEnded());
    Demux::FilterStats stats;
    ASSERT_TRUE(Demux::instance().filterStats(slow, &stats));
    EXPECT_EQ(stats.received, 100u);
    EXPECT_EQ(stats.dropped, 84u);
    EXPECT_EQ(stats.queued, 16u);
    // What is left is the newest sixteen, in order.
    EXPECT_EQ(summary(readFilter(slow, 16)),
              summary(std::vector<TsPacket>(expected[0x100].end() - 16, expected[0x100].end())));
}

TEST_F(DemuxTest, UnpacedFileWaitsForASlowReaderInsteadOfDropping) {
    const auto stream = buildStream({.pids = {0x100}, .rounds = 200});
    FileSource source(stream, "?pace=none&queue=16");
    const int handle = start(0x100);
    std::vector<TsPacket> got;
    while (got.size() < 200) {
        std::this_thread::sleep_for(1ms);  // a reader much slower than the file
        const auto more = readFilter(handle, 1);
        ASSERT_FALSE(more.empty());
        got.insert(got.end(), more.begin(), more.end());
    }
    EXPECT_EQ(summary(got), summary(toPackets(stream)));
    Demux::FilterStats stats;
    ASSERT_TRUE(Demux::instance().filterStats(handle, &stats));
    EXPECT_EQ(stats.dropped, 0u);
}

// --- pacing: the behaviour under test is the release time itself -----------------

double secondsToRead(const std::string& options, const std::vector<uint8_t>& stream,
                     size_t packets) {
    FileSource source(stream, options);
    const int handle = DemuxBinder_StartFiltering(0x101, kDemuxFilterPes);
    EXPECT_GE(handle, 0);
    const auto before = std::chrono::steady_clock::now();
    EXPECT_EQ(readFilter(handle, packets, 30s).size(), packets);
    DemuxBinder_StopFiltering(handle);
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - before).count();
}

// One second of stream (a PCR every 40 ms on 0x100, three packets of 0x101 between
// two) played twice takes about two seconds: paced, and the PCR going back at the
// restart neither stalls the second pass nor sends it in a burst. Unpaced, one
// pass takes a small part of that.
TEST_F(DemuxTest, FileIsReleasedAtThePaceOfItsPcrAcrossALoop) {
    const auto stream =
        buildStream({.pids = {0x100, 0x101, 0x101, 0x101}, .rounds = 26, .pcrPid = 0x100});
    const double paced = secondsToRead("?loop=1", stream, 26 * 3 * 2);
    const double unpaced = secondsToRead("?pace=none", stream, 26 * 3);
    EXPECT_GT(paced, 1.4);
    EXPECT_LT(paced, 5.0);
    EXPECT_LT(unpaced, paced / 4);
}

// --- bad input ------------------------------------------------------------------

TEST_F(DemuxTest, SourceThatCannotBeOpenedGivesANegativeHandleAndSaysWhy) {
    // A regular file where a DVB demux device should be: it opens, but it does not
    // take the filter ioctl.
    const TempDir root("tavo_dvb");
    std::filesystem::create_directories(root / "adapter3");
    std::ofstream(root / "adapter3/demux1") << "not a device";
    const struct {
        const char* source;
        std::string message;
    } cases[] = {
        {"file:/nonexistent/tavo.ts", "cannot open TS file /nonexistent/tavo.ts"},
        {"dvb:99", "cannot open DVB demux " + root / "adapter99/demux0"},
        {"dvb:0.7?queue=64", "demux7"},
        {"dvb:3.1", "DMX_SET_PES_FILTER for PID 273"},
        {"udp://300.1.1.1:1234", "cannot resolve UDP address 300.1.1.1"},
        {"tcp://host:1", "unknown source"},
        {"", "no demux source"},
    };
    const ScopedEnv dvbRoot("TAVOPLAYER_DVB_ROOT", root.path());
    for (const auto& c : cases) {
        TraceCapture trace;
        ScopedDemuxSource source(c.source);
        EXPECT_LT(DemuxBinder_StartFiltering(0x111, kDemuxFilterVideo), 0) << c.source;
        EXPECT_TRUE(trace.contains(c.message)) << c.source << "\n" << trace.all();
        EXPECT_FALSE(Demux::instance().sourceStats().open) << c.source;
    }
    EXPECT_LT(DemuxBinder_StartFiltering(0x2000, kDemuxFilterPes), 0);
    EXPECT_LT(DemuxBinder_StopFiltering(17), 0);
}

// --- UDP ------------------------------------------------------------------------

// Sends to `group` on `port`; a multicast group through the loopback interface.
struct UdpSender {
    explicit UdpSender(int port, const char* group = "127.0.0.1") {
        to.sin_family = AF_INET;
        to.sin_port = htons(static_cast<uint16_t>(port));
        inet_pton(AF_INET, group, &to.sin_addr);
        in_addr loopback{htonl(INADDR_LOOPBACK)};
        setsockopt(fd, IPPROTO_IP, IP_MULTICAST_IF, &loopback, sizeof loopback);
    }
    ~UdpSender() { close(fd); }
    void send(const uint8_t* data, size_t size) {
        ASSERT_EQ(sendto(fd, data, size, 0, reinterpret_cast<sockaddr*>(&to), sizeof to),
                  static_cast<ssize_t>(size));
    }
    const int fd = socket(AF_INET, SOCK_DGRAM, 0);
    sockaddr_in to{};
};

TEST_F(DemuxTest, UdpDatagramsOfOneToSevenPacketsArriveIntact) {
    const int port = freeUdpPort();
    ScopedDemuxSource source("udp://127.0.0.1:" + std::to_string(port));
    TraceCapture trace;
    const int handle = start(0x100);
    const int other = start(0x101);
    const auto stream = buildStream({.pids = {0x100, 0x101}, .rounds = 140});
    UdpSender sender(port);
    size_t at = 0;
    for (size_t n = 1; at < stream.size(); n = n % 7 + 1) {
        const size_t bytes = std::min(n * 188, stream.size() - at);
        sender.send(stream.data() + at, bytes);
        at += bytes;
        // Loopback drops nothing while the receive buffer has room; give the
        // source thread a moment now and then all the same.
        if (n == 7)
            std::this_thread::sleep_for(1ms);
    }
    // Then a datagram that is not whole packets: its whole packets are kept, the
    // rest dropped and reported, and the next datagram is aligned as ever.
    const auto next = buildStream({.pids = {0x100, 0x101}, .rounds = 4, .firstSequence = 140});
    std::vector<uint8_t> bad(next.begin(), next.begin() + 4 * 188);
    bad.resize(bad.size() + 60, 0x47);
    sender.send(bad.data(), bad.size());
    sender.send(next.data() + 4 * 188, 4 * 188);

    std::vector<uint8_t> all = stream;
    all.insert(all.end(), next.begin(), next.end());
    auto expected = packetsByPid(all);
    EXPECT_EQ(summary(readFilter(handle, 144)), summary(expected[0x100]));
    // The very last packet waits for a sync byte after it that never comes.
    expected[0x101].pop_back();
    EXPECT_EQ(summary(readFilter(other, 143)), summary(expected[0x101]));
}

TEST_F(DemuxTest, UdpMulticastGroupIsJoinedOnTheGivenInterface) {
    const int port = freeUdpPort();
    ScopedDemuxSource source("udp://239.255.42.42:" + std::to_string(port) + "?iface=127.0.0.1");
    const int handle = DemuxBinder_StartFiltering(0x100, kDemuxFilterPes);
    if (handle < 0)
        GTEST_SKIP() << "this host cannot join a multicast group on loopback";
    handles.push_back(handle);
    const auto stream = buildStream({.pids = {0x100}, .rounds = 21});
    UdpSender sender(port, "239.255.42.42");
    for (size_t at = 0; at < stream.size(); at += 7 * 188)
        sender.send(stream.data() + at, 7 * 188);
    auto expected = toPackets(stream);
    expected.pop_back();  // waits for a sync byte after it
    EXPECT_EQ(summary(readFilter(handle, 20)), summary(expected));
}

}  // namespace
}  // namespace TavoPlayer
