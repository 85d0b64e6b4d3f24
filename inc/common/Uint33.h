// Uint33: a 90 kHz time stamp of 33 bits (ISO/IEC 13818-1, 2.4.3.7: PTS, DTS and
// the PCR base are 33-bit counts) held in an unsigned 64-bit integer. Sums are
// masked to 33 bits; a difference is read as a signed 33-bit number, so that two
// stamps on either side of the wrap are close together.
#pragma once

#include <cstdint>

namespace TavoPlayer {

using Uint33 = uint64_t;

constexpr uint64_t kUint33Mask = 0x1FFFFFFFFull;

constexpr Uint33 mask33(uint64_t value) {
    return value & kUint33Mask;
}

// (a - b) masked to 33 bits, with bit 32 as the sign.
constexpr int64_t signed33(uint64_t value) {
    const uint64_t masked = value & kUint33Mask;
    return (masked & 0x100000000ull) != 0 ? static_cast<int64_t>(masked | ~kUint33Mask)
                                          : static_cast<int64_t>(masked);
}

constexpr int64_t diff33(Uint33 a, Uint33 b) {
    return signed33(a - b);
}

constexpr Uint33 add33(Uint33 a, uint64_t b) {
    return mask33(a + b);
}

}  // namespace TavoPlayer
