#pragma once

#include <cstdint>
#include <vector>

namespace TavoPlayer::tsgen {

// One elementary-stream unit that becomes one PES packet. Times are on the
// 90 kHz clock and not yet reduced to 33 bits, so that the multiplexer can
// order units across a wrap; the PES writer masks them.
struct PesUnit {
    std::vector<uint8_t> payload;
    int64_t pts = 0;
    int64_t dts = 0;
    bool hasDts = false;
    // False for a PES in which no access unit starts (ISO/IEC 13818-1, 2.4.3.7:
    // a PTS is coded only when one does); pts and dts then still give the
    // decoding time of the data, for scheduling.
    bool hasPts = true;
    // The payload starts with an access unit (data_alignment_indicator).
    bool aligned = true;
    bool randomAccess = false;
};

}  // namespace TavoPlayer::tsgen
