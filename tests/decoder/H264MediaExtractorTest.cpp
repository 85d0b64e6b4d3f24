#include <gtest/gtest.h>

#include <filesystem>
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

using test::Bytes;
using test::concat;
using test::ExtractedUnit;
using test::PesChunk;
using test::PrintTo;

// An independent bit-string builder for RBSPs: u(n), ue(v), se(v) (ITU-T H.264, 7.2, 9.1).
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
    Rbsp& se(int64_t value) { return ue(value > 0 ? 2 * value - 1 : -2 * value); }
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

struct SpsParams {
    unsigned profile = 100;
    unsigned spsId = 0;
    unsigned chromaFormat = 1;
    unsigned bitDepthLumaMinus8 = 0;
    unsigned bitDepthChromaMinus8 = 0;
    bool scalingLists = false;
    unsigned log2MaxFrameNumMinus4 = 0;
    unsigned pocType = 0;
    unsigned log2MaxPocLsbMinus4 = 2;
    unsigned pocCycle = 0;
    unsigned refFrames = 1;
    unsigned widthMbs = 120;
    unsigned heightMapUnits = 68;
    bool frameMbsOnly = true;
    unsigned cropBottom = 0;  // in crop units
    bool vui = true;
    int aspectIdc = -1;  // -1: no aspect ratio info
    bool timing = true;
    uint32_t numUnitsInTick = 1001;
    uint32_t timeScale = 60000;
    bool fixedFrameRate = true;
    bool nalHrd = false;
    unsigned hrdFields[5] = {23, 23, 5, 7, 24};
    bool picStructPresent = false;
    bool bitstreamRestriction = true;
};

Bytes spsRbsp(const SpsParams& p) {
    Rbsp r;
    r.u(8, p.profile).u(8, 0).u(8, 40).ue(p.spsId);
    if (p.profile == 100) {
        r.ue(p.chromaFormat);
        if (p.chromaFormat == 3)
            r.u(1, 0);
        r.ue(p.bitDepthLumaMinus8).ue(p.bitDepthChromaMinus8).u(1, 0);
        r.u(1, p.scalingLists);
        if (p.scalingLists) {
            for (int list = 0; list < 8; ++list) {
                r.u(1, list % 2 == 0);
                if (list % 2 == 0) {
                    const int entries = list < 6 ? 16 : 64;
                    for (int j = 0; j < entries; ++j) {
                        r.se(j == entries - 1 ? -8 - j : 1);  // ends with next = 0
                    }
                }
            }
        }
    }
    r.ue(p.log2MaxFrameNumMinus4).ue(p.pocType);
    if (p.pocType == 0) {
        r.ue(p.log2MaxPocLsbMinus4);
    } else if (p.pocType == 1) {
        r.u(1, 0).se(-3).se(2).ue(p.pocCycle);
        for (unsigned i = 0; i < p.pocCycle && i < 300; ++i)
            r.se(static_cast<int>(i % 5) - 2);
    }
    r.ue(p.refFrames).u(1, 0).ue(p.widthMbs - 1).ue(p.heightMapUnits - 1);
    r.u(1, p.frameMbsOnly);
    if (!p.frameMbsOnly)
        r.u(1, 1);
    r.u(1, 1);
    r.u(1, p.cropBottom != 0);
    if (p.cropBottom != 0)
        r.ue(0).ue(0).ue(0).ue(p.cropBottom);
    r.u(1, p.vui);
    if (p.vui) {
        r.u(1, p.aspectIdc >= 0);
        if (p.aspectIdc >= 0) {
            r.u(8, static_cast<unsigned>(p.aspectIdc));
            if (p.aspectIdc == 255)
                r.u(16, 4).u(16, 3);
        }
        r.u(1, 0);                          // overscan
        r.u(1, 1).u(3, 5).u(1, 0).u(1, 1);  // video signal, colour description
        r.u(8, 1).u(8, 1).u(8, 1);
        r.u(1, 1).ue(0).ue(0);  // chroma location
        r.u(1, p.timing);
        if (p.timing)
            r.u(32, p.numUnitsInTick).u(32, p.timeScale).u(1, p.fixedFrameRate);
        r.u(1, p.nalHrd);
        if (p.nalHrd) {
            r.ue(0).u(4, 2).u(4, 3).ue(1000).ue(2000).u(1, 1);
            for (unsigned f : p.hrdFields) {  // five fields, as the extractor reads them
                r.u(5, f);
            }
        }
        r.u(1, 0);  // VCL HRD
        if (p.nalHrd) {
            r.u(1, 0);  // low_delay_hrd_flag
        }
        r.u(1, p.picStructPresent);
        r.u(1, p.bitstreamRestriction);
        if (p.bitstreamRestriction)
            r.u(1, 1).ue(2).ue(1).ue(16).ue(16).ue(1).ue(4);
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
// A picture-timing SEI for an SPS without HRD: pic_struct and no clock timestamps.
// An SEI NAL unit with one message of `payloadType` (its body padded with zero bits to
// a whole byte) and rbsp_trailing_bits (ITU-T H.264, 7.3.2.3).
Bytes seiNal(uint8_t payloadType, const Bytes& body) {
    return nal(0x06,
               concat({Bytes{payloadType, static_cast<uint8_t>(body.size())}, body, Bytes{0x80}}),
               false);
}
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

// --- Exp-Golomb and emulation prevention ------------------------------------------------

class H264GolombTest : public H264Fixture {};

// The codes read back as written; a code running off the buffer (24 zeros, no 1) stops
// at the buffer's end. Signed codes occur only in SPS fields whose values nothing
// downstream reads (POC type 1, scaling lists), so no stream comparison sees a wrong
// se(v) mapping: this does.
TEST_F(H264GolombTest, UnsignedAndSignedCodesRoundTrip) {
    const uint64_t unsignedValues[] = {0, 1, 2, 3, 6, 7, 254, 255, 65535, 0x7FFFFFFE, 0xFFFFFFFE};
    const int64_t signedValues[] = {0, 1, -1, 2, -2, 100, -100, 32767, -32768};
    Rbsp r;
    for (uint64_t v : unsignedValues)
        r.ue(v);
    for (int64_t v : signedValues)
        r.se(v);
    Bytes bytes = r.bytes();
    ReadBitInterface reader(bytes.data(), bytes.size());
    for (uint64_t v : unsignedValues)
        EXPECT_EQ(mExtractor->parseUEGolomb(&reader), v);
    for (int64_t v : signedValues)
        EXPECT_EQ(mExtractor->parseSEGolomb(&reader), v);
    Bytes zeros(3, 0x00);
    ReadBitInterface short3(zeros.data(), zeros.size());
    mExtractor->parseUEGolomb(&short3);
    EXPECT_EQ(short3.remainingBytes(), 0u);
}

class H264EmulationPreventionTest : public H264Fixture {};

// Emulation prevention bytes are removed from the fourth byte on; fewer than four
// bytes are refused.
TEST_F(H264EmulationPreventionTest, RemovalStartsAtByteFour) {
    struct Case {
        Bytes in;
        Bytes out;  // empty: refused
    };
    // clang-format off
    const Case cases[] = {
        {{0x00, 0x00, 0x03, 0x01, 0x00, 0x00, 0x03, 0x00, 0x00, 0x03}, {0x00, 0x00, 0x03, 0x01, 0x00, 0x00, 0x00, 0x00}},
        {{0x11, 0x00, 0x00, 0x03, 0x02}, {0x11, 0x00, 0x00, 0x03, 0x02}},  // 03 at byte 3 kept
        {{0x11, 0x22, 0x00, 0x00, 0x03, 0x01}, {0x11, 0x22, 0x00, 0x00, 0x01}},
        {{0x11, 0x22, 0x33, 0x44, 0x00, 0x03, 0x00, 0x03}, {0x11, 0x22, 0x33, 0x44, 0x00, 0x03, 0x00, 0x03}},
        {{0x11, 0x22, 0x33, 0x44, 0x00, 0x00}, {0x11, 0x22, 0x33, 0x44, 0x00, 0x00}},
        {{0x00, 0x00, 0x03}, {}},
    };
    // clang-format on
    for (const Case& c : cases) {
        test::TraceCapture trace;
        Bytes in = c.in;
        unsigned char* out = nullptr;
        unsigned int outSize = 0;
        ASSERT_EQ(mExtractor->decodeNALUnit(in.data(), in.size(), &out, &outSize) != 0,
                  c.out.empty());
        EXPECT_EQ(out == nullptr ? Bytes() : Bytes(out, out + outSize), c.out);
        EXPECT_EQ(trace.count(TRACE_ERROR, "decodeNALUnit: NAL Unit with less than 4 bytes?"),
                  c.out.empty() ? 1u : 0u);
        delete[] out;
    }
}

// --- SPS ------------------------------------------------------------------------

struct SpsCase {
    const char* name;
    SpsParams params;
    unsigned result;
    const char* message;  // expected error text, or nullptr
    uint32_t width;
    uint32_t height;
};

class H264SpsTest : public H264Fixture, public ::testing::WithParamInterface<SpsCase> {};

TEST_P(H264SpsTest, DecodesFieldsOrFailsWithItsMessage) {
    const SpsCase& c = GetParam();
    test::TraceCapture trace;
    Bytes rbsp = nal(0x67, spsRbsp(c.params));
    rbsp.erase(rbsp.begin(), rbsp.begin() + 5);  // the bytes after the header, escaped
    EXPECT_EQ(mExtractor->decodeSPS(rbsp.data(), rbsp.size(), true), c.result) << trace.all();
    if (c.message != nullptr) {
        EXPECT_EQ(trace.count(TRACE_ERROR, c.message), 1u) << trace.all();
    } else {
        EXPECT_EQ(trace.lines().size(), 0u) << trace.all();
    }
    if (c.width != 0) {
        EXPECT_EQ(mExtractor->getCroppedWidth(), c.width);
        EXPECT_EQ(mExtractor->getCroppedHeight(), c.height);
    }
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Fields, H264SpsTest, ::testing::Values(
    SpsCase{"Crop1088To1080", {.cropBottom = 4}, 0, nullptr, 1920, 1080},
    SpsCase{"InterlacedCrop", {.heightMapUnits = 34, .frameMbsOnly = false, .cropBottom = 2}, 0, nullptr, 1920, 1080},
    SpsCase{"Baseline", {.profile = 66, .widthMbs = 40, .heightMapUnits = 30}, 0, nullptr, 640, 480},
    SpsCase{"ScalingLists", {.scalingLists = true}, 0, nullptr, 1920, 1088},
    SpsCase{"PocType1", {.pocType = 1, .pocCycle = 3}, 0, nullptr, 1920, 1088},
    SpsCase{"PocType2", {.pocType = 2}, 0, nullptr, 1920, 1088},
    SpsCase{"Aspect17Passes", {.aspectIdc = 17}, 0, nullptr, 0, 0},
    SpsCase{"Aspect255", {.aspectIdc = 255}, 0, nullptr, 0, 0},
    SpsCase{"Aspect18Fails", {.aspectIdc = 18}, 1, "decodeVUI: Illegal Aspect Ratio: 18", 0, 0},
    SpsCase{"NoVui", {.vui = false}, 1, "decodeSPS: VUI is not present", 1920, 1088},
    SpsCase{"ZeroTimeScale", {.timeScale = 0}, 1, "decodeVUI: Illegal TimeScale or Number of Ticks (0, 1001)", 0, 0},
    SpsCase{"SpsId32", {.spsId = 32}, 1, "decodeSPS: SPS number (32) is out of range", 0, 0},
    SpsCase{"Chroma4", {.chromaFormat = 4}, 1, "decodeSPS: Chroma Format IDC 4 is not valid", 0, 0},
    SpsCase{"BitDepthsDiffer", {.bitDepthChromaMinus8 = 2}, 1, "decodeSPS: Illegal bit depth values (8, 10)", 0, 0},
    SpsCase{"BitDepth15", {.bitDepthLumaMinus8 = 7, .bitDepthChromaMinus8 = 7}, 1, "decodeSPS: Illegal bit depth values (15, 15)", 0, 0},
    SpsCase{"MaxFrameNum17", {.log2MaxFrameNumMinus4 = 13}, 1, "decodeSPS; Max frame num invalid range out of range (4-16): 17", 0, 0},
    SpsCase{"PocLsb17", {.log2MaxPocLsbMinus4 = 13}, 1, "decodeSPS: log2MaxPocLSB (17) is out of range", 0, 0},
    SpsCase{"PocCycle256", {.pocType = 1, .pocCycle = 256}, 1, "decodeSPS: Poc Cycle Length out of bounds: 256", 0, 0},
    SpsCase{"PocType3", {.pocType = 3}, 1, "decodeSPS: illegal POC type 3", 0, 0},
    SpsCase{"RefFrames17", {.refFrames = 17}, 1, "decodeSPS: Reference frames invalid: 17", 0, 0}),
    [](const auto& info) { return std::string(info.param.name); });
// clang-format on

class H264SpsRobustnessTest : public H264Fixture {};

// Every input goes in as a heap copy of exactly its size, so that ASan sees any read
// beyond it: every truncation of an SPS fails, and truncated SEI messages give no
// picture timing. (Bit flips are the fuzz target's business.)
TEST_F(H264SpsRobustnessTest, TruncatedUnitsNeverReadOutsideTheirBytes) {
    const auto exact = [](const Bytes& bytes, size_t size) {
        std::unique_ptr<uint8_t[]> copy(new uint8_t[std::max<size_t>(size, 1)]);
        std::copy(bytes.begin(), bytes.begin() + static_cast<long>(size), copy.get());
        return copy;
    };
    const Bytes full = spsRbsp({.scalingLists = true, .nalHrd = true, .picStructPresent = true});
    ASSERT_EQ(mExtractor->decodeSPS(exact(full, full.size()).get(), full.size(), false), 0u);
    // Cut before the last byte that holds a field (the last byte is only trailing bits).
    for (size_t size = 0; size + 1 < full.size(); ++size)
        EXPECT_EQ(mExtractor->decodeSPS(exact(full, size).get(), size, true), 1u) << size;
    SetUp();
    ASSERT_EQ(mExtractor->decodeSPS(exact(full, full.size()).get(), full.size(), false), 0u);
    const Bytes sei = {0xFF, 0xFF, 0x02, 0xFF, 0x30, 0x01, 0x02, 0x03, 0x04, 0x05};
    for (size_t size = 4; size <= sei.size(); ++size)
        mExtractor->decodeSEI(exact(sei, size).get(), size, true);
    EXPECT_FALSE(mExtractor->isPicTimingSeen());
}

TEST_F(H264SpsRobustnessTest, FifthHrdFieldShiftsTheLaterFields) {
    Bytes rbsp =
        spsRbsp({.nalHrd = true, .hrdFields = {23, 17, 5, 9, 11}, .picStructPresent = true});
    ASSERT_EQ(mExtractor->decodeSPS(const_cast<uint8_t*>(rbsp.data()), rbsp.size(), false), 0u);
    const auto& hrd = mExtractor->getNalHrd();
    EXPECT_EQ(hrd.lengthField[0], 23);
    EXPECT_EQ(hrd.lengthField[1], 17);
    EXPECT_EQ(hrd.lengthField[2], 9);  // the fourth read wins
    EXPECT_EQ(hrd.lengthField[3], 11);
    EXPECT_EQ(hrd.cpbCountMinus1, 0u);
    EXPECT_EQ(hrd.bitRateValueMinus1[0], 1000u);
    EXPECT_EQ(hrd.cpbSizeValueMinus1[0], 2000u);
    EXPECT_TRUE(hrd.cbrFlag[0]);
    EXPECT_TRUE(mExtractor->getPicStructPresent());
}

// --- SEI and frame rate --------------------------------------------------------------

class H264SeiTest : public H264Fixture {
protected:
    void decodeSps(const SpsParams& p) {
        Bytes rbsp = spsRbsp(p);
        ASSERT_EQ(mExtractor->decodeSPS(rbsp.data(), rbsp.size(), false), 0u);
    }
    unsigned decodeSei(Bytes seiNal) {
        seiNal.erase(seiNal.begin(), seiNal.begin() + 4);  // 3-byte start code and header
        return mExtractor->decodeSEI(seiNal.data(), seiNal.size(), true);
    }
};

TEST_F(H264SeiTest, PicTimingWithHrdDelaysAndClockTimestamp) {
    // Delays of 10 bits, no time offset.
    decodeSps({.nalHrd = true, .hrdFields = {23, 9, 5, 7, 0}, .picStructPresent = true});
    Rbsp payload;
    payload.u(10, 0x155).u(10, 0x0AA).u(4, 3);  // two delays, pic_struct 3: two clocks
    payload.u(1, 1).u(2, 1).u(1, 0).u(5, 4).u(1, 1).u(1, 0).u(1, 0).u(8, 12);
    payload.u(6, 30).u(6, 59).u(5, 23);  // full timestamp
    payload.u(1, 0);
    EXPECT_EQ(decodeSei(seiNal(1, payload.bytes(false))), 0u);
    EXPECT_TRUE(mExtractor->isPicTimingSeen());
    EXPECT_EQ(mExtractor->getPicStruct(), 3);
}

TEST_F(H264SeiTest, InvalidPicStructIsRefused) {
    decodeSps({.picStructPresent = true});
    test::TraceCapture trace;
    EXPECT_NE(decodeSei(seiNal(1, {0x9F})), 0u);  // pic_struct 9
    EXPECT_FALSE(mExtractor->isPicTimingSeen());
    EXPECT_EQ(trace.count("decodePicTimingSEI: Invalid picStruct value: 9"), 1u) << trace.all();
    EXPECT_EQ(trace.count("decodeSEI: Error decoding SEI"), 1u);
}

// Another message's payload is skipped by its size in bits modulo 256: a 40-byte
// user-data message (320 bits) wraps to 64, so what its bytes 8.. hold (a picture
// timing with pic_struct 4) is read next; a 31-byte one is skipped whole and the real
// picture timing after it (pic_struct 2) is read.
TEST_F(H264SeiTest, OtherMessageIsSkippedModulo256Bits) {
    for (uint8_t size : {40, 31}) {
        SetUp();
        decodeSps({.picStructPresent = true});
        Bytes sei = {5, size};
        sei.resize(2 + size, 0x55);
        sei.at(10) = 1;
        sei.at(11) = 1;
        sei.at(12) = 0x40;  // pic_struct 4, clock flags 0 0
        sei.insert(sei.end(), {1, 1, 0x20, 0x80});
        decodeSei(nal(0x06, sei, false));
        EXPECT_TRUE(mExtractor->isPicTimingSeen());
        EXPECT_EQ(mExtractor->getPicStruct(), size == 40 ? 4 : 2) << int(size);
    }
}

struct RateCase {
    const char* name;
    uint32_t units;
    uint32_t scale;
    bool fixed;
    bool picStructPresent;
    unsigned picStruct;
    bool field;
    long long ticks;
};

class H264FrameRateTest : public H264SeiTest, public ::testing::WithParamInterface<RateCase> {};

TEST_P(H264FrameRateTest, DurationInTicks) {
    const RateCase& c = GetParam();
    decodeSps({.numUnitsInTick = c.units,
               .timeScale = c.scale,
               .fixedFrameRate = c.fixed,
               .picStructPresent = c.picStructPresent});
    if (c.picStructPresent) {
        decodeSei(picTimingSei(c.picStruct));
        ASSERT_TRUE(mExtractor->isPicTimingSeen());
    }
    ASSERT_EQ(mExtractor->calculateFrameRate(c.field), 0u);
    EXPECT_EQ(mExtractor->getFrameDuration(), c.ticks);
}

INSTANTIATE_TEST_SUITE_P(
    Table, H264FrameRateTest,
    ::testing::Values(RateCase{"Frame2997PicStruct0", 1001, 60000, true, true, 0, false, 1501},
                      RateCase{"Frame2997PicStruct3", 1001, 60000, true, true, 3, false, 3003},
                      RateCase{"Frame2997PicStruct1", 1001, 60000, true, true, 1, true, 3003},
                      RateCase{"NoPicStructFrame", 1001, 60000, true, false, 0, false, 1501},
                      RateCase{"NoPicStructField", 1001, 60000, true, false, 0, true, 3003},
                      RateCase{"NotFixedField", 1001, 60000, false, false, 0, true, 1501},
                      RateCase{"Pal50", 1, 50, true, false, 0, false, 1800},
                      RateCase{"Film24", 1001, 48000, true, false, 0, false, 1876}),
    [](const auto& info) { return std::string(info.param.name); });

TEST_F(H264SeiTest, NoTimingIsInvalid) {
    test::TraceCapture trace;
    EXPECT_NE(mExtractor->calculateFrameRate(false), 0u);
    EXPECT_EQ(trace.count("calculateFrameRate: Invalid timing"), 1u);
    EXPECT_EQ(mExtractor->getFrameDuration(), 3003);  // the initial value stands
}

// --- access units -----------------------------------------------------------------

class H264AccessUnitTest : public H264Fixture {};

using Units = std::vector<ExtractedUnit>;
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

// Without VUI the SPS fails (no SPS flag) and slices never delimit: the first record is
// one unit; in the next, the unit runs from the first AUD to the payload end.
TEST_F(H264AccessUnitTest, SpsWithoutVuiDelimitsOnlyByRecord) {
    test::TraceCapture trace;
    const Bytes first =
        concat({aud(), spsNal({.vui = false}), slice(0x65, 0), aud(), slice(0x41, 0)});
    const Bytes fromAud = concat({aud(), slice(0x41, 0)});
    EXPECT_EQ(run({{first, 1000}, {concat({slice(0x41, 0), fromAud}), 4000}}),
              (Units{{first, 1000, H264MediaExtractor::kFlagIdr}, {fromAud, 4000, 0}}));
    EXPECT_EQ(trace.count("decodeSPS: VUI is not present"), 1u);
    EXPECT_EQ(trace.count("getNextAccessUnit: Error decoding SPS"), 1u);
    EXPECT_FALSE(mExtractor->isFrameDurationKnown());
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

// Records without any unit start: after 31 of them the extractor delimits by record,
// and then at every slice that starts a picture.
TEST_F(H264AccessUnitTest, WorkaroundAfterThirtyOneRecordsWithoutStart) {
    test::TraceCapture trace;
    std::vector<PesChunk> chunks = {{concat({spsNal(), pps(), slice(0x65, 0)}), 0}};
    const Bytes picture = slice(0x41, 0, true);
    for (uint64_t i = 1; i <= 40; ++i)
        chunks.push_back({picture, i * 3000});
    chunks.push_back({concat({picture, picture, slice(0x41, 60)}), 700000});
    Units expected = {{chunks[0].es, 0, kIdrSps}};
    for (uint64_t i = 32; i <= 40; ++i)
        expected.push_back({picture, static_cast<long long>(i * 3000), 0});
    expected.push_back({picture, 700000, 0});
    expected.push_back({concat({picture, slice(0x41, 60)}), 700000 + 1501, 0});
    EXPECT_EQ(run(chunks), expected);
    EXPECT_TRUE(mExtractor->isWorkaroundActive());
    EXPECT_EQ(trace.count("getNextAccessUnit: apply workaround"), 1u) << trace.all();
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

TEST_F(H264AccessUnitTest, ScanStepsOverLeadingOnesAndEndsUnitsAtTheNextStartCode) {
    const Bytes sei = nal(0x06, {0x05, 0x00}, false);
    Bytes payload = concat({Bytes{0x01, 0x01}, aud(), sei, slice(0x41, 3)});
    mExtractor->setPayloadForTest(payload.data(), payload.size());
    H264MediaExtractor::NALUnitType type;
    unsigned int length = 0;
    ASSERT_EQ(mExtractor->getNextNalUnit(&type, &length), 0u);
    EXPECT_EQ(type, H264MediaExtractor::NAL_AUD);
    EXPECT_EQ(mExtractor->getPosition(), 3u);  // the 4-byte start code's first zero is at 2
    EXPECT_EQ(length, 5u);  // 00 00 01 09 F0: the next unit starts with a 3-byte code
    ASSERT_EQ(mExtractor->getNextNALUWithType(H264MediaExtractor::NAL_SLICE, &length), 0u);
    EXPECT_EQ(mExtractor->getPosition(), payload.size() - slice(0x41, 3).size());
    EXPECT_EQ(length, slice(0x41, 3).size());
    mExtractor->setPayloadForTest(payload.data(), 2);
    EXPECT_EQ(mExtractor->getNextNalUnit(&type, &length), 3u);  // no start code in 01 01
}

TEST_F(H264AccessUnitTest, StatedEsSizeBeyondTheRecordIsBoundedByTheRecord) {
    const Bytes first = concat({aud(), spsNal(), slice(0x65, 0)});
    ASSERT_TRUE(test::writeRawRecord(*mRing, 40 + first.size(), 40, 1 << 20, 1234, first));
    const Bytes second = concat({aud(), slice(0x41, 0)});
    EXPECT_EQ(run({{second, 5678}}), (Units{{first, 1234, kIdrSps}, {second, 5678, 0}}));
}

// --- real encoder output against libavcodec's H.264 parser --------------------------

std::vector<test::ParsedUnit> ffmpegAccessUnits(const Bytes& es) {
    return test::ffmpegParse(es, AV_CODEC_ID_H264);
}

Bytes encode(const std::string& x264Params, const std::string& extra, int frames) {
    const std::string path = std::string(TAVO_BINARY_DIR) + "/h264test_" +
                             std::to_string(std::hash<std::string>()(x264Params + extra)) + ".h264";
    const bool ok = test::succeeds(
        "ffmpeg -v error -y -f lavfi -i testsrc=size=352x288:rate=30000/1001 -frames:v " +
        std::to_string(frames) + " -c:v libx264 -preset ultrafast -x264-params " + x264Params +
        " " + extra + " -f h264 '" + path + "'");
    const Bytes es = ok ? test::fileBytes(path) : Bytes();
    std::filesystem::remove(path);
    return es;
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
    const Bytes es = encode(c.x264Params, c.extra, 45);
    if (es.empty()) {
        GTEST_SKIP() << "ffmpeg with libx264 not available";
    }
    const auto reference = ffmpegAccessUnits(es);
    ASSERT_EQ(reference.size(), 45u);
    std::vector<Bytes> referenceBytes;
    for (const auto& unit : reference)
        referenceBytes.push_back(unit.bytes);
    // One access unit per PES, then several: the same units, each PES's first with its
    // PTS, the others the frame duration after the one before.
    for (size_t group : {1, 3, 7}) {
        SetUp();
        Units expected;
        for (size_t i = 0; i < reference.size(); ++i) {
            const auto pts =
                static_cast<long long>(500 + (i - i % group) * 3003 + (i % group) * c.ticks);
            expected.push_back(
                {reference[i].bytes, pts,
                 static_cast<unsigned char>((reference[i].key ? H264MediaExtractor::kFlagIdr : 0) |
                                            (i == 0 ? H264MediaExtractor::kFlagSps : 0))});
        }
        EXPECT_EQ(
            test::firstDifference(run(test::groupCuts(referenceBytes, group, 500, 3003)), expected),
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
        StreamCase{"ProgressiveFixed", "aud=1:keyint=20:force-cfr=1", "", 1501},
        StreamCase{"ProgressiveBFrames", "aud=1:keyint=12:bframes=2:force-cfr=1", "", 1501}),
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
        mReference = ffmpegAccessUnits(test::joinEs(mChunks));
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
        const auto units = run(mChunks);
        ASSERT_EQ(units.size(), mReference.size());
        for (size_t i = 0; i < units.size(); ++i) {
            ASSERT_EQ(units[i].bytes, mReference[i].bytes) << "unit " << i;
            EXPECT_EQ(units[i].pts, static_cast<long long>(mChunks[i].pts)) << "unit " << i;
            EXPECT_EQ(units[i].flags, (mReference[i].key ? H264MediaExtractor::kFlagIdr : 0) |
                                          (vui && i == 0 ? H264MediaExtractor::kFlagSps : 0))
                << "unit " << i;
        }
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

TEST_F(H264TsgenTest, FixedSizePesCutsUnitsAtRecordEnds) {
    if (!generate("-d 1 --size 352x288 --audio none --no-caption-stream --video-pes-bytes 1500")) {
        GTEST_SKIP() << "tsgen not available";
    }
    Bytes es;
    std::vector<size_t> recordEnds;
    for (const auto& chunk : mChunks) {
        es.insert(es.end(), chunk.es.begin(), chunk.es.end());
        recordEnds.push_back(es.size());
    }
    std::map<size_t, size_t> unitAt;
    size_t offset = 0;
    for (size_t i = 0; i < mReference.size(); ++i) {
        unitAt[offset] = i;
        offset += mReference[i].bytes.size();
    }
    const auto units = run(mChunks);
    ASSERT_FALSE(units.empty());
    size_t searchFrom = 0;
    for (const auto& unit : units) {
        auto it = std::search(es.begin() + static_cast<long>(searchFrom), es.end(),
                              unit.bytes.begin(), unit.bytes.end());
        ASSERT_NE(it, es.end());
        const size_t at = static_cast<size_t>(it - es.begin());
        // Inside one record, starting at one of FFmpeg's units (or one byte into its
        // 4-byte start code).
        const size_t end = *std::upper_bound(recordEnds.begin(), recordEnds.end(), at);
        EXPECT_LE(at + unit.bytes.size(), end);
        EXPECT_TRUE(unitAt.count(at) != 0 || unitAt.count(at - 1) != 0) << "unit at " << at;
        searchFrom = at + unit.bytes.size();
    }
}

// --- sample broadcasts: golden dumps --------------------------------------------------

struct SampleCase {
    const char* name;
    const char* file;
    uint16_t pid;
    size_t packetSize;
};

class H264GoldenTest : public H264Fixture, public ::testing::WithParamInterface<SampleCase> {};

TEST_P(H264GoldenTest, UnitsMatchTheDumpFfmpegAndTheTsParserPath) {
    const SampleCase& c = GetParam();
    const std::string path = test::sampleStream(c.file);
    if (path.empty()) {
        GTEST_SKIP() << "sample stream absent from " << TAVO_SHARED_STREAMS_DIR;
    }
    const Bytes ts = test::fileBytes(path);
    auto chunks = test::pesFromTs(ts, c.pid, c.packetSize);
    ASSERT_GT(chunks.size(), 1u);
    const auto units = run(chunks);
    EXPECT_EQ(test::compareGolden(std::string(c.name) + ".h264.txt", test::goldenDump(units)), "");

    // Independent check: every unit is one that libavcodec's parser cuts from the same
    // elementary stream (these muxers start each PES with an access unit).
    std::map<Bytes, int> reference;
    for (const auto& unit : ffmpegAccessUnits(test::joinEs(chunks)))
        ++reference[unit.bytes];
    for (size_t i = 0; i < units.size(); ++i) {
        EXPECT_GT(reference[units[i].bytes]--, 0)
            << "unit " << i << " of " << units.size() << ", " << units[i].bytes.size() << " bytes";
    }

    // Through the system's TS parser module, which emits a PES only when the next one
    // starts: the units of all but the last PES.
    chunks.pop_back();
    SetUp();
    const auto expected = run(chunks);
    SetUp();
    EXPECT_EQ(
        test::firstDifference(test::runThroughTsParser(*mExtractor, mRing, ts, c.pid, 1), expected),
        "");
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Samples, H264GoldenTest, ::testing::Values(
    SampleCase{"dvb_1080_x264", "dvb_h264_1080_mpeg1audio_0x03.ts", 0x100, 188},
    SampleCase{"dvb_1080i_picstruct", "dvb_h264_1080i_picstruct_sei_ac3_teletext.ts", 0x78, 188},
    SampleCase{"exoplayer_h264_mpeg_audio", "exoplayer_sample_h264_mpeg_audio.ts", 0x100, 188},
    // The ISDB-Tb captures carry no PES start on their video PID, so nothing to cut.
    SampleCase{"exoplayer_h264_no_aud_name", "exoplayer_sample_h264_no_access_unit_delimiters.ts", 0x100, 188}),
    [](const auto& info) { return std::string(info.param.name); });
// clang-format on

}  // namespace
}  // namespace TavoPlayer
