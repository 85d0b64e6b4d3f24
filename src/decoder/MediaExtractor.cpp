#include "decoder/MediaExtractor.h"

#include <utility>

#include "platform/os/Trace.h"

namespace TavoPlayer {

MediaExtractor::MediaExtractor(android::sp<RingBuffer> ring) : mRingBuffer(std::move(ring)) {}

MediaExtractor::~MediaExtractor() = default;

unsigned int MediaExtractor::acquireRecord(const char* function, PESData** record) {
    if (!mRingBuffer->waitForData(kMinRecordBytes)) {
        return RESULT_NO_INPUT;
    }
    auto* candidate = reinterpret_cast<PESData*>(mRingBuffer->readPointer());
    const uint32_t readable = mRingBuffer->usedSpace();
    if (candidate->mSize > readable) {
        // The doubled "r" is the message as the system has always logged it.
        TAVO_LOGE("%s: RingBuffer fatal errror: %d %u\n", function, static_cast<int>(readable),
                  candidate->mSize);
        mRingBuffer->abortRead();
        return RESULT_RING_FAULT;
    }
    *record = candidate;
    return RESULT_OK;
}

void MediaExtractor::consumeRecord(PESData* record) {
    mRingBuffer->consume(record->mSize);
}

void MediaExtractor::abandonRecord() {
    mRingBuffer->abortRead();
}

uint32_t MediaExtractor::boundedSizeES(const PESData& record) {
    if (record.mOffsetES >= record.mSize) {
        return 0;
    }
    const uint32_t available = record.mSize - record.mOffsetES;
    return record.mSizeES < available ? record.mSizeES : available;
}

}  // namespace TavoPlayer
