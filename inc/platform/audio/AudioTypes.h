// The platform's audio vocabulary: stream types, formats, channel masks, output
// devices and policy settings, with the values the platform defines for them, so
// that the system's numbers (stream type 3, device bit 0x80, force-use usage 1)
// mean here what they mean there.
#pragma once

#include <sys/types.h>

#include <cstdint>

#include <utils/Errors.h>

namespace android {

enum audio_stream_type_t : int32_t {
    AUDIO_STREAM_DEFAULT = -1,
    AUDIO_STREAM_VOICE_CALL = 0,
    AUDIO_STREAM_SYSTEM = 1,
    AUDIO_STREAM_RING = 2,
    AUDIO_STREAM_MUSIC = 3,
    AUDIO_STREAM_ALARM = 4,
    AUDIO_STREAM_NOTIFICATION = 5,
};

using audio_format_t = uint32_t;
constexpr audio_format_t AUDIO_FORMAT_DEFAULT = 0;  // 16-bit PCM
constexpr audio_format_t AUDIO_FORMAT_PCM_16_BIT = 1;

// Bit n of a positional mask is one loudspeaker position (front left 0x1, front
// right 0x2, ...). The two top bits select the representation: 0 positional,
// 2 indexed; 0xC0000000 is no valid mask, which is what more than eight channels
// are given.
using audio_channel_mask_t = uint32_t;
constexpr audio_channel_mask_t AUDIO_CHANNEL_NONE = 0;
constexpr audio_channel_mask_t AUDIO_CHANNEL_OUT_MONO = 0x1;
constexpr audio_channel_mask_t AUDIO_CHANNEL_OUT_STEREO = 0x3;
constexpr audio_channel_mask_t AUDIO_CHANNEL_INVALID = 0xC0000000u;

enum audio_output_flags_t : uint32_t {
    AUDIO_OUTPUT_FLAG_NONE = 0,
};

using audio_session_t = int32_t;
constexpr audio_session_t AUDIO_SESSION_ALLOCATE = 0;

using audio_io_handle_t = int32_t;

// Output device bits.
using audio_devices_t = uint32_t;
constexpr audio_devices_t AUDIO_DEVICE_OUT_EARPIECE = 0x1;
constexpr audio_devices_t AUDIO_DEVICE_OUT_SPEAKER = 0x2;
constexpr audio_devices_t AUDIO_DEVICE_OUT_WIRED_HEADSET = 0x4;
constexpr audio_devices_t AUDIO_DEVICE_OUT_WIRED_HEADPHONE = 0x8;
constexpr audio_devices_t AUDIO_DEVICE_OUT_BLUETOOTH_SCO = 0x10;
constexpr audio_devices_t AUDIO_DEVICE_OUT_BLUETOOTH_SCO_HEADSET = 0x20;
constexpr audio_devices_t AUDIO_DEVICE_OUT_BLUETOOTH_SCO_CARKIT = 0x40;
constexpr audio_devices_t AUDIO_DEVICE_OUT_BLUETOOTH_A2DP = 0x80;
constexpr audio_devices_t AUDIO_DEVICE_OUT_BLUETOOTH_A2DP_HEADPHONES = 0x100;
constexpr audio_devices_t AUDIO_DEVICE_OUT_BLUETOOTH_A2DP_SPEAKER = 0x200;

enum audio_policy_dev_state_t : int32_t {
    AUDIO_POLICY_DEVICE_STATE_UNAVAILABLE = 0,
    AUDIO_POLICY_DEVICE_STATE_AVAILABLE = 1,
};

enum audio_policy_force_use_t : int32_t {
    AUDIO_POLICY_FORCE_FOR_COMMUNICATION = 0,
    AUDIO_POLICY_FORCE_FOR_MEDIA = 1,
    AUDIO_POLICY_FORCE_FOR_RECORD = 2,
    AUDIO_POLICY_FORCE_FOR_DOCK = 3,
    AUDIO_POLICY_FORCE_FOR_SYSTEM = 4,
    AUDIO_POLICY_FORCE_FOR_HDMI_SYSTEM_AUDIO = 5,
    AUDIO_POLICY_FORCE_USE_CNT = 6,
};

enum audio_policy_forced_cfg_t : int32_t {
    AUDIO_POLICY_FORCE_NONE = 0,
    AUDIO_POLICY_FORCE_SPEAKER = 1,
    AUDIO_POLICY_FORCE_HEADPHONES = 2,
    AUDIO_POLICY_FORCE_BT_SCO = 3,
    AUDIO_POLICY_FORCE_BT_A2DP = 4,
    AUDIO_POLICY_FORCE_WIRED_ACCESSORY = 5,
    AUDIO_POLICY_FORCE_BT_CAR_DOCK = 6,
    AUDIO_POLICY_FORCE_BT_DESK_DOCK = 7,
    AUDIO_POLICY_FORCE_ANALOG_DOCK = 8,
    AUDIO_POLICY_FORCE_DIGITAL_DOCK = 9,
    AUDIO_POLICY_FORCE_NO_BT_A2DP = 10,
    AUDIO_POLICY_FORCE_SYSTEM_ENFORCED = 11,
    AUDIO_POLICY_FORCE_HDMI_SYSTEM_AUDIO_ENFORCED = 12,
    AUDIO_POLICY_FORCE_CFG_CNT = 13,
};

// Accepted for the shape of the creation call; no offload or attributes exist here.
struct audio_offload_info_t;
struct audio_attributes_t;

// Channels of a positional mask; 0 for a mask that is not positional.
constexpr uint32_t audio_channel_count_from_out_mask(audio_channel_mask_t mask) {
    return (mask & 0xC0000000u) != 0 ? 0u : static_cast<uint32_t>(__builtin_popcount(mask));
}

}  // namespace android
