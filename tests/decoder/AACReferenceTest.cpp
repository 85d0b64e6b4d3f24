// The AAC extractor against FFmpeg as an independent reference: the real sample
// streams, cut into PES records three ways, and tsgen's ADTS and LATM/LOAS in transport
// streams. The access units must be byte for byte those that FFmpeg's demuxer and
// aac_adtstoasc filter find, the configuration the one FFmpeg reports, and FFmpeg's
// own decoder must decode the units with that configuration.
#include <gtest/gtest.h>

#include <string>
#include <vector>

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavcodec/bsf.h>
#include <libavformat/avformat.h>
#include <libavutil/channel_layout.h>
}

#include "AACTestUtil.h"
#include "PesRecordTestUtil.h"
#include "decoder/AACMediaExtractor.h"

namespace TavoPlayer {
namespace {

using Unit = test::ExtractedUnit;
constexpr auto kAdts = AACMediaExtractor::TRANSPORT_LAYER_ADTS;

struct Demuxed {
    std::vector<Unit> packets;
    std::vector<uint8_t> extradata;
    int sampleRate = 0;
    int channels = 0;
    bool ok = false;
    // With ADTS through aac_adtstoasc: raw access units and the configuration it derives.
    std::vector<std::vector<uint8_t>> raw;
    std::vector<uint8_t> asc;
};

// The audio packets of a file as FFmpeg's demuxer (and parser) splits them; with
// `adtsToAsc`, also passed through FFmpeg's aac_adtstoasc filter.
Demuxed demux(const std::string& path, const char* format = nullptr, bool adtsToAsc = false) {
    Demuxed out;
    AVFormatContext* ctx = nullptr;
    const AVInputFormat* input = format ? av_find_input_format(format) : nullptr;
    if (avformat_open_input(&ctx, path.c_str(), input, nullptr) < 0)
        return out;
    AVBSFContext* bsf = nullptr;
    const int index = avformat_find_stream_info(ctx, nullptr) >= 0
                          ? av_find_best_stream(ctx, AVMEDIA_TYPE_AUDIO, -1, -1, nullptr, 0)
                          : -1;
    if (index >= 0) {
        const AVCodecParameters* par = ctx->streams[index]->codecpar;
        out.extradata.assign(par->extradata, par->extradata + par->extradata_size);
        out.sampleRate = par->sample_rate;
        out.channels = par->ch_layout.nb_channels;
        out.ok =
            !adtsToAsc || (av_bsf_alloc(av_bsf_get_by_name("aac_adtstoasc"), &bsf) >= 0 &&
                           avcodec_parameters_copy(bsf->par_in, par) >= 0 && av_bsf_init(bsf) >= 0);
        AVPacket* pkt = av_packet_alloc();
        while (out.ok && av_read_frame(ctx, pkt) >= 0) {
            if (pkt->stream_index == index) {
                out.packets.push_back(
                    {std::vector<uint8_t>(pkt->data, pkt->data + pkt->size), pkt->pts});
            }
            if (bsf != nullptr && pkt->stream_index == index) {
                out.ok = av_bsf_send_packet(bsf, pkt) >= 0;
                while (av_bsf_receive_packet(bsf, pkt) >= 0) {
                    size_t sideSize = 0;
                    const uint8_t* side =
                        av_packet_get_side_data(pkt, AV_PKT_DATA_NEW_EXTRADATA, &sideSize);
                    if (side != nullptr && out.asc.empty())
                        out.asc.assign(side, side + sideSize);
                    out.raw.emplace_back(pkt->data, pkt->data + pkt->size);
                    av_packet_unref(pkt);
                }
            }
            av_packet_unref(pkt);
        }
        av_packet_free(&pkt);
        if (bsf != nullptr && out.asc.empty()) {
            out.asc.assign(bsf->par_out->extradata,
                           bsf->par_out->extradata + bsf->par_out->extradata_size);
        }
    }
    av_bsf_free(&bsf);
    avformat_close_input(&ctx);
    return out;
}

// FFmpeg's AAC decoder, given the first unit (the configuration) as its own, decodes
// every other unit without error into frames of the rate and channels `ref` reports.
void expectFfmpegDecodes(const std::vector<Unit>& units, const Demuxed& ref) {
    const AVCodec* codec = avcodec_find_decoder(AV_CODEC_ID_AAC);
    AVCodecContext* ctx = avcodec_alloc_context3(codec);
    const std::vector<uint8_t>& asc = units[0].bytes;
    ctx->extradata = static_cast<uint8_t*>(av_mallocz(asc.size() + AV_INPUT_BUFFER_PADDING_SIZE));
    std::copy(asc.begin(), asc.end(), ctx->extradata);
    ctx->extradata_size = static_cast<int>(asc.size());
    ASSERT_GE(avcodec_open2(ctx, codec, nullptr), 0) << "configuration rejected";
    AVPacket* pkt = av_packet_alloc();
    AVFrame* frame = av_frame_alloc();
    size_t frames = 0;
    for (size_t i = 1; i < units.size(); ++i) {
        av_new_packet(pkt, static_cast<int>(units[i].bytes.size()));
        std::copy(units[i].bytes.begin(), units[i].bytes.end(), pkt->data);
        EXPECT_GE(avcodec_send_packet(ctx, pkt), 0) << "unit " << i;
        av_packet_unref(pkt);
        for (; avcodec_receive_frame(ctx, frame) >= 0; ++frames) {
            EXPECT_EQ(ref.sampleRate, frame->sample_rate) << "unit " << i;
            EXPECT_EQ(ref.channels, frame->ch_layout.nb_channels) << "unit " << i;
        }
    }
    EXPECT_EQ(units.size() - 1, frames);
    av_frame_free(&frame);
    av_packet_free(&pkt);
    avcodec_free_context(&ctx);
}

class AACReferenceTest : public ::testing::Test {
protected:
    // Runs the extractor over `records` (PTS given per record).
    std::vector<Unit> extract(const std::vector<test::PesChunk>& records,
                              AACMediaExtractor::transportLayer_t layer) {
        android::sp<RingBuffer> ring = test::makeRing("AudioPES", 1u << 22);
        for (const auto& r : records)
            EXPECT_TRUE(test::writePesRecord(*ring, r.es, r.pts, 0xC0));
        android::sp<AACMediaExtractor> extractor = new AACMediaExtractor(ring, layer);
        return test::drain(*extractor);
    }

    // Units: the configuration first, then every reference unit but the first (whose
    // place the configuration takes) and the last (held until a next header shows).
    void expectUnits(const std::vector<Unit>& units,
                     const std::vector<std::vector<uint8_t>>& reference,
                     const std::vector<uint8_t>& referenceAsc) {
        ASSERT_GE(reference.size(), 3u);
        ASSERT_FALSE(referenceAsc.empty());
        // FFmpeg's configuration carries its GASpecificConfig bits, which are zero for
        // these streams, as the ten written bytes leave them.
        std::vector<Unit> expected = {{referenceAsc, 0, AACMediaExtractor::FLAG_CODEC_CONFIG}};
        expected[0].bytes.resize(10, 0);
        for (size_t i = 1; i + 1 < reference.size(); ++i)
            expected.push_back({reference[i], 0, 0});
        std::vector<Unit> got = units;
        for (Unit& unit : got)
            unit.pts = 0;  // compared elsewhere
        EXPECT_EQ(test::firstDifference(got, expected), "");
    }

    test::TempDir mDir{"tavo_aac_ref"};
};

TEST_F(AACReferenceTest, ExoPlayerAdtsSamples) {
    const std::string plain = test::sampleStream("exoplayer_sample.adts");
    const std::string withId3 = test::sampleStream("exoplayer_sample_with_id3.adts");
    if (plain.empty() || withId3.empty()) {
        GTEST_SKIP() << "sample streams not found in " << TAVO_SHARED_STREAMS_DIR;
    }
    const Demuxed packets = demux(plain, "aac", true);
    ASSERT_TRUE(packets.ok);
    // The same bytes cut three ways: one FFmpeg packet per PES, fixed odd cuts, and
    // several packets per PES. Each must give the same units.
    const auto frames = test::bytesOf(packets.packets);
    const auto perPacket = test::groupCuts(frames, 1, 0, 1920);
    const auto units = extract(perPacket, kAdts);
    EXPECT_EQ(test::bytesOf(units),
              test::bytesOf(extract(test::fixedCuts(test::joinEs(perPacket), 181, 0, 181), kAdts)))
        << "odd cuts";
    EXPECT_EQ(test::bytesOf(units),
              test::bytesOf(extract(test::groupCuts(frames, 4, 0, 1920), kAdts)))
        << "grouped";
    expectUnits(units, packets.raw, packets.asc);
    ASSERT_FALSE(units.empty());
    EXPECT_EQ(test::compareGolden("aac_exoplayer_sample_adts.txt", test::goldenDump(units)), "");

    // The same audio with ID3v2 tags: one before the first frame and one between the
    // first and the second. The tags are skipped as junk; the first frame, followed
    // by a tag instead of a sync word before sync is established, is not trusted, so
    // the configuration takes the second frame's place and audio starts with the
    // third. FFmpeg's demuxer knows ID3 and keeps the first frame.
    const Demuxed taggedRef = demux(withId3, "aac", true);
    ASSERT_TRUE(taggedRef.ok);
    EXPECT_EQ(packets.asc, taggedRef.asc);
    const std::vector<uint8_t> file = test::fileBytes(withId3);
    ASSERT_FALSE(file.empty());
    const auto tagged = extract(test::fixedCuts(file, 500, 0, 500), kAdts);
    ASSERT_EQ(taggedRef.raw.size() - 2, tagged.size());
    EXPECT_EQ(units[0].bytes, tagged[0].bytes);
    for (size_t i = 1; i < tagged.size(); ++i)
        ASSERT_EQ(taggedRef.raw[i + 1], tagged[i].bytes) << i;
}

TEST_F(AACReferenceTest, ExoPlayerLatmInTransportStream) {
    const std::string path = test::sampleStream("exoplayer_sample_latm.ts");
    if (path.empty()) {
        GTEST_SKIP() << "sample stream not found in " << TAVO_SHARED_STREAMS_DIR;
    }
    const Demuxed ref = demux(path);
    ASSERT_TRUE(ref.ok);
    const auto records = test::pesFromTs(test::fileBytes(path), 0x100);
    ASSERT_FALSE(records.empty());
    const auto units = extract(records, AACMediaExtractor::TRANSPORT_LAYER_LOAS);

    // FFmpeg's packets: one LOAS frame each. All but the first (the configuration's
    // place) and the last (held) come out, with the PTS FFmpeg gives them.
    ASSERT_GE(ref.packets.size(), 3u);
    ASSERT_EQ(ref.packets.size() - 1, units.size());
    // The stream has one PES for all its frames: later PTS are extrapolated with a
    // whole number of ticks per frame (4179 for 1024 samples at 22.05 kHz) where
    // FFmpeg rounds 4179.59, so they may fall behind by up to a tick per frame.
    for (size_t i = 1; i < units.size(); ++i) {
        EXPECT_NEAR(static_cast<double>(ref.packets[i].pts), static_cast<double>(units[i].pts),
                    static_cast<double>(i))
            << i;
        EXPECT_LT(units[i].bytes.size(), ref.packets[i].bytes.size()) << i;
    }
    // FFmpeg's configuration: HE-AAC signalled hierarchically; the written one has
    // the same leading 26 bits (object type 5, core index, channels, extension index,
    // core object type).
    ASSERT_GE(ref.extradata.size(), 4u);
    EXPECT_EQ(ref.extradata[0], units[0].bytes[0]);
    EXPECT_EQ(ref.extradata[1], units[0].bytes[1]);
    EXPECT_EQ(ref.extradata[2], units[0].bytes[2]);
    EXPECT_EQ(ref.extradata[3] & 0xC0, units[0].bytes[3] & 0xC0);

    // FFmpeg's decoder takes the units with the written configuration and finds what
    // its own demuxer reports for the stream.
    expectFfmpegDecodes(units, ref);
    EXPECT_EQ(test::compareGolden("aac_exoplayer_sample_latm_ts.txt", test::goldenDump(units)), "");
}

// Whole transport streams from tsgen: the audio PID's PES payloads go to the
// extractor as the TS parser would deliver them; FFmpeg demuxes the same file.
struct TsgenCase {
    std::string name;
    std::string args;
    bool adts;
};
using test::PrintTo;

class AACTsgenTest : public AACReferenceTest, public ::testing::WithParamInterface<TsgenCase> {};

TEST_P(AACTsgenTest, UnitsAndTimesMatchFfmpeg) {
#ifndef TAVO_TSGEN_PATH
    GTEST_SKIP() << "tsgen is not part of this build";
#else
    const TsgenCase& c = GetParam();
    const std::string path = mDir / (c.name + ".ts");
    ASSERT_EQ(test::runCommand(std::string(TAVO_TSGEN_PATH) + " -o " + path +
                               " -d 2 --size 160x120 --audio " + (c.adts ? "adts " : "latm ") +
                               c.args + " 2>&1")
                  .exitCode,
              0);
    const Demuxed ref = demux(path, nullptr, c.adts);
    ASSERT_TRUE(ref.ok);
    ASSERT_GT(ref.packets.size(), 50u);
    const auto units = extract(
        test::pesFromTs(test::fileBytes(path), 0x112),
        c.adts ? AACMediaExtractor::TRANSPORT_LAYER_ADTS : AACMediaExtractor::TRANSPORT_LAYER_LOAS);
    ASSERT_EQ(ref.packets.size() - 1, units.size());
    for (size_t i = 1; i < units.size(); ++i)
        EXPECT_EQ(ref.packets[i].pts, units[i].pts) << "unit " << i;
    if (c.adts)
        expectUnits(units, ref.raw, ref.asc);
    expectFfmpegDecodes(units, ref);
#endif
}

INSTANTIATE_TEST_SUITE_P(
    Streams, AACTsgenTest,
    ::testing::Values(TsgenCase{"LatmOneFramePerPes", "", false},
                      TsgenCase{"LatmThreeFramesPerPes", "--audio-frames-per-pes 3", false},
                      TsgenCase{"LatmOddPesCuts", "--audio-pes-bytes 333", false},
                      TsgenCase{"LatmConfigEveryFifthFrame", "--latm-config-interval 5", false},
                      TsgenCase{"AdtsOneFramePerPes", "", true},
                      TsgenCase{"AdtsOddPesCuts", "--audio-pes-bytes 211", true}),
    [](const auto& info) { return info.param.name; });

}  // namespace
}  // namespace TavoPlayer
