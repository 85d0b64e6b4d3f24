// MediaCodecBuffer: one input or output buffer of the platform codec. The codec owns
// the bytes; a buffer's object stays the same for the codec's lifetime, so a client
// may keep the vector it got from getInputBuffers/getOutputBuffers (and reads base()
// each time it owns the buffer: the bytes may move when the codec refills it).
//
// The bytes can be shared (share()) with whoever must keep a picture after the
// buffer goes back to the codec, such as the surface that shows it; a shared block
// is never written again: the codec's next refill takes another block, from a pool
// shared by the codec's buffers, to which a block goes back once its last holder
// lets it go (so that steady playback neither allocates nor faults in new pages).
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <vector>

#include <utils/Errors.h>
#include <utils/RefBase.h>

namespace android {

// Blocks of bytes kept for reuse once their last holder lets them go. Blocks may
// outlive the pool (a surface may keep a picture after the codec is gone).
class ByteBlockPool : public std::enable_shared_from_this<ByteBlockPool> {
public:
    // Keeps at most `keep` free blocks.
    explicit ByteBlockPool(size_t keep) : mKeep(keep) {}
    // A block of `size` bytes, uninitialised (a reused one keeps old contents).
    std::shared_ptr<uint8_t[]> take(size_t size);
    size_t freeBlocks() const;

private:
    struct Block {
        std::unique_ptr<uint8_t[]> bytes;
        size_t size;
    };
    void giveBack(uint8_t* bytes, size_t size);

    const size_t mKeep;
    mutable std::mutex mLock;
    std::vector<Block> mFree;
};

class MediaCodecBuffer : public RefBase {
public:
    // `capacity` usable bytes followed by `padding` zeroed bytes that decoders may
    // read past the end of a unit. With a pool, the blocks of ensureCapacity come
    // from it.
    MediaCodecBuffer(size_t capacity, size_t padding,
                     std::shared_ptr<ByteBlockPool> pool = nullptr);

    uint8_t* base() { return mData.get(); }
    uint8_t* data() { return mData.get() + mOffset; }
    size_t capacity() const { return mCapacity; }
    size_t size() const { return mSize; }
    size_t offset() const { return mOffset; }
    // BAD_VALUE when the range leaves the buffer.
    status_t setRange(size_t offset, size_t size);

    // Only the codec calls this, while it owns the buffer: makes room for at least
    // `capacity` bytes (contents not kept), in a block of its own when the current
    // one is shared, and empties the range.
    void ensureCapacity(size_t capacity);

    // A reference that keeps the current bytes alive and unchanged.
    std::shared_ptr<const void> share() const { return mData; }
    // Whether someone besides the buffer holds its bytes.
    bool shared() const { return mData.use_count() > 1; }

private:
    void allocate(size_t capacity);

    const std::shared_ptr<ByteBlockPool> mPool;
    std::shared_ptr<uint8_t[]> mData;
    size_t mCapacity;
    size_t mPadding;
    size_t mOffset = 0;
    size_t mSize = 0;
};

}  // namespace android
