// ClosedCaptionFragmentData: caption text in a ring (type 3), written by the
// caption decoder. It derives from Data virtually, so its own part comes first:
//
//   offset  0  dispatch header of the caption part
//   offset  8  mPTS, the PTS of the PES the caption came from (90 kHz)
//   offset 16  dispatch header of the Data part
//   offset 24  mType = 3,  offset 28  mSize = 32 + text length
//   offset 32  the caption text (32-bit code points), no terminating zero
#pragma once

#include "common/data/Data.h"

namespace TavoPlayer {

class TAVO_RING_RECORD ClosedCaptionFragmentData : public virtual Data {
public:
    static constexpr uint32_t kHeaderSize = 32;

    ClosedCaptionFragmentData() : Data(TYPE_CLOSED_CAPTION_FRAGMENT, kHeaderSize), mPTS(0) {}

    // This record has no text form: the original builds it from an absent text and
    // must never be asked. Here it logs the misuse and returns an empty string.
    std::string toString() override;
    // Accepts any text without parsing it.
    bool fromString(char* text) override;
    // Leaves both outputs untouched.
    int getRaw(unsigned char** data, unsigned int* size) override;

    uint8_t* textBytes() { return reinterpret_cast<uint8_t*>(this) + kHeaderSize; }

    uint64_t mPTS;
};

}  // namespace TavoPlayer
