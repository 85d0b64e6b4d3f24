// Each fault tsgen can inject is present exactly where it was asked for, and
// nowhere else.

#include <gtest/gtest.h>

#include <functional>
#include <memory>

#include "TsgenTestUtil.h"

namespace TavoPlayer::test {
namespace {

constexpr int64_t kMuxRate = 2000000;
constexpr int64_t kTicks27PerPacket = 188 * 8 * 27000000LL / kMuxRate;
const std::string kBase = "-d 2 --size 320x240 --seed 3 --mux-rate 2000000 ";

// PCR steps that differ from what the byte distance predicts: (packet position
// of the later PCR, excess in 27 MHz ticks).
std::vector<std::pair<uint64_t, int64_t>> pcrAnomalies(const TsFile& ts) {
    std::vector<std::pair<uint64_t, int64_t>> anomalies;
    const TsPacket* previous = nullptr;
    for (const auto& p : ts.packets()) {
        if (!p.hasPcr) {
            continue;
        }
        if (previous != nullptr) {
            const int64_t expected =
                static_cast<int64_t>(p.position - previous->position) * kTicks27PerPacket;
            const int64_t excess = p.pcr27 - previous->pcr27 - expected;
            if (excess > 1 || excess < -1) {
                anomalies.emplace_back(p.position, excess);
            }
        }
        previous = &p;
    }
    return anomalies;
}

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

struct FaultCase {
    const char* name;
    const char* args;
    // Checks the faulty file; `clean` is the same stream without the fault.
    std::function<void(const TsFile& faulty, const TsFile& clean, const std::string& file)> check;
};

class TsgenFaultTest : public ::testing::TestWithParam<FaultCase> {
protected:
    static void SetUpTestSuite() {
        sDir = std::make_unique<TempDir>();
        const auto run = runTsgen(sDir->path("clean.ts"), kBase);
        ASSERT_EQ(run.exitCode, 0) << run.err;
        sClean = std::make_unique<TsFile>(readFile(sDir->path("clean.ts")));
    }
    static void TearDownTestSuite() {
        sClean.reset();
        sDir.reset();
    }
    static std::unique_ptr<TempDir> sDir;
    static std::unique_ptr<TsFile> sClean;
};

std::unique_ptr<TempDir> TsgenFaultTest::sDir;
std::unique_ptr<TsFile> TsgenFaultTest::sClean;

TEST_P(TsgenFaultTest, FaultIsWhereItWasAsked) {
    const FaultCase& c = GetParam();
    ASSERT_TRUE(sClean->valid());
    const std::string file = sDir->path(std::string(c.name) + ".ts");
    const auto run = runTsgen(file, kBase + c.args);
    ASSERT_EQ(run.exitCode, 0) << run.err;
    TsFile ts(readFile(file));
    ASSERT_TRUE(ts.valid());
    c.check(ts, *sClean, file);
}

const FaultCase kFaults[] = {
    {"CcError", "--cc-error 0x111:40 --cc-error 0x112:7",
     [](const TsFile& ts, const TsFile&, const std::string&) {
         EXPECT_EQ(ts.continuityErrors(0x111), (std::vector<size_t>{40}));
         EXPECT_EQ(ts.continuityErrors(0x112), (std::vector<size_t>{7}));
         EXPECT_TRUE(ts.continuityErrors(0x130).empty());
         EXPECT_TRUE(ts.continuityErrors(0x1000).empty());
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
         size_t total = 0;
         for (const auto& p : ts.packets()) {
             total += p.tei ? 1 : 0;
         }
         EXPECT_EQ(total, 3u);
     }},
    {"Scrambled", "--scramble 0x111:30:5 --scrambling-value 3",
     [](const TsFile& ts, const TsFile&, const std::string&) {
         EXPECT_EQ(indicesWhere(ts, 0x111, [](const TsPacket& p) { return p.scrambling == 3; }),
                   (std::vector<size_t>{30, 31, 32, 33, 34}));
         EXPECT_TRUE(indicesWhere(ts, 0x111, [](const TsPacket& p) {
                         return p.scrambling == 1 || p.scrambling == 2;
                     }).empty());
         EXPECT_TRUE(
             indicesWhere(ts, 0x112, [](const TsPacket& p) { return p.scrambling != 0; }).empty());
     }},
    {"PcrJump", "--pcr-jump 1:500",
     [](const TsFile& ts, const TsFile& clean, const std::string&) {
         const auto anomalies = pcrAnomalies(ts);
         ASSERT_EQ(anomalies.size(), 1u);
         EXPECT_NEAR(anomalies[0].second, 500 * 27000, 1);
         // Nothing else moves: same packets, same time stamps.
         EXPECT_EQ(ts.packets().size(), clean.packets().size());
         EXPECT_EQ(ts.pesOf(0x111)[10].pts, clean.pesOf(0x111)[10].pts);
         EXPECT_TRUE(pcrAnomalies(clean).empty());
     }},
    {"Gap", "--gap 1:300",
     [](const TsFile& ts, const TsFile& clean, const std::string&) {
         const auto anomalies = pcrAnomalies(ts);
         ASSERT_EQ(anomalies.size(), 1u);
         // The missing packets' time: 300 ms rounded to whole slots.
         EXPECT_NEAR(anomalies[0].second, 300 * 27000, kTicks27PerPacket + 1);
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
         EXPECT_NE(
             trace.out.find("vui_parameters_present_flag                                 0 = 0"),
             std::string::npos);
         EXPECT_EQ(
             trace.out.find("vui_parameters_present_flag                                 1 = 1"),
             std::string::npos);
         const auto decode =
             runCommand("ffmpeg -nostdin -v error -i '" + file + "' -map 0:v -f null -");
         EXPECT_EQ(decode.err, "");
         EXPECT_EQ(ts.pesOf(0x111).size(), 60u);
     }},
    {"StartPtsWrap", "--start-pts 8589844592",
     [](const TsFile& ts, const TsFile&, const std::string&) {
         constexpr int64_t kWrap = int64_t{1} << 33;
         const int64_t start = kWrap - 90000;
         // Unwrapped, the presentation times are still one frame apart.
         std::vector<int64_t> pts;
         bool wrapped = false;
         for (const auto& p : ts.pesOf(0x111)) {
             wrapped = wrapped || p.pts < start / 2;
             pts.push_back(p.pts < start / 2 ? p.pts + kWrap : p.pts);
         }
         EXPECT_TRUE(wrapped);
         std::sort(pts.begin(), pts.end());
         for (size_t i = 0; i < pts.size(); ++i) {
             EXPECT_EQ(pts[i], start + static_cast<int64_t>(i) * 3003);
         }
         // The PCR wraps too, once.
         size_t backwards = 0;
         int64_t last = -1;
         for (const auto& p : ts.packets()) {
             if (p.hasPcr) {
                 backwards += (last >= 0 && p.pcr27 < last) ? 1 : 0;
                 last = p.pcr27;
             }
         }
         EXPECT_EQ(backwards, 1u);
     }},
    {"LatmLabelledAdts", "--latm-as-adts",
     [](const TsFile& ts, const TsFile&, const std::string&) {
         Pmt pmt;
         ASSERT_TRUE(ts.pmt(0x1000, pmt));
         EXPECT_EQ(pmt.streams[1].streamType, 0x0F);
         const auto pes = ts.pesOf(0x112);
         ASSERT_FALSE(pes.empty());
         EXPECT_EQ(pes[0].payload[0], 0x56);  // still LOAS
     }},
};

INSTANTIATE_TEST_SUITE_P(Faults, TsgenFaultTest, ::testing::ValuesIn(kFaults),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(TsgenLabelFaultTest, AdtsLabelledLatm) {
    TempDir dir;
    const std::string file = dir.path("out.ts");
    ASSERT_EQ(runTsgen(file, kBase + "--audio adts --adts-as-latm").exitCode, 0);
    TsFile ts(readFile(file));
    Pmt pmt;
    ASSERT_TRUE(ts.pmt(0x1000, pmt));
    EXPECT_EQ(pmt.streams[1].streamType, 0x11);
    const auto pes = ts.pesOf(0x112);
    ASSERT_FALSE(pes.empty());
    EXPECT_EQ(pes[0].payload[0], 0xFF);  // ADTS syncword
    EXPECT_EQ(pes[0].payload[1] & 0xF0, 0xF0);
}

}  // namespace
}  // namespace TavoPlayer::test
