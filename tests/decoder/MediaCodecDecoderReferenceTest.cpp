// The decoder module against FFmpeg: tsgen streams go TS parser -> MediaCodecDecoder
// -> output ring; the pictures shown and the PCM written must be FFmpeg's own decode
// of the same file (framemd5 of nv12 with the stream's PTS; s16 PCM).
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <map>
#include <tuple>

#include "DecoderTestUtil.h"
#include "PesRecordTestUtil.h"

namespace TavoPlayer {
namespace {

struct ReferenceCase {
    std::string name;
    std::string args;
    Decoder::codingType_t type;
    int channels;
    int sampleRate;
};
using test::PrintTo;

class MediaCodecDecoderReferenceTest : public ::testing::TestWithParam<ReferenceCase> {
protected:
    void SetUp() override { ASSERT_FALSE(mDir.path().empty()); }
    test::TempDir mDir{"tavo_mcd_ref"};
};

TEST_P(MediaCodecDecoderReferenceTest, OutputIsFfmpegsDecode) {
#ifndef TAVO_TSGEN_PATH
    GTEST_SKIP() << "tsgen is not part of this build";
#else
    const ReferenceCase& c = GetParam();
    const std::string path = mDir / (c.name + ".ts");
    ASSERT_EQ(
        test::runCommand(std::string(TAVO_TSGEN_PATH) + " -o " + path + " " + c.args).exitCode, 0);
    const test::Bytes ts = test::fileBytes(path);
    const bool video = c.type == Decoder::CODING_H264;
    android::sp<test::RecordingSurface> surface = new test::RecordingSurface();
    const test::DecodedRun run =
        test::runDecoder(ts, video ? 0x111 : 0x112, c.type, video ? surface : nullptr);
    ASSERT_TRUE(run.started);
    EXPECT_EQ(0u, run.rejectedUnits);
    EXPECT_EQ(0u, run.heldOutputBuffers);
    EXPECT_EQ(0u, run.stopResult);

    if (video) {
        const auto reference = test::ffmpegFramemd5(path);
        ASSERT_GT(reference.size(), 20u);
        // Ticks go to the codec as whole microseconds and come back truncated: 93003
        // ticks become 1033366 us and then 93002 ticks, as designed.
        std::map<int64_t, std::string> md5At;
        for (const auto& line : reference)
            md5At[line.pts * 1000 / 90 * 9 / 100] = line.md5;
        const auto shown = surface->shown();
        // The last PES is never emitted by the TS parser and frame threads keep the
        // last pictures: a few at the end are missing, nothing else.
        ASSERT_GE(shown.size() + 4, reference.size());
        ASSERT_EQ(run.video.size(), shown.size());
        ASSERT_EQ(1000000, shown.front().ptsUs);  // PTS 90000 ticks
        for (size_t i = 0; i < shown.size(); ++i) {
            const int64_t pts = shown[i].ptsUs * 9 / 100;
            EXPECT_EQ(md5At[pts], shown[i].md5) << "picture " << i << " pts " << pts;
            EXPECT_EQ(static_cast<uint64_t>(pts), run.video[i].pts) << "record " << i;
            EXPECT_EQ(std::make_pair(1920, 1080), std::make_pair(shown[i].width, shown[i].height));
            // NV12, 1920 x 1080; GOP of 15: the pictures 0 and 15 are IDR pictures.
            const test::VideoRecord& record = run.video[i];
            EXPECT_EQ(std::make_tuple(261, 1920u, 1080u, i % 15 == 0 ? 1 : 0),
                      std::make_tuple(record.colorFormat, record.width, record.height, record.flag))
                << "record " << i;
            if (i > 0) {
                EXPECT_LT(shown[i - 1].ptsUs, shown[i].ptsUs);
            }
        }
        ASSERT_FALSE(run.resolutions.empty());
        EXPECT_EQ(std::make_pair(1920, 1080), run.resolutions.front());
        return;
    }

    // The AAC extractor's first unit is the stream's second frame (the first one goes
    // to finding the configuration). The decoder's state (the overlap, the noise
    // generator of perceptual noise substitution) then differs from a decode of the
    // whole stream, so FFmpeg decodes the same frames: the ES without its first frame.
    const bool aac = c.type != Decoder::CODING_MPEG_AUDIO;
    const size_t skipped = aac ? 1 : 0;
    const auto pes = test::pesFromTs(ts, 0x112);
    ASSERT_GT(pes.size(), skipped);
    std::string referencePath = path;
    if (aac) {
        test::Bytes es = test::joinEs(pes);
        ASSERT_GT(es.size(), 8u);
        // ISO/IEC 14496-3, 1.A.2 (adts_variable_header: frame_length).
        const size_t first = (es[3] & 3u) << 11 | es[4] << 3 | es[5] >> 5;
        es.erase(es.begin(), es.begin() + static_cast<long>(first));
        referencePath = mDir / (c.name + ".es");
        std::ofstream(referencePath, std::ios::binary)
            .write(reinterpret_cast<const char*>(es.data()),
                   static_cast<std::streamsize>(es.size()));
    }
    const test::Bytes reference = test::ffmpegPcm(referencePath, aac ? "aac" : "");
    ASSERT_GT(reference.size(), 10000u);
    ASSERT_GT(run.audio.size(), 10u);
    // The last frame or two never leave the extractors (see above); the rest is equal.
    const size_t frameBytes = run.audio.front().bytes;
    ASSERT_GE(run.pcm.size() + 3 * frameBytes, reference.size());
    ASSERT_LE(run.pcm.size(), reference.size());
    const auto mismatch = std::mismatch(run.pcm.begin(), run.pcm.end(), reference.begin());
    EXPECT_TRUE(mismatch.first == run.pcm.end())
        << "PCM differs from byte " << (mismatch.first - run.pcm.begin());
    EXPECT_EQ(pes[skipped].pts * 1000 / 90 * 9 / 100, run.audio.front().pts);
    for (const test::AudioRecord& record : run.audio) {
        EXPECT_EQ(c.channels, record.channels);
        EXPECT_EQ(static_cast<uint32_t>(c.sampleRate), record.sampleRate);
    }
    EXPECT_EQ(aac ? 1u : 0u, run.configInputs);
#endif
}

INSTANTIATE_TEST_SUITE_P(
    Streams, MediaCodecDecoderReferenceTest,
    ::testing::Values(
        ReferenceCase{"H264Interlaced1080Mbaff", "-d 1 --audio none --start-pts 90000",
                      Decoder::CODING_H264, 0, 0},
        ReferenceCase{"AacAdts48kStereo", "-d 2 --size 64x64 --audio adts",
                      Decoder::CODING_AAC_ADTS, 2, 48000},
        ReferenceCase{"AacAdts32kSurround",
                      "-d 2 --size 64x64 --audio adts --audio-rate 32000 --audio-channels 6",
                      Decoder::CODING_AAC_ADTS, 6, 32000},
        ReferenceCase{"Mp2", "-d 2 --size 64x64 --audio mp2", Decoder::CODING_MPEG_AUDIO, 2, 48000},
        ReferenceCase{"Mp3Mono", "-d 2 --size 64x64 --audio mp3 --audio-channels 1",
                      Decoder::CODING_MPEG_AUDIO, 1, 48000}),
    [](const auto& info) { return info.param.name; });

}  // namespace
}  // namespace TavoPlayer
