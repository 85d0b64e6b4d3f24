// The surface and its headless sinks: what the codec shows is cropped, recorded
// and logged; the capture's buffer holds the most recently shown picture; the y4m
// file is a stream that FFmpeg reads back with the right size and frame count.
#include <unistd.h>

#include <cstdio>

#include <gtest/gtest.h>

#include "SurfaceTestUtil.h"
#include "platform/gui/SinkSurface.h"

namespace android::test {
namespace {

sp<SinkSurface> createSurface(const std::string& sink, const std::string& logPath = "") {
    ScopedSinkProperties properties(sink, logPath);
    sp<Surface> surface = Surface::create();
    return static_cast<SinkSurface*>(surface.get());
}

// Checks that the NV12 planes hold the 64 x 48 rectangle of `picture` at (4, 2): the
// crop every test here shows.
void expectCrop(const TestPicture& picture, const uint8_t* y, size_t yStride, const uint8_t* uv,
                size_t uvStride) {
    for (int row = 0; row < 48; ++row) {
        for (int col = 0; col < 64; ++col)
            ASSERT_EQ(y[row * yStride + col], picture.lumaAt(row + 2, col + 4)) << row;
    }
    for (int row = 0; row < 24; ++row) {
        for (int byte = 0; byte < 64; ++byte)
            ASSERT_EQ(uv[row * uvStride + byte], picture.chromaAt(row + 1, byte + 4)) << row;
    }
}

// Pictures are shown with a crop, as the codec shows them; those shown with shared
// planes (the codec's output buffers) are kept by reference instead of copied, every
// reader honours the rows' stride and the crop, and the planes are let go once
// nothing shows or captures them.
class SurfaceTest : public testing::Test {
protected:
    // A 1920 x 1088 coded picture shown with the SPS's crop to 1920 x 1080 is the
    // broadcast case; here a smaller one with a crop that is off the origin.
    static constexpr android_native_rect_t kCrop{4, 2, 68, 50};  // 64 x 48 at (4, 2)

    static sp<SinkSurface> croppedSurface(const std::string& sink, const std::string& log = "") {
        sp<SinkSurface> surface = createSurface(sink, log);
        if (surface != nullptr) {
            EXPECT_EQ(native_window_set_crop(surface.get(), &kCrop), 0);
        }
        return surface;
    }
    // A padded picture whose planes live as long as the returned reference.
    static std::shared_ptr<const TestPicture> makePicture(int seed, int64_t ptsUs = 0) {
        return std::make_shared<const TestPicture>(80, 64, seed, ptsUs);
    }
    static int show(Surface& surface, const std::shared_ptr<const TestPicture>& picture) {
        return surface.showSharedPicture(picture->picture(), picture);
    }
};

TEST_F(SurfaceTest, NullSinkCountsCropsAndLogsEveryPicture) {
    const std::string logPath = TavoPlayer::test::tempPath("null.log");
    sp<SinkSurface> surface = croppedSurface("null", logPath);
    ASSERT_NE(surface, nullptr);
    EXPECT_STREQ(surface->sinkName(), "null");
    const int64_t ptsUs[] = {1'000'000, 1'033'366, 95'443'717'700};  // the last wraps 2^33 ticks
    std::shared_ptr<const TestPicture> picture;
    for (int i = 0; i < 3; ++i) {
        picture = makePicture(i, ptsUs[i]);
        ASSERT_EQ(surface->showPicture(picture->picture()), 0);
    }
    std::shared_ptr<const SinkPicture> last = surface->lastPicture();
    ASSERT_NE(last, nullptr);
    ASSERT_EQ(last->width, 64);
    ASSERT_EQ(last->height, 48);
    expectCrop(*picture, last->y(), 64, last->uv(), 64);

    // The log: "shown-at-ns pts90k width height" per picture; the last pts wraps 2^33.
    const std::vector<ShowLog::Entry> history = surface->showLog().history();
    ASSERT_EQ(history.size(), 3u);
    std::string expected;
    const char* pts[] = {" 90000 64 48\n", " 93002 64 48\n", " 1 64 48\n"};
    for (int i = 0; i < 3; ++i)
        expected += std::to_string(history[i].monotonicNs) + pts[i];
    EXPECT_EQ(fileText(logPath), expected);
    EXPECT_LE(history[0].monotonicNs, history[2].monotonicNs);
    unlink(logPath.c_str());
}

TEST_F(SurfaceTest, RejectsMalformedPicturesAndUnknownSinks) {
    sp<SinkSurface> surface = createSurface("null");
    ASSERT_NE(surface, nullptr);
    TestPicture picture(32, 16, 0, 0);
    SurfacePicture noChroma = picture.picture();
    noChroma.uv = nullptr;
    SurfacePicture shortStride = picture.picture();
    shortStride.yStride = 16;
    EXPECT_LT(surface->showPicture(noChroma), 0);
    EXPECT_LT(surface->showPicture(shortStride), 0);
    EXPECT_EQ(surface->showLog().shownCount(), 0u);

    EXPECT_EQ(createSurface("vga"), nullptr);
    EXPECT_EQ(createSurface("y4m:/nonexistent-dir/out.y4m"), nullptr);
}

TEST_F(SurfaceTest, KeepsAReferenceToTheCropAndCapturesItPacked) {
    sp<SinkSurface> surface = croppedSurface("null");
    ASSERT_NE(surface, nullptr);
    ANativeWindowBuffer* buffer = nullptr;
    EXPECT_LT(surface->dequeueBuffer(&buffer), 0);  // nothing shown yet
    std::shared_ptr<const TestPicture> first = makePicture(1);
    const std::weak_ptr<const TestPicture> firstAlive = first;
    ASSERT_EQ(show(*surface, first), 0);

    // No copy: the picture starts at the crop inside the shared planes.
    EXPECT_EQ(surface->lastPicture()->y(), first->y.data() + 2 * first->stride + 4);
    EXPECT_EQ(surface->lastPicture()->uv(), first->uv.data() + 1 * first->stride + 4);

    ASSERT_EQ(surface->dequeueBuffer(&buffer), 0);
    first.reset();
    // Shown later, while the capture holds the first picture.
    const std::shared_ptr<const TestPicture> latest = makePicture(2);
    ASSERT_EQ(show(*surface, latest), 0);
    EXPECT_FALSE(firstAlive.expired());

    // The capture reads packed rows at the picture's width, chroma straight after luma.
    android_ycbcr ycbcr{};
    GraphicBufferMapper& mapper = GraphicBufferMapper::get();
    ASSERT_EQ(mapper.lockYCbCr(buffer, 3, Rect{0, 0, 64, 48}, &ycbcr), 0);
    const auto* y = static_cast<const uint8_t*>(ycbcr.y);
    const auto* cb = static_cast<const uint8_t*>(ycbcr.cb);
    EXPECT_EQ(cb, y + 64 * 48);
    expectCrop(*firstAlive.lock(), y, 64, cb, 64);
    EXPECT_EQ(mapper.unlock(buffer), 0);
    EXPECT_LT(mapper.lockYCbCr(buffer, 3, Rect{0, 0, 66, 48}, &ycbcr), 0);  // wider than it
    EXPECT_EQ(surface->queueBuffer(buffer, -1), 0);
    EXPECT_LT(surface->queueBuffer(buffer, -1), 0);  // not ours any more

    // Neither shown nor captured any more: the planes are let go.
    EXPECT_TRUE(firstAlive.expired());
    // A new capture sees the latest picture.
    ASSERT_EQ(surface->dequeueBuffer(&buffer), 0);
    ASSERT_EQ(mapper.lockYCbCr(buffer, 3, Rect{0, 0, 64, 48}, &ycbcr), 0);
    expectCrop(*latest, static_cast<const uint8_t*>(ycbcr.y), 64,
               static_cast<const uint8_t*>(ycbcr.cb), 64);
    mapper.unlock(buffer);
    EXPECT_EQ(surface->queueBuffer(buffer, -1), 0);
}

// The y4m file is a stream FFmpeg reads back: every picture, at the size of the first
// (a stream that changes size midway is scaled to it), the crop of shared planes.
TEST_F(SurfaceTest, Y4mSinkWritesEveryPictureAtTheFirstCropsSize) {
    const std::string path = TavoPlayer::test::tempPath("shared.y4m");
    std::shared_ptr<const TestPicture> picture = makePicture(3);
    {
        sp<SinkSurface> surface = croppedSurface("y4m:" + path);
        ASSERT_NE(surface, nullptr);
        ASSERT_EQ(show(*surface, picture), 0);
        ASSERT_EQ(show(*surface, makePicture(4, 33'367)), 0);
        ASSERT_EQ(native_window_set_crop(surface.get(), nullptr), 0);
        TestPicture larger(128, 96, 9, 66'733);
        ASSERT_EQ(surface->showPicture(larger.picture()), 0);
    }
    EXPECT_EQ(runCommand("ffprobe -v error -count_frames -select_streams v:0 -show_entries "
                         "stream=width,height,nb_read_frames -of csv=p=0 '" +
                         path + "'")
                  .out,
              "64,48,3\n");
    const std::string frame =
        runCommand("ffmpeg -v error -i '" + path + "' -frames:v 1 -f rawvideo -pix_fmt nv12 -").out;
    unlink(path.c_str());
    ASSERT_EQ(frame.size(), 64u * 48u * 3 / 2);
    const auto* y = reinterpret_cast<const uint8_t*>(frame.data());
    expectCrop(*picture, y, 64, y + 64 * 48, 64);
}

// Pictures whose chroma the decoder left planar: the surface that keeps a reference
// and the one that copies both give the same NV12 crop as the interleaved picture.
TEST_F(SurfaceTest, PlanarChromaGivesTheSameCropAsNv12) {
    std::shared_ptr<const TestPicture> nv12 = makePicture(4);
    const int32_t cStride = nv12->stride / 2 + 8;  // padded, as decoder planes are
    std::vector<uint8_t> cb(cStride * nv12->height / 2), cr(cb.size());
    for (int32_t row = 0; row < nv12->height / 2; ++row) {
        for (int32_t i = 0; i < nv12->width / 2; ++i) {
            cb[row * cStride + i] = nv12->chromaAt(row, 2 * i);
            cr[row * cStride + i] = nv12->chromaAt(row, 2 * i + 1);
        }
    }
    SurfacePicture planar = nv12->picture();
    planar.uv = nullptr;
    planar.uvStride = 0;
    planar.cb = cb.data();
    planar.cr = cr.data();
    planar.cStride = cStride;

    for (const bool shared : {true, false}) {
        sp<SinkSurface> surface = croppedSurface("null");
        ASSERT_NE(surface, nullptr);
        ASSERT_EQ(shared ? surface->showSharedPicture(planar, nv12) : surface->showPicture(planar),
                  0);
        std::shared_ptr<const SinkPicture> last = surface->lastPicture();
        ASSERT_NE(last, nullptr);
        SCOPED_TRACE(shared ? "shared" : "copied");
        expectCrop(*nv12, last->y(), last->lumaStride(), last->uv(), last->chromaStride());
    }
}

}  // namespace
}  // namespace android::test
