// The window sink on a virtual X display. Skipped without Xvfb.
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <memory>
#include <thread>

#include <gtest/gtest.h>

#include "SurfaceTestUtil.h"
#include "platform/gui/SinkSurface.h"
#include "support/TsTestUtil.h"

namespace android::test {
namespace {

constexpr int kScreenWidth = 640;
constexpr int kScreenHeight = 480;

// An Xvfb server of the test's own, on a display number no one else holds.
class VirtualDisplay {
public:
    VirtualDisplay() {
        int n = 50 + getpid() % 400;
        while (access(("/tmp/.X" + std::to_string(n) + "-lock").c_str(), F_OK) == 0)
            n += 7;
        mName = ":" + std::to_string(n);
        const std::string screen =
            std::to_string(kScreenWidth) + "x" + std::to_string(kScreenHeight) + "x24";
        mPid = fork();
        if (mPid == 0) {
            execlp("Xvfb", "Xvfb", mName.c_str(), "-screen", "0", screen.c_str(), "-nolisten",
                   "tcp", static_cast<char*>(nullptr));
            _exit(127);
        }
        const std::string socket = "/tmp/.X11-unix/X" + std::to_string(n);
        running = TavoPlayer::test::waitUntil([&] { return access(socket.c_str(), F_OK) == 0; });
        setenv("DISPLAY", mName.c_str(), 1);
    }
    ~VirtualDisplay() {
        unsetenv("DISPLAY");
        if (mPid > 0) {
            kill(mPid, SIGTERM);
            waitpid(mPid, nullptr, 0);
        }
    }
    const std::string& name() const { return mName; }
    bool running = false;

private:
    pid_t mPid = -1;
    std::string mName;
};

struct Rgb {
    double r, g, b;
};

// ITU-R BT.601, studio range, as a display converts 4:2:0 standard definition.
Rgb bt601(int y, int cb, int cr) {
    const double l = 1.164 * (y - 16);
    auto clamp = [](double v) { return std::clamp(v, 0.0, 255.0); };
    return {clamp(l + 1.596 * (cr - 128)), clamp(l - 0.392 * (cb - 128) - 0.813 * (cr - 128)),
            clamp(l + 2.017 * (cb - 128))};
}

class SdlSinkTest : public testing::Test {
protected:
    void SetUp() override {
        if (access("/usr/bin/Xvfb", X_OK) != 0)
            GTEST_SKIP() << "Xvfb is not installed: the window sink is not tested here";
        mDisplay = std::make_unique<VirtualDisplay>();
        ASSERT_TRUE(mDisplay->running) << "Xvfb did not start";
        ScopedSinkProperties properties("sdl");
        sp<Surface> surface = Surface::create();
        ASSERT_NE(surface, nullptr) << "no SDL window on " << mDisplay->name();
        mSurface = static_cast<SinkSurface*>(surface.get());
        EXPECT_STREQ(mSurface->sinkName(), "sdl");
    }
    void TearDown() override { mSurface.clear(); }

    // Shows `picture` and waits (generously) until the window has presented it.
    void showAndWait(const SurfacePicture& picture) {
        const uint64_t before = mSurface->showLog().shownCount();
        ASSERT_EQ(mSurface->showPicture(picture), 0);
        TavoPlayer::test::waitUntil([&] { return mSurface->showLog().shownCount() > before; });
        ASSERT_EQ(mSurface->showLog().shownCount(), before + 1);
    }

    // The screen as RGB, grabbed by FFmpeg; retried until something is on it.
    std::string grab() {
        std::string screen;
        for (int attempt = 0; attempt < 20; ++attempt) {
            screen = runCommand("ffmpeg -v error -f x11grab -video_size " +
                                std::to_string(kScreenWidth) + "x" + std::to_string(kScreenHeight) +
                                " -draw_mouse 0 -i " + mDisplay->name() +
                                " -frames:v 1 -f rawvideo -pix_fmt rgb24 -")
                         .out;
            if (screen.find_first_not_of('\0') != std::string::npos)
                break;
            std::this_thread::sleep_for(std::chrono::milliseconds(100));
        }
        return screen;
    }

    // Checks that exactly a width x height area is lit, in the expected colour.
    void expectWindow(const std::string& screen, int width, int height, const Rgb& expected) {
        ASSERT_EQ(screen.size(), size_t{kScreenWidth} * kScreenHeight * 3);
        int left = kScreenWidth, top = kScreenHeight, right = -1, bottom = -1;
        double sum[3] = {0, 0, 0};
        for (int y = 0; y < kScreenHeight; ++y) {
            for (int x = 0; x < kScreenWidth; ++x) {
                const auto* p =
                    reinterpret_cast<const uint8_t*>(&screen[(y * kScreenWidth + x) * 3]);
                if (p[0] < 16 && p[1] < 16 && p[2] < 16)
                    continue;
                left = std::min(left, x);
                right = std::max(right, x);
                top = std::min(top, y);
                bottom = std::max(bottom, y);
                for (int c = 0; c < 3; ++c)
                    sum[c] += p[c];
            }
        }
        ASSERT_GE(right, 0) << "the screen is blank";
        EXPECT_EQ(right - left + 1, width);
        EXPECT_EQ(bottom - top + 1, height);
        const double n = static_cast<double>(width) * height;
        EXPECT_NEAR(sum[0] / n, expected.r, 6.0);
        EXPECT_NEAR(sum[1] / n, expected.g, 6.0);
        EXPECT_NEAR(sum[2] / n, expected.b, 6.0);
    }

    std::unique_ptr<VirtualDisplay> mDisplay;
    sp<SinkSurface> mSurface;
};

// A window at the size of the picture's crop, in its colours; interlaced pictures go
// through the deinterlacer, which runs one picture behind.
TEST_F(SdlSinkTest, AWindowShowsTheCropInItsColoursDeinterlacedOnePictureBehind) {
    TestPicture picture(336, 256, 60, 100, 200);
    const android_native_rect_t crop{0, 0, 320, 240};
    ASSERT_EQ(native_window_set_crop(mSurface.get(), &crop), 0);
    SurfacePicture interlaced = picture.picture();
    interlaced.interlaced = true;
    for (int i = 0; i < 3; ++i) {
        interlaced.ptsUs = 1'000'000 + i * 33'367;
        showAndWait(interlaced);
    }
    // The first picture is shown woven while the filter fills; after that each
    // shown picture is the filter's output for the picture before.
    const std::vector<ShowLog::Entry> shown = mSurface->showLog().history();
    ASSERT_EQ(shown.size(), 3u);
    EXPECT_EQ(shown[0].pts90k, 90000u);
    EXPECT_EQ(shown[1].pts90k, 90000u);
    EXPECT_EQ(shown[2].pts90k, 93003u);
    // A flat picture stays flat through the deinterlacer.
    expectWindow(grab(), 320, 240, bt601(60, 100, 200));
}

}  // namespace
}  // namespace android::test
