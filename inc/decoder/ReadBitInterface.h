// ReadBitInterface: reads MSB-first fields from a byte buffer.
//
// A read of `count` bits at bit position p loads exactly the ceil((p + count) / 8) bytes
// that the field spans and never a byte beyond them, so a parser that knows a field
// lies inside its buffer can read it without a bounds check. Fields of 25..32 bits go
// through readBitsLong, which splits them so that every load stays within 32 bits.
#pragma once

#include <cstdint>

#include "decoder/BitInterface.h"

namespace TavoPlayer {

class ReadBitInterface : public BitInterface {
public:
    ReadBitInterface(void* buffer, unsigned int size) : BitInterface(buffer, size) {}
    ~ReadBitInterface() override;

    // The next `count` bits (0..25) as an unsigned value; advances. 0 bits read 0.
    uint32_t readBits(unsigned char count);
    // As readBits without advancing.
    uint32_t peekBits(unsigned char count) const;
    // Fields of 25..32 bits. Any other count is logged and returns 0 without moving.
    uint32_t readBitsLong(unsigned char count);
    // Reads `count` bits from `buffer` (owned by the caller) at this object's bit
    // position; stores the whole bytes the caller must advance its pointer by through
    // `bytesAdvanced` and keeps the new bit position. This object's own pointer and
    // remaining count do not move.
    uint32_t readBits(unsigned char* buffer, unsigned char count, int* bytesAdvanced);
    // Moves to the start of the next byte unless aligned; stores 1 if it moved, else 0
    // (through `moved` when it is not null).
    void byteAlign(int* moved);
    // Advances by `count` bits (0..255); stores the whole bytes passed when not null.
    void skipBits(unsigned char count, int* bytesAdvanced);

private:
    // The field of `count` bits at bit position `bitPosition` of `bytes`, loading
    // only the bytes it spans.
    static uint32_t extract(const uint8_t* bytes, uint8_t bitPosition, unsigned char count);
};

}  // namespace TavoPlayer
