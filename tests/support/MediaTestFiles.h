// Short media files made by the ffmpeg program at test time (never downloaded, never
// checked in), in a temporary folder removed at destruction, and the null sinks set
// for the platform's media player so tests behave alike with or without a display.
#pragma once

#include <string>

#include "support/ScopedEnv.h"

namespace TavoPlayer::test {

class MediaTestFiles {
public:
    // Every file lasts kSeconds; video has a key frame every second (25 fps, GOP 25).
    static constexpr int kSeconds = 2;

    MediaTestFiles();
    MediaTestFiles(const MediaTestFiles&) = delete;
    MediaTestFiles& operator=(const MediaTestFiles&) = delete;

    // False (with the reason in error()) when ffmpeg is missing or failed.
    bool ok() const { return mError.empty(); }
    const std::string& error() const { return mError; }

    std::string mp4() const { return mDir / "av.mp4"; }               // H.264 320x240 + AAC
    std::string audioOnly() const { return mDir / "audio.m4a"; }      // AAC
    std::string truncated() const { return mDir / "truncated.mp4"; }  // first 60 %
    std::string notMedia() const { return mDir / "text.mp4"; }        // plain text
    std::string missing() const { return mDir / "missing.mp4"; }

private:
    TempDir mDir{"tavo-media"};
    std::string mError;
};

}  // namespace TavoPlayer::test
