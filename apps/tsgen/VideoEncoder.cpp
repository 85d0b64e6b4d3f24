#include "VideoEncoder.h"

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavutil/error.h>
#include <libavutil/frame.h>
#include <libavutil/mathematics.h>
#include <libavutil/opt.h>
}

#include <cmath>

#include "AvError.h"

#include "H264SpsEditor.h"

namespace TavoPlayer::tsgen {

VideoEncoder::VideoEncoder(const Options& options)
    : mOptions(options),
      mPattern(options.width, options.height, options.seed,
               options.syncMarks ? options.syncMarkPeriodFrames() : 0) {
    mFrameCount =
        std::max<int64_t>(1, std::llround(options.durationSec * options.fpsNum / options.fpsDen));
}

VideoEncoder::~VideoEncoder() {
    av_packet_free(&mPacket);
    av_frame_free(&mFrame);
    avcodec_free_context(&mContext);
}

int64_t VideoEncoder::frameTicks90k() const {
    return 90000LL * mOptions.fpsDen / mOptions.fpsNum;
}

int VideoEncoder::open() {
    const AVCodec* codec = avcodec_find_encoder_by_name("libx264");
    if (codec == nullptr) {
        mError = "libavcodec has no libx264 encoder";
        return 1;
    }
    mContext = avcodec_alloc_context3(codec);
    mFrame = av_frame_alloc();
    mPacket = av_packet_alloc();
    if (mContext == nullptr || mFrame == nullptr || mPacket == nullptr) {
        mError = "out of memory";
        return 1;
    }
    mContext->width = mOptions.width;
    mContext->height = mOptions.height;
    mContext->pix_fmt = AV_PIX_FMT_YUV420P;
    mContext->time_base = AVRational{mOptions.fpsDen, mOptions.fpsNum};
    mContext->framerate = AVRational{mOptions.fpsNum, mOptions.fpsDen};
    mContext->gop_size = mOptions.gop;
    mContext->max_b_frames = mOptions.bframes;
    mContext->bit_rate = mOptions.effectiveVideoBitrate();
    mContext->rc_max_rate = mOptions.effectiveVideoBitrate();
    mContext->rc_buffer_size = static_cast<int>(mOptions.effectiveVideoBitrate() / 2);
    mContext->thread_count = 1;
    // ABNT NBR 15602-1 pictures are BT.709 in limited range.
    mContext->color_primaries = AVCOL_PRI_BT709;
    mContext->color_trc = AVCOL_TRC_BT709;
    mContext->colorspace = AVCOL_SPC_BT709;
    mContext->color_range = AVCOL_RANGE_MPEG;
    mContext->sample_aspect_ratio = AVRational{1, 1};
    if (mOptions.interlaced) {
        mContext->flags |= AV_CODEC_FLAG_INTERLACED_DCT;
        mContext->field_order = AV_FIELD_TT;
    }

    av_opt_set(mContext->priv_data, "preset", mOptions.preset.c_str(), 0);
    av_opt_set_int(mContext->priv_data, "aud", mOptions.aud ? 1 : 0, 0);
    // Every IDR repeats SPS and PPS (x264 does that for closed GOPs with
    // repeat-headers, which libavcodec enables when no global header is asked).
    std::string params =
        "scenecut=0:open-gop=0:sliced-threads=0:lookahead-threads=1:sync-lookahead=0";
    params += ":keyint-min=" + std::to_string(mOptions.gop);
    params += ":bframes=" + std::to_string(mOptions.bframes);
    params += ":b-pyramid=none";
    // pic_struct in picture timing SEI (ITU-T H.264, D.2.3) needs the VUI's
    // pic_struct_present_flag; a stream without VUI cannot carry it.
    params += std::string(":pic-struct=") + (mOptions.picStruct && !mOptions.stripVui ? "1" : "0");
    if (mOptions.interlaced) {
        params += ":tff=1";
    }
    av_opt_set(mContext->priv_data, "x264-params", params.c_str(), 0);

    int rc = avcodec_open2(mContext, codec, nullptr);
    if (rc < 0) {
        mError = "cannot open libx264: " + avError(rc);
        return 1;
    }
    mFrame->format = AV_PIX_FMT_YUV420P;
    mFrame->width = mOptions.width;
    mFrame->height = mOptions.height;
    rc = av_frame_get_buffer(mFrame, 0);
    if (rc < 0) {
        mError = "cannot allocate a picture: " + avError(rc);
        return 1;
    }
    return 0;
}

int VideoEncoder::sendNextFrame() {
    if (mFramesSent >= mFrameCount) {
        if (!mFlushed) {
            mFlushed = true;
            return avcodec_send_frame(mContext, nullptr);
        }
        return AVERROR_EOF;
    }
    int rc = av_frame_make_writable(mFrame);
    if (rc < 0) {
        return rc;
    }
    mPattern.render(mFramesSent, mFrame->data[0], mFrame->linesize[0], mFrame->data[1],
                    mFrame->linesize[1], mFrame->data[2], mFrame->linesize[2]);
    mFrame->pts = mFramesSent;
    mFrame->interlaced_frame = mOptions.interlaced ? 1 : 0;
    mFrame->top_field_first = mOptions.interlaced ? 1 : 0;
    // Closed GOPs of fixed length: every GOP starts with an IDR picture.
    mFrame->pict_type =
        (mFramesSent % mOptions.gop == 0) ? AV_PICTURE_TYPE_I : AV_PICTURE_TYPE_NONE;
    mFrame->key_frame = 0;
    ++mFramesSent;
    return avcodec_send_frame(mContext, mFrame);
}

int VideoEncoder::next(PesUnit& unit) {
    while (true) {
        int rc = avcodec_receive_packet(mContext, mPacket);
        if (rc == 0) {
            break;
        }
        if (rc == AVERROR_EOF) {
            return 1;
        }
        if (rc != AVERROR(EAGAIN)) {
            mError = "libx264 failed: " + avError(rc);
            return -1;
        }
        rc = sendNextFrame();
        if (rc < 0 && rc != AVERROR_EOF) {
            mError = "libx264 refused a picture: " + avError(rc);
            return -1;
        }
    }
    const int64_t ticksNum = 90000LL * mOptions.fpsDen;
    unit.payload.assign(mPacket->data, mPacket->data + mPacket->size);
    unit.pts = mOptions.startPts + av_rescale(mPacket->pts, ticksNum, mOptions.fpsNum);
    unit.dts = mOptions.startPts + av_rescale(mPacket->dts, ticksNum, mOptions.fpsNum);
    unit.hasDts = unit.dts != unit.pts;
    unit.randomAccess = (mPacket->flags & AV_PKT_FLAG_KEY) != 0;
    av_packet_unref(mPacket);
    if (mOptions.stripVui && H264SpsEditor::stripVui(unit.payload) != 0) {
        mError = "cannot rewrite the SPS without VUI";
        return -1;
    }
    return 0;
}

}  // namespace TavoPlayer::tsgen
