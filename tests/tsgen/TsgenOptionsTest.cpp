// Command-line handling: bad options fail with a message that names them.

#include <gtest/gtest.h>

#include <sstream>

#include "TsgenTestUtil.h"

namespace TavoPlayer::test {
namespace {

struct BadOption {
    const char* args;
    const char* message;
    int exitCode = 2;  // 2: refused before writing; 1: the output failed
};

void PrintTo(const BadOption& c, std::ostream* os) {
    *os << "'" << c.args << "'";
}

class TsgenBadOptionTest : public ::testing::TestWithParam<BadOption> {};

TEST_P(TsgenBadOptionTest, FailsWithAClearMessageAndWritesNothing) {
    const auto run = runCommand(std::string(TAVO_TSGEN_PATH) + " " + GetParam().args);
    EXPECT_EQ(run.exitCode, GetParam().exitCode);
    EXPECT_NE(run.err.find(GetParam().message), std::string::npos) << run.err;
    EXPECT_TRUE(run.out.empty());
}

INSTANTIATE_TEST_SUITE_P(
    Table, TsgenBadOptionTest,
    ::testing::Values(BadOption{"", "no output given"},
                      BadOption{"-o /dev/null --duration 0", "--duration"},
                      BadOption{"-o /dev/null --duration ten", "--duration"},
                      BadOption{"-o /dev/null --size 321x240", "--size"},
                      BadOption{"-o /dev/null --fps 0", "--fps"},
                      BadOption{"-o /dev/null --audio aac", "--audio"},
                      BadOption{"-o /dev/null --video-pid 0x1FFF", "--video-pid"},
                      BadOption{"-o /dev/null --audio-pid 0x111", "must all differ"},
                      BadOption{"-o /dev/null --pcr-pid 0x112", "--pcr-pid"},
                      BadOption{"-o /dev/null --pcr-interval-ms 150", "--pcr-interval-ms"},
                      BadOption{"-o /dev/null --cc-error 0x111", "PID:INDEX"},
                      BadOption{"-o /dev/null --tei 0x111:x", "PID:INDEX"},
                      BadOption{"-o /dev/null --gap 1", "--gap"},
                      BadOption{"-o /dev/null --start-pts 8589934592", "--start-pts"},
                      BadOption{"-o /dev/null --latm-as-adts --audio adts", "--latm-as-adts"},
                      BadOption{"-o /dev/null --caption '1:\xe4\xb8\xad'", "no Latin caption code"},
                      BadOption{"-o /dev/null --mux-rate 200000", "below the contents"},
                      BadOption{"-o /dev/null --bogus", "unknown option --bogus"},
                      BadOption{"-o /dev/null --audio mp2 --audio-channels 6", "needs AAC"},
                      BadOption{"-o /dev/null --seed", "needs a value"},
                      BadOption{"-o /dev/null stray", "unexpected argument 'stray'"},
                      BadOption{"-d 0.1 --size 64x64 -o /nonexistent-dir/out.ts",
                                "cannot open /nonexistent-dir/out.ts", 1}));

TEST(TsgenHelpTest, HelpDocumentsTheFaultsAndSucceeds) {
    const auto run = runCommand(std::string(TAVO_TSGEN_PATH) + " --help");
    EXPECT_EQ(run.exitCode, 0);
    std::istringstream options(
        "--output --duration --size --fps --progressive --audio --caption --mux-rate "
        "--pcr-interval-ms --start-pts --seed --cc-error --drop --tei --scramble --pcr-jump "
        "--gap --no-aud --no-vui --latm-as-adts --adts-as-latm");
    for (std::string option; options >> option;) {
        // A trailing space keeps "--audio" from matching "--audio-pid" alone.
        EXPECT_NE(run.out.find(option + " "), std::string::npos) << option;
    }
}

}  // namespace
}  // namespace TavoPlayer::test
