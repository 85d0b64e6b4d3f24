// PacketQueue: the bounded FIFO of one demux filter.
//
// Holds at most capacity() TS packets. When a packet arrives at a full queue the
// oldest one is dropped and counted: a live source never waits for a slow reader,
// and one slow filter never holds back the others.
//
// Not locked: the demux guards every queue with its own mutex.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace TavoPlayer {

class PacketQueue {
public:
    static constexpr size_t kPacketSize = 188;

    explicit PacketQueue(size_t capacityPackets);

    // Appends one packet (kPacketSize bytes); drops the oldest when full.
    void push(const uint8_t* packet);
    // Copies up to `maxPackets` of the oldest packets into `out` and removes them.
    // Returns the number copied.
    size_t pop(uint8_t* out, size_t maxPackets);
    void clear();

    size_t count() const { return mCount; }
    size_t capacity() const { return mCapacity; }
    bool empty() const { return mCount == 0; }
    bool full() const { return mCount == mCapacity; }
    // Packets dropped because the queue was full, since construction.
    uint64_t dropped() const { return mDropped; }
    uint64_t pushed() const { return mPushed; }

private:
    size_t mCapacity;
    std::vector<uint8_t> mStorage;  // grows to mCapacity packets as needed
    size_t mFirst = 0;              // index of the oldest packet
    size_t mCount = 0;
    uint64_t mDropped = 0;
    uint64_t mPushed = 0;
};

}  // namespace TavoPlayer
