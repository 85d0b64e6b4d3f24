// All four chains' TS parsers at once on a whole TS file, as the pipeline runs them:
// one thread plays the receiver and hands each packet of the PCR, video, audio and
// caption PIDs (from the first programme's PMT) to its chain's input ring, in file
// order; the PCR parser has no output, the others each feed a ring drained as a
// decoder would.
//
//   bench_TsChains --ts=FILE   one pass over FILE; prints "file=", "packets=",
//                              "seconds=" (used by bench/ts_parse_vs_ffmpeg.sh)
//   bench_TsChains --ts=       the same on the default 1080i stream
//   bench_TsChains [benchmark flags]   Google Benchmark over the default stream
#include <benchmark/benchmark.h>

#include <chrono>
#include <memory>

#include "TSParserBench.h"
#include "platform/os/Trace.h"
#include "tsparser/TSParser.h"

namespace TavoPlayer::bench {
namespace {

class FourChains {
public:
    explicit FourChains(const ChainPids& pids) {
        const int chainPids[4] = {pids.pcr, pids.video, pids.audio, pids.caption};
        const char* names[4] = {"PCRTS", "VideoTS", "AudioTS", "CCTS"};
        const char* outputs[4] = {"", "VideoPES", "AudioPES", "CCPES"};
        for (int k = 0; k < 4; ++k) {
            mPid[k] = chainPids[k];
            if (mPid[k] < 0)
                continue;
            mInput[k] = new RingBuffer();
            mInput[k]->configure(names[k], 20);  // 1 MiB
            mParser[k] = new TSParser(k);
            mParser[k]->setInput(mInput[k]);
            if (k != TSParser::KIND_PCR) {
                android::sp<RingBuffer> out = new RingBuffer();
                out->configure(outputs[k], 21);  // 2 MiB
                mParser[k]->addOutput(out, nullptr);
                mDrainer[k] = std::make_unique<RecordDrainer>(out);
            }
            mParser[k]->start();
        }
    }
    ~FourChains() {
        for (auto& p : mParser) {
            if (p != nullptr)
                p->stop();
        }
    }

    // Hands the file's packets to the chains, 512 file packets at a time, one commit
    // per chain per step, and waits until every parser has taken its share.
    size_t run(const uint8_t* ts, size_t size) {
        constexpr size_t kStep = 512;
        // Bit k set: the packet goes to chain k. The PCR often travels on the video
        // PID, and then the receiver hands the same packet to both chains.
        uint8_t chainsOf[kStep];
        size_t handed = 0;
        const size_t total = size / kPacket;
        for (size_t first = 0; first < total; first += kStep) {
            const size_t n = std::min(kStep, total - first);
            uint32_t count[4] = {0, 0, 0, 0};
            for (size_t i = 0; i < n; ++i) {
                const int pid = pidOf(ts + (first + i) * kPacket);
                chainsOf[i] = 0;
                for (int k = 0; k < 4; ++k) {
                    if (pid == mPid[k]) {
                        chainsOf[i] = static_cast<uint8_t>(chainsOf[i] | (1u << k));
                        ++count[k];
                    }
                }
            }
            for (int k = 0; k < 4; ++k) {
                if (count[k] == 0)
                    continue;
                RingBuffer& ring = *mInput[k];
                while (!ring.waitForSpace(count[k] * kPacket)) {
                }
                uint8_t* w = ring.writePointer();
                for (size_t i = 0; i < n; ++i) {
                    if (!(chainsOf[i] & (1u << k)))
                        continue;
                    memcpy(w, ts + (first + i) * kPacket, kPacket);
                    w += kPacket;
                }
                ring.commitWrite(count[k] * kPacket);
                handed += count[k];
            }
        }
        for (int k = 0; k < 4; ++k) {
            if (mInput[k] != nullptr)
                waitDrained(*mInput[k]);
        }
        return handed;
    }

private:
    int mPid[4] = {-1, -1, -1, -1};
    android::sp<RingBuffer> mInput[4];
    android::sp<TSParser> mParser[4];
    std::unique_ptr<RecordDrainer> mDrainer[4];
};

int runOnce(std::string path) {
    setTraceLevel(TRACE_ERROR);
    if (path.empty())
        path = benchStream();
    if (path.empty() || !fileExists(path)) {
        fprintf(stderr, "no stream to parse\n");
        return 1;
    }
    using Clock = std::chrono::steady_clock;
    const auto start = Clock::now();
    const MappedFile ts(path);
    const ChainPids pids = findChainPids(ts.data(), ts.size());
    const auto read = Clock::now();
    size_t handed = 0;
    std::chrono::duration<double> parse{};
    {
        FourChains chains(pids);
        const auto begin = Clock::now();
        handed = chains.run(ts.data(), ts.size());
        parse = Clock::now() - begin;
    }
    const std::chrono::duration<double> elapsed = Clock::now() - start;
    const std::chrono::duration<double> reading = read - start;
    printf("read_seconds=%.6f\nparse_seconds=%.6f\n", reading.count(), parse.count());
    printf(
        "file=%s\npids=pcr:%d video:%d audio:%d caption:%d\npackets=%zu parsed=%zu\nseconds=%.6f\n",
        path.c_str(), pids.pcr, pids.video, pids.audio, pids.caption, ts.size() / kPacket, handed,
        elapsed.count());
    return 0;
}

void BM_FourChains(benchmark::State& state) {
    setTraceLevel(TRACE_ERROR);
    const std::string path = benchStream();
    if (path.empty()) {
        state.SkipWithError("no benchmark stream (ffmpeg missing and TAVO_BENCH_TS unset)");
        return;
    }
    const std::vector<uint8_t> ts = readFile(path);
    const ChainPids pids = findChainPids(ts);
    size_t handed = 0;
    for (auto _ : state) {
        // Fresh chains each pass: the file is not made to loop, so its counters and
        // the PES in assembly start clean every time.
        FourChains chains(pids);
        handed = chains.run(ts.data(), ts.size());
    }
    state.SetItemsProcessed(state.iterations() * static_cast<int64_t>(ts.size() / kPacket));
    state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(ts.size()));
    state.counters["chain_packets"] = static_cast<double>(handed);
}
BENCHMARK(BM_FourChains)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace TavoPlayer::bench

int main(int argc, char** argv) {
    for (int i = 1; i < argc; ++i) {
        if (strncmp(argv[i], "--ts=", 5) == 0)
            return TavoPlayer::bench::runOnce(argv[i] + 5);
    }
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv))
        return 1;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
