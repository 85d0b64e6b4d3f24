#pragma once

#include <cstdint>
#include <cstdio>
#include <functional>
#include <string>
#include <vector>

#include "FaultInjector.h"
#include "Options.h"
#include "PesUnit.h"
#include "PsiWriter.h"

namespace TavoPlayer::tsgen {

// Multiplexes PES units of a few elementary streams into a constant-rate MPEG-2
// transport stream (ISO/IEC 13818-1): PAT and PMT at a fixed period, PCR at a
// fixed period, each PES sent within a window before its decoding time, null
// packets wherever nothing is due. Packet slot i is sent at
// PCR(i) = PCR(0) + i * 188 * 8 / rate, so the PCR is exact for the byte position.
class TsMuxer {
public:
    // A source yields 0 with the next unit (in decoding order), 1 at its end,
    // or a negative value on failure.
    using Source = std::function<int(PesUnit&)>;

    TsMuxer(const Options& options, const PsiWriter& psi, FaultInjector& faults);

    void addStream(uint16_t pid, uint8_t streamId, Source source);
    // Writes the whole stream; returns 0, or 1 with a message in error().
    int run(std::FILE* out);

    struct Stats {
        uint64_t packets = 0;  // slots, written or not
        uint64_t packetsWritten = 0;
        uint64_t nullPackets = 0;
        uint64_t pesPackets = 0;
        uint64_t latePes = 0;  // PES whose last byte left after its DTS
        int64_t firstPcr27 = 0;
    };
    const Stats& stats() const { return mStats; }
    const std::string& error() const { return mError; }

    // ISO/IEC 13818-1, 2.4.3.6/2.4.3.7: a PES header with PTS (and DTS when it
    // differs), data_alignment_indicator set; times reduced to 33 bits.
    static std::vector<uint8_t> pesHeader(uint8_t streamId, const PesUnit& unit);

private:
    struct Stream {
        uint16_t pid;
        uint8_t streamId;
        Source source;
        std::vector<uint8_t> pes;  // header and payload of the PES being sent
        size_t offset = 0;
        int64_t dts90 = 0;
        PesUnit unit;  // times and flags of the PES being sent (payload emptied)
        bool randomAccess = false;
        bool loaded = false;
        bool ended = false;
    };

    int load(Stream& s);
    int64_t slotTime27(uint64_t slot) const;
    uint8_t nextCc(uint16_t pid);
    uint8_t currentCc(uint16_t pid);
    void writeSection(uint8_t* packet, uint16_t pid, const std::vector<uint8_t>& section);
    void writePayloadPacket(uint8_t* packet, Stream& s, bool withPcr, int64_t pcr27);
    void writePcrOnly(uint8_t* packet, uint16_t pid, int64_t pcr27);
    static void writeNull(uint8_t* packet);
    static void putPcr(uint8_t* p, int64_t pcr27);

    const Options& mOptions;
    const PsiWriter& mPsi;
    FaultInjector& mFaults;
    std::vector<Stream> mStreams;
    std::vector<std::pair<uint16_t, uint8_t>> mCc;  // last counter per PID
    int64_t mRate = 0;
    int64_t mStart27 = 0;
    int64_t mShift90 = 0;                // time-base change in force since the last PCR
    bool mDiscontinuityPending = false;  // the next PCR announces a new time base
    Stats mStats;
    std::string mError;
};

}  // namespace TavoPlayer::tsgen
