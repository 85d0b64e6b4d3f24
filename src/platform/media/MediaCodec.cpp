#include "platform/media/MediaCodec.h"

#include <cstdlib>
#include <cstring>

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavutil/error.h>
}

#include "platform/media/FFmpegDecoder.h"
#include "platform/os/Properties.h"
#include "platform/os/Trace.h"

namespace android {

namespace {

constexpr nsecs_t kLoopWaitNs = 100'000'000;

struct Component {
    const char* name;
    const char* mime;
    int kind;  // MediaCodec::Kind as an integer (the enum is private)
};

// The first entry of a type is the one CreateByType gives.
constexpr Component kComponents[] = {
    {"h264", "video/avc", 0},
    {"aac", "audio/mp4a-latm", 1},
    {"OMX.KOV.aac.dec", "audio/mp4a-latm", 1},
    {"mp3", "audio/mpeg", 2},
    {"OMX.KOV.mp3.dec", "audio/mpeg", 2},
};

nsecs_t monotonicNs() {
    return systemTime(SYSTEM_TIME_MONOTONIC);
}

}  // namespace

sp<MediaCodec> MediaCodec::CreateByType(const sp<ALooper>& looper, const AString& mime,
                                        bool encoder, status_t* err, pid_t /*pid*/, uid_t /*uid*/) {
    if (!encoder) {
        for (const Component& component : kComponents) {
            if (mime == component.mime)
                return create(looper, static_cast<Kind>(component.kind), component.name, err);
        }
    }
    if (err != nullptr)
        *err = NAME_NOT_FOUND;
    return nullptr;
}

sp<MediaCodec> MediaCodec::CreateByComponentName(const sp<ALooper>& looper, const AString& name,
                                                 status_t* err, pid_t /*pid*/, uid_t /*uid*/) {
    for (const Component& component : kComponents) {
        if (name == component.name)
            return create(looper, static_cast<Kind>(component.kind), component.name, err);
    }
    if (err != nullptr)
        *err = NAME_NOT_FOUND;
    return nullptr;
}

sp<MediaCodec> MediaCodec::create(const sp<ALooper>& looper, Kind kind, const char* name,
                                  status_t* err) {
    if (looper == nullptr) {
        if (err != nullptr)
            *err = BAD_VALUE;
        return nullptr;
    }
    if (err != nullptr)
        *err = OK;
    return new MediaCodec(looper, kind, name);
}

MediaCodec::MediaCodec(const sp<ALooper>& looper, Kind kind, const char* name)
    : mLooper(looper), mKind(kind), mName(name) {
    const bool video = kind == Kind::Avc;
    const size_t inputs = video ? kVideoInputBuffers : kAudioInputBuffers;
    const size_t inputCapacity = video ? kVideoInputCapacity : kAudioInputCapacity;
    const size_t outputs = video ? kVideoOutputBuffers : kAudioOutputBuffers;
    // Pictures are sized at the first decoded frame; PCM buffers hold the largest
    // frame any of the audio decoders gives.
    const size_t outputCapacity = video ? 0 : kAudioOutputCapacity;
    mInputs.resize(inputs);
    for (InputSlot& slot : mInputs)
        slot.buffer = new MediaCodecBuffer(inputCapacity, AV_INPUT_BUFFER_PADDING_SIZE);
    mOutputs.resize(outputs);
    // Pictures may be shared with the surface after their buffer is refilled; the
    // pool takes their bytes back for the next refill. Two spare blocks cover the
    // surface's last picture and one being captured or presented.
    const std::shared_ptr<ByteBlockPool> pool =
        video ? std::make_shared<ByteBlockPool>(kVideoSpareBlocks) : nullptr;
    for (OutputSlot& slot : mOutputs)
        slot.buffer = new MediaCodecBuffer(outputCapacity, 0, pool);
    mQueuedInputs.reserve(inputs);
    mReadyOutputs.reserve(outputs);
}

MediaCodec::~MediaCodec() {
    release();
}

status_t MediaCodec::getName(AString* name) const {
    if (name == nullptr)
        return BAD_VALUE;
    *name = mName;
    return OK;
}

status_t MediaCodec::configure(const sp<AMessage>& format, const sp<Surface>& nativeWindow,
                               const sp<ICrypto>& crypto, uint32_t flags) {
    Mutex::Autolock lock(mLock);
    if (mState != State::Initialized && mState != State::Configured)
        return INVALID_OPERATION;
    if ((flags & CONFIGURE_FLAG_ENCODE) != 0 || crypto != nullptr) {
        TAVO_LOGE("%s: [%s] encoding and crypto are not supported\n", __func__, mName.c_str());
        return INVALID_OPERATION;
    }
    mFormat = format != nullptr ? format->dup() : sp<AMessage>(new AMessage());
    mSurface = mKind == Kind::Avc ? nativeWindow : nullptr;
    mState = State::Configured;
    return OK;
}

status_t MediaCodec::start() {
    Mutex::Autolock lock(mLock);
    if (mState != State::Configured)
        return INVALID_OPERATION;
    char threads[TavoPlayer::kPropertyValueMax];
    TavoPlayer::property_get("tavoplayer.codec.threads", threads, "0");
    mDecoder =
        std::make_unique<FFmpegDecoder>(mKind == Kind::Avc   ? FFmpegDecoder::Kind::Avc
                                        : mKind == Kind::Aac ? FFmpegDecoder::Kind::Aac
                                                             : FFmpegDecoder::Kind::MpegAudio,
                                        atoi(threads));
    if (!mDecoder->open()) {
        mDecoder.reset();
        return UNKNOWN_ERROR;
    }
    for (InputSlot& slot : mInputs)
        slot.owner = Owner::Codec;
    for (OutputSlot& slot : mOutputs)
        slot.owner = Owner::Codec;
    mQueuedInputs.clear();
    mReadyOutputs.clear();
    mOutputFormat = mFormat;
    mLastFormat.clear();
    mStopRequested = false;
    mLoopRunning = true;
    sp<MediaCodec> self = this;
    if (mLooper->post([self] { self->decodeLoop(); }) != OK) {
        TAVO_LOGE("%s: [%s] the looper does not run\n", __func__, mName.c_str());
        mLoopRunning = false;
        mDecoder.reset();
        return INVALID_OPERATION;
    }
    mState = State::Started;
    return OK;
}

status_t MediaCodec::stop() {
    Mutex::Autolock lock(mLock);
    if (mState == State::Released)
        return INVALID_OPERATION;
    if (mState != State::Started) {
        mState = State::Initialized;
        return OK;
    }
    mStopRequested = true;
    mWork.broadcast();
    // The loop sees the request within one of its waits; FFmpeg's own work on one
    // unit is bounded.
    while (mLoopRunning)
        mLoopDone.waitRelative(mLock, kLoopWaitNs);
    mDecoder.reset();
    for (InputSlot& slot : mInputs)
        slot.owner = Owner::Codec;
    for (OutputSlot& slot : mOutputs) {
        slot.owner = Owner::Codec;
        slot.frame.reset();
    }
    mQueuedInputs.clear();
    mReadyOutputs.clear();
    mState = State::Initialized;
    mInputFree.broadcast();
    mOutputReady.broadcast();
    return OK;
}

status_t MediaCodec::release() {
    stop();
    Mutex::Autolock lock(mLock);
    mSurface.clear();
    mState = State::Released;
    return OK;
}

status_t MediaCodec::getInputBuffers(std::vector<sp<MediaCodecBuffer>>* buffers) const {
    Mutex::Autolock lock(mLock);
    if (buffers == nullptr || mState != State::Started)
        return INVALID_OPERATION;
    buffers->clear();
    for (const InputSlot& slot : mInputs)
        buffers->push_back(slot.buffer);
    return OK;
}

status_t MediaCodec::getOutputBuffers(std::vector<sp<MediaCodecBuffer>>* buffers) const {
    Mutex::Autolock lock(mLock);
    if (buffers == nullptr || mState != State::Started)
        return INVALID_OPERATION;
    buffers->clear();
    for (const OutputSlot& slot : mOutputs)
        buffers->push_back(slot.buffer);
    return OK;
}

status_t MediaCodec::dequeueInputBuffer(size_t* index, int64_t timeoutUs) {
    Mutex::Autolock lock(mLock);
    const nsecs_t deadline = monotonicNs() + timeoutUs * 1000;
    for (;;) {
        if (mState != State::Started)
            return INVALID_OPERATION;
        for (size_t i = 0; i < mInputs.size(); ++i) {
            if (mInputs[i].owner == Owner::Codec) {
                mInputs[i].owner = Owner::Client;
                mInputs[i].buffer->setRange(0, 0);
                *index = i;
                return OK;
            }
        }
        if (timeoutUs == 0)
            return INFO_TRY_AGAIN_LATER;
        const nsecs_t left = timeoutUs < 0 ? kLoopWaitNs : deadline - monotonicNs();
        if (left <= 0)
            return INFO_TRY_AGAIN_LATER;
        mInputFree.waitRelative(mLock, left < kLoopWaitNs ? left : kLoopWaitNs);
    }
}

status_t MediaCodec::queueInputBuffer(size_t index, size_t offset, size_t size,
                                      int64_t presentationTimeUs, uint32_t flags,
                                      AString* errorDetailMsg) {
    Mutex::Autolock lock(mLock);
    if (mState != State::Started)
        return INVALID_OPERATION;
    if (index >= mInputs.size() || mInputs[index].owner != Owner::Client) {
        if (errorDetailMsg != nullptr)
            errorDetailMsg->setTo("input buffer not owned by the client");
        return BAD_VALUE;
    }
    InputSlot& slot = mInputs[index];
    if (slot.buffer->setRange(offset, size) != OK) {
        if (errorDetailMsg != nullptr)
            errorDetailMsg->setTo("range outside the buffer");
        return BAD_VALUE;
    }
    if ((flags & BUFFER_FLAG_CODECCONFIG) != 0)
        ++mConfigInputs;
    if (size == 0) {
        ++mEmptyInputs;
        // Nothing to decode: an empty packet would mean end of stream to FFmpeg.
        slot.owner = Owner::Codec;
        mInputFree.broadcast();
        return OK;
    }
    // The decoder's bit readers may look past the unit's end (FFmpeg's input padding).
    memset(slot.buffer->base() + offset + size, 0, AV_INPUT_BUFFER_PADDING_SIZE);
    slot.ptsUs = presentationTimeUs;
    slot.flags = flags;
    slot.owner = Owner::Queued;
    mQueuedInputs.push_back(index);
    mWork.broadcast();
    return OK;
}

status_t MediaCodec::dequeueOutputBuffer(size_t* index, size_t* offset, size_t* size,
                                         int64_t* presentationTimeUs, uint32_t* flags,
                                         int64_t timeoutUs) {
    Mutex::Autolock lock(mLock);
    const nsecs_t deadline = monotonicNs() + timeoutUs * 1000;
    for (;;) {
        if (mState != State::Started)
            return INVALID_OPERATION;
        if (!mReadyOutputs.empty()) {
            const size_t ready = mReadyOutputs.front();
            OutputSlot& slot = mOutputs[ready];
            if (slot.format != mOutputFormat) {
                mOutputFormat = slot.format;
                return INFO_FORMAT_CHANGED;
            }
            mReadyOutputs.erase(mReadyOutputs.begin());
            slot.owner = Owner::Client;
            *index = ready;
            *offset = slot.buffer->offset();
            *size = slot.buffer->size();
            *presentationTimeUs = slot.ptsUs;
            *flags = slot.flags;
            return OK;
        }
        if (timeoutUs == 0)
            return INFO_TRY_AGAIN_LATER;
        const nsecs_t left = timeoutUs < 0 ? kLoopWaitNs : deadline - monotonicNs();
        if (left <= 0)
            return INFO_TRY_AGAIN_LATER;
        mOutputReady.waitRelative(mLock, left < kLoopWaitNs ? left : kLoopWaitNs);
    }
}

status_t MediaCodec::getOutputFormat(sp<AMessage>* format) const {
    Mutex::Autolock lock(mLock);
    if (format == nullptr)
        return BAD_VALUE;
    const sp<AMessage>& current = mOutputFormat != nullptr ? mOutputFormat : mFormat;
    if (current == nullptr)
        return INVALID_OPERATION;
    *format = current;
    return OK;
}

status_t MediaCodec::renderOutputBufferAndRelease(size_t index) {
    sp<Surface> surface;
    SurfacePicture picture{};
    std::shared_ptr<const void> storage;
    {
        Mutex::Autolock lock(mLock);
        if (mState != State::Started || index >= mOutputs.size() ||
            mOutputs[index].owner != Owner::Client)
            return BAD_VALUE;
        surface = mSurface;
        picture = mOutputs[index].picture;
        if (surface != nullptr && mKind == Kind::Avc) {
            storage = mOutputs[index].frame != nullptr ? mOutputs[index].frame
                                                       : mOutputs[index].buffer->share();
        }
    }
    status_t result = OK;
    // The surface keeps the picture's bytes instead of copying them; the decoding
    // loop refills this buffer into other bytes while they are shared. (The buffer
    // also stays the client's until the surface returns, for a surface that copies.)
    if (surface != nullptr && mKind == Kind::Avc)
        result = surface->showSharedPicture(picture, std::move(storage));
    Mutex::Autolock lock(mLock);
    if (mState == State::Started && mOutputs[index].owner == Owner::Client) {
        mOutputs[index].owner = Owner::Codec;
        mOutputs[index].frame.reset();
        mWork.broadcast();
    }
    return result;
}

status_t MediaCodec::releaseOutputBuffer(size_t index) {
    Mutex::Autolock lock(mLock);
    if (mState != State::Started || index >= mOutputs.size() ||
        mOutputs[index].owner != Owner::Client)
        return BAD_VALUE;
    mOutputs[index].owner = Owner::Codec;
    mOutputs[index].frame.reset();
    mWork.broadcast();
    return OK;
}

uint64_t MediaCodec::rejectedUnits() const {
    Mutex::Autolock lock(mLock);
    return mRejectedUnits;
}

uint64_t MediaCodec::decodedFrames() const {
    Mutex::Autolock lock(mLock);
    return mDecodedFrames;
}

uint64_t MediaCodec::emptyInputs() const {
    Mutex::Autolock lock(mLock);
    return mEmptyInputs;
}

uint64_t MediaCodec::configInputs() const {
    Mutex::Autolock lock(mLock);
    return mConfigInputs;
}

size_t MediaCodec::clientOutputBuffers() const {
    Mutex::Autolock lock(mLock);
    size_t held = 0;
    for (const OutputSlot& slot : mOutputs)
        held += slot.owner == Owner::Client ? 1 : 0;
    return held;
}

// --- the decoding loop (looper thread) ---------------------------------------------

void MediaCodec::decodeLoop() {
    for (;;) {
        if (mDecoder->hasFrame()) {
            if (!placeFrame())
                break;
            continue;
        }
        const int received = mDecoder->receive();
        if (received == 0)
            continue;
        if (received != AVERROR(EAGAIN) && received != AVERROR_EOF) {
            char text[AV_ERROR_MAX_STRING_SIZE];
            av_strerror(received, text, sizeof(text));
            TAVO_LOGW("%s: [%s] decoding error: %s\n", __func__, mName.c_str(), text);
            continue;
        }
        size_t index = 0;
        if (!takeQueuedInput(&index))
            break;
        decodeInput(index);
    }
    if (mDecoder->hasFrame())
        mDecoder->dropFrame();
    Mutex::Autolock lock(mLock);
    mLoopRunning = false;
    mLoopDone.broadcast();
}

bool MediaCodec::takeQueuedInput(size_t* index) {
    Mutex::Autolock lock(mLock);
    while (!mStopRequested && mQueuedInputs.empty())
        mWork.waitRelative(mLock, kLoopWaitNs);
    if (mStopRequested)
        return false;
    *index = mQueuedInputs.front();
    mQueuedInputs.erase(mQueuedInputs.begin());
    return true;
}

void MediaCodec::decodeInput(size_t index) {
    // The slot is the codec's (queued) until it is given back below.
    InputSlot& slot = mInputs[index];
    const uint8_t* data = slot.buffer->data();
    const size_t size = slot.buffer->size();
    bool rejected = false;
    if (mKind == Kind::Aac && (slot.flags & BUFFER_FLAG_CODECCONFIG) != 0) {
        rejected = !mDecoder->setConfig(data, size);
    } else {
        int result = mDecoder->send(data, size, slot.ptsUs);
        if (result == AVERROR(EAGAIN)) {
            // Frames must leave first; place them, then try the unit again.
            while (mDecoder->receive() == 0) {
                if (!placeFrame())
                    break;
            }
            result = mDecoder->send(data, size, slot.ptsUs);
        }
        if (result < 0) {
            char text[AV_ERROR_MAX_STRING_SIZE];
            av_strerror(result, text, sizeof(text));
            TAVO_LOGW("%s: [%s] unit of %zu bytes at %lld us rejected: %s\n", __func__,
                      mName.c_str(), size, static_cast<long long>(slot.ptsUs), text);
            rejected = true;
        }
    }
    Mutex::Autolock lock(mLock);
    if (rejected)
        ++mRejectedUnits;
    if (slot.owner == Owner::Queued) {
        slot.owner = Owner::Codec;
        mInputFree.broadcast();
    }
}

bool MediaCodec::placeFrame() {
    DecodedInfo info;
    if (!mDecoder->describeFrame(&info)) {
        TAVO_LOGW("%s: [%s] decoded frame without a usable format dropped\n", __func__,
                  mName.c_str());
        mDecoder->dropFrame();
        return true;
    }
    size_t index = 0;
    bool toSurface = false;
    {
        Mutex::Autolock lock(mLock);
        toSurface = mSurface != nullptr && mKind == Kind::Avc;
        for (;;) {
            if (mStopRequested) {
                mDecoder->dropFrame();
                return false;
            }
            // A free buffer whose bytes nobody shares is refilled in place; one
            // whose bytes a surface still shows would take a new block.
            bool found = false;
            for (size_t i = 0; i < mOutputs.size(); ++i) {
                if (mOutputs[i].owner != Owner::Codec)
                    continue;
                if (!found || !mOutputs[i].buffer->shared()) {
                    index = i;
                    found = true;
                    if (!mOutputs[i].buffer->shared())
                        break;
                }
            }
            if (found)
                break;
            mWork.waitRelative(mLock, kLoopWaitNs);
        }
        // Still owned by the codec: the client cannot see it until it is Ready.
    }
    OutputSlot& slot = mOutputs[index];
    slot.picture = SurfacePicture{};
    FFmpegDecoder::Planes planes;
    if (toSurface && mDecoder->takePlanes(&planes)) {
        // The surface shows the decoder's planes as they are: no conversion here,
        // and the buffer carries no bytes, as a codec's output does when it renders
        // to a surface. Whoever reads the chroma interleaves it then.
        slot.frame = std::move(planes.owner);
        slot.buffer->setRange(0, 0);
        slot.picture.y = planes.y;
        slot.picture.yStride = planes.yStride;
        slot.picture.cb = planes.cb;
        slot.picture.cr = planes.cr;
        slot.picture.cStride = planes.cStride;
    } else {
        slot.frame.reset();
        slot.buffer->ensureCapacity(info.bytes);
        if (!mDecoder->writeFrame(slot.buffer->base(), slot.buffer->capacity(), info)) {
            Mutex::Autolock lock(mLock);
            ++mRejectedUnits;
            return true;
        }
        slot.buffer->setRange(0, info.bytes);
        uint8_t* base = slot.buffer->base();
        slot.picture.y = base;
        slot.picture.yStride = info.width;
        slot.picture.uv = base + static_cast<size_t>(info.width) * info.height;
        slot.picture.uvStride = (info.width + 1) & ~1;
    }
    slot.ptsUs = info.ptsUs;
    slot.flags = info.keyFrame ? static_cast<uint32_t>(BUFFER_FLAG_SYNCFRAME) : 0u;
    slot.format = formatFor(info);
    if (mKind == Kind::Avc) {
        slot.picture.width = info.width;
        slot.picture.height = info.height;
        slot.picture.ptsUs = info.ptsUs;
        slot.picture.interlaced = info.interlaced;
        slot.picture.topFieldFirst = info.topFieldFirst;
    }
    Mutex::Autolock lock(mLock);
    slot.owner = Owner::Ready;
    mReadyOutputs.push_back(index);
    ++mDecodedFrames;
    mOutputReady.broadcast();
    return true;
}

sp<AMessage> MediaCodec::formatFor(const DecodedInfo& info) {
    if (mLastFormat != nullptr) {
        int32_t a = 0, b = 0, c = 0, d = 0;
        if (mKind == Kind::Avc) {
            int32_t width = 0, height = 0;
            if (mLastFormat->findInt32("width", &width) && width == info.width &&
                mLastFormat->findInt32("height", &height) && height == info.height &&
                mLastFormat->findRect("crop", &a, &b, &c, &d) && a == info.cropLeft &&
                b == info.cropTop && c == info.cropRight && d == info.cropBottom)
                return mLastFormat;
        } else if (mLastFormat->findInt32("sample-rate", &a) && a == info.sampleRate &&
                   mLastFormat->findInt32("channel-count", &b) && b == info.channelCount) {
            return mLastFormat;
        }
    }
    sp<AMessage> format = new AMessage();
    if (mKind == Kind::Avc) {
        format->setString("mime", "video/avc");
        format->setInt32("width", info.width);
        format->setInt32("height", info.height);
        format->setInt32("stride", info.width);
        format->setInt32("slice-height", info.height);
        format->setInt32("color-format", kColorFormatYUV420SemiPlanar);
        format->setRect("crop", info.cropLeft, info.cropTop, info.cropRight, info.cropBottom);
    } else {
        format->setString("mime", mKind == Kind::Aac ? "audio/mp4a-latm" : "audio/mpeg");
        format->setInt32("sample-rate", info.sampleRate);
        format->setInt32("channel-count", info.channelCount);
    }
    mLastFormat = format;
    return format;
}

}  // namespace android
