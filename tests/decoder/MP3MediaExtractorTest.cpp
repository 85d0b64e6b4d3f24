#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>
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

using test::Bytes;
using test::ExtractedUnit;
using test::PesChunk;
using test::PrintTo;

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

// ISO/IEC 11172-3, 2.4.1.3 header, written field by field.
std::vector<uint8_t> header(const HeaderFields& f) {
    test::BitSink s;
    s.put(f.sync, 11);
    s.put(f.version, 2);
    s.put(f.layer, 2);
    s.put(f.protection, 1);
    s.put(f.bitRateIndex, 4);
    s.put(f.samplingRateIndex, 2);
    s.put(f.padding, 1);
    s.put(0, 1);  // private_bit
    s.put(f.channelMode, 2);
    s.put(0, 2);  // mode_extension
    s.put(0, 1);  // copyright
    s.put(1, 1);  // original/home
    s.put(f.emphasis, 2);
    return s.bytes();
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
    std::vector<uint8_t> es = frame(c.fields, c.length, 1);
    es = test::concat({es, frame(c.fields, c.length, 2)});
    const auto units = run({{es, 9000}});
    ASSERT_EQ(units.size(), 2u);
    EXPECT_EQ(units[0].bytes.size(), c.length);
    EXPECT_EQ(mExtractor->frameLength(), c.length);
    EXPECT_EQ(mExtractor->frameDuration(), c.durationTicks);
    EXPECT_EQ(units[0].pts, 9000);
    EXPECT_EQ(units[1].pts, static_cast<long long>(9000 + c.durationTicks));
    EXPECT_EQ(units[1].bytes, std::vector<uint8_t>(es.begin() + c.length, es.end()));
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
              (std::vector<ExtractedUnit>{{good, 1000, 0}}));
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

// A frame followed by too few bytes for the next header: 4 or 5 bytes are too few for
// a header with CRC although this one has none; fewer than 4 too few for any header.
TEST_F(MP3ExtractorFixture, TooFewBytesForTheNextHeader) {
    struct Row {
        size_t tail;
        bool withCrcMessage;
    };
    for (const Row& row : {Row{4, true}, Row{5, true}, Row{3, false}}) {
        SetUp();
        test::TraceCapture trace;
        HeaderFields f;  // protection bit 1: no CRC
        std::vector<uint8_t> es = frame(f, 417, 1);
        const std::vector<uint8_t> next = frame(f, 417, 2);
        es.insert(es.end(), next.begin(), next.begin() + static_cast<long>(row.tail));
        const auto units = run({{es, 0}});
        ASSERT_EQ(units.size(), 1u) << "tail " << row.tail;
        // Logged at the frame boundary and again by the rescan from the same byte.
        EXPECT_EQ(trace.count("parseHeader: No enough bits to parse header.\n") > 0,
                  !row.withCrcMessage);
        EXPECT_EQ(trace.count("parseHeader: No enough bits to parse header with CRC.") > 0,
                  row.withCrcMessage)
            << trace.all();
        EXPECT_EQ(trace.count("getNextFragment: Failed to parse header."), 1u);
        EXPECT_FALSE(mExtractor->isSynced());
    }
}

using Units = std::vector<ExtractedUnit>;

TEST_F(MP3ExtractorFixture, ResyncSkipsGarbageAndFalseSyncs) {
    // FF E0 with a reserved layer: a false sync that must be stepped over.
    const Bytes garbage = {0x00, 0x12, 0xFF, 0xE0, 0x00, 0x00, 0x00, 0x00, 0x7F};
    const Bytes frame1 = frame({}, 417, 1);
    const Bytes frame2 = frame({}, 417, 2);
    EXPECT_EQ(run({{test::concat({garbage, frame1, frame2}), 0}}),
              (Units{{frame1, 0, 0}, {frame2, 2340, 0}}));
}

class MP3RingProtocolTest : public MP3ExtractorFixture {
protected:
    // The reader lock as the ring's dump shows it: "Locked" or "Unlocked".
    std::string readLock() {
        const std::string dump = test::printed([&](FILE* f) { mRing->dump(f, 0); });
        return dump.find("ReadLock: \e[01;31mLocked") != std::string::npos     ? "Locked"
               : dump.find("ReadLock: \e[01;32mUnlocked") != std::string::npos ? "Unlocked"
                                                                               : dump;
    }
    unsigned int call(unsigned char* flags = nullptr) {
        long long pts = 0;
        return mExtractor->getDecodableUnit(mOut.data(), mOut.size(), &mLength, &pts, flags);
    }
    Bytes mOut = Bytes(4096);
    unsigned long mLength = 7;
};

TEST_F(MP3RingProtocolTest, NoDataReturnsTwoAndHoldsNoLock) {
    unsigned char flags = 0x5A;
    EXPECT_EQ(call(&flags), MediaExtractor::RESULT_NO_INPUT);
    EXPECT_EQ(mLength, 0u);
    EXPECT_EQ(flags, 0x5A);  // not touched by this extractor
    EXPECT_EQ(readLock(), "Unlocked");
}

TEST_F(MP3RingProtocolTest, RecordLargerThanReadableIsAFaultAndNotConsumed) {
    test::TraceCapture trace;
    ASSERT_TRUE(test::writeRawRecord(*mRing, 5000, 54, 4946, 0, Bytes(8)));
    EXPECT_EQ(call(), MediaExtractor::RESULT_RING_FAULT);
    EXPECT_EQ(trace.count(TRACE_ERROR, "getDecodableUnit: RingBuffer fatal errror: 48 5000"), 1u)
        << trace.all();
    EXPECT_EQ(mRing->tail(), 0u);
    EXPECT_EQ(readLock(), "Unlocked");
}

TEST_F(MP3RingProtocolTest, RecordHeldAcrossCallsAndConsumedWhenUsedUp) {
    const Bytes es = test::concat({frame({}, 417, 1), frame({}, 417, 2)});
    ASSERT_TRUE(test::writePesRecord(*mRing, es, 0));
    ASSERT_EQ(call(), 0u);
    EXPECT_EQ(mLength, 417u);
    EXPECT_EQ(mRing->tail(), 0u);
    EXPECT_EQ(readLock(), "Locked");
    ASSERT_EQ(call(), 0u);
    EXPECT_EQ(mLength, 417u);
    EXPECT_EQ(mRing->tail(), RingBuffer::roundUp4(40 + 14 + es.size()));
    EXPECT_EQ(readLock(), "Unlocked");
}

TEST_F(MP3RingProtocolTest, StatedEsSizeBeyondTheRecordIsBoundedByTheRecord) {
    const Bytes frame1 = frame({}, 417, 1);
    Bytes first = frame1;
    first.resize(417 + 30, 0x11);  // a frame, then 30 bytes of a frame cut short
    // mSizeES claims far more than the record holds; the next record follows in the ring.
    ASSERT_TRUE(test::writeRawRecord(*mRing, 40 + 447, 40, 100000, 7000, first));
    const Bytes second = frame({}, 417, 2);
    EXPECT_EQ(run({{second, 8000}}), (Units{{frame1, 7000, 0}, {second, 8000, 0}}));
}

std::vector<std::vector<uint8_t>> ffmpegFrames(const std::vector<uint8_t>& es, AVCodecID id) {
    std::vector<std::vector<uint8_t>> frames;
    for (auto& unit : test::ffmpegParse(es, id))
        frames.push_back(std::move(unit.bytes));
    return frames;
}

// Real encoder output against libavcodec's MPEG audio parser on the same bytes, from
// the ffmpeg command (cut here three ways) or from tsgen (cut as its muxer cuts it).
struct ReferenceCase {
    const char* name;
    const char* ffmpegAudio;  // ffmpeg encoder options and format, or nullptr
    const char* tsgen;        // tsgen options, or nullptr
    AVCodecID codec;
};

class MP3ReferenceTest : public MP3ExtractorFixture,
                         public ::testing::WithParamInterface<ReferenceCase> {
protected:
    // A header needs its 6 bytes inside one record: a frame whose header a record
    // boundary cuts is lost (the extractor resyncs on the next header); every other
    // frame comes out whole, and one that starts a record carries the record's PTS.
    void expectFfmpegFrames(const std::vector<PesChunk>& chunks, AVCodecID codec) {
        SetUp();
        std::vector<uint8_t> es;
        std::map<size_t, uint64_t> recordAt;  // ES offset -> PTS of the record there
        for (const auto& chunk : chunks) {
            recordAt[es.size()] = chunk.pts;
            es.insert(es.end(), chunk.es.begin(), chunk.es.end());
        }
        const auto reference = ffmpegFrames(es, codec);
        ASSERT_GT(reference.size(), 50u);
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
};

TEST_P(MP3ReferenceTest, SameFramesAsFfmpegParser) {
    const ReferenceCase& c = GetParam();
    if (c.tsgen != nullptr) {
        const auto ts =
            test::runTsgen(std::string("-d 2 --size 176x144 --no-caption-stream ") + c.tsgen);
        if (ts.empty()) {
            GTEST_SKIP() << "tsgen not available";
        }
        expectFfmpegFrames(test::pesFromTs(ts, 0x112), c.codec);
        return;
    }
    const std::string path = std::string(TAVO_BINARY_DIR) + "/mp3test_" + c.name + ".es";
    const std::string command =
        std::string("ffmpeg -v error -y -f lavfi -i sine=frequency=440:duration=3 -ac 2 ") +
        c.ffmpegAudio + " '" + path + "'";
    if (!test::succeeds(command)) {
        GTEST_SKIP() << "encoder not available: " << command;
    }
    const std::vector<uint8_t> es = test::fileBytes(path);
    std::filesystem::remove(path);
    // One frame per PES, three frames per PES, and odd fixed cuts.
    const auto frames = ffmpegFrames(es, c.codec);
    for (size_t perPes : {1, 3})
        expectFfmpegFrames(test::groupCuts(frames, perPes, 1000, 2160), c.codec);
    for (size_t cut : {1013, 5 * 1152 + 7})
        expectFfmpegFrames(test::fixedCuts(es, cut, 1000, 100), c.codec);
}

// 48 and 24 kHz at these rates need no padding, where the extractor's padded-frame rule
// departs from the standard's.
INSTANTIATE_TEST_SUITE_P(
    Encoders, MP3ReferenceTest,
    ::testing::Values(
        ReferenceCase{"mp2_48k", "-ar 48000 -c:a mp2 -b:a 192k -f mp2", nullptr, AV_CODEC_ID_MP2},
        ReferenceCase{"mp2_24k", "-ar 24000 -c:a mp2 -b:a 64k -f mp2", nullptr, AV_CODEC_ID_MP2},
        ReferenceCase{"mp3_48k",
                      "-ar 48000 -c:a libmp3lame -b:a 128k -write_xing 0 -id3v2_version 0 -f mp3",
                      nullptr, AV_CODEC_ID_MP3},
        ReferenceCase{"tsgen_mp2", nullptr, "--audio mp2", AV_CODEC_ID_MP2},
        ReferenceCase{"tsgen_mp2_3_per_pes", nullptr, "--audio mp2 --audio-frames-per-pes 3",
                      AV_CODEC_ID_MP2},
        ReferenceCase{"tsgen_mp3", nullptr, "--audio mp3 --audio-frames-per-pes 2",
                      AV_CODEC_ID_MP3},
        ReferenceCase{"tsgen_mp2_odd_pes", nullptr, "--audio mp2 --audio-pes-bytes 1001",
                      AV_CODEC_ID_MP2}),
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
    auto chunks = test::pesFromTs(ts, c.pid);
    ASSERT_GT(chunks.size(), 1u);
    const auto units = run(chunks);
    ASSERT_FALSE(units.empty());
    EXPECT_EQ(test::compareGolden(std::string(c.name) + ".mpa.txt", test::goldenDump(units)), "");
    if (c.sameAsFfmpeg) {
        const auto reference = ffmpegFrames(test::joinEs(chunks), AV_CODEC_ID_MP2);
        ASSERT_EQ(units.size(), reference.size());
        for (size_t i = 0; i < units.size(); ++i)
            ASSERT_EQ(units[i].bytes, reference[i]) << "frame " << i;
    }
    // Through the system's TS parser module, which emits a PES only when the next one
    // starts: the frames of all but the last PES.
    chunks.pop_back();
    SetUp();
    const auto expected = run(chunks);
    SetUp();
    EXPECT_EQ(
        test::firstDifference(test::runThroughTsParser(*mExtractor, mRing, ts, c.pid, 2), expected),
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
