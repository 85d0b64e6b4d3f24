// Still capture through the decoder module: a decoded tsgen picture converted and
// compared with FFmpeg's own RGB conversion, and the refusals and failures.
#include <gtest/gtest.h>

#include <mutex>

extern "C" {
#include <libswscale/swscale.h>
}

#include "DecoderTestUtil.h"
#include "PesRecordTestUtil.h"
#include "decoder/MediaCodecDecoder.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

struct Capture {
    std::vector<uint32_t> pixels;
    bool flag;
};

// Keeps every capture delivered; while a test holds `gate`, the callback waits for it.
class Listener : public CaptureFrameListener, public test::Recorded<Capture> {
public:
    void onCaptureFrame(unsigned char* pixels, unsigned int width, unsigned int height,
                        bool flag) override {
        std::lock_guard<std::mutex> wait(gate);
        const auto* argb = reinterpret_cast<const uint32_t*>(pixels);
        push({std::vector<uint32_t>(argb, argb + width * height), flag});
        delete[] pixels;
    }
    bool waitForCaptures(size_t count) {
        return waitFor([&](const auto& all) { return all.size() == count; });
    }
    std::mutex gate;
};

class MediaCodecDecoderCaptureTest : public ::testing::Test {
public:
    void SetUp() override {
        mDecoder->configure(Decoder::CODING_H264);
        mFrame.mColorFormat = 261;
        mFrame.mCropWidth = 320;
        mFrame.mCropHeight = 240;
    }
    void setSurface() {
        android::sp<android::Surface> surface = mSurface;
        mDecoder->setSurface(surface);
    }
    test::TraceCapture mTrace;
    android::sp<MediaCodecDecoder> mDecoder = new MediaCodecDecoder();
    android::sp<test::RecordingSurface> mSurface = new test::RecordingSurface();
    VideoFrameData mFrame;
    Listener mListener;
};

TEST_F(MediaCodecDecoderCaptureTest, DecodedPictureMatchesFfmpegsConversion) {
    const test::Bytes ts = test::runTsgen("-d 1 --audio none --size 320x240 --progressive");
    ASSERT_FALSE(ts.empty());
    const test::DecodedRun run = test::runDecoder(ts, 0x111, Decoder::CODING_H264, mSurface);
    ASSERT_GT(mSurface->shown().size(), 10u);
    int width = 0, height = 0;
    std::vector<uint8_t> nv12 = mSurface->lastPicture(&width, &height);
    ASSERT_EQ(320, width);
    setSurface();
    ASSERT_TRUE(mDecoder->captureFrame(mFrame, &mListener));
    ASSERT_TRUE(mListener.waitForCaptures(1));
    const Capture capture = mListener.snapshot()[0];
    EXPECT_FALSE(capture.flag);
    ASSERT_EQ(320u * 240u, capture.pixels.size());
    EXPECT_EQ(1, mSurface->queuedBack);

    // FFmpeg: full-range BT.601 NV12 to BGRA (bytes B, G, R, A as the capture's
    // little-endian 0xAARRGGBB), chroma repeated over each 2 x 2 block.
    SwsContext* sws = sws_getContext(320, 240, AV_PIX_FMT_NV12, 320, 240, AV_PIX_FMT_BGRA,
                                     SWS_POINT, nullptr, nullptr, nullptr);
    ASSERT_NE(nullptr, sws);
    const int* table = sws_getCoefficients(SWS_CS_ITU601);
    sws_setColorspaceDetails(sws, table, 1, table, 1, 0, 1 << 16, 1 << 16);
    std::vector<uint32_t> reference(320 * 240);
    const uint8_t* planes[2] = {nv12.data(), nv12.data() + 320 * 240};
    const int strides[2] = {320, 320};
    uint8_t* out[1] = {reinterpret_cast<uint8_t*>(reference.data())};
    const int outStride[1] = {320 * 4};
    sws_scale(sws, planes, strides, 0, 240, out, outStride);
    sws_freeContext(sws);
    // The 10-bit factors truncate (arithmetic shifts) where FFmpeg rounds.
    int worst = 0;
    for (size_t i = 0; i < reference.size(); ++i) {
        for (int shift : {0, 8, 16}) {
            const int ours = (capture.pixels[i] >> shift) & 0xFF;
            const int theirs = (reference[i] >> shift) & 0xFF;
            worst = std::max(worst, std::abs(ours - theirs));
        }
        ASSERT_EQ(0xFF000000u, capture.pixels[i] & 0xFF000000u);
    }
    EXPECT_LE(worst, 3);
}

TEST_F(MediaCodecDecoderCaptureTest, OneCaptureAtATime) {
    mSurface->setLastPicture(std::vector<uint8_t>(320 * 240 * 3 / 2, 128), 320, 240);
    setSurface();
    std::unique_lock<std::mutex> held(mListener.gate);
    ASSERT_TRUE(mDecoder->captureFrame(mFrame, &mListener));
    EXPECT_FALSE(mDecoder->captureFrame(mFrame, &mListener));
    EXPECT_TRUE(mTrace.contains("captureFrame: Capture is in progress"));
    held.unlock();
    ASSERT_TRUE(mListener.waitForCaptures(1));
    EXPECT_EQ(std::vector<uint32_t>(320 * 240, 0xFF808080u), mListener.snapshot()[0].pixels);
    // A finished capture is replaced by the next one.
    ASSERT_TRUE(test::waitUntil([&] { return mDecoder->captureFrame(mFrame, &mListener); }));
    EXPECT_TRUE(mListener.waitForCaptures(2));
}

// Each failure is logged, and the listener is never called.
TEST_F(MediaCodecDecoderCaptureTest, FailuresLogAndNeverCallTheListener) {
    struct Row {
        const char* name;
        bool surface;
        int dequeueStatus;
        int lockStatus;
        int32_t colorFormat;
        bool started;
        const char* message;
    };
    for (const Row& row : {
             Row{"NoSurface", false, 0, 0, 261, false, "captureFrame: m_pSurface is null"},
             Row{"DequeueFails", true, -19, 0, 261, false, "dequeueBuffer returned error -19"},
             Row{"LockFails", true, 0, -22, 261, false, "mapper.lockYCbCr error -22"},
             Row{"UnsupportedFormat", true, 0, 0, 19, true, "threadLoop: Error converting frame"},
         }) {
        test::TraceCapture trace;
        android::sp<MediaCodecDecoder> decoder = new MediaCodecDecoder();
        decoder->configure(Decoder::CODING_H264);
        android::sp<test::RecordingSurface> recording = new test::RecordingSurface();
        recording->setLastPicture(std::vector<uint8_t>(320 * 240 * 3 / 2, 16), 320, 240);
        recording->dequeueStatus = row.dequeueStatus;
        recording->lockStatus = row.lockStatus;
        android::sp<android::Surface> surface = recording;
        if (row.surface)
            decoder->setSurface(surface);
        mFrame.mColorFormat = row.colorFormat;
        Listener listener;
        EXPECT_EQ(row.started, decoder->captureFrame(mFrame, &listener)) << row.name;
        EXPECT_TRUE(test::waitUntil([&] { return trace.contains(row.message); }))
            << row.name << "\n"
            << trace.all();
        if (row.lockStatus != 0) {
            EXPECT_EQ(1, recording->queuedBack) << "a dequeued buffer always goes back";
        }
        EXPECT_TRUE(listener.snapshot().empty()) << row.name;
    }
}

}  // namespace
}  // namespace TavoPlayer
