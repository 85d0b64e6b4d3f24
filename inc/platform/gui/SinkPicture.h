// SinkPicture: one shown picture as the sinks and the capture keep it: the crop
// rectangle of a decoded picture, packed as NV12 with no padding (Y rows of
// `width` bytes, then height / 2 rows of `width` bytes of Cb/Cr pairs, Cb first).
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace android {

struct SinkPicture {
    std::vector<uint8_t> data;  // width x height luma bytes, then width x height / 2 chroma
    int32_t width = 0;          // even, as 4:2:0 crops are
    int32_t height = 0;         // even
    int64_t ptsUs = 0;
    uint64_t pts90k = 0;  // ptsUs on the 33-bit 90 kHz clock
    bool interlaced = false;
    bool topFieldFirst = true;

    const uint8_t* y() const { return data.data(); }
    const uint8_t* uv() const { return data.data() + static_cast<size_t>(width) * height; }
    size_t byteSize() const { return static_cast<size_t>(width) * height * 3 / 2; }
};

}  // namespace android
