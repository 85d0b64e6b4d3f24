// tsgen: writes ISDB-Tb-like MPEG-2 transport streams for tests and benchmarks.

#include <cstdio>
#include <memory>

extern "C" {
#include <libavutil/log.h>
}

#include "AudioEncoder.h"
#include "CaptionWriter.h"
#include "FaultInjector.h"
#include "OptionParser.h"
#include "Options.h"
#include "PesResegmenter.h"
#include "PsiWriter.h"
#include "TsMuxer.h"
#include "VideoEncoder.h"

using namespace TavoPlayer::tsgen;

namespace {

struct FileCloser {
    void operator()(std::FILE* f) const {
        if (f != nullptr && f != stdout) {
            std::fclose(f);
        }
    }
};

}  // namespace

int main(int argc, char** argv) {
    Options options;
    OptionParser parser;
    const int parsed = parser.parse(argc, argv, options);
    if (parsed == 2) {
        std::fputs(OptionParser::usage().c_str(), stdout);
        return 0;
    }
    if (parsed != 0) {
        std::fprintf(stderr, "tsgen: %s\nTry 'tsgen --help'.\n", parser.error().c_str());
        return 2;
    }
    av_log_set_level(options.verbose ? AV_LOG_WARNING : AV_LOG_ERROR);

    PsiWriter psi;
    if (psi.build(options) != 0) {
        std::fprintf(stderr, "tsgen: libdvbpsi could not build the PAT/PMT\n");
        return 1;
    }
    VideoEncoder video(options);
    if (video.open() != 0) {
        std::fprintf(stderr, "tsgen: video: %s\n", video.error().c_str());
        return 1;
    }
    std::unique_ptr<AudioEncoder> audio;
    if (options.audioCodec != AudioCodec::kNone) {
        audio = std::make_unique<AudioEncoder>(options);
        if (audio->open() != 0) {
            std::fprintf(stderr, "tsgen: audio: %s\n", audio->error().c_str());
            return 1;
        }
    }
    CaptionWriter captions(options);

    std::unique_ptr<std::FILE, FileCloser> out(
        options.output == "-" ? stdout : std::fopen(options.output.c_str(), "wb"));
    if (!out) {
        std::perror(("tsgen: cannot open " + options.output).c_str());
        return 1;
    }
    static char buffer[1 << 20];
    std::setvbuf(out.get(), buffer, _IOFBF, sizeof buffer);

    FaultInjector faults(options);
    TsMuxer muxer(options, psi, faults);
    // ISO/IEC 13818-1, Table 2-22: stream_id 0xE0 video, 0xC0 audio, 0xBD
    // private_stream_1 for the caption PES (ARIB STD-B24).
    TsMuxer::Source videoSource = [&](PesUnit& u) { return video.next(u); };
    std::unique_ptr<PesResegmenter> videoCutter;
    if (options.videoPesBytes > 0) {
        videoCutter = std::make_unique<PesResegmenter>(videoSource, options.videoPesBytes);
        videoSource = [&](PesUnit& u) { return videoCutter->next(u); };
    }
    muxer.addStream(options.videoPid, 0xE0, videoSource);
    std::unique_ptr<PesResegmenter> audioCutter;
    if (audio) {
        TsMuxer::Source audioSource = [&](PesUnit& u) { return audio->next(u); };
        if (options.audioPesBytes > 0) {
            audioCutter = std::make_unique<PesResegmenter>(audioSource, options.audioPesBytes);
            audioSource = [&](PesUnit& u) { return audioCutter->next(u); };
        }
        muxer.addStream(options.audioPid, 0xC0, audioSource);
    }
    if (options.captionStream) {
        muxer.addStream(options.captionPid, 0xBD, [&](PesUnit& u) { return captions.next(u); });
    }
    if (muxer.run(out.get()) != 0) {
        std::fprintf(stderr, "tsgen: %s", muxer.error().c_str());
        if (!video.error().empty()) {
            std::fprintf(stderr, " (video: %s)", video.error().c_str());
        }
        if (audio && !audio->error().empty()) {
            std::fprintf(stderr, " (audio: %s)", audio->error().c_str());
        }
        std::fputc('\n', stderr);
        return 1;
    }
    if (std::fflush(out.get()) != 0) {
        std::perror("tsgen: cannot write the output");
        return 1;
    }
    const auto& st = muxer.stats();
    if (st.latePes > 0) {
        std::fprintf(stderr,
                     "tsgen: warning: %llu PES packets arrived after their decoding time; "
                     "raise --mux-rate\n",
                     static_cast<unsigned long long>(st.latePes));
    }
    if (options.verbose) {
        std::fprintf(stderr,
                     "tsgen: %llu packets (%llu written, %llu null), %llu PES, %lld frames, "
                     "mux rate %lld bit/s, video %lld bit/s, first PCR base %lld, first PTS %lld\n",
                     static_cast<unsigned long long>(st.packets),
                     static_cast<unsigned long long>(st.packetsWritten),
                     static_cast<unsigned long long>(st.nullPackets),
                     static_cast<unsigned long long>(st.pesPackets),
                     static_cast<long long>(video.frameCount()),
                     static_cast<long long>(options.effectiveMuxRate()),
                     static_cast<long long>(options.effectiveVideoBitrate()),
                     static_cast<long long>(st.firstPcr27 / 300),
                     static_cast<long long>(options.startPts));
    }
    return 0;
}
