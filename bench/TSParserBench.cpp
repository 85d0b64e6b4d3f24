// Packets per second through one video TSParser, from its input ring to its output
// ring, on the packets of the video PID of a 1080i H.264 stream at about 18 Mbit/s.
// A reader drains the output as the decoder would; the receiver's side writes 1024
// packets per commit. One iteration is the whole stream's video PID.
#include <benchmark/benchmark.h>

#include "TSParserBench.h"
#include "platform/os/Trace.h"
#include "tsparser/TSParser.h"

namespace TavoPlayer::bench {
namespace {

void BM_VideoTSParser(benchmark::State& state) {
    setTraceLevel(TRACE_ERROR);
    const std::string path = benchStream();
    if (path.empty()) {
        state.SkipWithError("no benchmark stream (ffmpeg missing and TAVO_BENCH_TS unset)");
        return;
    }
    const std::vector<uint8_t> ts = readFile(path);
    const ChainPids pids = findChainPids(ts);
    if (pids.video < 0) {
        state.SkipWithError("no video PID in the stream's PMT");
        return;
    }
    std::vector<uint8_t> video = packetsOfPid(ts, pids.video);
    // Cut after the last packet whose counter precedes that of the first packet with
    // payload, so that the counters run on from one iteration to the next without a
    // continuity error (adaptation-only packets repeat the counter).
    size_t first = 0;
    while (first + kPacket < video.size() && !(video[first + 3] & 0x10))
        first += kPacket;
    const uint8_t before = (video[first + 3] + 15) & 0x0F;
    size_t keep = video.size() / kPacket;
    while (keep > 1 && (video[(keep - 1) * kPacket + 3] & 0x0F) != before)
        --keep;
    video.resize(keep * kPacket);

    android::sp<RingBuffer> input = new RingBuffer();
    android::sp<RingBuffer> output = new RingBuffer();
    input->configure("VideoTS", 22);    // 4 MiB
    output->configure("VideoPES", 24);  // 16 MiB
    android::sp<TSParser> parser = new TSParser(TSParser::KIND_VIDEO);
    parser->setInput(input);
    parser->addOutput(output, nullptr);
    RecordDrainer drainer(output);
    parser->start();

    const size_t chunk = static_cast<size_t>(state.range(0)) * kPacket;
    for (auto _ : state) {
        feedRing(*input, video.data(), video.size(), chunk);
        waitDrained(*input);
    }
    parser->stop();
    const auto packets = static_cast<int64_t>(video.size() / kPacket);
    state.SetItemsProcessed(state.iterations() * packets);
    state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(video.size()));
    state.counters["packets_per_iteration"] = static_cast<double>(packets);
    state.counters["records"] = static_cast<double>(drainer.records());
}

// Commit sizes of the receiver's side: 7 packets (one UDP datagram), 1024.
BENCHMARK(BM_VideoTSParser)->Arg(7)->Arg(1024)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace TavoPlayer::bench

BENCHMARK_MAIN();
