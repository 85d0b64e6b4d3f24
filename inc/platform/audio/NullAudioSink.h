// NullAudioSink: keeps nothing; writes are paced by the monotonic clock like
// hardware with a device latency of AudioTrack::kSimulatedLatencyMs.
#pragma once

#include <memory>

#include "platform/audio/AudioPacer.h"
#include "platform/audio/AudioSink.h"

namespace android {

class NullAudioSink : public AudioSink {
public:
    status_t open(uint32_t sampleRate, uint32_t channels) override;
    uint32_t latencyMs() const override;
    ssize_t write(const void* data, size_t bytes, int64_t* leaveNs) override;
    void flush() override;
    bool keepsSamples() const override { return false; }

private:
    size_t mFrameSize = 0;
    std::unique_ptr<AudioPacer> mPacer;
};

}  // namespace android
