#include "platform/gui/PlanarChroma.h"

#include <cstddef>

namespace android {

PlanarChroma::PlanarChroma(const uint8_t* cb, const uint8_t* cr, int32_t stride, int32_t pairs,
                           int32_t rows)
    : mCb(cb), mCr(cr), mStride(stride), mPairs(pairs), mRows(rows) {}

const uint8_t* PlanarChroma::interleaved() const {
    std::call_once(mOnce, [this] {
        mUV.resize(static_cast<size_t>(mPairs) * 2 * mRows);
        interleave(mCb, mCr, mStride, mPairs, mRows, mUV.data(), mPairs * 2);
    });
    return mUV.data();
}

void PlanarChroma::interleave(const uint8_t* cb, const uint8_t* cr, int32_t stride, int32_t pairs,
                              int32_t rows, uint8_t* uv, int32_t uvStride) {
    for (int32_t row = 0; row < rows; ++row) {
        const uint8_t* u = cb + static_cast<size_t>(row) * stride;
        const uint8_t* v = cr + static_cast<size_t>(row) * stride;
        uint8_t* out = uv + static_cast<size_t>(row) * uvStride;
        for (int32_t i = 0; i < pairs; ++i) {
            out[2 * i] = u[i];
            out[2 * i + 1] = v[i];
        }
    }
}

}  // namespace android
