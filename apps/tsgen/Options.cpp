#include "Options.h"

#include <algorithm>

namespace TavoPlayer::tsgen {

int Options::effectiveAudioStreamType() const {
    if (audioStreamType >= 0) {
        return audioStreamType;
    }
    switch (audioCodec) {
        case AudioCodec::kAacLatm:
            return 0x11;  // ISO/IEC 13818-1, Table 2-34: ISO/IEC 14496-3 audio with LATM
        case AudioCodec::kAacAdts:
            return 0x0F;  // ISO/IEC 13818-7 audio with ADTS transport syntax
        case AudioCodec::kMp2:
        case AudioCodec::kMp3:
            // MPEG-1 audio at 32/44.1/48 kHz, MPEG-2 (LSF) audio below.
            return audioRate >= 32000 ? 0x03 : 0x04;
        case AudioCodec::kNone:
            break;
    }
    return 0;
}

int64_t Options::effectiveVideoBitrate() const {
    if (videoBitrate > 0) {
        return videoBitrate;
    }
    // 8 Mbit/s for a 1920x1080 picture, scaled by area, at least 300 kbit/s.
    const double area = static_cast<double>(width) * height;
    const double rate = 8.0e6 * area / (1920.0 * 1080.0);
    return std::max<int64_t>(300000, static_cast<int64_t>(rate));
}

int64_t Options::effectiveAudioBitrate() const {
    if (audioBitrate > 0) {
        return audioBitrate;
    }
    switch (audioCodec) {
        // MPEG-2 low sampling rates (ISO/IEC 13818-3) allow at most 160 kbit/s.
        case AudioCodec::kMp2:
            return audioRate >= 32000 ? 192000 : 96000;
        case AudioCodec::kMp3:
            return audioRate >= 32000 ? 128000 : 64000;
        default:
            return audioChannels > 2 ? 320000 : audioChannels > 1 ? 128000 : 64000;
    }
}

int64_t Options::effectiveMuxRate() const {
    if (muxRate > 0) {
        return muxRate;
    }
    // Room for the video rate control's peaks, the audio, captions and tables.
    const int64_t audio = audioCodec == AudioCodec::kNone ? 0 : effectiveAudioBitrate();
    const int64_t raw = effectiveVideoBitrate() * 3 / 2 + audio * 5 / 4 + 400000;
    const int64_t step = 188 * 8 * 100;
    return (raw + step - 1) / step * step;
}

int Options::syncMarkPeriodFrames() const {
    return std::max(1, (fpsNum + fpsDen / 2) / fpsDen);
}

int64_t Options::syncMarkSample(int64_t k) const {
    // Picture n is shown at n * fpsDen / fpsNum seconds; its sample, rounded to
    // the nearest (exact at 29.97 Hz and 48 kHz: 48048 samples per mark).
    const int64_t num = k * syncMarkPeriodFrames() * static_cast<int64_t>(fpsDen) * audioRate;
    return (num + fpsNum / 2) / fpsNum;
}

}  // namespace TavoPlayer::tsgen
