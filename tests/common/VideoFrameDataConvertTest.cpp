// The capture's colour conversion: the integer BT.601 factors, clamping, the three
// layouts and their stride rules, and the refusal of other formats.
#include <gtest/gtest.h>

#include <vector>

#include "common/data/VideoFrameData.h"

namespace TavoPlayer {
namespace {

struct Colour {
    uint8_t y, cb, cr;
};

// A 4 x 4 picture of four 2 x 2 blocks of uniform colour, laid out as `format` with
// luma stride 4: semi-planar chroma rows 16 bytes apart (the stride rounded up to 16),
// YV12 rows (stride / 2 rounded up to 16) = 16 bytes apart, Cr plane first.
std::vector<uint8_t> picture(int format, const Colour (&blocks)[4]) {
    std::vector<uint8_t> bytes(16 + 2 * 16 + 2 * 16, 0);
    for (int row = 0; row < 4; ++row)
        for (int col = 0; col < 4; ++col)
            bytes[row * 4 + col] = blocks[(row / 2) * 2 + col / 2].y;
    for (int block = 0; block < 4; ++block) {
        const int row = block / 2, col = block % 2;
        if (format == VideoFrameData::kColorFormatYV12) {
            bytes[16 + row * 16 + col] = blocks[block].cr;
            bytes[16 + (16 * 4) / 2 + row * 16 + col] = blocks[block].cb;
        } else {
            bytes[16 + row * 16 + 2 * col] = blocks[block].cb;
            bytes[16 + row * 16 + 2 * col + 1] = blocks[block].cr;
        }
    }
    return bytes;
}

TEST(VideoFrameDataConvertTest, FactorsClampingAndLayouts) {
    // mid-grey; BT.601 red (dR 156, dG 66, dB -68); Y 255 with V +127 clamps R and B
    // (dG 90); all zero clamps R and B low (dR -180, dG -136, dB -227).
    const Colour blocks[4] = {{128, 128, 128}, {81, 90, 240}, {255, 128, 255}, {0, 0, 0}};
    const uint32_t expected[4] = {0xFF808080u, 0xFFED0F0Du, 0xFFFFA5FFu, 0xFF008800u};
    for (int format :
         {VideoFrameData::kColorFormatYUV420SemiPlanar,
          VideoFrameData::kColorFormatYUV420SemiPlanarAlt, VideoFrameData::kColorFormatYV12}) {
        std::vector<uint8_t> source = picture(format, blocks);
        std::vector<int> pixels(16, 0);
        ASSERT_EQ(0, VideoFrameData::convertFrameFromYvuToRgba(source.data(), pixels.data(), 4, 4,
                                                               format, 4));
        for (int i = 0; i < 16; ++i) {
            const int block = ((i / 4) / 2) * 2 + (i % 4) / 2;
            EXPECT_EQ(expected[block], static_cast<uint32_t>(pixels[i]))
                << "format " << format << " pixel " << i;
        }
    }
}

TEST(VideoFrameDataConvertTest, OtherFormatsAndEmptyPicturesWriteNothing) {
    std::vector<uint8_t> source(64, 128);
    std::vector<int> pixels(16, 7);
    EXPECT_EQ(1,
              VideoFrameData::convertFrameFromYvuToRgba(source.data(), pixels.data(), 4, 4, 19, 4));
    EXPECT_EQ(
        0, VideoFrameData::convertFrameFromYvuToRgba(source.data(), pixels.data(), 0, 4, 261, 4));
    EXPECT_EQ(std::vector<int>(16, 7), pixels);
}

}  // namespace
}  // namespace TavoPlayer
