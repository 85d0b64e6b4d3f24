// TransportBitReader: a bounds-checked, most-significant-bit-first reader for the
// MPEG-4 transport decoder.
//
// Unlike ReadBitInterface (deliberately unchecked, its callers size their buffers),
// the transport decoder parses headers whose lengths come from the stream itself
// (audioMuxLengthBytes, frame_length, LatmGetValue, PCE comment bytes), so every read
// here is checked against the end of the data: reading past the end yields zero bits,
// does not move the cursor and latches overrun(), which the parsers test once per
// structure instead of after every field.
#pragma once

#include <cstdint>

namespace TavoPlayer {

class TransportBitReader {
public:
    TransportBitReader() = default;
    TransportBitReader(const uint8_t* data, uint32_t sizeBytes) { init(data, sizeBytes); }

    // Views `sizeBytes` bytes at `data` from bit 0 and clears the overrun latch.
    void init(const uint8_t* data, uint32_t sizeBytes);
    // Views a longer (or shorter) stretch of the same bytes, keeping the position.
    void setSize(const uint8_t* data, uint32_t sizeBytes);

    // The next `count` bits (0..32); 0 bits read 0. Past the end: 0, no move, overrun.
    uint32_t readBits(unsigned int count);
    // As readBits without moving.
    uint32_t peekBits(unsigned int count) const;
    // Moves `count` bits on; past the end: no move, overrun.
    void skipBits(uint64_t count);
    // Moves to the next byte boundary unless aligned.
    void byteAlign();
    // Copies `count` bytes starting at the current (possibly unaligned) bit position.
    // Past the end: nothing copied, no move, overrun.
    void readBytes(uint8_t* out, uint32_t count);

    uint64_t bitPosition() const { return mPositionBits; }
    // Moves to an absolute position; beyond the end is an overrun (position unchanged).
    void setBitPosition(uint64_t positionBits);
    uint64_t bitsLeft() const { return mSizeBits - mPositionBits; }
    uint64_t sizeBits() const { return mSizeBits; }
    const uint8_t* data() const { return mData; }
    bool overrun() const { return mOverrun; }
    void clearOverrun() { mOverrun = false; }

private:
    const uint8_t* mData = nullptr;
    uint64_t mSizeBits = 0;
    uint64_t mPositionBits = 0;
    bool mOverrun = false;
};

}  // namespace TavoPlayer
