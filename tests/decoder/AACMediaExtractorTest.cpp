// The AAC extractor over PES records in a ring: configuration again after reset, the
// switch between LOAS and ADTS, a writer thread, and records that lie
// about their sizes. Units, re-segmentation and time stamps against FFmpeg's are in
// AACReferenceTest.cpp.
#include "decoder/AACMediaExtractor.h"

#include <gtest/gtest.h>

#include <string>
#include <thread>
#include <vector>

#include "AACTestUtil.h"
#include "PesRecordTestUtil.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using namespace test;

constexpr uint64_t kTicksPerFrame48k = 1920;  // 1024 samples at 48 kHz in 90 kHz ticks
const std::vector<uint8_t> kLcStereo48kAsc = {0x11, 0x90, 0, 0, 0, 0, 0, 0, 0, 0};

using Framing = AACMediaExtractor::transportLayer_t;
constexpr Framing kLoas = AACMediaExtractor::TRANSPORT_LAYER_LOAS;
constexpr Framing kAdts = AACMediaExtractor::TRANSPORT_LAYER_ADTS;
using test::PrintTo;

// Frames of a synthetic stream and the access units they carry.
struct Stream {
    std::vector<std::vector<uint8_t>> frames;
    std::vector<std::vector<uint8_t>> units;
};

// LOAS frames carry a StreamMuxConfig every `configEvery` frames, as broadcasters
// repeat it.
Stream makeStream(Framing framing, size_t count, uint32_t seed = 7, size_t configEvery = 4) {
    Stream s;
    for (size_t i = 0; i < count; ++i) {
        auto unit = patternPayload(60 + (i * 37) % 250, seed + static_cast<uint32_t>(i));
        LoasOptions loas;
        loas.useSameStreamMux = (i % configEvery) != 0;
        s.frames.push_back(framing == kLoas ? loasFrame(loas, {unit})
                                            : adtsFrame(AdtsOptions{}, unit));
        s.units.push_back(std::move(unit));
    }
    return s;
}

class AACExtractorTest : public ::testing::Test {
protected:
    void SetUp() override { mRing = test::makeRing("AudioPES", 1u << 20); }

    // One frame per record, a frame's duration apart.
    void writeRecords(const std::vector<std::vector<uint8_t>>& frames) {
        for (const auto& record : test::groupCuts(frames, 1, 0, kTicksPerFrame48k))
            ASSERT_TRUE(test::writePesRecord(*mRing, record.es, record.pts, 0xC0));
    }

    // Drains a new extractor opened as `layer` over the ring.
    std::vector<ExtractedUnit> extract(Framing layer, size_t outputSize = 8192) {
        mExtractor = new AACMediaExtractor(mRing, layer);
        return test::drain(*mExtractor, outputSize);
    }

    android::sp<RingBuffer> mRing;
    android::sp<AACMediaExtractor> mExtractor;
    test::TraceCapture mTrace;
};

// ---- configuration first ----------------------------------------------------------

class AACFramingTest : public AACExtractorTest, public ::testing::WithParamInterface<Framing> {};

TEST_P(AACFramingTest, ResetSendsTheConfigurationAgainBeforeAudio) {
    const Stream s = makeStream(GetParam(), 10);
    writeRecords(s.frames);
    mExtractor = new AACMediaExtractor(mRing, GetParam());
    std::vector<uint8_t> out(4096);
    std::vector<ExtractedUnit> before;
    while (before.size() < 4)
        ASSERT_EQ(0u, test::pullUnit(*mExtractor, out, &before)) << mTrace.all();
    mExtractor->reset();
    EXPECT_FALSE(mExtractor->configSent());
    const auto after = test::drain(*mExtractor);
    ASSERT_FALSE(after.empty());
    EXPECT_EQ(AACMediaExtractor::FLAG_CODEC_CONFIG, after[0].flags);
    EXPECT_EQ(kLcStereo48kAsc, after[0].bytes);
    // The unit read with the new configuration request is replaced again; then audio.
    ASSERT_EQ(s.units.size() - before.size() - 1, after.size());
    for (size_t i = 1; i < after.size(); ++i) {
        EXPECT_EQ(s.units[before.size() + i], after[i].bytes) << i;
        EXPECT_EQ(0, after[i].flags);
    }
    EXPECT_EQ(0u, mRing->usedSpace());
}

INSTANTIATE_TEST_SUITE_P(Framings, AACFramingTest, ::testing::Values(kLoas, kAdts),
                         [](const auto& info) { return info.param == kLoas ? "Loas" : "Adts"; });

// ---- the switch between LOAS and ADTS --------------------------------------------

struct SwitchCase {
    std::string name;
    Framing stream;
    Framing openedAs;
    // Before the switch, every `lookAlikeEvery`-th record starts with the stream's
    // own sync word; the others start with one stray byte (0 = none does).
    size_t lookAlikeEvery;
    size_t recordsBeforeSwitch;  // records consumed when the switch happens
    const char* suspectMessage;
};

class AACSwitchTest : public AACExtractorTest, public ::testing::WithParamInterface<SwitchCase> {};

TEST_P(AACSwitchTest, SwitchesAfterTheCountedErrorsAndThenDeliversConfigAndAudio) {
    const SwitchCase& c = GetParam();
    const size_t total = c.recordsBeforeSwitch + 6;
    const Stream s = makeStream(c.stream, total, 11, 1);
    std::vector<std::vector<uint8_t>> records;
    for (size_t i = 0; i < total; ++i) {
        const bool lookAlike =
            i >= c.recordsBeforeSwitch || (c.lookAlikeEvery != 0 && (i % c.lookAlikeEvery) == 0);
        records.push_back(lookAlike ? s.frames[i] : test::concat({{0x00}, s.frames[i]}));
    }
    writeRecords(records);
    const auto units = extract(c.openedAs);

    EXPECT_EQ(c.stream, mExtractor->transportLayer());
    ASSERT_FALSE(units.empty()) << mTrace.all();
    EXPECT_EQ(AACMediaExtractor::FLAG_CODEC_CONFIG, units[0].flags);
    EXPECT_EQ(kLcStereo48kAsc, units[0].bytes);
    // The first record after the switch gives the configuration, all later ones audio.
    const auto firstAudio = s.units.begin() + static_cast<long>(c.recordsBeforeSwitch) + 1;
    EXPECT_EQ(std::vector<Bytes>(firstAudio, s.units.end() - 1),
              test::bytesOf({units.begin() + 1, units.end()}))
        << mTrace.all();
    const size_t lookAlikes =
        c.lookAlikeEvery == 0 ? 0
                              : (c.recordsBeforeSwitch + c.lookAlikeEvery - 1) / c.lookAlikeEvery;
    EXPECT_EQ(lookAlikes, mTrace.count(c.suspectMessage));
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Framings, AACSwitchTest, ::testing::Values(
    // One ADTS-looking record is enough once 26 errors are counted.
    SwitchCase{"AdtsOpenedAsLoas", kAdts, kLoas, 1, 26, "ADTS supect count"},
    SwitchCase{"AdtsOpenedAsLoasOneLookAlike", kAdts, kLoas, 30, 26, "ADTS supect count"},
    SwitchCase{"AdtsOpenedAsLoasNoLookAlike", kAdts, kLoas, 0, 50, "ADTS supect count"},
    // Ten LOAS-looking records are needed when decoding ADTS.
    SwitchCase{"LoasOpenedAsAdts", kLoas, kAdts, 1, 26, "LOAS supect count"},
    SwitchCase{"LoasOpenedAsAdtsEveryThird", kLoas, kAdts, 3, 28, "LOAS supect count"},
    SwitchCase{"LoasOpenedAsAdtsNoLookAlike", kLoas, kAdts, 0, 50, "LOAS supect count"}),
    [](const auto& info) { return info.param.name; });
// clang-format on

// After the first configuration nothing switches any more, whatever comes.
TEST_F(AACExtractorTest, NoSwitchAfterTheFirstConfiguration) {
    const Stream loas = makeStream(kLoas, 3);
    const Stream adts = makeStream(kAdts, 60);
    writeRecords(loas.frames);
    writeRecords(adts.frames);
    const auto units = extract(kLoas);
    EXPECT_EQ(AACMediaExtractor::TRANSPORT_LAYER_LOAS, mExtractor->transportLayer());
    EXPECT_EQ(3u, units.size());
    EXPECT_EQ(0u, mTrace.count("supect count"));
}

// ---- a writer thread on the other side ----------------------------------------------

// The extractor gives the reader lock back and takes it again while a record is in
// use; with a small ring the writer keeps waiting for the space that consumption
// frees. Every unit must come out once, in order.
TEST_F(AACExtractorTest, WriterThreadAndExtractorShareASmallRing) {
    android::sp<RingBuffer> ring = test::makeRing("AudioPES", 1u << 14);  // a few dozen records
    const Stream s = makeStream(kLoas, 300, 5, 3);
    std::thread writer([&] {
        for (size_t i = 0; i < s.frames.size(); ++i) {
            while (!test::writePesRecord(*ring, s.frames[i], i * kTicksPerFrame48k, 0xC0)) {
            }
        }
    });
    mExtractor = new AACMediaExtractor(ring, kLoas);
    const auto units = test::drain(*mExtractor, 4096, 10);
    writer.join();
    std::vector<ExtractedUnit> expected = {
        {kLcStereo48kAsc, 0, AACMediaExtractor::FLAG_CODEC_CONFIG}};
    for (size_t i = 1; i + 1 < s.units.size(); ++i)
        expected.push_back({s.units[i], static_cast<long long>(i * kTicksPerFrame48k), 0});
    EXPECT_EQ(test::firstDifference(units, expected), "");
}

// ---- bad input ------------------------------------------------------------------------

TEST_F(AACExtractorTest, RecordsClaimingMoreEsThanTheyHoldAreReadOnlyToTheirEnd) {
    const Stream s = makeStream(kAdts, 6);
    // A record whose mSizeES runs 5000 bytes past its end, one whose ES offset lies
    // beyond it, then a good stream.
    const auto& f = s.frames[0];
    ASSERT_TRUE(test::writeRawRecord(*mRing, PESData::kHeaderSize + static_cast<uint32_t>(f.size()),
                                     PESData::kHeaderSize, 5000, 0, f));
    ASSERT_TRUE(test::writeRawRecord(*mRing, PESData::kHeaderSize + 8, 4000, 100, 0,
                                     std::vector<uint8_t>(8, 0xFF)));
    writeRecords(s.frames);
    const auto units = extract(kAdts);
    // The first (bounded) record's frame is complete: it becomes the configuration;
    // the last frame waits for a next header.
    std::vector<Bytes> expected = {kLcStereo48kAsc};
    expected.insert(expected.end(), s.units.begin(), s.units.end() - 1);
    ASSERT_EQ(expected, test::bytesOf(units));
    EXPECT_EQ(AACMediaExtractor::FLAG_CODEC_CONFIG, units[0].flags);
    EXPECT_EQ(0u, mRing->usedSpace());
}

// The answers that carry no unit: no input within the wait on an empty ring, then a
// ring fault for a record larger than the readable bytes, which is left in place.
TEST_F(AACExtractorTest, NoInputThenRingFaultDeliverNothing) {
    mExtractor = new AACMediaExtractor(mRing, AACMediaExtractor::TRANSPORT_LAYER_LOAS);
    std::vector<uint8_t> out(1024);
    unsigned long length = 5;
    long long pts = 0;
    unsigned char flags = 0;
    EXPECT_EQ(2u, mExtractor->getDecodableUnit(out.data(), out.size(), &length, &pts, &flags));
    EXPECT_EQ(0u, length);
    ASSERT_TRUE(test::writeRawRecord(*mRing, 4096, PESData::kHeaderSize, 10, 0,
                                     std::vector<uint8_t>(16, 0)));
    length = 5;
    EXPECT_EQ(1u, mExtractor->getDecodableUnit(out.data(), out.size(), &length, &pts, &flags));
    EXPECT_EQ(0u, length);
    EXPECT_EQ(1u, mTrace.count("getDecodableUnit: RingBuffer fatal errror: 56 4136"));
    EXPECT_NE(0u, mRing->usedSpace()) << "nothing consumed";
}

TEST_F(AACExtractorTest, UnitLargerThanTheOutputIsDroppedAndTheNextDelivered) {
    Stream s = makeStream(kAdts, 5);
    s.units[2] = patternPayload(600, 99);
    s.frames[2] = adtsFrame({}, s.units[2]);
    writeRecords(s.frames);
    const auto units = extract(kAdts, 512);
    EXPECT_EQ((std::vector<Bytes>{kLcStereo48kAsc, s.units[1], s.units[3]}), test::bytesOf(units));
}

}  // namespace
}  // namespace TavoPlayer
