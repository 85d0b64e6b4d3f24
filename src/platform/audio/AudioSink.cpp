#include "platform/audio/AudioSink.h"

#include "platform/audio/AlsaAudioSink.h"
#include "platform/audio/NullAudioSink.h"
#include "platform/audio/WavAudioSink.h"

namespace android {

std::unique_ptr<AudioSink> AudioSink::create(const std::string& spec, std::string* name) {
    if (spec == "null") {
        *name = "null";
        return std::make_unique<NullAudioSink>();
    }
    if (spec.rfind("wav:", 0) == 0 && spec.size() > 4) {
        *name = spec;
        return std::make_unique<WavAudioSink>(spec.substr(4));
    }
    if (spec == "alsa" || (spec.rfind("alsa:", 0) == 0 && spec.size() > 5)) {
        const std::string device = spec == "alsa" ? "default" : spec.substr(5);
        *name = "alsa:" + device;
        return std::make_unique<AlsaAudioSink>(device);
    }
    *name = spec;
    return nullptr;
}

std::string AudioSink::defaultSpec() {
    return AlsaAudioSink::soundCardPresent() ? "alsa" : "null";
}

}  // namespace android
