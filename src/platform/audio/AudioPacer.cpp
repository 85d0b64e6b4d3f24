#include "platform/audio/AudioPacer.h"

#include <time.h>

#include <algorithm>
#include <chrono>

namespace android {

AudioPacer::AudioPacer(uint32_t sampleRate, size_t frameSize, int64_t latencyNs)
    : mSampleRate(sampleRate),
      mFrameSize(frameSize),
      mLatencyNs(latencyNs),
      mQueueEndNs(0),
      mResets(0) {}

int64_t AudioPacer::monotonicNs() {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<int64_t>(ts.tv_sec) * 1'000'000'000 + ts.tv_nsec;
}

int64_t AudioPacer::pace(size_t bytes) {
    const uint64_t frames = mFrameSize != 0 ? bytes / mFrameSize : 0;
    const int64_t durationNs =
        mSampleRate != 0 ? static_cast<int64_t>(frames * 1'000'000'000ull / mSampleRate) : 0;
    std::unique_lock<std::mutex> lock(mLock);
    const int64_t now = monotonicNs();
    // While the device still plays, new samples follow the queued ones without a
    // gap; an idle (or drained) device starts anew, and its first sample leaves one
    // device latency after it was written.
    const int64_t leave = mQueueEndNs > now ? mQueueEndNs : now + mLatencyNs;
    mQueueEndNs = leave + durationNs;
    const int64_t releaseNs = mQueueEndNs - mLatencyNs;
    const uint64_t resets = mResets;
    // steady_clock is CLOCK_MONOTONIC, the clock the deadline was taken on.
    const auto deadline =
        std::chrono::steady_clock::time_point(std::chrono::nanoseconds(releaseNs));
    mWake.wait_until(lock, deadline, [&] { return mResets != resets; });
    return leave;
}

void AudioPacer::reset() {
    {
        std::lock_guard<std::mutex> lock(mLock);
        mQueueEndNs = 0;
        ++mResets;
    }
    mWake.notify_all();
}

}  // namespace android
