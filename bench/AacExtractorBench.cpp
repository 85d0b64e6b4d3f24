// AAC access-unit extraction throughput: megabytes of elementary stream per second
// through AACMediaExtractor (PES records in a ring, LOAS and ADTS) next to FFmpeg's
// AAC and LATM parsers (av_parser_parse2) on the same bytes cut the same way, with
// the ratio printed at the end of the run.
//
// The stream is 20 s of 48 kHz stereo AAC-LC at 128 kbit/s made by the ffmpeg program
// (ADTS, and the same access units remuxed to LOAS/LATM), cut into PES payloads of
// four frames each, as a broadcast multiplexer would. Figures are per CPU second (the
// extractor never waits here: every record is in the ring before the clock runs), so
// that other load on the machine does not distort the ratio.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <new>
#include <string>
#include <vector>

extern "C" {
#include <libavcodec/avcodec.h>
}

#include "common/RingBuffer.h"
#include "common/data/PESData.h"
#include "decoder/AACMediaExtractor.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {
namespace {

constexpr size_t kFramesPerPes = 4;

struct Stream {
    std::vector<std::vector<uint8_t>> pes;  // payloads
    size_t bytes = 0;
    size_t frames = 0;
};

std::vector<uint8_t> readAll(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return std::vector<uint8_t>(std::istreambuf_iterator<char>(in), {});
}

// Frame lengths from the headers (ISO/IEC 13818-7 frame_length; ISO/IEC 14496-3
// audioMuxLengthBytes), to cut the stream into PES payloads at frame starts.
Stream cut(const std::vector<uint8_t>& es, bool adts) {
    Stream s;
    size_t at = 0;
    std::vector<uint8_t> current;
    size_t inCurrent = 0;
    while (at + 7 <= es.size()) {
        const size_t length =
            adts ? ((es[at + 3] & 3u) << 11) | (es[at + 4] << 3) | (es[at + 5] >> 5)
                 : 3 + (((es[at + 1] & 0x1Fu) << 8) | es[at + 2]);
        if (length == 0 || at + length > es.size()) {
            break;
        }
        current.insert(current.end(), es.begin() + static_cast<long>(at),
                       es.begin() + static_cast<long>(at + length));
        at += length;
        ++s.frames;
        if (++inCurrent == kFramesPerPes) {
            s.bytes += current.size();
            s.pes.push_back(std::move(current));
            current.clear();
            inCurrent = 0;
        }
    }
    if (!current.empty()) {
        s.bytes += current.size();
        s.pes.push_back(std::move(current));
    }
    return s;
}

const Stream& stream(bool adts) {
    static const std::map<bool, Stream> streams = [] {
        const std::filesystem::path dir = std::filesystem::path(TAVO_BINARY_DIR) / "bench_aac";
        std::filesystem::create_directories(dir);
        const std::string a = (dir / "sine.adts").string();
        const std::string l = (dir / "sine.latm").string();
        const std::string quiet = "ffmpeg -hide_banner -loglevel error -y ";
        if (std::system((quiet +
                         "-f lavfi -i sine=frequency=440:sample_rate=48000:duration=20 "
                         "-ac 2 -c:a aac -b:a 128k -f adts " +
                         a)
                            .c_str()) != 0 ||
            std::system((quiet + "-i " + a + " -c:a copy -f latm " + l).c_str()) != 0) {
            std::fprintf(stderr, "ffmpeg could not make the test stream\n");
            std::exit(1);
        }
        return std::map<bool, Stream>{{true, cut(readAll(a), true)},
                                      {false, cut(readAll(l), false)}};
    }();
    return streams.at(adts);
}

void writeRecords(RingBuffer& ring, const Stream& s) {
    uint64_t pts = 0;
    for (const auto& es : s.pes) {
        const uint32_t size = PESData::kHeaderSize + static_cast<uint32_t>(es.size());
        if (!ring.waitForSpace(RingBuffer::roundUp4(size))) {
            std::abort();
        }
        auto* record = new (ring.writePointer()) PESData();
        record->mSize = size;
        record->mOffsetES = PESData::kHeaderSize;
        record->mSizeES = static_cast<uint32_t>(es.size());
        record->mPTS = pts;
        std::memcpy(record->pesBytes(), es.data(), es.size());
        ring.commitWrite(size);
        pts += 1920 * kFramesPerPes;
    }
}

void BM_Extractor(benchmark::State& state, bool adts) {
    setTraceLevel(0xFFFFFFFFu);  // no logging in the measured loop
    const Stream& s = stream(adts);
    android::sp<RingBuffer> ring = new RingBuffer();
    ring->configure("BenchAAC", 22);
    std::vector<uint8_t> out(8192);
    size_t units = 0;
    for (auto _ : state) {
        state.PauseTiming();
        ring->reset();
        writeRecords(*ring, s);
        android::sp<AACMediaExtractor> extractor =
            new AACMediaExtractor(ring, adts ? AACMediaExtractor::TRANSPORT_LAYER_ADTS
                                             : AACMediaExtractor::TRANSPORT_LAYER_LOAS);
        state.ResumeTiming();
        units = 0;
        while (ring->usedSpace() != 0) {
            unsigned long length = 0;
            long long pts = 0;
            unsigned char flags = 0;
            extractor->getDecodableUnit(out.data(), out.size(), &length, &pts, &flags);
            units += length > 0;
        }
        benchmark::DoNotOptimize(units);
    }
    // The first frame gives way to the configuration, the last waits for a next header.
    if (units + 1 < s.frames) {
        state.SkipWithError("units missing");
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * s.bytes);
    state.counters["units"] = static_cast<double>(units);
}

void BM_FfmpegParser(benchmark::State& state, bool adts) {
    av_log_set_level(AV_LOG_QUIET);
    const Stream& s = stream(adts);
    size_t units = 0;
    for (auto _ : state) {
        AVCodecParserContext* parser =
            av_parser_init(adts ? AV_CODEC_ID_AAC : AV_CODEC_ID_AAC_LATM);
        AVCodecContext* ctx = avcodec_alloc_context3(nullptr);
        units = 0;
        for (const auto& es : s.pes) {
            const uint8_t* data = es.data();
            int left = static_cast<int>(es.size());
            while (left > 0) {
                uint8_t* frame = nullptr;
                int frameSize = 0;
                const int used = av_parser_parse2(parser, ctx, &frame, &frameSize, data, left,
                                                  AV_NOPTS_VALUE, AV_NOPTS_VALUE, 0);
                data += used;
                left -= used;
                units += frameSize > 0;
            }
        }
        av_parser_close(parser);
        avcodec_free_context(&ctx);
        benchmark::DoNotOptimize(units);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * s.bytes);
    state.counters["units"] = static_cast<double>(units);
}

BENCHMARK_CAPTURE(BM_Extractor, Loas, false)->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_FfmpegParser, Loas, false)->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_Extractor, Adts, true)->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(BM_FfmpegParser, Adts, true)->Unit(benchmark::kMicrosecond);

// Keeps each run's bytes per second to print the ratios after the table.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run>& runs) override {
        for (const Run& run : runs) {
            const auto it = run.counters.find("bytes_per_second");
            if (it != run.counters.end() && run.run_type == Run::RT_Iteration) {
                mBytesPerSecond[run.benchmark_name()] = it->second.value;
            }
        }
        ConsoleReporter::ReportRuns(runs);
    }
    void printRatios() const {
        for (const char* framing : {"Loas", "Adts"}) {
            const auto ours = mBytesPerSecond.find(std::string("BM_Extractor/") + framing);
            const auto theirs = mBytesPerSecond.find(std::string("BM_FfmpegParser/") + framing);
            if (ours == mBytesPerSecond.end() || theirs == mBytesPerSecond.end()) {
                continue;
            }
            std::printf("%s: AACMediaExtractor %.1f MB/s, FFmpeg parser %.1f MB/s, ratio %.2f\n",
                        framing, ours->second / 1e6, theirs->second / 1e6,
                        ours->second / theirs->second);
        }
    }

private:
    std::map<std::string, double> mBytesPerSecond;
};

}  // namespace
}  // namespace TavoPlayer

int main(int argc, char** argv) {
    benchmark::Initialize(&argc, argv);
    TavoPlayer::RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    reporter.printRatios();
    benchmark::Shutdown();
    return 0;
}
