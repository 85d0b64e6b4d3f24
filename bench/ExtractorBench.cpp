// Elementary-stream throughput of the H.264 and MPEG audio extractors, taking PESData
// records from a ring as the decoder's input thread does, next to libavcodec's parser
// for the same codec on the same bytes. After the runs the ratio extractor / parser is
// printed for each codec; the target is a ratio of at least 1.
//
// The streams are encoded once at start-up with the ffmpeg command (libx264 1080i with
// picture timing and AUDs, one access unit per PES; MPEG-1 Layer II 48 kHz, three
// frames per PES, as broadcast muxers cut them).
#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
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
#include "decoder/H264MediaExtractor.h"
#include "decoder/MP3MediaExtractor.h"
#include "platform/os/Trace.h"

namespace {

using TavoPlayer::PESData;
using TavoPlayer::RingBuffer;
using Bytes = std::vector<uint8_t>;

struct Stream {
    Bytes es;
    std::vector<std::pair<size_t, size_t>> pes;  // offset, size of each PES payload
};

Bytes encode(const std::string& arguments, const std::string& name) {
    const std::string path = std::string(TAVO_BINARY_DIR) + "/bench_extractor_" + name;
    const std::string command = "ffmpeg -v error -y " + arguments + " '" + path + "'";
    if (std::system(command.c_str()) != 0) {
        return {};
    }
    std::ifstream in(path, std::ios::binary);
    Bytes bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    std::remove(path.c_str());
    return bytes;
}

// Units as libavcodec's parser cuts them, to lay one or more per PES.
std::vector<size_t> unitSizes(const Bytes& es, AVCodecID codec) {
    std::vector<size_t> sizes;
    AVCodecParserContext* parser = av_parser_init(codec);
    AVCodecContext* context = avcodec_alloc_context3(nullptr);
    const uint8_t* data = es.data();
    int left = static_cast<int>(es.size());
    while (true) {
        uint8_t* out = nullptr;
        int outSize = 0;
        const int used = av_parser_parse2(parser, context, &out, &outSize, data, left,
                                          AV_NOPTS_VALUE, AV_NOPTS_VALUE, 0);
        if (outSize > 0) {
            sizes.push_back(static_cast<size_t>(outSize));
        }
        if (left == 0 && outSize == 0) {
            break;
        }
        data += used;
        left -= used;
    }
    avcodec_free_context(&context);
    av_parser_close(parser);
    return sizes;
}

Stream makeStream(const Bytes& es, AVCodecID codec, size_t unitsPerPes) {
    Stream stream{es, {}};
    size_t offset = 0;
    size_t count = 0;
    for (size_t size : unitSizes(es, codec)) {
        if (count++ % unitsPerPes == 0) {
            stream.pes.emplace_back(offset, 0);
        }
        stream.pes.back().second += size;
        offset += size;
    }
    return stream;
}

const Stream& h264Stream() {
    static const Stream stream = makeStream(
        encode("-f lavfi -i testsrc2=size=1920x1080:rate=30000/1001 -frames:v 60 -c:v libx264 "
               "-preset ultrafast -b:v 15M -x264-params "
               "interlaced=1:pic-struct=1:aud=1:keyint=30:force-cfr=1 -flags +ildct+ilme -f h264",
               "1080i.h264"),
        AV_CODEC_ID_H264, 1);
    return stream;
}

const Stream& mpegAudioStream() {
    static const Stream stream = makeStream(
        encode("-f lavfi -i sine=frequency=1000:duration=60 -ac 2 -ar 48000 -c:a mp2 -b:a 384k "
               "-f mp2",
               "48k.mp2"),
        AV_CODEC_ID_MP2, 3);
    return stream;
}

// Lays every PES of the stream into the ring as a PESData record (payload only; the
// extractors read from mOffsetES).
void fillRing(RingBuffer& ring, const Stream& stream) {
    uint64_t pts = 0;
    for (const auto& [offset, size] : stream.pes) {
        const auto recordSize = static_cast<uint32_t>(PESData::kHeaderSize + size);
        if (!ring.waitForSpace(RingBuffer::roundUp4(recordSize))) {
            std::abort();  // the ring is sized for the whole stream
        }
        auto* record = new (ring.writePointer()) PESData();
        record->mSize = recordSize;
        record->mOffsetES = PESData::kHeaderSize;
        record->mSizeES = static_cast<uint32_t>(size);
        record->mPTS = pts;
        std::memcpy(record->pesBytes(), stream.es.data() + offset, size);
        ring.commitWrite(recordSize);
        pts += 3003;
    }
}

template <typename Extractor>
void extractorRun(benchmark::State& state, const Stream& stream) {
    if (stream.es.empty()) {
        state.SkipWithError("ffmpeg could not encode the stream");
        return;
    }
    TavoPlayer::setTraceLevel(TavoPlayer::TRACE_ERROR);
    android::sp<RingBuffer> ring = new RingBuffer();
    ring->configure("BenchPES", 25);  // 32 MiB: the whole stream at once
    std::vector<uint8_t> output(8 << 20);
    size_t units = 0;
    for (auto _ : state) {
        state.PauseTiming();
        ring->reset();
        android::sp<Extractor> extractor = new Extractor(ring);
        fillRing(*ring, stream);
        state.ResumeTiming();
        while (ring->usedSpace() != 0) {
            unsigned long length = 0;
            long long pts = 0;
            unsigned char flags = 0;
            extractor->getDecodableUnit(output.data(), output.size(), &length, &pts, &flags);
            units += length > 0;
            benchmark::DoNotOptimize(output.data());
        }
        state.PauseTiming();
        extractor.clear();
        state.ResumeTiming();
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * stream.es.size()));
    state.counters["units"] = static_cast<double>(units) / static_cast<double>(state.iterations());
}

void ffmpegRun(benchmark::State& state, const Stream& stream, AVCodecID codec) {
    if (stream.es.empty()) {
        state.SkipWithError("ffmpeg could not encode the stream");
        return;
    }
    size_t units = 0;
    for (auto _ : state) {
        AVCodecParserContext* parser = av_parser_init(codec);
        AVCodecContext* context = avcodec_alloc_context3(nullptr);
        // Fed PES by PES, as a demuxer would hand it the payloads.
        for (const auto& [offset, size] : stream.pes) {
            const uint8_t* data = stream.es.data() + offset;
            int left = static_cast<int>(size);
            while (left > 0) {
                uint8_t* out = nullptr;
                int outSize = 0;
                const int used = av_parser_parse2(parser, context, &out, &outSize, data, left,
                                                  AV_NOPTS_VALUE, AV_NOPTS_VALUE, 0);
                units += outSize > 0;
                benchmark::DoNotOptimize(out);
                data += used;
                left -= used;
            }
        }
        uint8_t* out = nullptr;
        int outSize = 0;
        av_parser_parse2(parser, context, &out, &outSize, nullptr, 0, AV_NOPTS_VALUE,
                         AV_NOPTS_VALUE, 0);
        units += outSize > 0;
        avcodec_free_context(&context);
        av_parser_close(parser);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * stream.es.size()));
    state.counters["units"] = static_cast<double>(units) / static_cast<double>(state.iterations());
}

void BM_H264Extractor(benchmark::State& state) {
    extractorRun<TavoPlayer::H264MediaExtractor>(state, h264Stream());
}
void BM_H264FfmpegParser(benchmark::State& state) {
    ffmpegRun(state, h264Stream(), AV_CODEC_ID_H264);
}
void BM_MP3Extractor(benchmark::State& state) {
    extractorRun<TavoPlayer::MP3MediaExtractor>(state, mpegAudioStream());
}
void BM_MP3FfmpegParser(benchmark::State& state) {
    ffmpegRun(state, mpegAudioStream(), AV_CODEC_ID_MP2);
}

BENCHMARK(BM_H264Extractor)->Unit(benchmark::kMillisecond)->Repetitions(5)->ReportAggregatesOnly();
BENCHMARK(BM_H264FfmpegParser)
    ->Unit(benchmark::kMillisecond)
    ->Repetitions(5)
    ->ReportAggregatesOnly();
BENCHMARK(BM_MP3Extractor)->Unit(benchmark::kMillisecond)->Repetitions(5)->ReportAggregatesOnly();
BENCHMARK(BM_MP3FfmpegParser)
    ->Unit(benchmark::kMillisecond)
    ->Repetitions(5)
    ->ReportAggregatesOnly();

// Keeps the median throughput of every run to print the ratios at the end.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run>& runs) override {
        for (const Run& run : runs) {
            if (run.aggregate_name == "median") {
                const auto it = run.counters.find("bytes_per_second");
                if (it != run.counters.end()) {
                    mMedian[run.run_name.function_name] = it->second.value;
                }
            }
        }
        ConsoleReporter::ReportRuns(runs);
    }
    void printRatios() const {
        printRatio("H.264", "BM_H264Extractor", "BM_H264FfmpegParser");
        printRatio("MPEG audio", "BM_MP3Extractor", "BM_MP3FfmpegParser");
    }

private:
    void printRatio(const char* codec, const std::string& ours, const std::string& theirs) const {
        const auto a = mMedian.find(ours);
        const auto b = mMedian.find(theirs);
        if (a == mMedian.end() || b == mMedian.end() || b->second <= 0) {
            return;
        }
        std::printf("%-10s extractor %8.1f MB/s, libavcodec parser %8.1f MB/s, ratio %.2f\n", codec,
                    a->second / 1e6, b->second / 1e6, a->second / b->second);
    }
    std::map<std::string, double> mMedian;
};

}  // namespace

int main(int argc, char** argv) {
    benchmark::Initialize(&argc, argv);
    RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    reporter.printRatios();
    benchmark::Shutdown();
    return 0;
}
