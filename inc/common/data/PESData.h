// PESData: one complete PES packet in a ring (type 0), written by the TS parser
// module. Header 40 bytes, then the whole PES packet from its 00 00 01 prefix.
//
//   offset  0  dispatch header      offset 24  mDTS (90 kHz, 33 bits)
//   offset  8  mType = 0            offset 32  mOffsetES = mSize - mSizeES
//   offset 12  mSize = 40 + PES     offset 36  mSizeES (payload after the PES header)
//   offset 16  mPTS (90 kHz, 33 bits)
#pragma once

#include "common/data/Data.h"

namespace TavoPlayer {

class TAVO_RING_RECORD PESData : public Data {
public:
    static constexpr uint32_t kHeaderSize = 40;

    PESData() : Data(TYPE_PES, kHeaderSize), mPTS(0), mDTS(0), mOffsetES(0), mSizeES(0) {}

    std::string toString() override;
    bool fromString(char* text) override;
    // The whole PES packet: bytes from offset 40, mSize - 40 of them.
    int getRaw(unsigned char** data, unsigned int* size) override;

    // The PES packet and its elementary-stream payload, in place.
    uint8_t* pesBytes() { return reinterpret_cast<uint8_t*>(this) + kHeaderSize; }
    uint8_t* esBytes() { return reinterpret_cast<uint8_t*>(this) + mOffsetES; }

    uint64_t mPTS;
    uint64_t mDTS;
    uint32_t mOffsetES;
    uint32_t mSizeES;
};

}  // namespace TavoPlayer
