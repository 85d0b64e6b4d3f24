// TsIndexer: the time line of a recorded TS and the points where one can start
// reading it.
//
// The time of a packet is read from the PCR (ISO/IEC 13818-1, 2.4.2.2) of one PID:
// elapsed milliseconds since the first PCR, summed PCR interval by PCR interval so
// that the 2^33 wrap and a new time base (discontinuity_indicator, a step back, or
// a step of more than 15 s, as PcrPacer treats them) add nothing; a shorter silence
// counts, as the clip's pacing replays it. Each PCR packet becomes an index point (elapsed ms, byte
// offset of the packet): a reader moved there finds the PCR at once, and the pacing of the feed
// re-anchors on it.
//
// Pure: packets and offsets in; one thread.
#pragma once

#include <cstdint>
#include <vector>

namespace TavoPlayer {

struct IndexPoint {
    uint32_t timeMs = 0;
    uint64_t offset = 0;
};

class TsIndexer {
public:
    // `pcrPid` -1: the first PID seen carrying a PCR.
    explicit TsIndexer(int pcrPid = -1) : mPcrPid(pcrPid) {}

    // Feeds the 188-byte packet that starts at byte `offset` of the file. Returns
    // true when it became an index point (appended to points()).
    bool push(const uint8_t* packet, uint64_t offset);

    bool havePcr() const { return mHavePcr; }
    int pcrPid() const { return mPcrPid; }
    // Elapsed time at the last PCR.
    uint32_t elapsedMs() const { return static_cast<uint32_t>(mElapsedTicks / 27000); }
    const std::vector<IndexPoint>& points() const { return mPoints; }
    // Hands over the points gathered since the last call.
    std::vector<IndexPoint> takePoints();

private:
    int mPcrPid;
    bool mHavePcr = false;
    uint64_t mLastPcr = 0;
    uint64_t mElapsedTicks = 0;  // 27 MHz
    int64_t mLastPointMs = -1;
    std::vector<IndexPoint> mPoints;
};

}  // namespace TavoPlayer
