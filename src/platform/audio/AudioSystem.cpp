#include "platform/audio/AudioSystem.h"

#include <atomic>
#include <cstdlib>
#include <map>
#include <mutex>

#include "platform/os/Properties.h"
#include "platform/os/Trace.h"

namespace android {
namespace {

struct PolicyState {
    std::mutex lock;
    audio_policy_forced_cfg_t forceUse[AUDIO_POLICY_FORCE_USE_CNT] = {};
    std::map<std::string, std::string> parameters;
};

PolicyState& policy() {
    static PolicyState state;
    return state;
}

bool isSeparator(char c) {
    return c == ',' || c == ' ' || c == '\t' || c == '\n';
}

}  // namespace

audio_policy_dev_state_t AudioSystem::getDeviceConnectionState(audio_devices_t device,
                                                               const char* deviceAddress) {
    const std::string list = TavoPlayer::propertyGetString("tavoplayer.audio.devices", "");
    const std::string wanted = deviceAddress != nullptr ? deviceAddress : "";
    size_t pos = 0;
    while (pos < list.size()) {
        while (pos < list.size() && isSeparator(list[pos]))
            ++pos;
        size_t end = pos;
        while (end < list.size() && !isSeparator(list[end]))
            ++end;
        if (end == pos)
            break;
        const std::string entry = list.substr(pos, end - pos);
        pos = end;
        const size_t at = entry.find('@');
        const std::string maskText = entry.substr(0, at);
        const std::string address = at == std::string::npos ? "" : entry.substr(at + 1);
        char* stop = nullptr;
        const unsigned long mask = strtoul(maskText.c_str(), &stop, 0);
        if (stop == maskText.c_str() || *stop != '\0') {
            TAVO_LOGW("%s: ignoring device entry \"%s\"\n", __func__, entry.c_str());
            continue;
        }
        if (device != 0 && (mask & device) == device && (wanted.empty() || wanted == address))
            return AUDIO_POLICY_DEVICE_STATE_AVAILABLE;
    }
    return AUDIO_POLICY_DEVICE_STATE_UNAVAILABLE;
}

status_t AudioSystem::setForceUse(audio_policy_force_use_t usage,
                                  audio_policy_forced_cfg_t config) {
    if (usage < 0 || usage >= AUDIO_POLICY_FORCE_USE_CNT || config < 0 ||
        config >= AUDIO_POLICY_FORCE_CFG_CNT) {
        TAVO_LOGE("%s: invalid usage %d or configuration %d\n", __func__, usage, config);
        return BAD_VALUE;
    }
    PolicyState& state = policy();
    std::lock_guard<std::mutex> lock(state.lock);
    state.forceUse[usage] = config;
    TAVO_LOGI("%s: usage %d forced to %d\n", __func__, usage, config);
    return NO_ERROR;
}

audio_policy_forced_cfg_t AudioSystem::getForceUse(audio_policy_force_use_t usage) {
    if (usage < 0 || usage >= AUDIO_POLICY_FORCE_USE_CNT)
        return AUDIO_POLICY_FORCE_NONE;
    PolicyState& state = policy();
    std::lock_guard<std::mutex> lock(state.lock);
    return state.forceUse[usage];
}

status_t AudioSystem::setParameters(audio_io_handle_t ioHandle, const String8& keyValuePairs) {
    const std::string text(keyValuePairs.c_str(), keyValuePairs.length());
    if (text.empty())
        return BAD_VALUE;
    TAVO_LOGI("%s: io %d: %s\n", __func__, ioHandle, text.c_str());
    PolicyState& state = policy();
    std::lock_guard<std::mutex> lock(state.lock);
    size_t pos = 0;
    while (pos <= text.size()) {
        size_t end = text.find(';', pos);
        if (end == std::string::npos)
            end = text.size();
        const std::string pair = text.substr(pos, end - pos);
        if (!pair.empty()) {
            const size_t eq = pair.find('=');
            if (eq == std::string::npos) {
                state.parameters[pair] = "";
            } else {
                state.parameters[pair.substr(0, eq)] = pair.substr(eq + 1);
            }
        }
        pos = end + 1;
    }
    return NO_ERROR;
}

String8 AudioSystem::getParameters(audio_io_handle_t /*ioHandle*/, const String8& keys) {
    const std::string text(keys.c_str(), keys.length());
    PolicyState& state = policy();
    std::lock_guard<std::mutex> lock(state.lock);
    std::string result;
    size_t pos = 0;
    while (pos <= text.size()) {
        size_t end = text.find(';', pos);
        if (end == std::string::npos)
            end = text.size();
        const std::string key = text.substr(pos, end - pos);
        const auto found = state.parameters.find(key);
        if (!key.empty() && found != state.parameters.end()) {
            if (!result.empty())
                result += ';';
            result += key + "=" + found->second;
        }
        pos = end + 1;
    }
    return String8(result.c_str());
}

audio_session_t AudioSystem::newAudioSessionId() {
    // Unique ids of the platform carry their use in the low three bits; a session
    // is use 1, so sessions run 9, 17, 25, ...
    static std::atomic<int32_t> next{1};
    return (next.fetch_add(1) << 3) | 1;
}

}  // namespace android
