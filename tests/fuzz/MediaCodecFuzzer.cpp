// Random access units through the platform codec, after a valid configuration: the
// first byte picks H.264 (after an SPS and PPS), AAC (after an AudioSpecificConfig)
// or MPEG audio; then units follow, each as a 16-bit big-endian length and its bytes.
// Every decoded buffer is taken and given back; the codec must survive anything.
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "platform/media/MediaCodec.h"

namespace {

// An SPS and PPS of a 64 x 64 stream (ITU-T H.264, 7.3.2.1 and 7.3.2.2).
const uint8_t kParameterSets[] = {0x00, 0x00, 0x01, 0x67, 0x4D, 0x40, 0x15, 0xE9, 0x88,
                                  0x9B, 0x01, 0x6A, 0x02, 0x02, 0x02, 0x80, 0x00, 0x01,
                                  0xF4, 0x80, 0x00, 0x75, 0x30, 0x0F, 0x8A, 0x14, 0x9C,
                                  0x00, 0x00, 0x01, 0x68, 0xDE, 0x3C, 0x80};
// AAC LC, 48 kHz, two channels (ISO/IEC 14496-3, 1.6.2.1).
const uint8_t kAudioSpecificConfig[] = {0x11, 0x90};

void drain(android::MediaCodec& codec, int64_t timeoutUs) {
    for (;;) {
        size_t index = 0, offset = 0, size = 0;
        int64_t timeUs = 0;
        uint32_t flags = 0;
        const android::status_t result =
            codec.dequeueOutputBuffer(&index, &offset, &size, &timeUs, &flags, timeoutUs);
        if (result == android::OK)
            codec.releaseOutputBuffer(index);
        else if (result != android::INFO_FORMAT_CHANGED &&
                 result != android::INFO_OUTPUT_BUFFERS_CHANGED)
            return;
    }
}

bool queue(android::MediaCodec& codec,
           const std::vector<android::sp<android::MediaCodecBuffer>>& buffers, const uint8_t* data,
           size_t size, int64_t timeUs, uint32_t flags) {
    size_t index = 0;
    for (int tries = 0; codec.dequeueInputBuffer(&index, 10000) != android::OK; ++tries) {
        if (tries > 100)
            return false;
        drain(codec, 0);
    }
    const size_t length = size < buffers[index]->capacity() ? size : buffers[index]->capacity();
    memcpy(buffers[index]->base(), data, length);
    return codec.queueInputBuffer(index, 0, length, timeUs, flags) == android::OK;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1)
        return 0;
    setenv("TAVOPLAYER_PROP_tavoplayer_codec_threads", "1", 1);
    setenv("TAVOPLAYER_LOG_LEVEL", "none", 0);
    android::sp<android::ALooper> looper = new android::ALooper();
    looper->setName("FuzzLoop");
    looper->start();
    const int kind = data[0] % 3;
    const char* mime = kind == 0 ? "video/avc" : kind == 1 ? "audio/mp4a-latm" : "audio/mpeg";
    android::sp<android::MediaCodec> codec = android::MediaCodec::CreateByType(looper, mime, false);
    android::sp<android::AMessage> format = new android::AMessage();
    if (codec == nullptr || codec->configure(format, nullptr, nullptr, 0) != android::OK ||
        codec->start() != android::OK)
        abort();
    std::vector<android::sp<android::MediaCodecBuffer>> buffers;
    codec->getInputBuffers(&buffers);
    if (kind == 0)
        queue(*codec, buffers, kParameterSets, sizeof(kParameterSets), 0, 0);
    if (kind == 1)
        queue(*codec, buffers, kAudioSpecificConfig, sizeof(kAudioSpecificConfig), 0,
              android::MediaCodec::BUFFER_FLAG_CODECCONFIG);
    int64_t timeUs = 0;
    for (size_t at = 1; at + 2 <= size;) {
        const size_t length = static_cast<size_t>(data[at] << 8 | data[at + 1]);
        at += 2;
        const size_t take = length < size - at ? length : size - at;
        if (!queue(*codec, buffers, data + at, take, timeUs += 33366, 0))
            break;
        at += take;
        drain(*codec, 0);
    }
    drain(*codec, 20000);
    codec->release();
    looper->stop();
    return 0;
}
