#include "common/data/VideoFrameData.h"

#include <cstddef>
#include <cstdio>
#include <cstring>

#include "platform/gui/GraphicBuffer.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Winvalid-offsetof"
static_assert(offsetof(VideoFrameData, mType) == 8);
static_assert(offsetof(VideoFrameData, mSize) == 12);
static_assert(offsetof(VideoFrameData, mPTS) == 16);
static_assert(offsetof(VideoFrameData, mColorFormat) == 24);
static_assert(offsetof(VideoFrameData, mBufferIndex) == 28);
static_assert(offsetof(VideoFrameData, mGraphicBuffer) == 32);
static_assert(offsetof(VideoFrameData, mListener) == 40);
static_assert(offsetof(VideoFrameData, mFlag) == 48);
static_assert(offsetof(VideoFrameData, mReserved) == 56);
static_assert(offsetof(VideoFrameData, mCropWidth) == 64);
static_assert(offsetof(VideoFrameData, mCropHeight) == 68);
static_assert(offsetof(VideoFrameData, mReserved2) == 72);
static_assert(sizeof(VideoFrameData) == VideoFrameData::kRecordSize);
#pragma GCC diagnostic pop

std::string VideoFrameData::toString() {
    char buffer[kToStringBufferSize] = {};
    appendLine(buffer, "mType = %u\n", mType);
    appendLine(buffer, "mSize = %u\n", mSize);
    appendLine(buffer, "mPTS = %lu\n", static_cast<unsigned long>(mPTS));
    return buffer;
}

bool VideoFrameData::fromString(char* text) {
    if (text == nullptr)
        return false;
    unsigned long long pts = mPTS;
    // The trailing "lu" does not match toString() output, but all three fields are
    // assigned before that point, so the round trip succeeds for this record.
    const int assigned =
        sscanf(text, "mType = %u\nmSize = %u\nmPTS = %llulu\n", &mType, &mSize, &pts);
    if (assigned >= 3)
        mPTS = pts;
    return assigned == 3;
}

int VideoFrameData::getRaw(unsigned char** data, unsigned int* size) {
    if (mGraphicBuffer == nullptr) {
        *data = reinterpret_cast<unsigned char*>(this) + kRecordSize;
        *size = mSize - kRecordSize;
        return 0;
    }
    void* mapped = nullptr;
    const int status = mGraphicBuffer->lock(GraphicBuffer::USAGE_SW_READ_OFTEN, &mapped);
    if (status != 0 || mapped == nullptr) {
        *data = nullptr;
        *size = 0;
        return status != 0 ? status : -1;
    }
    const size_t bytes = mGraphicBuffer->getByteSize();
    auto* copy = new unsigned char[bytes];
    memcpy(copy, mapped, bytes);
    mGraphicBuffer->unlock();
    *data = copy;
    *size = static_cast<unsigned int>(bytes);
    return status;
}

}  // namespace TavoPlayer

namespace TavoPlayer {

namespace {

inline int clampByte(int value) {
    return value < 0 ? 0 : (value > 255 ? 255 : value);
}

}  // namespace

int VideoFrameData::convertFrameFromYvuToRgba(unsigned char* source, int* destination,
                                              unsigned int width, unsigned int height,
                                              int colorFormat, unsigned int stride) {
    TAVO_LOGI("Entering %s... colorSpace = 0x%x, width = %d, height = %d, stride = %d\n", __func__,
              colorFormat, width, height, stride);
    size_t cbStart = 0;
    size_t crStart = 0;
    size_t chromaStep = 0;
    size_t chromaStride = 0;
    const size_t lumaBytes = static_cast<size_t>(stride) * height;
    switch (colorFormat) {
        case kColorFormatYUV420SemiPlanar:
        case kColorFormatYUV420SemiPlanarAlt:
            // Cb at even and Cr at odd offsets of one interleaved plane. The chroma
            // rows are taken as the stride rounded up to 16, the luma rows as the
            // stride itself: intended, for decoder buffers 16 pixels wide per block.
            cbStart = lumaBytes;
            crStart = lumaBytes + 1;
            chromaStep = 2;
            chromaStride = (static_cast<size_t>(stride) + 15) & ~static_cast<size_t>(15);
            break;
        case kColorFormatYV12:
            chromaStride = (static_cast<size_t>(stride / 2) + 15) & ~static_cast<size_t>(15);
            crStart = lumaBytes;
            cbStart = lumaBytes + (chromaStride * height) / 2;
            chromaStep = 1;
            break;
        default:
            TAVO_LOGE("%s: Color format not supported\n", __func__);
            return 1;
    }
    if (static_cast<uint64_t>(width) * height < 1)
        return 0;
    const unsigned char* luma = source;
    const unsigned char* cb = source + cbStart;
    const unsigned char* cr = source + crStart;
    for (unsigned int y = 0; y < height; y += 2) {
        int* row0 = destination + static_cast<size_t>(y) * width;
        int* row1 = y + 1 < height ? row0 + width : nullptr;
        for (unsigned int x = 0; x < width; x += 2) {
            const size_t c = (x / 2) * chromaStep;
            const int u = cb[c] - 128;
            const int v = cr[c] - 128;
            // Full-range BT.601 (ITU-R BT.601 factors 1.402, 0.344, 0.714, 1.772)
            // in 10-bit fixed point; the exact integers are part of the output.
            const int dR = (1435 * v) >> 10;
            const int dG = (352 * u + 731 * v) >> 10;
            const int dB = (1814 * u) >> 10;
            const auto pixel = [&](int luminance) {
                return static_cast<int>(0xFF000000u |
                                        static_cast<uint32_t>(clampByte(luminance + dR)) << 16 |
                                        static_cast<uint32_t>(clampByte(luminance - dG)) << 8 |
                                        static_cast<uint32_t>(clampByte(luminance + dB)));
            };
            const unsigned int columns = x + 1 < width ? 2 : 1;
            for (unsigned int i = 0; i < columns; ++i) {
                row0[x + i] = pixel(luma[x + i]);
                if (row1 != nullptr)
                    row1[x + i] = pixel(luma[stride + x + i]);
            }
        }
        luma += 2 * static_cast<size_t>(stride);
        cb += chromaStride;
        cr += chromaStride;
    }
    return 0;
}

}  // namespace TavoPlayer
