// Fuzz target for the AAC extractor: the input is cut into PES records that go
// through a ring into AACMediaExtractor, opened as LOAS or ADTS (it may switch). Every
// unit delivered must fit the output buffer; records whose stated ES size runs past
// their end must never be read beyond it (the address sanitizer watches).
//
// Input layout: byte 0 bit 0 picks ADTS (1) or LOAS (0), bit 1 calls reset() after
// every record, the other bits the output size; then the records.
#include "ExtractorFuzzHarness.h"
#include "decoder/AACMediaExtractor.h"

using namespace TavoPlayer;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1) {
        return 0;
    }
    android::sp<RingBuffer> ring = fuzz::freshRing();
    const auto layer = (data[0] & 1) ? AACMediaExtractor::TRANSPORT_LAYER_ADTS
                                     : AACMediaExtractor::TRANSPORT_LAYER_LOAS;
    const bool resetEachRecord = (data[0] & 2) != 0;
    std::vector<uint8_t> output(4 + static_cast<size_t>(data[0] >> 2) * 48);
    android::sp<AACMediaExtractor> extractor = new AACMediaExtractor(ring, layer);
    fuzz::feedRecords(*ring, data, size, 1, 1920, [&] {
        // Drain while records are readable; a ring fault here means a record was
        // written badly or the read position was lost.
        for (int calls = 0; calls < 100000 && ring->usedSpace() != 0; ++calls) {
            if (fuzz::pullUnit(*extractor, output) == MediaExtractor::RESULT_RING_FAULT) {
                std::abort();
            }
        }
        if (resetEachRecord) {
            extractor->reset();
        }
        return true;
    });
    return 0;
}
