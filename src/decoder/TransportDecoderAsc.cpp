#include "decoder/TransportDecoderAsc.h"

namespace TavoPlayer {

namespace {

constexpr uint32_t kSamplingFrequencies[16] = {96000, 88200, 64000, 48000, 44100, 32000,
                                               24000, 22050, 16000, 12000, 11025, 8000,
                                               7350,  0,     0,     0};
constexpr uint32_t kExplicitFrequencyIndex = 15;
constexpr uint32_t kSyncExtensionSbr = 0x2B7;
constexpr uint32_t kSyncExtensionPs = 0x548;

// Object types whose specific configuration is GASpecificConfig (ISO/IEC 14496-3,
// 1.6.2.1, Table 1.15): AAC main, LC, SSR, LTP, scalable, TwinVQ and their
// error-resilient forms.
bool usesGASpecificConfig(int32_t aot) {
    switch (aot) {
        case 1:
        case 2:
        case 3:
        case 4:
        case 6:
        case 7:
        case 17:
        case 19:
        case 20:
        case 21:
        case 22:
        case 23:
            return true;
        default:
            return false;
    }
}

bool isErrorResilient(int32_t aot) {
    return aot >= 17 && aot <= 27;
}

}  // namespace

uint32_t TransportDecoderAsc::samplingFrequencyOf(uint32_t index) {
    return index < 16 ? kSamplingFrequencies[index] : 0;
}

int32_t TransportDecoderAsc::readAudioObjectType(TransportBitReader& reader) {
    // ISO/IEC 14496-3, 1.6.2.1, GetAudioObjectType(): 31 escapes to 32 + 6 bits.
    int32_t aot = static_cast<int32_t>(reader.readBits(5));
    if (aot == 31) {
        aot = 32 + static_cast<int32_t>(reader.readBits(6));
    }
    return aot;
}

void TransportDecoderAsc::readSamplingFrequency(TransportBitReader& reader, uint32_t* index,
                                                uint32_t* frequency) {
    *index = reader.readBits(4);
    *frequency =
        (*index == kExplicitFrequencyIndex) ? reader.readBits(24) : kSamplingFrequencies[*index];
}

void TransportDecoderAsc::skipProgramConfigElement(TransportBitReader& reader,
                                                   uint64_t ascStartBit) {
    // ISO/IEC 14496-3, 4.4.1.1, Table 4.2 (program_config_element).
    reader.skipBits(4 + 2 + 4);  // element_instance_tag, object_type, sampling_frequency_index
    const uint32_t front = reader.readBits(4);
    const uint32_t side = reader.readBits(4);
    const uint32_t back = reader.readBits(4);
    const uint32_t lfe = reader.readBits(2);
    const uint32_t assocData = reader.readBits(3);
    const uint32_t validCc = reader.readBits(4);
    if (reader.readBits(1)) {  // mono_mixdown_present
        reader.skipBits(4);
    }
    if (reader.readBits(1)) {  // stereo_mixdown_present
        reader.skipBits(4);
    }
    if (reader.readBits(1)) {  // matrix_mixdown_idx_present
        reader.skipBits(3);
    }
    reader.skipBits(5ull * (front + side + back) + 4ull * (lfe + assocData) + 5ull * validCc);
    // byte_alignment() here counts from the start of the AudioSpecificConfig
    // (ISO/IEC 14496-3, 1.6.2.1, note to program_config_element).
    const uint64_t used = reader.bitPosition() - ascStartBit;
    reader.skipBits((8 - (used & 7)) & 7);
    const uint32_t commentBytes = reader.readBits(8);
    reader.skipBits(8ull * commentBytes);
}

TRANSPORTDEC_ERROR TransportDecoderAsc::skipGASpecificConfig(TransportBitReader& reader,
                                                             uint64_t ascStartBit,
                                                             CSAudioSpecificConfig* config) {
    // ISO/IEC 14496-3, 4.4.1, Table 4.1 (GASpecificConfig).
    config->m_frameLengthFlag = reader.readBits(1);
    const bool lowDelay = config->m_aot == 23;
    config->m_samplesPerFrame = lowDelay ? (config->m_frameLengthFlag ? 480 : 512)
                                         : (config->m_frameLengthFlag ? 960 : 1024);
    if (reader.readBits(1)) {  // dependsOnCoreCoder
        reader.skipBits(14);   // coreCoderDelay
    }
    const uint32_t extensionFlag = reader.readBits(1);
    if (config->m_channelConfiguration == 0) {
        skipProgramConfigElement(reader, ascStartBit);
    }
    if (config->m_aot == 6 || config->m_aot == 20) {
        reader.skipBits(3);  // layerNr
    }
    if (extensionFlag) {
        if (config->m_aot == 22) {
            reader.skipBits(5 + 11);  // numOfSubFrame, layer_length
        }
        if (config->m_aot == 17 || config->m_aot == 19 || config->m_aot == 20 ||
            config->m_aot == 23) {
            reader.skipBits(3);  // the three resilience flags
        }
        reader.skipBits(1);  // extensionFlag3
    }
    return reader.overrun() ? TRANSPORTDEC_PARSE_ERROR : TRANSPORTDEC_OK;
}

TRANSPORTDEC_ERROR TransportDecoderAsc::parse(TransportBitReader& reader, int64_t lengthBits,
                                              CSAudioSpecificConfig* config) {
    CSAudioSpecificConfig parsed;
    const uint64_t start = reader.bitPosition();
    parsed.m_aot = readAudioObjectType(reader);
    readSamplingFrequency(reader, &parsed.m_samplingFrequencyIndex, &parsed.m_samplingFrequency);
    parsed.m_channelConfiguration = reader.readBits(4);
    if (parsed.m_aot == AOT_SBR || parsed.m_aot == AOT_PS) {
        // Hierarchical (explicit) signalling: the extension comes first, then the core.
        parsed.m_extensionAudioObjectType = AOT_SBR;
        parsed.m_sbrPresentFlag = 1;
        if (parsed.m_aot == AOT_PS) {
            parsed.m_psPresentFlag = 1;
        }
        readSamplingFrequency(reader, &parsed.m_extensionSamplingFrequencyIndex,
                              &parsed.m_extensionSamplingFrequency);
        parsed.m_aot = readAudioObjectType(reader);
        if (parsed.m_aot == 22) {
            reader.skipBits(4);  // extensionChannelConfiguration
        }
    }
    if (reader.overrun()) {
        return TRANSPORTDEC_PARSE_ERROR;
    }
    if (parsed.m_samplingFrequency == 0) {
        return TRANSPORTDEC_PARSE_ERROR;  // reserved index 13 or 14, or an explicit 0 Hz
    }
    if (!usesGASpecificConfig(parsed.m_aot)) {
        return TRANSPORTDEC_UNSUPPORTED_FORMAT;
    }
    const TRANSPORTDEC_ERROR ga = skipGASpecificConfig(reader, start, &parsed);
    if (ga != TRANSPORTDEC_OK) {
        return ga;
    }
    if (isErrorResilient(parsed.m_aot)) {
        const uint32_t epConfig = reader.readBits(2);
        if (epConfig == 2 || epConfig == 3) {
            return TRANSPORTDEC_UNSUPPORTED_FORMAT;  // ErrorProtectionSpecificConfig follows
        }
    }
    // Backward-compatible explicit signalling (ISO/IEC 14496-3, 1.6.5.1): only where
    // the container says how long the configuration is, so trailing bits are known
    // to belong to it.
    if (lengthBits >= 0 && parsed.m_extensionAudioObjectType != AOT_SBR) {
        const uint64_t used = reader.bitPosition() - start;
        uint64_t left = static_cast<uint64_t>(lengthBits) > used ? lengthBits - used : 0;
        if (left >= 16 && reader.peekBits(11) == kSyncExtensionSbr) {
            reader.skipBits(11);
            const int32_t extensionAot = readAudioObjectType(reader);
            if (extensionAot == AOT_SBR) {
                parsed.m_sbrPresentFlag = static_cast<int32_t>(reader.readBits(1));
                if (parsed.m_sbrPresentFlag == 1) {
                    parsed.m_extensionAudioObjectType = AOT_SBR;
                    readSamplingFrequency(reader, &parsed.m_extensionSamplingFrequencyIndex,
                                          &parsed.m_extensionSamplingFrequency);
                    const uint64_t usedNow = reader.bitPosition() - start;
                    left = static_cast<uint64_t>(lengthBits) > usedNow ? lengthBits - usedNow : 0;
                    if (left >= 12 && reader.peekBits(11) == kSyncExtensionPs) {
                        reader.skipBits(11);
                        parsed.m_psPresentFlag = static_cast<int32_t>(reader.readBits(1));
                    }
                }
            }
        }
        if (reader.overrun()) {
            return TRANSPORTDEC_PARSE_ERROR;
        }
    }
    *config = parsed;
    return TRANSPORTDEC_OK;
}

void TransportDecoderAsc::fromAdts(uint32_t profile, uint32_t samplingFrequencyIndex,
                                   uint32_t channelConfiguration, CSAudioSpecificConfig* config) {
    CSAudioSpecificConfig parsed;
    parsed.m_aot = static_cast<int32_t>(profile) + 1;
    parsed.m_samplingFrequencyIndex = samplingFrequencyIndex;
    parsed.m_samplingFrequency = samplingFrequencyOf(samplingFrequencyIndex);
    parsed.m_channelConfiguration = channelConfiguration;
    // An ADTS raw_data_block always carries 1024 spectral lines per channel
    // (ISO/IEC 14496-3, 1.A.3.1); SBR in ADTS can only be implicit.
    parsed.m_samplesPerFrame = 1024;
    *config = parsed;
}

}  // namespace TavoPlayer
