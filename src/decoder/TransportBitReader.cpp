#include "decoder/TransportBitReader.h"

#include <cstring>

namespace TavoPlayer {

void TransportBitReader::init(const uint8_t* data, uint32_t sizeBytes) {
    mData = data;
    mSizeBits = static_cast<uint64_t>(sizeBytes) * 8u;
    mPositionBits = 0;
    mOverrun = false;
}

void TransportBitReader::setSize(const uint8_t* data, uint32_t sizeBytes) {
    mData = data;
    mSizeBits = static_cast<uint64_t>(sizeBytes) * 8u;
    if (mPositionBits > mSizeBits) {
        mPositionBits = mSizeBits;
        mOverrun = true;
    }
}

uint32_t TransportBitReader::peekBits(unsigned int count) const {
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
    // Otherwise load only the bytes the field spans (at most 5 for 32 bits at an odd
    // offset).
    const unsigned int spanBytes = (offset + count + 7u) >> 3;
    uint64_t word = 0;
    for (unsigned int i = 0; i < spanBytes; ++i) {
        word = (word << 8) | at[i];
    }
    word >>= spanBytes * 8u - offset - count;
    return static_cast<uint32_t>(word & ((count == 32) ? 0xFFFFFFFFull : ((1ull << count) - 1)));
}

uint32_t TransportBitReader::readBits(unsigned int count) {
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

void TransportBitReader::skipBits(uint64_t count) {
    if (count > mSizeBits - mPositionBits) {
        mOverrun = true;
        return;
    }
    mPositionBits += count;
}

void TransportBitReader::byteAlign() {
    const uint64_t aligned = (mPositionBits + 7u) & ~uint64_t{7};
    if (aligned > mSizeBits) {
        mOverrun = true;
        return;
    }
    mPositionBits = aligned;
}

void TransportBitReader::readBytes(uint8_t* out, uint32_t count) {
    if (count == 0) {
        return;
    }
    const uint64_t bits = static_cast<uint64_t>(count) * 8u;
    if (bits > mSizeBits - mPositionBits) {
        mOverrun = true;
        return;
    }
    const uint8_t* at = mData + (mPositionBits >> 3);
    const unsigned int offset = static_cast<unsigned int>(mPositionBits & 7u);
    if (offset == 0) {
        std::memcpy(out, at, count);
    } else {
        // Each output byte takes the low (8 - offset) bits of one input byte and the
        // high `offset` bits of the next; the last input byte touched is still inside
        // the data because the whole field is.
        const unsigned int back = 8u - offset;
        uint32_t i = 0;
#if __BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__
        // Eight output bytes per step from a big-endian 64-bit load and the byte after
        // it (LATM payloads rarely start on a byte boundary, so this is the hot path).
        for (; i + 8 <= count; i += 8) {
            uint64_t word;
            std::memcpy(&word, at + i, sizeof(word));
            word = __builtin_bswap64(word);
            word = (word << offset) | (at[i + 8] >> back);
            word = __builtin_bswap64(word);
            std::memcpy(out + i, &word, sizeof(word));
        }
#endif
        for (; i < count; ++i) {
            out[i] = static_cast<uint8_t>((at[i] << offset) | (at[i + 1] >> back));
        }
    }
    mPositionBits += bits;
}

void TransportBitReader::setBitPosition(uint64_t positionBits) {
    if (positionBits > mSizeBits) {
        mOverrun = true;
        return;
    }
    mPositionBits = positionBits;
}

}  // namespace TavoPlayer
