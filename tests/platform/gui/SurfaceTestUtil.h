// Pictures and sink settings for the surface tests.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/gui/Surface.h"
#include "support/RunCommand.h"
#include "support/ScopedEnv.h"

namespace android::test {

// An NV12 picture whose rows are padded (as decoder buffers are), filled with a
// pattern that differs per `seed`, or with one flat colour.
struct TestPicture {
    TestPicture(int32_t width, int32_t height, int seed, int64_t ptsUs);
    TestPicture(int32_t width, int32_t height, uint8_t y, uint8_t cb, uint8_t cr);
    SurfacePicture picture() const;
    uint8_t lumaAt(int32_t row, int32_t column) const { return y[row * stride + column]; }
    uint8_t chromaAt(int32_t chromaRow, int32_t byte) const {
        return uv[chromaRow * stride + byte];
    }

    int32_t width;
    int32_t height;
    int32_t stride;
    int64_t ptsUs;
    std::vector<uint8_t> y;
    std::vector<uint8_t> uv;
};

// The sink properties, set through the environment while it lives.
struct ScopedSinkProperties {
    explicit ScopedSinkProperties(const std::string& sink, const std::string& logPath = "")
        : propertyFile("TAVOPLAYER_PROPERTIES", "/dev/null"),
          videoSink("TAVOPLAYER_PROP_tavoplayer_video_sink", sink),
          videoLog("TAVOPLAYER_PROP_tavoplayer_video_log", logPath) {}
    TavoPlayer::test::ScopedEnv propertyFile, videoSink, videoLog;
};

using TavoPlayer::test::fileText;
using TavoPlayer::test::runCommand;

}  // namespace android::test
