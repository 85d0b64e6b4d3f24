#pragma once

#include <cstdint>

namespace TavoPlayer::tsgen {

// Synthetic pictures: scrolling colour bars, a box moving on a path chosen by
// the seed, a field of seeded noise, and the frame number as a row of black and
// white 16x16 blocks (most significant bit first, 24 bits) in the top-left
// corner, so that a decoded picture tells which frame it is.
//
// With a sync-mark period P > 0 the picture is instead black (Y = 16), except
// every P-th frame from frame P on, which is white (Y = 235): the picture half
// of a lip-sync mark. The frame number is drawn on both.
class TestPattern {
public:
    TestPattern(int width, int height, uint32_t seed, int syncMarkPeriod = 0);
    // Fills 8-bit 4:2:0 planes of the given strides for frame number frameIndex.
    void render(int64_t frameIndex, uint8_t* y, int yStride, uint8_t* u, int uStride, uint8_t* v,
                int vStride) const;

    static constexpr int kIndexBits = 24;
    static constexpr int kIndexBlock = 16;
    static constexpr uint8_t kMarkLuma = 235;
    static constexpr uint8_t kDarkLuma = 16;

private:
    void renderBars(int64_t frameIndex, uint8_t* y, int yStride, uint8_t* u, int uStride,
                    uint8_t* v, int vStride) const;
    void renderFrameNumber(int64_t frameIndex, uint8_t* y, int yStride, uint8_t* u, int uStride,
                           uint8_t* v, int vStride) const;

    int mWidth;
    int mHeight;
    uint32_t mSeed;
    int mSyncMarkPeriod;
};

}  // namespace TavoPlayer::tsgen
