#include "FaultInjector.h"

#include <cmath>

namespace TavoPlayer::tsgen {

FaultInjector::FaultInjector(const Options& options) : mOptions(options) {}

bool FaultInjector::hits(const std::vector<PacketFault>& faults, uint16_t pid, uint64_t index) {
    for (const auto& f : faults) {
        if (f.pid == pid && index >= f.index && index - f.index < f.count) {
            return true;
        }
    }
    return false;
}

int64_t FaultInjector::pcrOffset27(int64_t streamTime27) const {
    int64_t offset = 0;
    for (const auto& jump : mOptions.pcrJumps) {
        if (streamTime27 >= static_cast<int64_t>(std::llround(jump.startSec * 27e6))) {
            offset += jump.amountMs * 27000;
        }
    }
    return offset;
}

int64_t FaultInjector::timebaseShift90(int64_t streamTime27) const {
    int64_t shift = 0;
    for (const auto& jump : mOptions.timebaseJumps) {
        if (streamTime27 >= static_cast<int64_t>(std::llround(jump.startSec * 27e6))) {
            shift += jump.amountMs * 90;
        }
    }
    return shift;
}

bool FaultInjector::apply(uint8_t* packet, int64_t streamTime27) {
    const uint16_t pid = static_cast<uint16_t>(((packet[1] & 0x1F) << 8) | packet[2]);
    const uint64_t index = mIndex[pid]++;

    if (hits(mOptions.ccErrors, pid, index)) {
        // ISO/IEC 13818-1, 2.4.3.3: continuity_counter is 4 bits; one extra step
        // here and on every later packet gives a single discontinuity.
        mCcOffset[pid] = static_cast<uint8_t>((mCcOffset[pid] + 1) & 0x0F);
    }
    const auto offset = mCcOffset.find(pid);
    if (offset != mCcOffset.end() && offset->second != 0) {
        packet[3] =
            static_cast<uint8_t>((packet[3] & 0xF0) | ((packet[3] + offset->second) & 0x0F));
    }
    if (hits(mOptions.teiPackets, pid, index)) {
        packet[1] |= 0x80;
    }
    if (hits(mOptions.scrambled, pid, index)) {
        packet[3] = static_cast<uint8_t>((packet[3] & 0x3F) | (mOptions.scramblingValue << 6));
    }
    for (const auto& gap : mOptions.gaps) {
        const auto start = static_cast<int64_t>(std::llround(gap.startSec * 27e6));
        if (streamTime27 >= start && streamTime27 < start + gap.amountMs * 27000) {
            ++mDropped;
            return false;
        }
    }
    if (hits(mOptions.drops, pid, index)) {
        ++mDropped;
        return false;
    }
    return true;
}

}  // namespace TavoPlayer::tsgen
