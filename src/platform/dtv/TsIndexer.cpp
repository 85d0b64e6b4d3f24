#include "platform/dtv/TsIndexer.h"

#include <utility>

#include "platform/dtv/PcrPacer.h"

namespace TavoPlayer {

bool TsIndexer::push(const uint8_t* packet, uint64_t offset) {
    uint64_t pcr = 0;
    bool discontinuity = false;
    if (packet[0] != 0x47 || !PcrPacer::readPcr(packet, &pcr, &discontinuity))
        return false;
    const int pid = ((packet[1] & 0x1f) << 8) | packet[2];
    if (mPcrPid < 0)
        mPcrPid = pid;
    if (pid != mPcrPid)
        return false;
    if (mHavePcr) {
        const uint64_t delta = (pcr + PcrPacer::kPcrModulus - mLastPcr) % PcrPacer::kPcrModulus;
        if (!discontinuity && delta <= PcrPacer::kMaxPcrGapTicks)
            mElapsedTicks += delta;
    }
    mHavePcr = true;
    mLastPcr = pcr;
    const uint32_t ms = elapsedMs();
    // One point per millisecond of the time line: the earliest packet leads there.
    if (mLastPointMs >= 0 && ms <= static_cast<uint32_t>(mLastPointMs))
        return false;
    mLastPointMs = ms;
    mPoints.push_back({ms, offset});
    return true;
}

std::vector<IndexPoint> TsIndexer::takePoints() {
    return std::exchange(mPoints, {});
}

}  // namespace TavoPlayer
