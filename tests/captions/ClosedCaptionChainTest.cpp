// The caption chain as the broadcast controller builds it: "CCTS" -> TSParser (kind
// 3) -> "CCPES" -> ClosedCaptionDecoder -> "CCRaw" -> ClosedCaptionRenderer ->
// listener, on streams written by tsgen; and the decoder on real Japanese caption
// streams, which share the data group and data unit framing.
#include <gtest/gtest.h>

#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "decoder/ClosedCaptionDecoder.h"
#include "support/CaptionBuilder.h"
#include "support/CaptionTestDoubles.h"
#include "support/ScopedEnv.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"
#include "tsparser/TSParser.h"

namespace TavoPlayer {
namespace {

using namespace test;

constexpr uint16_t kCaptionPid = 0x130;
constexpr uint64_t kFirstPts = 126000;  // tsgen's first picture PTS

struct Caption {
    double sec;
    std::string argument;  // as given to tsgen
    std::u32string text;   // what the listener must receive
};

// What the viewer is promised: accented Portuguese, the euro sign, the SS3 set,
// APR starting a row, CS wiping what came before, APS placing text on a new row.
const std::vector<Caption> kCaptions = {
    {1.0, "Ação, você, à noite - 50€", U"Ação, você, à noite - 50€\n"},
    {2.0, "\\x1D\\x21 Lá\\nFim", U"\u266A Lá\nFim\n"},
    {3.0, "apagado\\fCS ok", U"CS ok\n"},
    {4.0, "topo\\x1C\\x42\\x41baixo", U"topo\nbaixo\n"},
    {4.5, "\\x1D\\x30\\x1D\\x40\\x1D\\x47 Œœ", U"\u00A4\u2026\u2122 \u0152\u0153\n"},
};

Bytes tsgenCaptionStream(const std::vector<Caption>& captions) {
#ifndef TAVO_TSGEN_PATH
    return {};
#else
    std::string options = "--size 64x64 --audio none --mux-rate 600000";
    for (const auto& c : captions)
        options += " --caption '" + std::to_string(c.sec) + ":" + c.argument + "'";
    return fileBytes(tsgenStream(6, options));
#endif
}

TEST(ClosedCaptionChainTest, TsgenCaptionsReachTheListenerOnTime) {
    const Bytes ts = tsgenCaptionStream(kCaptions);
    ASSERT_FALSE(ts.empty()) << "tsgen did not produce the stream";

    ManualClock manual;
    android::sp<Synchronization> clock = manual.make();
    // The clock starts 200 ms before the first caption; from then on it moves only
    // by the renderer's waits, so each caption must arrive exactly at its PTS.
    const uint64_t firstCaptionPts = kFirstPts + 90000;
    clock->setBasePCR(firstCaptionPts - 200 * 90, Synchronization::RealPCR);

    android::sp<RingBuffer> ccts = makeRing("CCTS", 1 << 18);
    android::sp<RingBuffer> ccpes = makeRing("CCPES", 1 << 16);
    android::sp<RingBuffer> ccraw = makeRing("CCRaw", 1 << 16);
    android::sp<TSParser> parser = new TSParser(3);
    parser->setInput(ccts);
    parser->addOutput(ccpes, nullptr);
    parser->configure(clock);
    android::sp<ClosedCaptionDecoder> decoder = new ClosedCaptionDecoder();
    android::sp<WaitRecordingRenderer> renderer = new WaitRecordingRenderer(clock, manual);
    EXPECT_EQ(decoder->start(), 1u);  // not wired yet
    EXPECT_EQ(renderer->start(), 1u);
    decoder->setInput(ccpes);
    decoder->addOutput(ccraw, nullptr);
    RecordingListener listener(clock);
    renderer->setInput(ccraw);
    renderer->registerListener(&listener);
    renderer->setEnabled(1);
    ASSERT_EQ(renderer->start(), 0u);
    ASSERT_EQ(decoder->start(), 0u);
    ASSERT_EQ(parser->start(), 0u);

    ASSERT_TRUE(writeAll(*ccts, bytesOfPid(ts, kCaptionPid)));
    EXPECT_TRUE(waitUntil([&] { return listener.snapshot().size() >= kCaptions.size(); }));
    parser->stop();
    decoder->stop();
    renderer->stop();

    const auto deliveries = listener.snapshot();
    ASSERT_EQ(deliveries.size(), kCaptions.size());
    for (size_t i = 0; i < kCaptions.size(); ++i) {
        SCOPED_TRACE(kCaptions[i].argument);
        EXPECT_EQ(deliveries[i].text, kCaptions[i].text);
        const auto pts = static_cast<uint64_t>(kFirstPts + kCaptions[i].sec * 90000);
        EXPECT_EQ(deliveries[i].pcr, pts);
    }
    EXPECT_EQ(renderer->waits, (std::vector<int64_t>{200, 1000, 1000, 1000, 500}));
}

TEST(ClosedCaptionChainTest, JapaneseCaptionStreamsDecodeWithoutFault) {
    const std::string dir = std::string(TAVO_SHARED_STREAMS_DIR) + "/arib_caption_es";
    std::vector<std::string> files;
    std::error_code missing;
    for (const auto& entry : std::filesystem::directory_iterator(dir, missing)) {
        if (entry.path().extension() == ".es")
            files.push_back(entry.path());
    }
    if (files.empty())
        GTEST_SKIP() << "no caption streams (*.es) in " << dir;

    for (const std::string& path : files) {
        SCOPED_TRACE(path);
        const std::vector<Bytes> units = splitCaptionEs(fileBytes(path));
        TraceCapture trace;
        android::sp<RingBuffer> output = makeRing("CCRaw", 1 << 16);
        android::sp<ClosedCaptionDecoder> decoder = new ClosedCaptionDecoder();
        decoder->addOutput(output, nullptr);
        std::map<unsigned int, size_t> results;
        // As the worker runs them, but one exact-size record per unit, so that a read
        // past a record is a read past its allocation (seen by the sanitizer build). A
        // unit that never finishes hangs the test.
        for (const Bytes& unit : units) {
            OwnedPesRecord record(unit, 90000);
            ++results[decoder->processPacket(record.get())];
            decoder->clearScreenData();
            for (const CaptionRecord& r : drainCaptions(*output)) {
                // At most three rows of 32 and their line feeds; no empty cell inside.
                EXPECT_LE(r.text.size(), 99u);
                EXPECT_EQ(r.text.find(U'\0'), std::u32string::npos);
            }
        }
        const size_t longUnits = trace.count("bytes dropped");
        EXPECT_LE(longUnits, results[0]);
    }
}

}  // namespace
}  // namespace TavoPlayer
