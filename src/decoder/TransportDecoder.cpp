#include "decoder/TransportDecoder.h"

#include <algorithm>
#include <cstring>
#include <new>

#include "decoder/TransportDecoderAsc.h"

namespace TavoPlayer {

namespace {

constexpr uint32_t kLoasHeaderBytes = 3;  // syncword (11), audioMuxLengthBytes (13)
constexpr uint32_t kAdtsHeaderBytes = 7;
constexpr uint32_t kAdtsCrcBytes = 2;
constexpr uint8_t kLoasFirstByte = 0x56;  // 0x2B7 << 5, top byte
constexpr uint8_t kAdtsFirstByte = 0xFF;
// Both sync words fit in the first two bytes of a header.
constexpr uint32_t kNextSyncBytes = 2;

}  // namespace

TransportDecoder::TransportDecoder(TRANSPORT_TYPE type, uint32_t flags)
    : mType(type), mFlags(flags), mBuffer(kBufferSizeBytes) {
    mReader.init(mBuffer.data(), 0);
}

TRANSPORTDEC_ERROR TransportDecoder::setParam(TPDEC_PARAM param, int32_t value) {
    switch (param) {
        case TPDEC_PARAM_IGNORE_BUFFERFULLNESS:
            // Frames are handed out as soon as they are complete whatever the value:
            // this decoder has no buffer-fullness delay to switch off. The value is
            // kept so that callers can see what they asked for.
            mIgnoreBufferFullness = value != 0;
            return TRANSPORTDEC_OK;
    }
    return TRANSPORTDEC_INVALID_PARAMETER;
}

TRANSPORTDEC_ERROR TransportDecoder::registerAscCallback(cbUpdateConfig_t callback,
                                                         void* userData) {
    mCallback = callback;
    mCallbackData = userData;
    return TRANSPORTDEC_OK;
}

TRANSPORTDEC_ERROR TransportDecoder::fillData(const uint8_t* buffer, uint32_t bufferSize,
                                              uint32_t* bytesValid) {
    if (bytesValid == nullptr || *bytesValid > bufferSize ||
        (buffer == nullptr && *bytesValid > 0)) {
        return TRANSPORTDEC_INVALID_PARAMETER;
    }
    // Drop what has been framed already, keeping a frame still in use; only when the
    // new bytes would not fit otherwise, so that the unframed tail of each fill (at
    // least the held-back last frame) is not moved on every call.
    const uint32_t keepFrom = mInFrame ? mFrameStart : mReadPos;
    if (keepFrom > 0 && kBufferSizeBytes - mValid < *bytesValid) {
        const uint64_t position = mReader.bitPosition();
        const uint64_t shiftBits = static_cast<uint64_t>(keepFrom) * 8u;
        std::memmove(mBuffer.data(), mBuffer.data() + keepFrom, mValid - keepFrom);
        mValid -= keepFrom;
        mReadPos -= keepFrom;
        if (mInFrame) {
            mFrameStart -= keepFrom;
            mFrameEnd -= keepFrom;
            mNextSubFrameBit -= shiftBits;
            mAuStartBit -= shiftBits;
        }
        mReader.init(mBuffer.data(), mValid);
        mReader.setBitPosition(position > shiftBits ? position - shiftBits : 0);
    }
    const uint32_t take = std::min(kBufferSizeBytes - mValid, *bytesValid);
    if (take > 0) {
        std::memcpy(mBuffer.data() + mValid, buffer + (bufferSize - *bytesValid), take);
        mValid += take;
        *bytesValid -= take;
    }
    if (!mInFrame) {
        mReader.setSize(mBuffer.data(), mValid);
    }
    return TRANSPORTDEC_OK;
}

int32_t TransportDecoder::auBitsRemaining() const {
    return static_cast<int32_t>(static_cast<int64_t>(mAuStartBit) + mAuBits -
                                static_cast<int64_t>(mReader.bitPosition()));
}

TRANSPORTDEC_ERROR TransportDecoder::endAccessUnit() {
    if (mInFrame) {
        mReader.setBitPosition(mAuStartBit + mAuBits);
    }
    return TRANSPORTDEC_OK;
}

TRANSPORTDEC_ERROR TransportDecoder::readAccessUnit() {
    if (mInFrame && mSubFramesLeft > 0) {
        --mSubFramesLeft;
        const TRANSPORTDEC_ERROR error = readLatmSubFrame();
        return error == TRANSPORTDEC_OK ? error : dropFrame(mFrameEnd, error);
    }
    if (mInFrame) {
        mReadPos = mFrameEnd;
        mInFrame = false;
    }
    mAuBits = 0;
    return mType == TT_MP4_LOAS ? readLoasFrame() : readAdtsFrame();
}

inline bool TransportDecoder::syncAt(uint32_t offset) const {
    if (offset + 2 > mValid) {
        return false;
    }
    const uint8_t b0 = mBuffer[offset];
    const uint8_t b1 = mBuffer[offset + 1];
    if (mType == TT_MP4_LOAS) {
        return b0 == kLoasFirstByte && (b1 & 0xE0) == 0xE0;
    }
    // syncword 0xFFF and layer '00' (ISO/IEC 13818-7, 6.2.1).
    return b0 == kAdtsFirstByte && (b1 & 0xF6) == 0xF0;
}

TRANSPORTDEC_ERROR TransportDecoder::loseSync(uint32_t skipFrom) {
    mSynced = false;
    mInFrame = false;
    mAuBits = 0;
    const uint8_t first = mType == TT_MP4_LOAS ? kLoasFirstByte : kAdtsFirstByte;
    uint32_t at = std::min(skipFrom, mValid);
    while (at < mValid) {
        const void* hit = std::memchr(mBuffer.data() + at, first, mValid - at);
        if (hit == nullptr) {
            at = mValid;
            break;
        }
        at = static_cast<uint32_t>(static_cast<const uint8_t*>(hit) - mBuffer.data());
        if (at + 1 == mValid || syncAt(at)) {
            break;  // a sync word here, or possibly one that the next bytes complete
        }
        ++at;
    }
    mReadPos = at;
    return TRANSPORTDEC_SYNC_ERROR;
}

TRANSPORTDEC_ERROR TransportDecoder::dropFrame(uint32_t frameEnd, TRANSPORTDEC_ERROR error) {
    mInFrame = false;
    mSubFramesLeft = 0;
    mAuBits = 0;
    mReadPos = frameEnd;
    mSynced = true;
    mReader.setSize(mBuffer.data(), mValid);
    return error;
}

void TransportDecoder::reportConfig(const CSAudioSpecificConfig& config) {
    if (mHaveConfig && config.sameAs(mConfig)) {
        return;
    }
    mConfig = config;
    mHaveConfig = true;
    if (mCallback != nullptr) {
        unsigned char changed = 1;
        mCallback(mCallbackData, &mConfig, 0, &changed);
    }
}

uint32_t TransportDecoder::latmGetValue(TransportBitReader& reader) {
    // ISO/IEC 14496-3, 1.7.3.1, LatmGetValue(): bytesForValue + 1 bytes, big-endian.
    const uint32_t bytesForValue = reader.readBits(2);
    uint32_t value = 0;
    for (uint32_t i = 0; i <= bytesForValue; ++i) {
        value = (value << 8) | reader.readBits(8);
    }
    return value;
}

TRANSPORTDEC_ERROR TransportDecoder::readStreamMuxConfig(LatmConfig* latm,
                                                         CSAudioSpecificConfig* config) {
    // ISO/IEC 14496-3, 1.7.3.1, Table 1.42 (StreamMuxConfig).
    TransportBitReader& r = mReader;
    latm->audioMuxVersion = r.readBits(1);
    const uint32_t audioMuxVersionA = latm->audioMuxVersion ? r.readBits(1) : 0;
    if (audioMuxVersionA != 0) {
        return TRANSPORTDEC_UNSUPPORTED_FORMAT;  // its syntax is "to be defined"
    }
    if (latm->audioMuxVersion == 1) {
        (void)latmGetValue(r);  // taraBufferFullness
    }
    const uint32_t allStreamsSameTimeFraming = r.readBits(1);
    latm->numSubFrames = r.readBits(6);
    const uint32_t numProgram = r.readBits(4);
    const uint32_t numLayer = r.readBits(3);
    if (r.overrun()) {
        return TRANSPORTDEC_PARSE_ERROR;
    }
    if (numProgram != 0 || numLayer != 0 || allStreamsSameTimeFraming == 0) {
        return TRANSPORTDEC_UNSUPPORTED_FORMAT;
    }
    // Program 0, layer 0: useSameConfig is implicitly 0, so the configuration follows.
    TRANSPORTDEC_ERROR error;
    if (latm->audioMuxVersion == 0) {
        error = TransportDecoderAsc::parse(r, -1, config);
    } else {
        const uint32_t ascLenBits = latmGetValue(r);
        const uint64_t ascStart = r.bitPosition();
        error = TransportDecoderAsc::parse(r, ascLenBits, config);
        if (error == TRANSPORTDEC_OK) {
            const uint64_t used = r.bitPosition() - ascStart;
            if (used > ascLenBits) {
                return TRANSPORTDEC_PARSE_ERROR;
            }
            r.skipBits(ascLenBits - used);  // fillBits
        }
    }
    if (error != TRANSPORTDEC_OK) {
        return error;
    }
    const uint32_t frameLengthType = r.readBits(3);
    if (frameLengthType != 0) {
        return TRANSPORTDEC_UNSUPPORTED_FORMAT;
    }
    r.skipBits(8);  // latmBufferFullness
    latm->otherDataPresent = r.readBits(1);
    latm->otherDataLenBits = 0;
    if (latm->otherDataPresent) {
        if (latm->audioMuxVersion == 1) {
            latm->otherDataLenBits = latmGetValue(r);
        } else {
            uint32_t escape;
            do {
                escape = r.readBits(1);
                latm->otherDataLenBits = (latm->otherDataLenBits << 8) + r.readBits(8);
            } while (escape != 0 && !r.overrun() && latm->otherDataLenBits < (1ull << 32));
        }
    }
    if (r.readBits(1)) {  // crcCheckPresent
        r.skipBits(8);    // crcCheckSum
    }
    return r.overrun() ? TRANSPORTDEC_PARSE_ERROR : TRANSPORTDEC_OK;
}

TRANSPORTDEC_ERROR TransportDecoder::readLatmSubFrame() {
    // ISO/IEC 14496-3, 1.7.3.1, PayloadLengthInfo() for one program and layer with
    // frameLengthType 0: MuxSlotLengthBytes as a run of bytes ending below 255. Every
    // frame goes through here, so the run is read straight from the buffer at the
    // subframe's bit offset (one bit past a byte boundary after useSameStreamMux);
    // each byte is checked to lie within the frame before it is read.
    const uint8_t* data = mBuffer.data();
    const uint64_t endBit = static_cast<uint64_t>(mFrameEnd) * 8u;
    const unsigned int offset = static_cast<unsigned int>(mNextSubFrameBit & 7u);
    uint64_t bit = mNextSubFrameBit;
    uint32_t lengthBytes = 0;
    uint32_t part;
    do {
        if (bit + 8 > endBit) {
            mReader.setBitPosition(bit);
            return TRANSPORTDEC_PARSE_ERROR;
        }
        // With a non-zero offset the byte spans two buffer bytes, both before endBit.
        const uint8_t* at = data + (bit >> 3);
        part = offset == 0 ? at[0] : ((at[0] << offset) | (at[1] >> (8u - offset))) & 0xFFu;
        lengthBytes += part;
        bit += 8;
    } while (part == 255);
    const uint64_t bits = static_cast<uint64_t>(lengthBytes) * 8u;
    mReader.clearOverrun();
    mReader.setBitPosition(bit);
    if (bit + bits > endBit) {
        return TRANSPORTDEC_PARSE_ERROR;
    }
    mAuStartBit = bit;
    mAuBits = static_cast<uint32_t>(bits);
    mNextSubFrameBit = bit + bits;
    return TRANSPORTDEC_OK;
}

TRANSPORTDEC_ERROR TransportDecoder::readLoasFrame() {
    const uint32_t available = mValid - mReadPos;
    if (available < kLoasHeaderBytes) {
        if ((available == 1 && mBuffer[mReadPos] != kLoasFirstByte) ||
            (available == 2 && !syncAt(mReadPos))) {
            return loseSync(mReadPos + 1);
        }
        return TRANSPORTDEC_NOT_ENOUGH_BITS;
    }
    if (!syncAt(mReadPos)) {
        return loseSync(mReadPos + 1);
    }
    // ISO/IEC 14496-3, 1.7.2, Table 1.40 (AudioSyncStream).
    const uint32_t muxLength = ((mBuffer[mReadPos + 1] & 0x1Fu) << 8) | mBuffer[mReadPos + 2];
    const uint32_t frameBytes = kLoasHeaderBytes + muxLength;
    if (available < frameBytes + kNextSyncBytes) {
        return TRANSPORTDEC_NOT_ENOUGH_BITS;
    }
    if (!mSynced && !syncAt(mReadPos + frameBytes)) {
        return loseSync(mReadPos + 1);
    }
    const uint32_t frameStart = mReadPos;
    const uint32_t frameEnd = mReadPos + frameBytes;
    // Bound every read of this frame to the frame itself.
    mReader.init(mBuffer.data(), frameEnd);
    mReader.setBitPosition(static_cast<uint64_t>(frameStart + kLoasHeaderBytes) * 8u);

    // AudioMuxElement(1), Table 1.41: useSameStreamMux is the first bit after the
    // header, read from the byte itself (the frame is known to hold it unless empty).
    if (muxLength == 0) {
        return mSynced ? dropFrame(frameEnd, TRANSPORTDEC_PARSE_ERROR) : loseSync(frameStart + 1);
    }
    const uint32_t useSameStreamMux = mBuffer[frameStart + kLoasHeaderBytes] >> 7;
    mReader.skipBits(1);
    if (useSameStreamMux == 0) {
        LatmConfig latm;
        CSAudioSpecificConfig config;
        const TRANSPORTDEC_ERROR error = readStreamMuxConfig(&latm, &config);
        if (error != TRANSPORTDEC_OK) {
            mHaveLatmConfig = false;
            if (error == TRANSPORTDEC_PARSE_ERROR && !mSynced) {
                return loseSync(frameStart + 1);
            }
            return dropFrame(frameEnd, error);
        }
        mLatm = latm;
        mHaveLatmConfig = true;
        reportConfig(config);
    } else if (!mHaveLatmConfig) {
        return dropFrame(frameEnd, TRANSPORTDEC_NO_CONFIGURATION);
    }
    mInFrame = true;
    mSynced = true;
    mFrameStart = frameStart;
    mFrameEnd = frameEnd;
    mSubFramesLeft = mLatm.numSubFrames;
    mNextSubFrameBit = mReader.bitPosition();
    const TRANSPORTDEC_ERROR error = readLatmSubFrame();
    return error == TRANSPORTDEC_OK ? error : dropFrame(frameEnd, error);
}

TRANSPORTDEC_ERROR TransportDecoder::readAdtsFrame() {
    const uint32_t available = mValid - mReadPos;
    if (available < 2) {
        if (available == 1 && mBuffer[mReadPos] != kAdtsFirstByte) {
            return loseSync(mReadPos + 1);
        }
        return TRANSPORTDEC_NOT_ENOUGH_BITS;
    }
    if (!syncAt(mReadPos)) {
        return loseSync(mReadPos + 1);
    }
    if (available < kAdtsHeaderBytes) {
        return TRANSPORTDEC_NOT_ENOUGH_BITS;
    }
    // ISO/IEC 13818-7, 6.2.1 / ISO/IEC 14496-3, 1.A.3.2: adts_fixed_header and
    // adts_variable_header, 56 bits, read straight from the bytes (every frame goes
    // through here):
    //   syncword 12, ID 1, layer 2, protection_absent 1 | profile 2,
    //   sampling_frequency_index 4, private_bit 1, channel_configuration 3,
    //   original_copy 1, home 1 | copyright bits 2, frame_length 13,
    //   adts_buffer_fullness 11, number_of_raw_data_blocks_in_frame 2.
    const uint8_t* h = mBuffer.data() + mReadPos;
    const uint32_t protectionAbsent = h[1] & 1u;
    const uint32_t profile = h[2] >> 6;
    const uint32_t samplingFrequencyIndex = (h[2] >> 2) & 0x0Fu;
    const uint32_t channelConfiguration = ((h[2] & 1u) << 2) | (h[3] >> 6);
    const uint32_t frameLength = ((h[3] & 3u) << 11) | (h[4] << 3) | (h[5] >> 5);
    const uint32_t rawDataBlocks = h[6] & 3u;
    const uint32_t headerBytes = kAdtsHeaderBytes + (protectionAbsent ? 0 : kAdtsCrcBytes);
    if (TransportDecoderAsc::samplingFrequencyOf(samplingFrequencyIndex) == 0 ||
        frameLength < headerBytes) {
        return loseSync(mReadPos + 1);  // reserved values: not a header after all
    }
    if (available < frameLength + kNextSyncBytes) {
        return TRANSPORTDEC_NOT_ENOUGH_BITS;
    }
    if (!mSynced && !syncAt(mReadPos + frameLength)) {
        return loseSync(mReadPos + 1);
    }
    const uint32_t frameEnd = mReadPos + frameLength;
    if (rawDataBlocks != 0 && !protectionAbsent) {
        // With CRC, several blocks carry raw_data_block_position[] and a CRC each
        // (ISO/IEC 13818-7, 6.2.2): not handled.
        return dropFrame(frameEnd, TRANSPORTDEC_UNSUPPORTED_FORMAT);
    }
    // The fixed header rarely changes: only a change is turned into a configuration.
    const uint32_t fixedHeader =
        (profile << 8) | (samplingFrequencyIndex << 4) | channelConfiguration;
    if (!mHaveConfig || fixedHeader != mAdtsFixedHeader) {
        CSAudioSpecificConfig config;
        TransportDecoderAsc::fromAdts(profile, samplingFrequencyIndex, channelConfiguration,
                                      &config);
        reportConfig(config);
        mAdtsFixedHeader = fixedHeader;
    }
    mInFrame = true;
    mSynced = true;
    mFrameStart = mReadPos;
    mFrameEnd = frameEnd;
    mSubFramesLeft = 0;
    mAuStartBit = static_cast<uint64_t>(mReadPos + headerBytes) * 8u;
    mAuBits = (frameLength - headerBytes) * 8u;
    mReader.init(mBuffer.data(), frameEnd);
    mReader.setBitPosition(mAuStartBit);
    return TRANSPORTDEC_OK;
}

// ---- the calls the extractor makes ------------------------------------------------

HANDLE_TRANSPORTDEC transportDec_Open(TRANSPORT_TYPE transportType, uint32_t flags,
                                      uint32_t nrOfLayers) {
    if ((transportType != TT_MP4_LOAS && transportType != TT_MP4_ADTS) || nrOfLayers != 1) {
        return nullptr;
    }
    return new (std::nothrow) TransportDecoder(transportType, flags);
}

TRANSPORTDEC_ERROR transportDec_SetParam(HANDLE_TRANSPORTDEC handle, TPDEC_PARAM param,
                                         int32_t value) {
    return handle == nullptr ? TRANSPORTDEC_INVALID_PARAMETER : handle->setParam(param, value);
}

TRANSPORTDEC_ERROR transportDec_RegisterAscCallback(HANDLE_TRANSPORTDEC handle,
                                                    cbUpdateConfig_t callback, void* userData) {
    return handle == nullptr ? TRANSPORTDEC_INVALID_PARAMETER
                             : handle->registerAscCallback(callback, userData);
}

TRANSPORTDEC_ERROR transportDec_FillData(HANDLE_TRANSPORTDEC handle, const uint8_t* buffer,
                                         uint32_t bufferSize, uint32_t* bytesValid,
                                         uint32_t layer) {
    if (handle == nullptr || layer != 0) {
        return TRANSPORTDEC_INVALID_PARAMETER;
    }
    return handle->fillData(buffer, bufferSize, bytesValid);
}

TRANSPORTDEC_ERROR transportDec_ReadAccessUnit(HANDLE_TRANSPORTDEC handle, uint32_t layer) {
    if (handle == nullptr || layer != 0) {
        return TRANSPORTDEC_INVALID_PARAMETER;
    }
    return handle->readAccessUnit();
}

int32_t transportDec_GetAuBitsRemaining(HANDLE_TRANSPORTDEC handle, uint32_t layer) {
    return (handle == nullptr || layer != 0) ? 0 : handle->auBitsRemaining();
}

uint32_t transportDec_GetAuBitsTotal(HANDLE_TRANSPORTDEC handle, uint32_t layer) {
    return (handle == nullptr || layer != 0) ? 0 : handle->auBitsTotal();
}

TRANSPORTDEC_ERROR transportDec_EndAccessUnit(HANDLE_TRANSPORTDEC handle) {
    return handle == nullptr ? TRANSPORTDEC_INVALID_PARAMETER : handle->endAccessUnit();
}

TransportBitReader* transportDec_GetBitstream(HANDLE_TRANSPORTDEC handle, uint32_t layer) {
    return (handle == nullptr || layer != 0) ? nullptr : handle->bitstream();
}

void transportDec_Close(HANDLE_TRANSPORTDEC* handle) {
    if (handle != nullptr) {
        delete *handle;
        *handle = nullptr;
    }
}

}  // namespace TavoPlayer
