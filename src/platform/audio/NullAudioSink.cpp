#include "platform/audio/NullAudioSink.h"

#include "platform/audio/AudioTrack.h"

namespace android {

status_t NullAudioSink::open(uint32_t sampleRate, uint32_t channels) {
    mFrameSize = static_cast<size_t>(channels) * 2;
    mPacer = std::make_unique<AudioPacer>(sampleRate, mFrameSize,
                                          AudioTrack::kSimulatedLatencyMs * 1'000'000ll);
    return NO_ERROR;
}

uint32_t NullAudioSink::latencyMs() const {
    return AudioTrack::kSimulatedLatencyMs;
}

ssize_t NullAudioSink::write(const void* /*data*/, size_t bytes, int64_t* leaveNs) {
    if (mPacer == nullptr)
        return NO_INIT;
    const size_t taken = bytes - bytes % mFrameSize;
    *leaveNs = mPacer->pace(taken);
    return static_cast<ssize_t>(taken);
}

void NullAudioSink::flush() {
    if (mPacer != nullptr)
        mPacer->reset();
}

}  // namespace android
