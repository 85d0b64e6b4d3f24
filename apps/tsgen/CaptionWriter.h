#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "Options.h"
#include "PesUnit.h"

namespace TavoPlayer::tsgen {

// Builds ISDB-T caption PES payloads (ARIB STD-B24 Volume 1 Part 3, chapter 9;
// ABNT NBR 15606-1): PES_data_packet with data_identifier 0x80, one data group
// per PES, either caption management data (data_group_id 0x00) or caption
// statement data of the first language (data_group_id 0x01) with one data unit
// of statement body (unit separator 0x1F, data_unit_parameter 0x20).
class CaptionWriter {
public:
    explicit CaptionWriter(const Options& options);

    // Returns 0 with the next PES unit in time order, 1 when none is left.
    int next(PesUnit& unit);

    // Turns caption text from the command line into 8-bit caption codes:
    // UTF-8 characters map to their ABNT NBR 15606-1 Latin code (ISO 8859-15
    // positions), and \xNN, \n (APR, 0x0D), \f (CS, 0x0C) and \\ are escapes.
    // Returns false with a message in error for text that cannot be coded.
    static bool encodeText(const std::string& text, std::vector<uint8_t>& bytes,
                           std::string& error);

    static std::vector<uint8_t> managementPayload();
    static std::vector<uint8_t> statementPayload(const std::vector<uint8_t>& text);
    // CRC-16 of ITU-T Rec. H.222.0 style used by ARIB STD-B24 data groups:
    // polynomial x^16 + x^12 + x^5 + 1, initial value 0.
    static uint16_t crc16(const uint8_t* data, size_t size);

private:
    struct Event {
        int64_t pts;
        bool management;
        std::vector<uint8_t> text;
    };
    std::vector<Event> mEvents;
    size_t mNext = 0;
};

}  // namespace TavoPlayer::tsgen
