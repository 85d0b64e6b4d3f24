#include <gtest/gtest.h>

#include <cstdint>
#include <vector>

#include "decoder/ReadBitInterface.h"

namespace TavoPlayer {
namespace {

// A reference bit reader, one bit at a time, for comparing against the word loads.
uint32_t referenceBits(const std::vector<uint8_t>& bytes, size_t bitOffset, unsigned count) {
    uint32_t value = 0;
    for (size_t bit = bitOffset; bit < bitOffset + count; ++bit)
        value = (value << 1) | ((bytes[bit / 8] >> (7 - bit % 8)) & 1u);
    return value;
}

class ReadBitInterfaceTest : public ::testing::Test {
protected:
    std::vector<uint8_t> mBytes = {0xA5, 0x3C, 0x96, 0x0F, 0xF0, 0x81, 0x7E, 0xC3, 0x5A, 0x24};
};

TEST_F(ReadBitInterfaceTest, EveryStartAndWidthMatchesBitByBitReference) {
    for (unsigned start = 0; start < 8; ++start) {
        // readBits and peekBits take up to 25 bits, readBitsLong 25 to 32.
        for (unsigned count = 1; count <= 32; ++count) {
            ReadBitInterface reader(mBytes.data(), mBytes.size());
            reader.skipBits(static_cast<unsigned char>(start), nullptr);
            const uint32_t expected = referenceBits(mBytes, start, count);
            const auto n = static_cast<unsigned char>(count);
            if (count <= 25) {
                EXPECT_EQ(reader.peekBits(n), expected) << "start " << start << " count " << count;
            }
            EXPECT_EQ(count <= 25 ? reader.readBits(n) : reader.readBitsLong(n), expected)
                << "start " << start << " count " << count;
            EXPECT_EQ(reader.getBitCounter(), (start + count) % 8);
            EXPECT_EQ(reader.currentByte() - mBytes.data(), (start + count) / 8);
            EXPECT_EQ(reader.remainingBytes(), mBytes.size() - (start + count) / 8);
        }
    }
}

}  // namespace
}  // namespace TavoPlayer
