// tavoplay: watch a broadcast with one command. It reads the source's PAT and PMT
// to find the programme, starts a private tavoplayerd on that source, opens the
// "MTV" URI, starts playback and shows what the service reports: captions as they
// arrive and a status line (state, signal, buffering, frame rate, time).
//
// Exit status, as mpv's: 0 at the end of the stream or on quit, 1 when the service
// fails or dies, 2 when the source cannot be played (with a one-line reason).
#include <arpa/inet.h>
#include <fcntl.h>
#include <getopt.h>
#include <netinet/in.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <mutex>
#include <string>
#include <thread>

#include "DvbTuner.h"
#include "StreamProbe.h"
#include "platform/binder/IServiceManager.h"
#include "platform/binder/ProcessState.h"
#include "platform/gui/Surface.h"
#include "service/BnCTavoPlayerClient.h"
#include "service/ICTavoPlayer.h"
#include "tavoapps/CaptionText.h"
#include "tavoapps/PngWriter.h"

using android::sp;
using tavoplay::AudioCoding;
using tavoplay::ProbedProgram;
namespace fs = std::filesystem;

namespace {

constexpr size_t kProbeLimit = 16 << 20;  // a PAT/PMT period is well under this
// A frontend locks within a second or two when the signal is there at all.
constexpr auto kLockWait = std::chrono::seconds(5);
constexpr auto kQuietWait = std::chrono::seconds(5);

[[noreturn]] void fail(int status, const std::string& reason) {
    std::fprintf(stderr, "tavoplay: %s\n", reason.c_str());
    std::exit(status);
}

void usage(FILE* out) {
    std::fprintf(out,
                 "Usage: tavoplay [OPTIONS] SOURCE\n"
                 "Plays the first programme (or --program N) of SOURCE: a TS file,\n"
                 "udp://GROUP:PORT, dvb:ADAPTER[.DEMUX] (a DVB tuner) or - (standard input).\n\n"
                 "  -p, --program N   programme number to play\n"
                 "      --channel NAME  with dvb:, tune the frontend to this channel of the\n"
                 "                    --channels file first; its SERVICE_ID is the\n"
                 "                    programme unless --program says otherwise. Without\n"
                 "                    it the frontend must be tuned already (dvbv5-zap)\n"
                 "      --channels FILE  dvbv5 channel file, as dvbv5-scan writes it\n"
                 "      --headless    null video and audio outputs (chosen by itself when\n"
                 "                    there is no display or no sound card)\n"
                 "      --loop        play a file again and again\n"
                 "      --probe       print the programme found and its MTV URI, then exit\n"
                 "      --service DIR  play through the tavoplayerd already serving in DIR\n"
                 "                    (the system one: /run/tavoplayer) instead of a private\n"
                 "                    one; that service reads its own source, so SOURCE must\n"
                 "                    be what it reads (typically its tuner, dvb:N)\n"
                 "  -h, --help        this text\n\n"
                 "Keys: space pause/resume, c capture to PNG, r record on/off,\n"
                 "      a next audio PID, s captions on/off, q quit.\n"
                 "Exit status: 0 end or quit, 1 the service failed or died, 2 cannot play\n"
                 "SOURCE (or tune it: unknown channel, bad channel file, no adapter, no lock).\n");
}

// What the service reported, shown on one status line.
class Viewer : public TavoPlayer::BnCTavoPlayerClient {
public:
    std::atomic<int> openStatus{-1};
    std::atomic<int> startStatus{-1};
    std::atomic<int> signal{0};
    std::atomic<bool> signalLost{false};
    std::atomic<bool> captionsOn{true};
    std::atomic<int> errorCode{0};

    void status(const char* state, int frameRate) {
        std::lock_guard<std::mutex> lock(mLock);
        static const char* const kSignal[] = {"good", "late", "lost"};
        const int s = signal.load();
        std::fprintf(stderr, "\r[%s] signal %s, buffering %d%%, %d fps, video %dx%d   ", state,
                     s >= 0 && s < 3 ? kSignal[s] : "?", mBuffering, frameRate, mWidth, mHeight);
        std::fflush(stderr);
    }

    void openUriComplete(int32_t s) override { openStatus = s; }
    void startComplete(int32_t s) override { startStatus = s; }
    // The captured picture, as the service shows it, goes to capture-N.png in the
    // working folder.
    void onCaptureFrame(uint8_t* pixels, int32_t w, int32_t h, int32_t flag) override {
        const std::string path = "capture-" + std::to_string(++mCaptures) + ".png";
        const std::string why = flag != 0 || pixels == nullptr
                                    ? "not a 32-bit picture"
                                    : tavoapps::writeArgbPng(path, pixels, w, h, w, h);
        if (why.empty())
            line("captured a %dx%d frame to %s", w, h, path.c_str());
        else
            line("capture not saved: %s", why.c_str());
    }
    void onSignalStatusChanged(int32_t, int32_t current) override {
        signal = current;
        if (current == 2)
            signalLost = true;
    }
    void closedCaptionText(const uint8_t* text, int32_t length) override {
        if (captionsOn)
            line("caption: %s", tavoapps::captionToUtf8(text, length).c_str());
    }
    void onStopComplete(int32_t) override {}
    void onError(int32_t code) override {
        errorCode = code;
        line("service error 0x%x", static_cast<unsigned>(code));
    }
    void onBufferingBegin() override { setBuffering(0); }
    void onBufferingEnd() override { setBuffering(100); }
    void onBuffering(int32_t p) override { setBuffering(p); }
    void onAudioSessionId(int32_t) override {}
    void onStartVideoTask(int32_t w, int32_t h) override {
        std::lock_guard<std::mutex> lock(mLock);
        mWidth = w;
        mHeight = h;
    }
    void onTimeUpdate(int32_t) override {}
    void onEndOfContent() override { line("end of content"); }
    void onRecorderStarted(int32_t s) override { line("recording started (%d)", s); }
    void onRecorderStopped(int32_t s) override { line("recording stopped (%d)", s); }
    void onPaused(int32_t) override {}
    void onResumed(int32_t) override {}
    void onSeeked(int32_t) override {}

    template <typename... Args>
    void line(const char* format, Args... args) {
        std::lock_guard<std::mutex> lock(mLock);
        std::fprintf(stderr, "\r\033[K");
        std::printf(format, args...);
        std::printf("\n");
        std::fflush(stdout);
    }

private:
    void setBuffering(int p) {
        std::lock_guard<std::mutex> lock(mLock);
        mBuffering = p;
    }
    std::mutex mLock;
    int mBuffering = 0;
    int mWidth = 0;
    int mHeight = 0;
    std::atomic<int> mCaptures{0};
};

// Reads the start of the source into the probe. For '-', the bytes read are kept:
// they go to the service first.
std::string probeSource(const std::string& source, tavoplay::StreamProbe& probe,
                        std::string* consumed) {
    std::vector<uint8_t> buffer(64 * 1024);
    size_t total = 0;
    if (source.rfind("udp://", 0) == 0) {
        const std::string hostPort = source.substr(6);
        const size_t colon = hostPort.rfind(':');
        if (colon == std::string::npos)
            return "udp source needs GROUP:PORT";
        const std::string host = hostPort.substr(0, colon);
        const int port = std::atoi(hostPort.c_str() + colon + 1);
        const int fd = socket(AF_INET, SOCK_DGRAM, 0);
        int one = 1;
        setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &one, sizeof one);
        sockaddr_in addr{};
        addr.sin_family = AF_INET;
        addr.sin_port = htons(static_cast<uint16_t>(port));
        in_addr group{};
        if (inet_pton(AF_INET, host.c_str(), &group) != 1) {
            ::close(fd);
            return "udp source needs a numeric IPv4 address";
        }
        const bool multicast = (ntohl(group.s_addr) >> 28) == 14;
        addr.sin_addr.s_addr = multicast ? group.s_addr : htonl(INADDR_ANY);
        if (bind(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0) {
            ::close(fd);
            return "cannot listen on " + source + ": " + std::strerror(errno);
        }
        if (multicast) {
            ip_mreq mreq{};
            mreq.imr_multiaddr = group;
            setsockopt(fd, IPPROTO_IP, IP_ADD_MEMBERSHIP, &mreq, sizeof mreq);
        }
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(5);
        bool done = false;
        while (!done && total < kProbeLimit && std::chrono::steady_clock::now() < deadline) {
            pollfd p{fd, POLLIN, 0};
            if (poll(&p, 1, 200) <= 0)
                continue;
            const ssize_t n = recv(fd, buffer.data(), buffer.size(), 0);
            if (n > 0) {
                total += static_cast<size_t>(n);
                done = probe.feed(buffer.data(), static_cast<size_t>(n));
            }
        }
        ::close(fd);
        if (total == 0)
            return "nothing arrived on " + source + " within 5 s";
        return "";
    }
    const bool isStdin = source == "-";
    const int fd = isStdin ? STDIN_FILENO : open(source.c_str(), O_RDONLY);
    if (fd < 0)
        return "cannot open " + source + ": " + std::strerror(errno);
    bool done = false;
    while (!done && total < kProbeLimit) {
        const ssize_t n = read(fd, buffer.data(), buffer.size());
        if (n <= 0)
            break;
        total += static_cast<size_t>(n);
        if (isStdin)
            consumed->append(reinterpret_cast<const char*>(buffer.data()), static_cast<size_t>(n));
        done = probe.feed(buffer.data(), static_cast<size_t>(n));
    }
    if (!isStdin)
        ::close(fd);
    return "";
}

// The tavoplayerd beside this program (build tree or installed), else from PATH.
std::string daemonPath(const char* argv0) {
    std::error_code ec;
    const fs::path self = fs::canonical("/proc/self/exe", ec);
    for (const fs::path& candidate :
         {self.parent_path() / "tavoplayerd",
          self.parent_path().parent_path() / "tavoplayerd" / "tavoplayerd"})
        if (!ec && access(candidate.c_str(), X_OK) == 0)
            return candidate.string();
    (void)argv0;
    return "tavoplayerd";
}

bool haveSoundCard() {
    FILE* cards = std::fopen("/proc/asound/cards", "r");
    if (cards == nullptr)
        return false;
    char line[256] = {};
    const bool any = std::fgets(line, sizeof line, cards) != nullptr &&
                     std::strstr(line, "no soundcards") == nullptr;
    std::fclose(cards);
    return any;
}

struct RawTerminal {
    termios saved{};
    bool active = false;
    RawTerminal() {
        if (!isatty(STDIN_FILENO) || tcgetattr(STDIN_FILENO, &saved) != 0)
            return;
        termios raw = saved;
        raw.c_lflag &= static_cast<tcflag_t>(~(ICANON | ECHO));
        raw.c_cc[VMIN] = 0;
        raw.c_cc[VTIME] = 0;
        active = tcsetattr(STDIN_FILENO, TCSANOW, &raw) == 0;
    }
    ~RawTerminal() {
        if (active)
            tcsetattr(STDIN_FILENO, TCSANOW, &saved);
    }
};

std::atomic<bool> gQuit{false};

// Set when a running service's connection goes away.
struct DeathFlag : android::IBinder::DeathRecipient {
    void binderDied(const android::wp<android::IBinder>&) override { dead = true; }
    std::atomic<bool> dead{false};
};

// Starts a tavoplayerd of this program's own on `source`, with its socket folder and log
// in `dir`; standard input (what the probe read first) is forwarded to it for "-".
pid_t startPrivateService(const std::string& dir, const std::string& source,
                          const std::string& consumed, bool loop, bool isDvb,
                          const std::string& videoSink, const std::string& audioSink,
                          const char* argv0) {
    std::string demux;
    if (source == "-")
        demux = "stdin";
    else if (source.rfind("udp://", 0) == 0 || isDvb)
        demux = source;
    else
        demux = "file:" + fs::absolute(source).string() + (loop ? "?loop=1" : "");
    int feed[2] = {-1, -1};
    if (source == "-" && pipe(feed) != 0)
        fail(1, "cannot make a pipe");
    const pid_t daemon = fork();
    if (daemon == 0) {
        // The private service goes with this program, however it ends.
        prctl(PR_SET_PDEATHSIG, SIGTERM);
        setenv("TAVOPLAYER_SERVICE_DIR", (dir + "/svc").c_str(), 1);
        setenv("TAVOPLAYER_PROP_tavoplayer_demux_source", demux.c_str(), 1);
        setenv("TAVOPLAYER_PROP_tavoplayer_video_sink", videoSink.c_str(), 1);
        if (!audioSink.empty())
            setenv("TAVOPLAYER_PROP_tavoplayer_audio_sink", audioSink.c_str(), 1);
        if (getenv("TAVOPLAYER_PROP_tavoplayer_recordings_dir") == nullptr)
            setenv("TAVOPLAYER_PROP_tavoplayer_recordings_dir", (dir + "/recordings").c_str(), 1);
        if (feed[0] >= 0) {
            dup2(feed[0], STDIN_FILENO);
            ::close(feed[0]);
            ::close(feed[1]);
        } else {
            const int null = open("/dev/null", O_RDONLY);
            dup2(null, STDIN_FILENO);
        }
        const int log =
            open((dir + "/tavoplayerd.log").c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
        dup2(log, STDERR_FILENO);
        const std::string path = daemonPath(argv0);
        execlp(path.c_str(), path.c_str(), "--log-level", "warning", nullptr);
        _exit(127);
    }
    if (daemon < 0)
        fail(1, "cannot start tavoplayerd");
    std::thread pump;
    if (feed[1] >= 0) {
        ::close(feed[0]);
        // Standard input goes on to the service: first what the probe read.
        pump = std::thread([&consumed, out = feed[1]] {
            signal(SIGPIPE, SIG_IGN);
            if (write(out, consumed.data(), consumed.size()) >= 0) {
                char buffer[65536];
                ssize_t n;
                while (!gQuit && (n = read(STDIN_FILENO, buffer, sizeof buffer)) > 0)
                    if (write(out, buffer, static_cast<size_t>(n)) != n)
                        break;
            }
            ::close(out);
        });
        pump.detach();
    }
    return daemon;
}

}  // namespace

int main(int argc, char** argv) {
    static const option kOptions[] = {{"program", required_argument, nullptr, 'p'},
                                      {"headless", no_argument, nullptr, 'H'},
                                      {"loop", no_argument, nullptr, 'L'},
                                      {"probe", no_argument, nullptr, 'P'},
                                      {"channels", required_argument, nullptr, 'C'},
                                      {"channel", required_argument, nullptr, 'N'},
                                      {"service", required_argument, nullptr, 'S'},
                                      {"help", no_argument, nullptr, 'h'},
                                      {nullptr, 0, nullptr, 0}};
    int program = 0;
    bool headless = false;
    bool loop = false;
    bool probeOnly = false;
    std::string channelsFile;
    std::string channel;
    std::string serviceDir;
    int opt;
    while ((opt = getopt_long(argc, argv, "p:h", kOptions, nullptr)) != -1) {
        switch (opt) {
            case 'p':
                program = std::atoi(optarg);
                if (program <= 0 || program > 0xFFFF)
                    fail(2, std::string("bad programme number '") + optarg + "'");
                break;
            case 'H':
                headless = true;
                break;
            case 'L':
                loop = true;
                break;
            case 'P':
                probeOnly = true;
                break;
            case 'C':
                channelsFile = optarg;
                break;
            case 'N':
                channel = optarg;
                break;
            case 'S':
                serviceDir = optarg;
                break;
            case 'h':
                usage(stdout);
                return 0;
            default:
                usage(stderr);
                return 2;
        }
    }
    if (optind != argc - 1) {
        usage(stderr);
        return 2;
    }
    const std::string source = argv[optind];
    // Lines as they happen, in order with the status line on standard error, also
    // when the output goes to a pipe or a file.
    std::setvbuf(stdout, nullptr, _IOLBF, 0);
    // This process's own messages (and the service's, in its log) stay out of the
    // picture unless asked for.
    setenv("TAVOPLAYER_LOG_LEVEL", "warning", 0);
    const bool isDvb = source.rfind("dvb:", 0) == 0;
    tavoplay::DvbAddress dvb;
    if (isDvb && !tavoplay::parseDvbSource(source, &dvb))
        fail(2, source + ": a DVB source is dvb:ADAPTER or dvb:ADAPTER.DEMUX");
    if (!channel.empty() && channelsFile.empty())
        fail(2, "--channel needs --channels FILE");
    if (!channel.empty() && !isDvb)
        fail(2, "--channel tunes a dvb: source only");
    if (!serviceDir.empty() && source == "-")
        fail(2, "standard input cannot reach a running service; play it without --service");

    // 0. The tuner, when asked to tune: it stays tuned while this process runs.
    tavoplay::DvbTuner tuner;
    if (!channel.empty()) {
        std::string why = tuner.findChannel(channelsFile, channel);
        if (why.empty())
            why = tuner.tune(dvb, kLockWait);
        if (!why.empty())
            fail(2, source + ": " + why);
        if (program == 0)
            program = tuner.serviceId();
        std::printf("tuned adapter %d to '%s'\n", dvb.adapter, channel.c_str());
    }

    // 1. The programme.
    tavoplay::StreamProbe probe(static_cast<uint16_t>(program));
    std::string consumed;
    std::string reason =
        isDvb ? tavoplay::readDvbStream(
                    dvb, kQuietWait, kProbeLimit,
                    [&probe](const uint8_t* data, size_t size) { return probe.feed(data, size); })
              : probeSource(source, probe, &consumed);
    ProbedProgram found;
    if (reason.empty())
        reason = probe.finish(&found);
    if (!reason.empty())
        fail(2, source + ": " + reason);
    std::printf(
        "programme %u: video PID %u, audio PID %s%s, captions %s, PCR %s\n", found.programNumber,
        found.videoPid,
        found.audioPids.empty() ? "none" : std::to_string(found.audioPids[0]).c_str(),
        found.audioPids.empty()
            ? ""
            : (std::string(" ") + tavoplay::codingName(found.audioCoding) +
               (found.audioCodingFromPayload ? " (from the payload; the PMT differs)" : ""))
                  .c_str(),
        found.captionPid ? std::to_string(found.captionPid).c_str() : "none",
        found.pcrPid == 0x1FFF ? "none (playing on PTS)" : std::to_string(found.pcrPid).c_str());

    if (probeOnly) {
        std::printf("%s\n", found.uri().c_str());
        return 0;
    }

    // 2. Outputs.
    std::string videoSink = "sdl";
    std::string audioSink;  // the audio track's own default
    // A running service keeps the outputs it was started with.
    if (serviceDir.empty() && (headless || getenv("DISPLAY") == nullptr || !haveSoundCard())) {
        if (!headless)
            std::printf("no %s here: playing to the null outputs\n",
                        getenv("DISPLAY") == nullptr ? "display" : "sound card");
        if (headless || getenv("DISPLAY") == nullptr)
            videoSink = "null";
        if (headless || !haveSoundCard())
            audioSink = "null";
    }

    // 3. A private service on this source, or the running one asked for.
    pid_t daemon = -1;
    std::string dir;
    if (!serviceDir.empty()) {
        std::printf("playing through the service in %s, which reads its own source\n",
                    serviceDir.c_str());
    } else {
        char dirTemplate[] = "/tmp/tavoplay-XXXXXX";
        if (mkdtemp(dirTemplate) == nullptr)
            fail(1, std::string("cannot make a service directory: ") + std::strerror(errno));
        dir = dirTemplate;
        daemon =
            startPrivateService(dir, source, consumed, loop, isDvb, videoSink, audioSink, argv[0]);
    }
    setenv("TAVOPLAYER_SERVICE_DIR", (serviceDir.empty() ? dir + "/svc" : serviceDir).c_str(), 1);
    setenv("TAVOPLAYER_PROP_tavoplayer_video_sink", "null", 1);  // our own stand-in only
    auto cleanUp = [&](int status) {
        gQuit = true;
        if (daemon > 0) {
            kill(daemon, SIGTERM);
            waitpid(daemon, nullptr, 0);
            fs::remove_all(dir + "/svc");
            std::error_code ec;
            fs::remove(dir + "/tavoplayerd.log", ec);
            fs::remove(dir, ec);  // keeps recordings made here
        }
        std::exit(status);
    };

    sp<android::IBinder> binder =
        android::defaultServiceManager()->getService(android::String16("TavoPlayer"));
    sp<TavoPlayer::ICTavoPlayer> service =
        android::interface_cast<TavoPlayer::ICTavoPlayer>(binder);
    if (service == nullptr) {
        if (daemon > 0)
            std::fprintf(stderr, "tavoplay: tavoplayerd did not start (log: %s/tavoplayerd.log)\n",
                         dir.c_str());
        else
            std::fprintf(stderr, "tavoplay: no TavoPlayer service in %s\n", serviceDir.c_str());
        gQuit = true;
        if (daemon > 0) {
            kill(daemon, SIGTERM);
            waitpid(daemon, nullptr, 0);
        }
        return 1;
    }
    // A running service is not our child: its death comes as a death notice.
    sp<DeathFlag> died = new DeathFlag();
    if (daemon < 0)
        binder->linkToDeath(died);
    auto serviceGone = [&](std::string* how) {
        int status = 0;
        if (daemon < 0) {
            *how = "its connection closed";
            return died->dead.load();
        }
        if (waitpid(daemon, &status, WNOHANG) != daemon)
            return false;
        *how = (WIFSIGNALED(status) ? "killed by signal " + std::to_string(WTERMSIG(status))
                                    : "exit status " + std::to_string(WEXITSTATUS(status))) +
               "; its log is " + dir + "/tavoplayerd.log";
        return true;
    };
    sp<Viewer> viewer = new Viewer();
    service->registerClient(viewer);
    service->setSurface(android::Surface::create());
    // The answers are one-way callbacks: wait for each before going on.
    auto answered = [&](const std::atomic<int>& status) {
        std::string how;
        for (int i = 0; i < 300 && status == -1; ++i) {
            if (serviceGone(&how))
                break;
            std::this_thread::sleep_for(std::chrono::milliseconds(100));
        }
        return status.load();
    };
    service->openUri(found.uri().c_str(), 5);
    if (answered(viewer->openStatus) == 0) {
        service->start();
        answered(viewer->startStatus);
    }
    if (viewer->openStatus != 0 || viewer->startStatus != 0) {
        std::fprintf(stderr, "tavoplay: the service refused the stream (open %d, start %d)\n",
                     viewer->openStatus.load(), viewer->startStatus.load());
        cleanUp(1);
    }

    // 4. Keys and status until the end.
    signal(SIGINT, [](int) { gQuit = true; });
    signal(SIGTERM, [](int) { gQuit = true; });
    RawTerminal terminal;
    const bool keys = terminal.active && source != "-";
    size_t audioIndex = 0;
    bool paused = false;
    bool recording = false;
    int captures = 0;
    while (!gQuit) {
        std::string how;
        if (serviceGone(&how)) {
            // Its log stays for the reader.
            std::fprintf(stderr, "\ntavoplay: the service died (%s)\n", how.c_str());
            std::exit(1);
        }
        // A file does not come back once its packets stop: its end is the first
        // "signal late" (3 s without pictures or sound).
        if (viewer->signal >= 1 && !loop && source != "-" && source.rfind("udp://", 0) != 0 &&
            !isDvb) {
            viewer->line("end of stream");
            break;
        }
        if (viewer->signalLost && source == "-") {
            viewer->line("end of input");
            break;
        }
        viewer->status(paused ? "paused" : "playing", service->getFrameRate());
        pollfd p{STDIN_FILENO, POLLIN, 0};
        if (!keys || poll(&p, 1, 250) <= 0) {
            if (!keys)
                std::this_thread::sleep_for(std::chrono::milliseconds(250));
            continue;
        }
        char key = 0;
        if (read(STDIN_FILENO, &key, 1) != 1)
            continue;
        switch (key) {
            case ' ':
                paused ? service->resume() : service->pause();
                paused = !paused;
                break;
            case 'c':
                service->getFrame(1, 0);
                ++captures;
                viewer->line("capture %d requested", captures);
                break;
            case 'r':
                if (recording)
                    service->stopRecorder(1);
                else if (service->startRecorder("FILE://rec/tavoplay?channelName=tavoplay;") != 0)
                    viewer->line("recording could not start");
                recording = !recording;
                break;
            case 'a':
                if (found.audioPids.size() > 1) {
                    audioIndex = (audioIndex + 1) % found.audioPids.size();
                    service->setAudioPID(found.audioPids[audioIndex]);
                    viewer->line("audio PID %u", found.audioPids[audioIndex]);
                } else {
                    viewer->line("the programme has one audio stream");
                }
                break;
            case 's':
                viewer->captionsOn = !viewer->captionsOn;
                viewer->line("captions %s", viewer->captionsOn ? "on" : "off");
                break;
            case 'q':
                gQuit = true;
                break;
            default:
                break;
        }
    }
    std::fprintf(stderr, "\n");
    service->stop();
    service->close();
    cleanUp(0);
}
