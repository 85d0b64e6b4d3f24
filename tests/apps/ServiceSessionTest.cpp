// The service as a client meets it: tavoplayerd serving a tsgen broadcast from a
// file, driven by tavoctl over the socket transport, each a process of its own.
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "platform/binder/IServiceManager.h"
#include "platform/binder/Parcel.h"
#include "service/ICTavoPlayer.h"
#include "support/RecordingPlayerClient.h"
#include "support/RunCommand.h"
#include "support/ScopedEnv.h"
#include "support/TsTestUtil.h"

namespace {

namespace fs = std::filesystem;
using TavoPlayer::test::runCommand;
using TavoPlayer::test::waitUntil;

const std::string kBin = TAVO_BINARY_DIR "/apps/";
const std::string kLiveUri =
    "MTV://tuner/live?pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=1;subtitlePid=304;";
// tavoctl's command that opens the live broadcast, quoted for the shell.
const std::string kOpen = "'open 5 " + kLiveUri + "' ";

class ServiceSession : public testing::Test {
protected:
    // The folder goes with the test program.
    static void SetUpTestSuite() {
        sDir = TavoPlayer::test::tempPath("session");
        fs::create_directories(sDir);
        const auto made =
            runCommand(std::string(TAVO_TSGEN_PATH) + " -o " + (sDir / "live.ts").string() +
                       " -d 14 --caption 2:Olá --caption 5:'Ação, você'");
        ASSERT_EQ(made.exitCode, 0) << made.err;
    }

    void SetUp() override {
        const std::string env = environment();
        mDaemon = fork();
        ASSERT_GE(mDaemon, 0);
        if (mDaemon == 0) {
            execl("/bin/sh", "sh", "-c",
                  (env + " exec " + kBin + "tavoplayerd/tavoplayerd --log-level warning 2>" +
                   (sDir / "daemon.log").string())
                      .c_str(),
                  nullptr);
            _exit(127);
        }
        // The service is there once its socket is.
        ASSERT_TRUE(waitUntil([] { return fs::exists(sDir / "svc" / "TavoPlayer"); }));
    }
    void TearDown() override {
        if (mDaemon > 0) {
            kill(mDaemon, SIGTERM);
            int status = 0;
            waitpid(mDaemon, &status, 0);
            EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0)
                << "tavoplayerd did not exit 0 on SIGTERM";
        }
    }

    // The demux source the daemon serves.
    virtual std::string source() const { return (sDir / "live.ts").string(); }
    std::string environment() const {
        return "TAVOPLAYER_SERVICE_DIR=" + (sDir / "svc").string() +
               " TAVOPLAYER_PROP_tavoplayer_demux_source=file:" + source() +
               " TAVOPLAYER_PROP_tavoplayer_video_sink=null"
               " TAVOPLAYER_PROP_tavoplayer_audio_sink=null"
               " TAVOPLAYER_PROP_tavoplayer_recordings_dir=" +
               (sDir / "rec").string();
    }
    // tavoctl with the given commands, each one argument.
    int tavoctl(const std::string& commands, std::string* output) const {
        return runCommand(
            "timeout 90 env " + environment() + " " + kBin + "tavoctl/tavoctl " + commands, output);
    }

    static std::string daemonLog() { return TavoPlayer::test::fileText(sDir / "daemon.log"); }
    // The state a client left is Closed, and the next client plays.
    void expectClosedAndReadyForTheNext() const {
        std::string next;
        EXPECT_EQ(
            tavoctl("state " + kOpen + "start 'waitfor onStartVideoTask 20' stop close", &next), 0)
            << next;
        // The first line is the state the gone client left.
        EXPECT_NE(next.find("state 1 Closed"), std::string::npos) << next;
    }

    static inline fs::path sDir;
    pid_t mDaemon = -1;
};

TEST_F(ServiceSession, AWholeSessionGivesItsCallbacksInOrderAndAReadablePicture) {
    const std::string png = (sDir / "capture.png").string();
    std::string out;
    const std::string commands =
        "start 'waitfor onStartVideoTask 20' 'waitfor onBufferingEnd 20' 'capture 320 240 " + png +
        "' pause resume 'record FILE://rec/session?channelName=t;' 'waitfor closedCaptionText 20' "
        "'wait 1' stoprecord 'waitfor onRecorderStopped 10' stop close";
    EXPECT_EQ(tavoctl(kOpen + commands, &out), 0) << out;
    // Each callback in the order the session must see them.
    size_t at = 0;
    for (const char* expected :
         {"<- onBufferingBegin()", "<- openUriComplete(0)", "<- startComplete(0)",
          "<- onStartVideoTask(1920, 1080)", "<- onBufferingEnd()",
          "<- onCaptureFrame(1920, 1080, 0)", "<- onPaused(0)", "<- onResumed(0)",
          "<- onRecorderStarted(", "<- closedCaptionText(16) \"Olá", "<- onRecorderStopped("}) {
        const size_t found = out.find(expected, at);
        ASSERT_NE(found, std::string::npos) << "missing or out of order: " << expected << "\n"
                                            << out;
        at = found;
    }
    std::string probe;
    ASSERT_EQ(
        runCommand("ffprobe -v error -show_entries stream=width,height -of csv=p=0 " + png, &probe),
        0);
    EXPECT_EQ(probe, "320,240\n");
}

TEST_F(ServiceSession, AClientThatDiesMidPlaybackLeavesTheServiceReadyForTheNext) {
    std::string out;
    // Killed by timeout while playing: the service sees the hang-up as a death.
    runCommand("timeout -s KILL 6 env " + environment() + " " + kBin + "tavoctl/tavoctl " + kOpen +
                   "start 'wait 30'",
               &out);
    expectClosedAndReadyForTheNext();
}

using SilentClient = TavoPlayer::test::RecordingPlayerClient;

TEST_F(ServiceSession, AClientThatDiesDuringOpenLeavesTheServiceClosedAndReady) {
    // The client sends its open and is gone before the service can answer: the
    // open is sent without waiting for its reply, and the client exits as soon as
    // a later call shows the service has read it.
    const pid_t client = fork();
    ASSERT_GE(client, 0);
    if (client == 0) {
        setenv("TAVOPLAYER_SERVICE_DIR", (sDir / "svc").c_str(), 1);
        android::sp<android::IBinder> binder =
            android::defaultServiceManager()->getService(android::String16("TavoPlayer"));
        const auto service = android::interface_cast<TavoPlayer::ICTavoPlayer>(binder);
        if (service == nullptr)
            _exit(3);
        android::sp<SilentClient> me = new SilentClient();
        service->registerClient(me);
        android::Parcel open;
        open.writeInterfaceToken(TavoPlayer::ICTavoPlayer::descriptor);
        open.writeInt32(5);
        open.writeString16(android::String16(kLiveUri.c_str()));
        binder->transact(TavoPlayer::ICTavoPlayer::OPEN_URI, open, nullptr,
                         android::IBinder::FLAG_ONEWAY);
        service->getState();
        _exit(0);
    }
    int status = -1;
    waitpid(client, &status, 0);
    ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
    ASSERT_TRUE(waitUntil([] { return daemonLog().find("binderDied") != std::string::npos; }))
        << daemonLog();
    // The open of the dead client was closed with it.
    expectClosedAndReadyForTheNext();
}

// Datagrams that break the frame rules of docs/protocol.md, each on a connection of
// its own: the service hangs that connection up and goes on serving.
// The first row, a well-formed getState, shows that the others differ by their fault.
TEST_F(ServiceSession, MalformedFramesHangUpTheirConnectionOnly) {
    android::Parcel body;
    body.writeInterfaceToken(TavoPlayer::ICTavoPlayer::descriptor);
    std::vector<uint32_t> words = {
        0x31425654, 1, 0, 25, 1, 0, 1, 0, static_cast<uint32_t>(body.dataSize()), 0};
    std::vector<uint8_t> good(words.size() * 4);
    memcpy(good.data(), words.data(), good.size());
    good.insert(good.end(), body.data(), body.data() + body.dataSize());
    auto with = [&good](size_t word, uint32_t value) {
        std::vector<uint8_t> f = good;
        memcpy(f.data() + 4 * word, &value, 4);
        return f;
    };
    // One object, its offset (4096, in the host's little-endian order) beyond the data.
    std::vector<uint8_t> pastData = with(9, 1);
    pastData.insert(pastData.end(), {0x00, 0x10, 0x00, 0x00});
    const struct {
        const char* what;
        std::vector<uint8_t> frame;
        bool answered;
    } cases[] = {
        {"a well-formed getState", good, true},
        {"shorter than the header", std::vector<uint8_t>(good.begin(), good.begin() + 20), false},
        {"a wrong magic", with(0, 0x31425655), false},
        {"a data size past the datagram", with(8, static_cast<uint32_t>(body.dataSize() + 4)),
         false},
        {"an unknown command", with(1, 7), false},
        {"an object offset past the data", pastData, false},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        const int fd = socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
        sockaddr_un addr{};
        addr.sun_family = AF_UNIX;
        snprintf(addr.sun_path, sizeof addr.sun_path, "%s", (sDir / "svc" / "TavoPlayer").c_str());
        ASSERT_EQ(connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr), 0);
        ASSERT_EQ(send(fd, c.frame.data(), c.frame.size(), 0),
                  static_cast<ssize_t>(c.frame.size()));
        pollfd p{fd, POLLIN, 0};
        ASSERT_EQ(poll(&p, 1, 10000), 1) << "neither an answer nor a hang-up";
        uint8_t reply[512];
        const ssize_t n = recv(fd, reply, sizeof reply, 0);
        if (c.answered) {
            EXPECT_GE(n, 40) << "no reply frame";
        } else {
            EXPECT_EQ(n, 0) << "the connection was not hung up";
        }
        ::close(fd);
    }
    std::string out;
    EXPECT_EQ(tavoctl("state", &out), 0) << out;
}

// A source that is not a transport stream: the service plays it as a broadcast
// that never arrives (signal late, then lost), and stops.
class ServiceOnANonTsSource : public ServiceSession {
protected:
    std::string source() const override { return TAVO_SOURCE_DIR "/README.md"; }
};

TEST_F(ServiceOnANonTsSource, ReportsTheSignalLostAndLogsTheLostSync) {
    std::string out;
    EXPECT_EQ(tavoctl(kOpen + "start 'waitfor onSignalStatusChanged 20' "
                              "'waitfor onSignalStatusChanged 20' stop close",
                      &out),
              0)
        << out;
    EXPECT_NE(out.find("<- startComplete(0)"), std::string::npos) << out;
    EXPECT_NE(out.find("<- onSignalStatusChanged(1, 2)"), std::string::npos) << out;
    EXPECT_EQ(out.find("onStartVideoTask"), std::string::npos) << out;
}

TEST(TavoplayerdDirectory, ADirectoryThatCannotBeMadeIsOneLineAndStatus1) {
    const TavoPlayer::test::TempDir dir("tavo-svcdir");
    std::ofstream(dir / "file") << "x";
    // A file where the folder should be, and a file on the folder's path.
    const std::string daemon = "timeout 20 " + kBin + "tavoplayerd/tavoplayerd --service-dir ";
    for (const std::string& serviceDir : {dir / "file", dir / "file/svc"}) {
        std::string out;
        EXPECT_EQ(runCommand(daemon + serviceDir, &out), 1) << out;
        EXPECT_EQ(out, "tavoplayerd: cannot create the service directory " + serviceDir +
                           ": Not a directory\n");
    }
}

TEST_F(ServiceSession, CommandsThatFailGiveANonZeroExit) {
    // start while Closed answers startComplete(1).
    for (const char* commands : {"start", "bogus", "'seek abc'"}) {
        std::string out;
        EXPECT_EQ(tavoctl(commands, &out), 1) << commands << "\n" << out;
    }
    kill(mDaemon, SIGTERM);
    waitpid(mDaemon, nullptr, 0);
    mDaemon = -1;
    std::string out;
    EXPECT_EQ(tavoctl("state", &out), 3) << out;
}

}  // namespace
