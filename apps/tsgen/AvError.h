// FFmpeg's text for an error code, for tsgen's messages.
#pragma once

extern "C" {
#include <libavutil/error.h>
}

#include <string>

namespace TavoPlayer::tsgen {

inline std::string avError(int code) {
    char text[AV_ERROR_MAX_STRING_SIZE] = {};
    av_strerror(code, text, sizeof text);
    return text;
}

}  // namespace TavoPlayer::tsgen
