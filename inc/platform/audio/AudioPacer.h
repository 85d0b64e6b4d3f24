// AudioPacer: the timing of audio hardware for sinks that have none (a file,
// nothing). The device holds a queue of `latency`: a write into an idle (or
// drained) device leaves `latency` later, a write into a playing one leaves right
// after what is ahead of it, and the writer is held back until the device holds
// no more than `latency` again. So in steady state every sample leaves `latency`
// after it was written, and writes come at the pace of the sample rate.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <mutex>

namespace android {

class AudioPacer {
public:
    AudioPacer(uint32_t sampleRate, size_t frameSize, int64_t latencyNs);

    // Queues `bytes`, waits until the device has room again (or a reset), and
    // returns the monotonic time (ns) at which their first sample leaves.
    int64_t pace(size_t bytes);
    // Empties the queue and releases a waiting writer.
    void reset();

    static int64_t monotonicNs();

private:
    const uint32_t mSampleRate;
    const size_t mFrameSize;
    const int64_t mLatencyNs;
    std::mutex mLock;
    std::condition_variable mWake;
    int64_t mQueueEndNs;  // when the last queued sample leaves; 0 when idle
    uint64_t mResets;     // counts reset(); a waiting writer returns when it moves
};

}  // namespace android
