// AlsaAudioSink: an ALSA playback PCM (libasound), opened non-blocking and
// written with waits of at most 100 ms at a time, so that a write blocks like
// hardware yet flush() and stop() from another thread cut it short, and a device
// that stops taking samples for a second fails the write instead of hanging it.
//
// Device latency: ALSA is asked for AudioTrack::kAlsaLatencyMs of buffer; the
// buffer it grants is reported. An underrun (or a suspend) is recovered with
// snd_pcm_recover and logged; a device that fails beyond recovery is closed, the
// write fails with DEAD_OBJECT, and later writes try to reopen it at most once a
// second, so that playback resumes when the device returns.
#pragma once

#include <alsa/asoundlib.h>

#include <atomic>
#include <mutex>
#include <string>

#include "platform/audio/AudioSink.h"

namespace android {

class AlsaAudioSink : public AudioSink {
public:
    explicit AlsaAudioSink(std::string device) : mDevice(std::move(device)) {}
    ~AlsaAudioSink() override;

    status_t open(uint32_t sampleRate, uint32_t channels) override;
    uint32_t latencyMs() const override { return mLatencyMs; }
    ssize_t write(const void* data, size_t bytes, int64_t* leaveNs) override;
    void flush() override;

    // Whether ALSA knows at least one sound card.
    static bool soundCardPresent();

private:
    status_t openDevice_l();
    void closeDevice_l();
    int64_t leaveTime_l();

    const std::string mDevice;
    uint32_t mSampleRate = 0;
    uint32_t mChannels = 0;
    size_t mFrameSize = 0;
    uint32_t mLatencyMs = 0;
    std::mutex mLock;  // guards mPcm and every call on it except the waits
    snd_pcm_t* mPcm = nullptr;
    int64_t mLastReopenNs = 0;
    std::atomic<uint64_t> mFlushes{0};
};

}  // namespace android
