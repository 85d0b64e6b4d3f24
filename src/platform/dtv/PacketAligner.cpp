#include "platform/dtv/PacketAligner.h"

namespace TavoPlayer {

namespace {
// Sync bytes checked after a candidate before locking onto it: one repeat can be a
// payload byte that happens to be 0x47, two in a row at the period rarely are.
constexpr size_t kConfirmations = 2;
}  // namespace

size_t PacketAligner::push(const uint8_t* data, size_t size, std::vector<uint8_t>& out) {
    // Drop what has been processed before appending, so that the buffer stays
    // a few packets long whatever the piece size.
    if (mPos > 0) {
        mPending.erase(mPending.begin(), mPending.begin() + static_cast<std::ptrdiff_t>(mPos));
        mPos = 0;
    }
    mPending.insert(mPending.end(), data, data + size);
    return process(false, out);
}

size_t PacketAligner::finish(std::vector<uint8_t>& out) {
    const uint64_t skippedBefore = mBytesSkipped;
    process(true, out);
    const size_t remaining = mPending.size() - mPos;
    mBytesSkipped += remaining;
    const size_t dropped = static_cast<size_t>(mBytesSkipped - skippedBefore);
    mPending.clear();
    mPos = 0;
    mPacketSize = 0;
    return dropped;
}

void PacketAligner::reset() {
    mPending.clear();
    mPos = 0;
    mPacketSize = 0;
}

PacketAligner::Lock PacketAligner::tryLock(size_t at, size_t period, bool finishing) const {
    const size_t size = mPending.size();
    if (size - at < kPacketSize)
        return finishing ? Lock::kNo : Lock::kNeedMore;
    for (size_t k = 1; k <= kConfirmations; ++k) {
        const size_t next = at + k * period;
        if (next >= size) {
            // At the end of the stream the last packets have fewer followers to
            // confirm them; what could be checked has held.
            return finishing ? Lock::kYes : Lock::kNeedMore;
        }
        if (mPending[next] != kSyncByte)
            return Lock::kNo;
    }
    return Lock::kYes;
}

size_t PacketAligner::process(bool finishing, std::vector<uint8_t>& out) {
    size_t emitted = 0;
    const size_t size = mPending.size();
    while (mPos < size) {
        if (mPacketSize == 0) {
            // Searching: find a 0x47 that repeats at 188 or at 204 bytes.
            bool needMore = false;
            while (mPos < size) {
                if (mPending[mPos] == kSyncByte) {
                    const Lock at188 = tryLock(mPos, kPacketSize, finishing);
                    if (at188 == Lock::kYes) {
                        mPacketSize = kPacketSize;
                        break;
                    }
                    const Lock at204 = tryLock(mPos, kRsPacketSize, finishing);
                    if (at204 == Lock::kYes && at188 == Lock::kNo) {
                        mPacketSize = kRsPacketSize;
                        break;
                    }
                    if (at188 == Lock::kNeedMore || at204 == Lock::kNeedMore) {
                        needMore = true;
                        break;
                    }
                }
                ++mPos;
                ++mBytesSkipped;
            }
            if (needMore || mPacketSize == 0)
                break;
        }
        // Locked.
        if (size - mPos < mPacketSize) {
            // A final piece shorter than a packet is left for finish() to drop;
            // a 204-byte packet whose trailer is missing still carries its TS packet.
            if (finishing && mPacketSize == kRsPacketSize && size - mPos >= kPacketSize &&
                mPending[mPos] == kSyncByte) {
                out.insert(out.end(), mPending.begin() + static_cast<std::ptrdiff_t>(mPos),
                           mPending.begin() + static_cast<std::ptrdiff_t>(mPos + kPacketSize));
                ++emitted;
                ++mPacketsOut;
                mPos = size;
            }
            break;
        }
        const size_t next = mPos + mPacketSize;
        const size_t afterNext = next + mPacketSize;
        bool whole = mPending[mPos] == kSyncByte;
        if (whole && next < size && mPending[next] != kSyncByte) {
            // The next packet does not start where it should: either its own sync
            // byte is damaged (the one after it is in place) or this packet was cut
            // short and the bytes after it belong to another packet.
            if (afterNext >= size && !finishing)
                break;  // decide when it arrives
            whole = afterNext < size && mPending[afterNext] == kSyncByte;
        }
        if (!whole) {
            // Search again from the next byte.
            ++mSyncLosses;
            mPacketSize = 0;
            ++mPos;
            ++mBytesSkipped;
            continue;
        }
        if (next >= size && !finishing)
            break;  // wait for the next sync byte
        out.insert(out.end(), mPending.begin() + static_cast<std::ptrdiff_t>(mPos),
                   mPending.begin() + static_cast<std::ptrdiff_t>(mPos + kPacketSize));
        ++emitted;
        ++mPacketsOut;
        mPos = next;
    }
    return emitted;
}

}  // namespace TavoPlayer
