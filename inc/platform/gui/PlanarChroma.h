// PlanarChroma: the Cb and Cr planes of a 4:2:0 picture as the decoder gave them,
// interleaved into NV12's Cb/Cr pairs only when someone first reads them. A sink
// that never reads chroma (the null sink) then costs no conversion at all, and one
// that does pays for the chroma alone: the luma plane is the decoder's, unchanged.
//
// Threads: interleaved() may be called from any thread; the first call makes the
// rows, later ones return them. The planes must stay valid and unchanged while the
// object lives (the picture that holds it also holds the decoder's frame).
#pragma once

#include <cstdint>
#include <mutex>
#include <vector>

namespace android {

class PlanarChroma {
public:
    // `pairs` samples per row of each plane, `rows` rows, planes `stride` bytes a row.
    PlanarChroma(const uint8_t* cb, const uint8_t* cr, int32_t stride, int32_t pairs, int32_t rows);

    // Rows of 2 * pairs bytes, Cb first in each pair, packed one after the other.
    const uint8_t* interleaved() const;

    // Writes `rows` rows of `pairs` Cb/Cr pairs to `uv`, `uvStride` bytes apart.
    static void interleave(const uint8_t* cb, const uint8_t* cr, int32_t stride, int32_t pairs,
                           int32_t rows, uint8_t* uv, int32_t uvStride);

private:
    const uint8_t* const mCb;
    const uint8_t* const mCr;
    const int32_t mStride;
    const int32_t mPairs;
    const int32_t mRows;
    mutable std::once_flag mOnce;
    mutable std::vector<uint8_t> mUV;
};

}  // namespace android
