#include "platform/media/FFmpegDecoder.h"

#include <cstring>
#include <thread>

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavutil/channel_layout.h>
#include <libavutil/error.h>
#include <libavutil/frame.h>
#include <libavutil/opt.h>
#include <libavutil/pixdesc.h>
#include <libswresample/swresample.h>
#include <libswscale/swscale.h>
}

#include "platform/os/ThreadName.h"
#include "platform/os/Trace.h"

namespace android {

namespace {

const char* errorText(int error, char* buffer, size_t size) {
    av_strerror(error, buffer, size);
    return buffer;
}

// ISO/IEC 11172-3, 2.4.2.3: layer is 11 for Layer I, 10 for II, 01 for III.
AVCodecID mpegAudioCodecFor(const uint8_t* data, size_t size) {
    if (size < 4 || data[0] != 0xFF || (data[1] & 0xE0) != 0xE0)
        return AV_CODEC_ID_NONE;
    switch ((data[1] >> 1) & 3) {
        case 3:
            return AV_CODEC_ID_MP1;
        case 2:
            return AV_CODEC_ID_MP2;
        case 1:
            return AV_CODEC_ID_MP3;
        default:
            return AV_CODEC_ID_NONE;
    }
}

}  // namespace

FFmpegDecoder::FFmpegDecoder(Kind kind, int threads) : mKind(kind), mThreads(threads) {
    mFrame = av_frame_alloc();
    mPacket = av_packet_alloc();
}

FFmpegDecoder::~FFmpegDecoder() {
    close();
    av_frame_free(&mFrame);
    av_packet_free(&mPacket);
    sws_freeContext(mSws);
    swr_free(&mSwr);
}

void FFmpegDecoder::close() {
    if (mHaveFrame)
        dropFrame();
    avcodec_free_context(&mContext);
}

bool FFmpegDecoder::open() {
    if (mKind != Kind::Avc)
        return true;  // audio opens once its configuration or first header is known
    return openCodec("h264", nullptr, 0);
}

bool FFmpegDecoder::openCodec(const char* name, const uint8_t* extradata, size_t extradataSize) {
    close();
    if (mFrame == nullptr || mPacket == nullptr) {
        TAVO_LOGE("%s: out of memory\n", __func__);
        return false;
    }
    AVCodecID id = AV_CODEC_ID_NONE;
    if (strcmp(name, "h264") == 0)
        id = AV_CODEC_ID_H264;
    else if (strcmp(name, "aac") == 0)
        id = AV_CODEC_ID_AAC;
    else if (strcmp(name, "mp1") == 0)
        id = AV_CODEC_ID_MP1;
    else if (strcmp(name, "mp2") == 0)
        id = AV_CODEC_ID_MP2;
    else if (strcmp(name, "mp3") == 0)
        id = AV_CODEC_ID_MP3;
    // By identifier, not by name: the same decoder FFmpeg's own tools pick.
    const AVCodec* codec = avcodec_find_decoder(id);
    if (codec == nullptr) {
        TAVO_LOGE("%s: no FFmpeg decoder for %s\n", __func__, name);
        return false;
    }
    mContext = avcodec_alloc_context3(codec);
    if (mContext == nullptr) {
        TAVO_LOGE("%s: out of memory\n", __func__);
        return false;
    }
    mContext->pkt_timebase = AVRational{1, 1000000};
    if (mKind == Kind::Avc) {
        const unsigned cores = std::thread::hardware_concurrency();
        mContext->thread_count =
            mThreads > 0 ? mThreads : (cores > 0 ? static_cast<int>(cores) : 1);
        mContext->thread_type = FF_THREAD_FRAME;
        // The SPS's frame_cropping (ITU-T H.264, 7.4.2.1.1) goes to the output
        // format as the crop rectangle; the buffer keeps the coded size.
        mContext->apply_cropping = 0;
    }
    if (extradata != nullptr && extradataSize > 0) {
        mContext->extradata =
            static_cast<uint8_t*>(av_mallocz(extradataSize + AV_INPUT_BUFFER_PADDING_SIZE));
        if (mContext->extradata == nullptr) {
            avcodec_free_context(&mContext);
            return false;
        }
        memcpy(mContext->extradata, extradata, extradataSize);
        mContext->extradata_size = static_cast<int>(extradataSize);
    }
    int result;
    {
        // The frame-threading workers start here: they carry this name, not the name
        // of whichever thread (a binder thread, the codec looper) opened the codec.
        TavoPlayer::ScopedThreadName workers(mKind == Kind::Avc ? "H264Decoder" : "AudioDecoder");
        result = avcodec_open2(mContext, codec, nullptr);
    }
    if (result < 0) {
        char text[AV_ERROR_MAX_STRING_SIZE];
        TAVO_LOGE("%s: FFmpeg cannot open %s: %s\n", __func__, name,
                  errorText(result, text, sizeof(text)));
        avcodec_free_context(&mContext);
        return false;
    }
    return true;
}

bool FFmpegDecoder::setConfig(const uint8_t* data, size_t size) {
    if (mKind != Kind::Aac)
        return true;
    if (mContext != nullptr && mConfig.size() == size &&
        (size == 0 || memcmp(mConfig.data(), data, size) == 0))
        return true;
    mConfig.assign(data, data + size);
    if (!openCodec("aac", data, size)) {
        mConfig.clear();
        return false;
    }
    return true;
}

int FFmpegDecoder::send(const uint8_t* data, size_t size, int64_t ptsUs) {
    if (mContext == nullptr && mKind == Kind::MpegAudio) {
        const AVCodecID id = mpegAudioCodecFor(data, size);
        const char* name = id == AV_CODEC_ID_MP1   ? "mp1"
                           : id == AV_CODEC_ID_MP2 ? "mp2"
                           : id == AV_CODEC_ID_MP3 ? "mp3"
                                                   : nullptr;
        if (name == nullptr || !openCodec(name, nullptr, 0))
            return AVERROR_INVALIDDATA;
    }
    if (mContext == nullptr)
        return AVERROR_INVALIDDATA;  // AAC before its configuration
    // Not reference counted: FFmpeg copies the bytes, so the input buffer is free
    // again as soon as this returns.
    av_packet_unref(mPacket);
    mPacket->data = const_cast<uint8_t*>(data);
    mPacket->size = static_cast<int>(size);
    mPacket->pts = ptsUs;
    mPacket->dts = AV_NOPTS_VALUE;
    const int result = avcodec_send_packet(mContext, mPacket);
    mPacket->data = nullptr;
    mPacket->size = 0;
    return result;
}

int FFmpegDecoder::receive() {
    if (mContext == nullptr)
        return AVERROR(EAGAIN);
    if (mHaveFrame)
        return 0;
    const int result = avcodec_receive_frame(mContext, mFrame);
    mHaveFrame = result == 0;
    return result;
}

void FFmpegDecoder::dropFrame() {
    av_frame_unref(mFrame);
    mHaveFrame = false;
}

bool FFmpegDecoder::describeFrame(DecodedInfo* info) {
    if (!mHaveFrame)
        return false;
    *info = DecodedInfo{};
    info->ptsUs = mFrame->pts != AV_NOPTS_VALUE ? mFrame->pts : mFrame->best_effort_timestamp;
    if (info->ptsUs == AV_NOPTS_VALUE)
        info->ptsUs = 0;
    info->keyFrame = mFrame->key_frame != 0;
    if (mKind == Kind::Avc) {
        const int width = mFrame->width;
        const int height = mFrame->height;
        if (width <= 0 || height <= 0)
            return false;
        info->width = width;
        info->height = height;
        const auto cropWithin = [](size_t crop, int size) {
            return crop < static_cast<size_t>(size) ? static_cast<int32_t>(crop) : 0;
        };
        info->cropLeft = cropWithin(mFrame->crop_left, width);
        info->cropTop = cropWithin(mFrame->crop_top, height);
        info->cropRight = width - 1 - cropWithin(mFrame->crop_right, width - info->cropLeft);
        info->cropBottom = height - 1 - cropWithin(mFrame->crop_bottom, height - info->cropTop);
        info->interlaced = mFrame->interlaced_frame != 0;
        info->topFieldFirst = mFrame->top_field_first != 0;
        const size_t uvStride = (static_cast<size_t>(width) + 1) & ~static_cast<size_t>(1);
        info->bytes = static_cast<size_t>(width) * height + uvStride * ((height + 1) / 2);
        return true;
    }
    info->sampleRate = mFrame->sample_rate;
    info->channelCount = mFrame->ch_layout.nb_channels;
    if (info->sampleRate <= 0 || info->channelCount <= 0 || mFrame->nb_samples < 0)
        return false;
    info->bytes = static_cast<size_t>(mFrame->nb_samples) * info->channelCount * 2;
    return true;
}

bool FFmpegDecoder::takePlanes(Planes* planes) {
    if (!mHaveFrame || mKind != Kind::Avc)
        return false;
    const auto format = static_cast<AVPixelFormat>(mFrame->format);
    if ((format != AV_PIX_FMT_YUV420P && format != AV_PIX_FMT_YUVJ420P) ||
        mFrame->linesize[0] <= 0 || mFrame->linesize[1] <= 0 ||
        mFrame->linesize[1] != mFrame->linesize[2]) {
        return false;
    }
    AVFrame* frame = av_frame_alloc();
    if (frame == nullptr)
        return false;
    av_frame_move_ref(frame, mFrame);
    mHaveFrame = false;
    planes->y = frame->data[0];
    planes->cb = frame->data[1];
    planes->cr = frame->data[2];
    planes->yStride = frame->linesize[0];
    planes->cStride = frame->linesize[1];
    // The frame's buffers go back to the decoder's pool when the last holder lets go.
    planes->owner = std::shared_ptr<const void>(frame, [](const void* held) {
        AVFrame* owned = static_cast<AVFrame*>(const_cast<void*>(held));
        av_frame_free(&owned);
    });
    return true;
}

bool FFmpegDecoder::writeFrame(uint8_t* out, size_t capacity, const DecodedInfo& info) {
    if (!mHaveFrame || info.bytes > capacity) {
        TAVO_LOGW("%s: frame of %zu bytes does not fit %zu\n", __func__, info.bytes, capacity);
        dropFrame();
        return false;
    }
    bool ok = true;
    if (mKind == Kind::Avc) {
        const int width = info.width;
        const int height = info.height;
        const int uvStride = (width + 1) & ~1;
        uint8_t* planes[4] = {out, out + static_cast<size_t>(width) * height, nullptr, nullptr};
        int strides[4] = {width, uvStride, 0, 0};
        const auto format = static_cast<AVPixelFormat>(mFrame->format);
        mSws = sws_getCachedContext(mSws, width, height, format, width, height, AV_PIX_FMT_NV12,
                                    SWS_POINT, nullptr, nullptr, nullptr);
        if (mSws == nullptr) {
            TAVO_LOGE("%s: no conversion from %s to nv12\n", __func__,
                      av_get_pix_fmt_name(format) != nullptr ? av_get_pix_fmt_name(format) : "?");
            ok = false;
        } else {
            ok = sws_scale(mSws, mFrame->data, mFrame->linesize, 0, height, planes, strides) ==
                 height;
        }
    } else {
        const int channels = info.channelCount;
        const int format = mFrame->format;
        if (format == AV_SAMPLE_FMT_S16) {
            memcpy(out, mFrame->extended_data[0], info.bytes);
        } else {
            if (mSwr == nullptr || mSwrFormat != format || mSwrRate != info.sampleRate ||
                mSwrChannels != channels) {
                swr_free(&mSwr);
                const int result = swr_alloc_set_opts2(&mSwr, &mFrame->ch_layout, AV_SAMPLE_FMT_S16,
                                                       info.sampleRate, &mFrame->ch_layout,
                                                       static_cast<AVSampleFormat>(format),
                                                       info.sampleRate, 0, nullptr);
                if (result < 0 || swr_init(mSwr) < 0) {
                    TAVO_LOGE("%s: no conversion to s16 for this audio\n", __func__);
                    swr_free(&mSwr);
                    dropFrame();
                    return false;
                }
                mSwrFormat = format;
                mSwrRate = info.sampleRate;
                mSwrChannels = channels;
            }
            uint8_t* planes[1] = {out};
            const int samples =
                swr_convert(mSwr, planes, mFrame->nb_samples,
                            const_cast<const uint8_t**>(mFrame->extended_data), mFrame->nb_samples);
            ok = samples == mFrame->nb_samples;
        }
    }
    dropFrame();
    return ok;
}

}  // namespace android
