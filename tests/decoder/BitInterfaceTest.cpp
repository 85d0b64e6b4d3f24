#include <gtest/gtest.h>

#include <array>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "decoder/ReadBitInterface.h"
#include "decoder/WriteBitInterface.h"
#include "support/TraceCapture.h"

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

TEST_F(ReadBitInterfaceTest, FieldEndingOnLastByteLoadsNoByteBeyond) {
    // A 3-byte heap buffer: ASan reports any load of a fourth byte.
    auto bytes = std::make_unique<uint8_t[]>(3);
    std::copy(mBytes.begin(), mBytes.begin() + 3, bytes.get());
    ReadBitInterface reader(bytes.get(), 3);
    reader.readBits(4);
    EXPECT_EQ(reader.peekBits(20), 0x53C96u);
    EXPECT_EQ(reader.readBits(20), 0x53C96u);
    EXPECT_EQ(reader.remainingBytes(), 0u);
}

TEST_F(ReadBitInterfaceTest, ReadBitsLongOutOfRangeLogsAndDoesNotMove) {
    for (unsigned char count : {24, 33, 0}) {
        test::TraceCapture trace;
        ReadBitInterface reader(mBytes.data(), mBytes.size());
        reader.readBits(2);
        EXPECT_EQ(reader.readBitsLong(count), 0u);
        EXPECT_EQ(trace.count(TRACE_ERROR, "readBitsLong: bitCount value is out of range (" +
                                               std::to_string(count) + ")"),
                  1u)
            << trace.all();
        EXPECT_EQ(reader.getBitCounter(), 2);
        EXPECT_EQ(reader.currentByte(), mBytes.data());
    }
}

TEST(WriteBitInterfaceTest, CountAboveSixteenWritesNothing) {
    std::array<uint8_t, 4> out = {0x11, 0x22, 0x33, 0x44};
    WriteBitInterface writer(out.data(), out.size());
    EXPECT_EQ(writer.writeBits(0xFFFFFF, 24), 0);
    EXPECT_EQ(writer.writeBits(0xFFFF, 0), 0);
    EXPECT_EQ(out, (std::array<uint8_t, 4>{0x11, 0x22, 0x33, 0x44}));
    EXPECT_EQ(writer.currentByte(), out.data());
    EXPECT_EQ(writer.getBitCounter(), 0);
}

}  // namespace
}  // namespace TavoPlayer
