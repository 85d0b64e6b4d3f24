#include "decoder/ReadBitInterface.h"

#include "platform/os/Trace.h"

namespace TavoPlayer {

ReadBitInterface::~ReadBitInterface() = default;

uint32_t ReadBitInterface::extract(const uint8_t* bytes, uint8_t bitPosition, unsigned char count) {
    if (count == 0) {
        return 0;
    }
    const unsigned int end = bitPosition + count;  // bits spanned from the byte start
    // Only the bytes the field touches are loaded: a field that ends exactly on the
    // last byte of a buffer must not read the byte after it.
    const unsigned int touched = (end + 7) / 8;
    uint64_t word = 0;
    for (unsigned int i = 0; i < touched; ++i) {
        word |= static_cast<uint64_t>(bytes[i]) << (56 - 8 * i);
    }
    const uint64_t mask = (count >= 32) ? 0xFFFFFFFFull : ((1ull << count) - 1);
    return static_cast<uint32_t>((word >> (64 - end)) & mask);
}

uint32_t ReadBitInterface::readBits(unsigned char count) {
    if (count == 0) {
        return 0;
    }
    const uint32_t value = extract(mCurrent, mBitPosition, count);
    const unsigned int end = mBitPosition + count;
    advanceBytes(end / 8);
    mBitPosition = static_cast<uint8_t>(end % 8);
    return value;
}

uint32_t ReadBitInterface::peekBits(unsigned char count) const {
    return extract(mCurrent, mBitPosition, count);
}

uint32_t ReadBitInterface::readBitsLong(unsigned char count) {
    if (count < 25 || count > 32) {
        TAVO_LOGE("%s: bitCount value is out of range (%u)\n", "readBitsLong", count);
        return 0;
    }
    // 24 bits first, then the rest: whatever the starting bit position, neither load
    // spans more than 32 bits.
    const uint32_t high = readBits(24);
    const unsigned char lowCount = static_cast<unsigned char>(count - 24);
    const uint32_t low = readBits(lowCount);
    return (high << lowCount) | low;
}

uint32_t ReadBitInterface::readBits(unsigned char* buffer, unsigned char count,
                                    int* bytesAdvanced) {
    const uint32_t value = extract(buffer, mBitPosition, count);
    const unsigned int end = mBitPosition + count;
    if (bytesAdvanced != nullptr) {
        *bytesAdvanced = static_cast<int>(end / 8);
    }
    mBitPosition = static_cast<uint8_t>(end % 8);
    return value;
}

void ReadBitInterface::byteAlign(int* moved) {
    int result = 0;
    if (mBitPosition != 0) {
        advanceBytes(1);
        mBitPosition = 0;
        result = 1;
    }
    if (moved != nullptr) {
        *moved = result;
    }
}

void ReadBitInterface::skipBits(unsigned char count, int* bytesAdvanced) {
    const unsigned int end = mBitPosition + count;
    advanceBytes(end / 8);
    mBitPosition = static_cast<uint8_t>(end % 8);
    if (bytesAdvanced != nullptr) {
        *bytesAdvanced = static_cast<int>(end / 8);
    }
}

}  // namespace TavoPlayer
