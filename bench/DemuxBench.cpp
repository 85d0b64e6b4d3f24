// The demux and the TS receiver on the path from a source to the per-PID rings:
//  - the packet aligner alone (bytes in pieces of 64 KiB, whole packets out);
//  - the PCR pacer's bookkeeping per packet (clock passed in, no sleeping);
//  - the whole path: an unpaced TS file read by the demux's source thread, fanned out
//    to four filters, copied by the receiver thread into four rings, each drained by a
//    reader thread as the TS parsers do.
// Figures are bytes/s; the whole path is also given as a multiple of a 23 Mbit/s
// full-segment multiplex (the most an ISDB-T 6 MHz channel carries), and with the
// memory the four filter queues may hold.
#include <benchmark/benchmark.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <thread>
#include <vector>

#include "common/RingBuffer.h"
#include "platform/dtv/Demux.h"
#include "platform/dtv/PacketAligner.h"
#include "platform/dtv/PcrPacer.h"
#include "platform/os/Trace.h"
#include "tsreceiver/TSReceiver.h"

namespace TavoPlayer {
namespace {

constexpr size_t kPacket = 188;
constexpr double kFullSegmentBytesPerSecond = 23e6 / 8;

// `count` packets cycling over `pids`; the first PID carries a PCR every 40 ms of
// stream time, spread so that the stream runs at about 20 Mbit/s.
std::vector<uint8_t> makeStream(size_t count, const std::vector<uint16_t>& pids) {
    std::vector<uint8_t> out(count * kPacket);
    const size_t packetsPer40Ms = static_cast<size_t>(20e6 / 8 / kPacket * 0.04);
    uint64_t pcrBase = 0;
    for (size_t i = 0; i < count; ++i) {
        uint8_t* p = &out[i * kPacket];
        const uint16_t pid = pids[i % pids.size()];
        p[0] = 0x47;
        p[1] = static_cast<uint8_t>(pid >> 8);
        p[2] = static_cast<uint8_t>(pid);
        p[3] = static_cast<uint8_t>(0x10 | (i & 0xF));
        for (size_t j = 4; j < kPacket; ++j)
            p[j] = static_cast<uint8_t>(i * 7 + j);
        if (i % packetsPer40Ms == 0 && pid == pids[0]) {
            // ISO/IEC 13818-1, 2.4.3.4: adaptation field with PCR_flag, then payload.
            p[3] = static_cast<uint8_t>(0x30 | (i & 0xF));
            p[4] = 7;
            p[5] = 0x10;
            p[6] = static_cast<uint8_t>(pcrBase >> 25);
            p[7] = static_cast<uint8_t>(pcrBase >> 17);
            p[8] = static_cast<uint8_t>(pcrBase >> 9);
            p[9] = static_cast<uint8_t>(pcrBase >> 1);
            p[10] = static_cast<uint8_t>(((pcrBase & 1) << 7) | 0x7E);
            p[11] = 0;
            pcrBase += 3600;
        }
    }
    return out;
}

void BM_PacketAligner(benchmark::State& state) {
    const std::vector<uint8_t> stream = makeStream(100'000, {0x100, 0x111, 0x112, 0x130});
    std::vector<uint8_t> out;
    out.reserve(stream.size());
    constexpr size_t kPiece = 64 * 1024;
    for (auto _ : state) {
        PacketAligner aligner;
        out.clear();
        for (size_t at = 0; at < stream.size(); at += kPiece) {
            aligner.push(stream.data() + at, std::min(kPiece, stream.size() - at), out);
        }
        aligner.finish(out);
        benchmark::DoNotOptimize(out.data());
        if (out.size() != stream.size())
            state.SkipWithError("packets lost");
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * stream.size()));
}
BENCHMARK(BM_PacketAligner)->Unit(benchmark::kMillisecond);

void BM_PcrPacer(benchmark::State& state) {
    const std::vector<uint8_t> stream = makeStream(100'000, {0x100, 0x111, 0x112, 0x130});
    std::vector<uint8_t> out;
    out.reserve(stream.size());
    for (auto _ : state) {
        PcrPacer pacer;
        out.clear();
        int64_t now = 0;
        for (size_t i = 0; i < stream.size(); i += kPacket) {
            pacer.push(&stream[i], now);
            if (pacer.nextKnown())
                pacer.takeDue(pacer.nextDueNs() + 2'000'000, out);
            now += 75'000;  // about the packet period of 20 Mbit/s
        }
        pacer.endOfStream(now);
        pacer.takeDue(INT64_MAX, out);
        if (out.size() != stream.size())
            state.SkipWithError("packets lost");
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * stream.size()));
}
BENCHMARK(BM_PcrPacer)->Unit(benchmark::kMillisecond);

// Resident memory of the process now, in bytes (/proc/self/statm).
double residentBytes() {
    long pages = 0;
    long resident = 0;
    if (FILE* f = fopen("/proc/self/statm", "r")) {
        if (fscanf(f, "%ld %ld", &pages, &resident) != 2)
            resident = 0;
        fclose(f);
    }
    return static_cast<double>(resident) * static_cast<double>(sysconf(_SC_PAGESIZE));
}

// Reads a ring as a TS parser would, until told to stop.
class Drain {
public:
    explicit Drain(android::sp<RingBuffer> ring)
        : mRing(std::move(ring)), mThread([this] { run(); }) {}
    ~Drain() {
        mStop = true;
        mRing->wakeAll();
        mThread.join();
    }
    uint64_t bytes() const { return mBytes.load(); }

private:
    void run() {
        while (!mStop) {
            if (!mRing->waitForData(kPacket))
                continue;
            const uint32_t used = mRing->usedSpace();
            mRing->consume(used);
            mBytes += used;
        }
    }
    android::sp<RingBuffer> mRing;
    std::atomic<bool> mStop{false};
    std::atomic<uint64_t> mBytes{0};
    std::thread mThread;
};

void BM_FileToReceiverRings(benchmark::State& state) {
    setTraceLevel(TRACE_ERROR);
    const std::vector<uint16_t> pids = {0x100, 0x111, 0x112, 0x130};
    const std::vector<uint8_t> stream = makeStream(200'000, pids);  // 37.6 MB
    char path[] = "/tmp/tavo_demux_bench_XXXXXX";
    const int fd = mkstemp(path);
    if (fd < 0 || write(fd, stream.data(), stream.size()) != static_cast<ssize_t>(stream.size())) {
        state.SkipWithError("cannot write the stream file");
        return;
    }
    close(fd);
    const std::string source = std::string("file:") + path + "?pace=none";
    setenv("TAVOPLAYER_PROP_tavoplayer_demux_source", source.c_str(), 1);
    double seconds = 0;
    double peakGrowth = 0;
    for (auto _ : state) {
        const double baseline = residentBytes();
        const auto begin = std::chrono::steady_clock::now();
        android::sp<TSReceiver> receiver = new TSReceiver();
        std::vector<android::sp<RingBuffer>> rings;
        std::vector<std::unique_ptr<Drain>> drains;
        for (size_t i = 0; i < pids.size(); ++i) {
            android::sp<RingBuffer> ring = new RingBuffer();
            ring->configure("TS" + std::to_string(i), 20);  // 1 MiB, as the pipeline's TS rings
            receiver->addOutput(ring, nullptr);
            drains.push_back(std::make_unique<Drain>(ring));
            rings.push_back(ring);
        }
        receiver->configure(
            {{PCR_PID, pids[0]}, {VIDEO_PID, pids[1]}, {AUDIO_PID, pids[2]}, {CC_PID, pids[3]}});
        if (receiver->start() != 0) {
            state.SkipWithError("receiver did not start");
            break;
        }
        auto total = [&] {
            uint64_t sum = 0;
            for (auto& d : drains)
                sum += d->bytes();
            return sum;
        };
        while (total() < stream.size()) {
            std::this_thread::sleep_for(std::chrono::microseconds(200));
            peakGrowth = std::max(peakGrowth, residentBytes() - baseline);
        }
        receiver->stop();
        // Only the path counts, not the readers' and rings' teardown after it.
        const double iteration =
            std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count();
        state.SetIterationTime(iteration);
        seconds += iteration;
    }
    unlink(path);
    unsetenv("TAVOPLAYER_PROP_tavoplayer_demux_source");
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * stream.size()));
    // How many 23 Mbit/s multiplexes this path could carry at once.
    if (seconds > 0) {
        state.counters["xFullSegment"] = static_cast<double>(state.iterations() * stream.size()) /
                                         seconds / kFullSegmentBytesPerSecond;
    }
    // Measured: how far the resident size rose above its level before the receiver
    // and its rings were made (rings, filter queues, thread stacks, buffers).
    state.counters["rssGrowthBytes"] = peakGrowth;
    state.counters["queueBytesMax"] =
        static_cast<double>(pids.size() * DemuxSourceConfig::kDefaultQueuePackets * kPacket);
}
BENCHMARK(BM_FileToReceiverRings)->Unit(benchmark::kMillisecond)->UseManualTime()->Iterations(5);

}  // namespace
}  // namespace TavoPlayer

BENCHMARK_MAIN();
