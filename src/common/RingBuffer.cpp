#include "common/RingBuffer.h"

#include <cutils/ashmem.h>
#include <errno.h>
#include <sys/mman.h>
#include <time.h>
#include <unistd.h>

#include <climits>
#include <cstring>

#include "platform/os/Trace.h"

namespace TavoPlayer {
namespace {

constexpr int kColumns = 80;
constexpr const char* kRed = "\e[01;31m";
constexpr const char* kGreen = "\e[01;32m";
constexpr const char* kYellowBar = "\e[01;33m|";
constexpr const char* kReset = "\e[m";

// Deadline = now + 100 ms on the monotonic clock, normalised; the seconds saturate
// at the largest signed 64-bit value rather than overflow.
timespec waitDeadline() {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    ts.tv_nsec += RingBuffer::kWaitTimeoutNs;
    if (ts.tv_nsec >= 1'000'000'000) {
        ts.tv_nsec -= 1'000'000'000;
        ts.tv_sec = ts.tv_sec == LLONG_MAX ? LLONG_MAX : ts.tv_sec + 1;
    }
    return ts;
}

void initMonotonicCondition(pthread_cond_t* cond) {
    pthread_condattr_t attr;
    pthread_condattr_init(&attr);
    pthread_condattr_setclock(&attr, CLOCK_MONOTONIC);
    pthread_cond_init(cond, &attr);
    pthread_condattr_destroy(&attr);
}

}  // namespace

RingBuffer::RingBuffer() : mCounters(0), mSize(0), mBuffer(nullptr) {
    pthread_mutex_init(&mWriteLock, nullptr);
    pthread_mutex_init(&mReadLock, nullptr);
    initMonotonicCondition(&mSpaceAvailable);
    initMonotonicCondition(&mDataAvailable);
}

RingBuffer::~RingBuffer() {
    if (mBuffer != nullptr) {
        const int rc = munmap(mBuffer, 2 * static_cast<size_t>(mSize));
        if (rc < 0) {
            TAVO_LOGE("%s: munmap return code: %d\n", "~RingBuffer", rc);
        }
    }
    pthread_cond_destroy(&mSpaceAvailable);
    pthread_cond_destroy(&mDataAvailable);
    pthread_mutex_destroy(&mWriteLock);
    pthread_mutex_destroy(&mReadLock);
}

unsigned int RingBuffer::configure(std::string name, unsigned int log2Size) {
    return configureImpl(__func__, std::move(name), 1u << (log2Size % 32));
}

unsigned int RingBuffer::configureWithSize(std::string name, unsigned int size) {
    return configureImpl(__func__, std::move(name), size);
}

unsigned int RingBuffer::configureImpl(const char* function, std::string name, unsigned int size) {
    if (mSize != 0) {
        TAVO_LOGE("%s: RingBuffer already configured\n", function);
        return 1;
    }
    mSize = size;
    TAVO_LOGI("%s: mSize: %d\n", function, mSize);
    const long pageSize = sysconf(_SC_PAGE_SIZE);
    // Only "at least one page" is tested, although the message speaks of a multiple:
    // a size that is not a page multiple fails later, at the second mapping.
    if (static_cast<long>(mSize) < pageSize) {
        TAVO_LOGE("%s: Size must be multiple of %d\n", function, static_cast<int>(pageSize));
        mSize = 0;
        return 1;
    }
    mName = std::move(name);

    const int fd = ashmem_create_region(mName.c_str(), mSize);
    if (fd < 0) {
        TAVO_LOGE("%s: ashmem_create_region failed. error code: %d\n", function, fd);
        return 1;
    }
    const int prot = ashmem_set_prot_region(fd, PROT_READ | PROT_WRITE);
    if (prot < 0) {
        TAVO_LOGE("%s: ashmem_set_prot_region failed.error code: %d\n", function, prot);
        close(fd);
        return 1;
    }
    const size_t twice = 2 * static_cast<size_t>(mSize);
    void* reserved = mmap(nullptr, twice, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    mBuffer = static_cast<uint8_t*>(reserved);
    if (reserved == MAP_FAILED) {
        TAVO_LOGE("%s: mmap failed 1 fd = %d error code: %d\n", function, fd, errno);
        close(fd);
        return 1;
    }
    // The first view is populated now, so the ring's memory is taken once at configure
    // instead of page by page while it fills (a 6 MiB ring at a few Mbit/s takes minutes
    // to be touched throughout), and the writers meet no first-touch faults. The second
    // view only serves records that run past the end and is left to fault in.
    void* first =
        mmap(mBuffer, mSize, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_FIXED | MAP_POPULATE, fd, 0);
    if (first != mBuffer) {
        const int err = errno;
        TAVO_LOGE("%s: mmap failed 2 fd = %d. error code: (%d : %s)\n", function, fd, err,
                  strerror(err));
        close(fd);
        munmap(mBuffer, twice);
        return 1;
    }
    void* second =
        mmap(mBuffer + mSize, mSize, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_FIXED, fd, 0);
    if (second != mBuffer + mSize) {
        TAVO_LOGE("%s: mmap failed 3 fd = %d. error code: %d\n", function, fd, errno);
        close(fd);
        munmap(mBuffer, twice);
        return 1;
    }
    if (close(fd) != 0) {
        TAVO_LOGE("%s: close failed fd = %d. error code: %d\n", function, fd, errno);
        munmap(mBuffer, twice);
        return 1;
    }
    return 0;
}

bool RingBuffer::waitForSpace(uint32_t bytes) {
    pthread_mutex_lock(&mWriteLock);
    if (waitForSpace_l(bytes))
        return true;
    pthread_mutex_unlock(&mWriteLock);
    return false;
}

bool RingBuffer::waitForSpace_l(uint32_t bytes) {
    if (freeSpace() >= bytes)
        return true;
    const timespec deadline = waitDeadline();
    pthread_cond_timedwait(&mSpaceAvailable, &mWriteLock, &deadline);
    return freeSpace() >= bytes;
}

void RingBuffer::commitWrite(uint32_t bytes) {
    __atomic_store_n(&mHead, mHead + roundUp4(bytes), __ATOMIC_RELEASE);
    pthread_mutex_unlock(&mWriteLock);
    wakeReader();
}

void RingBuffer::abortWrite() {
    pthread_mutex_unlock(&mWriteLock);
    wakeReader();
}

bool RingBuffer::waitForData(uint32_t bytes) {
    pthread_mutex_lock(&mReadLock);
    if (usedSpace() < bytes) {
        const timespec deadline = waitDeadline();
        pthread_cond_timedwait(&mDataAvailable, &mReadLock, &deadline);
        if (usedSpace() < bytes) {
            pthread_mutex_unlock(&mReadLock);
            return false;
        }
    }
    return true;
}

void RingBuffer::consume(uint32_t bytes) {
    __atomic_store_n(&mTail, mTail + roundUp4(bytes), __ATOMIC_RELEASE);
    pthread_mutex_unlock(&mReadLock);
    wakeWriter();
}

void RingBuffer::abortRead() {
    pthread_mutex_unlock(&mReadLock);
    wakeWriter();
}

void RingBuffer::wakeReader() {
    if (pthread_mutex_trylock(&mReadLock) == 0) {
        pthread_cond_broadcast(&mDataAvailable);
        pthread_mutex_unlock(&mReadLock);
    }
}

void RingBuffer::wakeWriter() {
    if (pthread_mutex_trylock(&mWriteLock) == 0) {
        pthread_cond_broadcast(&mSpaceAvailable);
        pthread_mutex_unlock(&mWriteLock);
    }
}

void RingBuffer::wakeAll() {
    wakeReader();
    wakeWriter();
}

void RingBuffer::reset() {
    pthread_mutex_lock(&mReadLock);
    pthread_mutex_lock(&mWriteLock);
    __atomic_store_n(&mCounters, 0, __ATOMIC_RELEASE);
    pthread_cond_broadcast(&mDataAvailable);
    pthread_cond_broadcast(&mSpaceAvailable);
    pthread_mutex_unlock(&mReadLock);
    pthread_mutex_unlock(&mWriteLock);
}

std::string RingBuffer::getRepresentation() const {
    std::string picture(kColumns, '=');
    const uint32_t head = loadHead();
    const uint32_t tail = loadTail();
    if (head != tail) {
        const float h = static_cast<float>(head % mSize) / static_cast<float>(mSize);
        const float t = static_cast<float>(tail % mSize) / static_cast<float>(mSize);
        const auto headColumn = static_cast<size_t>(h * kColumns);
        const auto tailColumn = static_cast<size_t>(t * kColumns);
        if (t >= h) {
            // Used bytes wrap past the end (or the ring is full): red from the start.
            picture.insert(tailColumn, kRed);
            picture.insert(headColumn, kGreen);
            picture.insert(0, kRed);
        } else {
            picture.insert(headColumn, kGreen);
            picture.insert(tailColumn, kRed);
            picture.insert(0, kGreen);
        }
    } else {
        picture.insert(0, kGreen);
    }
    return kYellowBar + picture + kYellowBar + kReset;
}

void RingBuffer::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return;
    const std::string prefix(indent > 0 ? static_cast<size_t>(indent) : 0, '\t');
    const char* p = prefix.c_str();
    fprintf(stream, "\e[2K\r%s - RingBuffer %s\n", p, mName.c_str());
    if (mSize == 0) {
        fprintf(stream, "\e[2K\r%s\tRingBuffer is not configured.\n", p);
        return;
    }
    const uint32_t head = loadHead();
    const uint32_t tail = loadTail();
    fprintf(stream, "\e[2K\r%s\tSize: %u\n", p, mSize);
    fprintf(stream, "\e[2K\r%s\tHead: %u (%u)\n", p, head, head % mSize);
    fprintf(stream, "\e[2K\r%s\tTail: %u (%u)\n", p, tail, tail % mSize);
    fprintf(stream, "\e[2K\r%s\tUsed: %03.2f%%\n", p,
            static_cast<double>(head - tail) / mSize * 100.0);
    fprintf(stream, "\e[2K\r%s\tPointer: %p\n", p, static_cast<void*>(mBuffer));
    auto lockText = [](pthread_mutex_t* lock) {
        if (pthread_mutex_trylock(lock) != 0)
            return "\e[01;31mLocked\e[m";
        pthread_mutex_unlock(lock);
        return "\e[01;32mUnlocked\e[m";
    };
    fprintf(stream, "\e[2K\r%s\tWriteLock: %s\n", p, lockText(&mWriteLock));
    fprintf(stream, "\e[2K\r%s\tReadLock: %s\n", p, lockText(&mReadLock));
    fprintf(stream, "\e[2K\r%s\t%s\n", p, getRepresentation().c_str());
    // The carets are not shifted by the picture's leading "|", on purpose: each
    // stands one column left of its colour boundary.
    const auto column = [this](uint32_t counter) {
        const float fraction = static_cast<float>(counter % mSize) / static_cast<float>(mSize);
        return static_cast<size_t>(fraction * kColumns);
    };
    fprintf(stream, "\e[2K\r%s\t%s\n", p, (std::string(column(head), ' ') + "^ head").c_str());
    fprintf(stream, "\e[2K\r%s\t%s\n\n", p, (std::string(column(tail), ' ') + "^ tail").c_str());
}

}  // namespace TavoPlayer
