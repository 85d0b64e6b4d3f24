// A long run of whole sessions against a real tavoplayerd: open, start, stop and
// close over the socket, 1,000 times by default, on a looping tsgen broadcast.
// The daemon's open descriptors, threads and resident memory are read from /proc
// after a warm-up and again after the run; the figures are printed, and the exit
// status is non-zero when descriptors or threads grew (a leak per session would
// show as at least one per cycle) or when a cycle failed.
//
// Usage: bench_ServiceCycles [CYCLES]
#include <cstdio>
#include <cstdlib>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "ServiceBenchHost.h"
#include "platform/os/Trace.h"

using namespace servicebench;
using namespace std::chrono_literals;

namespace {

constexpr const char* kLiveUri =
    "MTV://tuner/live?pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=1;subtitlePid=304;";
constexpr int kWarmUpCycles = 10;
// Threads of a stopped pipeline are joined, but libutils threads are detached and
// may take a moment to leave /proc; wait this long for the count to settle.
constexpr auto kSettle = 5s;

// One open/start/stop/close; the reason when a step fails.
std::string cycle(TavoPlayer::ICTavoPlayer& service, StampingClient& client) {
    client.reset();
    int32_t status = -1;
    service.openUri(kLiveUri, 5);
    if (!client.waitFor("openUriComplete", 10s, nullptr, &status) || status != 0)
        return "open failed (" + std::to_string(status) + ")";
    service.start();
    if (!client.waitFor("startComplete", 10s, nullptr, &status) || status != 0)
        return "start failed (" + std::to_string(status) + ")";
    if (service.stop() != 0)
        return "stop failed";
    if (service.close() != 0)
        return "close failed";
    return "";
}

// Brings the daemon's binder pool to its full size (threads start on demand, up to
// its bound) so that a pool thread started late in the run is not taken for a leak:
// while a stop holds the service's lock (it joins the pipeline's threads, the
// longest call of a cycle), further calls wait for the lock, each on a pool thread of
// its own; each goes once the one before it is blocked.
void fillBinderPool(TavoPlayer::ICTavoPlayer& service, StampingClient& client) {
    client.reset();
    service.openUri(kLiveUri, 5);
    client.waitFor("openUriComplete", 10s, nullptr);
    service.start();
    client.waitFor("startComplete", 10s, nullptr);
    std::thread stop([&service] { service.stop(); });
    std::vector<std::thread> waiting;
    for (int i = 0; i < 4; ++i) {
        std::this_thread::sleep_for(15ms);
        waiting.emplace_back([&service] { service.getFrameRate(); });
    }
    stop.join();
    for (std::thread& t : waiting)
        t.join();
    service.close();
}

ProcessFigures settled(pid_t pid, const ProcessFigures& baseline) {
    const auto deadline = Clock::now() + kSettle;
    ProcessFigures now = figuresOf(pid);
    while (Clock::now() < deadline &&
           (now.threads > baseline.threads || now.descriptors > baseline.descriptors)) {
        std::this_thread::sleep_for(100ms);
        now = figuresOf(pid);
    }
    return now;
}

}  // namespace

int main(int argc, char** argv) {
    const int cycles = argc > 1 ? std::atoi(argv[1]) : 1000;
    if (cycles <= 0) {
        std::fprintf(stderr, "usage: bench_ServiceCycles [CYCLES]\n");
        return 2;
    }
    setenv("TAVOPLAYER_LOG_LEVEL", "warning", 0);
    const fs::path dir = fs::temp_directory_path() / ("tavo-cycles-" + std::to_string(getpid()));
    fs::create_directories(dir);
    const fs::path ts = dir / "live.ts";
    if (!makeStream(ts, "-d 10 --caption 1:Um")) {
        std::fprintf(stderr, "bench_ServiceCycles: tsgen failed\n");
        return 2;
    }
    int result = 0;
    {
        ServiceHost host(dir, "file:" + ts.string() + "?loop=1");
        android::sp<TavoPlayer::ICTavoPlayer> service = host.connect();
        if (service == nullptr) {
            std::fprintf(stderr, "bench_ServiceCycles: tavoplayerd did not start (log in %s)\n",
                         dir.c_str());
            return 2;
        }
        android::sp<StampingClient> client = new StampingClient();
        service->registerClient(client);
        service->setSurface(android::Surface::create());

        std::string failure;
        for (int i = 0; i < kWarmUpCycles && failure.empty(); ++i)
            failure = cycle(*service, *client);
        fillBinderPool(*service, *client);
        std::this_thread::sleep_for(1s);
        const ProcessFigures before = figuresOf(host.pid());
        const auto started = Clock::now();
        int done = 0;
        for (; done < cycles && failure.empty(); ++done) {
            failure = cycle(*service, *client);
            if (!failure.empty())
                failure = "cycle " + std::to_string(done + 1) + ": " + failure;
        }
        const double seconds = std::chrono::duration<double>(Clock::now() - started).count();
        const ProcessFigures after = settled(host.pid(), before);

        std::printf("tavoplayerd over %d open/start/stop/close cycles (%.1f s, %.1f ms a cycle):\n",
                    done, seconds, done > 0 ? seconds * 1000 / done : 0.0);
        std::printf("  open descriptors  %ld before, %ld after\n", before.descriptors,
                    after.descriptors);
        std::printf("  threads           %ld before, %ld after\n", before.threads, after.threads);
        std::map<std::string, int> names = before.threadNames;
        for (const auto& [name, count] : after.threadNames)
            names.emplace(name, 0);
        for (const auto& [name, count] : names) {
            const int was = before.threadNames.count(name) ? before.threadNames.at(name) : 0;
            const int is = after.threadNames.count(name) ? after.threadNames.at(name) : 0;
            std::printf("    %-16s %d before, %d after\n", name.c_str(), was, is);
        }
        std::printf("  resident memory   %ld kB before, %ld kB after (%+ld kB, %+.1f%%)\n",
                    before.rssKb, after.rssKb, after.rssKb - before.rssKb,
                    before.rssKb > 0 ? 100.0 * (after.rssKb - before.rssKb) / before.rssKb : 0.0);
        if (!failure.empty()) {
            std::printf("FAILED: %s\n", failure.c_str());
            result = 1;
        }
        if (after.descriptors > before.descriptors || after.threads > before.threads) {
            std::printf("FAILED: the daemon kept descriptors or threads from its sessions\n");
            result = 1;
        }
        if (!host.alive()) {
            std::printf("FAILED: tavoplayerd is gone (log in %s)\n", dir.c_str());
            return 1;
        }
        android::ProcessState::self()->shutdown();
        const int exitStatus = host.stop();
        if (exitStatus != 0) {
            std::printf("FAILED: tavoplayerd exited %d on SIGTERM\n", exitStatus);
            result = 1;
        }
    }
    if (result == 0)
        fs::remove_all(dir);
    return result;
}
