// TransportDecoderAsc: reads an AudioSpecificConfig (ISO/IEC 14496-3, 1.6.2.1) for the
// transport decoder, as carried in a LATM StreamMuxConfig, and derives the same
// configuration from an ADTS fixed header.
//
// Only what the receiver needs is kept (CSAudioSpecificConfig), but the whole
// structure is walked, because in audioMuxVersion 0 nothing else tells where the
// configuration ends and the next StreamMuxConfig field begins.
#pragma once

#include <cstdint>

#include "decoder/TransportBitReader.h"
#include "decoder/TransportDecoderTypes.h"

namespace TavoPlayer {

class TransportDecoderAsc {
public:
    // ISO/IEC 14496-3, Table 1.18 (samplingFrequencyIndex); 0 for the reserved 13 and 14.
    static uint32_t samplingFrequencyOf(uint32_t index);

    // Parses an AudioSpecificConfig at the reader's position. `lengthBits` is the
    // configuration's length when the container states it (audioMuxVersion 1:
    // ascLen), or -1; only with a known length is a backward-compatible SBR/PS
    // extension (syncExtensionType 0x2B7 / 0x548, 1.6.5.1) looked for after the
    // core configuration. Returns TRANSPORTDEC_OK, TRANSPORTDEC_UNSUPPORTED_FORMAT
    // (object types without GASpecificConfig, error-protection configurations) or
    // TRANSPORTDEC_PARSE_ERROR (reserved values, running off the data).
    static TRANSPORTDEC_ERROR parse(TransportBitReader& reader, int64_t lengthBits,
                                    CSAudioSpecificConfig* config);

    // The configuration an ADTS fixed header implies (ISO/IEC 14496-3, 1.A.3.2.1:
    // audio object type = profile_ObjectType + 1).
    static void fromAdts(uint32_t profile, uint32_t samplingFrequencyIndex,
                         uint32_t channelConfiguration, CSAudioSpecificConfig* config);

private:
    static int32_t readAudioObjectType(TransportBitReader& reader);
    static void readSamplingFrequency(TransportBitReader& reader, uint32_t* index,
                                      uint32_t* frequency);
    static TRANSPORTDEC_ERROR skipGASpecificConfig(TransportBitReader& reader, uint64_t ascStartBit,
                                                   CSAudioSpecificConfig* config);
    static void skipProgramConfigElement(TransportBitReader& reader, uint64_t ascStartBit);
};

}  // namespace TavoPlayer
