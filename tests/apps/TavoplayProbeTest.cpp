// tavoplay's discovery of the programme: what it finds in the PAT and PMT of each
// stream, and where the audio payload overrules a mislabelling PMT.
#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>

#include "support/RunCommand.h"
#include "support/ScopedEnv.h"

namespace {

namespace fs = std::filesystem;
using TavoPlayer::test::runCommand;
using TavoPlayer::test::TempDir;

std::string lastLine(const std::string& text) {
    const size_t end = text.find_last_not_of('\n');
    const size_t start = text.rfind('\n', end);
    return text.substr(start == std::string::npos ? 0 : start + 1, end - start);
}

const std::string kTavoplay = TAVO_BINARY_DIR "/apps/tavoplay/tavoplay --probe ";

TEST(TavoplayProbe, FindsEachProgrammesPidsAndTrustsTheAudioPayload) {
    const struct {
        const char* tsgenOptions;
        const char* uri;
    } cases[] = {
        {"", "pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=1;isMPEG2Audio=0;subtitlePid=304;"},
        {"--pcr-pid 0x200 --no-caption-stream",
         "pcrPid=512;videoPid=273;audioPid=274;IsLATMAudio=1;isMPEG2Audio=0;subtitlePid=8190;"},
        {"--audio adts",
         "pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=0;isMPEG2Audio=0;subtitlePid=304;"},
        {"--audio mp2",
         "pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=0;isMPEG2Audio=1;subtitlePid=304;"},
        // Mislabelled in the PMT, as real broadcasts are: the payload wins.
        {"--audio latm --audio-stream-type 0x0F",
         "pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=1;isMPEG2Audio=0;subtitlePid=304;"},
        {"--audio adts --audio-stream-type 0x11",
         "pcrPid=273;videoPid=273;audioPid=274;IsLATMAudio=0;isMPEG2Audio=0;subtitlePid=304;"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.tsgenOptions);
        const std::string& file = TavoPlayer::test::tsgenStream(1, c.tsgenOptions);
        ASSERT_FALSE(file.empty());
        std::string out;
        EXPECT_EQ(runCommand(kTavoplay + file, &out), 0) << out;
        EXPECT_EQ(lastLine(out), std::string("MTV://tuner/live?") + c.uri);
    }
}

// Each source that cannot be played, or stops being playable, ends tavoplay with
// its reason on the last line and the documented status, within a bound.
TEST(TavoplayBadSource, EachGivesItsReasonAndStatus) {
    const std::string streams = TAVO_SHARED_STREAMS_DIR;
    const TempDir dir("tavo-badsrc");
    const std::string channels = dir / "channels.conf";
    const std::string garbled = dir / "garbled.conf";
    // As dvbv5-scan writes an ISDB-T service.
    std::ofstream(channels) << "[TV EXEMPLO HD]\n\tSERVICE_ID = 23584\n\tFREQUENCY = 563142857\n"
                               "\tBANDWIDTH_HZ = 6000000\n\tISDBT_LAYER_ENABLED = 7\n"
                               "\tISDBT_LAYERB_MODULATION = QAM/64\n\tDELIVERY_SYSTEM = ISDBT\n";
    std::ofstream(garbled) << "FREQUENCY = 563142857\n[TV EXEMPLO HD]\n";
    const std::string& live = TavoPlayer::test::tsgenStream(30);
    ASSERT_FALSE(live.empty());
    const std::string tavoplay =
        "timeout 60 " TAVO_BINARY_DIR "/apps/tavoplay/tavoplay --headless ";
    const struct {
        std::string command;
        int status;
        std::string reason;
    } cases[] = {
        {tavoplay + TAVO_SOURCE_DIR "/README.md", 2, "not an MPEG transport stream"},
        {tavoplay + "/nonexistent.ts", 2, "cannot open"},
        {tavoplay + streams + "/isdbtb_br_tvintegracao_188_first200pkts.ts", 2,
         "no programme table (PAT)"},
        {tavoplay + streams + "/exoplayer_sample_latm.ts", 2, "the programme has no video"},
        {tavoplay + "--channels " + channels + " --channel 'TV NENHUMA' dvb:0", 2,
         "dvb:0: no channel 'TV NENHUMA' in " + channels},
        {tavoplay + "--channels " + garbled + " --channel 'TV EXEMPLO HD' dvb:0", 2,
         "dvb:0: " + garbled +
             " is not a dvbv5 channel file (key/value without a channel group while parsing "
             "line 1"},
        {tavoplay + "--channels " + channels + " --channel 'TV EXEMPLO HD' dvb:99", 2,
         "dvb:99: no DVB adapter 99 (/dev/dvb/adapter99/frontend0: No such file or directory)"},
        // The service is killed while the stream plays.
        {"timeout 60 sh -c '" TAVO_BINARY_DIR "/apps/tavoplay/tavoplay --headless " + live +
             " & p=$!; sleep 5; kill -KILL $(cat /proc/$p/task/*/children); wait $p'",
         1, "tavoplay: the service died (killed by signal 9"},
        // A running service played through --service is killed.
        {"timeout 60 sh -c 'TAVOPLAYER_SERVICE_DIR=" + dir.path() +
             "/svc TAVOPLAYER_PROP_tavoplayer_demux_source=file:" + live +
             " TAVOPLAYER_PROP_tavoplayer_video_sink=null " TAVO_BINARY_DIR
             "/apps/tavoplayerd/tavoplayerd 2>/dev/null & d=$!; sleep 1; (sleep 5; kill -KILL $d) "
             "& " +
             tavoplay + "--service " + dir.path() + "/svc " + live + "'",
         1, "tavoplay: the service died (its connection closed)"},
    };
    for (const auto& c : cases) {
        if (c.command.find(streams) != std::string::npos &&
            !fs::exists(c.command.substr(c.command.find(streams)))) {
            std::printf("skipped %s: the shared sample streams are absent\n", c.command.c_str());
            continue;
        }
        std::string out;
        EXPECT_EQ(runCommand(c.command, &out), c.status) << c.command << "\n" << out;
        EXPECT_NE(lastLine(out).find(c.reason), std::string::npos) << c.command << "\n" << out;
        // A service that died leaves its log for the reader; not the test's.
        const size_t log = out.find("its log is ");
        if (log != std::string::npos)
            fs::remove_all(
                fs::path(out.substr(log + 11, out.find(')', log) - log - 11)).parent_path());
    }
}

TEST(TavoplayProbe, ARealIsdbTbCaptureIn204BytePackets) {
    const std::string file =
        std::string(TAVO_SHARED_STREAMS_DIR) + "/isdbtb_br_tvintegracao_rs204_pcap_329pkts.ts";
    if (!fs::exists(file))
        GTEST_SKIP() << "the shared sample streams are absent";
    std::string out;
    ASSERT_EQ(runCommand(kTavoplay + file, &out), 0) << out;
    // Service 23584: PCR 0x100, H.264 0x111, LATM 0x112, captions 0x116.
    EXPECT_EQ(lastLine(out),
              "MTV://tuner/live?pcrPid=256;videoPid=273;audioPid=274;"
              "IsLATMAudio=1;isMPEG2Audio=0;subtitlePid=278;");
}

// With --service, tavoplay plays through a tavoplayerd that is already serving (as the
// system one does on its tuner) and leaves it serving when the stream ends.
TEST(TavoplayRunningService, PlaysThroughItAndLeavesItServing) {
    const TempDir dir("tavo-running");
    const std::string& ts = TavoPlayer::test::tsgenStream(8, "--caption '1:Olá'");
    ASSERT_FALSE(ts.empty());
    const std::string svc = dir / "svc";
    const std::string script =
        "TAVOPLAYER_SERVICE_DIR=" + svc + " TAVOPLAYER_PROP_tavoplayer_demux_source=file:" + ts +
        " TAVOPLAYER_PROP_tavoplayer_video_sink=null TAVOPLAYER_PROP_tavoplayer_audio_sink=null " +
        TAVO_BINARY_DIR "/apps/tavoplayerd/tavoplayerd 2>/dev/null & d=$!; sleep 1; " +
        "timeout 60 " TAVO_BINARY_DIR "/apps/tavoplay/tavoplay --service " + svc + " " + ts +
        "; s=$?; kill -0 $d && echo still serving; kill $d; wait $d; exit $s";
    std::string out;
    EXPECT_EQ(runCommand("sh -c '" + script + "'", &out), 0) << out;
    EXPECT_NE(out.find("caption: Olá"), std::string::npos) << out;
    EXPECT_NE(out.find("end of stream"), std::string::npos) << out;
    EXPECT_NE(out.find("still serving"), std::string::npos) << out;
}

// Keys from a terminal (script(1) gives tavoplay one): space pauses and resumes, c
// saves the shown picture as a PNG, q quits before the stream's end with status 0.
TEST(TavoplayKeys, PauseCaptureAndQuit) {
    const TempDir dir("tavo-keys");
    std::string out;
    ASSERT_EQ(
        runCommand(std::string(TAVO_TSGEN_PATH) + " -o " + (dir / "live.ts") + " -d 30", &out), 0)
        << out;
    const std::string keys =
        "(sleep 7; printf \" \"; sleep 1; printf \" \"; sleep 1; printf c; "
        "sleep 2; printf q)";
    EXPECT_EQ(runCommand("cd " + dir.path() + " && " + keys +
                             " | timeout 60 script -qfec '" TAVO_BINARY_DIR
                             "/apps/tavoplay/tavoplay --headless live.ts' /dev/null",
                         &out),
              0)
        << out;
    EXPECT_NE(out.find("[paused]"), std::string::npos) << out;
    EXPECT_NE(out.find("captured a 1920x1080 frame to capture-1.png"), std::string::npos) << out;
    EXPECT_GT(fs::file_size(dir / "capture-1.png"), 10000u);
    EXPECT_EQ(out.find("end of stream"), std::string::npos) << out;
}

}  // namespace
