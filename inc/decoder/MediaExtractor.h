// MediaExtractor: the base of the extractors that cut decodable units (H.264 access
// units, AAC access units, MPEG audio frames) out of the PESData records of an input
// ring, and the record-consumption protocol they share.
//
// Threads: only the decoder's input thread calls an extractor (getDecodableUnit, and
// reset while that thread is stopped). The ring's reader lock is held from adopting a
// record until the record is used up, across calls; the writer is woken only by a
// try-lock, so the reader never waits for the writer.
#pragma once

#include <cstdint>

#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

#include "common/RingBuffer.h"
#include "common/data/PESData.h"

namespace TavoPlayer {

class MediaExtractor : public virtual android::RefBase {
public:
    // Results of getDecodableUnit (the first three) and of the extractors' internal
    // steps (the rest).
    enum Result : unsigned int {
        RESULT_OK = 0,                // a unit if *length > 0; otherwise call again
        RESULT_RING_FAULT = 1,        // a record larger than the readable bytes
        RESULT_NO_INPUT = 2,          // nothing readable within the wait
        RESULT_NOT_ENOUGH_BYTES = 3,  // not enough bytes for a header
        RESULT_RESYNC_FAILED = 4,
        RESULT_INVALID = 5,  // invalid data, or output too small
    };

    explicit MediaExtractor(android::sp<RingBuffer> ring);
    ~MediaExtractor() override;
    MediaExtractor(const MediaExtractor&) = delete;
    MediaExtractor& operator=(const MediaExtractor&) = delete;

    // Writes at most one unit into `buffer` (of `size` bytes); its length through
    // `length`, its presentation time (90 kHz) through `pts` and its flags through
    // `flags` (extractor-specific). Returns a Result of 0..2.
    virtual unsigned int getDecodableUnit(void* buffer, unsigned long size, unsigned long* length,
                                          long long* pts, unsigned char* flags) = 0;
    virtual void reset() = 0;

protected:
    // Smallest readable amount that can hold a record header.
    static constexpr uint32_t kMinRecordBytes = PESData::kHeaderSize;

    // Steps 1-2 of the protocol: takes the reader lock, waits once (at most 100 ms)
    // for a record header, and checks that the whole record is readable. On
    // RESULT_OK *record points at the record in place and the reader lock stays held;
    // otherwise the lock has been released (RESULT_NO_INPUT, RESULT_RING_FAULT with
    // the ring-fault message naming `function`).
    unsigned int acquireRecord(const char* function, PESData** record);
    // The record is used up: advance past it, release the reader lock, wake the writer.
    void consumeRecord(PESData* record);
    // Gives the record back unconsumed (it is taken again from its start next time).
    void abandonRecord();

    // The elementary-stream payload of a record, bounded by the record itself: a
    // record whose mOffsetES/mSizeES claim bytes beyond mSize is read only up to
    // mSize, so that no extractor ever reads outside the record. On a consistent
    // record this is exactly mSizeES.
    static uint32_t boundedSizeES(const PESData& record);
    static uint8_t* payloadOf(PESData& record) { return record.esBytes(); }

    android::sp<RingBuffer> mRingBuffer;
};

}  // namespace TavoPlayer
