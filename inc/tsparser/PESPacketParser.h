// PESPacketParser: reads the header of one complete PES packet (ISO/IEC 13818-1,
// 2.4.3.6) assembled from TS payloads: stream id, length field, the optional
// header's flags and fields, PTS and DTS, and where the elementary-stream bytes
// start and how many there are.
//
// Pure and stateless: no I/O, no threads, no allocation. It trusts the assembled
// length it is given, not the packet's own PES_packet_length (0 for video, and a
// broken stream may lie), and never reads at or past that length.
#pragma once

#include <cstdint>

#include "tsparser/PESParsedData.h"

namespace TavoPlayer {

class PESPacketParser {
public:
    // Bytes before the optional header: start code (3), stream_id, PES_packet_length.
    static constexpr uint32_t kFixedHeaderSize = 6;
    // The optional header's two flag bytes and PES_header_data_length.
    static constexpr uint32_t kOptionalHeaderStart = 9;

    // 1 when the packet starts with a start code (the record is filled), else 0.
    uint32_t parse(const uint8_t* packet, uint32_t length, PESParsedData* data);
    // parse() without the parameter checks: the elementary-stream pointer, or null
    // when there is no start code or not even the fixed header.
    const uint8_t* parseHeader(const uint8_t* packet, int32_t length, PESParsedData* data);
    // The elementary-stream pointer (and its size stored in `data`), or null when the
    // optional header is missing or does not start with binary 10.
    const uint8_t* parseOptHeader(const uint8_t* packet, int32_t length, PESParsedData* data);
    void printPESData(const PESParsedData* data);

    // Stream ids that carry the optional header here: video (1110 xxxx), audio
    // (110x xxxx) and private_stream_1 (0xBD, the ISDB-T caption PES of
    // ARIB STD-B24 / ABNT NBR 15606-1). ISO/IEC 13818-1, Table 2-22.
    static bool hasOptionalHeader(uint8_t streamId) {
        return (streamId & 0xF0) == 0xE0 || streamId == 0xBD || (streamId & 0xE0) == 0xC0;
    }
    // A 33-bit PTS, DTS or DTS_next_AU from its five bytes at p; marker bits are not
    // checked (ISO/IEC 13818-1, 2.4.3.7).
    static uint64_t readTimeStamp(const uint8_t* p);
};

}  // namespace TavoPlayer
