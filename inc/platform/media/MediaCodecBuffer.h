// MediaCodecBuffer: one input or output buffer of the platform codec. The codec owns
// the bytes; a buffer's object stays the same for the codec's lifetime, so a client
// may keep the vector it got from getInputBuffers/getOutputBuffers.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

#include <utils/Errors.h>
#include <utils/RefBase.h>

namespace android {

class MediaCodecBuffer : public RefBase {
public:
    // `capacity` usable bytes followed by `padding` zeroed bytes that decoders may
    // read past the end of a unit.
    MediaCodecBuffer(size_t capacity, size_t padding);

    uint8_t* base() { return mData.get(); }
    uint8_t* data() { return mData.get() + mOffset; }
    size_t capacity() const { return mCapacity; }
    size_t size() const { return mSize; }
    size_t offset() const { return mOffset; }
    // BAD_VALUE when the range leaves the buffer.
    status_t setRange(size_t offset, size_t size);

    // Only the codec calls this, while it owns the buffer: makes room for at least
    // `capacity` bytes (contents not kept) and empties the range.
    void ensureCapacity(size_t capacity);

private:
    std::unique_ptr<uint8_t[]> mData;
    size_t mCapacity;
    size_t mPadding;
    size_t mOffset = 0;
    size_t mSize = 0;
};

}  // namespace android
