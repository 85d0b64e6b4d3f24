#include "platform/dtv/PacketQueue.h"

#include <algorithm>
#include <cstring>

namespace TavoPlayer {

PacketQueue::PacketQueue(size_t capacityPackets)
    : mCapacity(std::max<size_t>(capacityPackets, 1)) {}

void PacketQueue::push(const uint8_t* packet) {
    ++mPushed;
    if (mCount == mCapacity) {
        mFirst = (mFirst + 1) % mCapacity;
        --mCount;
        ++mDropped;
    }
    // Storage is allocated on first use, so an idle filter costs nothing.
    if (mStorage.empty())
        mStorage.resize(mCapacity * kPacketSize);
    const size_t slot = (mFirst + mCount) % mCapacity;
    std::memcpy(&mStorage[slot * kPacketSize], packet, kPacketSize);
    ++mCount;
}

size_t PacketQueue::pop(uint8_t* out, size_t maxPackets) {
    const size_t n = std::min(maxPackets, mCount);
    size_t done = 0;
    while (done < n) {
        // Copy the contiguous run up to the end of the storage, then wrap.
        const size_t run = std::min(n - done, mCapacity - mFirst);
        std::memcpy(out + done * kPacketSize, &mStorage[mFirst * kPacketSize], run * kPacketSize);
        done += run;
        mFirst = (mFirst + run) % mCapacity;
        mCount -= run;
    }
    if (mCount == 0)
        mFirst = 0;
    return n;
}

void PacketQueue::clear() {
    mFirst = 0;
    mCount = 0;
}

}  // namespace TavoPlayer
