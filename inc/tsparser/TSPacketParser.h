// TSPacketParser: reads one 188-byte transport packet of a single PID
// (ISO/IEC 13818-1, 2.4.3.2 transport packet, 2.4.3.4 adaptation field) and,
// across calls, follows that PID's continuity_counter to decide whether the
// payload continues the PES packet being assembled, starts a new one, or breaks it.
//
// Pure: no I/O, no threads, no allocation except the private-data copy. Never reads
// outside the 188 bytes it is given. One instance per PID, fed in arrival order by
// one thread (the TS parser module's).
#pragma once

#include <cstdint>

#include "tsparser/TSParsedData.h"

namespace TavoPlayer {

class TSPacketParser {
public:
    static constexpr uint32_t kPacketSize = 188;
    static constexpr uint8_t kSyncByte = 0x47;

    // Result bits of parse().
    static constexpr uint32_t RESULT_ERROR = 1;    // discard the PES in assembly
    static constexpr uint32_t RESULT_PAYLOAD = 2;  // payload pointer and length are valid
    static constexpr uint32_t RESULT_NEW_PES = 4;  // a unit start after a correct continuation
    static constexpr uint32_t RESULT_SKIP = 8;     // waiting for the first unit start

    // Codes of parseHeader(), OR-ed into the result of parse().
    static constexpr uint8_t HEADER_OK = 0;
    static constexpr uint8_t HEADER_NULL_PARAMETER = 16;
    static constexpr uint8_t HEADER_NO_SYNC = 64;
    static constexpr uint8_t HEADER_TRANSPORT_ERROR = 128;
    static constexpr uint8_t HEADER_BAD_ADAPTATION_LENGTH = 255;

    TSPacketParser();

    uint32_t parse(const uint8_t* packet, TSParsedData* data);
    uint8_t parseHeader(const uint8_t* packet, TSParsedData* data);
    void parseAdaptationField(const uint8_t* packet, TSParsedData* data);
    void printTSData(const TSParsedData* data);

    uint32_t lastContinuityCounter() const { return mLastContinuityCounter; }
    bool inPES() const { return mInPES != 0; }

private:
    uint32_t mLastContinuityCounter;
    uint8_t mInPES;
};

}  // namespace TavoPlayer
