// What the service benchmarks share: a tavoplayerd of their own on a tsgen stream,
// a client that stamps each callback as it arrives, and the figures of a process
// read from /proc (open descriptors, threads, resident memory).
#pragma once

#include <dirent.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <mutex>
#include <string>
#include <thread>

#include "platform/binder/IServiceManager.h"
#include "platform/binder/ProcessState.h"
#include "platform/gui/Surface.h"
#include "service/BnCTavoPlayerClient.h"
#include "service/ICTavoPlayer.h"

namespace servicebench {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

// tavoplayerd on one demux source, in a service directory of its own.
class ServiceHost {
public:
    // `demuxSource` is the tavoplayer.demux.source property, e.g. "file:/x.ts?loop=1".
    ServiceHost(const fs::path& dir, const std::string& demuxSource) : mDir(dir) {
        const fs::path svc = dir / "svc";
        mPid = fork();
        if (mPid == 0) {
            setenv("TAVOPLAYER_SERVICE_DIR", svc.c_str(), 1);
            setenv("TAVOPLAYER_PROP_tavoplayer_demux_source", demuxSource.c_str(), 1);
            setenv("TAVOPLAYER_PROP_tavoplayer_video_sink", "null", 1);
            setenv("TAVOPLAYER_PROP_tavoplayer_audio_sink", "null", 1);
            if (std::freopen((dir / "tavoplayerd.log").c_str(), "w", stderr) == nullptr)
                _exit(126);
            const std::string daemon = TAVO_BINARY_DIR "/apps/tavoplayerd/tavoplayerd";
            execl(daemon.c_str(), daemon.c_str(), "--log-level", "warning", nullptr);
            _exit(127);
        }
        setenv("TAVOPLAYER_SERVICE_DIR", svc.c_str(), 1);
        // The client's surface object only stands for the service's window.
        setenv("TAVOPLAYER_PROP_tavoplayer_video_sink", "null", 1);
        for (int i = 0; i < 200 && !fs::exists(svc / "TavoPlayer"); ++i)
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }
    ~ServiceHost() { stop(); }

    pid_t pid() const { return mPid; }
    bool alive() const { return mPid > 0 && kill(mPid, 0) == 0; }
    // SIGTERM and the exit status (-1 when it did not exit by itself).
    int stop() {
        if (mPid <= 0)
            return -1;
        kill(mPid, SIGTERM);
        int status = 0;
        waitpid(mPid, &status, 0);
        mPid = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }

    android::sp<TavoPlayer::ICTavoPlayer> connect() const {
        android::sp<android::IBinder> binder =
            android::defaultServiceManager()->getService(android::String16("TavoPlayer"));
        return android::interface_cast<TavoPlayer::ICTavoPlayer>(binder);
    }

private:
    fs::path mDir;
    pid_t mPid = -1;
};

// A client that keeps the arrival time of the latest call of each callback.
class StampingClient : public TavoPlayer::BnCTavoPlayerClient {
public:
    // Forgets every callback seen so far.
    void reset() {
        std::lock_guard<std::mutex> lock(mLock);
        mSeen.clear();
    }
    // Waits up to `timeout` for `name`; its arrival time and first argument.
    bool waitFor(const std::string& name, std::chrono::milliseconds timeout, Clock::time_point* at,
                 int32_t* arg = nullptr) {
        std::unique_lock<std::mutex> lock(mLock);
        if (!mCv.wait_for(lock, timeout, [&] { return mSeen.count(name) != 0; }))
            return false;
        if (at != nullptr)
            *at = mSeen[name].first;
        if (arg != nullptr)
            *arg = mSeen[name].second;
        return true;
    }

    void openUriComplete(int32_t s) override { seen("openUriComplete", s); }
    void startComplete(int32_t s) override { seen("startComplete", s); }
    void onCaptureFrame(uint8_t*, int32_t, int32_t, int32_t) override {}
    void onSignalStatusChanged(int32_t, int32_t current) override { seen("signal", current); }
    void closedCaptionText(const uint8_t*, int32_t) override {}
    void onStopComplete(int32_t) override {}
    void onError(int32_t code) override { seen("onError", code); }
    void onBufferingBegin() override {}
    void onBufferingEnd() override {}
    void onBuffering(int32_t) override {}
    void onAudioSessionId(int32_t) override {}
    void onStartVideoTask(int32_t w, int32_t) override { seen("onStartVideoTask", w); }
    void onTimeUpdate(int32_t) override {}
    void onEndOfContent() override {}
    void onRecorderStarted(int32_t) override {}
    void onRecorderStopped(int32_t) override {}
    void onPaused(int32_t) override {}
    void onResumed(int32_t) override {}
    void onSeeked(int32_t) override {}

private:
    void seen(const char* name, int32_t arg) {
        const Clock::time_point now = Clock::now();
        std::lock_guard<std::mutex> lock(mLock);
        // The first arrival counts: onStartVideoTask comes both from the first frame
        // rendered and from the service controller's event.
        mSeen.emplace(name, std::make_pair(now, arg));
        mCv.notify_all();
    }
    std::mutex mLock;
    std::condition_variable mCv;
    std::map<std::string, std::pair<Clock::time_point, int32_t>> mSeen;
};

struct ProcessFigures {
    long descriptors = -1;
    long threads = -1;
    long rssKb = -1;
    std::map<std::string, int> threadNames;  // name -> how many threads carry it
};

inline long countEntries(const std::string& dir) {
    DIR* d = opendir(dir.c_str());
    if (d == nullptr)
        return -1;
    long n = 0;
    while (dirent* e = readdir(d))
        if (e->d_name[0] != '.')
            ++n;
    closedir(d);
    return n;
}

inline ProcessFigures figuresOf(pid_t pid) {
    ProcessFigures f;
    const std::string proc = "/proc/" + std::to_string(pid);
    f.descriptors = countEntries(proc + "/fd");
    f.threads = countEntries(proc + "/task");
    std::error_code ec;
    for (const auto& task : fs::directory_iterator(proc + "/task", ec)) {
        std::ifstream comm(task.path() / "comm");
        std::string name;
        if (std::getline(comm, name))
            ++f.threadNames[name];
    }
    std::ifstream status(proc + "/status");
    for (std::string line; std::getline(status, line);)
        if (line.rfind("VmRSS:", 0) == 0)
            f.rssKb = std::atol(line.c_str() + 6);
    return f;
}

// Makes a tsgen stream; false (with tsgen's output left on stderr) when it fails.
inline bool makeStream(const fs::path& file, const std::string& options) {
    const std::string command = std::string(TAVO_BINARY_DIR "/apps/tsgen/tsgen -o ") +
                                file.string() + " " + options + " >/dev/null";
    return std::system(command.c_str()) == 0;
}

}  // namespace servicebench
