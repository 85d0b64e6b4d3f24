// The byte-level pieces of tsgen, checked against values worked out by hand
// from the standards' syntax tables.

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "AacFramer.h"
#include "BitWriter.h"
#include "CaptionWriter.h"
#include "H264SpsEditor.h"
#include "TsMuxer.h"

namespace TavoPlayer::tsgen {
namespace {

std::string bitString(const BitWriter& w) {
    std::string s;
    for (size_t i = 0; i < w.bitCount(); ++i) {
        s += ((w.bytes()[i / 8] >> (7 - i % 8)) & 1) ? '1' : '0';
    }
    return s;
}

TEST(BitWriterTest, ExpGolombCodesMatchTheStandardTable) {
    // ITU-T H.264, Table 9-2.
    const struct {
        uint32_t value;
        const char* bits;
    } kCases[] = {{0, "1"},     {1, "010"},     {2, "011"},      {3, "00100"},
                  {6, "00111"}, {7, "0001000"}, {14, "0001111"}, {255, "00000000100000000"}};
    for (const auto& c : kCases) {
        BitWriter w;
        w.putUe(c.value);
        EXPECT_EQ(bitString(w), c.bits) << "ue(" << c.value << ")";
        uint32_t back = 0;
        BitReader r(w.bytes().data(), w.bytes().size());
        ASSERT_TRUE(r.getUe(back));
        EXPECT_EQ(back, c.value);
    }
}

TEST(BitWriterTest, ReaderReportsRunningPastTheEnd) {
    const uint8_t data[] = {0x00};
    BitReader r(data, sizeof data);
    uint32_t v = 0;
    EXPECT_FALSE(r.getUe(v));  // eight zeros and no terminating one
    EXPECT_EQ(r.bitsLeft(), 0u);
}

TEST(AacFramerTest, AudioSpecificConfigForLcAt48kStereo) {
    // ISO/IEC 14496-3, 1.6.2.1: 00010 0011 0010 000 (AOT 2, index 3, 2 channels).
    AacFramer framer(2, 3, 2);
    EXPECT_EQ(framer.audioSpecificConfig(), (std::vector<uint8_t>{0x11, 0x90}));
}

TEST(AacFramerTest, AdtsHeaderFields) {
    AacFramer framer(2, 3, 2);
    const std::vector<uint8_t> raw(100, 0x5A);
    std::vector<uint8_t> out;
    ASSERT_EQ(framer.appendAdts(raw.data(), raw.size(), out), 0);
    // syncword FFF, ID 0, layer 0, protection_absent 1, profile 01, index 0011,
    // private 0, channels 010, frame_length 107, fullness 7FF, one raw block.
    const std::vector<uint8_t> header = {0xFF, 0xF1, 0x4C, 0x80, 0x0D, 0x7F, 0xFC};
    ASSERT_EQ(out.size(), 107u);
    EXPECT_EQ(std::vector<uint8_t>(out.begin(), out.begin() + 7), header);
    EXPECT_EQ(std::vector<uint8_t>(out.begin() + 7, out.end()), raw);
}

TEST(AacFramerTest, LoasFrameCarriesStreamMuxConfigAndLength) {
    AacFramer framer(2, 3, 2);
    const std::vector<uint8_t> raw(10, 0xAB);
    std::vector<uint8_t> out;
    ASSERT_EQ(framer.appendLoas(raw.data(), raw.size(), out), 0);
    // ISO/IEC 14496-3, 1.7.3: sync 0x2B7 and 13-bit length 17, then
    // useSameStreamMux 0, StreamMuxConfig (version 0, one program and layer,
    // the 16-bit AudioSpecificConfig, frameLengthType 0, fullness 0xFF), the
    // PayloadLengthInfo byte 10 and the payload shifted by 5 bits.
    const std::vector<uint8_t> expected = {0x56, 0xE0, 0x11, 0x20, 0x00, 0x11, 0x90,
                                           0x1F, 0xE0, 0x55, 0x5D, 0x5D, 0x5D, 0x5D,
                                           0x5D, 0x5D, 0x5D, 0x5D, 0x5D, 0x58};
    EXPECT_EQ(out, expected);
}

TEST(AacFramerTest, LoasFrameWithoutConfigReusesTheEarlierOne) {
    AacFramer framer(2, 3, 2);
    const std::vector<uint8_t> raw(10, 0xAB);
    std::vector<uint8_t> out;
    ASSERT_EQ(framer.appendLoas(raw.data(), raw.size(), out, false), 0);
    // useSameStreamMux 1, then at once PayloadLengthInfo 10 and the payload
    // shifted by one bit: 89 bits, 12 bytes.
    const std::vector<uint8_t> expected = {0x56, 0xE0, 0x0C, 0x85, 0x55, 0xD5, 0xD5, 0xD5,
                                           0xD5, 0xD5, 0xD5, 0xD5, 0xD5, 0xD5, 0x80};
    EXPECT_EQ(out, expected);
}

TEST(AacFramerTest, LongUnitsUseSeveralLengthBytes) {
    AacFramer framer(2, 3, 2);
    const std::vector<uint8_t> raw(600, 0x01);
    std::vector<uint8_t> out;
    ASSERT_EQ(framer.appendLoas(raw.data(), raw.size(), out), 0);
    // 600 = 255 + 255 + 90: three PayloadLengthInfo bytes, so 45 + 24 + 4800
    // bits after the sync header, rounded up to 609 bytes.
    const size_t length = ((out[1] & 0x1F) << 8) | out[2];
    EXPECT_EQ(length, 609u);
    EXPECT_EQ(out.size(), 3u + 609u);
}

TEST(AacFramerTest, SamplingFrequencyIndexTable) {
    EXPECT_EQ(AacFramer::samplingFrequencyIndex(48000), 3);
    EXPECT_EQ(AacFramer::samplingFrequencyIndex(44100), 4);
    EXPECT_EQ(AacFramer::samplingFrequencyIndex(24000), 6);
    EXPECT_EQ(AacFramer::samplingFrequencyIndex(8000), 11);
    EXPECT_EQ(AacFramer::samplingFrequencyIndex(47999), -1);
}

TEST(CaptionWriterTest, Crc16MatchesTheCatalogueCheckValue) {
    // CRC-16 with polynomial 0x1021 and initial value 0 gives 0x31C3 over "123456789".
    const std::string check = "123456789";
    EXPECT_EQ(CaptionWriter::crc16(reinterpret_cast<const uint8_t*>(check.data()), check.size()),
              0x31C3);
}

TEST(CaptionWriterTest, TextBecomesLatinCaptionCodes) {
    const struct {
        const char* text;
        std::vector<uint8_t> codes;
    } kCases[] = {
        {"Ola", {'O', 'l', 'a'}},
        {"Olá ç", {'O', 'l', 0xE1, ' ', 0xE7}},
        // ISO 8859-15 positions of the letters that ISO 8859-1 lacks.
        {"€ŠšŽžŒœŸ", {0xA4, 0xA6, 0xA8, 0xB4, 0xB8, 0xBC, 0xBD, 0xBE}},
        {"a\\x1D\\x21b", {'a', 0x1D, 0x21, 'b'}},  // SS3 + music note
        {"\\f\\n\\\\", {0x0C, 0x0D, '\\'}},
    };
    for (const auto& c : kCases) {
        std::vector<uint8_t> codes;
        std::string error;
        ASSERT_TRUE(CaptionWriter::encodeText(c.text, codes, error)) << c.text << ": " << error;
        EXPECT_EQ(codes, c.codes) << c.text;
    }
}

TEST(CaptionWriterTest, UncodableTextIsRefusedWithAReason) {
    const struct {
        const char* text;
        const char* error;
    } kCases[] = {
        {"\\x1", "two hex digits"},   {"\\xg0", "two hex digits"},     {"a\\", "lone backslash"},
        {"\\q", "unknown escape"},    {"中", "no Latin caption code"}, {"\xC3", "not valid UTF-8"},
        {"\xC3(", "not valid UTF-8"}, {"\x80", "not valid UTF-8"},
    };
    for (const auto& c : kCases) {
        std::vector<uint8_t> codes;
        std::string error;
        EXPECT_FALSE(CaptionWriter::encodeText(c.text, codes, error)) << c.text;
        EXPECT_NE(error.find(c.error), std::string::npos) << c.text << ": " << error;
    }
}

TEST(CaptionWriterTest, StatementDataGroupLayout) {
    const std::vector<uint8_t> text = {0x0C, 'O', 'l', 0xE1};
    const auto p = CaptionWriter::statementPayload(text);
    const std::vector<uint8_t> expected = {
        0x80, 0xFF, 0xF0,              // data_identifier, private_stream_id, header length 0
        0x04, 0x00, 0x00, 0x00, 0x0D,  // group id 1, version 0, links, size 13
        0x3F, 0x00, 0x00, 0x09,        // TMD 00, data_unit_loop_length 9
        0x1F, 0x20, 0x00, 0x00, 0x04,  // unit separator, statement body, size 4
        0x0C, 'O',  'l',  0xE1};
    ASSERT_EQ(p.size(), expected.size() + 2);
    EXPECT_EQ(std::vector<uint8_t>(p.begin(), p.end() - 2), expected);
    // The CRC covers the data group; over group and CRC the remainder is 0.
    EXPECT_EQ(CaptionWriter::crc16(p.data() + 3, p.size() - 3), 0);
}

TEST(CaptionWriterTest, ManagementGroupDeclaresOnePortugueseLanguage) {
    const auto p = CaptionWriter::managementPayload();
    ASSERT_GE(p.size(), 18u);
    EXPECT_EQ(p[3] >> 2, 0x00);  // data_group_id of caption management, group A
    EXPECT_EQ(p[9], 1);          // num_languages
    EXPECT_EQ(std::string(p.begin() + 11, p.begin() + 14), "por");
    EXPECT_EQ(CaptionWriter::crc16(p.data() + 3, p.size() - 3), 0);
}

TEST(TsMuxerPesHeaderTest, TimestampsAreReducedTo33BitsWithMarkers) {
    PesUnit unit;
    unit.payload = {1, 2, 3};
    unit.pts = (int64_t{1} << 33) + 1;  // wraps to 1
    unit.dts = (int64_t{1} << 33) - 1;
    unit.hasDts = true;
    const auto h = TsMuxer::pesHeader(0xE0, unit);
    // ISO/IEC 13818-1, 2.4.3.7: '0011' PTS, '0001' DTS, marker bits set.
    const std::vector<uint8_t> expected = {0x00, 0x00, 0x01, 0xE0, 0x00, 0x10, 0x84,
                                           0xC0, 0x0A, 0x31, 0x00, 0x01, 0x00, 0x03,  // PTS 1
                                           0x1F, 0xFF, 0xFF, 0xFF, 0xFF};  // DTS 2^33 - 1
    EXPECT_EQ(h, expected);
}

TEST(TsMuxerPesHeaderTest, OversizedVideoPesHasUnboundedLength) {
    PesUnit unit;
    unit.payload.assign(70000, 0);
    unit.pts = 0;
    const auto h = TsMuxer::pesHeader(0xE0, unit);
    EXPECT_EQ(h[4], 0);
    EXPECT_EQ(h[5], 0);
}

TEST(H264SpsEditorTest, EmulationPreventionRoundTrip) {
    const std::vector<uint8_t> rbsp = {0x00, 0x00, 0x00, 0x01, 0x00, 0x00, 0x03, 0x00, 0x00, 0x04};
    const auto ebsp = H264SpsEditor::toEbsp(rbsp);
    // ITU-T H.264, 7.4.1: 0x03 after each 00 00 followed by a byte 0..3.
    EXPECT_EQ(ebsp, (std::vector<uint8_t>{0x00, 0x00, 0x03, 0x00, 0x01, 0x00, 0x00, 0x03, 0x03,
                                          0x00, 0x00, 0x04}));
    EXPECT_EQ(H264SpsEditor::toRbsp(ebsp.data(), ebsp.size()), rbsp);
}

// A Baseline SPS written field by field (ITU-T H.264, 7.3.2.1.1): profile 66,
// level 30, id 0, log2_max_frame_num - 4 = 0, POC type 2, one reference frame,
// 20x15 macroblocks, frame_mbs_only, direct_8x8, no cropping; with VUI, a byte of
// VUI flags follows.
std::vector<uint8_t> baselineSps(bool withVui) {
    BitWriter w;
    w.putBits(0x67, 8);
    w.putBits(66, 8);
    w.putBits(0, 8);
    w.putBits(30, 8);
    for (uint32_t ue : {0u, 0u, 2u, 1u}) {
        w.putUe(ue);
    }
    w.putBits(0, 1);
    w.putUe(19);
    w.putUe(14);
    w.putBits(0b110, 3);
    w.putBits(withVui ? 1 : 0, 1);
    if (withVui) {
        w.putBits(0, 9);  // VUI flags, all clear
    }
    w.putBits(1, 1);  // rbsp_stop_one_bit
    w.alignZero();
    return w.bytes();
}

TEST(H264SpsEditorTest, BaselineSpsLosesItsVui) {
    std::vector<uint8_t> out;
    ASSERT_EQ(H264SpsEditor::stripVuiFromNal(baselineSps(true), out), 0);
    EXPECT_EQ(out, baselineSps(false));
}

TEST(H264SpsEditorTest, RejectsNonSpsAndTruncatedSps) {
    std::vector<uint8_t> out;
    EXPECT_EQ(H264SpsEditor::stripVuiFromNal({0x68, 0xEE, 0x3C, 0x80}, out), 1);
    EXPECT_EQ(H264SpsEditor::stripVuiFromNal({0x67, 0x64}, out), 1);
}

}  // namespace
}  // namespace TavoPlayer::tsgen
