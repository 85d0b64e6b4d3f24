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
#include <cstring>

namespace TavoPlayer {

class TransportBitReader {
public:
    TransportBitReader() = default;
    TransportBitReader(const uint8_t* data, uint32_t sizeBytes) { init(data, sizeBytes); }

    // Views `sizeBytes` bytes at `data` from bit 0 and clears the overrun latch.
    void init(const uint8_t* data, uint32_t sizeBytes) {
        mData = data;
        mSizeBits = static_cast<uint64_t>(sizeBytes) * 8u;
        mPositionBits = 0;
        mOverrun = false;
    }
    // Views a longer (or shorter) stretch of the same bytes, keeping the position.
    void setSize(const uint8_t* data, uint32_t sizeBytes) {
        mData = data;
        mSizeBits = static_cast<uint64_t>(sizeBytes) * 8u;
        if (mPositionBits > mSizeBits) {
            mPositionBits = mSizeBits;
            mOverrun = true;
        }
    }

    // The next `count` bits (0..32); 0 bits read 0. Past the end: 0, no move, overrun.
    uint32_t readBits(unsigned int count) {
        if (count == 0) {
            return 0;
        }
        if (count > 32 || count > mSizeBits - mPositionBits) {
            mOverrun = true;
            return 0;
        }
        const uint32_t value = peekBits(count);
        mPositionBits += count;
        return value;
    }
    // As readBits without moving.
    uint32_t peekBits(unsigned int count) const {
        if (count == 0 || count > 32 || count > mSizeBits - mPositionBits) {
            return 0;
        }
        const uint8_t* at = mData + (mPositionBits >> 3);
        const unsigned int offset = static_cast<unsigned int>(mPositionBits & 7u);
#if __BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__
        // With eight bytes left from here, one big-endian 64-bit load covers any field.
        if ((mPositionBits >> 3) + 8 <= (mSizeBits >> 3)) {
            uint64_t word;
            std::memcpy(&word, at, sizeof(word));
            word = __builtin_bswap64(word);
            return static_cast<uint32_t>((word << offset) >> (64u - count));
        }
#endif
        return peekNearEnd(at, offset, count);
    }
    // Moves `count` bits on; past the end: no move, overrun.
    void skipBits(uint64_t count) {
        if (count > mSizeBits - mPositionBits) {
            mOverrun = true;
            return;
        }
        mPositionBits += count;
    }
    // Moves to the next byte boundary unless aligned.
    void byteAlign() {
        const uint64_t aligned = (mPositionBits + 7u) & ~uint64_t{7};
        if (aligned > mSizeBits) {
            mOverrun = true;
            return;
        }
        mPositionBits = aligned;
    }
    // Copies `count` bytes starting at the current (possibly unaligned) bit position.
    // Past the end: nothing copied, no move, overrun.
    void readBytes(uint8_t* out, uint32_t count);

    uint64_t bitPosition() const {
        return mPositionBits;
    }
    // Moves to an absolute position; beyond the end is an overrun (position unchanged).
    void setBitPosition(uint64_t positionBits) {
        if (positionBits > mSizeBits) {
            mOverrun = true;
            return;
        }
        mPositionBits = positionBits;
    }
    uint64_t bitsLeft() const {
        return mSizeBits - mPositionBits;
    }
    uint64_t sizeBits() const {
        return mSizeBits;
    }
    const uint8_t* data() const {
        return mData;
    }
    bool overrun() const {
        return mOverrun;
    }
    void clearOverrun() {
        mOverrun = false;
    }

private:
    // peekBits where fewer than eight bytes are left: only the bytes the field spans.
    static uint32_t peekNearEnd(const uint8_t* at, unsigned int offset, unsigned int count);

    const uint8_t* mData = nullptr;
    uint64_t mSizeBits = 0;
    uint64_t mPositionBits = 0;
    bool mOverrun = false;
};

}  // namespace TavoPlayer
