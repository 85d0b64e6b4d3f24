// Fuzz target for the H.264 extractor: the input is cut into PES records that go
// through a ring into H264MediaExtractor, and is also handed whole to the SPS and SEI
// decoders. Every unit delivered must lie inside the output buffer.
//
// Input layout: byte 0 picks the output size; then records, each a 2-byte big-endian
// length (top bit: write the record with a stated ES size far beyond the record) and
// that many ES bytes.
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <vector>

#include "common/RingBuffer.h"
#include "common/data/PESData.h"
#include "decoder/H264MediaExtractor.h"
#include "platform/os/Trace.h"

namespace {

using TavoPlayer::PESData;
using TavoPlayer::RingBuffer;

android::sp<RingBuffer> sharedRing() {
    static android::sp<RingBuffer> ring = [] {
        TavoPlayer::setTraceLevel(TavoPlayer::TRACE_NONE);  // nothing is logged while fuzzing
        android::sp<RingBuffer> r = new RingBuffer();
        r->configure("FuzzPES", 20);
        return r;
    }();
    return ring;
}

void writeRecord(RingBuffer& ring, const uint8_t* es, uint32_t size, bool lie, uint64_t pts) {
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
    if (size > 0) {
        std::memcpy(record->pesBytes(), es, size);
    }
    ring.commitWrite(recordSize);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1) {
        return 0;
    }
    android::sp<RingBuffer> ring = sharedRing();
    ring->reset();
    const size_t outputSize = 64 + static_cast<size_t>(data[0]) * 64;
    std::vector<uint8_t> output(outputSize);
    {
        android::sp<TavoPlayer::H264MediaExtractor> extractor =
            new TavoPlayer::H264MediaExtractor(ring);
        // The parsers on the raw bytes, from an exact-size copy.
        std::unique_ptr<uint8_t[]> copy(new uint8_t[size]);
        std::memcpy(copy.get(), data, size);
        extractor->decodeSPS(copy.get(), size, true);
        extractor->decodeSEI(copy.get(), size, true);

        size_t at = 1;
        uint64_t pts = 0;
        while (at + 2 <= size) {
            const bool lie = (data[at] & 0x80) != 0;
            uint32_t length = ((data[at] & 0x7F) << 8) | data[at + 1];
            at += 2;
            if (length > size - at) {
                length = static_cast<uint32_t>(size - at);
            }
            writeRecord(*ring, data + at, length, lie, pts);
            at += length;
            pts += 3003;
            // Drain what is there, so that the ring never fills.
            for (int calls = 0; calls < 4096; ++calls) {
                unsigned long length = 0;
                long long unitPts = 0;
                unsigned char flags = 0;
                const unsigned int result = extractor->getDecodableUnit(
                    output.data(), output.size(), &length, &unitPts, &flags);
                if (length > output.size()) {
                    std::abort();
                }
                if (result != 0 || ring->usedSpace() == 0) {
                    break;
                }
            }
            if (ring->usedSpace() != 0) {
                break;  // the extractor is holding a record it cannot finish: stop here
            }
        }
        extractor->reset();
    }
    return 0;
}
