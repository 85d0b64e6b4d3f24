#include "decoder/AACMediaExtractor.h"

#include <cstring>
#include <utility>

#include "decoder/ASCParser.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

constexpr uint32_t kLayer = 0;
constexpr int32_t kIgnoreBufferFullness = 1;
constexpr uint64_t kTicksPerSecond = 90000;

TRANSPORT_TYPE transportTypeOf(AACMediaExtractor::transportLayer_t layer) {
    return layer == AACMediaExtractor::TRANSPORT_LAYER_LOAS ? TT_MP4_LOAS : TT_MP4_ADTS;
}

uint32_t transportFlagsOf(AACMediaExtractor::transportLayer_t layer) {
    return layer == AACMediaExtractor::TRANSPORT_LAYER_LOAS ? 0u : 1u;
}

}  // namespace

AACMediaExtractor::AACMediaExtractor(android::sp<RingBuffer> ring, transportLayer_t layer)
    : MediaExtractor(std::move(ring)), mTransportLayer(layer) {
    openTransport("AACMediaExtractor");
}

AACMediaExtractor::~AACMediaExtractor() {
    releaseReadLock();
    transportDec_Close(&mTransportDecoder);
}

void AACMediaExtractor::openTransport(const char* function) {
    mTransportDecoder =
        transportDec_Open(transportTypeOf(mTransportLayer), transportFlagsOf(mTransportLayer), 1);
    if (mTransportDecoder == nullptr) {
        TAVO_LOGE("%s: Error creating transport decoder\n", function);
        return;
    }
    if (transportDec_SetParam(mTransportDecoder, TPDEC_PARAM_IGNORE_BUFFERFULLNESS,
                              kIgnoreBufferFullness) != TRANSPORTDEC_OK) {
        TAVO_LOGE("%s: Error configuring the AAC tp decoder\n", function);
    }
    if (transportDec_RegisterAscCallback(mTransportDecoder, &AACMediaExtractor::ASCCallback,
                                         this) != TRANSPORTDEC_OK) {
        TAVO_LOGE("%s: Error registering callback\n", function);
    }
}

void AACMediaExtractor::releaseReadLock() {
    if (mReadLocked) {
        mRingBuffer->abortRead();
        mReadLocked = false;
    }
}

void AACMediaExtractor::reset() {
    mConfigSent = false;
    if (mCurrentRecord != nullptr) {
        // Given back unconsumed: the next call adopts it again from the read position
        // (bytes valid tells how much of it the transport decoder already has).
        releaseReadLock();
        mCurrentRecord = nullptr;
    }
}

int32_t AACMediaExtractor::ASCCallback(void* self, const CSAudioSpecificConfig* config,
                                       unsigned char /*configMode*/,
                                       unsigned char* /*configChanged*/) {
    auto* extractor = static_cast<AACMediaExtractor*>(self);
    if (extractor == nullptr || config == nullptr || extractor->mConfig != nullptr) {
        return 0;  // only the first configuration counts
    }
    extractor->mConfigCopy = *config;
    extractor->mConfig = &extractor->mConfigCopy;
    extractor->mFrameDuration = config->m_samplingFrequency == 0
                                    ? 0
                                    : static_cast<uint64_t>(config->m_samplesPerFrame) *
                                          kTicksPerSecond / config->m_samplingFrequency;
    return 0;
}

unsigned int AACMediaExtractor::getASC(void* buffer, unsigned long size, unsigned long* length) {
    if (mConfig == nullptr) {
        return 1;
    }
    ASCParser parser;
    parser.mAudioObjectType = mConfig->m_aot;
    parser.mSamplingFrequencyIndex = mConfig->m_samplingFrequencyIndex;
    parser.mSamplingFrequency = mConfig->m_samplingFrequency;
    parser.mChannelConfiguration = mConfig->m_channelConfiguration;
    parser.mExtensionAudioObjectType = mConfig->m_extensionAudioObjectType;
    parser.mExtensionSamplingFrequencyIndex = mConfig->m_extensionSamplingFrequencyIndex;
    parser.mExtensionSamplingFrequency = mConfig->m_extensionSamplingFrequency;
    unsigned char* asc = nullptr;
    unsigned int ascSize = 0;
    const unsigned int result = parser.createASC(&asc, &ascSize);
    if (result != 0) {
        TAVO_LOGE("%s: createASC failed with error %d", __func__, static_cast<int>(result));
        return 1;
    }
    if (ascSize > size) {
        TAVO_LOGE("%s: Not enough space on output buffer. (%u > %lu)", __func__, ascSize, size);
        delete[] asc;
        return 1;
    }
    std::memcpy(buffer, asc, ascSize);
    delete[] asc;
    *length = ascSize;
    return 0;
}

unsigned int AACMediaExtractor::getNextFragment(void* buffer, unsigned long size,
                                                unsigned long* length, long long* pts) {
    if (mNeedFill) {
        if (mBytesValid == 0) {
            mBytesValid = mPayloadSize;
            if (!mPtsCarry) {
                mCurrentPTS = static_cast<int64_t>(mCurrentRecord->mPTS);
            }
        }
        mNeedFill = false;
        const TRANSPORTDEC_ERROR fill =
            transportDec_FillData(mTransportDecoder, mPayload, mPayloadSize, &mBytesValid, kLayer);
        if (fill != TRANSPORTDEC_OK) {
            TAVO_LOGE("%s: Fill data failed with code %d", __func__, static_cast<int>(fill));
            // Nothing was taken and nothing ever will be (no decoder): let the record
            // go rather than offering it again forever.
            mBytesValid = 0;
        }
    }
    const unsigned int notDone = FRAGMENT_NOT_FULLY_FED;
    const TRANSPORTDEC_ERROR read = transportDec_ReadAccessUnit(mTransportDecoder, kLayer);
    if (read == TRANSPORTDEC_SYNC_ERROR) {
        if (mErrorCounting) {
            ++mErrorCnt;
        }
        TAVO_LOGW("%s: transportDec_ReadAccessUnit: Sync Error 0x%X mErrorCnt(%d)", __func__,
                  static_cast<unsigned int>(TRANSPORTDEC_SYNC_ERROR), static_cast<int>(mErrorCnt));
        mNeedFill = true;
        return mBytesValid != 0 ? notDone : FRAGMENT_EXHAUSTED;
    }
    if (read == TRANSPORTDEC_NOT_ENOUGH_BITS) {
        if (mErrorCounting) {
            ++mErrorCnt;
        }
        // The unit being read continues in the next record: that record's PTS belongs
        // to the unit after it.
        mPtsCarry = true;
        mNeedFill = true;
        return mBytesValid != 0 ? notDone : FRAGMENT_EXHAUSTED;
    }
    if (read != TRANSPORTDEC_OK) {
        TAVO_LOGE("%s: transportDec_ReadAccessUnit() failed with code %d", __func__,
                  static_cast<int>(read));
        mNeedFill = true;
        return mBytesValid != 0 ? notDone : FRAGMENT_EXHAUSTED;
    }
    const uint32_t unitBytes = transportDec_GetAuBitsTotal(mTransportDecoder, kLayer) / 8;
    if (unitBytes == 0) {
        mNeedFill = true;
        return mBytesValid != 0 ? notDone : FRAGMENT_EXHAUSTED;
    }
    if (unitBytes <= size) {
        TransportBitReader* bits = transportDec_GetBitstream(mTransportDecoder, kLayer);
        bits->readBytes(static_cast<uint8_t*>(buffer), unitBytes);
        bits->byteAlign();
        *pts = mCurrentPTS;
        if (mPtsCarry) {
            mPtsCarry = false;
            mCurrentPTS = static_cast<int64_t>(mCurrentRecord->mPTS);
        } else {
            mCurrentPTS += static_cast<int64_t>(mFrameDuration);
        }
        if (mConfigSent) {
            *length = unitBytes;
            return FRAGMENT_DONE;
        }
    } else if (mConfigSent) {
        return FRAGMENT_DONE;  // larger than the output buffer: dropped
    }
    if (mConfig == nullptr) {
        return FRAGMENT_DONE;  // no audio leaves before the configuration
    }
    // The configuration takes the place of the unit just copied, deliberately: the
    // decoder must have it first, and one unit is a small loss at start-up.
    if (getASC(buffer, size, length) != 0) {
        TAVO_LOGE("%s: Error creating ASC\n", __func__);
        return FRAGMENT_DONE;
    }
    mConfigSent = true;
    return FRAGMENT_CONFIG;
}

bool AACMediaExtractor::shouldSwitch(const uint8_t* head, uint32_t headBytes) {
    const uint32_t b0 = headBytes > 0 ? head[0] : 0;
    const uint32_t b1 = headBytes > 1 ? head[1] : 0;
    const uint32_t b2 = headBytes > 2 ? head[2] : 0;
    const uint32_t b3 = headBytes > 3 ? head[3] : 0;
    const uint32_t word = (b0 * 16) + (b1 / 16);
    if (mTransportLayer == TRANSPORT_LAYER_ADTS) {
        // 11-bit LOAS syncword 0x2B7 (ISO/IEC 14496-3, 1.7.2).
        if (headBytes >= 2 && (word & 0xFFE) == 0x56E) {
            ++mSuspectCount;
            // "supect" is the message as the system has always logged it.
            TAVO_LOGW("%s: LOAS supect count : %d", "getDecodableUnit",
                      static_cast<int>(mSuspectCount));
        }
    } else {
        // ADTS syncword with a valid sampling-frequency index and channel
        // configuration (ISO/IEC 13818-7, 6.2.1).
        const uint32_t frequencyIndex = (b2 & 0x3C) / 4;
        const uint32_t channels = ((b2 & 1) * 4) + (b3 / 64);
        if (headBytes >= 4 && word == 0xFFF && frequencyIndex < 13 && channels < 7) {
            ++mSuspectCount;
            TAVO_LOGW("%s: ADTS supect count : %d", "getDecodableUnit",
                      static_cast<int>(mSuspectCount));
        }
    }
    if (mErrorCnt >= kSwitchErrorCount) {
        return true;
    }
    if (mErrorCnt >= kSuspectErrorCount) {
        return mTransportLayer == TRANSPORT_LAYER_ADTS ? mSuspectCount >= kLoasSuspectsNeeded
                                                       : mSuspectCount >= kAdtsSuspectsNeeded;
    }
    return false;
}

unsigned int AACMediaExtractor::getDecodableUnit(void* buffer, unsigned long size,
                                                 unsigned long* length, long long* pts,
                                                 unsigned char* flags) {
    static constexpr const char* kFunction = "getDecodableUnit";
    unsigned long ignoredLength = 0;
    long long ignoredPts = 0;
    if (length == nullptr) {
        length = &ignoredLength;
    }
    if (pts == nullptr) {
        pts = &ignoredPts;
    }
    *length = 0;
    if (mCurrentRecord == nullptr) {
        if (!mRingBuffer->waitForData(kMinRecordBytes)) {
            return RESULT_NO_INPUT;
        }
        auto* record = reinterpret_cast<PESData*>(mRingBuffer->readPointer());
        const uint32_t readable = mRingBuffer->usedSpace();
        if (record->mSize > readable || record->mSize < PESData::kHeaderSize) {
            // The doubled "r" is the message as the system has always logged it.
            TAVO_LOGE("%s: RingBuffer fatal errror: %d %u\n", kFunction, static_cast<int>(readable),
                      record->mSize + PESData::kHeaderSize);
            mRingBuffer->abortRead();
            return RESULT_RING_FAULT;
        }
        mReadLocked = true;
        mCurrentRecord = record;
        mScanOffset = 0;
        mPayloadSize = boundedSizeES(*record);
        mPayload = mPayloadSize > 0 ? payloadOf(*record) : nullptr;
        if (mBytesValid > mPayloadSize) {
            mBytesValid = 0;  // what was left of a record given back by reset() is gone
        }
    } else if (!mReadLocked) {
        if (!mRingBuffer->waitForData(kMinRecordBytes)) {
            return RESULT_NO_INPUT;
        }
        mReadLocked = true;
    }

    switch (getNextFragment(buffer, size, length, pts)) {
        case FRAGMENT_NOT_FULLY_FED:
            releaseReadLock();
            return RESULT_NO_INPUT;
        case FRAGMENT_CONFIG:
            if (flags != nullptr) {
                *flags |= FLAG_CODEC_CONFIG;
            }
            releaseReadLock();
            mErrorCounting = false;
            mErrorCnt = 0;
            TAVO_LOGI("%s: found aac codec config", kFunction);
            return RESULT_OK;
        case FRAGMENT_EXHAUSTED: {
            // Keep the first bytes for the framing check: after consume() the writer
            // may reuse the record's space.
            uint8_t head[4] = {0, 0, 0, 0};
            const uint32_t headBytes = mPayloadSize < 4 ? mPayloadSize : 4;
            if (headBytes > 0) {
                std::memcpy(head, mPayload, headBytes);
            }
            mRingBuffer->consume(mCurrentRecord->mSize);
            mReadLocked = false;
            mCurrentRecord = nullptr;
            mPayload = nullptr;
            mPayloadSize = 0;
            if (!mErrorCounting || !shouldSwitch(head, headBytes)) {
                return RESULT_OK;
            }
            mErrorCnt = 0;
            mSuspectCount = 0;
            transportDec_Close(&mTransportDecoder);
            mTransportLayer = mTransportLayer == TRANSPORT_LAYER_LOAS ? TRANSPORT_LAYER_ADTS
                                                                      : TRANSPORT_LAYER_LOAS;
            openTransport(kFunction);
            return RESULT_NO_INPUT;
        }
        default:
            return RESULT_OK;
    }
}

}  // namespace TavoPlayer
