#include "BitWriter.h"

namespace TavoPlayer::tsgen {

void BitWriter::putBits(uint32_t value, int count) {
    for (int i = count - 1; i >= 0; --i) {
        if (mBitCount % 8 == 0) {
            mBytes.push_back(0);
        }
        if ((value >> i) & 1U) {
            mBytes.back() |= static_cast<uint8_t>(0x80U >> (mBitCount % 8));
        }
        ++mBitCount;
    }
}

void BitWriter::alignZero() {
    while (mBitCount % 8 != 0) {
        putBits(0, 1);
    }
}

bool BitReader::getBits(int count, uint32_t& value) {
    value = 0;
    for (int i = 0; i < count; ++i) {
        if (mPos >= mSizeBits) {
            value = 0;
            return false;
        }
        value = (value << 1) | ((mData[mPos / 8] >> (7 - mPos % 8)) & 1U);
        ++mPos;
    }
    return true;
}

bool BitReader::getUe(uint32_t& value) {
    int leadingZeros = 0;
    uint32_t bit = 0;
    while (true) {
        if (!getBits(1, bit)) {
            return false;
        }
        if (bit) {
            break;
        }
        if (++leadingZeros > 31) {
            return false;
        }
    }
    uint32_t suffix = 0;
    if (!getBits(leadingZeros, suffix)) {
        return false;
    }
    value = static_cast<uint32_t>((1ULL << leadingZeros) - 1 + suffix);
    return true;
}

bool BitReader::getSe(int32_t& value) {
    uint32_t k = 0;
    if (!getUe(k)) {
        return false;
    }
    // ITU-T H.264, 9.1.1: odd code numbers are positive.
    value = (k & 1U) ? static_cast<int32_t>((k + 1) / 2) : -static_cast<int32_t>(k / 2);
    return true;
}

}  // namespace TavoPlayer::tsgen
