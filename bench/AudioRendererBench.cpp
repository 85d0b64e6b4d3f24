// The audio renderer's processor time per second of 48 kHz stereo 16-bit PCM played
// through the null sink (which holds writes back like hardware, so a second of
// audio takes a second), next to a plain memcpy of the same PCM in the same run.
//
// A feeder thread lays 1024-frame records (one AAC frame's worth) into the ring as
// the decoder would; the renderer's own thread plays them. The renderer's cost is
// the process's CPU time over the run less the feeder's own thread CPU time. The
// ratio is memcpy's cost over the renderer's: above 1 would mean the renderer
// costs less than copying its PCM once.
#include <benchmark/benchmark.h>
#include <stdlib.h>
#include <time.h>

#include <atomic>
#include <cstdio>
#include <cstring>
#include <thread>
#include <vector>

#include "common/RingBuffer.h"
#include "common/Synchronization.h"
#include "common/data/AudioFragmentData.h"
#include "platform/os/Trace.h"
#include "renderer/AudioRenderer.h"

namespace TavoPlayer {
namespace {

constexpr uint32_t kRate = 48000;
constexpr uint32_t kFrameBytes = 4;
constexpr uint32_t kFramesPerRecord = 1024;
constexpr uint32_t kRecordPcm = kFramesPerRecord * kFrameBytes;
constexpr double kAudioSecondsPerRun = 2.0;

double cpuSeconds(clockid_t clock) {
    timespec ts{};
    clock_gettime(clock, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) * 1e-9;
}

double gRendererCpuPerAudioSecond = 0;
double gMemcpyCpuPerAudioSecond = 0;

void BM_AudioRendererNullSink(benchmark::State& state) {
    setenv("TAVOPLAYER_PROPERTIES", "/nonexistent/system.prop", 1);
    setenv("TAVOPLAYER_PROP_tavoplayer_audio_sink", "null", 1);
    unsetenv("TAVOPLAYER_PROP_tavoplayer_audio_log");
    setTraceLevel(TRACE_ERROR);
    const uint32_t records = static_cast<uint32_t>(kAudioSecondsPerRun * kRate / kFramesPerRecord);
    std::vector<uint8_t> pcm(kRecordPcm);
    for (size_t i = 0; i < pcm.size(); ++i)
        pcm[i] = static_cast<uint8_t>(i * 31);
    double total = 0;
    for (auto _ : state) {
        android::sp<Synchronization> clock = new Synchronization();
        android::sp<RingBuffer> ring = new RingBuffer();
        ring->configure("AudioRaw", 19);
        android::sp<AudioRenderer> renderer = new AudioRenderer(clock);
        renderer->setInput(ring);
        renderer->configure();
        renderer->setOutputEnable(true);
        const Uint33 anchor = 900000;
        clock->setBasePCR(anchor, Synchronization::RealPCR);

        std::atomic<double> feederCpu{0};
        const double processBefore = cpuSeconds(CLOCK_PROCESS_CPUTIME_ID);
        renderer->start();
        std::thread feeder([&] {
            const double before = cpuSeconds(CLOCK_THREAD_CPUTIME_ID);
            for (uint32_t i = 0; i < records;) {
                if (!ring->waitForSpace(RingBuffer::roundUp4(32 + kRecordPcm)))
                    continue;
                AudioFragmentData header;
                header.mSize = 32 + kRecordPcm;
                header.mPTS = mask33(anchor + uint64_t(i) * kFramesPerRecord * 90000 / kRate);
                header.mNumberChannels = 2;
                header.mSamplingRate = kRate;
                memcpy(ring->writePointer(), static_cast<const void*>(&header), 32);
                memcpy(ring->writePointer() + 32, pcm.data(), kRecordPcm);
                ring->commitWrite(32 + kRecordPcm);
                ++i;
            }
            feederCpu = cpuSeconds(CLOCK_THREAD_CPUTIME_ID) - before;
        });
        feeder.join();
        while (ring->usedSpace() != 0)
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        renderer->stop();
        const double rendererCpu =
            cpuSeconds(CLOCK_PROCESS_CPUTIME_ID) - processBefore - feederCpu.load();
        state.SetIterationTime(rendererCpu);
        total += rendererCpu;
        renderer.clear();
    }
    const double audioSeconds = records * double(kFramesPerRecord) / kRate;
    gRendererCpuPerAudioSecond = total / static_cast<double>(state.iterations()) / audioSeconds;
    state.counters["cpu_us_per_audio_s"] = gRendererCpuPerAudioSecond * 1e6;
}
BENCHMARK(BM_AudioRendererNullSink)->UseManualTime()->Iterations(2)->Unit(benchmark::kMillisecond);

// The same PCM, record by record, copied once with memcpy: 2 s of audio, repeated
// so that the thread's CPU clock resolves it.
void BM_MemcpySamePcm(benchmark::State& state) {
    const uint32_t records = static_cast<uint32_t>(kAudioSecondsPerRun * kRate / kFramesPerRecord);
    std::vector<uint8_t> source(kRecordPcm * records);
    std::vector<uint8_t> destination(kRecordPcm);
    for (size_t i = 0; i < source.size(); ++i)
        source[i] = static_cast<uint8_t>(i * 31);
    constexpr int kRepeats = 200;
    double total = 0;
    for (auto _ : state) {
        const double before = cpuSeconds(CLOCK_THREAD_CPUTIME_ID);
        for (int r = 0; r < kRepeats; ++r) {
            for (uint32_t i = 0; i < records; ++i) {
                memcpy(destination.data(), &source[size_t(i) * kRecordPcm], kRecordPcm);
                benchmark::ClobberMemory();
            }
        }
        const double cpu = (cpuSeconds(CLOCK_THREAD_CPUTIME_ID) - before) / kRepeats;
        state.SetIterationTime(cpu);
        total += cpu;
    }
    const double audioSeconds = records * double(kFramesPerRecord) / kRate;
    gMemcpyCpuPerAudioSecond = total / static_cast<double>(state.iterations()) / audioSeconds;
    state.counters["cpu_us_per_audio_s"] = gMemcpyCpuPerAudioSecond * 1e6;
}
BENCHMARK(BM_MemcpySamePcm)->UseManualTime()->Iterations(5)->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace TavoPlayer

int main(int argc, char** argv) {
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    using TavoPlayer::gMemcpyCpuPerAudioSecond;
    using TavoPlayer::gRendererCpuPerAudioSecond;
    if (gRendererCpuPerAudioSecond > 0 && gMemcpyCpuPerAudioSecond > 0) {
        std::printf(
            "audio renderer, 48 kHz stereo through the null sink: %.1f us CPU per second of "
            "audio (%.4f%% of a core); memcpy of the same PCM: %.1f us; ratio %.2f\n",
            gRendererCpuPerAudioSecond * 1e6, gRendererCpuPerAudioSecond * 100,
            gMemcpyCpuPerAudioSecond * 1e6, gMemcpyCpuPerAudioSecond / gRendererCpuPerAudioSecond);
    }
    benchmark::Shutdown();
    return 0;
}
