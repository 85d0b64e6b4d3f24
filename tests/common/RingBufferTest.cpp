#include "common/RingBuffer.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <functional>
#include <thread>

#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using namespace std::chrono_literals;
using test::TraceCapture;

const unsigned int kPage = static_cast<unsigned int>(sysconf(_SC_PAGE_SIZE));

// Writes, or reads, `bytes` that the ring has room, or data, for.
void put(RingBuffer& ring, uint32_t bytes) {
    ASSERT_TRUE(ring.waitForSpace(bytes));
    ring.commitWrite(bytes);
}
void take(RingBuffer& ring, uint32_t bytes) {
    ASSERT_TRUE(ring.waitForData(bytes));
    ring.consume(bytes);
}

// ---------------------------------------------------------------------------------
// Configuration

TEST(RingBufferConfigureTest, OnlyTheFirstValidConfigurationCounts) {
    TraceCapture trace;
    android::sp<RingBuffer> ring = new RingBuffer;
    // Below one page: refused, and the ring stays unconfigured.
    EXPECT_EQ(1u, ring->configureWithSize("first", kPage - 4));
    EXPECT_EQ(0u, ring->configureWithSize("first", kPage));
    // A second configuration, of either kind, changes nothing.
    EXPECT_EQ(1u, ring->configure("second", 17));
    EXPECT_EQ(1u, ring->configureWithSize("third", 3 * kPage));
    EXPECT_EQ(kPage, ring->size());
    EXPECT_EQ("first", ring->name());
    // Not a page multiple: the mirrored second mapping cannot be placed.
    android::sp<RingBuffer> odd = new RingBuffer;
    EXPECT_EQ(1u, odd->configureWithSize("odd", kPage + 100));
}

// ---------------------------------------------------------------------------------
// Record access

class RingBufferAccessTest : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_EQ(0u, ring->configureWithSize("access", kPage)); }

    // Moves the counters to `position` by writing and consuming filler.
    void advanceTo(uint32_t position) {
        while (ring->head() < position) {
            const uint32_t step = std::min<uint32_t>(position - ring->head(), kPage / 2);
            ASSERT_NO_FATAL_FAILURE(put(*ring, step));
            ASSERT_NO_FATAL_FAILURE(take(*ring, step));
        }
    }

    android::sp<RingBuffer> ring = new RingBuffer;
};

TEST_F(RingBufferAccessTest, CommitRoundsUpToFourAndUsedPlusFreeIsTheSize) {
    put(*ring, 2001);
    EXPECT_EQ(2004u, ring->head());
    EXPECT_EQ(2004u, ring->usedSpace());
    EXPECT_EQ(kPage, ring->usedSpace() + ring->freeSpace());
    ASSERT_TRUE(ring->waitForData(40));
    ring->consume(1001);
    EXPECT_EQ(1004u, ring->tail());
    EXPECT_EQ(kPage, ring->usedSpace() + ring->freeSpace());
}

TEST_F(RingBufferAccessTest, RecordStartingEightBytesBeforeTheEndIsContiguous) {
    advanceTo(kPage - 8);
    ASSERT_TRUE(ring->waitForSpace(64));
    uint8_t* w = ring->writePointer();
    EXPECT_EQ(ring->readPointer(), w);
    for (int i = 0; i < 64; ++i)
        w[i] = static_cast<uint8_t>(0xA0 + i);
    ring->commitWrite(64);

    ASSERT_TRUE(ring->waitForData(64));
    const uint8_t* r = ring->readPointer();
    for (int i = 0; i < 64; ++i)
        ASSERT_EQ(static_cast<uint8_t>(0xA0 + i), r[i]) << i;
    // Bytes 8.. landed at the start of the ring, seen through the first mapping.
    const uint8_t* start = r + 8 - kPage;
    EXPECT_EQ(0, memcmp(start, r + 8, 56));
    ring->consume(64);
    EXPECT_EQ(0u, ring->usedSpace());
}

// Each side gives up after one wait of the time-out; the writer's failed wait has
// released its lock, so the reader side still works.
TEST_F(RingBufferAccessTest, WaitsGiveUpAfterOneTimeOut) {
    auto timed = [](const std::function<bool()>& wait) {
        const auto start = std::chrono::steady_clock::now();
        EXPECT_FALSE(wait());
        return std::chrono::steady_clock::now() - start;
    };
    const auto empty = timed([&] { return ring->waitForData(40); });
    EXPECT_GE(empty, 95ms);
    EXPECT_LT(empty, 5s);
    put(*ring, kPage);
    EXPECT_GE(timed([&] { return ring->waitForSpace(4); }), 95ms);
    take(*ring, kPage);
    EXPECT_TRUE(ring->waitForSpace(4));
    ring->abortWrite();
}

// ---------------------------------------------------------------------------------
// Wake-ups: a waiter woken by the other side returns before its 100 ms time-out.
// The wait runs on a thread; the waking side acts 10 ms after it started, so that
// the wake-up finds it inside its wait. The assertions are about who wakes whom.

struct WakeCase {
    const char* name;
    bool fullFirst;    // fill the ring before the wait
    bool readerWaits;  // else the writer waits, for `bytes` in either case
    uint32_t bytes;
    std::function<void(RingBuffer&)> wake;  // on the test's thread
    bool result;
};

TEST(RingBufferWakeTest, TheOtherSideOrAResetEndsTheWait) {
    const WakeCase cases[] = {
        {"commit wakes a reader", false, true, 40, [](RingBuffer& r) { put(r, 40); }, true},
        {"consume wakes a writer", true, false, 400, [](RingBuffer& r) { take(r, 400); }, true},
        {"reset wakes a writer", true, false, kPage, [](RingBuffer& r) { r.reset(); }, true},
        // The ring is empty after the reset: still nothing to read.
        {"reset wakes a reader", false, true, 40, [](RingBuffer& r) { r.reset(); }, false},
    };
    for (const WakeCase& c : cases) {
        SCOPED_TRACE(c.name);
        android::sp<RingBuffer> ring = new RingBuffer;
        ASSERT_EQ(0u, ring->configureWithSize("wait", kPage));
        if (c.fullFirst)
            put(*ring, kPage);
        std::atomic<bool> started{false};
        bool result = !c.result;
        std::chrono::steady_clock::duration waited{};
        std::thread waiter([&] {
            started = true;
            const auto start = std::chrono::steady_clock::now();
            result = c.readerWaits ? ring->waitForData(c.bytes) : ring->waitForSpace(c.bytes);
            // Release the lock the successful wait took.
            if (result)
                c.readerWaits ? ring->abortRead() : ring->abortWrite();
            waited = std::chrono::steady_clock::now() - start;
        });
        while (!started)
            std::this_thread::yield();
        std::this_thread::sleep_for(10ms);
        c.wake(*ring);
        waiter.join();
        EXPECT_EQ(result, c.result);
        EXPECT_LT(waited, std::chrono::nanoseconds(RingBuffer::kWaitTimeoutNs) * 9 / 10);
    }
}

}  // namespace
}  // namespace TavoPlayer
