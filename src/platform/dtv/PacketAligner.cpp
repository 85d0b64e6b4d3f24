#include "platform/dtv/PacketAligner.h"

#include <algorithm>

namespace TavoPlayer {

namespace {
// Sync bytes checked after a candidate before locking onto it: one repeat can be a
// payload byte that happens to be 0x47, two in a row at the period rarely are.
constexpr size_t kConfirmations = 2;
}  // namespace

size_t PacketAligner::push(const uint8_t* data, size_t size, std::vector<uint8_t>& out) {
    // Drop what has been processed before appending, so that the buffer stays
    // a few packets long whatever the piece size.
    const size_t keepFrom = std::min(mPos, mSuspect);
    if (keepFrom > 0) {
        mPending.erase(mPending.begin(), mPending.begin() + static_cast<std::ptrdiff_t>(keepFrom));
        mPos -= keepFrom;
        if (mSuspect != kNone)
            mSuspect -= keepFrom;
    }
    mPending.insert(mPending.end(), data, data + size);
    return process(false, out);
}

size_t PacketAligner::finish(std::vector<uint8_t>& out) {
    const uint64_t skippedBefore = mBytesSkipped;
    process(true, out);
    if (mSuspect != kNone) {
        // The stream ended inside the packet under suspicion: it was cut short.
        mBytesSkipped += mPos - mSuspect;
        mSuspect = kNone;
    }
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
    mSuspect = kNone;
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

void PacketAligner::emit(size_t at, std::vector<uint8_t>& out) {
    out.insert(out.end(), mPending.begin() + static_cast<std::ptrdiff_t>(at),
               mPending.begin() + static_cast<std::ptrdiff_t>(at + kPacketSize));
    ++mPacketsOut;
}

size_t PacketAligner::process(bool finishing, std::vector<uint8_t>& out) {
    const uint64_t before = mPacketsOut;
    const size_t size = mPending.size();
    while (mPos < size) {
        if (mPacketSize == 0) {
            // Searching: find a 0x47 that repeats at 188 or at 204 bytes.
            bool needMore = false;
            while (mPos < size) {
                if (mSuspect != kNone && mPos >= mSuspect + kPacketSize) {
                    // No packet starts inside the suspect: it was whole, and what
                    // followed it was garbage or a packet with a damaged sync byte.
                    emit(mSuspect, out);
                    mSuspect = kNone;
                }
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
                // Bytes of a suspect packet are counted once its fate is known.
                if (mSuspect == kNone)
                    ++mBytesSkipped;
            }
            if (needMore || mPacketSize == 0)
                break;
            if (mSuspect != kNone) {
                // A packet starts inside the suspect: it was cut short.
                mBytesSkipped += mPos - mSuspect;
                mSuspect = kNone;
            }
        }
        // Locked.
        if (size - mPos < mPacketSize) {
            // A final piece shorter than a packet is left for finish() to drop;
            // a 204-byte packet whose trailer is missing still carries its TS packet.
            if (finishing && mPacketSize == kRsPacketSize && size - mPos >= kPacketSize &&
                mPending[mPos] == kSyncByte) {
                emit(mPos, out);
                mPos = size;
            }
            break;
        }
        if (mPending[mPos] != kSyncByte) {
            ++mSyncLosses;
            mPacketSize = 0;
            ++mPos;
            ++mBytesSkipped;
            continue;
        }
        const size_t next = mPos + mPacketSize;
        if (next < size && mPending[next] != kSyncByte) {
            // The next packet does not start where it should. Either this packet
            // was cut short (a packet starts inside it) or garbage follows it; the
            // search for the next packet tells which.
            ++mSyncLosses;
            mSuspect = mPos;
            mPacketSize = 0;
            ++mPos;
            continue;
        }
        if (next >= size && !finishing)
            break;  // wait for the next sync byte
        emit(mPos, out);
        mPos = next;
    }
    return static_cast<size_t>(mPacketsOut - before);
}

}  // namespace TavoPlayer
