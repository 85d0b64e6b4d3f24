// Fuzz target for the MPEG audio extractor: the input is cut into PES records that go
// through a ring into MP3MediaExtractor. Every frame delivered must lie inside the
// output buffer, and a frame held across records must come out whole or not at all.
//
// Input layout: byte 0 picks the output size; then the records.
#include "ExtractorFuzzHarness.h"
#include "decoder/MP3MediaExtractor.h"

using namespace TavoPlayer;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1) {
        return 0;
    }
    android::sp<RingBuffer> ring = fuzz::freshRing();
    std::vector<uint8_t> output(64 + static_cast<size_t>(data[0]) * 64);
    android::sp<MP3MediaExtractor> extractor = new MP3MediaExtractor(ring);
    fuzz::feedRecords(*ring, data, size, 1, 2160,
                      [&] { return fuzz::drainRing(*extractor, *ring, output); });
    extractor->reset();
    return 0;
}
