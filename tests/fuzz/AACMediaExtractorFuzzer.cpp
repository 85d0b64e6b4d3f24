// Fuzz target for the AAC extractor: the input is cut into PES records that go
// through a ring into AACMediaExtractor, opened as LOAS or ADTS (it may switch). Every
// unit delivered must fit the output buffer; records whose stated ES size runs past
// their end must never be read beyond it (the address sanitizer watches).
//
// Input layout: byte 0 bit 0 picks ADTS (1) or LOAS (0), bit 1 calls reset() after
// every record, the other bits the output size; then records, each a 2-byte
// big-endian length (top bit: state an ES size far beyond the record) and that many
// ES bytes.
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <new>
#include <vector>

#include "common/RingBuffer.h"
#include "common/data/PESData.h"
#include "decoder/AACMediaExtractor.h"
#include "platform/os/Trace.h"

namespace {

using TavoPlayer::AACMediaExtractor;
using TavoPlayer::PESData;
using TavoPlayer::RingBuffer;

android::sp<RingBuffer> sharedRing() {
    static android::sp<RingBuffer> ring = [] {
        TavoPlayer::setTraceLevel(0xFFFFFFFFu);  // level "none": nothing is logged while fuzzing
        android::sp<RingBuffer> r = new RingBuffer();
        r->configure("FuzzAACPES", 20);
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
    const auto layer = (data[0] & 1) ? AACMediaExtractor::TRANSPORT_LAYER_ADTS
                                     : AACMediaExtractor::TRANSPORT_LAYER_LOAS;
    const bool resetEachRecord = (data[0] & 2) != 0;
    const size_t outputSize = 4 + static_cast<size_t>(data[0] >> 2) * 48;
    std::vector<uint8_t> output(outputSize);
    {
        android::sp<AACMediaExtractor> extractor = new AACMediaExtractor(ring, layer);
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
            pts += 1920;
            // Drain while records are readable, so that no call waits on an empty ring.
            for (int calls = 0; calls < 100000 && ring->usedSpace() != 0; ++calls) {
                unsigned long unitLength = 0;
                long long unitPts = 0;
                unsigned char flags = 0;
                const unsigned int result = extractor->getDecodableUnit(
                    output.data(), output.size(), &unitLength, &unitPts, &flags);
                if (unitLength > output.size() || result == 1) {
                    std::abort();
                }
            }
            if (resetEachRecord) {
                extractor->reset();
            }
        }
    }
    return 0;
}
