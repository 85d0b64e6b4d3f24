// What the extractor fuzz targets share: a ring reused across runs, the input cut into
// PES records written into it, and a check that every unit handed out fits the output.
//
// Record layout in the input: a 2-byte big-endian length (top bit: state an ES size far
// beyond the record's end, which must never be read) and that many ES bytes.
#pragma once

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <new>
#include <vector>

#include "common/RingBuffer.h"
#include "common/data/PESData.h"
#include "decoder/MediaExtractor.h"
#include "platform/os/Trace.h"

namespace TavoPlayer::fuzz {

// One ring for every run (configuring 1 MiB each time would dominate), emptied here.
inline android::sp<RingBuffer> freshRing() {
    static android::sp<RingBuffer> ring = [] {
        setTraceLevel(TRACE_NONE);  // nothing is logged while fuzzing
        android::sp<RingBuffer> r = new RingBuffer();
        r->configure("FuzzPES", 20);
        return r;
    }();
    ring->reset();
    return ring;
}

inline void writeRecord(RingBuffer& ring, const uint8_t* es, uint32_t size, bool lie,
                        uint64_t pts) {
    const uint32_t recordSize = PESData::kHeaderSize + size;
    if (ring.freeSpace() < RingBuffer::roundUp4(recordSize) ||
        !ring.waitForSpace(RingBuffer::roundUp4(recordSize))) {
        return;
    }
    auto* record = new (ring.writePointer()) PESData();
    record->mSize = recordSize;
    record->mOffsetES = PESData::kHeaderSize;
    record->mSizeES = lie ? size * 7 + 1000 : size;
    record->mPTS = pts;
    std::memcpy(record->pesBytes(), es, size);  // `es` is inside the input: never null
    ring.commitWrite(recordSize);
}

// Writes the records found in data[at..size) one by one, `ptsStep` apart, calling
// afterEach() after each; stops early when it returns false.
template <typename AfterEach>
void feedRecords(RingBuffer& ring, const uint8_t* data, size_t size, size_t at, uint64_t ptsStep,
                 AfterEach afterEach) {
    for (uint64_t pts = 0; at + 2 <= size; pts += ptsStep) {
        const bool lie = (data[at] & 0x80) != 0;
        uint32_t length = ((data[at] & 0x7F) << 8) | data[at + 1];
        at += 2;
        length = std::min(length, static_cast<uint32_t>(size - at));
        writeRecord(ring, data + at, length, lie, pts);
        at += length;
        if (!afterEach()) {
            return;
        }
    }
}

// One call for a unit; a unit that does not fit the output is the fault looked for.
inline unsigned int pullUnit(MediaExtractor& extractor, std::vector<uint8_t>& output) {
    unsigned long length = 0;
    long long pts = 0;
    unsigned char flags = 0;
    const unsigned int result =
        extractor.getDecodableUnit(output.data(), output.size(), &length, &pts, &flags);
    if (length > output.size()) {
        std::abort();
    }
    return result;
}

// Drains what the ring holds (so that it never fills and no call waits on an empty
// ring); false when the extractor keeps a record it cannot finish.
inline bool drainRing(MediaExtractor& extractor, RingBuffer& ring, std::vector<uint8_t>& output) {
    for (int calls = 0; calls < 4096; ++calls) {
        if (pullUnit(extractor, output) != 0 || ring.usedSpace() == 0) {
            break;
        }
    }
    return ring.usedSpace() == 0;
}

}  // namespace TavoPlayer::fuzz
