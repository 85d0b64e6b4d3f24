// Variations of one stream against the stream without them: each fault tsgen
// can inject is present exactly where it was asked for and nowhere else; the
// same contents cut into other PES, carried in 204-byte packets, or moved to
// an announced new time base.

#include <gtest/gtest.h>

#include <algorithm>

#include "TsgenTestUtil.h"
#include "support/NamedRow.h"

namespace TavoPlayer::test {
namespace {

using test::PrintTo;

constexpr int64_t kMuxRate = 2000000;
const std::string kBase = "-d 2 --size 320x240 --seed 3 --mux-rate 2000000 ";

// A PMT that declares one audio coding (its stream_type on PID 0x112, ISO/IEC
// 13818-1, 2.4.4.8) over a PES that still carries the other, by its sync word.
std::function<void(const Generated&, const Generated&)> mislabelled(const char* pmtEntry, int sync,
                                                                    int syncBits) {
    return [=](const Generated& v, const Generated&) {
        EXPECT_TRUE(contains(v.ts.packetsOf(0x1000).at(0)->payload, pmtEntry));
        const auto pes = v.ts.pesOf(0x112);
        ASSERT_FALSE(pes.empty());
        EXPECT_EQ(((pes[0].payload[0] << 8) | pes[0].payload[1]) >> (16 - syncBits), sync);
    };
}

// The same elementary stream of `pid` cut into other PES: every PES of the
// clean stream starts a unit; in the cut stream a PES has the PTS of the first
// unit that starts in it, or none.
std::function<void(const Generated&, const Generated&)> sameUnits(uint16_t pid) {
    return [pid](const Generated& variant, const Generated& clean) {
        std::map<size_t, int64_t> unitPts;  // elementary stream offset of each unit -> its PTS
        std::vector<uint8_t> plainEs, cutEs;
        for (const auto& p : clean.ts.pesOf(pid)) {
            unitPts[plainEs.size()] = p.pts;
            plainEs.insert(plainEs.end(), p.payload.begin(), p.payload.end());
        }
        const auto cut = variant.ts.pesOf(pid);
        EXPECT_NE(cut.size(), unitPts.size());
        for (const auto& p : cut) {
            const auto first = unitPts.lower_bound(cutEs.size());
            cutEs.insert(cutEs.end(), p.payload.begin(), p.payload.end());
            const bool starts = first != unitPts.end() && first->first < cutEs.size();
            EXPECT_EQ(p.hasPts, starts);
            EXPECT_TRUE(!starts || p.pts == first->second) << "PES ending at " << cutEs.size();
        }
        EXPECT_EQ(cutEs, plainEs);
        EXPECT_EQ(decodeErrors(variant.file), "");
    };
}

struct VariantCase {
    const char* name;
    const char* codecArgs;  // shared by the variant and the clean stream
    const char* args;
    // Checks the variant; `clean` is the same stream without it.
    std::function<void(const Generated& variant, const Generated& clean)> check;
};

class TsgenVariantTest : public ::testing::TestWithParam<VariantCase> {};

TEST_P(TsgenVariantTest, DiffersFromTheCleanStreamOnlyAsAsked) {
    const auto& clean = tsgen(kBase + GetParam().codecArgs);
    const auto& variant = tsgen(kBase + GetParam().codecArgs + " " + GetParam().args);
    ASSERT_TRUE(clean.ok());
    ASSERT_TRUE(variant.ok());
    GetParam().check(variant, clean);
}

const VariantCase kVariants[] = {
    {"CcError", "", "--cc-error 0x111:40 --cc-error 0x112:7",
     [](const Generated& v, const Generated&) {
         EXPECT_EQ(v.ts.continuityErrors(), (PacketIndices{{0x111, {40}}, {0x112, {7}}}));
     }},
    {"Drop", "", "--drop 0x112:10:2",
     [](const Generated& v, const Generated& c) {
         EXPECT_EQ(v.ts.packetsOf(0x112).size() + 2, c.ts.packetsOf(0x112).size());
         EXPECT_EQ(v.ts.packetsOf(0x111).size(), c.ts.packetsOf(0x111).size());
         EXPECT_EQ(v.ts.continuityErrors(), (PacketIndices{{0x112, {10}}}));
     }},
    {"TransportError", "", "--tei 0x111:20:3",
     [](const Generated& v, const Generated&) {
         EXPECT_EQ(v.ts.where([](auto& p) { return p.tei; }),
                   (PacketIndices{{0x111, {20, 21, 22}}}));
     }},
    {"Scrambled", "", "--scramble 0x111:30:5 --scrambling-value 3",
     [](const Generated& v, const Generated&) {
         const PacketIndices expected{{0x111, {30, 31, 32, 33, 34}}};
         EXPECT_EQ(v.ts.where([](auto& p) { return p.scrambling != 0; }), expected);
         EXPECT_EQ(v.ts.where([](auto& p) { return p.scrambling == 3; }), expected);
     }},
    {"PcrJump", "", "--pcr-jump 1:500",
     [](const Generated& v, const Generated& c) {
         const auto anomalies = pcrAnomalies(v.ts, kMuxRate);
         ASSERT_EQ(anomalies.size(), 1u);
         EXPECT_NEAR(anomalies[0].second, 500 * 27000, 1);
         // Nothing else moves: same packets, same time stamps.
         EXPECT_EQ(v.ts.packets.size(), c.ts.packets.size());
         EXPECT_EQ(v.ts.pesOf(0x111)[10].pts, c.ts.pesOf(0x111)[10].pts);
         EXPECT_TRUE(pcrAnomalies(c.ts, kMuxRate).empty());
     }},
    {"Gap", "", "--gap 1:300",
     [](const Generated& v, const Generated& c) {
         const auto anomalies = pcrAnomalies(v.ts, kMuxRate);
         ASSERT_EQ(anomalies.size(), 1u);
         // The missing packets' time: 300 ms rounded to whole slots of 1504 bits.
         EXPECT_NEAR(anomalies[0].second, 300 * 27000, ticks27PerPacket(kMuxRate) + 1);
         EXPECT_NEAR(double(c.ts.packets.size() - v.ts.packets.size()), 0.3 * kMuxRate / 1504, 1.0);
         // The lost stretch breaks the counters of the streams that were sending.
         EXPECT_EQ(v.ts.continuityErrors().count(0x111), 1u);
     }},
    {"NoAud", "", "--no-aud",
     [](const Generated& v, const Generated& c) {
         // Emulation prevention keeps 00 00 01 out of NAL units: this finds start codes only.
         for (const auto& p : v.ts.pesOf(0x111))
             EXPECT_FALSE(contains(p.payload, "00 00 01 09"));
         for (const auto& p : c.ts.pesOf(0x111))
             EXPECT_EQ(nalTypes(p.payload).at(0), 9);
     }},
    {"NoVui", "", "--no-vui",
     [](const Generated& v, const Generated&) {
         // libavcodec's own bitstream tracer reads the SPS.
         const auto trace = runCommand("ffmpeg -nostdin -hide_banner -i '" + v.file +
                                       "' -map 0:v -c copy -bsf:v trace_headers -f null - 2>&1");
         const std::string flag = "vui_parameters_present_flag                                 ";
         EXPECT_NE(trace.out.find(flag + "0 = 0"), std::string::npos);
         EXPECT_EQ(trace.out.find(flag + "1 = 1"), std::string::npos);
         EXPECT_EQ(decodeErrors(v.file), "");
         EXPECT_EQ(v.ts.pesOf(0x111).size(), 60u);
     }},
    {"StartPtsWrap", "", "--start-pts 8589844592",
     [](const Generated& v, const Generated&) {
         constexpr int64_t kWrap = int64_t{1} << 33;
         const int64_t start = kWrap - 90000;
         // Modulo 2^33 the presentation times are still one frame apart.
         const auto pes = v.ts.pesOf(0x111);
         std::vector<int64_t> offsets;
         for (const auto& p : pes)
             offsets.push_back((p.pts - start) & (kWrap - 1));
         EXPECT_LT(pes.back().pts, start);  // the last picture is past the wrap
         std::sort(offsets.begin(), offsets.end());
         for (size_t i = 0; i < offsets.size(); ++i)
             EXPECT_EQ(offsets[i], static_cast<int64_t>(i) * 3003);
         // The PCR wraps too, once, by 2^33 * 300 ticks.
         const auto anomalies = pcrAnomalies(v.ts, kMuxRate);
         ASSERT_EQ(anomalies.size(), 1u);
         EXPECT_NEAR(anomalies[0].second, -kWrap * 300, 1);
     }},
    {"LatmLabelledAdts", "", "--latm-as-adts", mislabelled("0F E1 12 F0", 0x2B7, 11)},
    {"AdtsLabelledLatm", "--audio adts", "--adts-as-latm", mislabelled("11 E1 12 F0", 0xFFF, 12)},
    {"Packets204", "", "--packet-size 204",
     [](const Generated& v, const Generated& c) {
         std::vector<uint8_t> first188;
         for (size_t at = 0; at < v.bytes.size(); at += 204)
             first188.insert(first188.end(), v.bytes.begin() + at, v.bytes.begin() + at + 188);
         EXPECT_TRUE(first188 == c.bytes);
     }},
    {"TimebaseJump", "", "--timebase-jump 1:5000",
     [](const Generated& v, const Generated& c) {
         ASSERT_EQ(v.ts.packets.size(), c.ts.packets.size());
         // One PCR moves on by 5 s more than the bytes say, and only its packet
         // carries discontinuity_indicator.
         const auto anomalies = pcrAnomalies(v.ts, kMuxRate);
         ASSERT_EQ(anomalies.size(), 1u);
         EXPECT_NEAR(anomalies[0].second, 5000 * 27000, 1);
         const uint64_t mark = anomalies[0].first;
         for (const auto& p : v.ts.packets)
             EXPECT_EQ(p.discontinuity, p.position == mark) << "packet " << p.position;
         // PES that start after the mark are on the new time base; those before are not.
         for (uint16_t pid : {0x111, 0x112}) {
             const auto before = c.ts.pesOf(pid);
             const auto after = v.ts.pesOf(pid);
             ASSERT_EQ(before.size(), after.size());
             EXPECT_GE(after.back().firstPacket, mark);  // some PES come after the mark
             for (size_t i = 0; i < before.size(); ++i) {
                 const bool late = after[i].firstPacket >= mark;
                 EXPECT_EQ(after[i].pts - before[i].pts, late ? 450000 : 0) << pid << " PES " << i;
             }
         }
     }},
    {"CutVideoSmall", "", "--video-pes-bytes 777", sameUnits(0x111)},
    {"CutVideoLarge", "", "--video-pes-bytes 5000", sameUnits(0x111)},
    {"CutLatmOdd", "", "--audio-pes-bytes 101", sameUnits(0x112)},
    {"CutLatmSeveralFrames", "", "--audio-pes-bytes 1000", sameUnits(0x112)},
    {"CutAdtsOdd", "--audio adts", "--audio-pes-bytes 250", sameUnits(0x112)},
    {"CutMp2Odd", "--audio mp2", "--audio-pes-bytes 333", sameUnits(0x112)},
    {"LatmThreeFramesPerPes", "", "--audio-frames-per-pes 3", sameUnits(0x112)},
};

INSTANTIATE_TEST_SUITE_P(Variants, TsgenVariantTest, ::testing::ValuesIn(kVariants),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace TavoPlayer::test
