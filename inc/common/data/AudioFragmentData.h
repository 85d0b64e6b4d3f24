// AudioFragmentData: decoded PCM in a ring (type 1), written by the audio decoder.
// Header 32 bytes, then interleaved 16-bit PCM as the codec delivered it.
//
//   offset  8  mType = 1          offset 24  mNumberChannels (1 byte)
//   offset 12  mSize = 32 + PCM   offset 25  mBitsPerSample (1 byte, always 16)
//   offset 16  mPTS (90 kHz)      offset 28  mSamplingRate (Hz)
#pragma once

#include "common/data/Data.h"

namespace TavoPlayer {

class TAVO_RING_RECORD AudioFragmentData : public Data {
public:
    static constexpr uint32_t kHeaderSize = 32;

    AudioFragmentData()
        : Data(TYPE_AUDIO_FRAGMENT, kHeaderSize),
          mPTS(0),
          mNumberChannels(0),
          mBitsPerSample(16),
          mPadding{},
          mSamplingRate(0) {}

    std::string toString() override;
    bool fromString(char* text) override;
    int getRaw(unsigned char** data, unsigned int* size) override;

    uint64_t mPTS;
    uint8_t mNumberChannels;
    uint8_t mBitsPerSample;
    uint8_t mPadding[2];  // keeps mSamplingRate at 28
    uint32_t mSamplingRate;
};

}  // namespace TavoPlayer
