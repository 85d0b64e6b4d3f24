#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "AacFramer.h"
#include "Options.h"
#include "PesUnit.h"

struct AVCodecContext;
struct AVFrame;
struct AVPacket;

namespace TavoPlayer::tsgen {

// Encodes a test tone with libavcodec (AAC, MP2 or MP3) and frames it for the
// transport: AAC in ADTS or LOAS/LATM, MPEG audio as is. One PES unit holds a
// fixed number of frames; its PTS is that of its first frame.
class AudioEncoder {
public:
    explicit AudioEncoder(const Options& options);
    ~AudioEncoder();
    AudioEncoder(const AudioEncoder&) = delete;
    AudioEncoder& operator=(const AudioEncoder&) = delete;

    int open();
    // Returns 0 with the next PES unit, 1 at the end, negative on failure.
    int next(PesUnit& unit);
    int frameSamples() const;
    double toneHz() const { return mToneHz; }
    const std::string& error() const { return mError; }

private:
    int encodeFrame(std::vector<uint8_t>& framed);
    int sendNextFrame();
    void fillTone();
    double syncMarkLevel(int64_t inputSample) const;

    const Options& mOptions;
    std::unique_ptr<AacFramer> mFramer;
    AVCodecContext* mContext = nullptr;
    AVFrame* mFrame = nullptr;
    AVPacket* mPacket = nullptr;
    int64_t mTotalSamples = 0;
    int64_t mSamplesSent = 0;
    int64_t mFramesOut = 0;
    int64_t mEncodedFrames = 0;
    bool mFlushed = false;
    bool mEnded = false;
    double mToneHz = 1000.0;
    int64_t mPrimingSamples = 0;  // the encoder's delay: input sample t decodes at t + this
    std::string mError;
};

}  // namespace TavoPlayer::tsgen
