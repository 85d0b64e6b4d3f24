// MediaCodec: the platform codec, with the shape the decoder module uses, decoding
// with FFmpeg's libavcodec.
//
//   "video/avc"        H.264 (frame threads, one per core unless
//                      tavoplayer.codec.threads says otherwise); pictures leave as NV12,
//                      colour format 261, with the SPS's crop rectangle
//   "audio/mp4a-latm"  AAC (LC, HE-AAC) from raw access units; the first buffer flagged
//                      BUFFER_FLAG_CODECCONFIG is the AudioSpecificConfig
//   "audio/mpeg"       MPEG-1/2 Layers I-III, the decoder chosen from the first header
// Audio leaves as interleaved signed 16-bit PCM. The component names
// "OMX.KOV.aac.dec" and "OMX.KOV.mp3.dec" are registered aliases of the two audio
// decoders; any other name gives no codec.
//
// Buffers: a fixed set of input and output buffers, allocated once. An input buffer
// is the client's from dequeueInputBuffer to queueInputBuffer; an output buffer from
// dequeueOutputBuffer until renderOutputBufferAndRelease or releaseOutputBuffer. A
// decoded picture stays in its output buffer, owned by the codec, until then; when
// every output buffer is held by the client, decoding waits (back-pressure).
//
// Threads: the client's calls may come from several threads (the decoder module's
// input and output threads, the renderer's); all state is guarded by mLock. The
// decoding itself runs on the looper's thread, which alone touches the FFmpeg
// decoder; a buffer's bytes are touched only by whoever owns the buffer.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include <utils/Condition.h>
#include <utils/Errors.h>
#include <utils/Mutex.h>
#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

#include "platform/gui/Surface.h"
#include "platform/media/ALooper.h"
#include "platform/media/AMessage.h"
#include "platform/media/AString.h"
#include "platform/media/MediaCodecBuffer.h"

namespace android {

class FFmpegDecoder;

// Status codes of dequeueOutputBuffer beside OK and the system's errors.
enum : status_t {
    INFO_TRY_AGAIN_LATER = -11,  // -EAGAIN
    INFO_FORMAT_CHANGED = -1012,
    INFO_OUTPUT_BUFFERS_CHANGED = -1014,
};

// Colour format of the pictures this codec puts out (semi-planar 4:2:0, Cb first).
constexpr int32_t kColorFormatYUV420SemiPlanar = 261;

// Content protection is not supported; the type exists for the signature.
class ICrypto : public RefBase {};

class MediaCodec : public RefBase {
public:
    enum BufferFlags : uint32_t {
        BUFFER_FLAG_SYNCFRAME = 1,
        BUFFER_FLAG_CODECCONFIG = 2,
        BUFFER_FLAG_EOS = 4,
    };
    enum ConfigureFlags : uint32_t {
        CONFIGURE_FLAG_ENCODE = 1,
    };

    static constexpr size_t kVideoInputBuffers = 4;
    static constexpr size_t kVideoInputCapacity = 2 * 1024 * 1024;
    // Pictures decoded ahead of the renderer (200 ms at 29.97 Hz), 3.1 MB each at
    // 1080: a picture costs about 3 ms of decoding CPU, so a few cover an IDR picture's
    // longer decode and scheduling delays; more only cost memory.
    static constexpr size_t kVideoOutputBuffers = 6;
    // Picture blocks kept for reuse beyond those of the output buffers.
    static constexpr size_t kVideoSpareBlocks = 2;
    static constexpr size_t kAudioInputBuffers = 8;
    static constexpr size_t kAudioInputCapacity = 16 * 1024;
    static constexpr size_t kAudioOutputBuffers = 8;
    // 2048 samples (HE-AAC) of 8 channels in 16 bits.
    static constexpr size_t kAudioOutputCapacity = 2048 * 8 * 2;

    // A decoder for `mime`; null (and NAME_NOT_FOUND in *err) for an unknown type or
    // an encoder.
    static sp<MediaCodec> CreateByType(const sp<ALooper>& looper, const AString& mime, bool encoder,
                                       status_t* err = nullptr, pid_t pid = -1, uid_t uid = -1);
    // The decoder registered under `name` (a registered alias or FFmpeg's own decoder
    // name); null for any other name.
    static sp<MediaCodec> CreateByComponentName(const sp<ALooper>& looper, const AString& name,
                                                status_t* err = nullptr, pid_t pid = -1,
                                                uid_t uid = -1);

    ~MediaCodec() override;
    MediaCodec(const MediaCodec&) = delete;
    MediaCodec& operator=(const MediaCodec&) = delete;

    status_t getName(AString* name) const;

    // In the initialised state (after creation or stop): keeps the format and the
    // surface for start. Encoding and crypto are refused (INVALID_OPERATION).
    status_t configure(const sp<AMessage>& format, const sp<Surface>& nativeWindow,
                       const sp<ICrypto>& crypto, uint32_t flags);
    // Opens the decoder (video now, audio once its configuration or first header
    // arrives) and posts the decoding loop on the looper.
    status_t start();
    // Ends the decoding loop, closes the decoder and takes every buffer back.
    status_t stop();
    // stop(), then forgets the surface; the codec cannot be used again.
    status_t release();

    status_t getInputBuffers(std::vector<sp<MediaCodecBuffer>>* buffers) const;
    status_t getOutputBuffers(std::vector<sp<MediaCodecBuffer>>* buffers) const;

    // INFO_TRY_AGAIN_LATER after `timeoutUs` (negative: wait without end) with no
    // buffer free; INVALID_OPERATION when not started.
    status_t dequeueInputBuffer(size_t* index, int64_t timeoutUs);
    // A zero-size buffer without flags is given back unused (nothing is decoded).
    status_t queueInputBuffer(size_t index, size_t offset, size_t size, int64_t presentationTimeUs,
                              uint32_t flags, AString* errorDetailMsg = nullptr);
    // A decoded buffer, or INFO_FORMAT_CHANGED before the first buffer of a new
    // output format, or INFO_TRY_AGAIN_LATER after `timeoutUs`.
    status_t dequeueOutputBuffer(size_t* index, size_t* offset, size_t* size,
                                 int64_t* presentationTimeUs, uint32_t* flags,
                                 int64_t timeoutUs = 0);
    // The output format most recently announced by INFO_FORMAT_CHANGED (before
    // that, the configured format).
    status_t getOutputFormat(sp<AMessage>* format) const;
    // Shows the picture on the surface (when there is one) and gives the buffer back.
    status_t renderOutputBufferAndRelease(size_t index);
    status_t releaseOutputBuffer(size_t index);

    // For tests and the benchmark: units the decoder rejected, frames it put out,
    // empty and codec-configuration input buffers queued, output buffers the client
    // holds now.
    uint64_t rejectedUnits() const;
    uint64_t decodedFrames() const;
    uint64_t emptyInputs() const;
    uint64_t configInputs() const;
    size_t clientOutputBuffers() const;

private:
    enum class Kind { Avc, Aac, MpegAudio };
    enum class State { Initialized, Configured, Started, Released };
    enum class Owner { Codec, Client, Queued, Ready };

    struct InputSlot {
        sp<MediaCodecBuffer> buffer;
        Owner owner = Owner::Codec;
        int64_t ptsUs = 0;
        uint32_t flags = 0;
    };
    struct OutputSlot {
        sp<MediaCodecBuffer> buffer;
        Owner owner = Owner::Codec;
        int64_t ptsUs = 0;
        uint32_t flags = 0;
        sp<AMessage> format;  // the output format the buffer was decoded in
        SurfacePicture picture{};
        // The decoder's own frame when the picture is shown from its planes (a
        // surface is set): the buffer then carries no bytes. Released with the buffer.
        std::shared_ptr<const void> frame;
    };

    MediaCodec(const sp<ALooper>& looper, Kind kind, const char* name);
    static sp<MediaCodec> create(const sp<ALooper>& looper, Kind kind, const char* name,
                                 status_t* err);

    // The decoding loop, on the looper's thread, until stop.
    void decodeLoop();
    // Decoding-loop steps (mLock not held while FFmpeg works).
    bool takeQueuedInput(size_t* index);
    void decodeInput(size_t index);
    void drainFrames();
    bool placeFrame();
    sp<AMessage> formatFor(const struct DecodedInfo& info);
    bool waitForWork_l();

    const sp<ALooper> mLooper;
    const Kind mKind;
    const AString mName;

    mutable Mutex mLock;
    Condition mInputFree;    // an input buffer became free, or the state changed
    Condition mOutputReady;  // an output buffer became ready, or the state changed
    Condition mWork;         // input queued, output freed, or stop requested
    Condition mLoopDone;     // the decoding loop has returned
    State mState = State::Initialized;
    bool mLoopRunning = false;
    bool mStopRequested = false;
    sp<AMessage> mFormat;        // as configured
    sp<AMessage> mOutputFormat;  // last announced to the client
    sp<Surface> mSurface;
    std::vector<InputSlot> mInputs;
    std::vector<OutputSlot> mOutputs;
    std::vector<size_t> mQueuedInputs;  // FIFO of queued input indices (mLock)
    std::vector<size_t> mReadyOutputs;  // FIFO of ready output indices (mLock)
    uint64_t mRejectedUnits = 0;
    uint64_t mDecodedFrames = 0;
    uint64_t mEmptyInputs = 0;
    uint64_t mConfigInputs = 0;

    // Touched only on the looper's thread while started (and by start/stop while the
    // loop does not run).
    std::unique_ptr<FFmpegDecoder> mDecoder;
    sp<AMessage> mLastFormat;  // format of the last placed frame
};

}  // namespace android
