// MediaCodecDecoder: the pipeline module that decodes one elementary stream, video
// (H.264) or audio (AAC in LATM/LOAS or ADTS, MPEG-1/2 audio), with the platform
// codec. Its input ring carries PESData records; an extractor cuts them into units,
// "MCInputThread" queues the units to the codec and "MCOutputThread" writes what the
// codec puts out into the first output ring: AudioFragmentData records (the PCM
// copied) or VideoFrameData records (a reference to a codec output buffer, which
// stays the codec's until the renderer calls renderFrame).
//
// Threads and locks: configure, start, stop, setSurface and the renderer's
// renderFrame are serialised by mLock. The two worker threads run without it: the
// input thread alone uses the extractor (and through it holds the input ring's
// reader lock), the output thread alone writes the output ring. Fields the workers
// read (codec, buffers, surface, display size, formats) change only while they are
// stopped. captureFrame runs on the renderer's thread without mLock.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <utils/Mutex.h>
#include <utils/StrongPointer.h>
#include <utils/Thread.h>

#include "common/data/VideoFrameData.h"
#include "decoder/CaptureFrameListener.h"
#include "decoder/Decoder.h"
#include "decoder/MediaExtractor.h"
#include "platform/media/ALooper.h"
#include "platform/media/AMessage.h"
#include "platform/media/AString.h"
#include "platform/media/MediaCodec.h"
#include "platform/media/MediaCodecBuffer.h"

namespace TavoPlayer {

class MediaCodecDecoder : public Decoder, public VideoFrameData::VideoListener {
public:
    static constexpr int64_t kInputTimeoutUs = 250'000;
    static constexpr int64_t kOutputTimeoutUs = 100'000;
    static constexpr uint32_t kAudioRecordOverhead = 32;

    class CaptureThread;

    MediaCodecDecoder();
    ~MediaCodecDecoder() override;

    unsigned int configure(codingType_t type) override;
    unsigned int start() override;
    unsigned int stop() override;
    unsigned int setSurface(android::sp<android::Surface>& surface) override;
    android::sp<android::Surface> getSurface() override;
    void setDecoderInfoListenerListener(DecoderInfoListener* listener) override;

    void renderFrame(bool render, VideoFrameData& frame) override;
    // Copies the surface's picture on this thread and converts it on "CaptureThread";
    // true when a capture was started. The listener must outlive the capture.
    bool captureFrame(VideoFrameData& frame, CaptureFrameListener* listener) override;

    unsigned int dump(FILE* stream, int indent) override;

    // For tests: the codec in use (null when none) and the state.
    android::sp<android::MediaCodec> getCodecForTest() const { return mMediaCodec; }
    uint32_t getStateForTest() const { return mState; }

private:
    class InputThread : public android::Thread {
    public:
        // The decoder owns this thread and joins it before it goes.
        explicit InputThread(MediaCodecDecoder& decoder)
            : android::Thread(true), mDecoder(decoder) {}

    private:
        android::status_t readyToRun() override;
        bool threadLoop() override;
        MediaCodecDecoder& mDecoder;
    };
    class OutputThread : public android::Thread {
    public:
        explicit OutputThread(MediaCodecDecoder& decoder)
            : android::Thread(true), mDecoder(decoder) {}

    private:
        android::status_t readyToRun() override;
        bool threadLoop() override;
        MediaCodecDecoder& mDecoder;
    };

    unsigned int allocateMediaDecoder();
    unsigned int startMediaCodec();
    unsigned int stopMediaCodec();
    // One turn of each worker.
    bool inputLoopOnce();
    bool outputLoopOnce();
    // The input thread's last act: gives back the record (and the input ring's reader
    // lock) the extractor holds, on the thread that took it.
    void releaseInputOnExit();
    void onOutputFormatChanged();
    // Writes the pending output buffer into the first output ring; false when it
    // stays pending (no room within one wait, or no output ring).
    bool writeAudioRecord();
    bool writeVideoRecord();
    bool isAudio() const { return mCodingType != CODING_H264; }
    static unsigned int joinThread(android::sp<android::Thread>& thread);

    android::Mutex mLock;
    uint32_t mState;
    codingType_t mCodingType;
    android::sp<android::MediaCodec> mMediaCodec;
    android::sp<MediaExtractor> mExtractor;
    android::sp<android::AMessage> mFormat;
    android::AString mComponentName;
    std::string mMime;
    bool mAudio;
    int32_t mPendingOutputIndex;  // output thread only while it runs
    size_t mPendingOffset;
    size_t mPendingSize;
    int64_t mPendingTimeUs;
    uint32_t mPendingFlags;
    android::sp<android::Thread> m_pInputThread;
    android::sp<android::Thread> m_pOutputThread;
    std::vector<android::sp<android::MediaCodecBuffer>> mInputBuffers;
    std::vector<android::sp<android::MediaCodecBuffer>> mOutputBuffers;
    android::sp<android::Surface> m_pSurface;
    int32_t mColorFormat;
    uint32_t mDisplayWidth;  // written by the output thread, read by the module's callers
    uint32_t mDisplayHeight;
    int32_t mChannelCount;
    int32_t mSampleRate;
    DecoderInfoListener* mDecoderInfoListener;  // not owned
    android::sp<android::ALooper> mLooper;
    android::sp<CaptureThread> mCaptureThread;
};

}  // namespace TavoPlayer
