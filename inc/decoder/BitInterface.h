// BitInterface: a most-significant-bit-first cursor over a byte buffer, the base of
// ReadBitInterface and WriteBitInterface.
//
// MPEG syntax (ISO/IEC 13818-1, ITU-T H.264 7.2, ISO/IEC 14496-3) orders bits from the
// most significant bit of each byte, and multi-bit fields big-endian across byte
// boundaries; both directions follow that order.
//
// The cursor is deliberately unchecked: no operation looks at the remaining byte count
// before touching memory. Bounds are the caller's business: every parser that uses it
// sizes its buffer (or stops on its own counts) so that no field runs off the end.
// The interface never owns the buffer. Not thread-safe; one parser uses one cursor.
#pragma once

#include <cstdint>

namespace TavoPlayer {

class BitInterface {
public:
    BitInterface(void* buffer, unsigned int size);
    virtual ~BitInterface();
    BitInterface(const BitInterface&) = delete;
    BitInterface& operator=(const BitInterface&) = delete;

    void resetBitCounter() { mBitPosition = 0; }
    // Bits already consumed (or written) in the current byte, 0..7: not a running total.
    uint8_t getBitCounter() const { return mBitPosition; }
    bool isByteAligned() const { return mBitPosition == 0; }

    // Where the next bit lives, and the bytes left from there (informational: it may
    // underflow silently when a caller reads past its buffer).
    const uint8_t* currentByte() const { return mCurrent; }
    uint32_t remainingBytes() const { return mRemaining; }

protected:
    // Moves the cursor on by `bytes` whole bytes.
    void advanceBytes(uint32_t bytes) {
        mCurrent += bytes;
        mRemaining -= bytes;
    }

    uint8_t mBitPosition;
    uint8_t* mCurrent;
    uint32_t mRemaining;
};

}  // namespace TavoPlayer
