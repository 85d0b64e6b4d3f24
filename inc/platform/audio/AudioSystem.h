// AudioSystem: the audio policy's face: which output devices are connected, the
// forced routing per usage, and free-form parameters for the audio hardware.
//
// Connection states come from the property tavoplayer.audio.devices, re-read on
// every query so that a headset or Bluetooth output can be plugged and unplugged
// while the service runs. Its value is a list of entries separated by commas or
// white space; each entry is a device mask, decimal or 0x-hexadecimal, optionally
// followed by "@ADDRESS" (a Bluetooth address, say): "0x8, 0x80@00:11:22:33:44:55".
// Every bit of an entry's mask is connected. A query with an empty address
// matches the device whatever its address; otherwise the addresses must be equal.
//
// Forced routing and parameters are kept (process-wide, under a lock) and logged;
// there is no routing to change on this platform.
#pragma once

#include <string>

#include <utils/String8.h>

#include "platform/audio/AudioTypes.h"

namespace android {

class AudioSystem {
public:
    AudioSystem() = delete;

    static audio_policy_dev_state_t getDeviceConnectionState(audio_devices_t device,
                                                             const char* deviceAddress);
    // BAD_VALUE for a usage or configuration out of range.
    static status_t setForceUse(audio_policy_force_use_t usage, audio_policy_forced_cfg_t config);
    static audio_policy_forced_cfg_t getForceUse(audio_policy_force_use_t usage);
    // Keeps "key=value" pairs (separated by ';'); a word without '=' is kept as
    // a key with an empty value. BAD_VALUE for an empty text.
    static status_t setParameters(audio_io_handle_t ioHandle, const String8& keyValuePairs);
    // The kept values of the ';'-separated keys, as "key=value;...".
    static String8 getParameters(audio_io_handle_t ioHandle, const String8& keys);
    // A fresh audio session id, unique in the process.
    static audio_session_t newAudioSessionId();
};

}  // namespace android
