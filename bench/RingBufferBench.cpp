// Ring throughput with one writer thread and one reader thread, next to memcpy
// bandwidth measured in the same run:
//  - 188-byte TS packets written in batches as the TS receiver does (as many whole
//    packets as fit in the free space), read one packet at a time by the reader;
//  - 80-byte records (the size of a video frame record) written and read one at a time.
// At the end each figure is printed as bytes/s and as a ratio to memcpy.
#include <benchmark/benchmark.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "common/RingBuffer.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {
namespace {

constexpr uint32_t kPacket = 188;
constexpr uint64_t kBytesPerIteration = 64ull << 20;
constexpr unsigned kRingLog2 = 20;  // 1 MiB, as the receiver's TS rings

std::vector<uint8_t> makePackets(size_t count) {
    std::vector<uint8_t> packets(count * kPacket);
    for (size_t i = 0; i < count; ++i) {
        uint8_t* p = &packets[i * kPacket];
        p[0] = 0x47;
        for (uint32_t j = 1; j < kPacket; ++j)
            p[j] = static_cast<uint8_t>(i + j);
    }
    return packets;
}

// memcpy bandwidth in two geometries, both measured in this run:
//  - "cached": 12 KiB chunks from an 8 MiB source into a 1 MiB destination (the
//    size of the video TS ring), so the destination stays in this core's cache;
//  - "memory": one 64 MiB buffer into another, bound by memory bandwidth.
// The ring moves data from one core to the other, so its figure lies between.
void BM_Memcpy(benchmark::State& state) {
    const size_t destinationBytes = static_cast<size_t>(state.range(0));
    const size_t chunk = destinationBytes >= (64u << 20) ? destinationBytes : 64 * kPacket;
    const std::vector<uint8_t> source =
        makePackets(std::max<size_t>(8u << 20, destinationBytes) / kPacket + 1);
    std::vector<uint8_t> destination(destinationBytes);
    for (auto _ : state) {
        uint64_t moved = 0;
        size_t s = 0, d = 0;
        while (moved < kBytesPerIteration) {
            if (s + chunk > source.size())
                s = 0;
            if (d + chunk > destination.size())
                d = 0;
            memcpy(&destination[d], &source[s], chunk);
            s += chunk;
            d += chunk;
            moved += chunk;
        }
        benchmark::DoNotOptimize(destination.data());
        benchmark::ClobberMemory();
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * kBytesPerIteration));
}
BENCHMARK(BM_Memcpy)
    ->ArgName("destination")
    ->Arg(1 << kRingLog2)
    ->Arg(64 << 20)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void BM_RingBatchedPackets(benchmark::State& state) {
    const std::vector<uint8_t> source = makePackets((8u << 20) / kPacket);
    const uint64_t packets = kBytesPerIteration / kPacket;
    uint64_t checksum = 0;
    for (auto _ : state) {
        android::sp<RingBuffer> ring = new RingBuffer;
        ring->configure("bench", kRingLog2);
        std::thread writer([&] {
            uint64_t sent = 0;
            size_t s = 0;
            while (sent < packets) {
                // As the TS receiver: the free space rounded down to whole packets.
                uint32_t request = ring->freeSpace() / kPacket * kPacket;
                if (request < kPacket)
                    request = kPacket;
                if (!ring->waitForSpace(request))
                    continue;
                uint32_t count = request / kPacket;
                if (count > packets - sent)
                    count = static_cast<uint32_t>(packets - sent);
                if (s + count * kPacket > source.size())
                    s = 0;
                memcpy(ring->writePointer(), &source[s], count * kPacket);
                s += count * kPacket;
                ring->commitWrite(count * kPacket);
                sent += count;
            }
        });
        uint64_t received = 0;
        uint64_t sum = 0;
        while (received < packets) {
            if (!ring->waitForData(kPacket))
                continue;
            // One batch under one lock, as the TS parser reads.
            const uint32_t available = ring->usedSpace() / kPacket;
            const uint8_t* r = ring->readPointer();
            for (uint32_t i = 0; i < available; ++i)
                sum += r[i * kPacket] + r[i * kPacket + 187];
            ring->consume(available * kPacket);
            received += available;
        }
        writer.join();
        checksum += sum;
    }
    benchmark::DoNotOptimize(checksum);
    state.SetBytesProcessed(
        static_cast<int64_t>(state.iterations() * (kBytesPerIteration / kPacket * kPacket)));
}
BENCHMARK(BM_RingBatchedPackets)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_RingRecords80(benchmark::State& state) {
    constexpr uint32_t kRecord = 80;
    const uint64_t records = (kBytesPerIteration / 8) / kRecord;  // fewer bytes: per-record cost
    uint64_t checksum = 0;
    for (auto _ : state) {
        android::sp<RingBuffer> ring = new RingBuffer;
        ring->configure("bench", 16);
        std::thread writer([&] {
            for (uint64_t i = 0; i < records;) {
                if (!ring->waitForSpace(kRecord))
                    continue;
                uint8_t* w = ring->writePointer();
                memset(w, static_cast<int>(i), kRecord);
                ring->commitWrite(kRecord);
                ++i;
            }
        });
        uint64_t sum = 0;
        for (uint64_t i = 0; i < records;) {
            if (!ring->waitForData(kRecord))
                continue;
            sum += ring->readPointer()[kRecord - 1];
            ring->consume(kRecord);
            ++i;
        }
        writer.join();
        checksum += sum;
    }
    benchmark::DoNotOptimize(checksum);
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * records * kRecord));
}
BENCHMARK(BM_RingRecords80)->UseRealTime()->Unit(benchmark::kMillisecond);

// Prints the usual table, then each result as bytes/s and as a ratio to both memcpy
// figures. With repetitions, the median stands for each benchmark.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run>& runs) override {
        ConsoleReporter::ReportRuns(runs);
        for (const Run& run : runs) {
            const bool aggregate = run.run_type == Run::RT_Aggregate;
            if (aggregate && run.aggregate_name != "median")
                continue;
            auto it = run.counters.find("bytes_per_second");
            if (it != run.counters.end())
                mRates[run.run_name.str()] = it->second.value;
        }
    }
    void Finalize() override {
        ConsoleReporter::Finalize();
        double cached = 0, memory = 0;
        for (const auto& [name, rate] : mRates) {
            if (name.find("BM_Memcpy/destination:1048576") == 0)
                cached = rate;
            if (name.find("BM_Memcpy/destination:67108864") == 0)
                memory = rate;
        }
        printf("\n%-44s %12s %16s %16s\n", "benchmark", "bytes/s", "x memcpy cached",
               "x memcpy memory");
        for (const auto& [name, rate] : mRates) {
            printf("%-44s %12.4g %16.2f %16.2f\n", name.c_str(), rate,
                   cached > 0 ? rate / cached : 0.0, memory > 0 ? rate / memory : 0.0);
        }
    }

private:
    std::map<std::string, double> mRates;
};

}  // namespace
}  // namespace TavoPlayer

int main(int argc, char** argv) {
    TavoPlayer::setTraceLevel(TavoPlayer::TRACE_WARNING);
    benchmark::Initialize(&argc, argv);
    TavoPlayer::RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();
    return 0;
}
