#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "Options.h"
#include "PesUnit.h"
#include "TestPattern.h"

struct AVCodecContext;
struct AVFrame;
struct AVPacket;

namespace TavoPlayer::tsgen {

// Encodes the test pattern with libx264 through libavcodec, one access unit
// per call, in decoding order. Single-threaded with fixed settings so that the
// same options give the same bytes.
class VideoEncoder {
public:
    explicit VideoEncoder(const Options& options);
    ~VideoEncoder();
    VideoEncoder(const VideoEncoder&) = delete;
    VideoEncoder& operator=(const VideoEncoder&) = delete;

    // Returns 0 when the encoder is ready, 1 with a message in error().
    int open();
    // Returns 0 with the next access unit, 1 at the end of the stream, or a
    // negative value on an encoder failure (message in error()).
    int next(PesUnit& unit);
    int64_t frameCount() const { return mFrameCount; }
    int64_t frameTicks90k() const;
    const std::string& error() const { return mError; }

private:
    int sendNextFrame();

    const Options& mOptions;
    TestPattern mPattern;
    AVCodecContext* mContext = nullptr;
    AVFrame* mFrame = nullptr;
    AVPacket* mPacket = nullptr;
    int64_t mFrameCount = 0;
    int64_t mFramesSent = 0;
    bool mFlushed = false;
    std::string mError;
};

}  // namespace TavoPlayer::tsgen
