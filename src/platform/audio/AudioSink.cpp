#include "platform/audio/AudioSink.h"

#include "platform/audio/AlsaAudioSink.h"
#include "platform/audio/NullAudioSink.h"
#include "platform/audio/WavAudioSink.h"

namespace android {

std::unique_ptr<AudioSink> AudioSink::create(const std::string& choice, std::string* name) {
    if (choice == "null") {
        *name = "null";
        return std::make_unique<NullAudioSink>();
    }
    if (choice.rfind("wav:", 0) == 0 && choice.size() > 4) {
        *name = choice;
        return std::make_unique<WavAudioSink>(choice.substr(4));
    }
    if (choice == "alsa" || (choice.rfind("alsa:", 0) == 0 && choice.size() > 5)) {
        const std::string device = choice == "alsa" ? "default" : choice.substr(5);
        *name = "alsa:" + device;
        return std::make_unique<AlsaAudioSink>(device);
    }
    *name = choice;
    return nullptr;
}

std::string AudioSink::defaultChoice() {
    return AlsaAudioSink::soundCardPresent() ? "alsa" : "null";
}

}  // namespace android
