// CaptureFrameListener: receives a captured still picture. Called on the capture's
// own thread.
#pragma once

namespace TavoPlayer {

class CaptureFrameListener {
public:
    virtual ~CaptureFrameListener() = default;
    // `pixels` holds width x height 32-bit pixels 0xAARRGGBB (allocated with new[]);
    // ownership passes to the listener, which frees it with delete[]. `flag` false
    // means 4-byte pixels.
    virtual void onCaptureFrame(unsigned char* pixels, unsigned int width, unsigned int height,
                                bool flag) = 0;
};

}  // namespace TavoPlayer
