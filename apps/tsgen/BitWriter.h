#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace TavoPlayer::tsgen {

// Most-significant-bit-first writer for the bit-oriented syntax tsgen emits
// (LOAS/LATM headers, ADTS headers, H.264 parameter sets).
class BitWriter {
public:
    void putBits(uint32_t value, int count);
    void putBit(bool bit) { putBits(bit ? 1 : 0, 1); }
    void alignZero();
    bool byteAligned() const { return mBitCount % 8 == 0; }
    size_t bitCount() const { return mBitCount; }
    const std::vector<uint8_t>& bytes() const { return mBytes; }
    std::vector<uint8_t>& bytes() { return mBytes; }

private:
    std::vector<uint8_t> mBytes;
    size_t mBitCount = 0;
};

// Reader counterpart, used to copy fields of an existing bitstream.
class BitReader {
public:
    BitReader(const uint8_t* data, size_t sizeBytes) : mData(data), mSizeBits(sizeBytes * 8) {}
    // Returns false once the read runs past the end; the value is then 0.
    bool getBits(int count, uint32_t& value);
    bool getUe(uint32_t& value);
    bool getSe(int32_t& value);
    size_t position() const { return mPos; }
    size_t bitsLeft() const { return mPos < mSizeBits ? mSizeBits - mPos : 0; }

private:
    const uint8_t* mData;
    size_t mSizeBits;
    size_t mPos = 0;
};

}  // namespace TavoPlayer::tsgen
