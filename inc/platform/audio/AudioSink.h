// AudioSink: where a track's PCM goes (an ALSA device, a WAV file, nowhere). A
// sink behaves like audio hardware: writes block while the device is full, and
// each write reports when its first sample leaves the device.
//
// Threads: one writer; flush() and stop() may come from another thread and cut
// short a write that waits for room.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <string>

#include "platform/audio/AudioTypes.h"

namespace android {

class AudioSink {
public:
    virtual ~AudioSink() = default;

    // Opens for interleaved 16-bit PCM. NO_ERROR or a negative status.
    virtual status_t open(uint32_t sampleRate, uint32_t channels) = 0;
    // The queue between a write and the sound leaving, in ms.
    virtual uint32_t latencyMs() const = 0;
    // Takes whole frames of `bytes`, blocking like hardware. Returns the bytes
    // taken or a negative status; *leaveNs receives the monotonic time (ns) at
    // which the first sample leaves the device.
    virtual ssize_t write(const void* data, size_t bytes, int64_t* leaveNs) = 0;
    // Drops what is queued and wakes a waiting writer.
    virtual void flush() = 0;
    virtual void stop() { flush(); }
    // Whether the bytes written are kept (and so must carry the track's volume).
    virtual bool keepsSamples() const { return true; }

    // The sink named by `choice` ("alsa[:DEVICE]", "wav:PATH", "null"); null for an
    // unknown name. *name receives the sink's full name.
    static std::unique_ptr<AudioSink> create(const std::string& choice, std::string* name);
    // The sink used when tavoplayer.audio.sink is unset: "alsa" when a sound card
    // exists, "null" otherwise.
    static std::string defaultChoice();
};

}  // namespace android
