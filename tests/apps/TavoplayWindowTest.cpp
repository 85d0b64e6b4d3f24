// tavoplay under a virtual X display: the picture reaches a real window that fits
// the screen with the picture's aspect ratio, captions reach the terminal and the
// end of the file ends the program with status 0.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <set>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "support/RunCommand.h"
#include "support/ScopedEnv.h"

namespace {

struct Screen {
    int width, height;
    // The window expected for a 1920x1080 picture: the largest of its aspect that
    // fits, centred.
    const char* window;
};
void PrintTo(const Screen& s, std::ostream* os) {
    *os << s.width << "x" << s.height;
}

class TavoplayWindow : public testing::TestWithParam<Screen> {};

// The size and place of the TavoPlayer window, "WxH+X+Y", as the X server has it in
// a line of the window tree: ...: ("tavoplayerd" "tavoplayerd")  1024x576+0+96  +0+96
std::string windowGeometry(const std::string& display) {
    std::string line;
    TavoPlayer::test::runCommand(
        "xwininfo -display " + display + " -root -tree 2>/dev/null | grep '\"TavoPlayer\"'", &line);
    std::istringstream after(line.substr(line.find(')') + 1));
    std::string geometry;
    after >> geometry;
    return geometry;
}

TEST_P(TavoplayWindow, ShowsTheTestPatternFittedAndPrintsCaptions) {
    const Screen screen = GetParam();
    const std::string size = std::to_string(screen.width) + "x" + std::to_string(screen.height);
    if (system("command -v Xvfb >/dev/null && command -v ffmpeg >/dev/null && "
               "command -v xwininfo >/dev/null") != 0)
        GTEST_SKIP() << "Xvfb, ffmpeg or xwininfo is not installed";
    const TavoPlayer::test::TempDir dir("tavo-window");
    const std::string ts = dir / "s.ts";
    const auto made = TavoPlayer::test::runCommand(std::string(TAVO_TSGEN_PATH) + " -o " + ts +
                                                   " -d 8 --caption '2:Olá'");
    ASSERT_EQ(made.exitCode, 0) << made.err;
    const std::string display = ":" + std::to_string(100 + getpid() % 100);
    const pid_t xvfb = fork();
    if (xvfb == 0) {
        execlp("Xvfb", "Xvfb", display.c_str(), "-screen", "0", (size + "x24").c_str(), "-nolisten",
               "tcp", nullptr);
        _exit(127);
    }
    std::this_thread::sleep_for(std::chrono::seconds(2));
    const std::string env = "DISPLAY=" + display + " ";
    const std::string out = dir / "out.txt";
    FILE* player = popen((env + TAVO_BINARY_DIR "/apps/tavoplay/tavoplay " + ts + " >" + out +
                          " 2>&1 </dev/null; echo $?")
                             .c_str(),
                         "r");
    ASSERT_NE(player, nullptr);
    // The picture, grabbed from the screen while the stream plays, scaled down.
    std::this_thread::sleep_for(std::chrono::seconds(6));
    std::vector<unsigned char> rgb(160 * 90 * 3);
    const std::string geometry = windowGeometry(display);
    FILE* grab = popen((env + "ffmpeg -v error -f x11grab -video_size " + size + " -i " + display +
                        " -frames:v 1 -vf scale=160:90 -f rawvideo -pix_fmt rgb24 -")
                           .c_str(),
                       "r");
    ASSERT_NE(grab, nullptr);
    const size_t got = fread(rgb.data(), 1, rgb.size(), grab);
    pclose(grab);
    char status[16] = {};
    fgets(status, sizeof status, player);
    pclose(player);
    kill(xvfb, SIGTERM);
    waitpid(xvfb, nullptr, 0);
    ASSERT_EQ(got, rgb.size());
    EXPECT_EQ(geometry, screen.window);
    // Colour bars: most of the screen lit, in several clearly different colours.
    size_t lit = 0;
    std::set<int> colours;
    for (size_t i = 0; i < rgb.size(); i += 3) {
        if (rgb[i] + rgb[i + 1] + rgb[i + 2] > 60)
            ++lit;
        colours.insert((rgb[i] >> 6) << 4 | (rgb[i + 1] >> 6) << 2 | (rgb[i + 2] >> 6));
    }
    EXPECT_GT(lit, rgb.size() / 3 / 2) << "the window is mostly black";
    EXPECT_GE(colours.size(), 5u) << "the window does not show the colour bars";
    EXPECT_STREQ(status, "0\n");
    const std::string printed = TavoPlayer::test::fileText(out);
    EXPECT_NE(printed.find("caption: Olá"), std::string::npos) << printed;
}

INSTANTIATE_TEST_SUITE_P(Screens, TavoplayWindow,
                         testing::Values(Screen{1920, 1080, "1920x1080+0+0"},
                                         Screen{1024, 768, "1024x576+0+96"}));

}  // namespace
