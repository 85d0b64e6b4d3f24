// Surface: where decoded pictures are shown. The platform codec hands each
// rendered picture to its surface; the sink behind it (an SDL2 window, a
// YUV4MPEG2 file or nothing at all) is chosen by the property
// tavoplayer.video.sink. The surface is also the native window that the frame
// capture dequeues the most recently shown picture from.
//
// This header is the contract between the codec and capture on one side and the
// surface on the other: the codec uses Surface::showSharedPicture (or
// showPicture) and native_window_set_crop; the capture dequeues a buffer, maps it with
// GraphicBufferMapper::lockYCbCr and queues it back.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

namespace android {

struct android_native_rect_t {
    int32_t left;
    int32_t top;
    int32_t right;   // exclusive, as the platform's native-window crop is
    int32_t bottom;  // exclusive
};

// One decoded picture in NV12 (Y plane, then interleaved Cb/Cr pairs, Cb first).
// The planes belong to the caller and are valid only during showPicture.
struct SurfacePicture {
    const uint8_t* y;
    int32_t yStride;
    const uint8_t* uv;
    int32_t uvStride;
    int32_t width;  // coded size; the window's crop rectangle selects what is shown
    int32_t height;
    int64_t ptsUs;
    bool interlaced;
    bool topFieldFirst;
    // Planar chroma instead, when `uv` is null: the Cb and Cr planes, `cStride` bytes
    // a row, as a decoder gives them (only showSharedPicture takes such pictures).
    const uint8_t* cb = nullptr;
    const uint8_t* cr = nullptr;
    int32_t cStride = 0;
};

struct Rect {
    int32_t left;
    int32_t top;
    int32_t right;   // exclusive
    int32_t bottom;  // exclusive
};

// Where lockYCbCr puts a picture's planes; chroma_step 2 for interleaved chroma.
struct android_ycbcr {
    void* y;
    void* cb;
    void* cr;
    size_t ystride;
    size_t cstride;
    size_t chroma_step;
};

// A picture buffer of a native window, mappable for the CPU.
class ANativeWindowBuffer {
public:
    virtual ~ANativeWindowBuffer() = default;
    // 0 or a negative status; the planes stay valid until unlock().
    virtual int lockYCbCr(uint32_t usage, const Rect& bounds, android_ycbcr* ycbcr) = 0;
    virtual int unlock() = 0;
};

class ANativeWindow {
public:
    virtual ~ANativeWindow() = default;
    virtual int setCrop(const android_native_rect_t* crop) = 0;
    // Hands out a buffer holding the most recently shown picture; 0 or a negative
    // status. The buffer is the window's until queueBuffer gives it back.
    virtual int dequeueBuffer(ANativeWindowBuffer** buffer) = 0;
    // Gives a dequeued buffer back; fenceFd -1 for none. 0 or a negative status.
    virtual int queueBuffer(ANativeWindowBuffer* buffer, int fenceFd) = 0;
};

// The process-wide mapper of picture buffers, as the platform has one.
class GraphicBufferMapper {
public:
    static GraphicBufferMapper& get() {
        static GraphicBufferMapper mapper;
        return mapper;
    }
    int lockYCbCr(ANativeWindowBuffer* buffer, uint32_t usage, const Rect& bounds,
                  android_ycbcr* ycbcr) {
        return buffer->lockYCbCr(usage, bounds, ycbcr);
    }
    int unlock(ANativeWindowBuffer* buffer) { return buffer->unlock(); }
};

// Sets the rectangle of each picture that is shown; 0 or a negative status.
inline int native_window_set_crop(ANativeWindow* window, const android_native_rect_t* crop) {
    return window != nullptr ? window->setCrop(crop) : -22;  // -EINVAL, as the platform
}

class Surface : public ANativeWindow, public virtual RefBase {
public:
    // A surface on the sink named by tavoplayer.video.sink (sdl, y4m:PATH, null;
    // sdl by default when a display is present, null otherwise). Null on failure.
    static sp<Surface> create();

    // Shows `picture` now (the codec calls this when a buffer is rendered), copying
    // what the sink needs before returning. 0 or a negative status.
    virtual int showPicture(const SurfacePicture& picture) = 0;
    // Shows `picture` whose planes stay valid and unchanged for as long as anyone
    // holds `storage`: a surface may keep a reference instead of copying. This
    // default copies, as showPicture does (interleaving planar chroma first).
    virtual int showSharedPicture(const SurfacePicture& picture,
                                  std::shared_ptr<const void> storage);
};

}  // namespace android
