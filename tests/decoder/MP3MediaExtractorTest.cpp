#include <gtest/gtest.h>

#include <cstdio>
#include <map>
#include <string>
#include <vector>

extern "C" {
#include <libavcodec/avcodec.h>
}

#include "PesRecordTestUtil.h"
#include "decoder/MP3MediaExtractor.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using namespace test;
using test::PrintTo;
using Units = std::vector<ExtractedUnit>;

struct HeaderFields {
    unsigned version = 3;  // 3 MPEG-1, 2 MPEG-2, 0 MPEG 2.5
    unsigned layer = 1;    // 3 Layer I, 2 Layer II, 1 Layer III
    unsigned protection = 1;
    unsigned bitRateIndex = 9;
    unsigned samplingRateIndex = 0;
    unsigned padding = 0;
    unsigned channelMode = 0;
    unsigned emphasis = 0;
    unsigned sync = 0x7FF;
};

// ISO/IEC 11172-3, 2.4.1.3 header: private_bit 0, mode_extension 0, copyright 0,
// original 1.
std::vector<uint8_t> header(const HeaderFields& f) {
    const uint32_t h = f.sync << 21 | f.version << 19 | f.layer << 17 | f.protection << 16 |
                       f.bitRateIndex << 12 | f.samplingRateIndex << 10 | f.padding << 9 |
                       f.channelMode << 6 | 1u << 2 | f.emphasis;
    return {static_cast<uint8_t>(h >> 24), static_cast<uint8_t>(h >> 16),
            static_cast<uint8_t>(h >> 8), static_cast<uint8_t>(h)};
}

// A frame of `length` bytes: the header, then a body that cannot contain a sync word.
std::vector<uint8_t> frame(const HeaderFields& f, size_t length, uint8_t seed) {
    std::vector<uint8_t> bytes = header(f);
    for (size_t i = bytes.size(); i < length; ++i)
        bytes.push_back(static_cast<uint8_t>((seed + i) % 0x7F));
    return bytes;
}

class MP3ExtractorFixture : public ::testing::Test {
protected:
    void SetUp() override {
        mRing = test::makeRing("AudioPES", 1u << 20);
        mExtractor = new MP3MediaExtractor(mRing);
    }
    std::vector<ExtractedUnit> run(const std::vector<PesChunk>& chunks,
                                   size_t outputSize = 1 << 16) {
        return test::runExtractor(*mExtractor, *mRing, chunks, outputSize);
    }
    android::sp<RingBuffer> mRing;
    android::sp<MP3MediaExtractor> mExtractor;
};

// Frame lengths and durations by the extractor's rule: truncated double arithmetic,
// padding added before the factor 144 for Layers II and III of every version.
struct LengthCase {
    const char* name;
    HeaderFields fields;
    uint32_t length;
    uint64_t durationTicks;
};

class MP3FrameLengthTest : public MP3ExtractorFixture,
                           public ::testing::WithParamInterface<LengthCase> {};

TEST_P(MP3FrameLengthTest, LengthAndDurationFollowTheTables) {
    const LengthCase& c = GetParam();
    const Bytes first = frame(c.fields, c.length, 1);
    const Bytes second = frame(c.fields, c.length, 2);
    EXPECT_EQ(
        run({{test::concat({first, second}), 9000}}),
        (Units{{first, 9000, 0}, {second, static_cast<long long>(9000 + c.durationTicks), 0}}));
}

INSTANTIATE_TEST_SUITE_P(Tables, MP3FrameLengthTest,
                         ::testing::Values(
                             // 128 kbit/s, 44.1 kHz Layer III: 26 ms = 2340 ticks.
                             LengthCase{"V1L3_128k_44k", {3, 1, 1, 9, 0, 0}, 417, 2340},
                             LengthCase{"V1L3_128k_44k_padded", {3, 1, 1, 9, 0, 1}, 561, 3150},
                             // Forbidden index 15 takes the sixteenth row: 384 kbit/s.
                             LengthCase{"V1L3_index15", {3, 1, 1, 15, 0, 0}, 1253, 2340},
                             LengthCase{"V1L1_384k_48k", {3, 3, 1, 12, 1, 0}, 384, 720},
                             LengthCase{"V1L1_32k_32k_padded", {3, 3, 1, 1, 2, 1}, 52, 1170},
                             LengthCase{"V2L3_64k_24k", {2, 1, 1, 8, 1, 0}, 384, 4320},
                             LengthCase{"V2L1_index15_16k", {2, 3, 1, 15, 2, 0}, 3456, 2160},
                             LengthCase{"V25L3_64k_12k", {0, 1, 1, 8, 1, 0}, 768, 8640},
                             LengthCase{"V1L2_CRC", {3, 2, 0, 10, 1, 0}, 576, 2160}),
                         [](const auto& info) { return std::string(info.param.name); });

// A stream with one bad spot: the bad frame is not delivered (and logged), the stream
// goes on, and a dropped frame does not advance the time.
struct BadFrameCase {
    const char* name;
    HeaderFields fields;  // of the first frame
    const char* message;
    size_t length = 417;
    size_t outputSize = 1 << 16;
};

class MP3BadFrameTest : public MP3ExtractorFixture,
                        public ::testing::WithParamInterface<BadFrameCase> {};

TEST_P(MP3BadFrameTest, IsSkippedWithItsMessageAndTheStreamGoesOn) {
    const BadFrameCase& c = GetParam();
    test::TraceCapture trace;
    const Bytes good = frame({}, 417, 4);
    EXPECT_EQ(run({{test::concat({frame(c.fields, c.length, 3), good}), 1000}}, c.outputSize),
              (Units{{good, 1000, 0}}));
    EXPECT_GE(trace.count(TRACE_ERROR, c.message), 1u) << trace.all();
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(BadFrames, MP3BadFrameTest, ::testing::Values(
    BadFrameCase{"Version", {1, 1, 1, 9, 0}, "parseHeader: Invalid Version ID: 0x1"},
    BadFrameCase{"Layer", {3, 0, 1, 9, 0}, "parseHeader: Invalid Layer Index: 0x0"},
    BadFrameCase{"FreeFormat", {3, 1, 1, 0, 0}, "parseHeader: Invalid bit rate index: 0x0"},
    BadFrameCase{"SamplingRate", {3, 1, 1, 9, 3}, "parseHeader: Invalid sampling rate index: 0x3"},
    BadFrameCase{"Emphasis", {3, 1, 1, 9, 0, 0, 0, 2}, "parseHeader: Invalid emphasis value: 0x2"},
    // A padded 561-byte frame and an output one byte smaller.
    BadFrameCase{"OutputOneByteTooSmall", {.padding = 1},
                 "getNextFragment: not enough space in output buffer for MPEG audio frame.", 561, 560}),
    [](const auto& info) { return std::string(info.param.name); });
// clang-format on

TEST_F(MP3ExtractorFixture, ResyncSkipsGarbageAndFalseSyncs) {
    // FF E0 with a reserved layer: a false sync that must be stepped over.
    const Bytes garbage = {0x00, 0x12, 0xFF, 0xE0, 0x00, 0x00, 0x00, 0x00, 0x7F};
    const Bytes frame1 = frame({}, 417, 1);
    const Bytes frame2 = frame({}, 417, 2);
    EXPECT_EQ(run({{test::concat({garbage, frame1, frame2}), 0}}),
              (Units{{frame1, 0, 0}, {frame2, 2340, 0}}));
}

// A record larger than the readable bytes is a ring fault: nothing is consumed and the
// reader lock is given back (the ring's dump shows it).
TEST_F(MP3ExtractorFixture, RecordLargerThanReadableIsAFaultAndNotConsumed) {
    test::TraceCapture trace;
    ASSERT_TRUE(test::writeRawRecord(*mRing, 5000, 54, 4946, 0, Bytes(8)));
    Bytes out(4096);
    unsigned long length = 7;
    long long pts = 0;
    EXPECT_EQ(mExtractor->getDecodableUnit(out.data(), out.size(), &length, &pts, nullptr),
              MediaExtractor::RESULT_RING_FAULT);
    EXPECT_EQ(trace.count(TRACE_ERROR, "getDecodableUnit: RingBuffer fatal errror: 48 5000"), 1u)
        << trace.all();
    EXPECT_EQ(mRing->tail(), 0u);
    const std::string dump = test::printed([&](FILE* f) { mRing->dump(f, 0); });
    EXPECT_NE(dump.find("ReadLock: \e[01;32mUnlocked"), std::string::npos) << dump;
}

// Real encoder output from tsgen, cut as its muxer cuts it, against libavcodec's MPEG
// audio parser on the same bytes.
struct ReferenceCase {
    const char* name;
    const char* tsgen;  // the audio options
    AVCodecID codec;
};

class MP3ReferenceTest : public MP3ExtractorFixture,
                         public ::testing::WithParamInterface<ReferenceCase> {};

// A header needs its 6 bytes inside one record: a frame whose header a record boundary
// cuts is lost (the extractor resyncs on the next header); every other frame comes out
// whole, and one that starts a record carries the record's PTS.
TEST_P(MP3ReferenceTest, SameFramesAsFfmpegParser) {
    const auto ts =
        test::runTsgen(std::string("-d 2 --size 176x144 --no-caption-stream ") + GetParam().tsgen);
    if (ts.empty()) {
        GTEST_SKIP() << "tsgen not available";
    }
    const std::vector<PesChunk> chunks = test::pesFromTs(ts, 0x112);
    std::map<size_t, uint64_t> recordAt;  // ES offset -> PTS of the record there
    for (size_t at = 0; const auto& chunk : chunks) {
        recordAt[at] = chunk.pts;
        at += chunk.es.size();
    }
    const auto reference = test::bytesOf(test::ffmpegParse(test::joinEs(chunks), GetParam().codec));
    ASSERT_GT(reference.size(), 30u);
    const auto units = run(chunks);
    size_t at = 0;
    size_t next = 0;
    for (const auto& frame : reference) {
        const auto boundary = recordAt.upper_bound(at);
        if (boundary == recordAt.end() || boundary->first >= at + 6) {
            ASSERT_LT(next, units.size());
            ASSERT_EQ(units[next].bytes, frame) << "frame at " << at;
            if (recordAt.count(at) != 0) {
                EXPECT_EQ(units[next].pts, static_cast<long long>(recordAt[at]));
            }
            ++next;
        }
        at += frame.size();
    }
    EXPECT_EQ(next, units.size());
}

// 48 and 24 kHz at these rates need no padding, where the extractor's padded-frame rule
// departs from the standard's.
INSTANTIATE_TEST_SUITE_P(
    Encoders, MP3ReferenceTest,
    ::testing::Values(
        ReferenceCase{"mp2", "--audio mp2", AV_CODEC_ID_MP2},
        ReferenceCase{"mp2_3_per_pes", "--audio mp2 --audio-frames-per-pes 3", AV_CODEC_ID_MP2},
        ReferenceCase{"mp2_odd_pes", "--audio mp2 --audio-pes-bytes 1001", AV_CODEC_ID_MP2},
        // MPEG-2 (half rate) Layer II, with headers cut by the record boundaries.
        ReferenceCase{"mp2_24k_odd_pes",
                      "--audio mp2 --audio-rate 24000 --audio-bitrate 64000 --audio-pes-bytes 1013",
                      AV_CODEC_ID_MP2},
        ReferenceCase{"mp3", "--audio mp3 --audio-frames-per-pes 2", AV_CODEC_ID_MP3},
        ReferenceCase{"mp3_odd_pes", "--audio mp3 --audio-pes-bytes 5767", AV_CODEC_ID_MP3}),
    [](const auto& info) { return std::string(info.param.name); });

// Sample broadcasts: golden dumps, and libavcodec's frames where the stream needs no
// padding (48 kHz), where this extractor's frame-length rule and the standard's agree.
struct SampleCase {
    const char* name;
    const char* file;
    uint16_t pid;
    bool sameAsFfmpeg;
};

class MP3GoldenTest : public MP3ExtractorFixture,
                      public ::testing::WithParamInterface<SampleCase> {};

TEST_P(MP3GoldenTest, FramesMatchTheDumpFfmpegAndTheTsParserPath) {
    const SampleCase& c = GetParam();
    const std::string path = test::sampleStream(c.file);
    if (path.empty()) {
        GTEST_SKIP() << "sample stream absent from " << TAVO_SHARED_STREAMS_DIR;
    }
    const std::vector<uint8_t> ts = test::fileBytes(path);
    const auto chunks = test::pesFromTs(ts, c.pid);
    ASSERT_GT(chunks.size(), 1u);
    const auto units = run(chunks);
    ASSERT_FALSE(units.empty());
    EXPECT_EQ(test::compareGolden(std::string(c.name) + ".mpa.txt", test::goldenDump(units)), "");
    if (c.sameAsFfmpeg) {
        const auto reference =
            test::bytesOf(test::ffmpegParse(test::joinEs(chunks), AV_CODEC_ID_MP2));
        ASSERT_EQ(units.size(), reference.size());
        for (size_t i = 0; i < units.size(); ++i)
            ASSERT_EQ(units[i].bytes, reference[i]) << "frame " << i;
    }
    // The same frames through the system's TS parser module.
    EXPECT_EQ(test::tsParserPathDifference(
                  ts, c.pid, 2, [](const auto& input) { return new MP3MediaExtractor(input); }),
              "");
}

INSTANTIATE_TEST_SUITE_P(
    Samples, MP3GoldenTest,
    ::testing::Values(
        SampleCase{"dvb_mp2_48k", "dvb_h264_1080_mpeg1audio_0x03.ts", 0x101, true},
        SampleCase{"exoplayer_h264_mp2_44k", "exoplayer_sample_h264_mpeg_audio.ts", 0x101, false},
        SampleCase{"exoplayer_h262_mp2_44k", "exoplayer_sample_h262_mpeg_audio.ts", 0x101, false}),
    [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace TavoPlayer
