#include "platform/media/MediaCodecBuffer.h"

#include <cstring>

namespace android {

MediaCodecBuffer::MediaCodecBuffer(size_t capacity, size_t padding)
    : mCapacity(capacity), mPadding(padding) {
    // Left uninitialised: the pages of a large buffer cost memory only once used.
    mData = std::make_unique_for_overwrite<uint8_t[]>(capacity + padding);
    memset(mData.get() + capacity, 0, padding);
}

status_t MediaCodecBuffer::setRange(size_t offset, size_t size) {
    if (offset > mCapacity || size > mCapacity - offset)
        return BAD_VALUE;
    mOffset = offset;
    mSize = size;
    return OK;
}

void MediaCodecBuffer::ensureCapacity(size_t capacity) {
    if (capacity > mCapacity) {
        mData = std::make_unique_for_overwrite<uint8_t[]>(capacity + mPadding);
        memset(mData.get() + capacity, 0, mPadding);
        mCapacity = capacity;
    }
    mOffset = 0;
    mSize = 0;
}

}  // namespace android
