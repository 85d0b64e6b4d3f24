#include "platform/gui/SinkSurface.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/Uint33.h"
#include "platform/os/Trace.h"

namespace android {

// Pictures released by every holder come back here for reuse, so that a steady
// stream of pictures of one size allocates nothing. The pool is shared with the
// pictures' deleters, since a capture may hold a picture after the surface is gone.
class SinkSurface::PicturePool : public std::enable_shared_from_this<PicturePool> {
public:
    std::shared_ptr<SinkPicture> take() {
        std::unique_ptr<SinkPicture> picture;
        {
            std::lock_guard<std::mutex> lock(mLock);
            if (!mFree.empty()) {
                picture = std::move(mFree.back());
                mFree.pop_back();
            }
        }
        if (picture == nullptr)
            picture = std::make_unique<SinkPicture>();
        std::weak_ptr<PicturePool> weak = weak_from_this();
        return std::shared_ptr<SinkPicture>(picture.release(), [weak](SinkPicture* released) {
            if (const std::shared_ptr<PicturePool> pool = weak.lock()) {
                pool->giveBack(released);
            } else {
                delete released;
            }
        });
    }

private:
    void giveBack(SinkPicture* picture) {
        std::unique_ptr<SinkPicture> owned(picture);
        std::lock_guard<std::mutex> lock(mLock);
        if (mFree.size() < kPoolSize)
            mFree.push_back(std::move(owned));
    }

    std::mutex mLock;
    std::vector<std::unique_ptr<SinkPicture>> mFree;
};

// A dequeued buffer: a reference to one shown picture, mapped as NV12.
class SinkSurface::Buffer : public ANativeWindowBuffer {
public:
    explicit Buffer(std::shared_ptr<const SinkPicture> picture) : mPicture(std::move(picture)) {}

    int lockYCbCr(uint32_t /*usage*/, const Rect& bounds, android_ycbcr* ycbcr) override {
        const SinkPicture& p = *mPicture;
        if (ycbcr == nullptr || bounds.left < 0 || bounds.top < 0 || bounds.right > p.width ||
            bounds.bottom > p.height || bounds.left >= bounds.right ||
            bounds.top >= bounds.bottom) {
            return -EINVAL;
        }
        if (mLocked)
            return -EBUSY;
        // A whole packed picture is mapped in place; anything else (a part, or
        // planes shared with the codec, rows apart by its stride) is packed first.
        if (p.storage == nullptr && bounds.left == 0 && bounds.top == 0 &&
            bounds.right == p.width && bounds.bottom == p.height) {
            mapPlanes(p.y(), p.uv(), static_cast<size_t>(p.width), ycbcr);
        } else {
            packSubRectangle(bounds, ycbcr);
        }
        mLocked = true;
        return 0;
    }

    int unlock() override {
        if (!mLocked)
            return -EINVAL;
        mLocked = false;
        return 0;
    }

private:
    static void mapPlanes(const uint8_t* y, const uint8_t* uv, size_t stride,
                          android_ycbcr* ycbcr) {
        ycbcr->y = const_cast<uint8_t*>(y);
        ycbcr->cb = const_cast<uint8_t*>(uv);
        ycbcr->cr = const_cast<uint8_t*>(uv + 1);
        ycbcr->ystride = stride;
        ycbcr->cstride = stride;
        ycbcr->chroma_step = 2;
    }

    // The rectangle is copied out, packed like a whole picture, so that a reader
    // may take the planes as contiguous rows of the rectangle's width.
    void packSubRectangle(const Rect& bounds, android_ycbcr* ycbcr) {
        const SinkPicture& p = *mPicture;
        const int32_t left = bounds.left & ~1;
        const int32_t top = bounds.top & ~1;
        const size_t width = static_cast<size_t>(bounds.right - left);
        const size_t height = static_cast<size_t>(bounds.bottom - top);
        const size_t chromaWidth = (width + 1) & ~size_t{1};
        const size_t chromaRows = (height + 1) / 2;
        mScratch.assign(width * height + chromaWidth * chromaRows, 0);
        const size_t yStride = static_cast<size_t>(p.lumaStride());
        const size_t uvStride = static_cast<size_t>(p.chromaStride());
        for (size_t row = 0; row < height; ++row)
            memcpy(&mScratch[row * width], p.y() + (top + row) * yStride + left, width);
        uint8_t* uv = mScratch.data() + width * height;
        const size_t chromaCopy = std::min(chromaWidth, static_cast<size_t>(p.width - left));
        for (size_t row = 0; row < chromaRows; ++row)
            memcpy(uv + row * chromaWidth, p.uv() + (top / 2 + row) * uvStride + left, chromaCopy);
        mapPlanes(mScratch.data(), uv, width, ycbcr);
        ycbcr->cstride = chromaWidth;
    }

    std::shared_ptr<const SinkPicture> mPicture;
    std::vector<uint8_t> mScratch;
    bool mLocked = false;
};

SinkSurface::SinkSurface(const std::string& logPath,
                         const std::function<std::unique_ptr<VideoSink>(ShowLog&)>& makeSink)
    : mPool(std::make_shared<PicturePool>()), mLog(std::make_unique<ShowLog>(logPath)) {
    mSink = makeSink(*mLog);
}

SinkSurface::~SinkSurface() {
    // The sink goes first: a window thread may still record into the log.
    mSink.reset();
    for (ANativeWindowBuffer* buffer : mDequeued)
        delete buffer;
}

int SinkSurface::showPicture(const SurfacePicture& picture) {
    return show(picture, nullptr);
}

int SinkSurface::showSharedPicture(const SurfacePicture& picture,
                                   std::shared_ptr<const void> storage) {
    return show(picture, std::move(storage));
}

int SinkSurface::show(const SurfacePicture& picture, std::shared_ptr<const void> storage) {
    if (mSink == nullptr)
        return -ENODEV;
    // NV12, or planar chroma (Cb and Cr planes of half the width) kept as decoded.
    const bool planar = picture.uv == nullptr && picture.cb != nullptr && picture.cr != nullptr;
    if (picture.y == nullptr || picture.width < 2 || picture.height < 2 ||
        picture.yStride < picture.width ||
        (planar ? picture.cStride < (picture.width + 1) / 2
                : picture.uv == nullptr || picture.uvStride < picture.width)) {
        return -EINVAL;
    }
    android_native_rect_t crop{0, 0, picture.width, picture.height};
    {
        std::lock_guard<std::mutex> lock(mLock);
        if (mHasCrop)
            crop = mCrop;
    }
    // ITU-T H.264, 7.4.2.1.1: 4:2:0 crops come in units of two samples, so every
    // edge is even; one that is not is moved inwards, so that each shown chroma
    // pair is whole. A crop outside the picture shows the whole picture.
    int32_t left = std::clamp(crop.left, 0, picture.width);
    int32_t top = std::clamp(crop.top, 0, picture.height);
    const int32_t right = std::clamp(crop.right, left, picture.width);
    const int32_t bottom = std::clamp(crop.bottom, top, picture.height);
    left = (left + 1) & ~1;
    top = (top + 1) & ~1;
    int32_t width = (right - left) & ~1;
    int32_t height = (bottom - top) & ~1;
    if (width < 2 || height < 2) {
        left = 0;
        top = 0;
        width = picture.width & ~1;
        height = picture.height & ~1;
    }

    std::shared_ptr<SinkPicture> shown =
        storage != nullptr ? std::make_shared<SinkPicture>() : mPool->take();
    shown->width = width;
    shown->height = height;
    shown->ptsUs = picture.ptsUs;
    // The same conversion as the decoder's records: microseconds x 9 / 100.
    shown->pts90k = TavoPlayer::mask33(static_cast<uint64_t>(picture.ptsUs * 9 / 100));
    shown->interlaced = picture.interlaced;
    shown->topFieldFirst = picture.topFieldFirst;
    const uint8_t* cropY = picture.y + static_cast<size_t>(top) * picture.yStride + left;
    const size_t chromaOffset = static_cast<size_t>(top / 2) * picture.cStride + left / 2;
    const uint8_t* cropCb = planar ? picture.cb + chromaOffset : nullptr;
    const uint8_t* cropCr = planar ? picture.cr + chromaOffset : nullptr;
    const uint8_t* cropUV =
        planar ? nullptr : picture.uv + static_cast<size_t>(top / 2) * picture.uvStride + left;
    if (storage != nullptr) {
        // The planes stay unchanged while referenced: no copy, the crop is where the
        // picture starts and its rows are the codec's.
        shown->storage = std::move(storage);
        shown->sharedY = cropY;
        shown->sharedUV = cropUV;
        shown->yStride = picture.yStride;
        shown->uvStride = picture.uvStride;
        if (planar) {
            shown->planarChroma = std::make_shared<const PlanarChroma>(
                cropCb, cropCr, picture.cStride, width / 2, height / 2);
        }
    } else {
        shown->data.resize(shown->byteSize());
        uint8_t* y = shown->data.data();
        for (int32_t row = 0; row < height; ++row) {
            memcpy(y + static_cast<size_t>(row) * width,
                   cropY + static_cast<size_t>(row) * picture.yStride, width);
        }
        uint8_t* uv = y + static_cast<size_t>(width) * height;
        if (planar) {
            PlanarChroma::interleave(cropCb, cropCr, picture.cStride, width / 2, height / 2, uv,
                                     width);
        } else {
            for (int32_t row = 0; row < height / 2; ++row) {
                memcpy(uv + static_cast<size_t>(row) * width,
                       cropUV + static_cast<size_t>(row) * picture.uvStride, width);
            }
        }
    }

    std::shared_ptr<const SinkPicture> published = std::move(shown);
    {
        std::lock_guard<std::mutex> lock(mLock);
        mLast = published;
    }
    return mSink->show(published);
}

int SinkSurface::setCrop(const android_native_rect_t* crop) {
    std::lock_guard<std::mutex> lock(mLock);
    // A null crop shows whole pictures again, as on the platform.
    mHasCrop = crop != nullptr;
    if (crop != nullptr)
        mCrop = *crop;
    return 0;
}

int SinkSurface::dequeueBuffer(ANativeWindowBuffer** buffer) {
    if (buffer == nullptr)
        return -EINVAL;
    std::lock_guard<std::mutex> lock(mLock);
    if (mLast == nullptr)
        return -ENODATA;
    auto* dequeued = new Buffer(mLast);
    mDequeued.insert(dequeued);
    *buffer = dequeued;
    return 0;
}

int SinkSurface::queueBuffer(ANativeWindowBuffer* buffer, int fenceFd) {
    // The fence is ours once queued, whatever happens to the buffer.
    if (fenceFd >= 0)
        close(fenceFd);
    std::lock_guard<std::mutex> lock(mLock);
    if (mDequeued.erase(buffer) == 0)
        return -EINVAL;
    delete buffer;
    return 0;
}

std::shared_ptr<const SinkPicture> SinkSurface::lastPicture() const {
    std::lock_guard<std::mutex> lock(mLock);
    return mLast;
}

size_t SinkSurface::dequeuedCount() const {
    std::lock_guard<std::mutex> lock(mLock);
    return mDequeued.size();
}

}  // namespace android
