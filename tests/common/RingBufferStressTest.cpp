// One writer thread and one reader thread move more than 100 MB of records of
// varying size through a small ring; the reader checks every byte. Built twice:
// normally, and with ThreadSanitizer as its own CTest entry (label "tsan").
#include <gtest/gtest.h>

#include <cstring>
#include <random>
#include <thread>

#include "common/RingBuffer.h"

namespace TavoPlayer {
namespace {

constexpr uint64_t kTotalBytes = 100ull * 1024 * 1024 + 12345;
constexpr uint32_t kHeader = 8;  // record size, sequence number

uint8_t patternByte(uint32_t sequence, uint32_t index) {
    return static_cast<uint8_t>((sequence * 131u) ^ (index * 7u) ^ (index >> 8));
}

struct Totals {
    uint64_t bytes = 0;
    uint32_t records = 0;
    uint32_t badBytes = 0;
    uint32_t badHeaders = 0;
};

class RingBufferStressTest : public ::testing::TestWithParam<uint32_t> {};

TEST_P(RingBufferStressTest, EveryByteArrivesInOrder) {
    android::sp<RingBuffer> ring = new RingBuffer;
    ASSERT_EQ(0u, ring->configure("stress", GetParam()));
    const uint32_t maxRecord = ring->size() / 3;

    Totals written;
    std::thread writer([&] {
        std::mt19937 random(1234);
        std::uniform_int_distribution<uint32_t> sizes(kHeader, maxRecord);
        uint32_t sequence = 0;
        while (written.bytes < kTotalBytes) {
            const uint32_t size = sizes(random);
            while (!ring->waitForSpace(size)) {
            }
            uint8_t* w = ring->writePointer();
            memcpy(w, &size, 4);
            memcpy(w + 4, &sequence, 4);
            for (uint32_t i = kHeader; i < size; ++i)
                w[i] = patternByte(sequence, i);
            ring->commitWrite(size);
            written.bytes += size;
            ++sequence;
        }
        written.records = sequence;
    });

    Totals read;
    uint64_t target = 0;
    std::thread reader([&] {
        uint32_t expected = 0;
        while (true) {
            if (!ring->waitForData(kHeader)) {
                // The writer may be done; it publishes its count before we stop.
                if (__atomic_load_n(&target, __ATOMIC_ACQUIRE) != 0 && read.bytes >= target)
                    return;
                continue;
            }
            const uint8_t* r = ring->readPointer();
            uint32_t size, sequence;
            memcpy(&size, r, 4);
            memcpy(&sequence, r + 4, 4);
            // Never trust the size beyond what is readable.
            if (size < kHeader || size > ring->usedSpace() || sequence != expected) {
                ++read.badHeaders;
                ring->abortRead();
                return;
            }
            for (uint32_t i = kHeader; i < size; ++i) {
                if (r[i] != patternByte(sequence, i))
                    ++read.badBytes;
            }
            ring->consume(size);
            read.bytes += size;
            ++read.records;
            ++expected;
        }
    });

    writer.join();
    __atomic_store_n(&target, written.bytes, __ATOMIC_RELEASE);
    reader.join();

    EXPECT_GE(written.bytes, kTotalBytes);
    EXPECT_EQ(written.bytes, read.bytes);
    EXPECT_EQ(written.records, read.records);
    EXPECT_EQ(0u, read.badHeaders);
    EXPECT_EQ(0u, read.badBytes);
    EXPECT_EQ(0u, ring->usedSpace());
}

// 16 KiB (a few records at a time, many wraps) and 64 KiB.
INSTANTIATE_TEST_SUITE_P(SmallRings, RingBufferStressTest, ::testing::Values(14u, 16u));

}  // namespace
}  // namespace TavoPlayer
