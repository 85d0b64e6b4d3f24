// The video renderer's cost per frame, next to a plain loop doing the least the
// same job needs, in the same run:
//  - renderer: one 80-byte record written into a real ring, then one render()
//    pass (take the record, read the clock, check the PTS sequence, show the frame
//    through a no-op listener and report it), frames due at once;
//  - plain loop: copy the 80-byte record in and out, read the monotonic clock, wait
//    for no time at all (the frame is due) and call the same no-op listener.
// Printed as CPU ns per frame (the machine may be shared, so wall time says more
// about other processes) and as a ratio, plain over renderer: above 1 would mean
// the renderer costs less than the plain loop.
#include <benchmark/benchmark.h>
#include <time.h>

#include <chrono>
#include <cstring>
#include <map>
#include <string>
#include <thread>

#include "common/Synchronization.h"
#include "platform/os/Trace.h"
#include "renderer/VideoRenderer.h"

namespace TavoPlayer {
namespace {

constexpr Uint33 kBasePCR = 900000;

class NoopListener : public VideoFrameData::VideoListener {
public:
    void renderFrame(bool render, VideoFrameData& frame) override {
        benchmark::DoNotOptimize(render);
        const Uint33 pts = frame.mPTS;  // a packed field: read by value
        benchmark::DoNotOptimize(pts);
    }
    bool captureFrame(VideoFrameData&, CaptureFrameListener*) override { return false; }
};

class NoopRendered : public VideoRenderer::FrameRenderedListener {
public:
    void onFrameRendered(int width, int, Uint33) override { benchmark::DoNotOptimize(width); }
    void onFirstFrameRendered(int, int) override {}
};

// Frames half a second late (shown at once), one tick apart, going back every
// thousand frames so that they stay within the clock's reach; a step back is no
// PTS error, so every frame takes the full path to the listener.
Uint33 framePTS(uint64_t i) {
    return kBasePCR - 45000 + i % 1000;
}

VideoFrameData makeFrame(NoopListener* listener) {
    VideoFrameData frame;
    frame.mListener = listener;
    frame.mCropWidth = 1920;
    frame.mCropHeight = 1080;
    return frame;
}

void BM_VideoRenderer(benchmark::State& state) {
    setTraceLevel(TRACE_WARNING);
    // The clock stands still, so that every frame is due in the same way.
    android::sp<Synchronization> clock = new Synchronization([](timespec* now) {
        now->tv_sec = 1000;
        now->tv_nsec = 0;
        return true;
    });
    clock->setBasePCR(kBasePCR, Synchronization::RealPCR);
    android::sp<RingBuffer> ring = new RingBuffer();
    ring->configure("VideoRaw", 16);
    android::sp<VideoRenderer> renderer = new VideoRenderer(clock);
    renderer->setInput(ring);
    renderer->setOutputEnable(true);
    NoopRendered rendered;
    renderer->setFrameRenderedListener(&rendered);
    NoopListener listener;
    VideoFrameData frame = makeFrame(&listener);
    uint64_t i = 0;
    for (auto _ : state) {
        frame.mPTS = framePTS(i++);
        ring->waitForSpace(VideoFrameData::kRecordSize);
        memcpy(ring->writePointer(), static_cast<const void*>(&frame), VideoFrameData::kRecordSize);
        ring->commitWrite(VideoFrameData::kRecordSize);
        renderer->render();
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()));
}
BENCHMARK(BM_VideoRenderer)->Repetitions(5)->ReportAggregatesOnly(true);

void BM_PlainLoop(benchmark::State& state) {
    NoopListener listener;
    VideoFrameData frame = makeFrame(&listener);
    alignas(8) uint8_t record[VideoFrameData::kRecordSize];
    uint64_t i = 0;
    for (auto _ : state) {
        frame.mPTS = framePTS(i++);
        memcpy(record, static_cast<const void*>(&frame), sizeof(record));
        benchmark::DoNotOptimize(record);
        VideoFrameData copy = makeFrame(&listener);
        memcpy(reinterpret_cast<uint8_t*>(&copy) + 8, record + 8, sizeof(record) - 8);
        timespec now{};
        clock_gettime(CLOCK_MONOTONIC, &now);
        benchmark::DoNotOptimize(now);
        std::this_thread::sleep_for(std::chrono::nanoseconds(0));
        copy.mListener->renderFrame(true, copy);
    }
    state.SetItemsProcessed(static_cast<int64_t>(state.iterations()));
}
BENCHMARK(BM_PlainLoop)->Repetitions(5)->ReportAggregatesOnly(true);

// The usual table, then the medians per frame and their ratio.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run>& runs) override {
        ConsoleReporter::ReportRuns(runs);
        for (const Run& run : runs) {
            if (run.run_type == Run::RT_Aggregate && run.aggregate_name == "median")
                mNsPerFrame[run.run_name.function_name] = run.GetAdjustedCPUTime();
        }
    }
    void Finalize() override {
        ConsoleReporter::Finalize();
        const double renderer = mNsPerFrame["BM_VideoRenderer"];
        const double plain = mNsPerFrame["BM_PlainLoop"];
        printf(
            "\nvideo renderer %.0f CPU ns per frame, plain loop with a no-op wait %.0f CPU ns per "
            "frame: ratio %.2f\n",
            renderer, plain, renderer > 0 ? plain / renderer : 0.0);
    }

private:
    std::map<std::string, double> mNsPerFrame;
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
