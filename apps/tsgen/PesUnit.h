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
    bool randomAccess = false;
};

}  // namespace TavoPlayer::tsgen
