// AudioTrack: a streaming PCM output with the platform's shape (creation
// parameters, init status, per-channel volume, start/stop/flush, blocking write,
// audio session). Only 16-bit interleaved PCM is played.
//
// The sink behind a track is chosen, when the track is created, by the property
// tavoplayer.audio.sink:
//   alsa[:DEVICE]  ALSA PCM DEVICE ("default" when omitted); the default sink when
//                  the machine has a sound card. Device latency: the buffer ALSA
//                  grants for a 188 ms request (kAlsaLatencyMs); underruns are
//                  recovered with snd_pcm_recover and logged.
//   wav:PATH       a RIFF/WAVE file, created anew by every track, written at the
//                  pace of hardware. Device latency 188 ms (kSimulatedLatencyMs).
//   null           nothing is kept; writes are paced by the monotonic clock like
//                  hardware. Device latency 188 ms (kSimulatedLatencyMs).
// The device latency is the queue between a write and the sound leaving: a write
// into an idle device leaves that much later, and a writer is held back while the
// device holds more than that. Every sink reports the monotonic time at which the
// first sample of each write leaves; with tavoplayer.audio.log=PATH each write
// appends the line "<monotonic_ns_when_first_sample_leaves> <bytes>" to PATH.
//
// Threads: write() is called by one thread (the renderer's); start, stop, flush,
// setVolume and the getters may be called from any other thread at the same time.
// flush() and stop() cut short a write that is waiting for the device.
#pragma once

#include <sys/types.h>
#include <time.h>

#include <cstdint>
#include <cstdio>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <utils/RefBase.h>

#include "platform/audio/AudioTypes.h"

namespace android {

class AudioSink;

// A frame position and the monotonic time at which that frame leaves the device.
struct AudioTimestamp {
    uint32_t mPosition;
    struct timespec mTime;
};

class AudioTrack : public virtual RefBase {
public:
    enum transfer_type {
        TRANSFER_DEFAULT,
        TRANSFER_CALLBACK,
        TRANSFER_OBTAIN,
        TRANSFER_SYNC,
        TRANSFER_SHARED,
    };
    using callback_t = void (*)(int event, void* user, void* info);

    // The device latency of every sink. The audio renderer writes sound 158 to 201 ms
    // ahead of its time stamp (it plays a fragment as it is within 201 ms of its clock
    // and inserts silence in 42.7 ms steps beyond), a lead made for a television's
    // output path. A device that holds 188 ms puts the sound between 13 ms ahead of
    // and 30 ms behind its picture, inside the window viewers accept (ATSC IS-191:
    // 15 ms ahead, 45 ms behind).
    static constexpr uint32_t kSimulatedLatencyMs = 188;
    static constexpr uint32_t kAlsaLatencyMs = 188;
    // Rates a track accepts, as the platform's mixer does.
    static constexpr uint32_t kMinSampleRate = 4000;
    static constexpr uint32_t kMaxSampleRate = 192000;
    static constexpr uint32_t kMaxChannels = 8;

    // A streaming track. Only streaming with blocking writes is provided: a
    // callback, shared memory or offload info is refused (initCheck BAD_VALUE).
    AudioTrack(audio_stream_type_t streamType, uint32_t sampleRate, audio_format_t format,
               audio_channel_mask_t channelMask, size_t frameCount = 0,
               audio_output_flags_t flags = AUDIO_OUTPUT_FLAG_NONE, callback_t cbf = nullptr,
               void* user = nullptr, int32_t notificationFrames = 0,
               audio_session_t sessionId = AUDIO_SESSION_ALLOCATE,
               transfer_type transferType = TRANSFER_DEFAULT,
               const audio_offload_info_t* offloadInfo = nullptr, uid_t uid = -1, pid_t pid = -1,
               const audio_attributes_t* pAttributes = nullptr, bool doNotReconnect = false,
               float maxRequiredSpeed = 1.0f);
    ~AudioTrack() override;
    AudioTrack(const AudioTrack&) = delete;
    AudioTrack& operator=(const AudioTrack&) = delete;

    // NO_ERROR, BAD_VALUE (parameters) or NO_INIT (the sink could not be opened).
    status_t initCheck() const { return mStatus; }
    // Gains from 0.0 to 1.0; left applies to even channels, right to odd ones.
    status_t setVolume(float left, float right);
    status_t start();
    // Stops playback; what is queued is dropped, as a streaming track's stop
    // followed by the renderer's flush would leave nothing anyway.
    void stop();
    bool stopped() const;
    // Drops everything queued; the next write starts a fresh stream.
    void flush();
    // Blocks until the device has taken all bytes (a whole number of frames).
    // Returns the bytes taken or a negative status: NO_INIT without a sink,
    // INVALID_OPERATION before start, BAD_VALUE for a null buffer, or the sink's
    // failure (DEAD_OBJECT when the device went away). A failing device still
    // holds the writer for the duration of the data, so that no writer spins.
    ssize_t write(const void* buffer, size_t size, bool blocking = true);

    audio_session_t getSessionId() const { return mSessionId; }
    uint32_t getSampleRate() const { return mSampleRate; }
    uint32_t channelCount() const { return mChannelCount; }
    size_t frameSize() const { return mFrameSize; }
    audio_stream_type_t streamType() const { return mStreamType; }
    audio_channel_mask_t channelMask() const { return mChannelMask; }
    // Device latency in ms.
    uint32_t latency() const;
    // The frame position of the last write's first frame and when it leaves.
    status_t getTimestamp(AudioTimestamp& timestamp) const;
    // The sink's name ("alsa:default", "wav:/tmp/x.wav", "null").
    const std::string& sinkName() const { return mSinkName; }

private:
    void applyVolume(const uint8_t* in, size_t bytes);
    void logWrite(int64_t leaveNs, size_t bytes);

    status_t mStatus;
    audio_stream_type_t mStreamType;
    uint32_t mSampleRate;
    audio_channel_mask_t mChannelMask;
    uint32_t mChannelCount;
    size_t mFrameSize;
    audio_session_t mSessionId;
    std::string mSinkName;
    std::unique_ptr<AudioSink> mSink;
    FILE* mLog;

    mutable std::mutex mLock;  // guards the fields below
    float mVolumeLeft;
    float mVolumeRight;
    bool mStarted;
    uint64_t mFramesWritten;
    AudioTimestamp mLastTimestamp;

    // Writer only: PCM scaled by the volume.
    std::vector<uint8_t> mScaled;
};

}  // namespace android
