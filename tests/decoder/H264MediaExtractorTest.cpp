#include <gtest/gtest.h>

#include <functional>
#include <map>
#include <string>
#include <vector>

extern "C" {
#include <libavcodec/avcodec.h>
}

#include "PesRecordTestUtil.h"
#include "decoder/H264MediaExtractor.h"
#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using namespace test;
using test::PrintTo;
using Units = std::vector<ExtractedUnit>;

// An independent bit-string builder for RBSPs: u(n) and ue(v) (ITU-T H.264, 7.2, 9.1).
class Rbsp : public test::BitSink {
public:
    Rbsp& u(unsigned count, uint64_t value) {
        put(static_cast<uint32_t>(value), count);
        return *this;
    }
    Rbsp& ue(uint64_t value) {
        const uint64_t code = value + 1;
        unsigned width = 0;
        while ((code >> width) > 1)
            ++width;
        u(width, 0);
        return u(width + 1, code);
    }
    // With rbsp_trailing_bits, or only padded with zero bits to a whole byte.
    Bytes bytes(bool trailing = true) const {
        BitSink out = *this;
        out.put(trailing ? 1 : 0, trailing ? 1 : 0);
        out.align();
        return out.BitSink::bytes();
    }
};

// A NAL unit: start code (3 or 4 bytes), header, payload with emulation prevention.
Bytes nal(uint8_t header, const Bytes& rbsp, bool longStartCode = true) {
    Bytes out = longStartCode ? Bytes{0, 0, 0, 1} : Bytes{0, 0, 1};
    out.push_back(header);
    int zeros = 0;
    for (uint8_t b : rbsp) {
        if (zeros >= 2 && b <= 3) {
            out.push_back(3);
            zeros = 0;
        }
        out.push_back(b);
        zeros = b == 0 ? zeros + 1 : 0;
    }
    return out;
}

// A High profile SPS, 1920 x 1088 (or field pairs of 1920 x 544), with a VUI whose
// timing is 1001/60000 s per tick (ITU-T H.264, 7.3.2.1.1, E.1.1).
struct SpsParams {
    unsigned heightMapUnits = 68;
    bool frameMbsOnly = true;
    bool vui = true;
    bool nalHrd = false;
    bool picStructPresent = false;
};

Bytes spsRbsp(const SpsParams& p) {
    Rbsp r;
    r.u(8, 100).u(8, 0).u(8, 40).ue(0);   // profile, constraints, level, id
    r.ue(1).ue(0).ue(0).u(1, 0).u(1, 0);  // 4:2:0, 8 bits, no scaling matrices
    r.ue(0).ue(0).ue(2);                  // frame_num, POC type 0 and its LSB
    r.ue(1).u(1, 0).ue(119).ue(p.heightMapUnits - 1);
    r.u(1, p.frameMbsOnly);
    if (!p.frameMbsOnly)
        r.u(1, 1);
    r.u(1, 1).u(1, 0).u(1, p.vui);  // direct_8x8_inference, no cropping
    if (p.vui) {
        r.u(1, 0).u(1, 0).u(1, 0).u(1, 0);  // aspect, overscan, video signal, chroma
        r.u(1, 1).u(32, 1001).u(32, 60000).u(1, 1);
        r.u(1, p.nalHrd);
        if (p.nalHrd) {
            r.ue(0).u(4, 2).u(4, 3).ue(1000).ue(2000).u(1, 1);
            // Five 5-bit fields, as the extractor reads them: delays of 10 bits.
            r.u(5, 23).u(5, 9).u(5, 5).u(5, 7).u(5, 0);
        }
        r.u(1, 0);  // VCL HRD
        if (p.nalHrd) {
            r.u(1, 0);  // low_delay_hrd_flag
        }
        r.u(1, p.picStructPresent).u(1, 0);
    }
    return r.bytes();
}

Bytes spsNal(const SpsParams& p = {}) {
    return nal(0x67, spsRbsp(p));
}
Bytes aud() {
    return nal(0x09, Rbsp().u(3, 7).bytes());
}
Bytes pps() {
    return nal(0x68, Rbsp().ue(0).ue(0).u(1, 0).u(1, 0).ue(0).bytes());
}
// A slice: first_mb_in_slice, slice_type, pps id, frame_num (4 bits), [field_pic_flag],
// then filler. `header` 0x65 for IDR, 0x41 otherwise.
Bytes slice(uint8_t header, unsigned firstMb, bool longStartCode = false, int field = -1,
            size_t filler = 24) {
    Rbsp r;
    r.ue(firstMb).ue(header == 0x65 ? 7 : 5).ue(0).u(4, 0);
    if (field >= 0)
        r.u(1, static_cast<unsigned>(field));
    for (size_t i = 0; i < filler; ++i)
        r.u(8, 0xA0 + i % 31);
    return nal(header, r.bytes(), longStartCode);
}
// An SEI NAL unit with one message of `payloadType` (its body padded with zero bits to
// a whole byte) and rbsp_trailing_bits (ITU-T H.264, 7.3.2.3).
Bytes seiNal(uint8_t payloadType, const Bytes& body) {
    return nal(0x06,
               concat({Bytes{payloadType, static_cast<uint8_t>(body.size())}, body, Bytes{0x80}}),
               false);
}
// A picture-timing SEI for an SPS without HRD: pic_struct and no clock timestamps.
Bytes picTimingSei(unsigned picStruct) {
    Rbsp payload;
    payload.u(4, picStruct);
    static const unsigned clocks[9] = {1, 1, 1, 2, 2, 3, 3, 2, 3};
    for (unsigned i = 0; i < clocks[picStruct]; ++i)
        payload.u(1, 0);
    return seiNal(1, payload.bytes(false));
}

class H264Fixture : public ::testing::Test {
protected:
    void SetUp() override {
        mRing = test::makeRing("VideoPES", 1u << 22);
        mExtractor = new H264MediaExtractor(mRing);
    }
    std::vector<ExtractedUnit> run(const std::vector<PesChunk>& chunks, size_t out = 1 << 20) {
        return test::runExtractor(*mExtractor, *mRing, chunks, out);
    }
    android::sp<RingBuffer> mRing;
    android::sp<H264MediaExtractor> mExtractor;
    Bytes mOut = Bytes(1 << 16);
};

// --- SPS and SEI --------------------------------------------------------------

class H264SpsSeiTest : public H264Fixture {};

TEST_F(H264SpsSeiTest, PicTimingWithHrdDelaysAndClockTimestamp) {
    Bytes sps = spsRbsp({.nalHrd = true, .picStructPresent = true});
    ASSERT_EQ(mExtractor->decodeSPS(sps.data(), sps.size(), false), 0u);
    Rbsp payload;
    payload.u(10, 0x155).u(10, 0x0AA).u(4, 3);  // two delays, pic_struct 3: two clocks
    payload.u(1, 1).u(2, 1).u(1, 0).u(5, 4).u(1, 1).u(1, 0).u(1, 0).u(8, 12);
    payload.u(6, 30).u(6, 59).u(5, 23);  // full timestamp
    payload.u(1, 0);
    Bytes sei = seiNal(1, payload.bytes(false));
    // Without its 3-byte start code and header.
    EXPECT_EQ(mExtractor->decodeSEI(sei.data() + 4, sei.size() - 4, true), 0u);
    EXPECT_TRUE(mExtractor->isPicTimingSeen());
    EXPECT_EQ(mExtractor->getPicStruct(), 3);
}

// se(v) feeds only the scaling lists' delta_scale, whose sum decides where the list ends
// (ITU-T H.264, 7.3.2.1.1.1): a wrong sign mapping misreads every later SPS field of a
// stream with explicit lists, and no stream here has them.
TEST_F(H264SpsSeiTest, ExpGolombCodesReadBackAsWritten) {
    const int64_t values[] = {0, 1, -1, 2, -2, 100, -32768};
    Rbsp r;
    r.ue(0xFFFFFFFE);
    for (int64_t v : values)
        r.ue(v > 0 ? 2 * v - 1 : -2 * v);
    Bytes bytes = r.bytes();
    ReadBitInterface reader(bytes.data(), bytes.size());
    EXPECT_EQ(mExtractor->parseUEGolomb(&reader), 0xFFFFFFFEu);
    for (int64_t v : values)
        EXPECT_EQ(mExtractor->parseSEGolomb(&reader), v);
}

// --- access units -----------------------------------------------------------------

class H264AccessUnitTest : public H264Fixture {};

constexpr unsigned char kIdrSps = H264MediaExtractor::kFlagIdr | H264MediaExtractor::kFlagSps;

TEST_F(H264AccessUnitTest, DelimiterSplitsRecordIntoTwoUnits) {
    const Bytes first = concat(
        {aud(), spsNal({.picStructPresent = true}), pps(), picTimingSei(0), slice(0x65, 0, true)});
    const Bytes second = concat({aud(), slice(0x41, 0, true)});
    const Bytes es = concat({first, second});
    ASSERT_TRUE(test::writePesRecord(*mRing, es, 90000));
    std::vector<ExtractedUnit> units;
    ASSERT_EQ(test::pullUnit(*mExtractor, mOut, &units), 0u);
    EXPECT_EQ(mRing->tail(), 0u);  // the record is still in use
    // The first unit has the leading zero of its 4-byte start code.
    EXPECT_EQ(units, (Units{{first, 90000, kIdrSps}}));
    unsigned long length = 0;
    long long pts = 0;
    unsigned char flags = 0xFF;  // must be written, not left as it was
    ASSERT_EQ(mExtractor->getDecodableUnit(mOut.data(), mOut.size(), &length, &pts, &flags), 0u);
    EXPECT_EQ(
        (ExtractedUnit{Bytes(mOut.begin(), mOut.begin() + static_cast<long>(length)), pts, flags}),
        (ExtractedUnit{second, 90000 + 1501, 0}));
    EXPECT_EQ(mRing->tail(), RingBuffer::roundUp4(40 + 14 + es.size()));
}

TEST_F(H264AccessUnitTest, NothingIsOutputBeforeTheFirstSps) {
    const Bytes withoutSps = concat({aud(), slice(0x41, 0)});
    const Bytes withSps = concat({aud(), spsNal(), slice(0x65, 0)});
    EXPECT_EQ(run({{withoutSps, 100}, {withoutSps, 200}, {withSps, 300}}),
              (Units{{withSps, 300, kIdrSps}}));
}

TEST_F(H264AccessUnitTest, PicStructStreamWaitsForPictureTiming) {
    // No picture-timing SEI yet: slices are ignored, so the second AUD does not end the AU.
    const Bytes first =
        concat({aud(), spsNal({.picStructPresent = true}), slice(0x65, 0), aud(), slice(0x41, 0)});
    const Bytes second = concat({aud(), picTimingSei(0), slice(0x41, 0)});
    const Bytes third = concat({aud(), slice(0x41, 0)});
    EXPECT_EQ(run({{first, 0}, {concat({second, third}), 9000}}),
              (Units{{first, 0, kIdrSps}, {second, 9000, 0}, {third, 9000 + 1501, 0}}));
}

TEST_F(H264AccessUnitTest, FieldPairsInOneRecordAreCutAtEveryFirstMbZero) {
    // Field pictures (field_pic_flag 1) each start with first_mb_in_slice 0, so the
    // second field ends the unit that the AUD opened; what follows it up to the next
    // delimiter is cut by the same rule: field 2 (and likewise field 3) only marks the
    // first slice of its call. Field pictures without pic_struct count two ticks each.
    const Bytes head = concat({aud(), spsNal({.heightMapUnits = 34, .frameMbsOnly = false}), pps(),
                               slice(0x65, 0, true, 1)});
    const Bytes field = slice(0x41, 0, true, 1);
    EXPECT_EQ(run({{concat({head, field, aud(), field, field}), 0}}),
              (Units{{head, 0, kIdrSps}, {aud(), 3003, 0}, {field, 6006, 0}}));
    EXPECT_EQ(mExtractor->getFrameDuration(), 3003);
}

TEST_F(H264AccessUnitTest, UnitLargerThanOutputIsDroppedSilently) {
    const Bytes big = concat({aud(), spsNal(), slice(0x65, 0, true, -1, 400)});
    const Bytes small = concat({aud(), slice(0x41, 0, true)});
    test::TraceCapture trace;
    // A dropped unit does not advance the time.
    EXPECT_EQ(run({{concat({big, small}), 100}}, 300), (Units{{small, 100, 0}}));
    EXPECT_EQ(trace.lines().size(), 0u) << trace.all();
}

TEST_F(H264AccessUnitTest, ResetGivesTheRecordBackAndDecodesTheSpsAgain) {
    const Bytes first = concat({aud(), spsNal(), slice(0x65, 0)});
    const Bytes es = concat({first, aud(), slice(0x41, 0)});
    ASSERT_TRUE(test::writePesRecord(*mRing, es, 700));
    std::vector<ExtractedUnit> units;
    ASSERT_EQ(test::pullUnit(*mExtractor, mOut, &units), 0u);
    mExtractor->reset();
    EXPECT_FALSE(mExtractor->isFrameDurationKnown());
    ASSERT_EQ(test::pullUnit(*mExtractor, mOut, &units), 0u);
    // Both times from the record's start, with the SPS decoded again.
    EXPECT_EQ(units, (Units{{first, 700, kIdrSps}, {first, 700, kIdrSps}}));
}

// --- real encoder output against libavcodec's H.264 parser --------------------------

// libavcodec's units as the extractor must deliver them: unit i with the PTS `ptsOf(i)`,
// the IDR flag where libavcodec sees a key frame and the SPS flag on the first when `sps`.
Units referenceUnits(const std::vector<test::ParsedUnit>& reference, bool sps,
                     const std::function<long long(size_t)>& ptsOf) {
    Units units;
    for (size_t i = 0; i < reference.size(); ++i) {
        const int flags = (reference[i].key ? H264MediaExtractor::kFlagIdr : 0) |
                          (sps && i == 0 ? H264MediaExtractor::kFlagSps : 0);
        units.push_back({reference[i].bytes, ptsOf(i), static_cast<unsigned char>(flags)});
    }
    return units;
}

// 45 frames of FFmpeg's test pattern from libx264; empty when that encoder is missing.
Bytes encode(const std::string& x264Params, const std::string& extra) {
    const TempDir dir("tavo_h264");
    const std::string path = dir / "x264.h264";
    const bool ok = runCommand(
                        "ffmpeg -v error -f lavfi -i testsrc=size=352x288:rate=30000/1001 "
                        "-frames:v 45 -c:v libx264 -preset ultrafast -x264-params " +
                        x264Params + " " + extra + " -f h264 '" + path + "'")
                        .exitCode == 0;
    return ok ? fileBytes(path) : Bytes();
}

struct StreamCase {
    const char* name;
    const char* x264Params;
    const char* extra;
    long long ticks;  // the frame duration the extractor is expected to find
};

class H264RealStreamTest : public H264Fixture, public ::testing::WithParamInterface<StreamCase> {};

TEST_P(H264RealStreamTest, SameAccessUnitsAsFfmpegParser) {
    const StreamCase& c = GetParam();
    const Bytes es = encode(c.x264Params, c.extra);
    if (es.empty()) {
        GTEST_SKIP() << "ffmpeg with libx264 not available";
    }
    const auto reference = test::ffmpegParse(es, AV_CODEC_ID_H264);
    ASSERT_EQ(reference.size(), 45u);
    // One access unit per PES, then several: the same units, each PES's first with its
    // PTS, the others the frame duration after the one before.
    for (size_t group : {1, 3, 7}) {
        SetUp();
        const Units expected = referenceUnits(reference, true, [&](size_t i) {
            return static_cast<long long>(500 + (i - i % group) * 3003 + (i % group) * c.ticks);
        });
        EXPECT_EQ(test::firstDifference(
                      run(test::groupCuts(test::bytesOf(reference), group, 500, 3003)), expected),
                  "")
            << "group " << group;
        EXPECT_EQ(mExtractor->getCroppedWidth(), 352u);
        EXPECT_EQ(mExtractor->getCroppedHeight(), 288u);
        EXPECT_EQ(mExtractor->getFrameDuration(), c.ticks);
    }
}

INSTANTIATE_TEST_SUITE_P(
    X264, H264RealStreamTest,
    ::testing::Values(
        // Interlaced, fixed rate, picture timing with pic_struct 3/4 (two fields): two
        // ticks of 1001/60000 s.
        StreamCase{"InterlacedPicStructFixed",
                   "interlaced=1:pic-struct=1:aud=1:keyint=15:force-cfr=1", "-flags +ildct+ilme",
                   3003},
        // Without fixed_frame_rate_flag every unit counts one tick: 1501.
        StreamCase{"InterlacedPicStructVariable", "interlaced=1:pic-struct=1:aud=1:keyint=15",
                   "-flags +ildct+ilme", 1501},
        // A standard aspect ratio (4:3 is aspect_ratio_idc 14).
        StreamCase{"ProgressiveFixed", "aud=1:keyint=20:force-cfr=1", "-vf setsar=4/3", 1501},
        // An extended aspect ratio (idc 255 with its two 16-bit fields).
        StreamCase{"ProgressiveBFrames", "aud=1:keyint=12:bframes=2:force-cfr=1", "-vf setsar=5/7",
                   1501},
        // 25 frames/s, pic_struct 0 (a frame): one tick of 1/50 s.
        StreamCase{"Progressive25PicStruct", "aud=1:keyint=25:pic-struct=1:force-cfr=1", "-r 25",
                   1800}),
    [](const auto& info) { return std::string(info.param.name); });

// --- generated transport streams ------------------------------------------------------

class H264TsgenTest : public H264Fixture {
protected:
    // The video PES of a generated stream, and libavcodec's units of the same bytes.
    bool generate(const std::string& arguments) {
        const Bytes ts = test::runTsgen(arguments);
        if (ts.empty())
            return false;
        mChunks = test::pesFromTs(ts, 0x111);
        mReference = test::ffmpegParse(test::joinEs(mChunks), AV_CODEC_ID_H264);
        return true;
    }
    std::vector<PesChunk> mChunks;
    std::vector<test::ParsedUnit> mReference;
};

// One unit per PES, the ones libavcodec finds, each with its record's PTS: the
// interlaced 1080 default stream (SPS flag on the first unit, 1088 coded lines cropped
// to 1080, one 1001/60000 s tick per unit without fixed_frame_rate_flag), and a stream
// without VUI (its SPS fails, so no unit carries the SPS flag and no rate is known).
TEST_F(H264TsgenTest, OneUnitPerPesWithAndWithoutVui) {
    for (const bool vui : {true, false}) {
        if (!generate(vui ? "-d 1 --audio none --no-caption-stream"
                          : "-d 1 --size 352x288 --audio none --no-caption-stream --no-vui")) {
            GTEST_SKIP() << "tsgen not available";
        }
        SetUp();
        test::TraceCapture trace;
        ASSERT_EQ(mReference.size(), mChunks.size());
        const Units expected = referenceUnits(
            mReference, vui, [&](size_t i) { return static_cast<long long>(mChunks[i].pts); });
        EXPECT_EQ(test::firstDifference(run(mChunks), expected), "");
        EXPECT_EQ(trace.count("decodeSPS: VUI is not present"), vui ? 0u : 1u);
        if (vui) {
            EXPECT_EQ(mExtractor->getCroppedWidth(), 1920u);
            EXPECT_EQ(mExtractor->getCroppedHeight(), 1080u);
            EXPECT_EQ(mExtractor->getFrameDuration(), 1501);
        } else {
            EXPECT_FALSE(mExtractor->isFrameDurationKnown());
        }
    }
}

TEST_F(H264TsgenTest, StreamWithoutDelimitersSwitchesToTheWorkaround) {
    if (!generate("-d 2 --size 352x288 --audio none --no-caption-stream --no-aud --gop 100")) {
        GTEST_SKIP() << "tsgen not available";
    }
    ASSERT_EQ(mReference.size(), mChunks.size());
    ASSERT_GT(mChunks.size(), 40u);
    test::TraceCapture trace;
    const auto units = run(mChunks);
    EXPECT_EQ(trace.count("getNextAccessUnit: apply workaround"), 1u);
    // The first record (it has the SPS), nothing for the next 31, then one per record.
    ASSERT_EQ(units.size(), 1 + (mChunks.size() - 32));
    EXPECT_EQ(units[0].bytes, mReference[0].bytes);
    for (size_t i = 1; i < units.size(); ++i) {
        const size_t record = 31 + i;
        const Bytes& whole = mReference[record].bytes;
        // The unit runs from the picture's first slice (its SEI before it is left out)
        // to the end of the record.
        ASSERT_LE(units[i].bytes.size(), whole.size());
        EXPECT_TRUE(std::equal(units[i].bytes.rbegin(), units[i].bytes.rend(), whole.rbegin()))
            << "record " << record;
        EXPECT_EQ(units[i].pts, static_cast<long long>(mChunks[record].pts));
    }
}

// --- sample broadcasts: golden dumps --------------------------------------------------

struct SampleCase {
    const char* name;
    const char* file;
    uint16_t pid;
};

class H264GoldenTest : public H264Fixture, public ::testing::WithParamInterface<SampleCase> {};

TEST_P(H264GoldenTest, UnitsMatchTheDumpFfmpegAndTheTsParserPath) {
    const SampleCase& c = GetParam();
    const std::string path = test::sampleStream(c.file);
    if (path.empty()) {
        GTEST_SKIP() << "sample stream absent from " << TAVO_SHARED_STREAMS_DIR;
    }
    const Bytes ts = test::fileBytes(path);
    const auto chunks = test::pesFromTs(ts, c.pid);
    ASSERT_GT(chunks.size(), 1u);
    const auto units = run(chunks);
    EXPECT_EQ(test::compareGolden(std::string(c.name) + ".h264.txt", test::goldenDump(units)), "");

    // Independent check: every unit is one that libavcodec's parser cuts from the same
    // elementary stream (these muxers start each PES with an access unit).
    std::map<Bytes, int> reference;
    for (const auto& unit : test::ffmpegParse(test::joinEs(chunks), AV_CODEC_ID_H264))
        ++reference[unit.bytes];
    for (size_t i = 0; i < units.size(); ++i) {
        EXPECT_GT(reference[units[i].bytes]--, 0)
            << "unit " << i << " of " << units.size() << ", " << units[i].bytes.size() << " bytes";
    }

    // The same units through the system's TS parser module.
    EXPECT_EQ(test::tsParserPathDifference(
                  ts, c.pid, 1, [](const auto& input) { return new H264MediaExtractor(input); }),
              "");
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Samples, H264GoldenTest, ::testing::Values(
    SampleCase{"dvb_1080_x264", "dvb_h264_1080_mpeg1audio_0x03.ts", 0x100},
    SampleCase{"dvb_1080i_picstruct", "dvb_h264_1080i_picstruct_sei_ac3_teletext.ts", 0x78},
    SampleCase{"exoplayer_h264_mpeg_audio", "exoplayer_sample_h264_mpeg_audio.ts", 0x100},
    // The ISDB-Tb captures carry no PES start on their video PID, so nothing to cut.
    SampleCase{"exoplayer_h264_no_aud_name", "exoplayer_sample_h264_no_access_unit_delimiters.ts", 0x100}),
    [](const auto& info) { return std::string(info.param.name); });
// clang-format on

}  // namespace
}  // namespace TavoPlayer
