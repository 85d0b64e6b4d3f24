// tavoplay's discovery of the programme: what it finds in the PAT and PMT of each
// stream, and where the audio payload overrules a mislabelling PMT.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdio>
#include <filesystem>
#include <string>

#include "support/RunCommand.h"

namespace {

namespace fs = std::filesystem;
using TavoPlayer::test::runCommand;

std::string lastLine(const std::string& text) {
    const size_t end = text.find_last_not_of('\n');
    const size_t start = text.rfind('\n', end);
    return text.substr(start == std::string::npos ? 0 : start + 1, end - start);
}

const std::string kTavoplay = TAVO_BINARY_DIR "/apps/tavoplay/tavoplay --probe ";

TEST(TavoplayProbe, FindsEachProgrammesPidsAndTrustsTheAudioPayload) {
    const fs::path dir = fs::temp_directory_path() / ("tavo-probe-" + std::to_string(getpid()));
    fs::create_directories(dir);
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
    int index = 0;
    for (const auto& c : cases) {
        SCOPED_TRACE(c.tsgenOptions);
        const std::string file = (dir / ("s" + std::to_string(index++) + ".ts")).string();
        std::string out;
        ASSERT_EQ(
            runCommand(std::string(TAVO_TSGEN_PATH) + " -o " + file + " -d 1 " + c.tsgenOptions,
                       &out),
            0)
            << out;
        out.clear();
        EXPECT_EQ(runCommand(kTavoplay + file, &out), 0) << out;
        const std::string expected = std::string("MTV://tuner/live?") + c.uri;
        EXPECT_EQ(lastLine(out), expected);
    }
    fs::remove_all(dir);
}

TEST(TavoplayProbe, SourcesThatCannotBePlayedGiveTheirReasonAndStatus2) {
    const std::string streams = TAVO_SHARED_STREAMS_DIR;
    const struct {
        std::string source;
        const char* reason;
    } cases[] = {
        {TAVO_SOURCE_DIR "/README.md", "not an MPEG transport stream"},
        {"/nonexistent.ts", "cannot open"},
        {streams + "/isdbtb_br_tvintegracao_188_first200pkts.ts", "no programme table (PAT)"},
        {streams + "/exoplayer_sample_latm.ts", "the programme has no video"},
    };
    for (const auto& c : cases) {
        if (c.source.rfind(streams, 0) == 0 && !fs::exists(c.source)) {
            std::printf("skipped %s: the shared sample streams are absent\n", c.source.c_str());
            continue;
        }
        std::string out;
        EXPECT_EQ(runCommand(kTavoplay + c.source, &out), 2) << c.source;
        EXPECT_NE(out.find(c.reason), std::string::npos) << out;
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

}  // namespace
