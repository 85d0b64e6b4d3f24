// The service as a client meets it: tavoplayerd serving a tsgen broadcast from a
// file, driven by tavoctl over the socket transport, each a process of its own.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include <thread>

#include "platform/binder/IServiceManager.h"
#include "platform/binder/Parcel.h"
#include "service/BnCTavoPlayerClient.h"
#include "service/ICTavoPlayer.h"
#include "support/RunCommand.h"

namespace {

namespace fs = std::filesystem;
using TavoPlayer::test::runCommand;

const std::string kBin = TAVO_BINARY_DIR "/apps/";
constexpr const char* kLive =
    "open 5 MTV://tuner/live?pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=1;"
    "subtitlePid=304;";

class ServiceSession : public testing::Test {
protected:
    static void SetUpTestSuite() {
        sDir = fs::temp_directory_path() / ("tavo-session-" + std::to_string(getpid()));
        fs::create_directories(sDir);
        std::string out;
        ASSERT_EQ(runCommand(std::string(TAVO_TSGEN_PATH) + " -o " + (sDir / "live.ts").string() +
                                 " -d 14 --caption 2:Olá --caption 5:'Ação, você'",
                             &out),
                  0)
            << out;
    }
    static void TearDownTestSuite() { fs::remove_all(sDir); }

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
        for (int i = 0; i < 100 && !fs::exists(sDir / "svc" / "TavoPlayer"); ++i)
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
        ASSERT_TRUE(fs::exists(sDir / "svc" / "TavoPlayer"));
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

    static std::string environment() {
        return "TAVOPLAYER_SERVICE_DIR=" + (sDir / "svc").string() +
               " TAVOPLAYER_PROP_tavoplayer_demux_source=file:" + (sDir / "live.ts").string() +
               " TAVOPLAYER_PROP_tavoplayer_video_sink=null"
               " TAVOPLAYER_PROP_tavoplayer_audio_sink=null"
               " TAVOPLAYER_PROP_tavoplayer_recordings_dir=" +
               (sDir / "rec").string();
    }
    // tavoctl with the given commands, each one argument.
    static int tavoctl(const std::string& commands, std::string* output) {
        return runCommand(
            "timeout 90 env " + environment() + " " + kBin + "tavoctl/tavoctl " + commands, output);
    }

    static std::string daemonLog() {
        std::ifstream log(sDir / "daemon.log");
        std::stringstream text;
        text << log.rdbuf();
        return text.str();
    }

    static fs::path sDir;
    pid_t mDaemon = -1;
};

fs::path ServiceSession::sDir;

TEST_F(ServiceSession, AWholeSessionGivesItsCallbacksInOrderAndAReadablePicture) {
    const std::string png = (sDir / "capture.png").string();
    std::string out;
    const int status = tavoctl(std::string("'") + kLive +
                                   "' start 'waitfor onStartVideoTask 20' 'waitfor onBufferingEnd "
                                   "20' 'capture 320 240 " +
                                   png +
                                   "' pause resume 'record FILE://rec/session?channelName=t;' "
                                   "'waitfor closedCaptionText 20' "
                                   "'wait 1' stoprecord 'waitfor onRecorderStopped 10' stop close",
                               &out);
    EXPECT_EQ(status, 0) << out;
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
    runCommand("timeout -s KILL 6 env " + environment() + " " + kBin + "tavoctl/tavoctl '" + kLive +
                   "' start 'wait 30'",
               &out);
    std::string next;
    EXPECT_EQ(tavoctl(std::string("state '") + kLive +
                          "' start 'waitfor onStartVideoTask 20' stop close state",
                      &next),
              0)
        << next;
    // The first line is the state the dead client left: Closed.
    EXPECT_NE(next.find("state 1 Closed"), std::string::npos) << next;
    EXPECT_NE(daemonLog().find("binderDied"), std::string::npos) << daemonLog();
}

// A client that takes every callback and does nothing with it.
class SilentClient : public TavoPlayer::BnCTavoPlayerClient {
    void openUriComplete(int32_t) override {}
    void startComplete(int32_t) override {}
    void onCaptureFrame(uint8_t*, int32_t, int32_t, int32_t) override {}
    void onSignalStatusChanged(int32_t, int32_t) override {}
    void closedCaptionText(const uint8_t*, int32_t) override {}
    void onStopComplete(int32_t) override {}
    void onError(int32_t) override {}
    void onBufferingBegin() override {}
    void onBufferingEnd() override {}
    void onBuffering(int32_t) override {}
    void onAudioSessionId(int32_t) override {}
    void onStartVideoTask(int32_t, int32_t) override {}
    void onTimeUpdate(int32_t) override {}
    void onEndOfContent() override {}
    void onRecorderStarted(int32_t) override {}
    void onRecorderStopped(int32_t) override {}
    void onPaused(int32_t) override {}
    void onResumed(int32_t) override {}
    void onSeeked(int32_t) override {}
};

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
        android::sp<TavoPlayer::ICTavoPlayer> service =
            android::interface_cast<TavoPlayer::ICTavoPlayer>(binder);
        if (service == nullptr)
            _exit(3);
        android::sp<SilentClient> me = new SilentClient();
        service->registerClient(me);
        android::Parcel open;
        open.writeInterfaceToken(TavoPlayer::ICTavoPlayer::descriptor);
        open.writeInt32(5);
        open.writeString16(android::String16(kLive + 7));  // the URI after "open 5 "
        binder->transact(TavoPlayer::ICTavoPlayer::OPEN_URI, open, nullptr,
                         android::IBinder::FLAG_ONEWAY);
        service->getState();
        _exit(0);
    }
    int status = -1;
    waitpid(client, &status, 0);
    ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
    for (int i = 0; i < 200 && daemonLog().find("binderDied") == std::string::npos; ++i)
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    ASSERT_NE(daemonLog().find("binderDied"), std::string::npos) << daemonLog();
    std::string next;
    EXPECT_EQ(
        tavoctl(std::string("state '") + kLive + "' start 'waitfor onStartVideoTask 20' stop close",
                &next),
        0)
        << next;
    // The open of the dead client was closed with it.
    EXPECT_NE(next.find("state 1 Closed"), std::string::npos) << next;
}

TEST(TavoplayerdDirectory, ADirectoryThatCannotBeMadeIsOneLineAndStatus1) {
    const fs::path dir = fs::temp_directory_path() / ("tavo-svcdir-" + std::to_string(getpid()));
    fs::create_directories(dir);
    std::ofstream(dir / "file") << "x";
    const struct {
        std::string serviceDir;
        const char* reason;
    } cases[] = {
        {(dir / "file").string(), "Not a directory"},
        {(dir / "file" / "svc").string(), "Not a directory"},
    };
    for (const auto& c : cases) {
        std::string out;
        EXPECT_EQ(runCommand("timeout 20 " + kBin + "tavoplayerd/tavoplayerd --service-dir " +
                                 c.serviceDir,
                             &out),
                  1)
            << out;
        EXPECT_EQ(out, "tavoplayerd: cannot create the service directory " + c.serviceDir + ": " +
                           c.reason + "\n");
    }
    fs::remove_all(dir);
}

TEST_F(ServiceSession, CommandsThatFailGiveANonZeroExit) {
    const struct {
        const char* commands;
        int status;
    } cases[] = {
        {"'open 5 NOT A URI'", 1},
        {"'open 3 MTV://x/y?a=1;'", 1},
        {"start", 1},  // Closed: startComplete(1)
        {"bogus", 1},
        {"'seek abc'", 1},
    };
    for (const auto& c : cases) {
        std::string out;
        EXPECT_EQ(tavoctl(c.commands, &out), c.status) << c.commands << "\n" << out;
    }
    kill(mDaemon, SIGTERM);
    waitpid(mDaemon, nullptr, 0);
    mDaemon = -1;
    std::string out;
    EXPECT_EQ(tavoctl("state", &out), 3) << out;
}

}  // namespace
