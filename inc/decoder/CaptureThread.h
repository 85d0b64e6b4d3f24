// MediaCodecDecoder::CaptureThread: one still capture. The decoder copies the
// surface's picture on the requesting thread (copyFrameContents); the thread then
// converts the copy to 32-bit pixels and hands them to the listener, once.
#pragma once

#include <cstdint>
#include <memory>

#include <utils/Thread.h>

#include "common/data/VideoFrameData.h"
#include "decoder/CaptureFrameListener.h"
#include "decoder/MediaCodecDecoder.h"
#include "platform/gui/Surface.h"

namespace TavoPlayer {

class MediaCodecDecoder::CaptureThread : public android::Thread {
public:
    // `listener` is not owned and must outlive the capture; `window` is the
    // decoder's surface, kept alive by `surface`.
    CaptureThread(const VideoFrameData& frame, CaptureFrameListener* listener,
                  const android::sp<android::Surface>& surface);

    // Copies width x height luma bytes and width x height / 2 chroma bytes of the
    // window's current picture; false (logged) when none can be had.
    bool copyFrameContents();

    uint32_t width() const { return static_cast<uint32_t>(mFrame.mCropWidth); }
    uint32_t height() const { return static_cast<uint32_t>(mFrame.mCropHeight); }

private:
    android::status_t readyToRun() override;
    bool threadLoop() override;

    VideoFrameData mFrame;
    CaptureFrameListener* mListener;
    std::unique_ptr<unsigned char[]> mFrameContents;  // 2 x width x height bytes
    android::sp<android::Surface> mSurface;
    android::ANativeWindow* mNativeWindow;
};

}  // namespace TavoPlayer
