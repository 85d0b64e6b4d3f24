#include "platform/gui/Surface.h"

#include <cstdlib>
#include <string>
#include <vector>

#include "platform/gui/NullVideoSink.h"
#include "platform/gui/PlanarChroma.h"
#include "platform/gui/SdlVideoSink.h"
#include "platform/gui/SinkSurface.h"
#include "platform/gui/Y4mVideoSink.h"
#include "platform/os/Properties.h"
#include "platform/os/Trace.h"

namespace android {
namespace {

using SinkFactory = std::function<std::unique_ptr<VideoSink>(ShowLog&)>;

SinkFactory nullFactory() {
    return [](ShowLog& log) { return std::make_unique<NullVideoSink>(log); };
}

SinkFactory sdlFactory() {
    std::string mode = TavoPlayer::propertyGetString("tavoplayer.video.deinterlace", "auto");
    if (mode.empty())
        mode = "auto";
    if (mode != "auto" && mode != "off") {
        TAVO_LOGW("%s: tavoplayer.video.deinterlace is auto or off, not \"%s\"; using auto\n",
                  __func__, mode.c_str());
        mode = "auto";
    }
    const bool deinterlace = mode == "auto";
    return [deinterlace](ShowLog& log) { return SdlVideoSink::open(log, deinterlace); };
}

bool displayPresent() {
    const char* x11 = getenv("DISPLAY");
    const char* wayland = getenv("WAYLAND_DISPLAY");
    return (x11 != nullptr && *x11 != '\0') || (wayland != nullptr && *wayland != '\0');
}

}  // namespace

sp<Surface> Surface::create() {
    const std::string sink = TavoPlayer::propertyGetString("tavoplayer.video.sink", "");
    const std::string logPath = TavoPlayer::propertyGetString("tavoplayer.video.log", "");

    SinkFactory factory;
    if (sink.empty() && displayPresent()) {
        // The window when SDL can open one; headless otherwise.
        sp<SinkSurface> surface = new SinkSurface(logPath, sdlFactory());
        if (surface->valid()) {
            TAVO_LOGI("%s: video sink %s\n", __func__, surface->sinkName());
            return surface;
        }
        factory = nullFactory();
    } else if (sink.empty() || sink == "null") {
        factory = nullFactory();
    } else if (sink == "sdl") {
        factory = sdlFactory();
    } else if (sink.rfind("y4m:", 0) == 0) {
        const std::string path = sink.substr(4);
        factory = [path](ShowLog& log) { return Y4mVideoSink::open(path, log); };
    } else {
        TAVO_LOGE("%s: unknown video sink \"%s\" (sdl, y4m:PATH or null)\n", __func__,
                  sink.c_str());
        return nullptr;
    }

    sp<SinkSurface> surface = new SinkSurface(logPath, factory);
    if (!surface->valid()) {
        TAVO_LOGE("%s: video sink \"%s\" cannot be used\n", __func__, sink.c_str());
        return nullptr;
    }
    TAVO_LOGI("%s: video sink %s\n", __func__, surface->sinkName());
    return surface;
}

int Surface::showSharedPicture(const SurfacePicture& picture, std::shared_ptr<const void> storage) {
    (void)storage;
    if (picture.uv != nullptr || picture.cb == nullptr || picture.cr == nullptr)
        return showPicture(picture);
    if (picture.width < 2 || picture.height < 2 || picture.cStride < (picture.width + 1) / 2)
        return -22;  // -EINVAL
    const int32_t uvStride = (picture.width + 1) & ~1;
    std::vector<uint8_t> uv(static_cast<size_t>(uvStride) * ((picture.height + 1) / 2));
    PlanarChroma::interleave(picture.cb, picture.cr, picture.cStride, uvStride / 2,
                             (picture.height + 1) / 2, uv.data(), uvStride);
    SurfacePicture packed = picture;
    packed.uv = uv.data();
    packed.uvStride = uvStride;
    return showPicture(packed);
}

}  // namespace android
