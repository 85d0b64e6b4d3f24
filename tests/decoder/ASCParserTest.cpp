// The AudioSpecificConfig writer: exact bytes for the configurations broadcasts use,
// the escape of object types above 31 and the explicit frequency (ISO/IEC 14496-3,
// 1.6.2.1).
#include "decoder/ASCParser.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/NamedRow.h"

namespace TavoPlayer {
namespace {

struct AscCase {
    std::string name;
    int32_t aot;
    uint32_t sfi;
    uint32_t sf;
    uint32_t channels;
    int32_t extAot;
    uint32_t extSfi;
    uint32_t extSf;
    std::vector<uint8_t> expected;  // all 10 bytes
};
using test::PrintTo;

std::vector<AscCase> ascCases() {
    // clang-format off
    return {
        // 00010 0011 0010 -> 11 90
        {"LcAt48kStereo", 2, 3, 48000, 2, -1, 0, 0, {0x11, 0x90, 0, 0, 0, 0, 0, 0, 0, 0}},
        // 00101 0110 0010 0011 00010 -> 2B 11 88
        {"HeAacCore24kExtension48k", 2, 6, 24000, 2, 5, 3, 48000, {0x2B, 0x11, 0x88, 0, 0, 0, 0, 0, 0, 0}},
        // 00010 0100 0001 -> 12 08 (the ExoPlayer ADTS sample: 44.1 kHz mono)
        {"LcAt44kMono", 2, 4, 44100, 1, -1, 0, 0, {0x12, 0x08, 0, 0, 0, 0, 0, 0, 0, 0}},
        // 5.1 at 48 kHz: 00010 0011 0110 -> 11 B0
        {"LcAt48kFivePointOne", 2, 3, 48000, 6, -1, 0, 0, {0x11, 0xB0, 0, 0, 0, 0, 0, 0, 0, 0}},
        // An extension type other than SBR is not written.
        {"PsExtensionIsNotSbr", 2, 3, 48000, 2, 29, 3, 48000, {0x11, 0x90, 0, 0, 0, 0, 0, 0, 0, 0}},
        // Object type 42 escapes: 11111 001010, then 0011 0010 -> F9 46 40
        {"EscapedObjectType", 42, 3, 48000, 2, -1, 0, 0, {0xF9, 0x46, 0x40, 0, 0, 0, 0, 0, 0, 0}},
        // Index 15 carries the frequency in 24 bits: 00010 1111 0x00BB80 0010
        // -> 00010111 10000000 01011101 11000000 00010... = 17 80 5D C0 10
        {"ExplicitFrequency", 2, 15, 48000, 2, -1, 0, 0, {0x17, 0x80, 0x5D, 0xC0, 0x10, 0, 0, 0, 0, 0}},
    };
    // clang-format on
}

class ASCParserBytesTest : public ::testing::TestWithParam<AscCase> {};

TEST_P(ASCParserBytesTest, WritesTheConfigurationInTenBytes) {
    const AscCase& c = GetParam();
    ASCParser parser;
    parser.mAudioObjectType = c.aot;
    parser.mSamplingFrequencyIndex = c.sfi;
    parser.mSamplingFrequency = c.sf;
    parser.mChannelConfiguration = c.channels;
    parser.mExtensionAudioObjectType = c.extAot;
    parser.mExtensionSamplingFrequencyIndex = c.extSfi;
    parser.mExtensionSamplingFrequency = c.extSf;
    unsigned char* asc = nullptr;
    unsigned int size = 0;
    ASSERT_EQ(0u, parser.createASC(&asc, &size));
    ASSERT_NE(nullptr, asc);
    EXPECT_EQ(10u, size);
    EXPECT_EQ(c.expected, std::vector<uint8_t>(asc, asc + size));

    delete[] asc;
}

INSTANTIATE_TEST_SUITE_P(Configurations, ASCParserBytesTest, ::testing::ValuesIn(ascCases()),
                         [](const auto& info) { return info.param.name; });

}  // namespace
}  // namespace TavoPlayer
