#include "decoder/CaptureThread.h"

#include <pthread.h>

#include <cstring>
#include <new>

#include "platform/os/Trace.h"

namespace TavoPlayer {

MediaCodecDecoder::CaptureThread::CaptureThread(const VideoFrameData& frame,
                                                CaptureFrameListener* listener,
                                                const android::sp<android::Surface>& surface)
    : android::Thread(false),
      mFrame(frame),
      mListener(listener),
      mSurface(surface),
      mNativeWindow(surface.get()) {}

android::status_t MediaCodecDecoder::CaptureThread::readyToRun() {
    pthread_setname_np(pthread_self(), "CaptureThread");
    return android::OK;
}

bool MediaCodecDecoder::CaptureThread::copyFrameContents() {
    android::GraphicBufferMapper& mapper = android::GraphicBufferMapper::get();
    android::ANativeWindowBuffer* buffer = nullptr;
    int status = mNativeWindow != nullptr ? mNativeWindow->dequeueBuffer(&buffer) : -22;
    if (status != 0 || buffer == nullptr) {
        TAVO_LOGI("Surface::dequeueBuffer returned error %d\n", status);
        return false;
    }
    const uint32_t frameWidth = width();
    const uint32_t frameHeight = height();
    const android::Rect bounds = {0, 0, static_cast<int32_t>(frameWidth),
                                  static_cast<int32_t>(frameHeight)};
    android::android_ycbcr ycbcr = {};
    bool ok = false;
    status = mapper.lockYCbCr(buffer, 3, bounds, &ycbcr);
    if (status != 0) {
        TAVO_LOGE("mapper.lockYCbCr error %d\n", status);
    } else {
        const size_t lumaBytes = static_cast<size_t>(frameWidth) * frameHeight;
        // 2 x width x height bytes are copied; the conversion reads chroma rows of
        // the width rounded up to 16, so a narrow picture gets zeroed room for that.
        const size_t copied = 2 * lumaBytes;
        const size_t room = copied + 16 * static_cast<size_t>(frameHeight) + 16;
        mFrameContents.reset(new (std::nothrow) unsigned char[room]);
        if (mFrameContents != nullptr)
            memset(mFrameContents.get() + copied, 0, room - copied);
        if (mFrameContents != nullptr && ycbcr.y != nullptr && ycbcr.cb != nullptr) {
            // The luma and the interleaved chroma are taken as contiguous runs: the
            // picture's rows are exactly `width` bytes, as for decoder buffers whose
            // width is a multiple of 16.
            memcpy(mFrameContents.get(), ycbcr.y, lumaBytes);
            memcpy(mFrameContents.get() + lumaBytes, ycbcr.cb, lumaBytes / 2);
            ok = true;
        }
        mapper.unlock(buffer);
    }
    status = mNativeWindow->queueBuffer(buffer, -1);
    if (status != 0)
        TAVO_LOGE("%s Surface::queueBuffer returned error %d\n", __func__, status);
    return ok;
}

bool MediaCodecDecoder::CaptureThread::threadLoop() {
    const uint32_t frameWidth = width();
    const uint32_t frameHeight = height();
    const size_t pixelCount = static_cast<size_t>(frameWidth) * frameHeight;
    // Bytes, as the listener frees them; new[] aligns them for the 32-bit pixels.
    auto* pixels = new (std::nothrow) unsigned char[(pixelCount > 0 ? pixelCount : 1) * 4];
    if (pixels != nullptr && mFrameContents != nullptr &&
        VideoFrameData::convertFrameFromYvuToRgba(
            mFrameContents.get(), reinterpret_cast<int*>(pixels), frameWidth, frameHeight,
            mFrame.mColorFormat, frameWidth) == 0) {
        if (mListener != nullptr)
            mListener->onCaptureFrame(pixels, frameWidth, frameHeight, false);
        else
            delete[] pixels;
    } else {
        TAVO_LOGE("%s: Error converting frame\n", __func__);
        delete[] pixels;
    }
    mFrameContents.reset();
    return false;
}

}  // namespace TavoPlayer
