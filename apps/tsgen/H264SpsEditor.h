#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace TavoPlayer::tsgen {

// Rewrites H.264 sequence parameter sets in an Annex B byte stream. Used to
// produce streams whose SPS carries no VUI (no timing, no pic_struct_present_flag),
// which x264 never writes on its own.
class H264SpsEditor {
public:
    // Rewrites every SPS NAL unit of the access unit in place of the original.
    // Returns 0 on success, 1 if an SPS could not be parsed (the unit is unchanged).
    static int stripVui(std::vector<uint8_t>& accessUnit);
    // Rewrites one SPS NAL unit (header byte included, emulation prevention
    // applied). Returns 0 on success, 1 if it is not a parsable SPS.
    static int stripVuiFromNal(const std::vector<uint8_t>& nal, std::vector<uint8_t>& out);
    // ITU-T H.264, 7.4.1: removes / inserts emulation_prevention_three_byte.
    static std::vector<uint8_t> toRbsp(const uint8_t* data, size_t size);
    static std::vector<uint8_t> toEbsp(const std::vector<uint8_t>& rbsp);
};

}  // namespace TavoPlayer::tsgen
