// ClosedCaptionDecoder::processPacket over arbitrary bytes taken as the elementary
// stream of one caption PES record, in an exact-size buffer so that the sanitizers
// see any read past the record. A fresh decoder per input, as each PES starts on an
// empty screen. A written caption must be at most three rows of 32 code points.
#include <cstdint>
#include <cstdlib>

#include "common/data/ClosedCaptionFragmentData.h"
#include "decoder/ClosedCaptionDecoder.h"
#include "platform/os/Trace.h"
#include "support/CaptionBuilder.h"

namespace {

android::sp<TavoPlayer::RingBuffer>* gOutput = nullptr;

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    setenv("TAVOPLAYER_LOG_LEVEL", "none", 0);
    OneSegPGL_InitializeDebug();
    gOutput = new android::sp<TavoPlayer::RingBuffer>(new TavoPlayer::RingBuffer());
    if ((*gOutput)->configureWithSize("CCRaw", 1 << 16) != 0)
        abort();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using TavoPlayer::ClosedCaptionDecoder;
    if (size > (1u << 16))
        return 0;
    TavoPlayer::test::OwnedPesRecord record(std::vector<uint8_t>(data, data + size), 12345);
    android::sp<ClosedCaptionDecoder> decoder = new ClosedCaptionDecoder();
    decoder->addOutput(*gOutput, nullptr);
    const unsigned int result = decoder->processPacket(record.get());
    TavoPlayer::RingBuffer& output = **gOutput;
    const bool written = output.usedSpace() > 0;
    if ((result == ClosedCaptionDecoder::RESULT_WRITTEN) != written)
        abort();
    if (written) {
        if (!output.waitForData(TavoPlayer::ClosedCaptionFragmentData::kHeaderSize))
            abort();
        auto* caption =
            reinterpret_cast<TavoPlayer::ClosedCaptionFragmentData*>(output.readPointer());
        const uint32_t textBytes = caption->mSize - 32;
        // Three rows of 32 code points and at most three line feeds.
        if (caption->mSize < 36 || textBytes > 4 * (3 * 33) || textBytes != decoder->getCCSize() ||
            caption->mPTS != 12345)
            abort();
        output.consume(caption->mSize);
    }
    return 0;
}
