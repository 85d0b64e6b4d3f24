#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace TavoPlayer::tsgen {

class BitWriter;

// Wraps raw AAC access units (ISO/IEC 14496-3 raw_data_block) in one of the two
// transports a broadcast uses: ADTS (ISO/IEC 14496-3, 1.A.2) or LOAS/LATM
// (ISO/IEC 14496-3, 1.7.3): AudioSyncStream around an AudioMuxElement that
// carries its StreamMuxConfig in every frame (so that a receiver can start
// anywhere) or in every n-th frame, as some broadcasters do.
class AacFramer {
public:
    // audioObjectType 2 = AAC LC; samplingFrequencyIndex per ISO/IEC 14496-3,
    // Table 1.18; channelConfiguration 1 or 2.
    AacFramer(int audioObjectType, int samplingFrequencyIndex, int channelConfiguration);

    // ISO/IEC 14496-3, 1.6.2.1: AudioSpecificConfig with a GASpecificConfig
    // (frameLengthFlag, dependsOnCoreCoder and extensionFlag all 0).
    std::vector<uint8_t> audioSpecificConfig() const;
    // Returns 0 with the framed unit appended to out, 1 if the unit is too long
    // for the transport's length field.
    int appendAdts(const uint8_t* raw, size_t size, std::vector<uint8_t>& out) const;
    // withConfig false sets useSameStreamMux: the frame relies on the
    // StreamMuxConfig of an earlier one.
    int appendLoas(const uint8_t* raw, size_t size, std::vector<uint8_t>& out,
                   bool withConfig = true) const;

    // ISO/IEC 14496-3, Table 1.18; -1 for a rate without an index.
    static int samplingFrequencyIndex(int sampleRate);

private:
    void writeAudioSpecificConfig(BitWriter& writer) const;

    int mAudioObjectType;
    int mSamplingFrequencyIndex;
    int mChannelConfiguration;
};

}  // namespace TavoPlayer::tsgen
