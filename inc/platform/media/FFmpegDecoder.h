// FFmpegDecoder: one libavcodec decoder behind the platform codec, with the
// conversions its output needs (NV12 pictures, interleaved signed 16-bit PCM).
//
// Threads: used by one thread at a time (the codec's looper while the codec runs).
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

struct AVCodecContext;
struct AVFrame;
struct AVPacket;
struct SwsContext;
struct SwrContext;

namespace android {

// What a decoded frame looks like, for the codec's output format.
struct DecodedInfo {
    int64_t ptsUs = 0;
    bool keyFrame = false;
    // video
    int32_t width = 0;  // coded size (the buffer's), before cropping
    int32_t height = 0;
    int32_t cropLeft = 0;  // inclusive rectangle inside the coded size
    int32_t cropTop = 0;
    int32_t cropRight = -1;
    int32_t cropBottom = -1;
    bool interlaced = false;
    bool topFieldFirst = false;
    // audio
    int32_t sampleRate = 0;
    int32_t channelCount = 0;
    size_t bytes = 0;  // size of the converted output
};

class FFmpegDecoder {
public:
    enum class Kind { Avc, Aac, MpegAudio };

    // `threads` 0: one frame thread per core (video only).
    FFmpegDecoder(Kind kind, int threads);
    ~FFmpegDecoder();
    FFmpegDecoder(const FFmpegDecoder&) = delete;
    FFmpegDecoder& operator=(const FFmpegDecoder&) = delete;

    // Opens the decoder where the kind allows it without stream data (H.264).
    // false on failure (logged).
    bool open();
    bool isOpen() const { return mContext != nullptr; }
    // AAC: `data` is an AudioSpecificConfig (ISO/IEC 14496-3, 1.6.2.1); the decoder is
    // (re)opened with it unless it is the one in use. false when FFmpeg rejects it
    // (logged); the decoder is then closed until a valid one arrives.
    bool setConfig(const uint8_t* data, size_t size);

    // Sends one unit (which must have AV_INPUT_BUFFER_PADDING_SIZE zero bytes after
    // it). MPEG audio opens the decoder for the layer of the first header. Returns 0,
    // EAGAIN-as-AVERROR when frames must be received first, or another negative
    // AVERROR (the unit was rejected).
    int send(const uint8_t* data, size_t size, int64_t ptsUs);
    // 0 when a frame was received (kept until writeFrame or dropFrame), AVERROR(EAGAIN)
    // when none is ready, another negative AVERROR on a decoding error.
    int receive();
    bool hasFrame() const { return mHaveFrame; }
    // The held frame's description; info.bytes is what writeFrame needs.
    bool describeFrame(DecodedInfo* info);
    // Converts the held frame into `out` (NV12 at the coded size with strides equal
    // to the width, or interleaved s16) and drops it. false when it cannot (logged).
    bool writeFrame(uint8_t* out, size_t capacity, const DecodedInfo& info);
    // The held picture's planes, referenced as decoded instead of converted: 8-bit
    // 4:2:0 planar pictures only (what the H.264 decoder gives for the profiles
    // broadcast uses). The frame leaves the decoder and lives while `owner` does.
    struct Planes {
        std::shared_ptr<const void> owner;
        const uint8_t* y = nullptr;
        const uint8_t* cb = nullptr;
        const uint8_t* cr = nullptr;
        int32_t yStride = 0;
        int32_t cStride = 0;
    };
    // false (the frame stays held) when the picture is not 8-bit 4:2:0 planar.
    bool takePlanes(Planes* planes);
    void dropFrame();

private:
    bool openCodec(const char* name, const uint8_t* extradata, size_t extradataSize);
    void close();

    const Kind mKind;
    const int mThreads;
    AVCodecContext* mContext = nullptr;
    AVFrame* mFrame = nullptr;
    AVPacket* mPacket = nullptr;
    SwsContext* mSws = nullptr;
    SwrContext* mSwr = nullptr;
    int mSwrFormat = -1;  // input sample format, rate and channels mSwr was set up for
    int mSwrRate = 0;
    int mSwrChannels = 0;
    bool mHaveFrame = false;
    std::vector<uint8_t> mConfig;  // the AudioSpecificConfig in use
};

}  // namespace android
