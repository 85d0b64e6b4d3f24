// Which libmpv outputs the media player uses, so that a played file reaches the same
// sinks as the broadcast pipeline: tavoplayer.video.sink and tavoplayer.audio.sink
// name them (see Surface.h), and with nothing to show on (no display, no sound card,
// no surface) the output is libmpv's null one, which still decodes and paces.
#pragma once

#include <string>
#include <utility>
#include <vector>

namespace android {

struct MediaPlayerOutputs {
    std::string vo;  // libmpv "vo"
    std::string ao;  // libmpv "ao"
    // Further libmpv options the chosen outputs need (device, file), in order.
    std::vector<std::pair<std::string, std::string>> options;
    // Set when a sink has no libmpv counterpart and null stands in for it.
    std::string note;

    // videoSink/audioSink: the property values ("" when unset); hasSurface: whether a
    // surface was given; hasDisplay/hasSoundCard: what the machine offers.
    static MediaPlayerOutputs choose(const std::string& videoSink, const std::string& audioSink,
                                     bool hasSurface, bool hasDisplay, bool hasSoundCard);

    // The same from the properties and the machine this process runs on.
    static MediaPlayerOutputs fromSystem(bool hasSurface);
};

}  // namespace android
