#pragma once

#include <cstdint>
#include <map>

#include "Options.h"

namespace TavoPlayer::tsgen {

// Damages the multiplex on request, packet by packet, after the multiplexer has
// built each packet: continuity counter jumps, lost packets, the transport error
// indicator, scrambling bits, PCR jumps and gaps without any packet.
// Times are in 27 MHz ticks relative to the first picture's PTS.
class FaultInjector {
public:
    explicit FaultInjector(const Options& options);

    // Returns false when the packet is to be left out of the output.
    bool apply(uint8_t* packet, int64_t streamTime27);
    // Offset to add to a PCR sampled at that time.
    int64_t pcrOffset27(int64_t streamTime27) const;
    // Announced change of time base in force at that time (PCR, PTS and DTS move).
    int64_t timebaseShift90(int64_t streamTime27) const;
    uint64_t droppedPackets() const { return mDropped; }

private:
    static bool hits(const std::vector<PacketFault>& faults, uint16_t pid, uint64_t index);

    const Options& mOptions;
    std::map<uint16_t, uint64_t> mIndex;    // packets seen per PID
    std::map<uint16_t, uint8_t> mCcOffset;  // accumulated counter jumps per PID
    uint64_t mDropped = 0;
};

}  // namespace TavoPlayer::tsgen
