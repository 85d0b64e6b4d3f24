// WriteBitInterface: appends MSB-first fields to a byte buffer.
//
// The writer never relies on a pre-cleared buffer: a byte is set to zero when the
// first bit is written into it, and later bits are OR-ed in. It works a byte at a
// time and supports fields of 1..16 bits; a longer field is refused (nothing is
// written), which every field the system writes respects except the 24-bit explicit
// sampling frequency of an AudioSpecificConfig (ISO/IEC 14496-3, 1.6.2.1), which its
// writer splits.
#pragma once

#include <cstdint>

#include "decoder/BitInterface.h"

namespace TavoPlayer {

class WriteBitInterface : public BitInterface {
public:
    static constexpr unsigned int kMaxWriteBits = 16;

    WriteBitInterface(void* buffer, unsigned int size) : BitInterface(buffer, size) {}
    ~WriteBitInterface() override;

    // Appends the low `count` bits of `value`, most significant first. Returns 0.
    // `count` 0 does nothing; a count above 16 returns without writing.
    int writeBits(unsigned int value, unsigned int count);
    // Pads with zero bits to the next byte boundary; stores 1 if it wrote any, else 0
    // (through `moved` when it is not null).
    void byteAlign(int* moved);
    // Writes `count` zero bits (the same 16-bit limit); `bytesAdvanced` is ignored.
    void skipBits(unsigned char count, int* bytesAdvanced);
};

}  // namespace TavoPlayer
