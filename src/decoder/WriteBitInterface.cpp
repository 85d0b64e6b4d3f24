#include "decoder/WriteBitInterface.h"

namespace TavoPlayer {

WriteBitInterface::~WriteBitInterface() = default;

int WriteBitInterface::writeBits(unsigned int value, unsigned int count) {
    // Byte-wise selection covers two source bytes only; a wider field could never make
    // progress, so it is refused before anything is written.
    if (count > kMaxWriteBits) {
        return 0;
    }
    unsigned int remaining = count;
    while (remaining > 0) {
        if (mBitPosition == 0) {
            *mCurrent = 0;  // never rely on a pre-cleared buffer
        }
        // The source byte that holds the highest remaining bit, and how many of the
        // remaining bits it holds.
        unsigned int take;
        unsigned int source;
        if (remaining <= 8) {
            take = remaining;
            source = value & 0xFFu;
        } else {
            take = remaining - 8;
            source = (value >> 8) & 0xFFu;
        }
        source &= (1u << take) - 1u;
        const unsigned int room = 8u - mBitPosition;
        unsigned int written;
        if (take <= room) {
            *mCurrent |= static_cast<uint8_t>(source << (room - take));
            written = take;
        } else {
            // Only the highest `room` bits fit; the rest go to the next byte.
            *mCurrent |= static_cast<uint8_t>(source >> (take - room));
            written = room;
        }
        remaining -= written;
        mBitPosition = static_cast<uint8_t>(mBitPosition + written);
        if (mBitPosition == 8) {
            advanceBytes(1);
            mBitPosition = 0;
        }
    }
    return 0;
}

void WriteBitInterface::byteAlign(int* moved) {
    int result = 0;
    if (mBitPosition != 0) {
        writeBits(0, 8u - mBitPosition);
        result = 1;
    }
    if (moved != nullptr) {
        *moved = result;
    }
}

void WriteBitInterface::skipBits(unsigned char count, int* /*bytesAdvanced*/) {
    writeBits(0, count);
}

}  // namespace TavoPlayer
