// tavoctl: drives the "TavoPlayer" service by hand or from a script. It registers
// its own callback binder, runs the commands given as arguments (one command per
// argument, e.g. 'open 5 MTV://...' or split words ending at the next command
// name) or read line by line from standard input, and prints every callback as it
// arrives. Commands whose result comes back as a callback (open, start, pause,
// resume, seek, capture) wait for it, so a script fails at the step that failed.
#include <unistd.h>

#include <chrono>
#include <cinttypes>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <iostream>
#include <map>
#include <mutex>
#include <sstream>
#include <string>
#include <vector>

#include "platform/binder/IServiceManager.h"
#include "platform/binder/ProcessState.h"
#include "platform/gui/Surface.h"
#include "platform/os/Trace.h"
#include "service/BnCTavoPlayerClient.h"
#include "service/ICTavoPlayer.h"
#include "tavoapps/CaptionText.h"
#include "tavoapps/PngWriter.h"

using android::sp;
using android::String16;
using TavoPlayer::ICTavoPlayer;

namespace {

constexpr auto kReplyWait = std::chrono::seconds(30);

// The callbacks: each is printed as "name(args)" on its own line and counted, so
// that commands and 'waitfor' can wait for one.
class Client : public TavoPlayer::BnCTavoPlayerClient {
public:
    // Waits until `name` has arrived more often than `seen` times; its last
    // arguments go to *args. False on time-out.
    bool waitFor(const std::string& name, size_t seen, std::chrono::milliseconds timeout,
                 std::vector<int32_t>* args = nullptr) {
        std::unique_lock<std::mutex> lock(mLock);
        const bool arrived = mArrived.wait_for(lock, timeout, [&] { return mCount[name] > seen; });
        if (arrived && args != nullptr)
            *args = mLast[name];
        return arrived;
    }
    size_t count(const std::string& name) {
        std::lock_guard<std::mutex> lock(mLock);
        return mCount[name];
    }
    // The next captured frame is saved to `path` (none: not saved) at that size.
    void setCapture(const std::string& path, int width, int height) {
        std::lock_guard<std::mutex> lock(mLock);
        mCapturePath = path;
        mCaptureWidth = width;
        mCaptureHeight = height;
    }
    std::string captureResult() {
        std::lock_guard<std::mutex> lock(mLock);
        return mCaptureResult;
    }

    void openUriComplete(int32_t s) override { event("openUriComplete", {s}); }
    void startComplete(int32_t s) override { event("startComplete", {s}); }
    void onCaptureFrame(uint8_t* data, int32_t w, int32_t h, int32_t flag) override {
        std::string path;
        int width = 0;
        int height = 0;
        {
            std::lock_guard<std::mutex> lock(mLock);
            path = mCapturePath;
            width = mCaptureWidth;
            height = mCaptureHeight;
            mCapturePath.clear();
        }
        std::string result = "not saved";
        if (!path.empty()) {
            result = flag != 0 ? "2-byte pixels are not written as PNG"
                               : tavoapps::writeArgbPng(path, data, w, h, width, height);
            if (result.empty())
                result = "saved " + path;
        }
        {
            std::lock_guard<std::mutex> lock(mLock);
            mCaptureResult = result;
        }
        event("onCaptureFrame", {w, h, flag}, result);
    }
    void onSignalStatusChanged(int32_t p, int32_t c) override {
        event("onSignalStatusChanged", {p, c});
    }
    void closedCaptionText(const uint8_t* text, int32_t length) override {
        event("closedCaptionText", {length}, "\"" + tavoapps::captionToUtf8(text, length) + "\"");
    }
    void onStopComplete(int32_t s) override { event("onStopComplete", {s}); }
    void onError(int32_t code) override { event("onError", {code}); }
    void onBufferingBegin() override { event("onBufferingBegin", {}); }
    void onBufferingEnd() override { event("onBufferingEnd", {}); }
    void onBuffering(int32_t p) override { event("onBuffering", {p}); }
    void onAudioSessionId(int32_t id) override { event("onAudioSessionId", {id}); }
    void onStartVideoTask(int32_t w, int32_t h) override { event("onStartVideoTask", {w, h}); }
    void onTimeUpdate(int32_t t) override { event("onTimeUpdate", {t}); }
    void onEndOfContent() override { event("onEndOfContent", {}); }
    void onRecorderStarted(int32_t s) override { event("onRecorderStarted", {s}); }
    void onRecorderStopped(int32_t s) override { event("onRecorderStopped", {s}); }
    void onPaused(int32_t s) override { event("onPaused", {s}); }
    void onResumed(int32_t s) override { event("onResumed", {s}); }
    void onSeeked(int32_t ms) override { event("onSeeked", {ms}); }

private:
    void event(const std::string& name, std::vector<int32_t> args, const std::string& extra = "") {
        std::string line = name + "(";
        for (size_t i = 0; i < args.size(); ++i)
            line += (i ? ", " : "") + std::to_string(args[i]);
        line += ")";
        if (!extra.empty())
            line += " " + extra;
        std::lock_guard<std::mutex> lock(mLock);
        std::printf("<- %s\n", line.c_str());
        std::fflush(stdout);
        ++mCount[name];
        mLast[name] = std::move(args);
        mArrived.notify_all();
    }

    std::mutex mLock;
    std::condition_variable mArrived;
    std::map<std::string, size_t> mCount;
    std::map<std::string, std::vector<int32_t>> mLast;
    std::string mCapturePath;
    int mCaptureWidth = 0;
    int mCaptureHeight = 0;
    std::string mCaptureResult;
};

struct Command {
    const char* name;
    const char* args;
    const char* help;
};

const Command kCommands[] = {
    {"open", "TYPE URI", "open a source: type 5 (MTV:// live or FILE:// clip), 0 (media file)"},
    {"start", "", "start playback, wait for startComplete"},
    {"pause", "", "pause, wait for onPaused"},
    {"resume", "", "resume, wait for onResumed"},
    {"seek", "MS", "seek a recorded clip or file, wait for onSeeked or onEndOfContent"},
    {"stop", "", "stop playback (in Closed the service ends itself, as designed)"},
    {"close", "", "close the source"},
    {"state", "", "print the player state"},
    {"surface", "", "give the service a surface (done by open when none was given)"},
    {"nosurface", "", "take the surface away"},
    {"capture", "W H [FILE.png]", "capture the shown frame, wait for it, save it W x H as PNG"},
    {"getframe", "A B", "send getFrame(A, B) as is (broadcast: A frames, B ms apart)"},
    {"record", "URI", "start recording the live stream"},
    {"stoprecord", "[FLAG]", "stop recording (FLAG 1 keeps, default 0)"},
    {"audiopid", "PID", "change the audio PID"},
    {"ccpid", "PID", "change or add the caption PID"},
    {"avsync", "V", "A/V offset, biased by 200 (200 = none)"},
    {"captionsync", "V", "caption offset (kept by the service)"},
    {"captionlang", "N", "caption language"},
    {"audioenable", "0|1", "audio output on or off"},
    {"audioonly", "0|1", "audio-only mode"},
    {"audiopath", "MODE", "force the audio path"},
    {"soundeffect", "EFFECT OPTION", "sound effect option (0..9)"},
    {"croprect", "A B C D E", "crop rectangle for the video decoder"},
    {"framerate", "", "print frames shown in the last second"},
    {"pcr", "", "print the current PCR (90 kHz)"},
    {"dump", "", "ask the service for its dump (needs the dump permission)"},
    {"wait", "SECONDS", "wait, printing callbacks"},
    {"waitfor", "CALLBACK [SECONDS]",
     "wait for a callback of that name not yet waited for (default 30 s)"},
};

void usage(FILE* out) {
    std::fprintf(out,
                 "Usage: tavoctl [--service-dir DIR] [COMMAND ...]\n"
                 "Runs each argument as a command ('open 5 MTV://...' quoted, or its words\n"
                 "as separate arguments); without commands, reads them line by line from\n"
                 "standard input. Callbacks print as '<- name(args)'. Exit status 1 when a\n"
                 "command fails, 2 on a usage error, 3 when the service cannot be reached.\n\n"
                 "Commands:\n");
    for (const Command& c : kCommands)
        std::fprintf(out, "  %-12s %-20s %s\n", c.name, c.args, c.help);
}

bool isCommand(const std::string& word) {
    for (const Command& c : kCommands)
        if (word == c.name)
            return true;
    return false;
}

class Session {
public:
    Session(sp<ICTavoPlayer> service, sp<Client> client)
        : mService(std::move(service)), mClient(std::move(client)) {}

    // Runs one command line; false when it failed.
    bool run(const std::string& line) {
        std::istringstream in(line);
        std::vector<std::string> w;
        for (std::string word; in >> word;)
            w.push_back(word);
        if (w.empty() || w[0][0] == '#')
            return true;
        std::printf("-> %s\n", line.c_str());
        std::fflush(stdout);
        const bool ok = dispatch(w);
        if (!ok)
            std::printf("!! %s failed\n", w[0].c_str());
        std::fflush(stdout);
        return ok;
    }

private:
    static bool toInt(const std::string& s, int32_t* out) {
        char* end = nullptr;
        errno = 0;
        const long v = std::strtol(s.c_str(), &end, 0);
        if (end == s.c_str() || *end != '\0' || errno != 0 || v < INT32_MIN || v > INT32_MAX)
            return false;
        *out = static_cast<int32_t>(v);
        return true;
    }
    bool ints(const std::vector<std::string>& w, size_t n, int32_t* out) {
        if (w.size() < n + 1) {
            std::fprintf(stderr, "tavoctl: %s needs %zu argument(s)\n", w[0].c_str(), n);
            return false;
        }
        for (size_t i = 0; i < n; ++i)
            if (!toInt(w[i + 1], &out[i])) {
                std::fprintf(stderr, "tavoctl: '%s' is not a number\n", w[i + 1].c_str());
                return false;
            }
        return true;
    }
    // Sends a command whose outcome arrives as `callback`; true when it came with a
    // first argument of 0 (or any argument when `anyValue`).
    bool callAndWait(const std::string& callback, const std::function<void()>& send,
                     bool anyValue = false) {
        const size_t seen = mClient->count(callback);
        send();
        std::vector<int32_t> args;
        if (!mClient->waitFor(callback, seen, kReplyWait, &args)) {
            std::fprintf(stderr, "tavoctl: no %s within %lld s\n", callback.c_str(),
                         static_cast<long long>(kReplyWait.count()));
            return false;
        }
        return anyValue || args.empty() || args[0] == 0;
    }
    bool giveSurface() {
        if (mSurface == nullptr)
            mSurface = android::Surface::create();
        return mService->setSurface(mSurface) == 0;
    }

    bool dispatch(const std::vector<std::string>& w) {
        const std::string& c = w[0];
        int32_t a[5] = {};
        if (c == "open") {
            if (w.size() < 3 || !toInt(w[1], &a[0])) {
                std::fprintf(stderr, "tavoctl: open needs TYPE URI\n");
                return false;
            }
            // Without a surface the service decodes but shows nothing and cannot
            // capture; a client always hands one over first.
            if (mSurface == nullptr && !giveSurface())
                return false;
            return callAndWait("openUriComplete", [&] { mService->openUri(w[2].c_str(), a[0]); });
        }
        if (c == "start")
            return callAndWait("startComplete", [&] { mService->start(); });
        if (c == "pause")
            return callAndWait("onPaused", [&] { mService->pause(); });
        if (c == "resume")
            return callAndWait("onResumed", [&] { mService->resume(); });
        if (c == "seek") {
            if (!ints(w, 1, a))
                return false;
            const size_t eoc = mClient->count("onEndOfContent");
            const bool done = callAndWait(
                "onSeeked", [&] { mService->seek(a[0]); }, true);
            return done || mClient->count("onEndOfContent") > eoc ? done : false;
        }
        if (c == "stop")
            return mService->stop() == 0;
        if (c == "close")
            return mService->close() == 0;
        if (c == "state") {
            static const char* const kNames[] = {"None", "Closed", "Stopped", "Playing", "Paused"};
            const uint32_t s = mService->getState();
            std::printf("state %u %s\n", s, s < 5 ? kNames[s] : "?");
            return true;
        }
        if (c == "surface")
            return giveSurface();
        if (c == "nosurface")
            return mService->setSurface(nullptr) == 0;
        if (c == "capture") {
            if (!ints(w, 2, a))
                return false;
            if (a[0] <= 0 || a[1] <= 0) {
                std::fprintf(stderr, "tavoctl: capture needs a positive size\n");
                return false;
            }
            mClient->setCapture(w.size() > 3 ? w[3] : "", a[0], a[1]);
            // The broadcast controller reads getFrame's arguments as a frame count
            // and an interval: one frame, now. The size is the PNG's.
            if (!callAndWait(
                    "onCaptureFrame", [&] { mService->getFrame(1, 0); }, true))
                return false;
            const std::string result = mClient->captureResult();
            return w.size() <= 3 || result.rfind("saved", 0) == 0;
        }
        if (c == "getframe")
            return ints(w, 2, a) && mService->getFrame(a[0], a[1]) == 0;
        if (c == "record")
            return w.size() > 1 && mService->startRecorder(w[1].c_str()) == 0;
        if (c == "stoprecord") {
            a[0] = 0;
            if (w.size() > 1 && !toInt(w[1], &a[0]))
                return false;
            return mService->stopRecorder(a[0]) == 0;
        }
        if (c == "audiopid")
            return ints(w, 1, a) && mService->setAudioPID(a[0]) == 0;
        if (c == "ccpid")
            return ints(w, 1, a) && mService->setCCPID(a[0]) == 0;
        if (c == "avsync")
            return ints(w, 1, a) && mService->setAVSync(a[0]) == 0;
        if (c == "captionsync")
            return ints(w, 1, a) && mService->setCaptionSync(a[0]) == 0;
        if (c == "captionlang")
            return ints(w, 1, a) && mService->setCaptionLanguage(a[0]) == 0;
        if (c == "audioenable")
            return ints(w, 1, a) && mService->setAudioEnable(a[0]) == 0;
        if (c == "audioonly")
            return ints(w, 1, a) && mService->setAudioOnlyMode(a[0]) == 0;
        if (c == "audiopath")
            return ints(w, 1, a) && mService->setAudioPathForce(a[0]) >= 0;
        if (c == "soundeffect")
            return ints(w, 2, a) && mService->setSoundEffect(a[0], a[1]) == 0;
        if (c == "croprect")
            return ints(w, 5, a) && mService->setCropRect(a[0], a[1], a[2], a[3], a[4]) == 0;
        if (c == "framerate") {
            std::printf("framerate %d\n", mService->getFrameRate());
            return true;
        }
        if (c == "pcr") {
            std::printf("pcr %" PRId64 "\n", mService->getPCRValue());
            return true;
        }
        if (c == "dump") {
            fflush(stdout);
            return android::IInterface::asBinder(mService)->dump(STDOUT_FILENO, {}) == android::OK;
        }
        if (c == "wait") {
            if (!ints(w, 1, a) || a[0] < 0)
                return false;
            mClient->waitFor("", SIZE_MAX, std::chrono::seconds(a[0]));
            return true;
        }
        if (c == "waitfor") {
            if (w.size() < 2 || (w.size() > 2 && !toInt(w[2], &a[0])))
                return false;
            const int32_t seconds = w.size() > 2 ? a[0] : 30;
            // A callback that came while an earlier command ran counts: scripts
            // cannot know whether it will come before or after they ask.
            size_t& waited = mWaited[w[1]];
            if (!mClient->waitFor(w[1], waited, std::chrono::seconds(seconds)))
                return false;
            waited = mClient->count(w[1]);
            return true;
        }
        std::fprintf(stderr, "tavoctl: unknown command '%s' (see --help)\n", c.c_str());
        return false;
    }

    sp<ICTavoPlayer> mService;
    sp<Client> mClient;
    sp<android::Surface> mSurface;
    std::map<std::string, size_t> mWaited;  // per callback: how many 'waitfor' consumed
};

}  // namespace

int main(int argc, char** argv) {
    std::vector<std::string> commands;
    for (int i = 1; i < argc; ++i) {
        const std::string arg = argv[i];
        if (arg == "-h" || arg == "--help") {
            usage(stdout);
            return 0;
        }
        if (arg == "--service-dir" && i + 1 < argc) {
            setenv("TAVOPLAYER_SERVICE_DIR", argv[++i], 1);
            continue;
        }
        // Words join the current command until the next command name, so both
        // 'tavoctl "seek 100"' and 'tavoctl seek 100' work.
        const std::string first = arg.substr(0, arg.find(' '));
        if (commands.empty() || isCommand(first))
            commands.push_back(arg);
        else
            commands.back() += " " + arg;
    }
    // The client's own surface object only stands for the window the service
    // draws into; it never shows anything in this process.
    setenv("TAVOPLAYER_PROP_tavoplayer_video_sink", "null", 1);

    sp<android::IBinder> binder =
        android::defaultServiceManager()->getService(String16("TavoPlayer"));
    sp<ICTavoPlayer> service = android::interface_cast<ICTavoPlayer>(binder);
    if (service == nullptr) {
        std::fprintf(stderr, "tavoctl: the TavoPlayer service is not running\n");
        return 3;
    }
    sp<Client> client = new Client();
    service->registerClient(client);
    Session session(service, client);

    bool ok = true;
    if (!commands.empty()) {
        for (const std::string& command : commands)
            if (!(ok = session.run(command)))
                break;
    } else {
        for (std::string line; ok && std::getline(std::cin, line);)
            ok = session.run(line);
    }
    android::ProcessState::self()->shutdown();
    return ok ? 0 : 1;
}
