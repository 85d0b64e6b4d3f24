// The transport decoder on frames built field by field: which access units come out
// of each LOAS/LATM and ADTS header variant, what configuration is reported, and how
// bad sync, unsupported syntax and truncation are answered.
#include "decoder/TransportDecoder.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <vector>

#include "AACTestUtil.h"

namespace TavoPlayer {
namespace {

using test::adtsFrame;
using test::AdtsOptions;
using test::loasFrame;
using test::LoasOptions;
using test::patternPayload;

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
        size_t offset = 0;
        if (chunk == 0) {
            chunk = stream.size();
        }
        bool more = true;
        while (more) {
            uint32_t size = static_cast<uint32_t>(std::min(chunk, stream.size() - offset));
            uint32_t valid = size;
            while (valid > 0 || more) {
                EXPECT_EQ(TRANSPORTDEC_OK,
                          transportDec_FillData(mHandle, stream.data() + offset, size, &valid, 0));
                // Read until the decoder needs bytes.
                for (;;) {
                    const uint32_t error = transportDec_ReadAccessUnit(mHandle, 0);
                    if (error == TRANSPORTDEC_NOT_ENOUGH_BITS) {
                        break;
                    }
                    Outcome o{error, {}};
                    if (error == TRANSPORTDEC_OK) {
                        const uint32_t bits = transportDec_GetAuBitsTotal(mHandle, 0);
                        EXPECT_EQ(0u, bits % 8);
                        EXPECT_EQ(static_cast<int32_t>(bits),
                                  transportDec_GetAuBitsRemaining(mHandle, 0));
                        o.unit.resize(bits / 8);
                        TransportBitReader* r = transportDec_GetBitstream(mHandle, 0);
                        for (auto& b : o.unit) {
                            b = static_cast<uint8_t>(r->readBits(8));
                        }
                        EXPECT_FALSE(r->overrun());
                        EXPECT_EQ(0, transportDec_GetAuBitsRemaining(mHandle, 0));
                        transportDec_EndAccessUnit(mHandle);
                    }
                    out.push_back(std::move(o));
                }
                if (valid == 0) {
                    break;
                }
            }
            offset += size;
            more = offset < stream.size();
        }
        return out;
    }

    std::vector<CSAudioSpecificConfig> configs;

private:
    static int32_t onConfig(void* self, const CSAudioSpecificConfig* config, unsigned char,
                            unsigned char*) {
        static_cast<Harness*>(self)->configs.push_back(*config);
        return 0;
    }
    TRANSPORT_TYPE mType;
    HANDLE_TRANSPORTDEC mHandle;
};

std::vector<uint8_t> concat(std::initializer_list<std::vector<uint8_t>> parts) {
    std::vector<uint8_t> out;
    for (const auto& p : parts) {
        out.insert(out.end(), p.begin(), p.end());
    }
    return out;
}

const std::vector<uint8_t> kA = patternPayload(40, 1);
const std::vector<uint8_t> kB = patternPayload(300, 2);  // length escape (255 + 45)
const std::vector<uint8_t> kC = patternPayload(7, 3);

struct HeaderCase {
    std::string name;
    TRANSPORT_TYPE type;
    std::function<std::vector<uint8_t>()> build;
    std::vector<Outcome> expected;
};

LoasOptions v1() {
    LoasOptions o;
    o.audioMuxVersion = 1;
    return o;
}

std::vector<HeaderCase> headerCases() {
    const auto ok = [](const std::vector<uint8_t>& u) { return Outcome{TRANSPORTDEC_OK, u}; };
    const auto err = [](uint32_t e) { return Outcome{e, {}}; };
    LoasOptions same;
    same.useSameStreamMux = true;
    return {
        {"LoasVersion0", TT_MP4_LOAS, [] { return loasFrame({}, {kA}); }, {ok(kA)}},
        {"LoasVersion1", TT_MP4_LOAS, [] { return loasFrame(v1(), {kA}); }, {ok(kA)}},
        {"LoasVersion1WithAscFillBits",
         TT_MP4_LOAS,
         [] {
             LoasOptions o = v1();
             o.ascFillBits = 13;
             return loasFrame(o, {kA});
         },
         {ok(kA)}},
        {"LoasLongPayloadLength", TT_MP4_LOAS, [] { return loasFrame({}, {kB}); }, {ok(kB)}},
        {"LoasCrcByte",
         TT_MP4_LOAS,
         [] {
             LoasOptions o;
             o.crc = true;
             return loasFrame(o, {kA});
         },
         {ok(kA)}},
        {"LoasOtherDataVersion0",
         TT_MP4_LOAS,
         [] {
             LoasOptions o;
             o.otherDataBits = 300;  // two escape-coded bytes
             return loasFrame(o, {kA});
         },
         {ok(kA)}},
        {"LoasOtherDataVersion1",
         TT_MP4_LOAS,
         [] {
             LoasOptions o = v1();
             o.otherDataBits = 17;
             return loasFrame(o, {kC});
         },
         {ok(kC)}},
        {"LoasSubFramesAreUnits",
         TT_MP4_LOAS,
         [] {
             return loasFrame({}, {kA, kB, kC});
         },
         {ok(kA), ok(kB), ok(kC)}},
        {"LoasUseSameStreamMuxAfterConfig",
         TT_MP4_LOAS,
         [same] {
             return concat({loasFrame({}, {kA}), loasFrame(same, {kC})});
         },
         {ok(kA), ok(kC)}},
        {"LoasUseSameStreamMuxBeforeAnyConfig",
         TT_MP4_LOAS,
         [same] {
             return concat({loasFrame(same, {kC}), loasFrame({}, {kA})});
         },
         {err(TRANSPORTDEC_NO_CONFIGURATION), ok(kA)}},
        {"LoasGarbageBeforeSync",
         TT_MP4_LOAS,
         [] {
             return concat({{0x00, 0x11, 0x56, 0x00, 0x22}, loasFrame({}, {kA})});
         },
         {err(TRANSPORTDEC_SYNC_ERROR), ok(kA)}},
        {"LoasTwoProgramsUnsupported",
         TT_MP4_LOAS,
         [] {
             LoasOptions o;
             o.numProgram = 1;
             return concat({loasFrame(o, {kA}), loasFrame({}, {kC})});
         },
         {err(TRANSPORTDEC_UNSUPPORTED_FORMAT), ok(kC)}},
        {"LoasTwoLayersUnsupported",
         TT_MP4_LOAS,
         [] {
             LoasOptions o;
             o.numLayer = 1;
             return concat({loasFrame(o, {kA}), loasFrame({}, {kC})});
         },
         {err(TRANSPORTDEC_UNSUPPORTED_FORMAT), ok(kC)}},
        {"LoasFrameLengthType1Unsupported",
         TT_MP4_LOAS,
         [] {
             LoasOptions o;
             o.frameLengthType = 1;
             return concat({loasFrame(o, {kA}), loasFrame({}, {kC})});
         },
         {err(TRANSPORTDEC_UNSUPPORTED_FORMAT), ok(kC)}},
        {"LoasAudioMuxVersionAUnsupported",
         TT_MP4_LOAS,
         [] {
             LoasOptions o = v1();
             o.audioMuxVersionA = 1;
             return concat({loasFrame(o, {kA}), loasFrame({}, {kC})});
         },
         {err(TRANSPORTDEC_UNSUPPORTED_FORMAT), ok(kC)}},
        {"AdtsWithoutCrc", TT_MP4_ADTS, [] { return adtsFrame({}, kA); }, {ok(kA)}},
        {"AdtsWithCrc",
         TT_MP4_ADTS,
         [] {
             AdtsOptions o;
             o.crc = true;
             return adtsFrame(o, kA);
         },
         {ok(kA)}},
        {"AdtsSeveralBlocksWithoutCrcIsOneUnit",
         TT_MP4_ADTS,
         [] {
             AdtsOptions o;
             o.rawDataBlocks = 2;
             return adtsFrame(o, kB);
         },
         {ok(kB)}},
        {"AdtsSeveralBlocksWithCrcUnsupported",
         TT_MP4_ADTS,
         [] {
             AdtsOptions o;
             o.crc = true;
             o.rawDataBlocks = 1;
             return concat({adtsFrame(o, kA), adtsFrame({}, kC)});
         },
         {err(TRANSPORTDEC_UNSUPPORTED_FORMAT), ok(kC)}},
        {"AdtsReservedFrequencyIsNoHeader",
         TT_MP4_ADTS,
         [] {
             AdtsOptions o;
             o.samplingFrequencyIndex = 13;
             return concat({adtsFrame(o, kC), adtsFrame({}, kA)});
         },
         {err(TRANSPORTDEC_SYNC_ERROR), ok(kA)}},
        {"AdtsGarbageBeforeSync",
         TT_MP4_ADTS,
         [] {
             return concat({{0x12, 0xFF, 0x00, 0xFF}, adtsFrame({}, kA), adtsFrame({}, kC)});
         },
         {err(TRANSPORTDEC_SYNC_ERROR), ok(kA), ok(kC)}},
        {"AdtsStreamReadAsLoasIsSyncErrors",
         TT_MP4_LOAS,
         [] { return adtsFrame({}, kA); },
         {err(TRANSPORTDEC_SYNC_ERROR)}},
    };
}

class TransportDecoderHeaderTest : public ::testing::TestWithParam<HeaderCase> {};

TEST_P(TransportDecoderHeaderTest, YieldsTheExpectedUnits) {
    const HeaderCase& c = GetParam();
    Harness harness(c.type);
    const auto got = harness.run(c.build());
    ASSERT_EQ(c.expected.size(), got.size());
    for (size_t i = 0; i < got.size(); ++i) {
        EXPECT_EQ(c.expected[i].error, got[i].error) << "result " << i;
        EXPECT_EQ(c.expected[i].unit, got[i].unit) << "unit " << i;
    }
}

// Cutting the stream into fills at any byte must not change what comes out.
TEST_P(TransportDecoderHeaderTest, TruncationAtEveryByteThenRestGivesSameUnits) {
    const HeaderCase& c = GetParam();
    const auto stream = c.build();
    std::vector<std::vector<uint8_t>> expectedUnits;
    for (const auto& o : c.expected) {
        if (o.error == TRANSPORTDEC_OK) {
            expectedUnits.push_back(o.unit);
        }
    }
    for (size_t cut = 1; cut < stream.size() + 2; ++cut) {
        Harness harness(c.type);
        std::vector<std::vector<uint8_t>> units;
        for (const auto& o : harness.run(stream, cut)) {
            if (o.error == TRANSPORTDEC_OK) {
                units.push_back(o.unit);
            }
        }
        ASSERT_EQ(expectedUnits, units) << "fills of " << cut << " bytes";
    }
}

INSTANTIATE_TEST_SUITE_P(Headers, TransportDecoderHeaderTest, ::testing::ValuesIn(headerCases()),
                         [](const auto& info) { return info.param.name; });

class TransportDecoderConfigTest : public ::testing::Test {
protected:
    CSAudioSpecificConfig configOf(TRANSPORT_TYPE type, const std::vector<uint8_t>& stream) {
        Harness harness(type);
        harness.run(stream);
        EXPECT_EQ(1u, harness.configs.size());
        return harness.configs.empty() ? CSAudioSpecificConfig{} : harness.configs.front();
    }
};

TEST_F(TransportDecoderConfigTest, LcFromStreamMuxConfig) {
    const auto c = configOf(TT_MP4_LOAS, loasFrame({}, {kA}));
    EXPECT_EQ(2, c.m_aot);
    EXPECT_EQ(3u, c.m_samplingFrequencyIndex);
    EXPECT_EQ(48000u, c.m_samplingFrequency);
    EXPECT_EQ(2u, c.m_channelConfiguration);
    EXPECT_EQ(AOT_NONE, c.m_extensionAudioObjectType);
    EXPECT_EQ(1024u, c.m_samplesPerFrame);
}

TEST_F(TransportDecoderConfigTest, HierarchicalSbrAndPs) {
    for (uint32_t extension : {5u, 29u}) {
        LoasOptions o;
        o.asc.hierarchicalExtension = extension;
        o.asc.samplingFrequencyIndex = 6;
        o.asc.extensionSamplingFrequencyIndex = 3;
        o.asc.channelConfiguration = extension == 29 ? 1 : 2;
        const auto c = configOf(TT_MP4_LOAS, loasFrame(o, {kA}));
        EXPECT_EQ(2, c.m_aot);
        EXPECT_EQ(24000u, c.m_samplingFrequency);
        EXPECT_EQ(AOT_SBR, c.m_extensionAudioObjectType);
        EXPECT_EQ(3u, c.m_extensionSamplingFrequencyIndex);
        EXPECT_EQ(48000u, c.m_extensionSamplingFrequency);
        EXPECT_EQ(extension == 29 ? 1 : -1, c.m_psPresentFlag);
    }
}

TEST_F(TransportDecoderConfigTest, BackwardCompatibleSbrNeedsAscLen) {
    LoasOptions o = v1();
    o.asc.samplingFrequencyIndex = 6;
    o.asc.extensionSamplingFrequencyIndex = 3;
    o.asc.backwardCompatibleSbr = true;
    o.asc.backwardCompatiblePs = true;
    const auto c = configOf(TT_MP4_LOAS, loasFrame(o, {kA}));
    EXPECT_EQ(2, c.m_aot);
    EXPECT_EQ(AOT_SBR, c.m_extensionAudioObjectType);
    EXPECT_EQ(1, c.m_sbrPresentFlag);
    EXPECT_EQ(48000u, c.m_extensionSamplingFrequency);
    EXPECT_EQ(1, c.m_psPresentFlag);
}

TEST_F(TransportDecoderConfigTest, ImplicitSbrIsNotReported) {
    LoasOptions o = v1();
    o.asc.samplingFrequencyIndex = 6;
    const auto c = configOf(TT_MP4_LOAS, loasFrame(o, {kA}));
    EXPECT_EQ(AOT_NONE, c.m_extensionAudioObjectType);
    EXPECT_EQ(-1, c.m_sbrPresentFlag);
}

TEST_F(TransportDecoderConfigTest, AdtsHeaderGivesProfilePlusOne) {
    AdtsOptions o;
    o.profile = 1;
    o.samplingFrequencyIndex = 4;
    o.channelConfiguration = 1;
    const auto c = configOf(TT_MP4_ADTS, adtsFrame(o, kA));
    EXPECT_EQ(2, c.m_aot);
    EXPECT_EQ(44100u, c.m_samplingFrequency);
    EXPECT_EQ(1u, c.m_channelConfiguration);
    EXPECT_EQ(1024u, c.m_samplesPerFrame);
}

TEST_F(TransportDecoderConfigTest, ReportedAgainOnlyWhenItChanges) {
    LoasOptions other;
    other.asc.channelConfiguration = 1;
    Harness harness(TT_MP4_LOAS);
    harness.run(concat({loasFrame({}, {kA}), loasFrame({}, {kA}), loasFrame(other, {kA})}));
    ASSERT_EQ(2u, harness.configs.size());
    EXPECT_EQ(2u, harness.configs[0].m_channelConfiguration);
    EXPECT_EQ(1u, harness.configs[1].m_channelConfiguration);
}

class TransportDecoderHoldBackTest : public ::testing::Test {};

TEST_F(TransportDecoderHoldBackTest, FrameWaitsUntilTheNextSyncWordShows) {
    for (TRANSPORT_TYPE type : {TT_MP4_LOAS, TT_MP4_ADTS}) {
        const auto frame = type == TT_MP4_LOAS ? loasFrame({}, {kA}) : adtsFrame({}, kA);
        HANDLE_TRANSPORTDEC h = transportDec_Open(type, 0, 1);
        uint32_t valid = static_cast<uint32_t>(frame.size());
        transportDec_FillData(h, frame.data(), valid, &valid, 0);
        EXPECT_EQ(TRANSPORTDEC_NOT_ENOUGH_BITS, transportDec_ReadAccessUnit(h, 0));
        // One byte of the next header is not enough to tell a sync word.
        valid = 1;
        transportDec_FillData(h, frame.data(), 1, &valid, 0);
        EXPECT_EQ(TRANSPORTDEC_NOT_ENOUGH_BITS, transportDec_ReadAccessUnit(h, 0));
        valid = static_cast<uint32_t>(frame.size()) - 1;
        transportDec_FillData(h, frame.data(), static_cast<uint32_t>(frame.size()), &valid, 0);
        EXPECT_EQ(TRANSPORTDEC_OK, transportDec_ReadAccessUnit(h, 0));
        EXPECT_EQ(kA.size() * 8, transportDec_GetAuBitsTotal(h, 0));
        transportDec_Close(&h);
    }
}

// A frame found after a loss of sync must be followed by a sync word; once in sync,
// a frame followed by junk is still delivered and the junk skipped afterwards.
TEST_F(TransportDecoderHoldBackTest, NextSyncWordConfirmsOnlyAfterALossOfSync) {
    const auto a = adtsFrame({}, kA);
    const auto c = adtsFrame({}, kC);
    Harness harness(TT_MP4_ADTS);
    const auto got = harness.run(concat({a, {0x00, 0x00}, c, c}));
    std::vector<uint32_t> errors;
    for (const auto& o : got) {
        errors.push_back(o.error);
    }
    // First frame: followed by junk while not yet in sync, so it is not trusted and
    // everything up to the next sync word is skipped.
    EXPECT_EQ((std::vector<uint32_t>{TRANSPORTDEC_SYNC_ERROR, TRANSPORTDEC_OK, TRANSPORTDEC_OK}),
              errors);
    EXPECT_EQ(kC, got.back().unit);
    Harness synced(TT_MP4_ADTS);
    const auto got2 = synced.run(concat({a, a, {0x00, 0x00}, c}));
    errors.clear();
    for (const auto& o : got2) {
        errors.push_back(o.error);
    }
    EXPECT_EQ((std::vector<uint32_t>{TRANSPORTDEC_OK, TRANSPORTDEC_OK, TRANSPORTDEC_SYNC_ERROR,
                                     TRANSPORTDEC_OK}),
              errors);
}

// The decoder's own bounds-checked reader.
class TransportBitReaderTest : public ::testing::Test {
protected:
    const std::vector<uint8_t> kBytes = {0xA5, 0x3C, 0xFF, 0x01, 0x80};
};

TEST_F(TransportBitReaderTest, ReadsFieldsMsbFirstAcrossBytes) {
    struct Row {
        unsigned int skip;
        unsigned int count;
        uint32_t value;
    };
    for (const Row& row :
         {Row{0, 8, 0xA5}, Row{4, 8, 0x53}, Row{3, 13, 0x053C}, Row{0, 32, 0xA53CFF01},
          Row{7, 32, 0x9E7F80C0}, Row{39, 1, 0}, Row{32, 1, 1}}) {
        TransportBitReader r(kBytes.data(), static_cast<uint32_t>(kBytes.size()));
        r.skipBits(row.skip);
        EXPECT_EQ(row.value, r.peekBits(row.count)) << row.skip << "+" << row.count;
        EXPECT_EQ(row.value, r.readBits(row.count)) << row.skip << "+" << row.count;
        EXPECT_EQ(row.skip + row.count, r.bitPosition());
        EXPECT_FALSE(r.overrun());
    }
}

TEST_F(TransportBitReaderTest, ReadingPastTheEndLatchesOverrunWithoutMoving) {
    TransportBitReader r(kBytes.data(), static_cast<uint32_t>(kBytes.size()));
    r.skipBits(36);
    EXPECT_EQ(0u, r.readBits(5));
    EXPECT_TRUE(r.overrun());
    EXPECT_EQ(36u, r.bitPosition());
    EXPECT_EQ(0u, r.readBits(4));  // the field that fits still reads (zero bits here)
    EXPECT_EQ(40u, r.bitPosition());
    uint8_t out[2] = {0x11, 0x22};
    r.readBytes(out, 1);
    EXPECT_EQ(0x11, out[0]) << "nothing copied past the end";
    r.readBytes(nullptr, 0);  // an empty copy is no overrun and touches nothing
    EXPECT_EQ(40u, r.bitPosition());
}

TEST_F(TransportBitReaderTest, ReadsBytesAtAnyBitOffset) {
    for (unsigned int offset = 0; offset < 8; ++offset) {
        TransportBitReader r(kBytes.data(), static_cast<uint32_t>(kBytes.size()));
        r.skipBits(offset);
        uint8_t out[4] = {};
        r.readBytes(out, 4);
        TransportBitReader check(kBytes.data(), static_cast<uint32_t>(kBytes.size()));
        check.skipBits(offset);
        for (uint8_t b : out) {
            EXPECT_EQ(check.readBits(8), b) << "offset " << offset;
        }
        EXPECT_EQ(offset + 32, r.bitPosition());
    }
}

class TransportDecoderApiTest : public ::testing::Test {};

TEST_F(TransportDecoderApiTest, OpensOnlyLoasAndAdtsWithOneLayer) {
    struct Row {
        TRANSPORT_TYPE type;
        uint32_t layers;
        bool opens;
    };
    for (const Row& row :
         {Row{TT_MP4_LOAS, 1, true}, Row{TT_MP4_ADTS, 1, true}, Row{TT_MP4_LOAS, 2, false},
          Row{TT_UNKNOWN, 1, false}, Row{static_cast<TRANSPORT_TYPE>(6), 1, false}}) {
        HANDLE_TRANSPORTDEC h = transportDec_Open(row.type, 0, row.layers);
        EXPECT_EQ(row.opens, h != nullptr) << row.type << "/" << row.layers;
        transportDec_Close(&h);
        EXPECT_EQ(nullptr, h);
    }
}

TEST_F(TransportDecoderApiTest, NullHandleAndOtherLayersAreRefused) {
    uint8_t byte = 0;
    uint32_t valid = 1;
    EXPECT_NE(TRANSPORTDEC_OK, transportDec_FillData(nullptr, &byte, 1, &valid, 0));
    EXPECT_NE(TRANSPORTDEC_OK, transportDec_ReadAccessUnit(nullptr, 0));
    EXPECT_EQ(nullptr, transportDec_GetBitstream(nullptr, 0));
    HANDLE_TRANSPORTDEC h = transportDec_Open(TT_MP4_ADTS, 1, 1);
    EXPECT_EQ(TRANSPORTDEC_OK, transportDec_SetParam(h, TPDEC_PARAM_IGNORE_BUFFERFULLNESS, 1));
    EXPECT_TRUE(h->ignoreBufferFullness());
    EXPECT_NE(TRANSPORTDEC_OK, transportDec_FillData(h, &byte, 1, &valid, 1));
    EXPECT_EQ(1u, valid);
    EXPECT_NE(TRANSPORTDEC_OK, transportDec_ReadAccessUnit(h, 1));
    transportDec_Close(&h);
}

TEST_F(TransportDecoderApiTest, FillTakesWhatFitsAndReducesBytesValid) {
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
