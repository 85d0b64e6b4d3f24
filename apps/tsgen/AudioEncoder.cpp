#include "AudioEncoder.h"

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavutil/channel_layout.h>
#include <libavutil/error.h>
#include <libavutil/frame.h>
#include <libavutil/mathematics.h>
#include <libavutil/samplefmt.h>
}

#include <algorithm>
#include <cmath>

#include "AvError.h"

namespace TavoPlayer::tsgen {

namespace {

const char* encoderName(AudioCodec codec) {
    switch (codec) {
        case AudioCodec::kAacLatm:
        case AudioCodec::kAacAdts:
            return "aac";
        case AudioCodec::kMp2:
            return "mp2";
        case AudioCodec::kMp3:
            return "libmp3lame";
        case AudioCodec::kNone:
            break;
    }
    return nullptr;
}

}  // namespace

AudioEncoder::AudioEncoder(const Options& options) : mOptions(options) {
    mTotalSamples = static_cast<int64_t>(std::llround(options.durationSec * options.audioRate));
    // A tone per seed, on a 10 Hz grid from 300 Hz to 1.5 kHz, unless asked for;
    // 1 kHz for sync marks, the usual lip-sync beep.
    mToneHz = options.toneHz > 0  ? options.toneHz
              : options.syncMarks ? 1000.0
                                  : 300.0 + 10.0 * (options.seed % 121);
}

AudioEncoder::~AudioEncoder() {
    av_packet_free(&mPacket);
    av_frame_free(&mFrame);
    avcodec_free_context(&mContext);
}

int AudioEncoder::frameSamples() const {
    return mContext != nullptr && mContext->frame_size > 0 ? mContext->frame_size : 1024;
}

int AudioEncoder::open() {
    const char* name = encoderName(mOptions.audioCodec);
    const AVCodec* codec = name ? avcodec_find_encoder_by_name(name) : nullptr;
    if (codec == nullptr) {
        mError = std::string("libavcodec has no ") + (name ? name : "audio") + " encoder";
        return 1;
    }
    mContext = avcodec_alloc_context3(codec);
    mFrame = av_frame_alloc();
    mPacket = av_packet_alloc();
    if (mContext == nullptr || mFrame == nullptr || mPacket == nullptr) {
        mError = "out of memory";
        return 1;
    }
    const AVSampleFormat* formats = codec->sample_fmts;
    mContext->sample_fmt = formats ? formats[0] : AV_SAMPLE_FMT_S16;
    mContext->sample_rate = mOptions.audioRate;
    av_channel_layout_default(&mContext->ch_layout, mOptions.audioChannels);
    mContext->bit_rate = mOptions.effectiveAudioBitrate();
    mContext->time_base = AVRational{1, mOptions.audioRate};
    mContext->thread_count = 1;
    // No encoder version string in the stream: output does not change with it.
    mContext->flags |= AV_CODEC_FLAG_BITEXACT;
    if (mOptions.audioCodec == AudioCodec::kAacLatm ||
        mOptions.audioCodec == AudioCodec::kAacAdts) {
        mContext->profile = FF_PROFILE_AAC_LOW;
        const int index = AacFramer::samplingFrequencyIndex(mOptions.audioRate);
        if (index < 0) {
            mError = "AAC has no sampling frequency index for " +
                     std::to_string(mOptions.audioRate) + " Hz";
            return 1;
        }
        // ISO/IEC 14496-3, Table 1.19: channelConfiguration 1..6 are 1..6 channels
        // (6 being 5.1), which is also FFmpeg's default layout for those counts.
        mFramer = std::make_unique<AacFramer>(2, index, mOptions.audioChannels);
    }
    int rc = avcodec_open2(mContext, codec, nullptr);
    if (rc < 0) {
        mError = std::string("cannot open the ") + name + " encoder: " + avError(rc);
        return 1;
    }
    mPrimingSamples = mContext->initial_padding;
    mFrame->format = mContext->sample_fmt;
    mFrame->nb_samples = frameSamples();
    mFrame->sample_rate = mContext->sample_rate;
    rc = av_channel_layout_copy(&mFrame->ch_layout, &mContext->ch_layout);
    if (rc >= 0) {
        rc = av_frame_get_buffer(mFrame, 0);
    }
    if (rc < 0) {
        mError = "cannot allocate audio samples: " + avError(rc);
        return 1;
    }
    return 0;
}

// Burst length of a sync mark: 40 ms, long enough to be found in any decoded
// frame, short enough to stay one event.
constexpr int64_t kSyncBurstMs = 40;

double AudioEncoder::syncMarkLevel(int64_t inputSample) const {
    // Time stamps count decoded samples from the first picture's PTS, and the
    // decoder gives input sample t back at t + priming (the encoder's delay, which
    // the plain tone does not need to care about): the burst is moved earlier by
    // that much so that its first sample decodes exactly at the mark's PTS.
    const int64_t at = inputSample + mPrimingSamples;
    const int64_t period = mOptions.syncMarkSample(1);
    const int64_t k = period > 0 ? at / period : 0;
    const int64_t burst = kSyncBurstMs * mOptions.audioRate / 1000;
    for (int64_t mark = std::max<int64_t>(1, k - 1); mark <= k + 1; ++mark) {
        const int64_t start = mOptions.syncMarkSample(mark);
        if (at >= start && at < start + burst) {
            const double phase =
                2.0 * M_PI *
                std::fmod(mToneHz * static_cast<double>(at - start), mOptions.audioRate) /
                mOptions.audioRate;
            return 0.5 * std::sin(phase);
        }
    }
    return 0.0;
}

void AudioEncoder::fillTone() {
    const int n = mFrame->nb_samples;
    const int channels = mOptions.audioChannels;
    const auto format = static_cast<AVSampleFormat>(mFrame->format);
    const bool planar = av_sample_fmt_is_planar(format) != 0;
    const AVSampleFormat packed = av_get_packed_sample_fmt(format);
    for (int i = 0; i < n; ++i) {
        const int64_t t = mSamplesSent + i;
        for (int ch = 0; ch < channels; ++ch) {
            // Channel k plays harmonic k + 1 (the right channel an octave up), so
            // that a swap of channels is audible; harmonics above Nyquist fall
            // back to the fundamental.
            double hz = mToneHz * (ch + 1);
            if (hz >= mOptions.audioRate / 2.0) {
                hz = mToneHz;
            }
            // Phase from an integer sample count keeps the tone exact over hours.
            const double phase = 2.0 * M_PI *
                                 std::fmod(hz * static_cast<double>(t), mOptions.audioRate) /
                                 mOptions.audioRate;
            double s = t < mTotalSamples ? 0.25 * std::sin(phase) : 0.0;
            if (mOptions.syncMarks) {
                s = t < mTotalSamples ? syncMarkLevel(t) : 0.0;
            }
            const int plane = planar ? ch : 0;
            const int index = planar ? i : i * channels + ch;
            switch (packed) {
                case AV_SAMPLE_FMT_S16:
                    reinterpret_cast<int16_t*>(mFrame->data[plane])[index] =
                        static_cast<int16_t>(std::lrint(s * 32767.0));
                    break;
                case AV_SAMPLE_FMT_S32:
                    reinterpret_cast<int32_t*>(mFrame->data[plane])[index] =
                        static_cast<int32_t>(std::lrint(s * 2147483647.0));
                    break;
                case AV_SAMPLE_FMT_FLT:
                    reinterpret_cast<float*>(mFrame->data[plane])[index] = static_cast<float>(s);
                    break;
                default:
                    reinterpret_cast<double*>(mFrame->data[plane])[index] = s;
                    break;
            }
        }
    }
}

int AudioEncoder::sendNextFrame() {
    if (mSamplesSent >= mTotalSamples) {
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
    fillTone();
    mFrame->pts = mSamplesSent;
    mSamplesSent += mFrame->nb_samples;
    return avcodec_send_frame(mContext, mFrame);
}

int AudioEncoder::encodeFrame(std::vector<uint8_t>& out) {
    while (true) {
        int rc = avcodec_receive_packet(mContext, mPacket);
        if (rc == 0) {
            break;
        }
        if (rc == AVERROR_EOF) {
            return 1;
        }
        if (rc != AVERROR(EAGAIN)) {
            mError = "audio encoder failed: " + avError(rc);
            return -1;
        }
        rc = sendNextFrame();
        if (rc < 0 && rc != AVERROR_EOF) {
            mError = "audio encoder refused samples: " + avError(rc);
            return -1;
        }
    }
    int rc = 0;
    switch (mOptions.audioCodec) {
        case AudioCodec::kAacLatm:
            rc = mFramer->appendLoas(mPacket->data, static_cast<size_t>(mPacket->size), out,
                                     mEncodedFrames % mOptions.latmConfigInterval == 0);
            break;
        case AudioCodec::kAacAdts:
            rc = mFramer->appendAdts(mPacket->data, static_cast<size_t>(mPacket->size), out);
            break;
        default:
            out.insert(out.end(), mPacket->data, mPacket->data + mPacket->size);
            break;
    }
    av_packet_unref(mPacket);
    ++mEncodedFrames;
    if (rc != 0) {
        mError = "an AAC access unit is too long for its transport";
        return -1;
    }
    return 0;
}

int AudioEncoder::next(PesUnit& unit) {
    if (mEnded) {
        return 1;
    }
    unit.payload.clear();
    // Time stamps count output frames from the first picture's PTS; the
    // encoder's priming delay is not compensated, the tone has no onset to keep.
    unit.pts =
        mOptions.startPts + av_rescale(mFramesOut * frameSamples(), 90000, mOptions.audioRate);
    unit.dts = unit.pts;
    unit.hasDts = false;
    unit.randomAccess = true;
    int frames = 0;
    while (frames < mOptions.audioFramesPerPes) {
        // Stop at the requested duration; the encoder's flush would add frames
        // of silence beyond it.
        if (mFramesOut * frameSamples() >= mTotalSamples) {
            mEnded = true;
            break;
        }
        const int rc = encodeFrame(unit.payload);
        if (rc < 0) {
            return rc;
        }
        if (rc == 1) {
            mEnded = true;
            break;
        }
        ++frames;
        ++mFramesOut;
    }
    return frames > 0 ? 0 : 1;
}

}  // namespace TavoPlayer::tsgen
