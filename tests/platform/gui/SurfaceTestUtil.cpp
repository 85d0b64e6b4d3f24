#include "SurfaceTestUtil.h"

namespace android::test {

TestPicture::TestPicture(int32_t w, int32_t h, int seed, int64_t pts)
    : width(w), height(h), stride(w + 32), ptsUs(pts) {
    y.resize(static_cast<size_t>(stride) * h);
    uv.resize(static_cast<size_t>(stride) * h / 2);
    for (size_t i = 0; i < y.size(); ++i)
        y[i] = static_cast<uint8_t>((i * 7 + seed * 13) & 0xFF);
    for (size_t i = 0; i < uv.size(); ++i)
        uv[i] = static_cast<uint8_t>((i * 5 + seed * 29 + 1) & 0xFF);
}

TestPicture::TestPicture(int32_t w, int32_t h, uint8_t luma, uint8_t cb, uint8_t cr)
    : width(w), height(h), stride(w), ptsUs(0) {
    y.assign(static_cast<size_t>(w) * h, luma);
    uv.resize(static_cast<size_t>(w) * h / 2);
    for (size_t i = 0; i < uv.size(); i += 2) {
        uv[i] = cb;
        uv[i + 1] = cr;
    }
}

SurfacePicture TestPicture::picture() const {
    return SurfacePicture{y.data(), stride, uv.data(), stride, width, height, ptsUs, false, true};
}

}  // namespace android::test
