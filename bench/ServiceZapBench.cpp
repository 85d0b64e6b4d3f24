// Zap time as a viewer's application sees it, next to the same pipeline driven in
// process, on one tsgen broadcast whose GOP is 15 pictures at 29.97 Hz (0.5 s),
// entered 0.25 s after an IDR picture:
//  - through the service: from the openUri call to the first onStartVideoTask
//    callback of a real tavoplayerd, over the socket transport (open, start, the
//    pipeline's first picture, the one-way callback);
//  - in process: from MainController::start() to the service controller's
//    START_VIDEO_TASK event, taken by a ServiceControllerListener.
// The two alternate, run by run, so that a slow moment of the machine falls on
// both. The medians are compared on one line ending with "ratio N.NN": the
// in-process time over the service's time (below 1: the service path costs more).
//
// Usage: bench_ServiceZap [RUNS]
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <map>
#include <string>
#include <vector>

#include "ServiceBenchHost.h"
#include "service/MainController.h"

using namespace servicebench;
using namespace std::chrono_literals;

namespace {

constexpr const char* kLiveUri =
    "MTV://tuner/live?pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=1;subtitlePid=304;";
constexpr auto kFirstPictureWait = 20s;

double msBetween(Clock::time_point from, Clock::time_point to) {
    return std::chrono::duration<double, std::milli>(to - from).count();
}

double median(std::vector<double> values) {
    std::sort(values.begin(), values.end());
    const size_t n = values.size();
    return n % 2 != 0 ? values[n / 2] : (values[n / 2 - 1] + values[n / 2]) / 2;
}

class VideoTaskWatch : public TavoPlayer::ServiceController::ServiceControllerListener {
public:
    void onServiceControllerEvent(TavoPlayer::ServiceController::event_t event, unsigned int,
                                  unsigned int) override {
        if (event != TavoPlayer::ServiceController::START_VIDEO_TASK_EVENT)
            return;
        std::lock_guard<std::mutex> lock(mLock);
        if (!mSeen) {
            mSeen = true;
            mAt = Clock::now();
        }
        mCv.notify_all();
    }
    bool wait(Clock::time_point* at) {
        std::unique_lock<std::mutex> lock(mLock);
        if (!mCv.wait_for(lock, kFirstPictureWait, [&] { return mSeen; }))
            return false;
        *at = mAt;
        return true;
    }

private:
    std::mutex mLock;
    std::condition_variable mCv;
    bool mSeen = false;
    Clock::time_point mAt;
};

// One zap in this process; negative when no picture came.
double zapInProcess() {
    std::map<std::string, std::string> config = {{"pcrPid", "273"},      {"videoPid", "273"},
                                                 {"audioPid", "274"},    {"IsLATMAudio", "1"},
                                                 {"subtitlePid", "304"}, {"sourceType", "0"}};
    android::sp<TavoPlayer::MainController> controller = new TavoPlayer::MainController();
    if (controller->configure(config) != 0)
        return -1;
    VideoTaskWatch watch;
    controller->setServiceControllerListener(&watch);
    android::sp<android::Surface> surface = android::Surface::create();
    controller->setSurface(surface);
    const Clock::time_point started = Clock::now();
    if (controller->start() != 0)
        return -1;
    Clock::time_point shown;
    const bool ok = watch.wait(&shown);
    controller->stop();
    return ok ? msBetween(started, shown) : -1;
}

// One zap through the service; negative when no picture came.
double zapThroughService(TavoPlayer::ICTavoPlayer& service, StampingClient& client) {
    client.reset();
    const Clock::time_point opened = Clock::now();
    service.openUri(kLiveUri, 5);
    int32_t status = -1;
    if (!client.waitFor("openUriComplete", 10s, nullptr, &status) || status != 0)
        return -1;
    service.start();
    Clock::time_point shown;
    const bool ok = client.waitFor("onStartVideoTask", kFirstPictureWait, &shown);
    service.stop();
    service.close();
    return ok ? msBetween(opened, shown) : -1;
}

}  // namespace

int main(int argc, char** argv) {
    const int runs = argc > 1 ? std::atoi(argv[1]) : 7;
    if (runs <= 0) {
        std::fprintf(stderr, "usage: bench_ServiceZap [RUNS]\n");
        return 2;
    }
    setenv("TAVOPLAYER_LOG_LEVEL", "warning", 0);
    const fs::path dir = fs::temp_directory_path() / ("tavo-zap-" + std::to_string(getpid()));
    fs::create_directories(dir);
    // A viewer tunes in at any moment, not at an IDR picture: both paths read the
    // broadcast from half-way into its first GOP, so the first picture waits for the
    // next IDR, as on air.
    const fs::path whole = dir / "whole.ts";
    const fs::path ts = dir / "live.ts";
    if (!makeStream(whole, "-d 8 --gop 15")) {
        std::fprintf(stderr, "bench_ServiceZap: tsgen failed\n");
        return 2;
    }
    {
        std::ifstream in(whole, std::ios::binary);
        const std::string bytes((std::istreambuf_iterator<char>(in)),
                                std::istreambuf_iterator<char>());
        const size_t quarterSecond = bytes.size() / (8 * 4) / 188 * 188;
        std::ofstream(ts, std::ios::binary) << bytes.substr(quarterSecond);
    }
    // The in-process pipeline reads the same file with the same null outputs.
    setenv("TAVOPLAYER_PROP_tavoplayer_demux_source", ("file:" + ts.string()).c_str(), 1);
    setenv("TAVOPLAYER_PROP_tavoplayer_audio_sink", "null", 1);
    ServiceHost host(dir, "file:" + ts.string());
    android::sp<TavoPlayer::ICTavoPlayer> service = host.connect();
    if (service == nullptr) {
        std::fprintf(stderr, "bench_ServiceZap: tavoplayerd did not start (log in %s)\n",
                     dir.c_str());
        return 2;
    }
    android::sp<StampingClient> client = new StampingClient();
    service->registerClient(client);
    service->setSurface(android::Surface::create());

    std::vector<double> viaService, inProcess;
    for (int i = 0; i < runs; ++i) {
        const double s = zapThroughService(*service, *client);
        const double p = zapInProcess();
        std::printf("run %d: service %.1f ms, in process %.1f ms\n", i + 1, s, p);
        if (s < 0 || p < 0) {
            std::printf("FAILED: no first picture within %lld s\n",
                        static_cast<long long>(kFirstPictureWait.count()));
            return 1;
        }
        viaService.push_back(s);
        inProcess.push_back(p);
    }
    const double ms = median(viaService);
    const double mp = median(inProcess);
    std::printf(
        "zap time over %d runs, GOP 0.5 s entered 0.25 s after an IDR: service (openUri to first "
        "onStartVideoTask) median "
        "%.1f ms, in process (MainController start to START_VIDEO_TASK) median %.1f ms; "
        "in-process time over service time, above 1 means the service zaps faster, below 1 "
        "that the service path costs more: ratio %.2f\n",
        runs, ms, mp, mp / ms);
    android::ProcessState::self()->shutdown();
    host.stop();
    fs::remove_all(dir);
    return 0;
}
