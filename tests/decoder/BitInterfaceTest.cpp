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

// Zero-bit reads return 0 and do not move; the counter is the position in the current
// byte, not a running total, and resetting it leaves the pointer alone.
TEST_F(ReadBitInterfaceTest, ZeroCountsAndBitCounter) {
    ReadBitInterface reader(mBytes.data(), mBytes.size());
    reader.readBits(13);
    EXPECT_EQ(reader.readBits(0), 0u);
    EXPECT_EQ(reader.peekBits(0), 0u);
    EXPECT_EQ(reader.getBitCounter(), 5);
    EXPECT_FALSE(reader.isByteAligned());
    EXPECT_EQ(reader.currentByte(), mBytes.data() + 1);
    reader.resetBitCounter();
    EXPECT_TRUE(reader.isByteAligned());
    EXPECT_EQ(reader.currentByte(), mBytes.data() + 1);
}

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

TEST_F(ReadBitInterfaceTest, ExternalBufferFormLeavesOwnPointerAlone) {
    std::vector<uint8_t> other = {0xFF, 0x00, 0xAA};
    ReadBitInterface reader(mBytes.data(), mBytes.size());
    reader.readBits(5);
    int advanced = -1;
    // 7 bits at position 5 of FF 00: 111 0000 -> 0x70; 12 bits spanned -> 1 byte, position 4.
    EXPECT_EQ(reader.readBits(other.data(), 7, &advanced), 0x70u);
    EXPECT_EQ(advanced, 1);
    EXPECT_EQ(reader.getBitCounter(), 4);
    EXPECT_EQ(reader.currentByte(), mBytes.data());
    EXPECT_EQ(reader.remainingBytes(), mBytes.size());
}

// byteAlign and skipBits report the whole bytes they passed (a null report is allowed).
TEST_F(ReadBitInterfaceTest, AlignAndSkipReportWholeBytesPassed) {
    ReadBitInterface reader(mBytes.data(), mBytes.size());
    int moved = -1;
    reader.byteAlign(&moved);
    EXPECT_EQ(moved, 0);
    EXPECT_EQ(reader.currentByte(), mBytes.data());
    reader.readBits(3);
    reader.byteAlign(&moved);
    EXPECT_EQ(moved, 1);
    EXPECT_EQ(reader.remainingBytes(), mBytes.size() - 1);
    EXPECT_TRUE(reader.isByteAligned());
    reader.readBits(1);
    reader.byteAlign(nullptr);
    EXPECT_EQ(reader.currentByte(), mBytes.data() + 2);
    reader.skipBits(5, &moved);
    EXPECT_EQ(moved, 0);
    reader.skipBits(20, &moved);  // 25 bits from byte 2: 3 bytes, position 1
    EXPECT_EQ(moved, 3);
    EXPECT_EQ(reader.getBitCounter(), 1);
    EXPECT_EQ(reader.readBits(7), referenceBits(mBytes, 2 * 8 + 25, 7));
}

// Into a buffer of 0xCC: a byte is cleared before its first bit is written (so nothing
// of the old contents shows in what is read back), and a byte never reached is untouched.
TEST(WriteBitInterfaceTest, RoundTripsThroughReaderForEveryWidthAndOffset) {
    for (unsigned start = 0; start < 8; ++start) {
        for (unsigned count = 1; count <= 16; ++count) {
            std::array<uint8_t, 8> out;
            out.fill(0xCC);
            WriteBitInterface writer(out.data(), out.size());
            writer.writeBits(0, start);
            const unsigned value = (0xB6D5u * (count + start)) & ((1u << count) - 1);
            EXPECT_EQ(writer.writeBits(value, count), 0);
            writer.writeBits(0b101, 3);
            ReadBitInterface reader(out.data(), out.size());
            reader.skipBits(static_cast<unsigned char>(start), nullptr);
            EXPECT_EQ(reader.readBits(static_cast<unsigned char>(count)), value)
                << "start " << start << " count " << count;
            EXPECT_EQ(reader.readBits(3), 0b101u);
            if (reader.getBitCounter() != 0) {
                EXPECT_EQ(reader.readBits(static_cast<unsigned char>(8 - reader.getBitCounter())),
                          0u);
            }
            EXPECT_EQ(out[(start + count + 3 + 7) / 8], 0xCC);
            EXPECT_EQ(writer.getBitCounter(), (start + count + 3) % 8);
            EXPECT_EQ(writer.currentByte() - out.data(), (start + count + 3) / 8);
        }
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

TEST(WriteBitInterfaceTest, AlignAndSkipWriteZeroBits) {
    std::array<uint8_t, 4> out;
    out.fill(0xFF);
    WriteBitInterface writer(out.data(), out.size());
    int moved = -1;
    writer.byteAlign(&moved);
    EXPECT_EQ(moved, 0);
    writer.writeBits(0b111, 3);
    writer.byteAlign(&moved);
    EXPECT_EQ(moved, 1);
    EXPECT_EQ(out[0], 0xE0);
    EXPECT_TRUE(writer.isByteAligned());
    writer.writeBits(1, 1);
    writer.skipBits(9, nullptr);
    writer.writeBits(1, 1);
    EXPECT_EQ(out[1], 0x80);
    EXPECT_EQ(out[2], 0x20);
    EXPECT_EQ(writer.remainingBytes(), 2u);
}

}  // namespace
}  // namespace TavoPlayer
