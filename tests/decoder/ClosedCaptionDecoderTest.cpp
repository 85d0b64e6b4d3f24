#include "decoder/ClosedCaptionDecoder.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/CaptionBuilder.h"
#include "support/NamedRow.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

using namespace test;

const char* const kOutOfScope =
    "48 out of scope at void TavoPlayer::ClosedCaptionDecoder::handleCommands(uint8_t)";

struct DecodeCase {
    const char* name;
    Bytes es;
    unsigned int result;
    std::u32string text;      // the record's text when result is 1
    const char* logged = "";  // a message that must have been logged
};
using test::PrintTo;

std::vector<DecodeCase> decodeCases() {
    return {
        {"Ola", captionEs({0x4F, 0x6C, 0x61}), 1, U"Ola\n"},
        {"FortyCharactersFillRowZero", captionEs(Bytes(40, 'x')), 1,
         std::u32string(32, U'x') + std::u32string(8, U'x') + U"\n"},
        {"FourthRowScrollsUp", captionEs(bytesOf("a\rb\rc\rd")), 1, U"b\nc\nd\n"},
        {"HundredCharactersKeepLastThreeRows",
         captionEs(
             bytesOf(std::string(32, 'a') + std::string(32, 'b') + std::string(32, 'c') + "dddd")),
         1, std::u32string(32, U'b') + std::u32string(32, U'c') + U"dddd\n"},
        {"Ss3MusicNote", captionEs({0x1D, 0x21}), 1, U"\u266A\n"},
        {"Ss3WholeSet",
         captionEs({0x1D, 0x30, 0x1D, 0x37, 0x1D, 0x40, 0x1D, 0x4B, 0x1D, 0x22, 0x41}), 1,
         U"\u00A4\u00BE\u2026\u215E\"A\n"},
        {"Iso885915Replacements", captionEs({0xA4, 0xA6, 0xA8, 0xB4, 0xB8, 0xBC, 0xBD, 0xBE}), 1,
         U"\u20AC\u0160\u0161\u017D\u017E\u0152\u0153\u0178\n"},
        {"LatinAccents", captionEs({'A', 0xE7, 0xE3, 'o', ' ', 0xE0}), 1, U"Ação à\n"},
        {"ClearScreen", captionEs(bytesOf("abc\fde")), 1, U"de\n"},
        {"ControlsOnly", captionEs({0x0D, 0x0A, 0x80, 0x89, 0x0C}), 2, U""},
        // An invalid row neither starts a row nor stops the column parameter.
        {"ApsRowOutOfScope", captionEs({'a', 0x1C, 0x30, 0x41, 'x'}), 1, U"a\n", kOutOfScope},
        {"ApsStartsNewRow", captionEs({'a', 0x1C, 0x41, 0x41, 'b'}), 1, U"a\nb\n"},
        {"ColourParameterIsNotText", captionEs({0x90, 0x48, 'a'}), 1, U"a\n"},
        {"ColourParameter58HidesText", captionEs({0x90, 0x58, 'a'}), 2, U""},
        {"CsiSwallowsFollowingText",
         captionEs(bytesOf("\x9B"
                           "1;2 Vxy\rz")),
         1, U"z\n"},
        {"CsiBadFinalByte",
         captionEs(bytesOf("\x9B"
                           "1 !\rq")),
         1, U"q\n", "CONTROLCODE not valid"},
        {"NulInRowZeroEndsTheRow", captionEs({'a', 0x00, 'b'}), 1, U"a\n"},
        {"TimedStatementSkipsPresentationTime", captionEs({'t'}, {.timeControlMode = 1}), 1,
         U"t\n"},
        {"PesDataHeaderSkipped", captionEs({'h'}, {.headerLength = 3}), 1, U"h\n"},
        {"NotStatementBody", captionEs({'a'}, {.unitParameter = 0x30}), 4, U""},
        {"WrongDataIdentifier", captionEs({'a'}, {.dataIdentifier = 0x81}), 0, U""},
        {"NoUnitSeparator", captionEs({'a'}, {.separator = 0x1E}), 0, U""},
        {"UnitPastTheRecord", captionEs({'a'}, {.declaredSize = 4}), 0, U""},
        {"UnitOf256BytesDropped", captionEs(Bytes(256, 'z')), 0, U"", "256 bytes dropped"},
        {"UnitOf255BytesDecoded", captionEs(Bytes(255, 'z')), 1, std::u32string(95, U'z') + U"\n"},
        {"TruncatedBeforeUnit", Bytes{0x80, 0xFF, 0xF0, 0x04, 0x00, 0x00, 0x00}, 0, U""},
    };
}

class ClosedCaptionDecodeTest : public testing::TestWithParam<DecodeCase> {};

TEST_P(ClosedCaptionDecodeTest, DecodesOnePacket) {
    const DecodeCase& c = GetParam();
    TraceCapture trace;
    setTraceLevel(TRACE_DEBUG);
    android::sp<RingBuffer> output = test::makeRing("CCRaw", 1 << 16);
    android::sp<ClosedCaptionDecoder> decoder = new ClosedCaptionDecoder();
    decoder->addOutput(output, nullptr);
    OwnedPesRecord record(c.es, 123456);

    EXPECT_EQ(decoder->processPacket(record.get()), c.result);
    const std::vector<CaptionRecord> written = drainCaptions(*output);
    if (c.result == 1) {
        ASSERT_EQ(written.size(), 1u);
        EXPECT_EQ(written[0].text, c.text);
        EXPECT_EQ(written[0].size, 32 + 4 * c.text.size());
        EXPECT_EQ(written[0].pts, 123456u);
        EXPECT_EQ(decoder->getCCSize(), 4 * c.text.size());
    } else {
        EXPECT_TRUE(written.empty());
    }
    if (*c.logged != '\0') {
        EXPECT_TRUE(trace.contains(c.logged)) << trace.all();
    }
    setTraceLevel(TRACE_INFO);
}

INSTANTIATE_TEST_SUITE_P(Units, ClosedCaptionDecodeTest, testing::ValuesIn(decodeCases()),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace TavoPlayer
