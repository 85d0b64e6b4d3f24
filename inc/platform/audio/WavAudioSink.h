// WavAudioSink: a RIFF/WAVE file of 16-bit PCM (format tag 1), created anew when
// the sink opens, written at the pace of hardware (device latency
// AudioTrack::kSimulatedLatencyMs). The RIFF and data sizes are written when the
// sink closes; a file cut short before that still holds its samples after the
// 44-byte header.
#pragma once

#include <cstdio>
#include <memory>
#include <string>

#include "platform/audio/AudioPacer.h"
#include "platform/audio/AudioSink.h"

namespace android {

class WavAudioSink : public AudioSink {
public:
    static constexpr size_t kHeaderSize = 44;

    explicit WavAudioSink(std::string path) : mPath(std::move(path)) {}
    ~WavAudioSink() override;

    status_t open(uint32_t sampleRate, uint32_t channels) override;
    uint32_t latencyMs() const override;
    ssize_t write(const void* data, size_t bytes, int64_t* leaveNs) override;
    void flush() override;

private:
    void writeHeader(uint32_t dataBytes);

    const std::string mPath;
    FILE* mFile = nullptr;
    uint32_t mSampleRate = 0;
    uint32_t mChannels = 0;
    size_t mFrameSize = 0;
    uint64_t mDataBytes = 0;
    std::unique_ptr<AudioPacer> mPacer;
};

}  // namespace android
