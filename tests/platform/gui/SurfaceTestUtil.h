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
    TestPicture(int32_t w, int32_t h, int seed, int64_t pts)
        : width(w), height(h), stride(w + 32), ptsUs(pts) {
        y.resize(static_cast<size_t>(stride) * h);
        uv.resize(static_cast<size_t>(stride) * h / 2);
        for (size_t i = 0; i < y.size(); ++i)
            y[i] = static_cast<uint8_t>((i * 7 + seed * 13) & 0xFF);
        for (size_t i = 0; i < uv.size(); ++i)
            uv[i] = static_cast<uint8_t>((i * 5 + seed * 29 + 1) & 0xFF);
    }
    TestPicture(int32_t w, int32_t h, uint8_t luma, uint8_t cb, uint8_t cr)
        : width(w), height(h), stride(w), ptsUs(0), y(static_cast<size_t>(w) * h, luma) {
        uv.resize(static_cast<size_t>(w) * h / 2);
        for (size_t i = 0; i < uv.size(); i += 2) {
            uv[i] = cb;
            uv[i + 1] = cr;
        }
    }
    SurfacePicture picture() const {
        return SurfacePicture{y.data(), stride, uv.data(), stride, width,
                              height,   ptsUs,  false,     true};
    }
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
