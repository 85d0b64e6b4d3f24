// SinkSurface: the one implementation of Surface. It crops each picture the codec
// shows to the window's crop rectangle and either references the codec's planes
// (showSharedPicture: no copy) or packs them as NV12 into a picture of its own
// (showPicture; pooled, so that steady playback allocates nothing), keeps it as the
// most recently shown picture for capture and hands it to its sink.
//
// Capture: dequeueBuffer gives out a buffer that holds a reference to the most
// recently shown picture (the picture is never written again while referenced, so
// the codec can go on showing pictures meanwhile); lockYCbCr maps it as NV12;
// queueBuffer takes the buffer back and frees it.
//
// Threads: showPicture and setCrop come from the codec's threads, the buffer calls
// from the capture's (the video renderer's); mLock guards the crop, the last
// picture, the pool and the set of dequeued buffers, and is never held while the
// sink presents.
#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "platform/gui/ShowLog.h"
#include "platform/gui/SinkPicture.h"
#include "platform/gui/Surface.h"
#include "platform/gui/VideoSink.h"

namespace android {

class SinkSurface : public Surface {
public:
    // Pictures kept for reuse once released; a picture still held by a capture or
    // by the sink is never written again.
    static constexpr size_t kPoolSize = 4;

    // The log is created first, so that the sink factory can hand it to the sink.
    SinkSurface(const std::string& logPath,
                const std::function<std::unique_ptr<VideoSink>(ShowLog&)>& makeSink);
    ~SinkSurface() override;

    // False when the sink could not be made.
    bool valid() const { return mSink != nullptr; }
    const char* sinkName() const { return mSink != nullptr ? mSink->name() : ""; }

    int showPicture(const SurfacePicture& picture) override;
    int showSharedPicture(const SurfacePicture& picture,
                          std::shared_ptr<const void> storage) override;
    int setCrop(const android_native_rect_t* crop) override;
    int dequeueBuffer(ANativeWindowBuffer** buffer) override;
    int queueBuffer(ANativeWindowBuffer* buffer, int fenceFd) override;

    const ShowLog& showLog() const { return *mLog; }
    std::shared_ptr<const SinkPicture> lastPicture() const;
    // Buffers dequeued and not yet queued back.
    size_t dequeuedCount() const;

private:
    class Buffer;
    class PicturePool;

    // Both ways of showing: a copy into a pooled picture (storage null) or a
    // reference to the shared planes.
    int show(const SurfacePicture& picture, std::shared_ptr<const void> storage);

    mutable std::mutex mLock;
    bool mHasCrop = false;
    android_native_rect_t mCrop{};
    std::shared_ptr<const SinkPicture> mLast;
    std::set<ANativeWindowBuffer*> mDequeued;
    // Shared with the pictures it hands out, which may outlive the surface.
    std::shared_ptr<PicturePool> mPool;

    // Declared before the sink: the sink records into it until it is destroyed.
    std::unique_ptr<ShowLog> mLog;
    std::unique_ptr<VideoSink> mSink;
};

}  // namespace android
