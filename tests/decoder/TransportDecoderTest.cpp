// The transport decoder on frames built field by field: which access units come out
// of each LOAS/LATM and ADTS header variant, what configuration is reported, and how
// bad sync, unsupported syntax and truncation are answered.
#include "decoder/TransportDecoder.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "AACTestUtil.h"
#include "PesRecordTestUtil.h"

namespace TavoPlayer {
namespace {

using namespace test;

struct Outcome {
    uint32_t error;
    std::vector<uint8_t> unit;  // for TRANSPORTDEC_OK
};

// Feeds `stream` in `chunk`-byte fills and reads until the decoder wants more and
// nothing is left, recording every result and unit.
class Harness {
public:
    explicit Harness(TRANSPORT_TYPE type) : mType(type), mHandle(transportDec_Open(type, 0, 1)) {
        transportDec_RegisterAscCallback(mHandle, &Harness::onConfig, this);
    }
    ~Harness() { transportDec_Close(&mHandle); }

    // The decoder holds a frame back until the next sync word shows, so `frames` is
    // followed by the first two bytes of another header.
    std::vector<Outcome> run(const std::vector<uint8_t>& frames, size_t chunk = 0) {
        std::vector<uint8_t> stream = frames;
        stream.push_back(mType == TT_MP4_LOAS ? 0x56 : 0xFF);
        stream.push_back(mType == TT_MP4_LOAS ? 0xE0 : 0xF1);
        std::vector<Outcome> out;
        chunk = chunk == 0 ? stream.size() : chunk;
        for (size_t offset = 0; offset < stream.size(); offset += chunk) {
            const auto size = static_cast<uint32_t>(std::min(chunk, stream.size() - offset));
            uint32_t valid = size;
            do {  // until the decoder has taken the whole fill
                EXPECT_EQ(TRANSPORTDEC_OK,
                          transportDec_FillData(mHandle, stream.data() + offset, size, &valid, 0));
                for (uint32_t error; (error = transportDec_ReadAccessUnit(mHandle, 0)) !=
                                     TRANSPORTDEC_NOT_ENOUGH_BITS;) {
                    out.push_back(take(error));
                }
            } while (valid > 0);
        }
        return out;
    }

    std::vector<CSAudioSpecificConfig> configs;

private:
    // The unit of a successful read, read to its last bit through the decoder's reader.
    Outcome take(uint32_t error) {
        Outcome o{error, {}};
        if (error == TRANSPORTDEC_OK) {
            const uint32_t bits = transportDec_GetAuBitsTotal(mHandle, 0);
            EXPECT_EQ(0u, bits % 8);
            EXPECT_EQ(static_cast<int32_t>(bits), transportDec_GetAuBitsRemaining(mHandle, 0));
            o.unit.resize(bits / 8);
            TransportBitReader* r = transportDec_GetBitstream(mHandle, 0);
            for (auto& b : o.unit)
                b = static_cast<uint8_t>(r->readBits(8));
            EXPECT_FALSE(r->overrun());
            EXPECT_EQ(0, transportDec_GetAuBitsRemaining(mHandle, 0));
            transportDec_EndAccessUnit(mHandle);
        }
        return o;
    }
    static int32_t onConfig(void* self, const CSAudioSpecificConfig* config, unsigned char,
                            unsigned char*) {
        static_cast<Harness*>(self)->configs.push_back(*config);
        return 0;
    }
    TRANSPORT_TYPE mType;
    HANDLE_TRANSPORTDEC mHandle;
};

const std::vector<uint8_t> kA = patternPayload(40, 1);
const std::vector<uint8_t> kB = patternPayload(300, 2);  // length escape (255 + 45)
const std::vector<uint8_t> kC = patternPayload(7, 3);

// A row's name says how its stream is read: "Adts..." as ADTS, any other as LOAS.
TRANSPORT_TYPE typeOf(const std::string& name) {
    return name.starts_with("Adts") ? TT_MP4_ADTS : TT_MP4_LOAS;
}

struct HeaderCase {
    std::string name;
    std::vector<uint8_t> stream;
    std::vector<Outcome> expected;
};
using test::PrintTo;

std::vector<HeaderCase> headerCases() {
    const auto ok = [](const std::vector<uint8_t>& u) { return Outcome{TRANSPORTDEC_OK, u}; };
    const auto err = [](uint32_t e) { return Outcome{e, {}}; };
    const auto loas = [](const LoasOptions& o, const std::vector<uint8_t>& payload) {
        return loasFrame(o, {payload});
    };
    const Outcome unsupported = err(TRANSPORTDEC_UNSUPPORTED_FORMAT);
    const Outcome syncError = err(TRANSPORTDEC_SYNC_ERROR);
    const LoasOptions same{.useSameStreamMux = true};
    const std::vector<uint8_t> plainC = loas({}, kC);
    const std::vector<uint8_t> plainA = loas({}, kA);
    const Outcome parseError = err(TRANSPORTDEC_PARSE_ERROR);
    const std::vector<uint8_t> adtsA = adtsFrame({}, kA);
    const std::vector<uint8_t> adtsC = adtsFrame({}, kC);
    // A frame of syntax the decoder does not support, then a good one.
    const auto unsupportedThenC = [&](const LoasOptions& o) {
        return concat({loas(o, kA), plainC});
    };
    // The frame cut down to `muxLength` bytes after its header (audioMuxLengthBytes too).
    const auto shortened = [](std::vector<uint8_t> frame, uint32_t muxLength) {
        frame[1] = static_cast<uint8_t>(0xE0 | (muxLength >> 8));
        frame[2] = static_cast<uint8_t>(muxLength & 0xFF);
        frame.resize(3 + muxLength);
        return frame;
    };
    // clang-format off
    return {
        {"LoasVersion0", loas({}, kA), {ok(kA)}},
        {"LoasVersion1", loas({.audioMuxVersion = 1}, kA), {ok(kA)}},
        {"LoasVersion1WithAscFillBits", loas({.audioMuxVersion = 1, .ascFillBits = 13}, kA),
         {ok(kA)}},
        {"LoasLongPayloadLength", loas({}, kB), {ok(kB)}},
        {"LoasCrcByte", loas({.crc = true}, kA), {ok(kA)}},
        // Two escape-coded bytes of other data length.
        {"LoasOtherDataVersion0", loas({.otherDataBits = 300}, kA), {ok(kA)}},
        {"LoasOtherDataVersion1", loas({.audioMuxVersion = 1, .otherDataBits = 17}, kC), {ok(kC)}},
        {"LoasSubFramesAreUnits", loasFrame({}, {kA, kB, kC}), {ok(kA), ok(kB), ok(kC)}},
        {"LoasUseSameStreamMuxAfterConfig", concat({plainA, loas(same, kC)}), {ok(kA), ok(kC)}},
        {"LoasUseSameStreamMuxBeforeAnyConfig", concat({loas(same, kC), plainA}),
         {err(TRANSPORTDEC_NO_CONFIGURATION), ok(kA)}},
        // After useSameStreamMux the length run starts one bit into a byte.
        {"LoasUseSameStreamMuxLongPayloadLength", concat({plainA, loas(same, kB), loas(same, kC)}),
         {ok(kA), ok(kB), ok(kC)}},
        {"LoasPayloadLongerThanItsFrame", concat({plainA, shortened(loas(same, kB), 10), plainC}),
         {ok(kA), parseError, ok(kC)}},
        {"LoasLengthRunPastItsFrame", concat({plainA, shortened(loas(same, kB), 2), plainC}),
         {ok(kA), parseError, ok(kC)}},
        {"LoasEmptyFrame", concat({plainA, {0x56, 0xE0, 0x00}, plainC}),
         {ok(kA), parseError, ok(kC)}},
        {"LoasGarbageBeforeSync", concat({{0x00, 0x11, 0x56, 0x00, 0x22}, plainA}),
         {syncError, ok(kA)}},
        {"LoasTwoProgramsUnsupported", unsupportedThenC({.numProgram = 1}), {unsupported, ok(kC)}},
        {"LoasTwoLayersUnsupported", unsupportedThenC({.numLayer = 1}), {unsupported, ok(kC)}},
        {"LoasFrameLengthType1Unsupported", unsupportedThenC({.frameLengthType = 1}),
         {unsupported, ok(kC)}},
        {"LoasAudioMuxVersionAUnsupported",
         unsupportedThenC({.audioMuxVersion = 1, .audioMuxVersionA = 1}), {unsupported, ok(kC)}},
        {"AdtsWithoutCrc", adtsFrame({}, kA), {ok(kA)}},
        {"AdtsWithCrc", adtsFrame({.crc = true}, kA), {ok(kA)}},
        {"AdtsSeveralBlocksWithoutCrcIsOneUnit", adtsFrame({.rawDataBlocks = 2}, kB), {ok(kB)}},
        {"AdtsSeveralBlocksWithCrcUnsupported",
         concat({adtsFrame({.crc = true, .rawDataBlocks = 1}, kA), adtsC}), {unsupported, ok(kC)}},
        {"AdtsReservedFrequencyIsNoHeader",
         concat({adtsFrame({.samplingFrequencyIndex = 13}, kC), adtsA}), {syncError, ok(kA)}},
        {"AdtsGarbageBeforeSync", concat({{0x12, 0xFF, 0x00, 0xFF}, adtsA, adtsC}),
         {syncError, ok(kA), ok(kC)}},
        {"LoasReadingAdtsIsSyncErrors", adtsA, {syncError}},
        // A frame found after a loss of sync must be followed by a sync word, else it is
        // not trusted and everything up to the next sync word is skipped; once in sync,
        // a frame followed by junk is still delivered and the junk skipped afterwards.
        {"AdtsFrameBeforeJunkIsNotTrustedOutOfSync", concat({adtsA, {0x00, 0x00}, adtsC, adtsC}),
         {syncError, ok(kC), ok(kC)}},
        {"AdtsFrameBeforeJunkIsDeliveredInSync", concat({adtsA, adtsA, {0x00, 0x00}, adtsC}),
         {ok(kA), ok(kA), syncError, ok(kC)}},
    };
    // clang-format on
}

class TransportDecoderHeaderTest : public ::testing::TestWithParam<HeaderCase> {};

std::vector<std::vector<uint8_t>> unitsOf(const std::vector<Outcome>& outcomes) {
    std::vector<std::vector<uint8_t>> units;
    for (const auto& o : outcomes) {
        if (o.error == TRANSPORTDEC_OK)
            units.push_back(o.unit);
    }
    return units;
}

// The expected results in one fill; then cutting the stream into fills at any byte
// must not change the units that come out.
TEST_P(TransportDecoderHeaderTest, YieldsTheExpectedUnitsHoweverFilled) {
    const HeaderCase& c = GetParam();
    const auto got = Harness(typeOf(c.name)).run(c.stream);
    ASSERT_EQ(c.expected.size(), got.size());
    for (size_t i = 0; i < got.size(); ++i) {
        EXPECT_EQ(c.expected[i].error, got[i].error) << "result " << i;
        EXPECT_EQ(c.expected[i].unit, got[i].unit) << "unit " << i;
    }
    for (size_t cut = 1; cut < c.stream.size() + 2; ++cut) {
        ASSERT_EQ(unitsOf(c.expected), unitsOf(Harness(typeOf(c.name)).run(c.stream, cut)))
            << "fills of " << cut << " bytes";
    }
}

INSTANTIATE_TEST_SUITE_P(Headers, TransportDecoderHeaderTest, ::testing::ValuesIn(headerCases()),
                         [](const auto& info) { return info.param.name; });

// What the configuration callback reports, in the fields the extractor reads.
struct ConfigCase {
    std::string name;
    std::vector<uint8_t> stream;
    uint32_t sampleRate;
    uint32_t channels;
    int extensionAot;
    uint32_t extensionRate;
};

std::vector<ConfigCase> configCases() {
    constexpr AscFields kHeAac{.samplingFrequencyIndex = 6, .extensionSamplingFrequencyIndex = 3};
    AscFields hierarchicalSbr = kHeAac;
    hierarchicalSbr.hierarchicalExtension = 5;
    AscFields hierarchicalPs = hierarchicalSbr;
    hierarchicalPs.hierarchicalExtension = 29;
    hierarchicalPs.channelConfiguration = 1;
    AscFields compatibleSbrPs = kHeAac;
    compatibleSbrPs.backwardCompatibleSbr = true;
    compatibleSbrPs.backwardCompatiblePs = true;
    // clang-format off
    return {
        {"LcFromStreamMuxConfig", loasFrame({}, {kA}), 48000, 2, AOT_NONE, 0},
        {"HierarchicalSbr", loasFrame({.asc = hierarchicalSbr}, {kA}), 24000, 2, AOT_SBR, 48000},
        {"HierarchicalPs", loasFrame({.asc = hierarchicalPs}, {kA}), 24000, 1, AOT_SBR, 48000},
        // Backward-compatible signalling needs ascLen, i.e. audioMuxVersion 1.
        {"BackwardCompatibleSbrAndPs",
         loasFrame({.audioMuxVersion = 1, .asc = compatibleSbrPs}, {kA}), 24000, 2, AOT_SBR, 48000},
        {"ImplicitSbrIsNotReported", loasFrame({.audioMuxVersion = 1, .asc = kHeAac}, {kA}),
         24000, 2, AOT_NONE, 0},
        // ADTS profile 1 is object type 2.
        {"AdtsHeader", adtsFrame({.samplingFrequencyIndex = 4, .channelConfiguration = 1}, kA),
         44100, 1, AOT_NONE, 0},
    };
    // clang-format on
}

class TransportDecoderConfigTest : public ::testing::TestWithParam<ConfigCase> {};

TEST_P(TransportDecoderConfigTest, ReportsTheStreamsConfiguration) {
    const ConfigCase& c = GetParam();
    Harness harness(typeOf(c.name));
    harness.run(c.stream);
    ASSERT_EQ(1u, harness.configs.size());
    const CSAudioSpecificConfig& got = harness.configs.front();
    EXPECT_EQ(2, got.m_aot);
    EXPECT_EQ(c.sampleRate, got.m_samplingFrequency);
    EXPECT_EQ(c.sampleRate == 48000   ? 3u
              : c.sampleRate == 44100 ? 4u
                                      : 6u,
              got.m_samplingFrequencyIndex);
    EXPECT_EQ(c.channels, got.m_channelConfiguration);
    EXPECT_EQ(1024u, got.m_samplesPerFrame);
    EXPECT_EQ(c.extensionAot, got.m_extensionAudioObjectType);
    if (c.extensionAot == AOT_SBR) {
        EXPECT_EQ(3u, got.m_extensionSamplingFrequencyIndex);
        EXPECT_EQ(c.extensionRate, got.m_extensionSamplingFrequency);
    }
}

INSTANTIATE_TEST_SUITE_P(Configs, TransportDecoderConfigTest, ::testing::ValuesIn(configCases()),
                         [](const auto& info) { return info.param.name; });

TEST(TransportDecoderConfigChangeTest, ReportedAgainOnlyWhenItChanges) {
    const LoasOptions other{.asc = {.channelConfiguration = 1}};
    Harness harness(TT_MP4_LOAS);
    harness.run(concat({loasFrame({}, {kA}), loasFrame({}, {kA}), loasFrame(other, {kA})}));
    ASSERT_EQ(2u, harness.configs.size());
    EXPECT_EQ(2u, harness.configs[0].m_channelConfiguration);
    EXPECT_EQ(1u, harness.configs[1].m_channelConfiguration);
}

// Fills larger than the 16 KiB buffer (a long PES) are taken in parts.
TEST(TransportDecoderFillTest, TakesWhatFitsAndReducesBytesValid) {
    HANDLE_TRANSPORTDEC h = transportDec_Open(TT_MP4_ADTS, 1, 1);
    std::vector<uint8_t> big(TransportDecoder::kBufferSizeBytes + 1000, 0x00);
    uint32_t valid = static_cast<uint32_t>(big.size());
    ASSERT_EQ(TRANSPORTDEC_OK,
              transportDec_FillData(h, big.data(), static_cast<uint32_t>(big.size()), &valid, 0));
    EXPECT_EQ(1000u, valid);
    // Zeros hold no sync word: all of it is skipped, then the rest fits.
    EXPECT_EQ(TRANSPORTDEC_SYNC_ERROR, transportDec_ReadAccessUnit(h, 0));
    EXPECT_EQ(0u, h->bufferedBytes());
    ASSERT_EQ(TRANSPORTDEC_OK,
              transportDec_FillData(h, big.data(), static_cast<uint32_t>(big.size()), &valid, 0));
    EXPECT_EQ(0u, valid);
    transportDec_Close(&h);
}

}  // namespace
}  // namespace TavoPlayer
