#include "AacFramer.h"

#include "BitWriter.h"

namespace TavoPlayer::tsgen {

AacFramer::AacFramer(int audioObjectType, int samplingFrequencyIndex, int channelConfiguration)
    : mAudioObjectType(audioObjectType),
      mSamplingFrequencyIndex(samplingFrequencyIndex),
      mChannelConfiguration(channelConfiguration) {}

int AacFramer::samplingFrequencyIndex(int sampleRate) {
    static const int kRates[] = {96000, 88200, 64000, 48000, 44100, 32000, 24000,
                                 22050, 16000, 12000, 11025, 8000,  7350};
    for (int i = 0; i < static_cast<int>(sizeof kRates / sizeof kRates[0]); ++i) {
        if (kRates[i] == sampleRate) {
            return i;
        }
    }
    return -1;
}

void AacFramer::writeAudioSpecificConfig(BitWriter& writer) const {
    writer.putBits(static_cast<uint32_t>(mAudioObjectType), 5);
    writer.putBits(static_cast<uint32_t>(mSamplingFrequencyIndex), 4);
    writer.putBits(static_cast<uint32_t>(mChannelConfiguration), 4);
    writer.putBits(0, 1);  // frameLengthFlag: 1024-sample frames
    writer.putBits(0, 1);  // dependsOnCoreCoder
    writer.putBits(0, 1);  // extensionFlag
}

std::vector<uint8_t> AacFramer::audioSpecificConfig() const {
    BitWriter writer;
    writeAudioSpecificConfig(writer);
    writer.alignZero();
    return writer.bytes();
}

int AacFramer::appendAdts(const uint8_t* raw, size_t size, std::vector<uint8_t>& out) const {
    const size_t frameLength = size + 7;
    if (frameLength > 0x1FFF) {
        return 1;
    }
    BitWriter w;
    // adts_fixed_header (ISO/IEC 14496-3, 1.A.2.2.1)
    w.putBits(0xFFF, 12);                                       // syncword
    w.putBits(0, 1);                                            // ID: MPEG-4
    w.putBits(0, 2);                                            // layer
    w.putBits(1, 1);                                            // protection_absent: no CRC
    w.putBits(static_cast<uint32_t>(mAudioObjectType - 1), 2);  // profile_ObjectType
    w.putBits(static_cast<uint32_t>(mSamplingFrequencyIndex), 4);
    w.putBits(0, 1);  // private_bit
    w.putBits(static_cast<uint32_t>(mChannelConfiguration), 3);
    w.putBits(0, 1);  // original_copy
    w.putBits(0, 1);  // home
    // adts_variable_header
    w.putBits(0, 1);  // copyright_identification_bit
    w.putBits(0, 1);  // copyright_identification_start
    w.putBits(static_cast<uint32_t>(frameLength), 13);
    w.putBits(0x7FF, 11);  // adts_buffer_fullness: variable rate
    w.putBits(0, 2);       // number_of_raw_data_blocks_in_frame - 1
    out.insert(out.end(), w.bytes().begin(), w.bytes().end());
    out.insert(out.end(), raw, raw + size);
    return 0;
}

int AacFramer::appendLoas(const uint8_t* raw, size_t size, std::vector<uint8_t>& out,
                          bool withConfig) const {
    // AudioMuxElement(muxConfigPresent = 1), ISO/IEC 14496-3, 1.7.3.1, Table 1.32.
    BitWriter mux;
    mux.putBits(withConfig ? 0 : 1, 1);  // useSameStreamMux
    if (withConfig) {
        // StreamMuxConfig (Table 1.33), audioMuxVersion 0.
        mux.putBits(0, 1);  // audioMuxVersion
        mux.putBits(1, 1);  // allStreamsSameTimeFraming
        mux.putBits(0, 6);  // numSubFrames - 1
        mux.putBits(0, 4);  // numProgram - 1
        mux.putBits(0, 3);  // numLayer - 1
        writeAudioSpecificConfig(mux);
        mux.putBits(0, 3);     // frameLengthType 0: payload lengths in PayloadLengthInfo
        mux.putBits(0xFF, 8);  // latmBufferFullness: variable rate
        mux.putBits(0, 1);     // otherDataPresent
        mux.putBits(0, 1);     // crcCheckPresent
    }
    // PayloadLengthInfo (Table 1.35): 255-valued bytes then the remainder.
    size_t remaining = size;
    while (remaining >= 255) {
        mux.putBits(255, 8);
        remaining -= 255;
    }
    mux.putBits(static_cast<uint32_t>(remaining), 8);
    // PayloadMux: the raw access unit, not byte-aligned in general.
    for (size_t i = 0; i < size; ++i) {
        mux.putBits(raw[i], 8);
    }
    mux.alignZero();  // byte_alignment() at the end of the AudioMuxElement

    const size_t muxLength = mux.bytes().size();
    if (muxLength > 0x1FFF) {
        return 1;
    }
    // AudioSyncStream (Table 1.36): syncword 0x2B7, audioMuxLengthBytes.
    BitWriter sync;
    sync.putBits(0x2B7, 11);
    sync.putBits(static_cast<uint32_t>(muxLength), 13);
    out.insert(out.end(), sync.bytes().begin(), sync.bytes().end());
    out.insert(out.end(), mux.bytes().begin(), mux.bytes().end());
    return 0;
}

}  // namespace TavoPlayer::tsgen
