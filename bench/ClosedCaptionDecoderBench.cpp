// Caption PES decoded per second: the caption PES of a tsgen stream (two captions a
// second for 30 s: accented text, the special set, row changes, clear screen, a
// CSI sequence) run through ClosedCaptionDecoder::processPacket as the worker runs
// them, each written record read back. Captions arrive a few times a second, so
// the figure only has to show that one never costs a visible fraction of a core.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "common/data/ClosedCaptionFragmentData.h"
#include "decoder/ClosedCaptionDecoder.h"
#include "platform/os/Trace.h"

namespace {

using TavoPlayer::ClosedCaptionDecoder;
using TavoPlayer::PESData;
using TavoPlayer::RingBuffer;

std::vector<uint8_t> readAll(const std::string& path) {
    std::vector<uint8_t> bytes;
    if (FILE* f = fopen(path.c_str(), "rb")) {
        uint8_t buffer[65536];
        size_t n;
        while ((n = fread(buffer, 1, sizeof(buffer), f)) > 0)
            bytes.insert(bytes.end(), buffer, buffer + n);
        fclose(f);
    }
    return bytes;
}

// Every caption PES of PID 0x130 as a PESData record (40-byte header, then the PES
// payload), one aligned buffer each.
std::vector<std::vector<uint64_t>> captionRecords() {
    const std::string path = std::string(TAVO_BINARY_DIR) + "/bench_captions.ts";
    std::string command = std::string(TAVO_BINARY_DIR) + "/apps/tsgen/tsgen -o " + path +
                          " -d 31 --size 64x64 --audio none --mux-rate 600000";
    const char* texts[] = {"Ação, você, à noite - 50€", "\\x1D\\x21 Lá, lá\\nFim da linha",
                           "apagado\\fTexto novo \\x9B1;2 V", "topo\\x1C\\x42\\x41baixo Œœ Šš",
                           "Uma legenda longa que ocupa mais de uma linha inteira da tela"};
    for (int i = 0; i < 60; ++i)
        command += " --caption '" + std::to_string(0.5 + 0.5 * i) + ":" + texts[i % 5] + "'";
    std::vector<std::vector<uint64_t>> records;
    if (system((command + " 2>/dev/null").c_str()) != 0)
        return records;
    const std::vector<uint8_t> ts = readAll(path);
    std::vector<uint8_t> pes;
    auto finish = [&] {
        if (pes.size() < 9)
            return;
        const size_t esStart = 9u + pes[8];
        if (esStart > pes.size())
            return;
        const size_t size = PESData::kHeaderSize + pes.size() - esStart;
        std::vector<uint64_t> record((size + 7) / 8);
        PESData header;
        header.mSize = static_cast<uint32_t>(size);
        header.mPTS = 90000;
        header.mOffsetES = PESData::kHeaderSize;
        header.mSizeES = static_cast<uint32_t>(pes.size() - esStart);
        memcpy(record.data(), static_cast<const void*>(&header), PESData::kHeaderSize);
        memcpy(reinterpret_cast<uint8_t*>(record.data()) + PESData::kHeaderSize,
               pes.data() + esStart, pes.size() - esStart);
        records.push_back(std::move(record));
    };
    for (size_t at = 0; at + 188 <= ts.size(); at += 188) {
        const uint8_t* p = ts.data() + at;
        if ((((p[1] & 0x1F) << 8) | p[2]) != 0x130 || !(p[3] & 0x10))
            continue;
        const size_t payload = (p[3] & 0x20) ? 5u + p[4] : 4u;
        if (payload >= 188)
            continue;
        if (p[1] & 0x40) {
            finish();
            pes.clear();
        }
        pes.insert(pes.end(), p + payload, p + 188);
    }
    finish();
    return records;
}

void BM_CaptionPesDecode(benchmark::State& state) {
    setenv("TAVOPLAYER_LOG_LEVEL", "none", 1);
    static const std::vector<std::vector<uint64_t>> records = captionRecords();
    if (records.empty()) {
        state.SkipWithError("tsgen did not produce the caption stream");
        return;
    }
    android::sp<RingBuffer> output = new RingBuffer();
    output->configureWithSize("CCRaw", 1 << 16);
    android::sp<ClosedCaptionDecoder> decoder = new ClosedCaptionDecoder();
    decoder->addOutput(output, nullptr);
    size_t written = 0;
    for (auto _ : state) {
        for (const auto& record : records) {
            auto* pes = reinterpret_cast<PESData*>(const_cast<uint64_t*>(record.data()));
            if (decoder->processPacket(pes) == ClosedCaptionDecoder::RESULT_WRITTEN) {
                ++written;
                output->waitForData(TavoPlayer::ClosedCaptionFragmentData::kHeaderSize);
                auto* caption =
                    reinterpret_cast<TavoPlayer::ClosedCaptionFragmentData*>(output->readPointer());
                output->consume(caption->mSize);
            }
            decoder->clearScreenData();
        }
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations() * records.size()));
    state.counters["pes_per_iteration"] = static_cast<double>(records.size());
    state.counters["captions_written"] =
        static_cast<double>(written) / static_cast<double>(state.iterations());
}
BENCHMARK(BM_CaptionPesDecode);

}  // namespace

BENCHMARK_MAIN();
