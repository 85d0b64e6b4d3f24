#include "platform/gui/Surface.h"

#include <cstdlib>
#include <string>

#include "platform/gui/NullVideoSink.h"
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

}  // namespace

sp<Surface> Surface::create() {
    const std::string sink = TavoPlayer::propertyGetString("tavoplayer.video.sink", "");
    const std::string logPath = TavoPlayer::propertyGetString("tavoplayer.video.log", "");

    SinkFactory factory;
    if (sink.empty() || sink == "null") {
        factory = nullFactory();
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

}  // namespace android
