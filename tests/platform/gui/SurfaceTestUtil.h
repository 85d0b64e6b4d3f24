// Pictures and sink settings for the surface tests.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/gui/Surface.h"

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

// Sets the sink properties through the environment for the fixture's lifetime.
class ScopedSinkProperties {
public:
    explicit ScopedSinkProperties(const std::string& sink, const std::string& logPath = "");
    ~ScopedSinkProperties();
};

std::string readFile(const std::string& path);
// Standard output of a shell command.
std::string runCommand(const std::string& command);

}  // namespace android::test
