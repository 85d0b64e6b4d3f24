#include "decoder/MediaCodecDecoder.h"

#include <pthread.h>
#include <unistd.h>

#include <cstring>
#include <new>

#include "common/data/AudioFragmentData.h"
#include "decoder/AACMediaExtractor.h"
#include "decoder/CaptureThread.h"
#include "decoder/H264MediaExtractor.h"
#include "decoder/MP3MediaExtractor.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

constexpr uint64_t kPtsMask = 0x1FFFFFFFFull;  // 33-bit PTS (ISO/IEC 13818-1, 2.4.3.7)

const char* errorText(android::status_t status) {
    return strerror(status < 0 ? -status : status);
}

}  // namespace

MediaCodecDecoder::MediaCodecDecoder()
    : Decoder("MediaCodecDecoder"),
      mState(0),
      mCodingType(CODING_H264),
      mAudio(false),
      mPendingOutputIndex(-1),
      mPendingOffset(0),
      mPendingSize(0),
      mPendingTimeUs(0),
      mPendingFlags(0),
      mColorFormat(0),
      mDisplayWidth(0),
      mDisplayHeight(0),
      mChannelCount(2),
      mSampleRate(48000),
      mDecoderInfoListener(nullptr) {}

MediaCodecDecoder::~MediaCodecDecoder() {
    {
        android::Mutex::Autolock lock(mLock);
        if (mState == 2)
            stopMediaCodec();
    }
    if (mCaptureThread != nullptr) {
        android::sp<android::Thread> capture = mCaptureThread;
        mCaptureThread.clear();
        joinThread(capture);
    }
    if (mMediaCodec != nullptr)
        mMediaCodec->release();
    mMediaCodec.clear();
    if (mLooper != nullptr)
        mLooper->stop();
}

unsigned int MediaCodecDecoder::configure(codingType_t type) {
    android::Mutex::Autolock lock(mLock);
    if (mLooper != nullptr)
        return REFUSED;
    android::sp<android::AMessage> format = new android::AMessage();
    switch (type) {
        case CODING_H264:
            mExtractor = new H264MediaExtractor(mInput);
            mMime = "video/avc";
            mAudio = false;
            format->setInt32("width", 1920);
            format->setInt32("height", 1080);
            break;
        case CODING_AAC_LATM:
        case CODING_AAC_ADTS:
            mExtractor = new AACMediaExtractor(
                mInput, type == CODING_AAC_LATM ? AACMediaExtractor::TRANSPORT_LAYER_LOAS
                                                : AACMediaExtractor::TRANSPORT_LAYER_ADTS);
            mMime = "audio/mp4a-latm";
            mComponentName = "OMX.KOV.aac.dec";
            mAudio = true;
            format->setInt32("channel-count", mChannelCount);
            format->setInt32("sample-rate", mSampleRate);
            if (type == CODING_AAC_ADTS)
                format->setInt32("is-adts", 1);
            break;
        case CODING_MPEG_AUDIO:
            mExtractor = new MP3MediaExtractor(mInput);
            mMime = "audio/mpeg";
            mComponentName = "OMX.KOV.mp3.dec";
            mAudio = true;
            format->setInt32("channel-count", mChannelCount);
            format->setInt32("sample-rate", mSampleRate);
            break;
        default:
            TAVO_LOGE("%s: Unsupported type: %d\n", __func__, static_cast<int>(type));
            return ERROR_DECODER_UNSUPPORTED_CODING;
    }
    mCodingType = type;
    mFormat = format;
    mFormat->setString("mime", mMime.c_str());
    mLooper = new android::ALooper();
    mLooper->setName("MTVMediaCodecLoop");
    mLooper->start(false, false, 0);
    if (allocateMediaDecoder() != OK) {
        // Carries on without a codec, as on a platform without the component.
        TAVO_LOGE("[%s] %s: Error allocating Media Codec\n", mComponentName.c_str(), __func__);
    }
    mState = 1;
    return OK;
}

unsigned int MediaCodecDecoder::allocateMediaDecoder() {
    if (mAudio) {
        mMediaCodec = android::MediaCodec::CreateByComponentName(mLooper, mComponentName, nullptr,
                                                                 -1, static_cast<uid_t>(-1));
    } else {
        mMediaCodec = android::MediaCodec::CreateByType(mLooper, mMime.c_str(), false, nullptr, -1,
                                                        static_cast<uid_t>(-1));
    }
    if (mMediaCodec == nullptr) {
        TAVO_LOGE("%s: Error creating MediaCodec\n", __func__);
        return ERROR_DECODER_CODEC;
    }
    if (mMediaCodec->getName(&mComponentName) != android::OK) {
        TAVO_LOGE("%s: Error getting decoder name\n", __func__);
        return ERROR_DECODER_CODEC;
    }
    return OK;
}

unsigned int MediaCodecDecoder::start() {
    android::Mutex::Autolock lock(mLock);
    if (mState != 1) {
        TAVO_LOGE("%s: Called in wrong state: %d\n", __func__, static_cast<int>(mState));
        return REFUSED;
    }
    if (mMediaCodec != nullptr && startMediaCodec() != OK)
        return REFUSED;
    mState = 2;
    return OK;
}

unsigned int MediaCodecDecoder::stop() {
    android::Mutex::Autolock lock(mLock);
    if (mState != 2)
        return REFUSED;
    if (stopMediaCodec() != OK) {
        TAVO_LOGE("[%s] %s: Error stopping MediaCodec\n", mComponentName.c_str(), __func__);
        return REFUSED;
    }
    mState = 1;
    return OK;
}

unsigned int MediaCodecDecoder::startMediaCodec() {
    if (mInput == nullptr) {
        TAVO_LOGE("%s: no input Ring Buffer set\n", __func__);
        return ERROR_DECODER_CODEC;
    }
    if (mMediaCodec->configure(mFormat, m_pSurface, nullptr, 0) != android::OK) {
        TAVO_LOGE("%s: Error configuring MediaCodec\n", __func__);
        return ERROR_DECODER_CODEC;
    }
    if (mMediaCodec->start() != android::OK) {
        TAVO_LOGE("[%s] %s: Error starting MediaCodec\n", mComponentName.c_str(), __func__);
        return ERROR_DECODER_CODEC;
    }
    if (mMediaCodec->getInputBuffers(&mInputBuffers) != android::OK) {
        TAVO_LOGE("[%s] %s: Error getting MediaCodec input buffers\n", mComponentName.c_str(),
                  __func__);
        mMediaCodec->stop();
        return ERROR_DECODER_CODEC;
    }
    if (mMediaCodec->getOutputBuffers(&mOutputBuffers) != android::OK) {
        TAVO_LOGE("[%s] %s: Error getting MediaCodec output buffers\n", mComponentName.c_str(),
                  __func__);
        mMediaCodec->stop();
        return ERROR_DECODER_CODEC;
    }
    mPendingOutputIndex = -1;
    m_pInputThread = new InputThread(*this);
    m_pOutputThread = new OutputThread(*this);
    if (m_pInputThread->run("MCInputThread") != android::OK ||
        m_pOutputThread->run("MCOutputThread") != android::OK) {
        TAVO_LOGE("[%s] %s: Error starting MediaCodec\n", mComponentName.c_str(), __func__);
        stopMediaCodec();
        return ERROR_DECODER_CODEC;
    }
    return OK;
}

unsigned int MediaCodecDecoder::joinThread(android::sp<android::Thread>& thread) {
    thread->requestExit();
    if (thread->join() != android::OK)
        return ERROR_TSRECEIVER_PID_OR_THREAD;
    // The thread drops its own reference just after join returns; waiting for that
    // makes this thread release the last one, after everything the thread did.
    for (int i = 0; i < 1000 && thread->getStrongCount() > 1; ++i)
        usleep(1000);
    thread.clear();
    return OK;
}

unsigned int MediaCodecDecoder::stopMediaCodec() {
    if (m_pOutputThread != nullptr) {
        m_pOutputThread->requestExit();
        for (const auto& output : mOutputs)
            output->wakeAll();
        if (joinThread(m_pOutputThread) != OK) {
            TAVO_LOGE("%s - could not stop m_pOutputThread!\n", __func__);
            return ERROR_TSRECEIVER_PID_OR_THREAD;
        }
    }
    if (m_pInputThread != nullptr) {
        m_pInputThread->requestExit();
        if (mInput != nullptr)
            mInput->wakeAll();
        if (joinThread(m_pInputThread) != OK) {
            TAVO_LOGE("%s - could not stop m_pInputThread!\n", __func__);
            return ERROR_TSRECEIVER_PID_OR_THREAD;
        }
    }
    // The workers gave back their ring locks on their way out (a lock is released by
    // the thread that took it); wake whoever waits on the other sides.
    if (mInput != nullptr)
        mInput->wakeAll();
    for (const auto& output : mOutputs)
        output->wakeAll();
    if (mExtractor != nullptr)
        mExtractor->reset();
    mPendingOutputIndex = -1;
    if (mMediaCodec != nullptr && mMediaCodec->stop() != android::OK)
        TAVO_LOGE("[%s] %s: Error stopping MediaCodec\n", mComponentName.c_str(), __func__);
    return OK;
}

unsigned int MediaCodecDecoder::setSurface(android::sp<android::Surface>& surface) {
    bool restart = false;
    {
        android::Mutex::Autolock lock(mLock);
        if (surface == m_pSurface) {
            TAVO_LOGI("[%s] %s: same surface skip setSurface\n", mComponentName.c_str(), __func__);
            return OK;
        }
        m_pSurface = surface;
        if (surface == nullptr)
            return OK;
        if (mState == 2) {
            if (stopMediaCodec() != OK)
                TAVO_LOGE("[%s] %s: Error stopping MediaCodec\n", mComponentName.c_str(), __func__);
            restart = true;
        }
    }
    // The frames written for the old surface go. Done without the module lock: the
    // renderer holds this ring's read lock while it calls renderFrame, which takes
    // the module lock; a late renderFrame meets a stopped codec and does nothing.
    if (restart && !mOutputs.empty())
        mOutputs.front()->reset();
    android::Mutex::Autolock lock(mLock);
    if (mState == 1 || mState == 2) {
        if (mMediaCodec != nullptr)
            mMediaCodec->release();
        mMediaCodec.clear();
        if (allocateMediaDecoder() != OK)
            TAVO_LOGE("[%s] %s: Error allocating Media Codec\n", mComponentName.c_str(), __func__);
    }
    if (mState == 2 && mMediaCodec != nullptr && startMediaCodec() != OK)
        TAVO_LOGE("[%s] %s: Error starting Media Codec\n", mComponentName.c_str(), __func__);
    return OK;
}

android::sp<android::Surface> MediaCodecDecoder::getSurface() {
    android::Mutex::Autolock lock(mLock);
    return m_pSurface;
}

void MediaCodecDecoder::setDecoderInfoListenerListener(DecoderInfoListener* listener) {
    mDecoderInfoListener = listener;
}

void MediaCodecDecoder::renderFrame(bool render, VideoFrameData& frame) {
    android::Mutex::Autolock lock(mLock);
    if (mMediaCodec == nullptr)
        return;
    const auto index = static_cast<size_t>(frame.mBufferIndex);
    if (render)
        mMediaCodec->renderOutputBufferAndRelease(index);
    else
        mMediaCodec->releaseOutputBuffer(index);
}

bool MediaCodecDecoder::captureFrame(VideoFrameData& frame, CaptureFrameListener* listener) {
    if (mCaptureThread != nullptr && mCaptureThread->isRunning()) {
        TAVO_LOGE("%s: Capture is in progress\n", __func__);
        return false;
    }
    const android::sp<android::Surface> surface = getSurface();
    if (surface == nullptr) {
        TAVO_LOGE("%s: m_pSurface is null fail to capture\n", __func__);
        return false;
    }
    if (mCaptureThread != nullptr) {
        // Finished: join it so that its last reference is dropped here.
        android::sp<android::Thread> previous = mCaptureThread;
        mCaptureThread.clear();
        joinThread(previous);
    }
    mCaptureThread = new CaptureThread(frame, listener, surface);
    if (!mCaptureThread->copyFrameContents()) {
        TAVO_LOGE("%s: Failed to copy frame contents to convert color format\n", __func__);
        return false;
    }
    if (mCaptureThread->run("CaptureThread", 1) != android::OK) {
        TAVO_LOGE("%s: Error converting frame\n", __func__);
        return false;
    }
    return true;
}

unsigned int MediaCodecDecoder::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return OK;
    Module::dump(stream, indent);
    const std::string prefix(indent >= 0 ? static_cast<size_t>(indent) + 1 : 1, '\t');
    fprintf(stream, "%s - mState: %u\n", prefix.c_str(), mState);
    fprintf(stream, "%s - mComponentName: %s\n", prefix.c_str(), mComponentName.c_str());
    fprintf(stream, "%s - mMime: %s\n", prefix.c_str(), mMime.c_str());
    fprintf(stream, "%s - mPendingOutputIndex: %d\n", prefix.c_str(), mPendingOutputIndex);
    fprintf(stream, "%s - mDisplay: %ux%u\n", prefix.c_str(), mDisplayWidth, mDisplayHeight);
    fprintf(stream, "%s - mChannelCount: %d mSampleRate: %d\n", prefix.c_str(), mChannelCount,
            mSampleRate);
    return OK;
}

// --- input thread -----------------------------------------------------------------

android::status_t MediaCodecDecoder::InputThread::readyToRun() {
    pthread_setname_np(pthread_self(), "MCInputThread");
    return android::OK;
}

bool MediaCodecDecoder::InputThread::threadLoop() {
    // Turns run here so that the thread can only end through releaseInputOnExit:
    // the extractor may hold the input ring's reader lock between turns.
    while (!exitPending())
        mDecoder.inputLoopOnce();
    mDecoder.releaseInputOnExit();
    return false;
}

void MediaCodecDecoder::releaseInputOnExit() {
    if (mExtractor == nullptr)
        return;
    if (mCodingType == CODING_MPEG_AUDIO)
        static_cast<MP3MediaExtractor*>(mExtractor.get())->giveBackRecord();
    else
        mExtractor->reset();
}

bool MediaCodecDecoder::inputLoopOnce() {
    size_t index = 0;
    const android::status_t dequeued = mMediaCodec->dequeueInputBuffer(&index, kInputTimeoutUs);
    if (dequeued == android::INFO_TRY_AGAIN_LATER || dequeued == android::INVALID_OPERATION)
        return true;
    if (dequeued != android::OK) {
        TAVO_LOGE("[%s] %s: dequeue input returned: %d: %s\n", mComponentName.c_str(), "threadLoop",
                  dequeued, errorText(dequeued));
        return true;
    }
    const android::sp<android::MediaCodecBuffer>& buffer = mInputBuffers[index];
    buffer->setRange(0, 0);
    unsigned long length = 0;
    long long pts = 0;
    unsigned char unitFlags = 0;
    const unsigned int result =
        mExtractor->getDecodableUnit(buffer->base(), buffer->capacity(), &length, &pts, &unitFlags);
    uint32_t flags = 0;
    if (result == MediaExtractor::RESULT_OK && length > 0) {
        if (mCodingType != CODING_H264 && (unitFlags & AACMediaExtractor::FLAG_CODEC_CONFIG) != 0)
            flags |= android::MediaCodec::BUFFER_FLAG_CODECCONFIG;
        if (mCodingType == CODING_H264) {
            if ((unitFlags & H264MediaExtractor::kFlagIdr) != 0)
                flags |= android::MediaCodec::BUFFER_FLAG_SYNCFRAME;
            if ((unitFlags & H264MediaExtractor::kFlagSps) != 0 &&
                mDecoderInfoListener != nullptr) {
                const auto* h264 = static_cast<H264MediaExtractor*>(mExtractor.get());
                mDecoderInfoListener->onVideoResolution(static_cast<int>(h264->getCroppedWidth()),
                                                        static_cast<int>(h264->getCroppedHeight()));
            }
        }
    } else {
        length = 0;
    }
    buffer->setRange(0, length);
    const int64_t timeUs = static_cast<int64_t>(pts) * 1000 / 90;
    android::AString detail;
    const android::status_t queued =
        mMediaCodec->queueInputBuffer(index, 0, length, timeUs, flags, &detail);
    if (queued != android::OK) {
        TAVO_LOGE("[%s] %s: Error queueing buffer on MediaCodec: %s (%d) %s\n",
                  mComponentName.c_str(), "threadLoop", errorText(queued), queued, detail.c_str());
    }
    return true;
}

// --- output thread ----------------------------------------------------------------

android::status_t MediaCodecDecoder::OutputThread::readyToRun() {
    pthread_setname_np(pthread_self(), "MCOutputThread");
    return android::OK;
}

bool MediaCodecDecoder::OutputThread::threadLoop() {
    return mDecoder.outputLoopOnce();
}

bool MediaCodecDecoder::outputLoopOnce() {
    if (mPendingOutputIndex < 0) {
        size_t index = 0;
        const android::status_t result =
            mMediaCodec->dequeueOutputBuffer(&index, &mPendingOffset, &mPendingSize,
                                             &mPendingTimeUs, &mPendingFlags, kOutputTimeoutUs);
        switch (result) {
            case android::OK:
                mPendingOutputIndex = static_cast<int32_t>(index);
                break;
            case android::INFO_TRY_AGAIN_LATER:
            case android::INVALID_OPERATION:
                return true;
            case android::INFO_OUTPUT_BUFFERS_CHANGED:
                if (mMediaCodec->getOutputBuffers(&mOutputBuffers) != android::OK)
                    TAVO_LOGE("[%s] %s: Error getting MediaCodec output buffers\n",
                              mComponentName.c_str(), "threadLoop");
                return true;
            case android::INFO_FORMAT_CHANGED:
                onOutputFormatChanged();
                return true;
            default:
                TAVO_LOGE("[%s] %s: Returning on dequeue output: %d: %s\n", mComponentName.c_str(),
                          "threadLoop", result, errorText(result));
                return true;
        }
    }
    if (mAudio)
        writeAudioRecord();
    else
        writeVideoRecord();
    return true;
}

void MediaCodecDecoder::onOutputFormatChanged() {
    android::sp<android::AMessage> format;
    if (mMediaCodec->getOutputFormat(&format) != android::OK || format == nullptr) {
        TAVO_LOGE("[%s] %s: Error getting new format\n", mComponentName.c_str(), "threadLoop");
        return;
    }
    mFormat = format;
    format->findInt32("sample-rate", &mSampleRate);
    format->findInt32("channel-count", &mChannelCount);
    format->findInt32("color-format", &mColorFormat);
    int32_t left = 0, top = 0, right = 0, bottom = 0;
    if (format->findRect("crop", &left, &top, &right, &bottom)) {
        mDisplayWidth = static_cast<uint32_t>(right + 1 - left);
        mDisplayHeight = static_cast<uint32_t>(bottom + 1 - top);
        if (m_pSurface != nullptr) {
            // The format's rectangle is inclusive; the window's is exclusive.
            const android::android_native_rect_t crop = {left, top, right + 1, bottom + 1};
            if (android::native_window_set_crop(m_pSurface.get(), &crop) != 0)
                TAVO_LOGE("[%s] %s: Failed setting crop on Surface\n", mComponentName.c_str(),
                          "threadLoop");
        }
    }
}

bool MediaCodecDecoder::writeAudioRecord() {
    const auto index = static_cast<size_t>(mPendingOutputIndex);
    if (mOutputs.empty() || index >= mOutputBuffers.size()) {
        mMediaCodec->releaseOutputBuffer(index);
        mPendingOutputIndex = -1;
        return false;
    }
    const android::sp<RingBuffer>& ring = mOutputs.front();
    const uint32_t recordSize = static_cast<uint32_t>(mPendingSize) + kAudioRecordOverhead;
    const uint32_t need = RingBuffer::roundUp4(recordSize);
    if (need > ring->size()) {
        // Could never fit: keeping it pending would stall the codec for good.
        TAVO_LOGE("%s: %u bytes of PCM do not fit the ring\n", __func__, recordSize);
        mMediaCodec->releaseOutputBuffer(index);
        mPendingOutputIndex = -1;
        return false;
    }
    if (!ring->waitForSpace(need))
        return false;  // stays pending; the codec is held back meanwhile
    auto* record = new (ring->writePointer()) AudioFragmentData();
    record->mPTS = static_cast<uint64_t>(mPendingTimeUs * 9 / 100) & kPtsMask;
    record->mNumberChannels = static_cast<uint8_t>(mChannelCount);
    record->mBitsPerSample = 16;
    record->mSamplingRate = static_cast<uint32_t>(mSampleRate);
    memcpy(reinterpret_cast<uint8_t*>(record) + AudioFragmentData::kHeaderSize,
           mOutputBuffers[index]->base() + mPendingOffset, mPendingSize);
    record->mSize = recordSize;
    mMediaCodec->releaseOutputBuffer(index);
    ring->commitWrite(recordSize);
    mPendingOutputIndex = -1;
    return true;
}

bool MediaCodecDecoder::writeVideoRecord() {
    const auto index = static_cast<size_t>(mPendingOutputIndex);
    if (mOutputs.empty()) {
        mMediaCodec->releaseOutputBuffer(index);
        mPendingOutputIndex = -1;
        return false;
    }
    if (mDisplayWidth == 0 && mDisplayHeight == 0) {
        android::sp<android::AMessage> format;
        int32_t width = 0, height = 0;
        if (mMediaCodec->getOutputFormat(&format) == android::OK && format != nullptr) {
            format->findInt32("width", &width);
            format->findInt32("height", &height);
        }
        mDisplayWidth = static_cast<uint32_t>(width);
        mDisplayHeight = static_cast<uint32_t>(height);
        TAVO_LOGI("[%s] %s: w/h is not get...w=%d, h=%d\n", mComponentName.c_str(), "threadLoop",
                  width, height);
    }
    const android::sp<RingBuffer>& ring = mOutputs.front();
    if (!ring->waitForSpace(VideoFrameData::kRecordSize))
        return false;
    auto* record = new (ring->writePointer()) VideoFrameData();
    record->mPTS = static_cast<uint64_t>(mPendingTimeUs * 9 / 100) & kPtsMask;
    record->mColorFormat = mColorFormat;
    record->mBufferIndex = mPendingOutputIndex;
    record->mGraphicBuffer = nullptr;
    record->mListener = this;
    // A key frame (an IDR picture, ITU-T H.264, 7.4.1.2.4) is marked so that the
    // renderer can resume at it.
    record->mFlag = (mPendingFlags & android::MediaCodec::BUFFER_FLAG_SYNCFRAME) != 0 ? 1 : 0;
    record->mReserved = 0;
    record->mCropWidth = mDisplayWidth;
    record->mCropHeight = mDisplayHeight;
    ring->commitWrite(VideoFrameData::kRecordSize);
    mPendingOutputIndex = -1;
    return true;
}

}  // namespace TavoPlayer
