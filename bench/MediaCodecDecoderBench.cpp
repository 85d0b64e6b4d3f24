// Decoding throughput of the decoder module (TS parser -> MediaCodecDecoder -> ring,
// pictures released at once) against FFmpeg's own tool on the same tsgen file with the
// same thread count, and the module's resident memory in steady state.
//
//   bench_MediaCodecDecoder            prints "... ratio N.NN" lines (above 1: ours faster)
#include <benchmark/benchmark.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "common/Synchronization.h"
#include "common/data/AudioFragmentData.h"
#include "common/data/VideoFrameData.h"
#include "decoder/MediaCodecDecoder.h"
#include "platform/os/Trace.h"
#include "tsparser/TSParser.h"

namespace {

using namespace TavoPlayer;
using Clock = std::chrono::steady_clock;

long residentKb() {
    std::ifstream status("/proc/self/status");
    std::string line;
    while (std::getline(status, line))
        if (line.rfind("VmRSS:", 0) == 0)
            return atol(line.c_str() + 6);
    return 0;
}

std::vector<uint8_t> readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return std::vector<uint8_t>(std::istreambuf_iterator<char>(in), {});
}

struct Result {
    double seconds = 0;
    size_t units = 0;
    long steadyKb = 0;  // resident growth while decoding, measured halfway
};

android::sp<RingBuffer> ringOf(const char* name, uint32_t bytes) {
    android::sp<RingBuffer> ring = new RingBuffer();
    ring->configureWithSize(name, bytes);
    return ring;
}

// The whole TS goes into a large input ring first; the clock runs from the start of
// the modules to the last record read.
Result runModule(const std::vector<uint8_t>& ts, uint16_t pid, Decoder::codingType_t type) {
    const bool video = type == Decoder::CODING_H264;
    std::vector<uint8_t> packets;
    for (size_t at = 0; at + 188 <= ts.size(); at += 188)
        if ((((ts[at + 1] & 0x1F) << 8) | ts[at + 2]) == pid)
            packets.insert(packets.end(), ts.begin() + static_cast<long>(at),
                           ts.begin() + static_cast<long>(at + 188));
    android::sp<RingBuffer> input = ringOf("TS", 64u << 20);
    android::sp<RingBuffer> pes = ringOf("PES", 8u << 20);
    android::sp<RingBuffer> output = ringOf("Raw", 1u << 20);
    input->waitForSpace(static_cast<uint32_t>(packets.size()));
    memcpy(input->writePointer(), packets.data(), packets.size());
    input->commitWrite(static_cast<uint32_t>(packets.size()));
    android::sp<Synchronization> clock = new Synchronization();
    android::sp<TSParser> parser =
        new TSParser(video ? TSParser::KIND_VIDEO : TSParser::KIND_AUDIO);
    parser->setInput(input);
    parser->addOutput(pes, nullptr);
    parser->configure(clock);
    android::sp<MediaCodecDecoder> decoder = new MediaCodecDecoder();
    decoder->setInput(pes);
    decoder->addOutput(output, nullptr);
    decoder->configure(type);
    const long before = residentKb();
    Result result;
    const auto start = Clock::now();
    parser->start();
    decoder->start();
    auto last = start;
    size_t expectedHalf = 0;
    while (Clock::now() - last < std::chrono::seconds(2)) {
        if (!output->waitForData(sizeof(Data)))
            continue;
        last = Clock::now();
        auto* record = reinterpret_cast<Data*>(output->readPointer());
        if (record->mType == Data::TYPE_VIDEO_FRAME) {
            auto* frame = static_cast<VideoFrameData*>(record);
            frame->mListener->renderFrame(false, *frame);
        }
        output->consume(record->mSize);
        ++result.units;
        if (++expectedHalf == 60)
            result.steadyKb = residentKb() - before;
    }
    result.seconds = std::chrono::duration<double>(last - start).count();
    decoder->stop();
    parser->stop();
    return result;
}

double runFfmpeg(const std::string& path, const char* map, int threads) {
    const std::string command = "ffmpeg -v error -nostdin -threads " + std::to_string(threads) +
                                " -i " + path + " -map " + map + " -f null - 2>/dev/null";
    const auto start = Clock::now();
    if (system(command.c_str()) != 0)
        return 0;
    return std::chrono::duration<double>(Clock::now() - start).count();
}

long ffmpegMaxRssKb(const std::string& path, const char* map, int threads) {
    const std::string command = "ffmpeg -nostdin -benchmark -threads " + std::to_string(threads) +
                                " -i " + path + " -map " + map +
                                " -f null - 2>&1 | grep -o 'maxrss=[0-9]*'";
    FILE* pipe = popen(command.c_str(), "r");
    long kb = 0;
    if (pipe != nullptr) {
        if (fscanf(pipe, "maxrss=%ld", &kb) != 1)
            kb = 0;
        pclose(pipe);
    }
    return kb;
}

}  // namespace

int main() {
    setTraceLevel(TRACE_ERROR);
    const std::string dir = "/tmp/tavo_bench_mcd_" + std::to_string(getpid());
    const std::string tsgen = std::string(TAVO_BINARY_DIR) + "/apps/tsgen/tsgen";
    std::string cmd = "mkdir -p " + dir + " && " + tsgen + " -o " + dir +
                      "/v.ts -d 4 --audio none >/dev/null 2>&1 && " + tsgen + " -o " + dir +
                      "/aac.ts -d 30 --size 64x64 --audio latm >/dev/null 2>&1 && " + tsgen +
                      " -o " + dir + "/mp2.ts -d 30 --size 64x64 --audio mp2 >/dev/null 2>&1";
    if (system(cmd.c_str()) != 0) {
        fprintf(stderr, "tsgen failed\n");
        return 1;
    }
    const unsigned cores = std::thread::hardware_concurrency();
    const int threads = cores > 0 ? static_cast<int>(cores) : 1;
    setenv("TAVOPLAYER_PROP_tavoplayer_codec_threads", std::to_string(threads).c_str(), 1);

    const Result video = runModule(readFile(dir + "/v.ts"), 0x111, Decoder::CODING_H264);
    const double ffVideo = runFfmpeg(dir + "/v.ts", "0:v", threads);
    printf(
        "1080i H.264, %d threads: module %zu pictures in %.3f s (%.1f fps), ffmpeg %.3f s ratio "
        "%.2f\n",
        threads, video.units, video.seconds, video.units / video.seconds, ffVideo,
        ffVideo / video.seconds);
    printf(
        "resident memory growth of the video decoder in steady state: %ld kB; ffmpeg -threads %d "
        "whole process maxrss: %ld kB\n",
        video.steadyKb, threads, ffmpegMaxRssKb(dir + "/v.ts", "0:v", threads));

    const struct {
        const char* name;
        const char* file;
        Decoder::codingType_t type;
    } audio[] = {{"AAC LATM", "/aac.ts", Decoder::CODING_AAC_LATM},
                 {"MP2", "/mp2.ts", Decoder::CODING_MPEG_AUDIO}};
    for (const auto& a : audio) {
        const Result ours = runModule(readFile(dir + a.file), 0x112, a.type);
        const double theirs = runFfmpeg(dir + a.file, "0:a", 1);
        printf("%s 30 s: module %zu frames in %.3f s, ffmpeg %.3f s ratio %.2f\n", a.name,
               ours.units, ours.seconds, theirs, theirs / ours.seconds);
    }
    cmd = "rm -rf " + dir;
    return system(cmd.c_str()) == 0 ? 0 : 1;
}
