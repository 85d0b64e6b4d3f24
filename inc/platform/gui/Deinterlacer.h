// Deinterlacer: FFmpeg's bwdif filter over shown pictures, one picture out per
// picture in (its send_frame mode), as planar 4:2:0. bwdif looks at the picture
// before and after the one it makes, so its output runs one picture behind.
//
// Used by one thread at a time (the window's).
#pragma once

#include <cstdint>

#include "platform/gui/SinkPicture.h"

struct AVFilterGraph;
struct AVFilterContext;
struct AVFrame;

namespace android {

class Deinterlacer {
public:
    Deinterlacer();
    ~Deinterlacer();
    Deinterlacer(const Deinterlacer&) = delete;
    Deinterlacer& operator=(const Deinterlacer&) = delete;

    // Feeds one picture; the graph is rebuilt when the size or field order changes.
    // False (and an error logged once) when the filter cannot run.
    bool push(const SinkPicture& picture);
    // The next deinterlaced picture (yuv420p, pts in 90 kHz ticks), or null when
    // none is ready. Valid until the next push or pull.
    const AVFrame* pull();

private:
    bool configure(int32_t width, int32_t height, bool topFieldFirst);
    void release();

    AVFilterGraph* mGraph = nullptr;
    AVFilterContext* mSource = nullptr;
    AVFilterContext* mSink = nullptr;
    AVFrame* mOut = nullptr;
    int32_t mWidth = 0;
    int32_t mHeight = 0;
    bool mTopFieldFirst = true;
    bool mFailed = false;
};

}  // namespace android
