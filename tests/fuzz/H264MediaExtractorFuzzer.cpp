// Fuzz target for the H.264 extractor: the input is cut into PES records that go
// through a ring into H264MediaExtractor, and is also handed whole to the SPS and SEI
// decoders. Every unit delivered must lie inside the output buffer.
//
// Input layout: byte 0 picks the output size; then the records.
#include <memory>

#include "ExtractorFuzzHarness.h"
#include "decoder/H264MediaExtractor.h"

using namespace TavoPlayer;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1) {
        return 0;
    }
    android::sp<RingBuffer> ring = fuzz::freshRing();
    std::vector<uint8_t> output(64 + static_cast<size_t>(data[0]) * 64);
    android::sp<H264MediaExtractor> extractor = new H264MediaExtractor(ring);
    // The parsers on the raw bytes, from an exact-size copy.
    std::unique_ptr<uint8_t[]> copy(new uint8_t[size]);
    std::memcpy(copy.get(), data, size);
    extractor->decodeSPS(copy.get(), size, true);
    extractor->decodeSEI(copy.get(), size, true);
    fuzz::feedRecords(*ring, data, size, 1, 3003,
                      [&] { return fuzz::drainRing(*extractor, *ring, output); });
    extractor->reset();
    return 0;
}
