// RingBuffer: the one channel between two pipeline modules.
//
// A byte ring in an ashmem region that is mapped twice, back to back, so that a
// record starting near the end continues into the second mapping: every record is
// contiguous, and neither side ever handles a wrap. Exactly one writer thread and
// one reader thread use a ring; records are built in place at writePointer() and
// used in place at readPointer().
//
// Locks: mWriteLock is held by the writer from waitForSpace() until commitWrite()
// or abortWrite(); mReadLock by the reader from waitForData() until consume() or
// abortRead(). mHead is written only under mWriteLock, mTail only under mReadLock;
// each side reads the other's counter without its lock (a stale value only shows
// less space or less data). Wake-ups go to the other side with a try-lock and a
// broadcast, never a blocking lock, so a lost wake-up costs at most one 100 ms wait.
// A lock must be released by the thread that took it.
#pragma once

#include <pthread.h>

#include <cstdint>
#include <cstdio>
#include <string>

#include <utils/RefBase.h>

namespace TavoPlayer {

class RingBuffer : public android::RefBase {
public:
    // Every wait step waits at most once for this long and then re-tests.
    static constexpr int64_t kWaitTimeoutNs = 100'000'000;

    RingBuffer();
    ~RingBuffer() override;
    RingBuffer(const RingBuffer&) = delete;
    RingBuffer& operator=(const RingBuffer&) = delete;

    // Capacity 1 << (log2Size mod 32). Returns 0, or 1 on any failure.
    unsigned int configure(std::string name, unsigned int log2Size);
    // Capacity exactly `size` (at least one page). Returns 0, or 1 on any failure.
    unsigned int configureWithSize(std::string name, unsigned int size);

    // --- writer side -------------------------------------------------------------
    // Locks mWriteLock and waits (once, at most 100 ms) until `bytes` are free.
    // true: the lock stays held. false: "no room", the lock has been released.
    bool waitForSpace(uint32_t bytes);
    // With mWriteLock already held: if fewer than `bytes` are free, waits once (at
    // most 100 ms) on mSpaceAvailable. The lock stays held either way. Returns
    // whether `bytes` are free now.
    bool waitForSpace_l(uint32_t bytes);
    uint8_t* writePointer() const { return mBuffer + (mHead % mSize); }
    // mHead += bytes rounded up to 4; releases mWriteLock; wakes the reader.
    void commitWrite(uint32_t bytes);
    // Releases mWriteLock without writing anything; wakes the reader.
    void abortWrite();

    // --- reader side -------------------------------------------------------------
    // Locks mReadLock and waits (once, at most 100 ms) until `bytes` are readable.
    // true: the lock stays held. false: "nothing", the lock has been released.
    bool waitForData(uint32_t bytes);
    uint8_t* readPointer() const { return mBuffer + (mTail % mSize); }
    // mTail += bytes rounded up to 4; releases mReadLock; wakes the writer.
    void consume(uint32_t bytes);
    // Releases mReadLock without consuming; wakes the writer.
    void abortRead();

    // --- control -----------------------------------------------------------------
    // Empties the ring and wakes both sides. Takes mReadLock, then mWriteLock.
    void reset();
    // Wakes every waiter on both conditions (try-lock, broadcast); used by stop().
    void wakeAll();

    uint32_t usedSpace() const { return loadHead() - loadTail(); }
    uint32_t freeSpace() const { return loadTail() + mSize - loadHead(); }
    uint32_t size() const { return mSize; }
    uint32_t head() const { return loadHead(); }
    uint32_t tail() const { return loadTail(); }
    const std::string& name() const { return mName; }

    std::string getRepresentation() const;
    void dump(FILE* stream, int indent);

    // Records advance a ring by their size rounded up to a multiple of 4.
    static constexpr uint32_t roundUp4(uint32_t bytes) { return (bytes + 3u) & ~3u; }

private:
    unsigned int configureImpl(const char* function, std::string name, unsigned int size);
    void wakeReader();
    void wakeWriter();
    uint32_t loadHead() const { return __atomic_load_n(&mHead, __ATOMIC_ACQUIRE); }
    uint32_t loadTail() const { return __atomic_load_n(&mTail, __ATOMIC_ACQUIRE); }

    std::string mName;
    // mHead and mTail sit together so that reset() can clear both with one 64-bit store.
    union {
        struct {
            uint32_t mHead;  // total bytes committed; writer only (mWriteLock)
            uint32_t mTail;  // total bytes consumed; reader only (mReadLock)
        };
        uint64_t mCounters;
    };
    uint32_t mSize;
    uint8_t* mBuffer;
    mutable pthread_mutex_t mWriteLock;
    mutable pthread_mutex_t mReadLock;
    pthread_cond_t mSpaceAvailable;
    pthread_cond_t mDataAvailable;
};

}  // namespace TavoPlayer
