// What the file controller costs on top of the player library it drives: 30 s of a
// 1080p H.264/AAC MP4 played through MP4Controller with null video and audio outputs,
// next to the mpv program playing the same file the same way
// (mpv --no-config --vo=null --ao=null), in the same run. Each side is a child process
// of its own, so its CPU time (user + system) and peak resident size are the kernel's
// figures for that child alone. Both play in real time, paced by the null audio output.
//
//   bench_MP4Controller [--file=PATH] [--runs=N]
//
// Without --file, the file is made with the ffmpeg program in the build folder on
// first use. Ratios are mpv's cost over ours: above 1, the controller costs less.
#include <spawn.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "service/MP4Controller.h"

extern char** environ;

namespace {

using namespace TavoPlayer;

constexpr int kSeconds = 30;

struct Cost {
    double cpuSeconds = 0;
    double peakMiB = 0;
    bool ok = false;
};

class EndListener : public IPlayerListener, public ErrorListener {
public:
    void onEndOfContent() override { ended = true; }
    void onError(unsigned int, const Module*) const override { failed = true; }
    std::atomic<bool> ended{false};
    mutable std::atomic<bool> failed{false};
};

// The child's side: play the file to its end through the controller.
int play(const std::string& path) {
    EndListener listener;
    android::sp<MP4Controller> controller = new MP4Controller();
    controller->setPlayerListener(&listener);
    controller->setErrorListener(&listener);
    std::map<std::string, std::string> config{{"path", path}};
    controller->configure(config);
    controller->setAudioEnable(1);
    controller->start();
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(kSeconds * 3);
    while (!listener.ended && !listener.failed && std::chrono::steady_clock::now() < deadline)
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    controller->stop();
    controller.clear();
    return listener.ended ? 0 : 1;
}

Cost run(const std::vector<std::string>& args) {
    std::vector<char*> argv;
    for (const std::string& a : args)
        argv.push_back(const_cast<char*>(a.c_str()));
    argv.push_back(nullptr);
    pid_t pid = 0;
    Cost cost;
    if (posix_spawnp(&pid, argv[0], nullptr, nullptr, argv.data(), environ) != 0)
        return cost;
    int status = 0;
    struct rusage usage {};
    if (wait4(pid, &status, 0, &usage) != pid)
        return cost;
    cost.cpuSeconds = usage.ru_utime.tv_sec + usage.ru_utime.tv_usec / 1e6 + usage.ru_stime.tv_sec +
                      usage.ru_stime.tv_usec / 1e6;
    cost.peakMiB = usage.ru_maxrss / 1024.0;  // ru_maxrss is in KiB on Linux
    cost.ok = WIFEXITED(status) && WEXITSTATUS(status) == 0;
    return cost;
}

std::string makeFile() {
    const std::string dir = std::string(TAVO_BINARY_DIR) + "/bench-media";
    const std::string path = dir + "/h264-aac-1080p-30s.mp4";
    struct stat st {};
    if (stat(path.c_str(), &st) == 0 && st.st_size > 0)
        return path;
    mkdir(dir.c_str(), 0755);
    const std::string command =
        "ffmpeg -nostdin -hide_banner -loglevel error -y"
        " -f lavfi -i testsrc2=size=1920x1080:rate=25"
        " -f lavfi -i sine=frequency=440:sample_rate=48000 -t " +
        std::to_string(kSeconds) +
        " -c:v libx264 -preset veryfast -b:v 8M -g 50 -pix_fmt yuv420p"
        " -c:a aac -b:a 128k -ac 2 -shortest -f mp4 '" +
        path + ".part' && mv '" + path + ".part' '" + path + "'";
    fprintf(stderr, "making %s with ffmpeg...\n", path.c_str());
    return system(command.c_str()) == 0 ? path : std::string();
}

double median(std::vector<double> v) {
    std::sort(v.begin(), v.end());
    return v.empty() ? 0 : v[(v.size() - 1) / 2];
}

}  // namespace

int main(int argc, char** argv) {
    std::string file;
    int runs = 1;
    for (int i = 1; i < argc; ++i) {
        const std::string arg = argv[i];
        if (arg.rfind("--play=", 0) == 0)
            return play(arg.substr(7));
        if (arg.rfind("--file=", 0) == 0)
            file = arg.substr(7);
        else if (arg.rfind("--runs=", 0) == 0)
            runs = std::max(1, atoi(arg.c_str() + 7));
    }
    // Null outputs for the controller's player, as mpv gets --vo=null --ao=null.
    setenv("TAVOPLAYER_PROP_tavoplayer_video_sink", "null", 1);
    setenv("TAVOPLAYER_PROP_tavoplayer_audio_sink", "null", 1);
    setenv("TAVOPLAYER_LOG_LEVEL", "warning", 1);
    if (file.empty())
        file = makeFile();
    if (file.empty()) {
        fprintf(stderr, "no input file (is ffmpeg installed?)\n");
        return 1;
    }
    char self[4096] = {};
    if (readlink("/proc/self/exe", self, sizeof self - 1) <= 0)
        return 1;
    printf("file=%s\n", file.c_str());

    std::vector<double> oursCpu, oursMem, mpvCpu, mpvMem;
    for (int i = 0; i < runs; ++i) {
        const Cost ours = run({self, "--play=" + file});
        const Cost mpv =
            run({"mpv", "--no-config", "--vo=null", "--ao=null", "--really-quiet", file});
        if (!ours.ok || !mpv.ok) {
            fprintf(stderr, "run %d failed (controller %d, mpv %d)\n", i + 1, ours.ok, mpv.ok);
            return 1;
        }
        printf("run %d: MP4Controller cpu %.2f s peak %.1f MiB; mpv cpu %.2f s peak %.1f MiB\n",
               i + 1, ours.cpuSeconds, ours.peakMiB, mpv.cpuSeconds, mpv.peakMiB);
        oursCpu.push_back(ours.cpuSeconds);
        oursMem.push_back(ours.peakMiB);
        mpvCpu.push_back(mpv.cpuSeconds);
        mpvMem.push_back(mpv.peakMiB);
    }
    const double cpu = median(oursCpu), cpuPeer = median(mpvCpu);
    const double mem = median(oursMem), memPeer = median(mpvMem);
    printf("CPU for %d s of 1080p H.264/AAC, MP4Controller %.2f s vs mpv %.2f s: ratio %.2f\n",
           kSeconds, cpu, cpuPeer, cpuPeer / cpu);
    printf("peak memory, MP4Controller %.1f MiB vs mpv %.1f MiB: ratio %.2f\n", mem, memPeer,
           memPeer / mem);
    return 0;
}
