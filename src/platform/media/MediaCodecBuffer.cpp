#include "platform/media/MediaCodecBuffer.h"

#include <cstring>

namespace android {

std::shared_ptr<uint8_t[]> ByteBlockPool::take(size_t size) {
    std::unique_ptr<uint8_t[]> bytes;
    {
        std::lock_guard<std::mutex> lock(mLock);
        for (auto it = mFree.begin(); it != mFree.end(); ++it) {
            if (it->size == size) {
                bytes = std::move(it->bytes);
                mFree.erase(it);
                break;
            }
        }
        // Blocks of another size belong to pictures of a format no longer decoded.
        if (bytes == nullptr)
            mFree.clear();
    }
    if (bytes == nullptr) {
        // Left uninitialised: the pages of a large block cost memory only once used.
        bytes = std::make_unique_for_overwrite<uint8_t[]>(size);
    }
    std::weak_ptr<ByteBlockPool> weak = weak_from_this();
    return std::shared_ptr<uint8_t[]>(bytes.release(), [weak, size](uint8_t* released) {
        if (const std::shared_ptr<ByteBlockPool> pool = weak.lock())
            pool->giveBack(released, size);
        else
            delete[] released;
    });
}

void ByteBlockPool::giveBack(uint8_t* bytes, size_t size) {
    std::unique_ptr<uint8_t[]> owned(bytes);
    std::lock_guard<std::mutex> lock(mLock);
    if (mFree.size() < mKeep)
        mFree.push_back(Block{std::move(owned), size});
}

size_t ByteBlockPool::freeBlocks() const {
    std::lock_guard<std::mutex> lock(mLock);
    return mFree.size();
}

MediaCodecBuffer::MediaCodecBuffer(size_t capacity, size_t padding,
                                   std::shared_ptr<ByteBlockPool> pool)
    : mPool(std::move(pool)), mCapacity(capacity), mPadding(padding) {
    allocate(capacity);
}

void MediaCodecBuffer::allocate(size_t capacity) {
    if (mPool != nullptr && capacity + mPadding > 0) {
        mData = mPool->take(capacity + mPadding);
    } else {
        // Left uninitialised: the pages of a large buffer cost memory only once used.
        mData = std::make_shared_for_overwrite<uint8_t[]>(capacity + mPadding);
    }
    memset(mData.get() + capacity, 0, mPadding);
    mCapacity = capacity;
}

status_t MediaCodecBuffer::setRange(size_t offset, size_t size) {
    if (offset > mCapacity || size > mCapacity - offset)
        return BAD_VALUE;
    mOffset = offset;
    mSize = size;
    return OK;
}

void MediaCodecBuffer::ensureCapacity(size_t capacity) {
    if (capacity > mCapacity || shared())
        allocate(capacity > mCapacity ? capacity : mCapacity);
    mOffset = 0;
    mSize = 0;
}

}  // namespace android
