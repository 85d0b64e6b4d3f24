// Types of the MPEG-4 audio transport decoder: transport formats, result codes,
// parameters, the AudioSpecificConfig it reports and the configuration callback.
//
// The numbering of transport types and result codes is the one the AAC extractor
// was designed against (LOAS = 10, ADTS = 2; 257 not enough bits, 258 sync error),
// so it is kept exactly.
#pragma once

#include <cstdint>

namespace TavoPlayer {

enum TRANSPORT_TYPE : int32_t {
    TT_UNKNOWN = -1,
    TT_MP4_ADTS = 2,   // ISO/IEC 13818-7 / ISO/IEC 14496-3, 1.A.3
    TT_MP4_LOAS = 10,  // ISO/IEC 14496-3, 1.7.2 AudioSyncStream carrying LATM
};

enum TRANSPORTDEC_ERROR : uint32_t {
    TRANSPORTDEC_OK = 0,
    TRANSPORTDEC_UNKNOWN_ERROR = 1,
    TRANSPORTDEC_INVALID_PARAMETER = 2,
    // The buffered bytes end before the next header or the frame it announces.
    TRANSPORTDEC_NOT_ENOUGH_BITS = 0x101,
    // No sync word where a frame should start; bytes were skipped up to the next
    // candidate sync word (or all of them when there was none).
    TRANSPORTDEC_SYNC_ERROR = 0x102,
    // A well-framed header that uses syntax this decoder does not handle: several
    // programs or layers, frameLengthType other than 0, audioMuxVersionA 1, ADTS with
    // several raw data blocks and CRC, an object type without GASpecificConfig.
    // The whole frame is skipped.
    TRANSPORTDEC_UNSUPPORTED_FORMAT = 0x401,
    // A well-framed header whose fields contradict its own length; the frame is skipped.
    TRANSPORTDEC_PARSE_ERROR = 0x402,
    // A LATM frame with useSameStreamMux set before any StreamMuxConfig was seen
    // (a receiver joining mid-stream); the frame is skipped.
    TRANSPORTDEC_NO_CONFIGURATION = 0x403,
};

enum TPDEC_PARAM : uint32_t {
    // Deliver access units at once instead of waiting until the decoder buffer would
    // hold latmBufferFullness / adts_buffer_fullness worth of bits.
    TPDEC_PARAM_IGNORE_BUFFERFULLNESS = 3,
};

// No audio object type (no explicit extension signalled).
constexpr int32_t AOT_NONE = -1;
constexpr int32_t AOT_SBR = 5;
constexpr int32_t AOT_PS = 29;

// The fields of an AudioSpecificConfig (ISO/IEC 14496-3, 1.6.2.1) that a receiver
// needs, plus the frame length the configuration implies.
struct CSAudioSpecificConfig {
    int32_t m_aot = AOT_NONE;  // core audio object type (2 = AAC LC)
    uint32_t m_samplingFrequencyIndex = 0;
    uint32_t m_samplingFrequency = 0;  // Hz, of the core
    uint32_t m_channelConfiguration = 0;
    // AOT_SBR when SBR is signalled explicitly (hierarchically with object type 5 or
    // 29, or backward-compatibly with syncExtensionType 0x2B7); AOT_NONE otherwise,
    // which includes implicit SBR, found only by the audio decoder.
    int32_t m_extensionAudioObjectType = AOT_NONE;
    uint32_t m_extensionSamplingFrequencyIndex = 0;
    uint32_t m_extensionSamplingFrequency = 0;
    int32_t m_sbrPresentFlag = -1;   // 1, 0 or -1 (not signalled)
    int32_t m_psPresentFlag = -1;    // 1, 0 or -1 (not signalled)
    uint32_t m_samplesPerFrame = 0;  // of the core: 1024 or 960 (512/480 for low delay)
    uint32_t m_frameLengthFlag = 0;

    bool sameAs(const CSAudioSpecificConfig& other) const {
        return m_aot == other.m_aot && m_samplingFrequencyIndex == other.m_samplingFrequencyIndex &&
               m_samplingFrequency == other.m_samplingFrequency &&
               m_channelConfiguration == other.m_channelConfiguration &&
               m_extensionAudioObjectType == other.m_extensionAudioObjectType &&
               m_extensionSamplingFrequencyIndex == other.m_extensionSamplingFrequencyIndex &&
               m_extensionSamplingFrequency == other.m_extensionSamplingFrequency &&
               m_sbrPresentFlag == other.m_sbrPresentFlag &&
               m_psPresentFlag == other.m_psPresentFlag &&
               m_samplesPerFrame == other.m_samplesPerFrame;
    }
};

// Called when the decoder meets a configuration for the first time or a changed one:
// (user data, configuration, config mode, "changed" output). Returns 0 to accept.
using cbUpdateConfig_t = int32_t (*)(void*, const CSAudioSpecificConfig*, unsigned char,
                                     unsigned char*);

}  // namespace TavoPlayer
