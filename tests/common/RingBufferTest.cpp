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

namespace TavoPlayer {
namespace {

using namespace std::chrono_literals;
using test::TraceCapture;

const unsigned int kPage = static_cast<unsigned int>(sysconf(_SC_PAGE_SIZE));

// ---------------------------------------------------------------------------------
// Configuration

class RingBufferConfigureTest : public ::testing::Test {
protected:
    TraceCapture trace;
    android::sp<RingBuffer> ring = new RingBuffer;
};

TEST_F(RingBufferConfigureTest, BelowOnePageIsRefusedAndLeavesTheRingUnconfigured) {
    EXPECT_EQ(1u, ring->configureWithSize("small", kPage - 4));
    EXPECT_EQ(0u, ring->size());
    EXPECT_EQ(1u, trace.count(TRACE_ERROR, "configureWithSize: Size must be multiple of " +
                                               std::to_string(kPage)));
    // Still unconfigured, so a proper size is accepted afterwards.
    EXPECT_EQ(0u, ring->configureWithSize("small", kPage));
    EXPECT_EQ(kPage, ring->size());
}

TEST_F(RingBufferConfigureTest, ExactlyOnePageIsAccepted) {
    EXPECT_EQ(0u, ring->configureWithSize("page", kPage));
    EXPECT_EQ(1u, trace.count(TRACE_INFO, "configureWithSize: mSize: " + std::to_string(kPage)));
    EXPECT_EQ("page", ring->name());
}

TEST_F(RingBufferConfigureTest, SecondConfigurationIsRefusedAndChangesNothing) {
    ASSERT_EQ(0u, ring->configure("first", 16));
    EXPECT_EQ(1u, ring->configure("second", 17));
    EXPECT_EQ(1u, ring->configureWithSize("third", 3 * kPage));
    EXPECT_EQ(65536u, ring->size());
    EXPECT_EQ("first", ring->name());
    EXPECT_EQ(1u, trace.count("configure: RingBuffer already configured"));
    EXPECT_EQ(1u, trace.count("configureWithSize: RingBuffer already configured"));
}

TEST_F(RingBufferConfigureTest, Log2SizeIsTakenModulo32) {
    // 32 + 14 = 46 -> 1 << 14.
    ASSERT_EQ(0u, ring->configure("mod", 46));
    EXPECT_EQ(16384u, ring->size());
}

TEST_F(RingBufferConfigureTest, SizeThatIsNotAPageMultipleFailsAtTheSecondMapping) {
    EXPECT_EQ(1u, ring->configureWithSize("odd", kPage + 100));
    EXPECT_TRUE(trace.contains("configureWithSize: mmap failed 3"));
    // The failed attempt leaves mSize set: a later attempt is "already configured".
    EXPECT_EQ(1u, ring->configureWithSize("odd", 2 * kPage));
    EXPECT_TRUE(trace.contains("RingBuffer already configured"));
}

TEST_F(RingBufferConfigureTest, FailedConfigurationsLeakNoDescriptor) {
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

    TraceCapture trace;
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

TEST_F(RingBufferAccessTest, FullRingRefusesMoreAfterOneWait) {
    ASSERT_TRUE(ring->waitForSpace(kPage));
    ring->commitWrite(kPage);
    EXPECT_FALSE(ring->waitForSpace(4));
    // The writer lock was released: the reader side can still work.
    ASSERT_TRUE(ring->waitForData(kPage));
    ring->consume(kPage);
    EXPECT_TRUE(ring->waitForSpace(4));
    ring->abortWrite();
}

// ---------------------------------------------------------------------------------
// Waits and wake-ups, with generous deadlines: the assertions are about who wakes
// whom, not about how fast.

class RingBufferWaitTest : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_EQ(0u, ring->configureWithSize("wait", kPage)); }
    android::sp<RingBuffer> ring = new RingBuffer;
};

TEST_F(RingBufferWaitTest, ReaderOnEmptyRingGivesUpAfterItsWait) {
    const auto start = std::chrono::steady_clock::now();
    EXPECT_FALSE(ring->waitForData(40));
    const auto waited = std::chrono::steady_clock::now() - start;
    EXPECT_GE(waited, 95ms);  // it did wait, once
    EXPECT_LT(waited, 5s);    // and did not wait forever
}

TEST_F(RingBufferWaitTest, WriterOnFullRingGivesUpAfterItsWait) {
    ASSERT_TRUE(ring->waitForSpace(kPage));
    ring->commitWrite(kPage);
    const auto start = std::chrono::steady_clock::now();
    EXPECT_FALSE(ring->waitForSpace(40));
    EXPECT_GE(std::chrono::steady_clock::now() - start, 95ms);
}

// A waiter woken by the other side returns before its 100 ms time-out. Each test
// runs the wait on a thread that reports how long it waited; the waking side acts
// 10 ms after the waiter started, so that the wake-up finds it inside its wait.
class Waiter {
public:
    explicit Waiter(std::function<bool()> wait) {
        mThread = std::thread([this, wait = std::move(wait)] {
            mStarted = true;
            const auto start = std::chrono::steady_clock::now();
            mResult = wait();
            mWaited = std::chrono::steady_clock::now() - start;
        });
        while (!mStarted)
            std::this_thread::yield();
    }
    bool result() {
        join();
        return mResult;
    }
    bool wokenBeforeTimeout() {
        join();
        return mWaited < std::chrono::nanoseconds(RingBuffer::kWaitTimeoutNs) * 9 / 10;
    }
    ~Waiter() { join(); }

private:
    void join() {
        if (mThread.joinable())
            mThread.join();
    }
    std::thread mThread;
    std::atomic<bool> mStarted{false};
    bool mResult = false;
    std::chrono::steady_clock::duration mWaited{};
};

TEST_F(RingBufferWaitTest, CommitWakesAWaitingReader) {
    Waiter reader([&] {
        const bool ok = ring->waitForData(40);
        if (ok)
            ring->consume(40);
        return ok;
    });
    std::this_thread::sleep_for(10ms);
    ASSERT_TRUE(ring->waitForSpace(40));
    ring->commitWrite(40);
    EXPECT_TRUE(reader.result());
    EXPECT_TRUE(reader.wokenBeforeTimeout());
}

TEST_F(RingBufferWaitTest, ConsumeWakesAWaitingWriter) {
    ASSERT_TRUE(ring->waitForSpace(kPage));
    ring->commitWrite(kPage);
    Waiter writer([&] {
        const bool ok = ring->waitForSpace(400);
        if (ok)
            ring->abortWrite();
        return ok;
    });
    std::this_thread::sleep_for(10ms);
    ASSERT_TRUE(ring->waitForData(400));
    ring->consume(400);
    EXPECT_TRUE(writer.result());
    EXPECT_TRUE(writer.wokenBeforeTimeout());
}

TEST_F(RingBufferWaitTest, ResetWakesAWriterWaitingForSpace) {
    ASSERT_TRUE(ring->waitForSpace(kPage));
    ring->commitWrite(kPage);
    Waiter writer([&] {
        const bool ok = ring->waitForSpace(kPage);
        if (ok)
            ring->abortWrite();
        return ok;
    });
    std::this_thread::sleep_for(10ms);
    ring->reset();
    EXPECT_TRUE(writer.result());
    EXPECT_TRUE(writer.wokenBeforeTimeout());
    EXPECT_EQ(0u, ring->head());
    EXPECT_EQ(0u, ring->tail());
}

TEST_F(RingBufferWaitTest, ResetWakesAReaderWaitingForData) {
    Waiter reader([&] { return ring->waitForData(40); });
    std::this_thread::sleep_for(10ms);
    ring->reset();
    EXPECT_FALSE(reader.result());  // the ring is empty after reset: still nothing
    EXPECT_TRUE(reader.wokenBeforeTimeout());
}

// ---------------------------------------------------------------------------------
// Picture and dump

class RingBufferDumpTest : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_EQ(0u, ring->configureWithSize("VideoPES", 8 * kPage)); }

    void fill(uint32_t head, uint32_t tail) {
        // Consume first so that both counters end where asked.
        if (head > 0) {
            ASSERT_TRUE(ring->waitForSpace(head));
            ring->commitWrite(head);
        }
        if (tail > 0) {
            ASSERT_TRUE(ring->waitForData(tail));
            ring->consume(tail);
        }
    }

    static std::string dumpText(RingBuffer& r, int indent) {
        char* buffer = nullptr;
        size_t length = 0;
        FILE* f = open_memstream(&buffer, &length);
        r.dump(f, indent);
        fclose(f);
        std::string text(buffer, length);
        free(buffer);
        return text;
    }

    android::sp<RingBuffer> ring = new RingBuffer;
    const std::string red = "\e[01;31m", green = "\e[01;32m", bar = "\e[01;33m|";
};

// The picture for head and tail positions given in eighths of the ring: used bytes
// red, free bytes green, 80 columns between yellow bars.
TEST_F(RingBufferDumpTest, UsedBytesAreRedAndFreeBytesGreen) {
    const std::string r = red, g = green;
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
        android::sp<RingBuffer> fresh = new RingBuffer;
        ASSERT_EQ(0u, fresh->configureWithSize("picture", 8 * kPage));
        ring = fresh;
        fill(c.wrapEighths * kPage, c.wrapEighths * kPage);
        fill(c.headEighths * kPage, c.tailEighths * kPage);
        EXPECT_EQ(bar + c.picture + bar + "\e[m", ring->getRepresentation()) << c.name;
    }
}

TEST_F(RingBufferDumpTest, DumpOfUnconfiguredRingIsTwoLines) {
    android::sp<RingBuffer> unconfigured = new RingBuffer;
    EXPECT_EQ("\e[2K\r\t - RingBuffer \n\e[2K\r\t\tRingBuffer is not configured.\n",
              dumpText(*unconfigured, 1));
}

TEST_F(RingBufferDumpTest, DumpListsCountersLocksPictureAndCarets) {
    const uint32_t size = 8 * kPage;
    fill(size / 2, size / 4);
    char pointer[32];
    snprintf(pointer, sizeof pointer, "%p", static_cast<void*>(ring->readPointer() - size / 4));
    const std::string head = std::to_string(size / 2), tail = std::to_string(size / 4);
    const std::string expected =
        "\e[2K\r - RingBuffer VideoPES\n"
        "\e[2K\r\tSize: " +
        std::to_string(size) +
        "\n"
        "\e[2K\r\tHead: " +
        head + " (" + head +
        ")\n"
        "\e[2K\r\tTail: " +
        tail + " (" + tail +
        ")\n"
        "\e[2K\r\tUsed: 25.00%\n"
        "\e[2K\r\tPointer: " +
        pointer +
        "\n"
        "\e[2K\r\tWriteLock: \e[01;32mUnlocked\e[m\n"
        "\e[2K\r\tReadLock: \e[01;32mUnlocked\e[m\n"
        "\e[2K\r\t" +
        ring->getRepresentation() +
        "\n"
        "\e[2K\r\t" +
        std::string(40, ' ') +
        "^ head\n"
        "\e[2K\r\t" +
        std::string(20, ' ') + "^ tail\n\n";
    EXPECT_EQ(expected, dumpText(*ring, 0));
}

TEST_F(RingBufferDumpTest, DumpShowsAHeldLock) {
    ASSERT_TRUE(ring->waitForSpace(4));
    std::string text;
    std::thread other([&] { text = dumpText(*ring, 2); });
    other.join();
    ring->abortWrite();
    EXPECT_NE(std::string::npos, text.find("\t\t\tWriteLock: \e[01;31mLocked\e[m\n"));
    EXPECT_NE(std::string::npos, text.find("\t\t\tReadLock: \e[01;32mUnlocked\e[m\n"));
    EXPECT_EQ(0u, text.find("\e[2K\r\t\t - RingBuffer VideoPES\n"));
}

}  // namespace
}  // namespace TavoPlayer
