// ASCParser: writes the AudioSpecificConfig (ISO/IEC 14496-3, 1.6.2.1) that the audio
// decoder must receive before the first access unit, from the fields the transport
// decoder reported.
//
// Only the leading fields are written (object type, sampling frequency, channel
// configuration and, for explicit SBR, the hierarchical extension); the
// GASpecificConfig bits stay zero, which reads as frameLengthFlag 0, no core coder,
// no extension. The result is always 10 bytes long, trailing zeros included: that is
// what the decoder has always been given.
#pragma once

#include <cstdint>

#include "decoder/WriteBitInterface.h"

namespace TavoPlayer {

class ASCParser {
public:
    static constexpr unsigned int kAscSizeBytes = 10;
    static constexpr int32_t kAotSbr = 5;

    // Writes a fresh buffer of kAscSizeBytes into *asc (the caller frees it with
    // delete[]) and its length into *size. Returns 1 if `asc` is null, else 0.
    unsigned int createASC(unsigned char** asc, unsigned int* size);
    // GetAudioObjectType() in reverse: below 32 in 5 bits, else 31 and (type - 32) in 6.
    void writeAOT(WriteBitInterface* writer, unsigned char audioObjectType);

    int32_t mAudioObjectType = 0;
    uint32_t mSamplingFrequencyIndex = 0;
    uint32_t mSamplingFrequency = 0;
    uint32_t mChannelConfiguration = 0;
    int32_t mExtensionAudioObjectType = -1;
    uint32_t mExtensionSamplingFrequencyIndex = 0;
    uint32_t mExtensionSamplingFrequency = 0;

private:
    // samplingFrequencyIndex, and the 24-bit explicit frequency after an index of 15
    // (split in two: the writer takes at most 16 bits at a time).
    static void writeSamplingFrequency(WriteBitInterface* writer, uint32_t index,
                                       uint32_t frequency);
};

}  // namespace TavoPlayer
