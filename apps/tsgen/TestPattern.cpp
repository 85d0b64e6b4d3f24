#include "TestPattern.h"

#include <algorithm>
#include <cstddef>
#include <cstring>

namespace TavoPlayer::tsgen {

namespace {

// 75% colour bars (ITU-R BT.601 limited range Y, Cb, Cr): white, yellow, cyan,
// green, magenta, red, blue, black.
constexpr uint8_t kBars[8][3] = {{180, 128, 128}, {162, 44, 142}, {131, 156, 44}, {112, 72, 58},
                                 {84, 184, 198},  {65, 100, 212}, {35, 212, 114}, {16, 128, 128}};

uint32_t mix(uint32_t x) {
    x ^= x >> 16;
    x *= 0x7FEB352DU;
    x ^= x >> 15;
    x *= 0x846CA68BU;
    x ^= x >> 16;
    return x;
}

}  // namespace

TestPattern::TestPattern(int width, int height, uint32_t seed, int syncMarkPeriod)
    : mWidth(width), mHeight(height), mSeed(seed), mSyncMarkPeriod(syncMarkPeriod) {}

void TestPattern::render(int64_t frameIndex, uint8_t* y, int yStride, uint8_t* u, int uStride,
                         uint8_t* v, int vStride) const {
    if (mSyncMarkPeriod > 0) {
        const bool mark = frameIndex > 0 && frameIndex % mSyncMarkPeriod == 0;
        const uint8_t luma = mark ? kMarkLuma : kDarkLuma;
        for (int row = 0; row < mHeight; ++row) {
            std::fill_n(y + static_cast<std::ptrdiff_t>(row) * yStride, mWidth, luma);
        }
        for (int row = 0; row < mHeight / 2; ++row) {
            std::fill_n(u + static_cast<std::ptrdiff_t>(row) * uStride, mWidth / 2, 128);
            std::fill_n(v + static_cast<std::ptrdiff_t>(row) * vStride, mWidth / 2, 128);
        }
    } else {
        renderBars(frameIndex, y, yStride, u, uStride, v, vStride);
    }
    renderFrameNumber(frameIndex, y, yStride, u, uStride, v, vStride);
}

void TestPattern::renderBars(int64_t frameIndex, uint8_t* y, int yStride, uint8_t* u, int uStride,
                             uint8_t* v, int vStride) const {
    const int barWidth = std::max(1, mWidth / 8);
    const int scroll = static_cast<int>((frameIndex * 4 + (mSeed % 97)) % mWidth);
    // The bars are the same on every row: build one row of each plane and copy it.
    uint8_t* firstY = y;
    for (int col = 0; col < mWidth; ++col) {
        const int bar = ((col + scroll) % mWidth) / barWidth;
        firstY[col] = kBars[std::min(bar, 7)][0];
    }
    for (int col = 0; col < mWidth / 2; ++col) {
        const int bar = ((col * 2 + scroll) % mWidth) / barWidth;
        u[col] = kBars[std::min(bar, 7)][1];
        v[col] = kBars[std::min(bar, 7)][2];
    }
    for (int row = 1; row < mHeight; ++row) {
        std::memcpy(y + static_cast<std::ptrdiff_t>(row) * yStride, firstY,
                    static_cast<size_t>(mWidth));
    }
    for (int row = 1; row < mHeight / 2; ++row) {
        std::memcpy(u + static_cast<std::ptrdiff_t>(row) * uStride, u,
                    static_cast<size_t>(mWidth / 2));
        std::memcpy(v + static_cast<std::ptrdiff_t>(row) * vStride, v,
                    static_cast<size_t>(mWidth / 2));
    }

    // Seeded noise in the lower quarter, changing every frame, so that the
    // encoder has real residual to code.
    const int noiseTop = mHeight * 3 / 4;
    const int noiseWidth = mWidth / 4;
    for (int row = noiseTop; row < mHeight; ++row) {
        uint8_t* line = y + static_cast<std::ptrdiff_t>(row) * yStride;
        for (int col = 0; col < noiseWidth; ++col) {
            const uint32_t r =
                mix(mSeed * 0x9E3779B9U ^ static_cast<uint32_t>(frameIndex) * 0x85EBCA6BU ^
                    static_cast<uint32_t>(row * mWidth + col));
            line[col] = static_cast<uint8_t>(16 + r % 220);
        }
    }

    // A box bouncing on a seeded path; it moves between the fields of an
    // interlaced frame only as much as between frames, which is enough motion.
    const int box = std::max(8, mHeight / 8);
    const int spanX = std::max(1, mWidth - box);
    const int spanY = std::max(1, mHeight - box);
    const int64_t t = frameIndex * 6 + (mSeed % 1000);
    const int64_t px = t % (2 * spanX);
    const int64_t py = (t * 2 / 3) % (2 * spanY);
    const int bx = static_cast<int>(px < spanX ? px : 2 * spanX - px);
    const int by = static_cast<int>(py < spanY ? py : 2 * spanY - py);
    for (int row = by; row < by + box && row < mHeight; ++row) {
        std::fill_n(y + static_cast<std::ptrdiff_t>(row) * yStride + bx, std::min(box, mWidth - bx),
                    235);
    }
    for (int row = by / 2; row < (by + box) / 2 && row < mHeight / 2; ++row) {
        const int cx = bx / 2;
        const int cw = std::min(box / 2, mWidth / 2 - cx);
        std::fill_n(u + static_cast<std::ptrdiff_t>(row) * uStride + cx, cw, 128);
        std::fill_n(v + static_cast<std::ptrdiff_t>(row) * vStride + cx, cw, 128);
    }
}

void TestPattern::renderFrameNumber(int64_t frameIndex, uint8_t* y, int yStride, uint8_t* u,
                                    int uStride, uint8_t* v, int vStride) const {
    // Frame number code, on a black band, when the picture is wide enough.
    if (mWidth >= (kIndexBits + 2) * kIndexBlock && mHeight >= 3 * kIndexBlock) {
        for (int row = 0; row < 3 * kIndexBlock; ++row) {
            std::fill_n(y + static_cast<std::ptrdiff_t>(row) * yStride,
                        (kIndexBits + 2) * kIndexBlock, 16);
        }
        for (int row = 0; row < 3 * kIndexBlock / 2; ++row) {
            std::fill_n(u + static_cast<std::ptrdiff_t>(row) * uStride,
                        (kIndexBits + 2) * kIndexBlock / 2, 128);
            std::fill_n(v + static_cast<std::ptrdiff_t>(row) * vStride,
                        (kIndexBits + 2) * kIndexBlock / 2, 128);
        }
        for (int bit = 0; bit < kIndexBits; ++bit) {
            const bool set = ((frameIndex >> (kIndexBits - 1 - bit)) & 1) != 0;
            if (!set) {
                continue;
            }
            const int x0 = (bit + 1) * kIndexBlock;
            for (int row = kIndexBlock; row < 2 * kIndexBlock; ++row) {
                std::fill_n(y + static_cast<std::ptrdiff_t>(row) * yStride + x0, kIndexBlock, 235);
            }
        }
    }
}

}  // namespace TavoPlayer::tsgen
