// tavoplayerd: hosts the "TavoPlayer" service as the media server did. It
// instantiates the service, serves binder calls on the binder thread pool until
// SIGTERM or SIGINT, then closes any open pipeline and exits 0.
//
// The service itself may end this process on purpose (an unrecoverable pipeline
// error, or a stop in a state that forbids it); the systemd unit restarts it.
#include <getopt.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>
#include <system_error>
#include <thread>

#include "platform/binder/ProcessState.h"
#include "platform/binder/SocketServiceManager.h"
#include "platform/os/Trace.h"
#include "service/CTavoPlayer.h"

namespace {

void usage(FILE* out) {
    std::fprintf(out,
                 "Usage: tavoplayerd [OPTIONS]\n"
                 "Serves the TavoPlayer binder service until SIGTERM or SIGINT.\n\n"
                 "  -l, --log-level LEVEL   error, warning, info (default), debug or none\n"
                 "  -d, --service-dir DIR   socket directory of the service manager\n"
                 "                          (default: $TAVOPLAYER_SERVICE_DIR, /run/tavoplayer\n"
                 "                          for root, else $XDG_RUNTIME_DIR/tavoplayer)\n"
                 "  -h, --help              this text\n\n"
                 "Sources and sinks are system properties (TAVOPLAYER_PROPERTIES or\n"
                 "TAVOPLAYER_PROP_<key> variables), e.g. tavoplayer.demux.source,\n"
                 "tavoplayer.video.sink and tavoplayer.audio.sink.\n\n"
                 "Exit status: 0 after SIGTERM or SIGINT, 1 when the service cannot be\n"
                 "registered (its directory cannot be made or written, or another process\n"
                 "serves it), 2 for a bad option.\n");
}

// The service directory, made when missing; empty when usable, else the reason.
// Checked here so that a wrong directory is one line on the terminal rather than
// a registration failure in the log.
std::string prepareServiceDirectory(const std::string& dir) {
    std::error_code ec;
    std::filesystem::create_directories(dir, ec);
    if (ec)
        return "cannot create the service directory " + dir + ": " + ec.message();
    if (!std::filesystem::is_directory(dir, ec))
        return "cannot create the service directory " + dir + ": it is not a directory";
    if (access(dir.c_str(), W_OK | X_OK) != 0)
        return "cannot use the service directory " + dir + ": " + std::strerror(errno);
    return "";
}

bool validLevel(const char* level) {
    for (const char* name : {"error", "warning", "info", "debug", "none"})
        if (std::strcmp(level, name) == 0)
            return true;
    return false;
}

}  // namespace

int main(int argc, char** argv) {
    static const option kOptions[] = {{"log-level", required_argument, nullptr, 'l'},
                                      {"service-dir", required_argument, nullptr, 'd'},
                                      {"help", no_argument, nullptr, 'h'},
                                      {nullptr, 0, nullptr, 0}};
    int opt;
    while ((opt = getopt_long(argc, argv, "l:d:h", kOptions, nullptr)) != -1) {
        switch (opt) {
            case 'l':
                if (!validLevel(optarg)) {
                    std::fprintf(stderr, "tavoplayerd: unknown log level '%s'\n", optarg);
                    return 2;
                }
                setenv("TAVOPLAYER_LOG_LEVEL", optarg, 1);
                break;
            case 'd':
                setenv("TAVOPLAYER_SERVICE_DIR", optarg, 1);
                break;
            case 'h':
                usage(stdout);
                return 0;
            default:
                usage(stderr);
                return 2;
        }
    }
    if (optind < argc) {
        std::fprintf(stderr, "tavoplayerd: unexpected argument '%s'\n", argv[optind]);
        return 2;
    }

    // The signals are taken by a thread of our own (sigwait), so every other
    // thread, binder and pipeline alike, starts with them blocked.
    sigset_t stopSignals;
    sigemptyset(&stopSignals);
    sigaddset(&stopSignals, SIGTERM);
    sigaddset(&stopSignals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &stopSignals, nullptr);
    // A client that hangs up mid-write must not end the service.
    signal(SIGPIPE, SIG_IGN);

    const std::string problem =
        prepareServiceDirectory(android::SocketServiceManager::serviceDirectory());
    if (!problem.empty()) {
        std::fprintf(stderr, "tavoplayerd: %s\n", problem.c_str());
        return 1;
    }
    OneSegPGL_InitializeDebug();
    TavoPlayer::CTavoPlayer::instantiate();
    android::sp<TavoPlayer::CTavoPlayer> service = TavoPlayer::CTavoPlayer::self();
    if (service == nullptr) {
        std::fprintf(stderr, "tavoplayerd: cannot register the service in %s (see the log)\n",
                     android::SocketServiceManager::serviceDirectory().c_str());
        return 1;
    }
    std::fprintf(stderr, "tavoplayerd: serving TavoPlayer in %s\n",
                 android::SocketServiceManager::serviceDirectory().c_str());

    int signo = 0;
    sigwait(&stopSignals, &signo);
    std::fprintf(stderr, "tavoplayerd: %s, closing\n", strsignal(signo));
    service->close();
    android::ProcessState::self()->shutdown();
    return 0;
}
