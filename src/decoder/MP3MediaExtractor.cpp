#include "decoder/MP3MediaExtractor.h"

#include <cstring>
#include <utility>

#include "decoder/ReadBitInterface.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {
// Header fields (ISO/IEC 11172-3, 2.4.1.3; ISO/IEC 13818-3 and the MPEG 2.5 extension).
constexpr uint32_t kSyncWord = 0x7FF;
constexpr uint32_t kVersionReserved = 1;
constexpr uint32_t kVersionMpeg1 = 3;
constexpr uint32_t kVersionMpeg2 = 2;
constexpr uint32_t kLayerReserved = 0;
constexpr uint32_t kLayerI = 3;
constexpr uint8_t kBitRateFree = 0;
constexpr uint8_t kSamplingRateReserved = 3;
constexpr uint8_t kEmphasisReserved = 2;
constexpr size_t kHeaderBytes = 4;
// Applied to every frame whatever its protection bit: the header plus a CRC word.
constexpr size_t kHeaderWithCrcBytes = 6;
}  // namespace

const uint32_t MP3MediaExtractor::bitRateTable[16][5] = {
    {0, 0, 0, 0, 0},
    {32, 32, 32, 32, 8},
    {64, 48, 40, 48, 16},
    {96, 56, 48, 56, 24},
    {128, 64, 56, 64, 32},
    {160, 80, 64, 80, 40},
    {192, 96, 80, 96, 48},
    {224, 112, 96, 112, 56},
    {256, 128, 112, 128, 64},
    {288, 160, 128, 144, 80},
    {320, 192, 160, 160, 96},
    {352, 224, 192, 176, 112},
    {384, 256, 224, 192, 128},
    {416, 320, 256, 224, 144},
    {448, 384, 320, 256, 160},
    {384, 384, 384, 1152, 1152},  // forbidden index 15, kept as the extractor has it
};

const uint32_t MP3MediaExtractor::samplesPerFrameTable[3][3] = {
    {384, 384, 384},
    {1152, 1152, 1152},
    {1152, 576, 576},
};

const uint32_t MP3MediaExtractor::samplingRateTable[3][3] = {
    {44100, 22050, 11025},
    {48000, 24000, 12000},
    {32000, 16000, 8000},
};

MP3MediaExtractor::MP3MediaExtractor(android::sp<RingBuffer> ring)
    : MediaExtractor(std::move(ring)),
      mPayload(nullptr),
      mPayloadSize(0),
      mCurrentPTS(0),
      mFrameDuration(0),
      mPosition(0),
      mSynced(false),
      mCarryPending(false),
      mCarryLength(0),
      mCarryPTS(0),
      mCurrentRecord(nullptr),
      mVersionId(0),
      mLayer(0),
      mCrcPresent(false),
      mBitRateIndex(0),
      mSamplingRateIndex(0),
      mPadding(false),
      mChannelMode(0),
      mModeExtension(0),
      mRights(false),
      mOriginal(false),
      mEmphasis(0),
      mFrameLength(0),
      mLastHeaderWord(0),
      mLastHeaderValid(false) {}

MP3MediaExtractor::~MP3MediaExtractor() {
    if (mCurrentRecord != nullptr) {
        abandonRecord();
        mCurrentRecord = nullptr;
    }
}

void MP3MediaExtractor::reset() {
    // Deliberately nothing: the sync state and a held frame start survive a flush.
}

void MP3MediaExtractor::giveBackRecord() {
    if (mCurrentRecord == nullptr)
        return;
    abandonRecord();
    mCurrentRecord = nullptr;
    mPayload = nullptr;
    mPayloadSize = 0;
    mPosition = 0;
    // Taken again from its start, where a frame tail may come first: find the next
    // header instead of failing on that tail.
    mSynced = false;
}

void MP3MediaExtractor::adoptRecord(PESData* record) {
    mCurrentRecord = record;
    mPosition = 0;
    mCurrentPTS = static_cast<long long>(record->mPTS);
    mPayload = payloadOf(*record);
    mPayloadSize = boundedSizeES(*record);
}

unsigned int MP3MediaExtractor::getDecodableUnit(void* buffer, unsigned long size,
                                                 unsigned long* length, long long* pts,
                                                 unsigned char* /*flags*/) {
    *length = 0;
    if (mCurrentRecord == nullptr) {
        PESData* record = nullptr;
        const unsigned int result = acquireRecord("getDecodableUnit", &record);
        if (result != RESULT_OK) {
            return result;
        }
        adoptRecord(record);
    }
    const unsigned int fragment = getNextFragment(buffer, size, length, pts);
    if (fragment == FRAGMENT_RECORD_EXHAUSTED || mPosition >= mPayloadSize) {
        consumeRecord(mCurrentRecord);
        mCurrentRecord = nullptr;
        mPayload = nullptr;
    }
    return RESULT_OK;
}

unsigned int MP3MediaExtractor::resync() {
    while (mPosition + 2 <= mPayloadSize) {
        const uint8_t* at = mPayload + mPosition;
        if (at[0] == 0xFF && (at[1] & 0xE0) == 0xE0 && parseHeader() == RESULT_OK) {
            return RESULT_OK;
        }
        ++mPosition;
    }
    return RESULT_RESYNC_FAILED;
}

unsigned int MP3MediaExtractor::getNextFragment(void* buffer, unsigned long size,
                                                unsigned long* length, long long* pts) {
    if (!mSynced) {
        if (resync() != RESULT_OK) {
            return FRAGMENT_RECORD_EXHAUSTED;
        }
        mSynced = true;
    }
    if (!mCarryPending && parseHeader() != RESULT_OK) {
        TAVO_LOGE("%s: Failed to parse header.\n", "getNextFragment");
        mSynced = false;
        return FRAGMENT_ERROR;
    }

    const uint64_t rest = mFrameLength - mCarryLength;
    if (mPosition + rest <= mPayloadSize) {
        auto* out = static_cast<uint8_t*>(buffer);
        if (mFrameLength > size) {
            TAVO_LOGE("%s: not enough space in output buffer for MPEG audio frame.\n",
                      "getNextFragment");
            // The frame is skipped whole; a held start belongs to it and goes too.
            mPosition += rest;
            mCarryPending = false;
            mCarryLength = 0;
            return FRAGMENT_ERROR;
        }
        if (!mCarryPending) {
            std::memcpy(out, mPayload + mPosition, mFrameLength);
            mPosition += mFrameLength;
            *length = mFrameLength;
            *pts = mCurrentPTS;
            mCurrentPTS += static_cast<long long>(mFrameDuration);
            return FRAGMENT_DELIVERED;
        }
        std::memcpy(out, mCarryBuffer.get(), mCarryLength);
        std::memcpy(out + mCarryLength, mPayload + mPosition, rest);
        mPosition += rest;
        *length = mFrameLength;
        *pts = mCarryPTS;
        // The current PTS stays: it is this record's own, and belongs to the next frame.
        mCarryLength = 0;
        mCarryPending = false;
        return FRAGMENT_DELIVERED;
    }

    const uint64_t available = mPayloadSize - mPosition;
    std::memcpy(mCarryBuffer.get() + mCarryLength, mPayload + mPosition, available);
    if (!mCarryPending) {
        // A frame spread over several records keeps the time of the record it began in.
        mCarryPTS = mCurrentPTS;
    }
    mCarryPending = true;
    mCarryLength += static_cast<uint32_t>(available);
    mPosition = mPayloadSize;
    return FRAGMENT_CONTINUES;
}

unsigned int MP3MediaExtractor::parseHeader() {
    const uint64_t left = mPosition < mPayloadSize ? mPayloadSize - mPosition : 0;
    if (left < kHeaderBytes) {
        TAVO_LOGE("%s: No enough bits to parse header.\n", "parseHeader");
        return RESULT_NOT_ENOUGH_BYTES;
    }
    const uint8_t* at = mPayload + mPosition;
    const uint32_t word = (static_cast<uint32_t>(at[0]) << 24) |
                          (static_cast<uint32_t>(at[1]) << 16) |
                          (static_cast<uint32_t>(at[2]) << 8) | at[3];
    if (mLastHeaderValid && word == mLastHeaderWord && left >= kHeaderWithCrcBytes) {
        // The same 32 bits as the last header that parsed: every field, the frame length
        // and the duration are already what this header gives (a CBR stream repeats one
        // header word, two with padding).
        return RESULT_OK;
    }
    ReadBitInterface reader(mPayload + mPosition, static_cast<unsigned int>(left));
    const uint32_t sync = reader.readBits(11);
    if (sync != kSyncWord) {
        TAVO_LOGE("%s: Invalid sync word: 0x%X\n", "parseHeader", sync);
        return RESULT_INVALID;
    }
    const uint32_t versionId = reader.readBits(2);
    if (versionId == kVersionReserved) {
        TAVO_LOGE("%s: Invalid Version ID: 0x%X\n", "parseHeader", versionId);
        return RESULT_INVALID;
    }
    const uint32_t layer = reader.readBits(2);
    if (layer == kLayerReserved) {
        TAVO_LOGE("%s: Invalid Layer Index: 0x%X\n", "parseHeader", layer);
        return RESULT_INVALID;
    }
    const bool crcPresent = reader.readBits(1) == 0;
    if (left < kHeaderWithCrcBytes) {
        TAVO_LOGE("%s: No enough bits to parse header with CRC.\n", "parseHeader");
        return RESULT_NOT_ENOUGH_BYTES;
    }
    const auto bitRateIndex = static_cast<uint8_t>(reader.readBits(4));
    if (bitRateIndex == kBitRateFree) {
        TAVO_LOGE("%s: Invalid bit rate index: 0x%X\n", "parseHeader", bitRateIndex);
        return RESULT_INVALID;
    }
    const unsigned column = versionId == kVersionMpeg1 ? 3 - layer : (layer == kLayerI ? 3 : 4);
    const uint32_t bitRate = bitRateTable[bitRateIndex][column];
    const auto samplingRateIndex = static_cast<uint8_t>(reader.readBits(2));
    if (samplingRateIndex == kSamplingRateReserved) {
        TAVO_LOGE("%s: Invalid sampling rate index: 0x%X\n", "parseHeader", samplingRateIndex);
        return RESULT_INVALID;
    }
    const bool padding = reader.readBits(1) != 0;
    reader.skipBits(1, nullptr);  // private bit
    const auto channelMode = static_cast<uint8_t>(reader.readBits(2));
    const auto modeExtension = static_cast<uint8_t>(reader.readBits(2));
    const bool rights = reader.readBits(1) != 0;
    const bool original = reader.readBits(1) != 0;
    const auto emphasis = static_cast<uint8_t>(reader.readBits(2));
    if (emphasis == kEmphasisReserved) {
        TAVO_LOGE("%s: Invalid emphasis value: 0x%X\n", "parseHeader", emphasis);
        return RESULT_INVALID;
    }

    mVersionId = versionId;
    mLayer = layer;
    mCrcPresent = crcPresent;
    mBitRateIndex = bitRateIndex;
    mSamplingRateIndex = samplingRateIndex;
    mPadding = padding;
    mChannelMode = channelMode;
    mModeExtension = modeExtension;
    mRights = rights;
    mOriginal = original;
    mEmphasis = emphasis;

    const unsigned rateColumn =
        versionId == kVersionMpeg1 ? 0 : (versionId == kVersionMpeg2 ? 1 : 2);
    const double samplingRate = samplingRateTable[samplingRateIndex][rateColumn];
    const double pad = padding ? 1.0 : 0.0;
    uint32_t frameLength;
    if (layer == kLayerI) {
        frameLength =
            static_cast<uint32_t>(static_cast<uint64_t>(bitRate * 12000.0 / samplingRate + pad)) *
            4;
    } else {
        // Intended as the extractor has always done it: the padding is added before
        // the factor 144, and MPEG-2/2.5 Layer III uses 144 too, unlike the textbook
        // formula of ISO/IEC 13818-3 (72, and a padding of one slot).
        frameLength = static_cast<uint32_t>((bitRate * 1000.0 / samplingRate + pad) * 144.0);
    }
    mFrameDuration = static_cast<uint64_t>(frameLength * 8u / bitRate) * 90u;
    mLastHeaderWord = word;
    mLastHeaderValid = true;

    if (frameLength != mFrameLength) {
        auto carry = std::make_unique<uint8_t[]>(frameLength + 4);
        if (mCarryPending && mCarryLength > 0) {
            // Only reachable through an explicit resync() while a frame is held.
            mCarryLength = mCarryLength < frameLength ? mCarryLength : frameLength;
            std::memcpy(carry.get(), mCarryBuffer.get(), mCarryLength);
        }
        mCarryBuffer = std::move(carry);
        mFrameLength = frameLength;
    }
    return RESULT_OK;
}

}  // namespace TavoPlayer
