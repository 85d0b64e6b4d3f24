// Surface: where decoded pictures are shown. The platform codec hands each
// rendered picture to its surface; the sink behind it (an SDL2 window, a
// YUV4MPEG2 file or nothing at all) is chosen by the property
// tavoplayer.video.sink. The surface is also the native window that the frame
// capture dequeues the most recently shown picture from.
//
// This header is the contract between the codec and the surface: the codec uses
// Surface::showPicture and native_window_set_crop only.
#pragma once

#include <cstdint>

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
    int32_t width;   // coded size; the window's crop rectangle selects what is shown
    int32_t height;
    int64_t ptsUs;
    bool interlaced;
    bool topFieldFirst;
};

class ANativeWindow {
public:
    virtual ~ANativeWindow() = default;
    virtual int setCrop(const android_native_rect_t* crop) = 0;
};

// Sets the rectangle of each picture that is shown; 0 or a negative status.
int native_window_set_crop(ANativeWindow* window, const android_native_rect_t* crop);

class Surface : public ANativeWindow, public virtual RefBase {
public:
    // A surface on the sink named by tavoplayer.video.sink (sdl, y4m:PATH, null;
    // sdl by default when a display is present, null otherwise). Null on failure.
    static sp<Surface> create();

    // Shows `picture` now (the codec calls this when a buffer is rendered), copying
    // what the sink needs before returning. 0 or a negative status.
    virtual int showPicture(const SurfacePicture& picture) = 0;
};

}  // namespace android
