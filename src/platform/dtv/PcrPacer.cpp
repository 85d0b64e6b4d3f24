#include "platform/dtv/PcrPacer.h"

#include <algorithm>

namespace TavoPlayer {

namespace {
// Compact the held packets once this many have been taken from the front.
constexpr size_t kCompactAfter = 4096;

int64_t ticksToNs(uint64_t ticks27MHz) {
    return static_cast<int64_t>(ticks27MHz * 1000 / 27);
}
}  // namespace

bool PcrPacer::readPcr(const uint8_t* packet, uint64_t* pcrTicks, bool* discontinuity) {
    // ISO/IEC 13818-1, 2.4.3.2 and 2.4.3.4: adaptation_field_control 2 or 3 carries
    // an adaptation field; its flags byte follows the length byte, and with
    // PCR_flag set the next six bytes are program_clock_reference_base (33 bits),
    // 6 reserved bits and program_clock_reference_extension (9 bits).
    const uint8_t control = (packet[3] >> 4) & 0x3;
    if (control != 2 && control != 3)
        return false;
    const uint8_t length = packet[4];
    if (length < 7 || length > 183)
        return false;
    const uint8_t flags = packet[5];
    if ((flags & 0x10) == 0)
        return false;
    const uint8_t* p = packet + 6;
    const uint64_t base = (uint64_t{p[0]} << 25) | (uint64_t{p[1]} << 17) | (uint64_t{p[2]} << 9) |
                          (uint64_t{p[3]} << 1) | (p[4] >> 7);
    const uint64_t extension = (uint64_t{p[4] & 0x1u} << 8) | p[5];
    *pcrTicks = base * 300 + extension;  // 2.4.2.2, equation 2-1
    *discontinuity = (flags & 0x80) != 0;
    return true;
}

void PcrPacer::push(const uint8_t* packet, int64_t nowNs) {
    const uint64_t index = mBase + mDue.size();
    mPackets.insert(mPackets.end(), packet, packet + kPacketSize);
    mDue.push_back(kUnknown);
    uint64_t pcr = 0;
    bool discontinuity = false;
    if (readPcr(packet, &pcr, &discontinuity)) {
        const int pid = ((packet[1] & 0x1f) << 8) | packet[2];
        if (mPcrPid < 0)
            mPcrPid = pid;
        if (pid == mPcrPid)
            onPcr(index, pcr, discontinuity, nowNs);
    }
    const uint64_t end = mBase + mDue.size();
    if (end - mUntimedFrom >= kMaxUntimedPackets)
        extrapolate(end, nowNs);
}

void PcrPacer::onPcr(uint64_t index, uint64_t pcr, bool discontinuity, int64_t nowNs) {
    if (!mHaveRef) {
        // The first PCR anchors the time line now; what came before it goes at once.
        const int64_t due = std::max(nowNs, mLastDueNs);
        for (uint64_t k = mUntimedFrom; k <= index; ++k)
            mDue[k - mBase] = due;
        mHaveRef = true;
        mRefIndex = index;
        mRefPcr = pcr;
        mRefDueNs = due;
        mLastDueNs = due;
        mUntimedFrom = index + 1;
        return;
    }
    const uint64_t delta = (pcr + kPcrModulus - mRefPcr) % kPcrModulus;
    if (discontinuity || mForceDiscontinuity || delta > kMaxPcrGapTicks) {
        // The PCR no longer measures time since the anchor: carry on at the last
        // rate up to this packet and anchor the new time base here.
        ++mDiscontinuities;
        mForceDiscontinuity = false;
        extrapolate(index + 1, nowNs);
        mRefIndex = index;
        mRefPcr = pcr;
        mRefDueNs = mDue[index - mBase];
        return;
    }
    int64_t due = mRefDueNs + ticksToNs(delta);
    if (due < nowNs - kMaxLagNs)
        due = nowNs;
    const uint64_t packets = index - mRefIndex;
    const int64_t span = due - mRefDueNs;
    for (uint64_t k = mUntimedFrom; k <= index; ++k) {
        mDue[k - mBase] = mRefDueNs + static_cast<int64_t>(static_cast<double>(span) *
                                                           static_cast<double>(k - mRefIndex) /
                                                           static_cast<double>(packets));
    }
    mNsPerPacket = static_cast<double>(span) / static_cast<double>(packets);
    mRefIndex = index;
    mRefPcr = pcr;
    mRefDueNs = due;
    mLastDueNs = std::max(mLastDueNs, due);
    mUntimedFrom = index + 1;
}

void PcrPacer::extrapolate(uint64_t endIndex, int64_t nowNs) {
    for (uint64_t k = mUntimedFrom; k < endIndex; ++k) {
        int64_t due;
        if (mHaveRef) {
            due =
                mRefDueNs + static_cast<int64_t>(mNsPerPacket * static_cast<double>(k - mRefIndex));
            if (due < nowNs - kMaxLagNs)
                due = nowNs;
        } else {
            due = std::max(nowNs, mLastDueNs);
        }
        mDue[k - mBase] = due;
        mLastDueNs = std::max(mLastDueNs, due);
    }
    mUntimedFrom = std::max(mUntimedFrom, endIndex);
}

void PcrPacer::endOfStream(int64_t nowNs) {
    extrapolate(mBase + mDue.size(), nowNs);
    mForceDiscontinuity = true;
}

size_t PcrPacer::takeDue(int64_t nowNs, std::vector<uint8_t>& out) {
    size_t taken = 0;
    const size_t size = mDue.size();
    const size_t start = mFirst;
    while (mFirst < size && mDue[mFirst] != kUnknown && mDue[mFirst] <= nowNs) {
        ++mFirst;
        ++taken;
    }
    out.insert(out.end(), mPackets.begin() + static_cast<std::ptrdiff_t>(start * kPacketSize),
               mPackets.begin() + static_cast<std::ptrdiff_t>(mFirst * kPacketSize));
    if (mFirst == size) {
        mBase += size;
        mPackets.clear();
        mDue.clear();
        mFirst = 0;
    } else if (mFirst >= kCompactAfter) {
        mBase += mFirst;
        mPackets.erase(mPackets.begin(),
                       mPackets.begin() + static_cast<std::ptrdiff_t>(mFirst * kPacketSize));
        mDue.erase(mDue.begin(), mDue.begin() + static_cast<std::ptrdiff_t>(mFirst));
        mFirst = 0;
    }
    return taken;
}

void PcrPacer::shift(int64_t ns) {
    for (size_t i = mFirst; i < mDue.size(); ++i) {
        if (mDue[i] != kUnknown)
            mDue[i] += ns;
    }
    if (mHaveRef)
        mRefDueNs += ns;
    if (mLastDueNs != INT64_MIN)
        mLastDueNs += ns;
}

void PcrPacer::reset() {
    *this = PcrPacer();
}

}  // namespace TavoPlayer
