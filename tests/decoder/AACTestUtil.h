// Builders of LOAS/LATM and ADTS frames for the AAC tests, written field by field
// with a bit writer so that every header in a test reads like its syntax table
// (ISO/IEC 14496-3, 1.7.2-1.7.3 and 1.6.2.1; ISO/IEC 13818-7, 6.2).
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "PesRecordTestUtil.h"

namespace TavoPlayer::test {

struct AscFields {
    uint32_t aot = 2;
    uint32_t samplingFrequencyIndex = 3;
    uint32_t channelConfiguration = 2;
    // Hierarchical SBR/PS signalling: write 5 or 29 first, then `aot` as the core.
    uint32_t hierarchicalExtension = 0;
    uint32_t extensionSamplingFrequencyIndex = 0;
    // Backward-compatible SBR signalling after the GASpecificConfig (needs ascLen,
    // i.e. audioMuxVersion 1).
    bool backwardCompatibleSbr = false;
    bool backwardCompatiblePs = false;
    uint32_t frameLengthFlag = 0;
};

struct LoasOptions {
    uint32_t audioMuxVersion = 0;
    bool useSameStreamMux = false;
    AscFields asc{};
    uint32_t ascFillBits = 0;  // version 1: bits after the configuration inside ascLen
    uint32_t numProgram = 0;   // anything but 0 is unsupported
    uint32_t numLayer = 0;
    uint32_t frameLengthType = 0;
    uint32_t audioMuxVersionA = 0;
    bool crc = false;
    uint32_t otherDataBits = 0;  // other data after the payloads, as zero bits
};

// One AudioSyncStream frame carrying `payloads` as subframes (numSubFrames =
// payloads.size() - 1).
std::vector<uint8_t> loasFrame(const LoasOptions& options,
                               const std::vector<std::vector<uint8_t>>& payloads);

struct AdtsOptions {
    uint32_t profile = 1;  // AAC LC
    uint32_t samplingFrequencyIndex = 3;
    uint32_t channelConfiguration = 2;
    bool crc = false;
    uint32_t rawDataBlocks = 0;  // number_of_raw_data_blocks_in_frame
};

std::vector<uint8_t> adtsFrame(const AdtsOptions& options, const std::vector<uint8_t>& payload);

// A payload of `size` bytes whose content depends on `seed`.
std::vector<uint8_t> patternPayload(size_t size, uint32_t seed);

}  // namespace TavoPlayer::test
