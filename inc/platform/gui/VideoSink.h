// VideoSink: where a surface's pictures go (a window, a file, nowhere). The
// surface crops and packs each picture and hands it over shared; a sink that
// presents later (the window) keeps the reference until then. Every sink records
// each picture it presents in the surface's ShowLog.
#pragma once

#include <memory>

#include "platform/gui/SinkPicture.h"

namespace android {

class VideoSink {
public:
    virtual ~VideoSink() = default;
    // "null", "y4m" or "sdl".
    virtual const char* name() const = 0;
    // Called on the codec's thread; returns quickly. 0 or a negative status.
    virtual int show(const std::shared_ptr<const SinkPicture>& picture) = 0;
};

}  // namespace android
