#include "platform/media/MediaPlayerOutputs.h"

#include <cstdlib>
#include <fstream>
#include <string>

#include "platform/os/Properties.h"

namespace android {
namespace {

bool startsWith(const std::string& text, const char* prefix) {
    return text.rfind(prefix, 0) == 0;
}

bool displayPresent() {
    for (const char* name : {"DISPLAY", "WAYLAND_DISPLAY"}) {
        const char* value = getenv(name);
        if (value != nullptr && value[0] != '\0')
            return true;
    }
    return false;
}

// ALSA lists its cards here; without any the file holds "--- no soundcards ---" or
// does not exist at all (no sound driver, or a container without /proc/asound).
bool soundCardPresent() {
    std::ifstream cards("/proc/asound/cards");
    std::string line;
    if (!std::getline(cards, line))
        return false;
    return line.find("no soundcards") == std::string::npos;
}

}  // namespace

MediaPlayerOutputs MediaPlayerOutputs::choose(const std::string& videoSink,
                                              const std::string& audioSink, bool hasSurface,
                                              bool hasDisplay, bool hasSoundCard) {
    MediaPlayerOutputs out;
    out.vo = "null";
    if (hasSurface) {
        if (videoSink == "sdl" || (videoSink.empty() && hasDisplay)) {
            if (hasDisplay)
                out.vo = "sdl";
            else
                out.note = "video sink sdl without a display: null output";
        } else if (startsWith(videoSink, "y4m:")) {
            // libmpv has no YUV4MPEG2 writer of its own.
            out.note = "video sink " + videoSink + " has no media-player counterpart: null output";
        } else if (!videoSink.empty() && videoSink != "null") {
            out.note = "unknown video sink " + videoSink + ": null output";
        }
    }

    out.ao = "null";
    if (startsWith(audioSink, "alsa") && (audioSink.size() == 4 || audioSink[4] == ':')) {
        if (hasSoundCard) {
            out.ao = "alsa";
            if (audioSink.size() > 5)
                out.options.emplace_back("audio-device", "alsa/" + audioSink.substr(5));
        } else {
            out.note += (out.note.empty() ? "" : "; ") +
                        std::string("audio sink alsa without a sound card: null output");
        }
    } else if (startsWith(audioSink, "wav:") && audioSink.size() > 4) {
        out.ao = "pcm";
        out.options.emplace_back("ao-pcm-file", audioSink.substr(4));
        out.options.emplace_back("ao-pcm-waveheader", "yes");
    } else if (audioSink.empty() && hasSoundCard) {
        out.ao = "alsa";
    } else if (!audioSink.empty() && audioSink != "null") {
        out.note +=
            (out.note.empty() ? "" : "; ") + ("unknown audio sink " + audioSink + ": null output");
    }
    return out;
}

MediaPlayerOutputs MediaPlayerOutputs::fromSystem(bool hasSurface) {
    return choose(TavoPlayer::propertyGetString("tavoplayer.video.sink", ""),
                  TavoPlayer::propertyGetString("tavoplayer.audio.sink", ""), hasSurface,
                  displayPresent(), soundCardPresent());
}

}  // namespace android
