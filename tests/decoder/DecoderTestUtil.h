// Helpers for the decoder module's tests: a surface that keeps what it is shown, and a
// runner that feeds a transport stream through the TS parser module into a
// MediaCodecDecoder and collects what comes out of the decoder's output ring.
#pragma once

#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include <utils/StrongPointer.h>

#include "decoder/Decoder.h"
#include "platform/gui/Surface.h"
#include "platform/media/MediaCodec.h"

namespace TavoPlayer::test {

// Keeps an MD5 of the cropped NV12 bytes of every picture shown (Y rows, then the
// interleaved chroma rows, as FFmpeg's framemd5 of nv12 hashes them) and a copy of the
// last one, which dequeueBuffer hands out for capture.
class RecordingSurface : public android::Surface {
public:
    struct Shown {
        int64_t ptsUs;
        std::string md5;
        int width;  // cropped
        int height;
    };

    int showPicture(const android::SurfacePicture& picture) override;
    int setCrop(const android::android_native_rect_t* crop) override;
    int dequeueBuffer(android::ANativeWindowBuffer** buffer) override;
    int queueBuffer(android::ANativeWindowBuffer* buffer, int fenceFd) override;

    std::vector<Shown> shown() const;
    // The last picture, cropped, as contiguous NV12.
    std::vector<uint8_t> lastPicture(int* width, int* height) const;
    // Replaces the last picture (for capture tests).
    void setLastPicture(std::vector<uint8_t> nv12, int width, int height);

    // Statuses the window operations answer with, for failure paths.
    int dequeueStatus = 0;
    int lockStatus = 0;
    int queuedBack = 0;

private:
    class Buffer : public android::ANativeWindowBuffer {
    public:
        explicit Buffer(RecordingSurface& surface) : mSurface(surface) {}
        int lockYCbCr(uint32_t usage, const android::Rect& bounds,
                      android::android_ycbcr* ycbcr) override;
        int unlock() override { return 0; }

    private:
        RecordingSurface& mSurface;
    };

    mutable std::mutex mMutex;
    android::android_native_rect_t mCrop{0, 0, 0, 0};
    bool mCropSet = false;
    std::vector<Shown> mShown;
    std::vector<uint8_t> mLast;
    int mLastWidth = 0;
    int mLastHeight = 0;
    Buffer mBuffer{*this};
};

struct VideoRecord {
    uint64_t pts;
    int32_t colorFormat;
    uint8_t flag;
    uint32_t width;
    uint32_t height;
};

struct AudioRecord {
    uint64_t pts;
    uint8_t channels;
    uint32_t sampleRate;
    uint32_t bytes;
};

struct DecodedRun {
    bool started = false;
    std::vector<VideoRecord> video;
    std::vector<AudioRecord> audio;
    std::vector<uint8_t> pcm;
    std::vector<std::pair<int, int>> resolutions;  // told to the decoder info listener
    uint64_t rejectedUnits = 0;
    uint64_t configInputs = 0;
    size_t heldOutputBuffers = 0;  // client-held codec buffers once every record is used
    unsigned int stopResult = 0;
};

// Runs the packets of `pid` (video when `type` is H.264, else audio) through TS parser,
// decoder and output ring. Video records are rendered to `surface` as they are read.
DecodedRun runDecoder(const std::vector<uint8_t>& ts, uint16_t pid, Decoder::codingType_t type,
                      const android::sp<android::Surface>& surface);

// FFmpeg's reference for the same file, from its command-line tool.
struct FramemdLine {
    int64_t pts;
    std::string md5;
};
std::vector<FramemdLine> ffmpegFramemd5(const std::string& path);
// `format` names the input format when the file is a bare elementary stream.
std::vector<uint8_t> ffmpegPcm(const std::string& path, const std::string& format = "");

}  // namespace TavoPlayer::test
