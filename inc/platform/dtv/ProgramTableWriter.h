// ProgramTableWriter: the PAT and PMT of a recording, as TS packets.
//
// A recording keeps only some PIDs of the multiplex, so the broadcast's own tables
// would describe streams that are not in the file (and other programmes). The file
// gets tables of its own instead: a PAT naming one programme and a PMT listing just
// the recorded streams with the stream types and descriptors the broadcast gave
// them, written first and then repeated (ISO/IEC 13818-1, 2.4.4), so that any
// player can open the file and one can start reading anywhere.
//
// Sections are built by libdvbpsi (CRC included) and cut into packets here
// (pointer_field 0, stuffing 0xFF, ISO/IEC 13818-1, 2.4.4.1); each table PID keeps
// its own continuity counter across repetitions.
#pragma once

#include <cstdint>
#include <vector>

#include "platform/dtv/ProgramFinder.h"

namespace TavoPlayer {

class ProgramTableWriter {
public:
    // Tables for `program` reduced to the streams whose PIDs are in `pids`.
    // Returns false (and builds nothing) when the library fails.
    bool build(const ProgramInfo& program, const std::vector<uint16_t>& pids);
    // Appends a PAT and a PMT, as whole 188-byte packets, to `out`.
    void append(std::vector<uint8_t>& out);
    size_t packetsPerRepetition() const;

    uint16_t pmtPid() const { return mPmtPid; }

private:
    void appendSection(const std::vector<uint8_t>& section, uint16_t pid, uint8_t& counter,
                       std::vector<uint8_t>& out) const;

    std::vector<uint8_t> mPat;
    std::vector<uint8_t> mPmt;
    uint16_t mPmtPid = 0x1000;
    uint8_t mPatCounter = 0;
    uint8_t mPmtCounter = 0;
};

}  // namespace TavoPlayer
