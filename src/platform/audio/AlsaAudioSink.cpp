#include "platform/audio/AlsaAudioSink.h"

#include <cerrno>
#include <cstring>

#include "platform/audio/AudioPacer.h"
#include "platform/audio/AudioTrack.h"
#include "platform/os/Trace.h"

namespace android {
namespace {

// Each wait for room lasts at most this long, so that a flush or stop from another
// thread is seen promptly.
constexpr int kWaitSliceMs = 100;
// A device that takes nothing for this many slices in a row has stalled.
constexpr int kMaxIdleSlices = 10;
constexpr int64_t kReopenIntervalNs = 1'000'000'000;

}  // namespace

AlsaAudioSink::~AlsaAudioSink() {
    std::lock_guard<std::mutex> lock(mLock);
    closeDevice_l();
}

bool AlsaAudioSink::soundCardPresent() {
    int card = -1;
    return snd_card_next(&card) == 0 && card >= 0;
}

status_t AlsaAudioSink::open(uint32_t sampleRate, uint32_t channels) {
    mSampleRate = sampleRate;
    mChannels = channels;
    mFrameSize = static_cast<size_t>(channels) * 2;
    std::lock_guard<std::mutex> lock(mLock);
    return openDevice_l();
}

status_t AlsaAudioSink::openDevice_l() {
    int err = snd_pcm_open(&mPcm, mDevice.c_str(), SND_PCM_STREAM_PLAYBACK, SND_PCM_NONBLOCK);
    if (err < 0) {
        TAVO_LOGE("%s: cannot open ALSA device %s: %s\n", "AlsaAudioSink", mDevice.c_str(),
                  snd_strerror(err));
        mPcm = nullptr;
        return NO_INIT;
    }
    err = snd_pcm_set_params(mPcm, SND_PCM_FORMAT_S16_LE, SND_PCM_ACCESS_RW_INTERLEAVED, mChannels,
                             mSampleRate, 1, AudioTrack::kAlsaLatencyMs * 1000u);
    if (err < 0) {
        TAVO_LOGE("%s: ALSA device %s refuses %u Hz, %u channels: %s\n", "AlsaAudioSink",
                  mDevice.c_str(), mSampleRate, mChannels, snd_strerror(err));
        closeDevice_l();
        return NO_INIT;
    }
    snd_pcm_uframes_t bufferFrames = 0;
    snd_pcm_uframes_t periodFrames = 0;
    if (snd_pcm_get_params(mPcm, &bufferFrames, &periodFrames) == 0 && mSampleRate != 0) {
        mLatencyMs = static_cast<uint32_t>(bufferFrames * 1000u / mSampleRate);
    } else {
        mLatencyMs = AudioTrack::kAlsaLatencyMs;
    }
    TAVO_LOGI("%s: ALSA device %s: %u Hz, %u channels, latency %u ms\n", "AlsaAudioSink",
              mDevice.c_str(), mSampleRate, mChannels, mLatencyMs);
    return NO_ERROR;
}

void AlsaAudioSink::closeDevice_l() {
    if (mPcm != nullptr) {
        snd_pcm_close(mPcm);
        mPcm = nullptr;
    }
}

int64_t AlsaAudioSink::leaveTime_l() {
    const int64_t now = AudioPacer::monotonicNs();
    snd_pcm_sframes_t delay = 0;
    // A running device tells how long a frame written now takes to be heard; a
    // prepared one starts once its buffer is full, a device latency from now.
    if (snd_pcm_state(mPcm) == SND_PCM_STATE_RUNNING && snd_pcm_delay(mPcm, &delay) == 0 &&
        delay >= 0) {
        return now + static_cast<int64_t>(delay) * 1'000'000'000ll / mSampleRate;
    }
    return now + static_cast<int64_t>(mLatencyMs) * 1'000'000ll;
}

ssize_t AlsaAudioSink::write(const void* data, size_t bytes, int64_t* leaveNs) {
    const uint8_t* at = static_cast<const uint8_t*>(data);
    snd_pcm_uframes_t frames = mFrameSize != 0 ? bytes / mFrameSize : 0;
    const uint64_t flushes = mFlushes.load();
    size_t taken = 0;
    int idleSlices = 0;
    {
        std::lock_guard<std::mutex> lock(mLock);
        if (mPcm == nullptr) {
            const int64_t now = AudioPacer::monotonicNs();
            if (now - mLastReopenNs < kReopenIntervalNs)
                return DEAD_OBJECT;
            mLastReopenNs = now;
            if (openDevice_l() != NO_ERROR)
                return DEAD_OBJECT;
            TAVO_LOGW("%s: ALSA device %s reopened\n", "AlsaAudioSink", mDevice.c_str());
        }
        *leaveNs = leaveTime_l();
    }
    while (frames > 0) {
        // Flushed meanwhile: the rest counts as taken and dropped with the queue,
        // as a flush drops what the device had already taken.
        if (mFlushes.load() != flushes)
            break;
        snd_pcm_sframes_t n;
        {
            std::lock_guard<std::mutex> lock(mLock);
            if (mPcm == nullptr)
                return DEAD_OBJECT;
            n = snd_pcm_writei(mPcm, at, frames);
            if (n == -EPIPE || n == -ESTRPIPE) {
                TAVO_LOGW("%s: ALSA %s on %s; recovering\n", "AlsaAudioSink",
                          n == -EPIPE ? "underrun" : "suspend", mDevice.c_str());
                const int err = snd_pcm_recover(mPcm, static_cast<int>(n), 1);
                if (err == 0)
                    continue;
                n = err;
            }
            if (n < 0 && n != -EAGAIN) {
                TAVO_LOGE("%s: ALSA device %s failed: %s\n", "AlsaAudioSink", mDevice.c_str(),
                          snd_strerror(static_cast<int>(n)));
                closeDevice_l();
                mLastReopenNs = AudioPacer::monotonicNs();
                return taken > 0 ? static_cast<ssize_t>(taken) : static_cast<ssize_t>(DEAD_OBJECT);
            }
        }
        if (n > 0) {
            idleSlices = 0;
            frames -= static_cast<snd_pcm_uframes_t>(n);
            at += static_cast<size_t>(n) * mFrameSize;
            taken += static_cast<size_t>(n) * mFrameSize;
            continue;
        }
        // Full: wait for room, one slice at a time.
        if (++idleSlices > kMaxIdleSlices) {
            TAVO_LOGE("%s: ALSA device %s takes no samples\n", "AlsaAudioSink", mDevice.c_str());
            return taken > 0 ? static_cast<ssize_t>(taken) : static_cast<ssize_t>(WOULD_BLOCK);
        }
        snd_pcm_wait(mPcm, kWaitSliceMs);
    }
    return static_cast<ssize_t>(bytes - bytes % mFrameSize);
}

void AlsaAudioSink::flush() {
    ++mFlushes;
    std::lock_guard<std::mutex> lock(mLock);
    if (mPcm != nullptr) {
        snd_pcm_drop(mPcm);
        snd_pcm_prepare(mPcm);
    }
}

}  // namespace android
