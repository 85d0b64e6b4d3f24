#pragma once

#include <cstdint>

namespace TavoPlayer::tsgen {

// Synthetic pictures: scrolling colour bars, a box moving on a path chosen by
// the seed, a field of seeded noise, and the frame number as a row of black and
// white 16x16 blocks (most significant bit first, 24 bits) in the top-left
// corner, so that a decoded picture tells which frame it is.
class TestPattern {
public:
    TestPattern(int width, int height, uint32_t seed);
    // Fills 8-bit 4:2:0 planes of the given strides for frame number frameIndex.
    void render(int64_t frameIndex, uint8_t* y, int yStride, uint8_t* u, int uStride, uint8_t* v,
                int vStride) const;

    static constexpr int kIndexBits = 24;
    static constexpr int kIndexBlock = 16;

private:
    int mWidth;
    int mHeight;
    uint32_t mSeed;
};

}  // namespace TavoPlayer::tsgen
