// The byte-level pieces of tsgen, checked against values worked out by hand
// from the standards' syntax tables.

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "AacFramer.h"
#include "CaptionWriter.h"
#include "H264SpsEditor.h"
#include "TsMuxer.h"
#include "TsgenTestUtil.h"

namespace TavoPlayer::tsgen {
namespace {

using test::hex;

uint16_t crc16(const std::vector<uint8_t>& bytes, size_t from = 0) {
    return CaptionWriter::crc16(bytes.data() + from, bytes.size() - from);
}

// "01 1" -> {0x60}: the bits in order, zero-padded to a byte; built by hand so
// that the writer is checked against something other than itself.
std::vector<uint8_t> bits(std::string text) {
    std::erase(text, ' ');
    std::vector<uint8_t> out((text.size() + 7) / 8);
    for (size_t i = 0; i < text.size(); ++i)
        out[i / 8] |= (text[i] == '1' ? 0x80 : 0) >> (i % 8);
    return out;
}

TEST(AacFramerTest, FramesMatchTheSyntaxTables) {
    // AAC LC, 48 kHz (index 3), stereo. ISO/IEC 14496-3, 1.6.2.1: 00010 0011 0010
    // 000 (AOT 2, index 3, 2 channels).
    const AacFramer framer(2, 3, 2);
    EXPECT_EQ(framer.audioSpecificConfig(), hex("11 90"));
    const std::vector<uint8_t> hundred(100, 0x5A), ten(10, 0xAB), long600(600, 0x01);
    std::vector<uint8_t> adts, loas, loasSameConfig, loasLong;
    ASSERT_EQ(framer.appendAdts(hundred.data(), hundred.size(), adts), 0);
    ASSERT_EQ(framer.appendLoas(ten.data(), ten.size(), loas), 0);
    ASSERT_EQ(framer.appendLoas(ten.data(), ten.size(), loasSameConfig, false), 0);
    // syncword FFF, ID 0, layer 0, protection_absent 1, profile 01, index 0011,
    // private 0, channels 010, frame_length 107, fullness 7FF, one raw block.
    auto adtsExpected = hex("FF F1 4C 80 0D 7F FC");
    adtsExpected.insert(adtsExpected.end(), hundred.begin(), hundred.end());
    EXPECT_EQ(adts, adtsExpected);
    // ISO/IEC 14496-3, 1.7.3: sync 0x2B7 and 13-bit length 17, then
    // useSameStreamMux 0, StreamMuxConfig (version 0, one program and layer,
    // the 16-bit AudioSpecificConfig, frameLengthType 0, fullness 0xFF), the
    // PayloadLengthInfo byte 10 and the payload shifted by 5 bits.
    EXPECT_EQ(loas, hex("56 E0 11 20 00 11 90 1F E0 55 5D 5D 5D 5D 5D 5D 5D 5D 5D 58"));
    // useSameStreamMux 1, then at once PayloadLengthInfo 10 and the payload
    // shifted by one bit: 89 bits, 12 bytes.
    EXPECT_EQ(loasSameConfig, hex("56 E0 0C 85 55 D5 D5 D5 D5 D5 D5 D5 D5 D5 80"));
    // 600 = 255 + 255 + 90: three PayloadLengthInfo bytes, so 45 + 24 + 4800
    // bits after the sync header, rounded up to 609 bytes.
    ASSERT_EQ(framer.appendLoas(long600.data(), long600.size(), loasLong), 0);
    EXPECT_EQ(((loasLong[1] & 0x1F) << 8) | loasLong[2], 609);
    EXPECT_EQ(loasLong.size(), 3u + 609u);
    for (const auto& [rate, index] :
         {std::pair{48000, 3}, {44100, 4}, {24000, 6}, {8000, 11}, {47999, -1}})
        EXPECT_EQ(AacFramer::samplingFrequencyIndex(rate), index) << rate;
}

// The letters that ISO 8859-1 lacks take their ISO 8859-15 positions; \x1D\x21
// is SS3 and the music note.
TEST(CaptionWriterTest, TextBecomesLatinCaptionCodesOrIsRefusedWithAReason) {
    // CRC-16 with polynomial 0x1021 and initial value 0 gives 0x31C3 over "123456789".
    EXPECT_EQ(crc16({'1', '2', '3', '4', '5', '6', '7', '8', '9'}), 0x31C3);
    const struct {
        const char* text;
        const char* codesOrError;  // hex codes, or the reason for refusing
    } kCases[] = {{"Ola", "4F 6C 61"},
                  {"Olá ç", "4F 6C E1 20 E7"},
                  {"€ŠšŽžŒœŸ", "A4 A6 A8 B4 B8 BC BD BE"},
                  {"a\\x1D\\x21b", "61 1D 21 62"},
                  {"\\f\\n\\\\", "0C 0D 5C"},
                  {"\\x1", "two hex digits"},
                  {"\\xg0", "two hex digits"},
                  {"a\\", "lone backslash"},
                  {"\\q", "unknown escape"},
                  {"中", "no Latin caption code"},
                  {"\xC3", "not valid UTF-8"},
                  {"\xC3(", "not valid UTF-8"},
                  {"\x80", "not valid UTF-8"}};
    for (const auto& c : kCases) {
        std::vector<uint8_t> codes;
        std::string error;
        const bool coded = CaptionWriter::encodeText(c.text, codes, error);
        const auto expected = hex(c.codesOrError);
        EXPECT_EQ(coded, !expected.empty()) << c.text << ": " << error;
        EXPECT_TRUE(coded ? codes == expected : error.find(c.codesOrError) != std::string::npos)
            << c.text << ": " << ::testing::PrintToString(codes) << " " << error;
    }
}

TEST(CaptionWriterTest, DataGroupsLayoutAndCrc) {
    const auto p = CaptionWriter::statementPayload(hex("0C 4F 6C E1"));
    // data_identifier, private_stream_id, header length 0; group id 1, version 0,
    // links, size 13; TMD 00, data_unit_loop_length 9; unit separator, statement
    // body, size 4; the text.
    const auto expected = hex("80 FF F0  04 00 00 00 0D  3F 00 00 09  1F 20 00 00 04  0C 4F 6C E1");
    ASSERT_EQ(p.size(), expected.size() + 2);
    EXPECT_EQ(std::vector<uint8_t>(p.begin(), p.end() - 2), expected);
    // The CRC covers the data group; over group and CRC the remainder is 0.
    EXPECT_EQ(crc16(p, 3), 0);

    const auto m = CaptionWriter::managementPayload();
    ASSERT_GE(m.size(), 18u);
    EXPECT_EQ(m[3] >> 2, 0x00);  // data_group_id of caption management, group A
    EXPECT_EQ(m[9], 1);          // num_languages
    EXPECT_EQ(std::string(m.begin() + 11, m.begin() + 14), "por");
    EXPECT_EQ(crc16(m, 3), 0);
}

TEST(TsMuxerPesHeaderTest, TimestampsAreReducedTo33BitsAndLongVideoIsUnbounded) {
    // PTS 2^33 + 1 wraps to 1; DTS 2^33 - 1 stays.
    PesUnit unit{{1, 2, 3}, (int64_t{1} << 33) + 1, (int64_t{1} << 33) - 1, true};
    // ISO/IEC 13818-1, 2.4.3.7: '0011' PTS 1, '0001' DTS 2^33 - 1, marker bits set.
    EXPECT_EQ(TsMuxer::pesHeader(0xE0, unit),
              hex("00 00 01 E0 00 10 84 C0 0A  31 00 01 00 03  1F FF FF FF FF"));
    unit.payload.assign(70000, 0);
    const auto h = TsMuxer::pesHeader(0xE0, unit);
    EXPECT_EQ((h[4] << 8) | h[5], 0);  // PES_packet_length 0: unbounded
}

// A Baseline SPS bit by bit (ITU-T H.264, 7.3.2.1.1): NAL header 0x67,
// profile 66, no constraint flags, level 30; ue(v) id 0, log2_max_frame_num - 4
// = 0, POC type 2, one reference frame; no gaps; ue(v) 19 and 14 for 20x15
// macroblocks; frame_mbs_only, direct_8x8, no cropping; the VUI flag (with VUI,
// nine clear VUI flags follow); rbsp_stop_one_bit.
std::vector<uint8_t> baselineSps(bool withVui) {
    return bits("01100111 01000010 00000000 00011110 1 1 011 010 0 000010100 0001111 110 " +
                std::string(withVui ? "1 000000000" : "0") + " 1");
}

TEST(H264SpsEditorTest, EmulationPreventionAndVuiRemoval) {
    const auto rbsp = hex("00 00 00 01 00 00 03 00 00 04");
    const auto ebsp = H264SpsEditor::toEbsp(rbsp);
    // ITU-T H.264, 7.4.1: 0x03 after each 00 00 followed by a byte 0..3.
    EXPECT_EQ(ebsp, hex("00 00 03 00 01 00 00 03 03 00 00 04"));
    EXPECT_EQ(H264SpsEditor::toRbsp(ebsp.data(), ebsp.size()), rbsp);

    std::vector<uint8_t> out;
    ASSERT_EQ(H264SpsEditor::stripVuiFromNal(baselineSps(true), out), 0);
    EXPECT_EQ(out, baselineSps(false));
    EXPECT_EQ(H264SpsEditor::stripVuiFromNal(hex("68 EE 3C 80"), out), 1);  // a PPS
    EXPECT_EQ(H264SpsEditor::stripVuiFromNal(hex("67 64"), out), 1);        // truncated
}

}  // namespace
}  // namespace TavoPlayer::tsgen
