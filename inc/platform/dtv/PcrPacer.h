// PcrPacer: releases the packets of a recorded TS at the pace they were broadcast.
//
// A transport stream carries its own clock: the PCR (ISO/IEC 13818-1, 2.4.2.2 and
// 2.4.3.5), a 27 MHz count sampled into the adaptation field of one PID at least
// every 100 ms. The pacer maps the PCR of one PID (the first PID seen carrying a
// PCR) onto the monotonic clock and gives every packet the time at which a live
// receiver would have got it: a packet carrying a PCR is due when the monotonic clock
// has advanced as far as the PCR has since the anchor, and the packets between two
// PCRs are spread evenly between their times (the bytes of a constant-rate
// multiplex arrive evenly, ISO/IEC 13818-1, 2.4.2.2, equation 2-1).
//
// A packet is held until the PCR after it is known, so the pacer reads at most one
// PCR interval ahead. A PCR discontinuity (the discontinuity_indicator, a PCR that
// goes backwards, or a jump forward of more than kMaxPcrGapTicks, as when a file
// loops or its PCR is rebased without the indicator)
// re-anchors the time line where it stood, so the stream continues without a burst
// or a stall. Packets before the first PCR are due at once; packets after the last
// PCR of a stream are spread at the last rate seen.
//
// Pure: the caller passes the monotonic time; no I/O, no locks, one thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace TavoPlayer {

class PcrPacer {
public:
    static constexpr size_t kPacketSize = 188;
    // The PCR counts 27 MHz ticks modulo 2^33 * 300.
    static constexpr uint64_t kPcrModulus = (uint64_t{1} << 33) * 300;
    // PCRs of one PID come at most 100 ms apart (ISO/IEC 13818-1, 2.7.2), so a
    // longer step is either a stretch with no packets at all, while the PCR ran on
    // (a signal loss kept in a recording), or a new time base. Steps up to 15 s are
    // replayed as the silence they were, so that a file shows a receiver what the
    // loss looked like; longer ones are taken as a discontinuity.
    static constexpr uint64_t kMaxPcrGapTicks = 15ull * 27'000'000;
    // Packets held without any PCR before they are timed at the last rate anyway,
    // so that a stream that stops sending PCRs neither stalls nor grows memory.
    static constexpr size_t kMaxUntimedPackets = 16384;
    // A time line that has fallen this far behind the clock (a stalled read) is
    // moved to now instead of catching up in a burst.
    static constexpr int64_t kMaxLagNs = 1'000'000'000;

    // Reads the PCR of a 188-byte packet. Returns false when the packet has none.
    static bool readPcr(const uint8_t* packet, uint64_t* pcrTicks, bool* discontinuity);

    // Adds one 188-byte packet that arrived at monotonic time `nowNs`.
    void push(const uint8_t* packet, int64_t nowNs);
    // The end of the stream or of one pass through it: the packets after the last
    // PCR are timed at the last rate, and the next PCR re-anchors the time line.
    void endOfStream(int64_t nowNs);
    // True when the oldest held packet has its time.
    bool nextKnown() const { return mFirst < mDue.size() && mDue[mFirst] != kUnknown; }
    // The time of the oldest held packet; only valid when nextKnown().
    int64_t nextDueNs() const { return mDue[mFirst]; }
    // Moves every held packet whose time is at or before `nowNs`, in order, to
    // `out`. Returns the number moved.
    size_t takeDue(int64_t nowNs, std::vector<uint8_t>& out);
    // Forgets the held packets and the time line.
    void reset();
    // Moves the whole time line `ns` later: the held packets and the anchor keep
    // their spacing, so a pause of the feed costs neither a burst nor a gap.
    void shift(int64_t ns);

    size_t heldPackets() const { return mDue.size() - mFirst; }
    // -1 until a PCR has been seen.
    int pcrPid() const { return mPcrPid; }
    uint64_t discontinuities() const { return mDiscontinuities; }

private:
    static constexpr int64_t kUnknown = INT64_MIN;
    void onPcr(uint64_t index, uint64_t pcr, bool discontinuity, int64_t nowNs);
    // Times every untimed packet before `endIndex` at the last rate after the anchor.
    void extrapolate(uint64_t endIndex, int64_t nowNs);

    // Held packets, bytes and due times; mDue[i] belongs to the packet whose
    // absolute index (count of packets pushed before it) is mBase + i.
    std::vector<uint8_t> mPackets;
    std::vector<int64_t> mDue;
    size_t mFirst = 0;  // the oldest held packet in mDue
    uint64_t mBase = 0;

    int mPcrPid = -1;
    bool mHaveRef = false;
    bool mForceDiscontinuity = false;
    uint64_t mRefIndex = 0;  // absolute index of the packet with the last PCR
    uint64_t mRefPcr = 0;
    int64_t mRefDueNs = 0;
    double mNsPerPacket = 0.0;
    int64_t mLastDueNs = INT64_MIN;
    uint64_t mUntimedFrom = 0;  // absolute index of the first packet without a time
    uint64_t mDiscontinuities = 0;
};

}  // namespace TavoPlayer
