// The decoder module's designed behaviour through real rings and the platform codec:
// its states and configure table, the input thread's empty turns, the surface rules,
// and bad input that must be survived.
#include <gtest/gtest.h>

#include <set>

#include "DecoderTestUtil.h"
#include "PesRecordTestUtil.h"
#include "common/data/VideoFrameData.h"
#include "decoder/MediaCodecDecoder.h"
#include "support/TraceCapture.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

class MediaCodecDecoderTest : public ::testing::Test {
protected:
    void SetUp() override {
        mDecoder->setInput(mInput);
        mDecoder->addOutput(mOutput, nullptr);
    }
    void TearDown() override { mDecoder->stop(); }

    // A small H.264 stream's PES payloads written as records into the input ring.
    void feedVideo(const std::string& args) {
        const test::Bytes ts = test::runTsgen("-d 2 --audio none --size 320x240 " + args);
        ASSERT_FALSE(ts.empty());
        for (const test::PesChunk& chunk : test::pesFromTs(ts, 0x111))
            ASSERT_TRUE(test::writePesRecord(*mInput, chunk.es, chunk.pts));
    }

    test::TraceCapture mTrace;
    android::sp<RingBuffer> mInput = test::makeRing("VideoPES", 1u << 22);
    android::sp<RingBuffer> mOutput = test::makeRing("VideoRaw", 1u << 16);
    android::sp<MediaCodecDecoder> mDecoder = new MediaCodecDecoder();
};

TEST_F(MediaCodecDecoderTest, StatesAndConfigureTable) {
    EXPECT_EQ(1u, mDecoder->start());
    EXPECT_EQ(1u, mDecoder->stop());
    EXPECT_EQ(200705u, mDecoder->configure(static_cast<Decoder::codingType_t>(4)));
    EXPECT_EQ(0u, mDecoder->getStateForTest());
    EXPECT_EQ(0u, mDecoder->configure(Decoder::CODING_AAC_ADTS));
    EXPECT_EQ(1u, mDecoder->getStateForTest());
    EXPECT_EQ(1u, mDecoder->configure(Decoder::CODING_H264));
    EXPECT_EQ(1u, mDecoder->getStateForTest());
}

// With nothing to read, each input turn still queues an empty buffer (one per
// extractor wait); the named threads run while started and are gone after stop.
TEST_F(MediaCodecDecoderTest, EmptyInputQueuesEmptyBuffers) {
    ASSERT_EQ(0u, mDecoder->configure(Decoder::CODING_AAC_LATM));
    ASSERT_EQ(0u, mDecoder->start());
    EXPECT_EQ(1u, mDecoder->start());
    EXPECT_TRUE(mTrace.contains("start: Called in wrong state: 2"));
    const auto codec = mDecoder->getCodecForTest();
    EXPECT_TRUE(test::waitUntil([&] { return codec->emptyInputs() >= 3; }));
    EXPECT_EQ(1u, test::threadsNamed("MCInputThread"));
    EXPECT_EQ(1u, test::threadsNamed("MCOutputThread"));
    EXPECT_EQ(1u, test::threadsNamed("MTVMediaCodecLo"));
    EXPECT_EQ(0u, codec->configInputs());
    EXPECT_EQ(0u, mOutput->usedSpace());
    EXPECT_EQ(0u, mDecoder->stop());
    EXPECT_EQ(1u, mDecoder->getStateForTest());
    // Joined libutils threads are detached: their tasks may linger a moment.
    EXPECT_TRUE(test::waitUntil([] { return test::threadsNamed("MCInputThread") == 0; }));
    EXPECT_TRUE(test::waitUntil([] { return test::threadsNamed("MCOutputThread") == 0; }));
    EXPECT_EQ(1u, mDecoder->stop());
    // Restartable, and the input ring was left free for its next reader.
    EXPECT_EQ(0u, mDecoder->start());
}

// A new surface while started: the codec is replaced and restarted and the frames
// written for the old surface are flushed; pictures then go to the new surface. The
// ten unread records also show back-pressure: every output buffer is held, so
// decoding waits instead of dropping pictures.
TEST_F(MediaCodecDecoderTest, NewSurfaceWhileStartedRestartsAndFlushes) {
    ASSERT_EQ(0u, mDecoder->configure(Decoder::CODING_H264));
    android::sp<test::RecordingSurface> first = new test::RecordingSurface();
    android::sp<test::RecordingSurface> second = new test::RecordingSurface();
    android::sp<android::Surface> surface = first;
    mDecoder->setSurface(surface);
    ASSERT_EQ(0u, mDecoder->start());
    feedVideo("");
    const uint32_t full = android::MediaCodec::kVideoOutputBuffers * VideoFrameData::kRecordSize;
    ASSERT_TRUE(test::waitUntil([&] { return mOutput->usedSpace() == full; }));
    const auto oldCodec = mDecoder->getCodecForTest();
    EXPECT_EQ(android::MediaCodec::kVideoOutputBuffers, oldCodec->clientOutputBuffers());

    surface = second;
    EXPECT_EQ(0u, mDecoder->setSurface(surface));
    EXPECT_LT(mOutput->usedSpace(), full);
    EXPECT_NE(oldCodec, mDecoder->getCodecForTest());
    EXPECT_EQ(2u, mDecoder->getStateForTest());

    // Holds the ring's reader lock once it succeeds.
    ASSERT_TRUE(test::waitUntil([&] { return mOutput->waitForData(VideoFrameData::kRecordSize); }));
    auto* frame = reinterpret_cast<VideoFrameData*>(mOutput->readPointer());
    EXPECT_EQ(320u, frame->mCropWidth);
    EXPECT_EQ(240u, frame->mCropHeight);
    frame->mListener->renderFrame(true, *frame);
    mOutput->consume(frame->mSize);
    EXPECT_EQ(1u, second->shown().size());
    EXPECT_EQ(0u, first->shown().size());
}

// Damaged and changing streams: the module logs, carries on, decodes what it can,
// gives every buffer back and stops cleanly.
struct BadInputCase {
    std::string name;
    std::vector<std::string> streams;  // tsgen arguments, concatenated in order
    Decoder::codingType_t type;
    std::set<int> expectedSizes;  // picture widths or sample rates that must appear
};
using test::PrintTo;

class MediaCodecDecoderBadInputTest : public ::testing::TestWithParam<BadInputCase> {};

TEST_P(MediaCodecDecoderBadInputTest, CarriesOn) {
    const BadInputCase& c = GetParam();
    test::Bytes ts;
    for (const std::string& args : c.streams) {
        const test::Bytes part = test::runTsgen(args);
        ASSERT_FALSE(part.empty()) << args;
        ts.insert(ts.end(), part.begin(), part.end());
    }
    const bool video = c.type == Decoder::CODING_H264;
    android::sp<test::RecordingSurface> surface = new test::RecordingSurface();
    const test::DecodedRun run =
        test::runDecoder(ts, video ? 0x111 : 0x112, c.type, video ? surface : nullptr);
    ASSERT_TRUE(run.started);
    EXPECT_EQ(0u, run.stopResult);
    EXPECT_EQ(0u, run.heldOutputBuffers);
    std::set<int> seen;
    if (video) {
        EXPECT_GT(surface->shown().size(), 20u);
        for (const auto& shown : surface->shown())
            seen.insert(shown.width);
    } else {
        EXPECT_GT(run.audio.size(), 20u);
        for (const auto& record : run.audio)
            seen.insert(static_cast<int>(record.sampleRate));
    }
    EXPECT_EQ(c.expectedSizes, seen);
}

INSTANTIATE_TEST_SUITE_P(
    Streams, MediaCodecDecoderBadInputTest,
    ::testing::Values(
        BadInputCase{"CutPes",
                     {"-d 2 --audio none --size 320x240 --video-pes-bytes 700 --drop 0x111:20:3"},
                     Decoder::CODING_H264,
                     {320}},
        BadInputCase{"ResolutionChange",
                     {"-d 1 --audio none --size 320x240",
                      "-d 1 --audio none --size 176x144 --start-pts 400000"},
                     Decoder::CODING_H264,
                     {320, 176}},
        BadInputCase{"Mp2SampleRateChange",
                     {"-d 1 --size 64x64 --audio mp2",
                      "-d 1 --size 64x64 --audio mp2 --audio-rate 32000 --start-pts 400000"},
                     Decoder::CODING_MPEG_AUDIO,
                     {48000, 32000}}),
    [](const auto& info) { return info.param.name; });

}  // namespace
}  // namespace TavoPlayer
