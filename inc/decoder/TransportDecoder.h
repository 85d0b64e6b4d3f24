// TransportDecoder: the MPEG-4 audio transport decoder that the AAC extractor uses to
// undo LOAS/LATM and ADTS framing and to learn the AudioSpecificConfig.
//
// Bytes are handed in with transportDec_FillData (copied into an internal buffer of
// kBufferSizeBytes, as much as fits); transportDec_ReadAccessUnit finds the next frame
// in what is buffered and positions the bitstream (transportDec_GetBitstream) at the
// access unit's first bit, transportDec_GetAuBitsTotal giving its length. Reading the
// next access unit implicitly ends the current one.
//
//  - LOAS (ISO/IEC 14496-3, 1.7.2): AudioSyncStream (syncword 0x2B7, 13-bit
//    audioMuxLengthBytes) carrying AudioMuxElement(1) (1.7.3): StreamMuxConfig for
//    audioMuxVersion 0 and 1 (LatmGetValue), useSameStreamMux, one program and one
//    layer, frameLengthType 0, numSubFrames (each subframe is an access unit), other
//    data and the CRC byte. Anything else is TRANSPORTDEC_UNSUPPORTED_FORMAT.
//  - ADTS (ISO/IEC 13818-7, 6.2; ISO/IEC 14496-3, 1.A.3): with and without CRC; the
//    raw data blocks of a frame form one access unit (with CRC and several blocks
//    the frame is unsupported).
//
// A frame is only returned once all its bytes and the first two bytes after it (where
// the next sync word starts) are buffered; until then the result is "not enough bits".
// Holding the last frame of a fill back until the next header shows has two reasons:
// a frame found after a loss of sync is only trusted when another sync word follows
// it (sync words also occur inside audio data), and "not enough bits" then always
// means that an access unit is pending into the next fill, which is what the AAC
// extractor's PTS carry relies on (a PES packet's PTS belongs to the first access unit
// that starts in it, ISO/IEC 13818-1, 2.4.3.7). The cost is one frame of latency, and
// the very last frame of a stream stays buffered.
//
// Threads: one decoder is used by one thread. Not copyable.
#pragma once

#include <cstdint>
#include <vector>

#include "decoder/TransportBitReader.h"
#include "decoder/TransportDecoderTypes.h"

namespace TavoPlayer {

class TransportDecoder {
public:
    // Twice the largest frame either framing can announce (3 + 8191 bytes for LOAS).
    static constexpr uint32_t kBufferSizeBytes = 16384;

    TransportDecoder(TRANSPORT_TYPE type, uint32_t flags);
    TransportDecoder(const TransportDecoder&) = delete;
    TransportDecoder& operator=(const TransportDecoder&) = delete;

    TRANSPORT_TYPE type() const { return mType; }
    // The flags given at open (1 for ADTS as MPEG-4); kept for the caller, they change
    // nothing in how frames are read.
    uint32_t flags() const { return mFlags; }
    TRANSPORTDEC_ERROR setParam(TPDEC_PARAM param, int32_t value);
    TRANSPORTDEC_ERROR registerAscCallback(cbUpdateConfig_t callback, void* userData);
    // Takes bytes from buffer + (bufferSize - *bytesValid), as many as fit, and reduces
    // *bytesValid by what it took.
    TRANSPORTDEC_ERROR fillData(const uint8_t* buffer, uint32_t bufferSize, uint32_t* bytesValid);
    TRANSPORTDEC_ERROR readAccessUnit();
    TRANSPORTDEC_ERROR endAccessUnit();
    uint32_t auBitsTotal() const { return mAuBits; }
    int32_t auBitsRemaining() const;
    TransportBitReader* bitstream() { return &mReader; }
    // Bytes buffered and not yet framed.
    uint32_t bufferedBytes() const { return mValid - mReadPos; }
    bool ignoreBufferFullness() const { return mIgnoreBufferFullness; }

private:
    // The syntax of one LATM StreamMuxConfig that later frames may refer to.
    struct LatmConfig {
        uint32_t audioMuxVersion = 0;
        uint32_t numSubFrames = 0;
        uint32_t otherDataPresent = 0;
        uint64_t otherDataLenBits = 0;
    };

    TRANSPORTDEC_ERROR readLoasFrame();
    TRANSPORTDEC_ERROR readAdtsFrame();
    TRANSPORTDEC_ERROR readStreamMuxConfig(LatmConfig* latm, CSAudioSpecificConfig* config);
    // PayloadLengthInfo() of the current subframe at mNextSubFrameBit; on success the
    // access unit lies at mAuStartBit, mAuBits long, within the frame.
    TRANSPORTDEC_ERROR readLatmSubFrame();
    static uint32_t latmGetValue(TransportBitReader& reader);
    // Skips to the next place where a sync word may start; always a sync error.
    TRANSPORTDEC_ERROR loseSync(uint32_t skipFrom);
    bool syncAt(uint32_t offset) const;
    // Skips the current frame whole (its length was trusted) and reports `error`.
    TRANSPORTDEC_ERROR dropFrame(uint32_t frameEnd, TRANSPORTDEC_ERROR error);
    void reportConfig(const CSAudioSpecificConfig& config);

    TRANSPORT_TYPE mType;
    uint32_t mFlags;
    bool mIgnoreBufferFullness = false;
    cbUpdateConfig_t mCallback = nullptr;
    void* mCallbackData = nullptr;

    std::vector<uint8_t> mBuffer;
    uint32_t mValid = 0;    // bytes buffered
    uint32_t mReadPos = 0;  // where the next frame is looked for
    bool mSynced = false;   // the last frame was found where the one before ended

    // The frame in use: [mFrameStart, mFrameEnd) in the buffer.
    bool mInFrame = false;
    uint32_t mFrameStart = 0;
    uint32_t mFrameEnd = 0;
    uint32_t mSubFramesLeft = 0;
    uint64_t mNextSubFrameBit = 0;
    uint64_t mAuStartBit = 0;
    uint32_t mAuBits = 0;
    TransportBitReader mReader;

    bool mHaveLatmConfig = false;
    LatmConfig mLatm;
    bool mHaveConfig = false;
    CSAudioSpecificConfig mConfig;
    uint32_t mAdtsFixedHeader = 0;  // profile, frequency index, channels of mConfig
};

using HANDLE_TRANSPORTDEC = TransportDecoder*;

// The calls the AAC extractor makes. `layer` must be 0 (one layer is all it uses).
// Open: LOAS or ADTS and nrOfLayers 1; null for anything else.
HANDLE_TRANSPORTDEC transportDec_Open(TRANSPORT_TYPE transportType, uint32_t flags,
                                      uint32_t nrOfLayers);
TRANSPORTDEC_ERROR transportDec_SetParam(HANDLE_TRANSPORTDEC handle, TPDEC_PARAM param,
                                         int32_t value);
TRANSPORTDEC_ERROR transportDec_RegisterAscCallback(HANDLE_TRANSPORTDEC handle,
                                                    cbUpdateConfig_t callback, void* userData);
TRANSPORTDEC_ERROR transportDec_FillData(HANDLE_TRANSPORTDEC handle, const uint8_t* buffer,
                                         uint32_t bufferSize, uint32_t* bytesValid, uint32_t layer);
TRANSPORTDEC_ERROR transportDec_ReadAccessUnit(HANDLE_TRANSPORTDEC handle, uint32_t layer);
int32_t transportDec_GetAuBitsRemaining(HANDLE_TRANSPORTDEC handle, uint32_t layer);
uint32_t transportDec_GetAuBitsTotal(HANDLE_TRANSPORTDEC handle, uint32_t layer);
TRANSPORTDEC_ERROR transportDec_EndAccessUnit(HANDLE_TRANSPORTDEC handle);
TransportBitReader* transportDec_GetBitstream(HANDLE_TRANSPORTDEC handle, uint32_t layer);
// Frees the decoder and nulls the handle.
void transportDec_Close(HANDLE_TRANSPORTDEC* handle);

}  // namespace TavoPlayer
