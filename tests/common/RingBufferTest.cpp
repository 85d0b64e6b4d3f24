#include "common/RingBuffer.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <functional>
#include <string>
#include <thread>

#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using namespace std::chrono_literals;
using test::TraceCapture;

const unsigned int kPage = static_cast<unsigned int>(sysconf(_SC_PAGE_SIZE));

// ---------------------------------------------------------------------------------
// Configuration

TEST(RingBufferConfigureTest, OnlyTheFirstValidConfigurationCounts) {
    TraceCapture trace;
    android::sp<RingBuffer> ring = new RingBuffer;
    // Below one page: refused, and the ring stays unconfigured.
    EXPECT_EQ(1u, ring->configureWithSize("first", kPage - 4));
    EXPECT_EQ(0u, ring->size());
    EXPECT_EQ(0u, ring->configureWithSize("first", kPage));
    EXPECT_EQ(kPage, ring->size());
    // A second configuration, of either kind, changes nothing.
    EXPECT_EQ(1u, ring->configure("second", 17));
    EXPECT_EQ(1u, ring->configureWithSize("third", 3 * kPage));
    EXPECT_EQ(kPage, ring->size());
    EXPECT_EQ("first", ring->name());

    android::sp<RingBuffer> mod = new RingBuffer;
    ASSERT_EQ(0u, mod->configure("mod", 46));  // log2 size taken modulo 32: 1 << 14
    EXPECT_EQ(16384u, mod->size());

    // Not a page multiple: the second mapping fails, and the size it left set makes
    // any later attempt "already configured".
    android::sp<RingBuffer> odd = new RingBuffer;
    EXPECT_EQ(1u, odd->configureWithSize("odd", kPage + 100));
    EXPECT_EQ(1u, odd->configureWithSize("odd", 2 * kPage));
}

TEST(RingBufferConfigureTest, FailedConfigurationsLeakNoDescriptor) {
    TraceCapture trace;
    auto openDescriptors = [] {
        int n = 0;
        for (int fd = 0; fd < 1024; ++fd) {
            if (fcntl(fd, F_GETFD) != -1)
                ++n;
        }
        return n;
    };
    const int before = openDescriptors();
    for (int i = 0; i < 20; ++i) {
        android::sp<RingBuffer> r = new RingBuffer;
        r->configureWithSize("leak", kPage + 100);
        android::sp<RingBuffer> ok = new RingBuffer;
        ok->configure("leak", 14);
    }
    EXPECT_EQ(before, openDescriptors());
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
            ASSERT_TRUE(ring->waitForSpace(step));
            ring->commitWrite(step);
            ASSERT_TRUE(ring->waitForData(step));
            ring->consume(step);
        }
    }

    android::sp<RingBuffer> ring = new RingBuffer;
};

TEST_F(RingBufferAccessTest, CommitRoundsUpToFourAndUsedPlusFreeIsTheSize) {
    ASSERT_TRUE(ring->waitForSpace(2001));
    ring->commitWrite(2001);
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
    ASSERT_TRUE(ring->waitForSpace(kPage));
    ring->commitWrite(kPage);
    EXPECT_GE(timed([&] { return ring->waitForSpace(4); }), 95ms);
    ASSERT_TRUE(ring->waitForData(kPage));
    ring->consume(kPage);
    EXPECT_TRUE(ring->waitForSpace(4));
    ring->abortWrite();
}

// ---------------------------------------------------------------------------------
// Wake-ups: a waiter woken by the other side returns before its 100 ms time-out.
// The wait runs on a thread; the waking side acts 10 ms after it started, so that
// the wake-up finds it inside its wait. The assertions are about who wakes whom.

struct WakeCase {
    const char* name;
    bool fullFirst;                         // fill the ring before the wait
    std::function<bool(RingBuffer&)> wait;  // on the waiting thread
    std::function<void(RingBuffer&)> wake;  // on the test's thread
    bool result;
};

TEST(RingBufferWakeTest, TheOtherSideOrAResetEndsTheWait) {
    const WakeCase cases[] = {
        {"commit wakes a reader", false,
         [](RingBuffer& r) {
             const bool ok = r.waitForData(40);
             if (ok)
                 r.consume(40);
             return ok;
         },
         [](RingBuffer& r) {
             ASSERT_TRUE(r.waitForSpace(40));
             r.commitWrite(40);
         },
         true},
        {"consume wakes a writer", true,
         [](RingBuffer& r) {
             const bool ok = r.waitForSpace(400);
             if (ok)
                 r.abortWrite();
             return ok;
         },
         [](RingBuffer& r) {
             ASSERT_TRUE(r.waitForData(400));
             r.consume(400);
         },
         true},
        {"reset wakes a writer", true,
         [](RingBuffer& r) {
             const bool ok = r.waitForSpace(kPage);
             if (ok)
                 r.abortWrite();
             return ok;
         },
         [](RingBuffer& r) { r.reset(); }, true},
        // The ring is empty after the reset: still nothing to read.
        {"reset wakes a reader", false, [](RingBuffer& r) { return r.waitForData(40); },
         [](RingBuffer& r) { r.reset(); }, false},
    };
    for (const WakeCase& c : cases) {
        SCOPED_TRACE(c.name);
        android::sp<RingBuffer> ring = new RingBuffer;
        ASSERT_EQ(0u, ring->configureWithSize("wait", kPage));
        if (c.fullFirst) {
            ASSERT_TRUE(ring->waitForSpace(kPage));
            ring->commitWrite(kPage);
        }
        std::atomic<bool> started{false};
        bool result = !c.result;
        std::chrono::steady_clock::duration waited{};
        std::thread waiter([&] {
            started = true;
            const auto start = std::chrono::steady_clock::now();
            result = c.wait(*ring);
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

// ---------------------------------------------------------------------------------
// Picture and dump: the dump's text is part of the service's diagnostic output.

std::string dumpText(RingBuffer& r, int indent) {
    return test::printed([&](FILE* f) { r.dump(f, indent); });
}

// A ring of eight pages whose counters first move on by `wrap`, then to `head`
// (written) and `tail` (consumed) from there.
android::sp<RingBuffer> filled(uint32_t head, uint32_t tail, uint32_t wrap = 0) {
    android::sp<RingBuffer> ring = new RingBuffer;
    EXPECT_EQ(0u, ring->configureWithSize("VideoPES", 8 * kPage));
    for (const auto& [write, read] : {std::pair{wrap, wrap}, std::pair{head, tail}}) {
        if (write > 0 && ring->waitForSpace(write))
            ring->commitWrite(write);
        if (read > 0 && ring->waitForData(read))
            ring->consume(read);
    }
    return ring;
}

const std::string kRed = "\e[01;31m", kGreen = "\e[01;32m", kBar = "\e[01;33m|";

// Head and tail positions in eighths of the ring: used bytes red, free bytes green,
// 80 columns between yellow bars.
TEST(RingBufferDumpTest, UsedBytesAreRedAndFreeBytesGreen) {
    const std::string r = kRed, g = kGreen;
    const struct {
        const char* name;
        uint32_t headEighths, tailEighths, wrapEighths;  // wrap: write and read this first
        std::string picture;
    } cases[] = {
        {"empty", 0, 0, 0, g + std::string(80, '=')},
        // Head and tail both at column 0: red in front, red and green inserted at 0.
        {"full", 8, 0, 0, r + g + r + std::string(80, '=')},
        {"used in the middle", 4, 2, 0,
         g + std::string(20, '=') + r + std::string(20, '=') + g + std::string(40, '=')},
        {"used bytes wrap", 6, 0, 4,
         r + std::string(20, '=') + g + std::string(20, '=') + r + std::string(40, '=')},
    };
    for (const auto& c : cases) {
        auto ring = filled(c.headEighths * kPage, c.tailEighths * kPage, c.wrapEighths * kPage);
        EXPECT_EQ(kBar + c.picture + kBar + "\e[m", ring->getRepresentation()) << c.name;
    }
}

TEST(RingBufferDumpTest, DumpListsCountersLocksPictureAndCarets) {
    android::sp<RingBuffer> unconfigured = new RingBuffer;
    EXPECT_EQ("\e[2K\r\t - RingBuffer \n\e[2K\r\t\tRingBuffer is not configured.\n",
              dumpText(*unconfigured, 1));

    const uint32_t size = 8 * kPage;
    auto ring = filled(size / 2, size / 4);
    char pointer[32];
    snprintf(pointer, sizeof pointer, "%p", static_cast<void*>(ring->readPointer() - size / 4));
    const std::string head = std::to_string(size / 2), tail = std::to_string(size / 4);
    std::string expected;
    for (const std::string& line :
         {std::string(" - RingBuffer VideoPES"), "\tSize: " + std::to_string(size),
          "\tHead: " + head + " (" + head + ")", "\tTail: " + tail + " (" + tail + ")",
          std::string("\tUsed: 25.00%"), "\tPointer: " + std::string(pointer),
          "\tWriteLock: " + kGreen + "Unlocked\e[m", "\tReadLock: " + kGreen + "Unlocked\e[m",
          "\t" + ring->getRepresentation(), "\t" + std::string(40, ' ') + "^ head",
          "\t" + std::string(20, ' ') + "^ tail"})
        expected += "\e[2K\r" + line + "\n";
    EXPECT_EQ(expected + "\n", dumpText(*ring, 0));

    // A lock held by another thread shows red.
    ASSERT_TRUE(ring->waitForSpace(4));
    std::string text;
    std::thread other([&] { text = dumpText(*ring, 2); });
    other.join();
    ring->abortWrite();
    EXPECT_NE(std::string::npos, text.find("\t\t\tWriteLock: " + kRed + "Locked\e[m\n"));
    EXPECT_NE(std::string::npos, text.find("\t\t\tReadLock: " + kGreen + "Unlocked\e[m\n"));
    EXPECT_EQ(0u, text.find("\e[2K\r\t\t - RingBuffer VideoPES\n"));
}

}  // namespace
}  // namespace TavoPlayer
