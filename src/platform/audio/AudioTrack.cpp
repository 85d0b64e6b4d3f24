#include "platform/audio/AudioTrack.h"

#include <cerrno>
#include <chrono>
#include <cinttypes>
#include <cstring>
#include <thread>

#include "platform/audio/AudioPacer.h"
#include "platform/audio/AudioSink.h"
#include "platform/audio/AudioSystem.h"
#include "platform/os/Properties.h"
#include "platform/os/Trace.h"

namespace android {
namespace {

// A failing device holds a writer for the duration of its data, at most this long.
constexpr int64_t kMaxFailurePaceNs = 1'000'000'000;

}  // namespace

AudioTrack::AudioTrack(audio_stream_type_t streamType, uint32_t sampleRate, audio_format_t format,
                       audio_channel_mask_t channelMask, size_t /*frameCount*/,
                       audio_output_flags_t flags, callback_t cbf, void* /*user*/,
                       int32_t /*notificationFrames*/, audio_session_t sessionId,
                       transfer_type transferType, const audio_offload_info_t* offloadInfo,
                       uid_t /*uid*/, pid_t /*pid*/, const audio_attributes_t* /*pAttributes*/,
                       bool /*doNotReconnect*/, float maxRequiredSpeed)
    : mStatus(NO_INIT),
      mStreamType(streamType),
      mSampleRate(sampleRate),
      mChannelMask(channelMask),
      mChannelCount(audio_channel_count_from_out_mask(channelMask)),
      mFrameSize(static_cast<size_t>(mChannelCount) * 2),
      mSessionId(sessionId),
      mLog(nullptr),
      mVolumeLeft(1.0f),
      mVolumeRight(1.0f),
      mStarted(false),
      mFramesWritten(0),
      mLastTimestamp{} {
    if (streamType < AUDIO_STREAM_DEFAULT || streamType > AUDIO_STREAM_NOTIFICATION ||
        (format != AUDIO_FORMAT_DEFAULT && format != AUDIO_FORMAT_PCM_16_BIT) ||
        mChannelCount == 0 || mChannelCount > kMaxChannels || sampleRate < kMinSampleRate ||
        sampleRate > kMaxSampleRate || flags != AUDIO_OUTPUT_FLAG_NONE || cbf != nullptr ||
        (transferType != TRANSFER_DEFAULT && transferType != TRANSFER_SYNC) ||
        offloadInfo != nullptr || maxRequiredSpeed != 1.0f) {
        TAVO_LOGE("%s: unsupported track: stream %d, %u Hz, format %u, mask 0x%x, flags 0x%x\n",
                  "AudioTrack", streamType, sampleRate, format, channelMask, flags);
        mStatus = BAD_VALUE;
        return;
    }
    if (mSessionId == AUDIO_SESSION_ALLOCATE)
        mSessionId = AudioSystem::newAudioSessionId();

    std::string choice = TavoPlayer::propertyGetString("tavoplayer.audio.sink", "");
    if (choice.empty())
        choice = AudioSink::defaultChoice();
    mSink = AudioSink::create(choice, &mSinkName);
    if (mSink == nullptr) {
        TAVO_LOGE("%s: unknown audio sink \"%s\" (alsa[:DEVICE], wav:PATH or null)\n", "AudioTrack",
                  choice.c_str());
        return;
    }
    const status_t opened = mSink->open(sampleRate, mChannelCount);
    if (opened != NO_ERROR) {
        TAVO_LOGE("%s: cannot open audio sink %s: %d\n", "AudioTrack", mSinkName.c_str(), opened);
        mSink.reset();
        return;
    }
    const std::string logPath = TavoPlayer::propertyGetString("tavoplayer.audio.log", "");
    if (!logPath.empty()) {
        mLog = fopen(logPath.c_str(), "a");
        if (mLog == nullptr) {
            TAVO_LOGW("%s: cannot open audio log %s: %s\n", "AudioTrack", logPath.c_str(),
                      strerror(errno));
        }
    }
    TAVO_LOGI("%s: %s, %u Hz, %u channels, session %d, latency %u ms\n", "AudioTrack",
              mSinkName.c_str(), sampleRate, mChannelCount, mSessionId, mSink->latencyMs());
    mStatus = NO_ERROR;
}

AudioTrack::~AudioTrack() {
    // The sink goes first: a WAV sink completes its header as it closes.
    mSink.reset();
    if (mLog != nullptr)
        fclose(mLog);
}

status_t AudioTrack::setVolume(float left, float right) {
    if (!(left >= 0.0f && left <= 1.0f && right >= 0.0f && right <= 1.0f))
        return BAD_VALUE;
    std::lock_guard<std::mutex> lock(mLock);
    mVolumeLeft = left;
    mVolumeRight = right;
    return NO_ERROR;
}

status_t AudioTrack::start() {
    if (mStatus != NO_ERROR)
        return mStatus;
    std::lock_guard<std::mutex> lock(mLock);
    mStarted = true;
    return NO_ERROR;
}

void AudioTrack::stop() {
    {
        std::lock_guard<std::mutex> lock(mLock);
        mStarted = false;
    }
    if (mSink != nullptr)
        mSink->stop();
}

bool AudioTrack::stopped() const {
    std::lock_guard<std::mutex> lock(mLock);
    return !mStarted;
}

void AudioTrack::flush() {
    if (mSink != nullptr)
        mSink->flush();
}

uint32_t AudioTrack::latency() const {
    return mSink != nullptr ? mSink->latencyMs() : 0;
}

status_t AudioTrack::getTimestamp(AudioTimestamp& timestamp) const {
    std::lock_guard<std::mutex> lock(mLock);
    if (mFramesWritten == 0)
        return WOULD_BLOCK;
    timestamp = mLastTimestamp;
    return NO_ERROR;
}

void AudioTrack::applyVolume(const uint8_t* in, size_t bytes) {
    float left;
    float right;
    {
        std::lock_guard<std::mutex> lock(mLock);
        left = mVolumeLeft;
        right = mVolumeRight;
    }
    mScaled.resize(bytes);
    const size_t samples = bytes / 2;
    for (size_t i = 0; i < samples; ++i) {
        int16_t sample;
        memcpy(&sample, in + 2 * i, 2);
        const float gain = (i % mChannelCount) % 2 == 0 ? left : right;
        sample = static_cast<int16_t>(static_cast<float>(sample) * gain);
        memcpy(mScaled.data() + 2 * i, &sample, 2);
    }
}

void AudioTrack::logWrite(int64_t leaveNs, size_t bytes) {
    if (mLog == nullptr)
        return;
    fprintf(mLog, "%" PRId64 " %zu\n", leaveNs, bytes);
    fflush(mLog);
}

ssize_t AudioTrack::write(const void* buffer, size_t size, bool /*blocking*/) {
    if (mStatus != NO_ERROR || mSink == nullptr)
        return NO_INIT;
    if (buffer == nullptr)
        return BAD_VALUE;
    bool unity;
    {
        std::lock_guard<std::mutex> lock(mLock);
        if (!mStarted)
            return INVALID_OPERATION;
        unity = mVolumeLeft == 1.0f && mVolumeRight == 1.0f;
    }
    size_t bytes = size - size % mFrameSize;
    if (bytes == 0)
        return 0;
    const void* data = buffer;
    if (!unity && mSink->keepsSamples()) {
        applyVolume(static_cast<const uint8_t*>(buffer), bytes);
        data = mScaled.data();
    }
    int64_t leaveNs = 0;
    const ssize_t written = mSink->write(data, bytes, &leaveNs);
    if (written < 0) {
        // Held like a working device would hold the writer, so that a caller that
        // goes on writing after a failure does not spin.
        int64_t paceNs = static_cast<int64_t>(bytes / mFrameSize) * 1'000'000'000ll / mSampleRate;
        if (paceNs > kMaxFailurePaceNs)
            paceNs = kMaxFailurePaceNs;
        std::this_thread::sleep_for(std::chrono::nanoseconds(paceNs));
        return written;
    }
    {
        std::lock_guard<std::mutex> lock(mLock);
        mLastTimestamp.mPosition = static_cast<uint32_t>(mFramesWritten);
        mLastTimestamp.mTime.tv_sec = static_cast<time_t>(leaveNs / 1'000'000'000);
        mLastTimestamp.mTime.tv_nsec = static_cast<long>(leaveNs % 1'000'000'000);
        mFramesWritten += static_cast<uint64_t>(written) / mFrameSize;
    }
    logWrite(leaveNs, static_cast<size_t>(written));
    return written;
}

}  // namespace android
