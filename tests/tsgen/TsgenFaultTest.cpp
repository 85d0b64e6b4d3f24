// Each fault tsgen can inject is present exactly where it was asked for, and
// nowhere else.

#include <gtest/gtest.h>

#include <algorithm>
#include <functional>

#include "TsgenTestUtil.h"

namespace TavoPlayer::test {
namespace {

constexpr int64_t kMuxRate = 2000000;
const std::string kBase = "-d 2 --size 320x240 --seed 3 --mux-rate 2000000 ";

std::vector<size_t> indicesWhere(const TsFile& ts, uint16_t pid,
                                 const std::function<bool(const TsPacket&)>& predicate) {
    std::vector<size_t> out;
    const auto packets = ts.packetsOf(pid);
    for (size_t i = 0; i < packets.size(); ++i) {
        if (predicate(*packets[i])) {
            out.push_back(i);
        }
    }
    return out;
}

// A PMT that declares one audio coding (its stream_type on PID 0x112, ISO/IEC
// 13818-1, 2.4.4.8) over a PES that carries the other, by its sync word.
void expectMislabelled(const TsFile& ts, const char* pmtEntry, int sync, int syncBits) {
    EXPECT_TRUE(contains(ts.packetsOf(0x1000).at(0)->payload, pmtEntry));
    const auto pes = ts.pesOf(0x112);
    ASSERT_FALSE(pes.empty());
    EXPECT_EQ(((pes[0].payload[0] << 8) | pes[0].payload[1]) >> (16 - syncBits), sync);
}

struct FaultCase {
    const char* name;
    const char* args;
    // Checks the faulty file; `clean` is the same stream without the fault.
    std::function<void(const TsFile& faulty, const TsFile& clean, const std::string& file)> check;
};

void PrintTo(const FaultCase& c, std::ostream* os) {
    *os << c.name;
}

class TsgenFaultTest : public ::testing::TestWithParam<FaultCase> {};

TEST_P(TsgenFaultTest, FaultIsWhereItWasAsked) {
    const auto& clean = tsgen(kBase);
    const auto& faulty = tsgen(kBase + GetParam().args);
    ASSERT_TRUE(clean.ok());
    ASSERT_TRUE(faulty.ok());
    GetParam().check(faulty.ts, clean.ts, faulty.file);
}

const FaultCase kFaults[] = {
    {"CcError", "--cc-error 0x111:40 --cc-error 0x112:7",
     [](const TsFile& ts, const TsFile&, const std::string&) {
         EXPECT_EQ(ts.continuityErrors(0x111), (std::vector<size_t>{40}));
         EXPECT_EQ(ts.continuityErrors(0x112), (std::vector<size_t>{7}));
         for (uint16_t pid : {0x0000, 0x1000, 0x130}) {
             EXPECT_FALSE(ts.packetsOf(pid).empty()) << "PID " << pid;
             EXPECT_TRUE(ts.continuityErrors(pid).empty()) << "PID " << pid;
         }
     }},
    {"Drop", "--drop 0x112:10:2",
     [](const TsFile& ts, const TsFile& clean, const std::string&) {
         EXPECT_EQ(ts.packetsOf(0x112).size() + 2, clean.packetsOf(0x112).size());
         EXPECT_EQ(ts.packetsOf(0x111).size(), clean.packetsOf(0x111).size());
         EXPECT_EQ(ts.continuityErrors(0x112), (std::vector<size_t>{10}));
     }},
    {"TransportError", "--tei 0x111:20:3",
     [](const TsFile& ts, const TsFile&, const std::string&) {
         EXPECT_EQ(indicesWhere(ts, 0x111, [](const TsPacket& p) { return p.tei; }),
                   (std::vector<size_t>{20, 21, 22}));
         EXPECT_EQ(
             std::count_if(ts.packets().begin(), ts.packets().end(), [](auto& p) { return p.tei; }),
             3);
     }},
    {"Scrambled", "--scramble 0x111:30:5 --scrambling-value 3",
     [](const TsFile& ts, const TsFile&, const std::string&) {
         EXPECT_EQ(indicesWhere(ts, 0x111, [](const TsPacket& p) { return p.scrambling == 3; }),
                   (std::vector<size_t>{30, 31, 32, 33, 34}));
         EXPECT_EQ(std::count_if(ts.packets().begin(), ts.packets().end(),
                                 [](auto& p) { return p.scrambling != 0; }),
                   5);
     }},
    {"PcrJump", "--pcr-jump 1:500",
     [](const TsFile& ts, const TsFile& clean, const std::string&) {
         const auto anomalies = pcrAnomalies(ts, kMuxRate);
         ASSERT_EQ(anomalies.size(), 1u);
         EXPECT_NEAR(anomalies[0].second, 500 * 27000, 1);
         // Nothing else moves: same packets, same time stamps.
         EXPECT_EQ(ts.packets().size(), clean.packets().size());
         EXPECT_EQ(ts.pesOf(0x111)[10].pts, clean.pesOf(0x111)[10].pts);
         EXPECT_TRUE(pcrAnomalies(clean, kMuxRate).empty());
     }},
    {"Gap", "--gap 1:300",
     [](const TsFile& ts, const TsFile& clean, const std::string&) {
         const auto anomalies = pcrAnomalies(ts, kMuxRate);
         ASSERT_EQ(anomalies.size(), 1u);
         // The missing packets' time: 300 ms rounded to whole slots.
         EXPECT_NEAR(anomalies[0].second, 300 * 27000, ticks27PerPacket(kMuxRate) + 1);
         const double missing = static_cast<double>(clean.packets().size() - ts.packets().size());
         EXPECT_NEAR(missing, 0.3 * kMuxRate / (188 * 8), 1.0);
         // The lost stretch breaks the counters of the streams that were sending.
         EXPECT_FALSE(ts.continuityErrors(0x111).empty());
     }},
    {"NoAud", "--no-aud",
     [](const TsFile& ts, const TsFile& clean, const std::string&) {
         for (const auto& p : ts.pesOf(0x111)) {
             const auto nals = nalTypes(p.payload);
             EXPECT_EQ(std::count(nals.begin(), nals.end(), 9), 0);
         }
         for (const auto& p : clean.pesOf(0x111)) {
             const auto nals = nalTypes(p.payload);
             ASSERT_FALSE(nals.empty());
             EXPECT_EQ(nals[0], 9);
         }
     }},
    {"NoVui", "--no-vui",
     [](const TsFile& ts, const TsFile&, const std::string& file) {
         // libavcodec's own bitstream tracer reads the SPS.
         const auto trace = runCommand("ffmpeg -nostdin -hide_banner -i '" + file +
                                       "' -map 0:v -c copy -bsf:v trace_headers -f null - 2>&1");
         const std::string flag = "vui_parameters_present_flag                                 ";
         EXPECT_NE(trace.out.find(flag + "0 = 0"), std::string::npos);
         EXPECT_EQ(trace.out.find(flag + "1 = 1"), std::string::npos);
         EXPECT_EQ(decodeErrors(file), "");
         EXPECT_EQ(ts.pesOf(0x111).size(), 60u);
     }},
    {"StartPtsWrap", "--start-pts 8589844592",
     [](const TsFile& ts, const TsFile&, const std::string&) {
         constexpr int64_t kWrap = int64_t{1} << 33;
         const int64_t start = kWrap - 90000;
         // Unwrapped, the presentation times are still one frame apart.
         std::vector<int64_t> pts;
         for (const auto& p : ts.pesOf(0x111)) {
             pts.push_back(p.pts < start / 2 ? p.pts + kWrap : p.pts);
         }
         EXPECT_GT(pts.back(), kWrap);  // the last picture is past the wrap
         std::sort(pts.begin(), pts.end());
         for (size_t i = 0; i < pts.size(); ++i) {
             EXPECT_EQ(pts[i], start + static_cast<int64_t>(i) * 3003);
         }
         // The PCR wraps too, once.
         size_t backwards = 0;
         int64_t last = -1;
         for (const auto& p : ts.packets()) {
             backwards += (p.hasPcr && p.pcr27 < last) ? 1 : 0;
             last = p.hasPcr ? p.pcr27 : last;
         }
         EXPECT_EQ(backwards, 1u);
     }},
    {"LatmLabelledAdts", "--latm-as-adts",
     [](const TsFile& ts, const TsFile&, const std::string&) {
         expectMislabelled(ts, "0F E1 12 F0", 0x2B7, 11);  // still LOAS
     }},
    {"AdtsLabelledLatm", "--audio adts --adts-as-latm",
     [](const TsFile& ts, const TsFile&, const std::string&) {
         expectMislabelled(ts, "11 E1 12 F0", 0xFFF, 12);  // ADTS
     }},
};

INSTANTIATE_TEST_SUITE_P(Faults, TsgenFaultTest, ::testing::ValuesIn(kFaults),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace TavoPlayer::test
