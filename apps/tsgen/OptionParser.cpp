#include "OptionParser.h"

#include <getopt.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstdlib>

#include "CaptionWriter.h"

namespace TavoPlayer::tsgen {

namespace {

enum OptionId {
    kOptDuration = 256,
    kOptSize,
    kOptFps,
    kOptProgressive,
    kOptVideoBitrate,
    kOptGop,
    kOptBframes,
    kOptPreset,
    kOptNoAud,
    kOptNoPicStruct,
    kOptNoVui,
    kOptAudio,
    kOptAudioRate,
    kOptAudioChannels,
    kOptAudioBitrate,
    kOptAudioFramesPerPes,
    kOptToneHz,
    kOptSyncMarks,
    kOptCaption,
    kOptNoCaptionStream,
    kOptCaptionMgmtInterval,
    kOptProgram,
    kOptTsid,
    kOptPmtPid,
    kOptVideoPid,
    kOptAudioPid,
    kOptCaptionPid,
    kOptPcrPid,
    kOptAudioStreamType,
    kOptLatmAsAdts,
    kOptAdtsAsLatm,
    kOptMuxRate,
    kOptPcrInterval,
    kOptPsiInterval,
    kOptStartPts,
    kOptSeed,
    kOptCcError,
    kOptDrop,
    kOptTei,
    kOptScramble,
    kOptScramblingValue,
    kOptPcrJump,
    kOptGap,
    kOptTimebaseJump,
    kOptPacketSize,
    kOptVideoPesBytes,
    kOptAudioPesBytes,
    kOptLatmConfigInterval,
};

bool parseInt(const std::string& text, int64_t minValue, int64_t maxValue, int64_t& value) {
    if (text.empty()) {
        return false;
    }
    errno = 0;
    char* end = nullptr;
    const long long v = std::strtoll(text.c_str(), &end, 0);
    if (errno != 0 || end == text.c_str() || *end != '\0' || v < minValue || v > maxValue) {
        return false;
    }
    value = v;
    return true;
}

bool parseDouble(const std::string& text, double minValue, double maxValue, double& value) {
    if (text.empty()) {
        return false;
    }
    errno = 0;
    char* end = nullptr;
    const double v = std::strtod(text.c_str(), &end);
    if (errno != 0 || end == text.c_str() || *end != '\0' || !std::isfinite(v) || v < minValue ||
        v > maxValue) {
        return false;
    }
    value = v;
    return true;
}

std::vector<std::string> split(const std::string& text, char separator) {
    std::vector<std::string> parts;
    std::string::size_type start = 0;
    while (true) {
        const auto pos = text.find(separator, start);
        parts.push_back(text.substr(start, pos - start));
        if (pos == std::string::npos) {
            break;
        }
        start = pos + 1;
    }
    return parts;
}

bool parsePacketFault(const std::string& text, PacketFault& fault) {
    const auto parts = split(text, ':');
    if (parts.size() < 2 || parts.size() > 3) {
        return false;
    }
    int64_t pid = 0;
    int64_t index = 0;
    int64_t count = 1;
    if (!parseInt(parts[0], 0, 0x1FFE, pid) || !parseInt(parts[1], 0, INT64_MAX, index)) {
        return false;
    }
    if (parts.size() == 3 && !parseInt(parts[2], 1, INT64_MAX, count)) {
        return false;
    }
    fault.pid = static_cast<uint16_t>(pid);
    fault.index = static_cast<uint64_t>(index);
    fault.count = static_cast<uint64_t>(count);
    return true;
}

bool parseTimedFault(const std::string& text, int64_t minMs, TimedFault& fault) {
    const auto parts = split(text, ':');
    if (parts.size() != 2) {
        return false;
    }
    return parseDouble(parts[0], 0.0, 1e6, fault.startSec) &&
           parseInt(parts[1], minMs, 3600 * 1000, fault.amountMs);
}

}  // namespace

int OptionParser::fail(const std::string& message) {
    mError = message;
    return 1;
}

std::string OptionParser::usage() {
    return R"(Usage: tsgen -o FILE [options]
Writes an ISDB-Tb-like MPEG-2 transport stream (PAT, PMT, H.264 video, AAC LATM/ADTS
or MPEG audio, ISDB-T caption PES) with synthetic, seed-deterministic content.

Output and content:
  -o, --output FILE          output file; '-' writes to standard output (required)
  -d, --duration SEC         stream duration in seconds (default 10)
      --size WxH             picture size (default 1920x1080; even numbers)
      --fps RATE             29.97, 59.94, 23.976, an integer, or NUM/DEN (default 29.97)
      --progressive          code progressive frames (default: interlaced, top field first)
      --video-bitrate BPS    H.264 bit rate (default: 8000000 scaled by picture area)
      --gop N                frames per GOP, IDR at each start (default 15)
      --bframes N            consecutive B-frames, 0..4 (default 2)
      --preset NAME          x264 preset (default ultrafast)
      --no-aud               no access unit delimiters
      --no-pic-struct        no picture timing SEI (pic_struct)
      --no-vui               rewrite every SPS without VUI parameters (fault)
      --audio CODEC          latm (default), adts, mp2, mp3 or none
      --audio-rate HZ        sampling rate (default 48000)
      --audio-channels N     1 or 2, or up to 6 for AAC (6 = 5.1) (default 2)
      --audio-bitrate BPS    audio bit rate (default 128000 AAC, 192000 MP2, 128000 MP3;
                             96000 MP2 and 64000 MP3 below 32 kHz)
      --audio-frames-per-pes N  audio frames in each PES packet (default 1)
      --latm-config-interval N  StreamMuxConfig in every N-th LOAS frame, the others set
                             useSameStreamMux (default 1: in every frame)
      --tone-hz HZ           test tone frequency (default: from the seed; 1000 with
                             --sync-marks)
      --sync-marks           lip-sync marks: dark pictures and silence, except a white
                             picture and a 40 ms tone burst at the same PTS on every
                             picture that is a multiple of the rounded frame rate (30 at
                             29.97 Hz: every 1.001 s, the first at 1.001 s)
      --caption SEC:TEXT     caption statement shown at SEC (repeatable); TEXT is UTF-8
                             with escapes \xNN (any caption code), \n (APR), \f (CS), \\
      --caption-mgmt-interval SEC  caption management data period (default 5)
      --no-caption-stream    no caption PID at all
      --seed N               content seed; same options and seed give identical bytes (default 1)

Programme:
      --program N            program_number (default 1)
      --tsid N               transport_stream_id (default 1)
      --pmt-pid PID          (default 0x1000)
      --video-pid PID        (default 0x111)
      --audio-pid PID        (default 0x112)
      --caption-pid PID      (default 0x130)
      --pcr-pid PID          PCR PID (default: the video PID); another PID gets PCR-only packets
      --audio-stream-type T  PMT stream_type of the audio (default from the codec:
                             0x11 LATM, 0x0F ADTS, 0x03/0x04 MPEG audio)

Multiplex:
      --mux-rate BPS         constant transport rate, null packets fill (default: from contents)
      --pcr-interval-ms MS   PCR period, 1..100 (default 40)
      --psi-interval-ms MS   PAT/PMT period (default 100)
      --start-pts TICKS      PTS of the first picture, 90 kHz (default 126000); values near
                             8589934592 (2^33) make the time stamps wrap
      --packet-size N        188 (default) or 204: each packet followed by 16 bytes of zeros,
                             in place of the ISDB-T / Reed-Solomon trailer
      --video-pes-bytes N    cut the video into PES of N bytes regardless of access units
                             (default: one access unit per PES); a PES in which no access
                             unit starts has no PTS
      --audio-pes-bytes N    the same for audio (default: --audio-frames-per-pes frames)

Faults (PACKET = PID:INDEX[:COUNT], INDEX counts the PID's packets from 0; SEC here and
in --caption counts from the first picture's PTS):
      --cc-error PACKET      continuity counter jumps by one extra step at each of those
                             packets and stays shifted (repeatable)
      --drop PACKET          leave those packets out (repeatable)
      --tei PACKET           set transport_error_indicator (repeatable)
      --scramble PACKET      set transport_scrambling_control (repeatable)
      --scrambling-value V   the scrambling control written, 1..3 (default 2)
      --pcr-jump SEC:MS      from time SEC on, PCR values are MS milliseconds off (repeatable)
      --gap SEC:MS           write no packets for MS milliseconds from SEC; the PCR runs on
                             (repeatable)
      --timebase-jump SEC:MS from SEC on, PCR, PTS and DTS move by MS milliseconds, announced
                             by discontinuity_indicator on the first PCR after it (repeatable)
      --latm-as-adts         label LATM audio with stream_type 0x0F
      --adts-as-latm         label ADTS audio with stream_type 0x11

  -v, --verbose              print a summary on standard error
  -h, --help                 this text
)";
}

int OptionParser::parse(int argc, char** argv, Options& o) {
    static const option kLong[] = {
        {"output", required_argument, nullptr, 'o'},
        {"duration", required_argument, nullptr, 'd'},
        {"size", required_argument, nullptr, kOptSize},
        {"fps", required_argument, nullptr, kOptFps},
        {"progressive", no_argument, nullptr, kOptProgressive},
        {"video-bitrate", required_argument, nullptr, kOptVideoBitrate},
        {"gop", required_argument, nullptr, kOptGop},
        {"bframes", required_argument, nullptr, kOptBframes},
        {"preset", required_argument, nullptr, kOptPreset},
        {"no-aud", no_argument, nullptr, kOptNoAud},
        {"no-pic-struct", no_argument, nullptr, kOptNoPicStruct},
        {"no-vui", no_argument, nullptr, kOptNoVui},
        {"audio", required_argument, nullptr, kOptAudio},
        {"audio-rate", required_argument, nullptr, kOptAudioRate},
        {"audio-channels", required_argument, nullptr, kOptAudioChannels},
        {"audio-bitrate", required_argument, nullptr, kOptAudioBitrate},
        {"audio-frames-per-pes", required_argument, nullptr, kOptAudioFramesPerPes},
        {"tone-hz", required_argument, nullptr, kOptToneHz},
        {"sync-marks", no_argument, nullptr, kOptSyncMarks},
        {"caption", required_argument, nullptr, kOptCaption},
        {"caption-mgmt-interval", required_argument, nullptr, kOptCaptionMgmtInterval},
        {"no-caption-stream", no_argument, nullptr, kOptNoCaptionStream},
        {"seed", required_argument, nullptr, kOptSeed},
        {"program", required_argument, nullptr, kOptProgram},
        {"tsid", required_argument, nullptr, kOptTsid},
        {"pmt-pid", required_argument, nullptr, kOptPmtPid},
        {"video-pid", required_argument, nullptr, kOptVideoPid},
        {"audio-pid", required_argument, nullptr, kOptAudioPid},
        {"caption-pid", required_argument, nullptr, kOptCaptionPid},
        {"pcr-pid", required_argument, nullptr, kOptPcrPid},
        {"audio-stream-type", required_argument, nullptr, kOptAudioStreamType},
        {"latm-as-adts", no_argument, nullptr, kOptLatmAsAdts},
        {"adts-as-latm", no_argument, nullptr, kOptAdtsAsLatm},
        {"mux-rate", required_argument, nullptr, kOptMuxRate},
        {"pcr-interval-ms", required_argument, nullptr, kOptPcrInterval},
        {"psi-interval-ms", required_argument, nullptr, kOptPsiInterval},
        {"start-pts", required_argument, nullptr, kOptStartPts},
        {"cc-error", required_argument, nullptr, kOptCcError},
        {"drop", required_argument, nullptr, kOptDrop},
        {"tei", required_argument, nullptr, kOptTei},
        {"scramble", required_argument, nullptr, kOptScramble},
        {"scrambling-value", required_argument, nullptr, kOptScramblingValue},
        {"pcr-jump", required_argument, nullptr, kOptPcrJump},
        {"gap", required_argument, nullptr, kOptGap},
        {"timebase-jump", required_argument, nullptr, kOptTimebaseJump},
        {"packet-size", required_argument, nullptr, kOptPacketSize},
        {"video-pes-bytes", required_argument, nullptr, kOptVideoPesBytes},
        {"audio-pes-bytes", required_argument, nullptr, kOptAudioPesBytes},
        {"latm-config-interval", required_argument, nullptr, kOptLatmConfigInterval},
        {"verbose", no_argument, nullptr, 'v'},
        {"help", no_argument, nullptr, 'h'},
        {nullptr, 0, nullptr, 0},
    };

    bool latmAsAdts = false;
    bool adtsAsLatm = false;
    opterr = 0;
    optind = 0;  // full re-initialisation, so that parse can run more than once
    int c = 0;
    int longIndex = -1;
    while ((c = getopt_long(argc, argv, ":o:d:vh", kLong, &longIndex)) != -1) {
        const std::string arg = optarg ? optarg : "";
        // The option as written: its long name when known, else the word that
        // getopt stopped at (an unknown option, or one missing its value).
        std::string name;
        if (longIndex >= 0 && c != '?' && c != ':') {
            name = std::string("--") + kLong[longIndex].name;
        } else if (c != '?' && c != ':') {
            name = std::string("-") + static_cast<char>(c);
        } else if (optind > 0 && optind <= argc) {
            name = argv[optind - 1];
        }
        longIndex = -1;
        int64_t v = 0;
        auto intArg = [&](int64_t lo, int64_t hi, auto& field) {
            if (!parseInt(arg, lo, hi, v)) {
                return false;
            }
            field = static_cast<std::remove_reference_t<decltype(field)>>(v);
            return true;
        };
        auto bad = [&](const char* what) { return fail("bad value '" + arg + "' for " + what); };
        switch (c) {
            case 'o':
                o.output = arg;
                break;
            case 'd':
                if (!parseDouble(arg, 0.001, 86400, o.durationSec)) {
                    return bad("--duration (seconds, above 0)");
                }
                break;
            case kOptSize: {
                const auto parts = split(arg, 'x');
                int64_t w = 0;
                int64_t h = 0;
                if (parts.size() != 2 || !parseInt(parts[0], 16, 4096, w) ||
                    !parseInt(parts[1], 16, 2304, h) || (w % 2) != 0 || (h % 2) != 0) {
                    return bad("--size (WxH, even, 16x16 to 4096x2304)");
                }
                o.width = static_cast<int>(w);
                o.height = static_cast<int>(h);
                break;
            }
            case kOptFps: {
                static const struct {
                    const char* name;
                    int num;
                    int den;
                } kRates[] = {{"29.97", 30000, 1001},
                              {"59.94", 60000, 1001},
                              {"23.976", 24000, 1001},
                              {"23.98", 24000, 1001}};
                bool found = false;
                for (const auto& r : kRates) {
                    if (arg == r.name) {
                        o.fpsNum = r.num;
                        o.fpsDen = r.den;
                        found = true;
                    }
                }
                if (found) {
                    break;
                }
                const auto parts = split(arg, '/');
                int64_t num = 0;
                int64_t den = 1;
                if (parts.empty() || parts.size() > 2 || !parseInt(parts[0], 1, 240000, num) ||
                    (parts.size() == 2 && !parseInt(parts[1], 1, 100000, den)) || num / den > 120 ||
                    num / den < 1) {
                    return bad("--fps (29.97, 59.94, 23.976, N or NUM/DEN, 1..120 Hz)");
                }
                o.fpsNum = static_cast<int>(num);
                o.fpsDen = static_cast<int>(den);
                break;
            }
            case kOptProgressive:
                o.interlaced = false;
                break;
            case kOptVideoBitrate:
                if (!intArg(50000, 100000000, o.videoBitrate)) {
                    return bad("--video-bitrate (50000..100000000)");
                }
                break;
            case kOptGop:
                if (!intArg(1, 1000, o.gop)) {
                    return bad("--gop (1..1000)");
                }
                break;
            case kOptBframes:
                if (!intArg(0, 4, o.bframes)) {
                    return bad("--bframes (0..4)");
                }
                break;
            case kOptPreset:
                o.preset = arg;
                break;
            case kOptNoAud:
                o.aud = false;
                break;
            case kOptNoPicStruct:
                o.picStruct = false;
                break;
            case kOptNoVui:
                o.stripVui = true;
                break;
            case kOptAudio:
                if (arg == "latm") {
                    o.audioCodec = AudioCodec::kAacLatm;
                } else if (arg == "adts") {
                    o.audioCodec = AudioCodec::kAacAdts;
                } else if (arg == "mp2") {
                    o.audioCodec = AudioCodec::kMp2;
                } else if (arg == "mp3") {
                    o.audioCodec = AudioCodec::kMp3;
                } else if (arg == "none") {
                    o.audioCodec = AudioCodec::kNone;
                } else {
                    return bad("--audio (latm, adts, mp2, mp3 or none)");
                }
                break;
            case kOptAudioRate:
                if (!intArg(8000, 96000, o.audioRate)) {
                    return bad("--audio-rate (8000..96000)");
                }
                break;
            case kOptAudioChannels:
                if (!intArg(1, 6, o.audioChannels)) {
                    return bad("--audio-channels (1..6)");
                }
                break;
            case kOptAudioBitrate:
                if (!intArg(8000, 640000, o.audioBitrate)) {
                    return bad("--audio-bitrate (8000..640000)");
                }
                break;
            case kOptAudioFramesPerPes:
                if (!intArg(1, 16, o.audioFramesPerPes)) {
                    return bad("--audio-frames-per-pes (1..16)");
                }
                break;
            case kOptToneHz:
                if (!parseDouble(arg, 20, 20000, o.toneHz)) {
                    return bad("--tone-hz (20..20000)");
                }
                break;
            case kOptSyncMarks:
                o.syncMarks = true;
                break;
            case kOptCaption: {
                const auto colon = arg.find(':');
                CaptionEvent event;
                std::string error;
                if (colon == std::string::npos ||
                    !parseDouble(arg.substr(0, colon), 0, 86400, event.timeSec)) {
                    return bad("--caption (SEC:TEXT)");
                }
                if (!CaptionWriter::encodeText(arg.substr(colon + 1), event.bytes, error)) {
                    return fail("bad --caption: " + error);
                }
                o.captions.push_back(std::move(event));
                break;
            }
            case kOptCaptionMgmtInterval:
                if (!parseDouble(arg, 0.1, 180, o.captionManagementIntervalSec)) {
                    return bad("--caption-mgmt-interval (0.1..180 seconds)");
                }
                break;
            case kOptNoCaptionStream:
                o.captionStream = false;
                break;
            case kOptSeed:
                if (!intArg(0, UINT32_MAX, o.seed)) {
                    return bad("--seed (0..4294967295)");
                }
                break;
            case kOptProgram:
                if (!intArg(1, 0xFFFF, o.programNumber)) {
                    return bad("--program (1..65535)");
                }
                break;
            case kOptTsid:
                if (!intArg(0, 0xFFFF, o.transportStreamId)) {
                    return bad("--tsid (0..65535)");
                }
                break;
            case kOptPmtPid:
            case kOptVideoPid:
            case kOptAudioPid:
            case kOptCaptionPid:
            case kOptPcrPid: {
                // ISO/IEC 13818-1, Table 2-3: 0x0000..0x000F are reserved for tables
                // and 0x1FFF is the null packet PID.
                if (!parseInt(arg, 0x10, 0x1FFE, v)) {
                    return fail("bad value '" + arg + "' for " + name + " (0x0010..0x1FFE)");
                }
                const auto pid = static_cast<uint16_t>(v);
                if (c == kOptPmtPid) {
                    o.pmtPid = pid;
                } else if (c == kOptVideoPid) {
                    o.videoPid = pid;
                } else if (c == kOptAudioPid) {
                    o.audioPid = pid;
                } else if (c == kOptCaptionPid) {
                    o.captionPid = pid;
                } else {
                    o.pcrPid = pid;
                }
                break;
            }
            case kOptAudioStreamType:
                if (!intArg(1, 0xFF, o.audioStreamType)) {
                    return bad("--audio-stream-type (1..0xFF)");
                }
                break;
            case kOptLatmAsAdts:
                latmAsAdts = true;
                break;
            case kOptAdtsAsLatm:
                adtsAsLatm = true;
                break;
            case kOptMuxRate:
                if (!intArg(100000, 200000000, o.muxRate)) {
                    return bad("--mux-rate (100000..200000000)");
                }
                break;
            case kOptPcrInterval:
                if (!intArg(1, 100, o.pcrIntervalMs)) {
                    return bad("--pcr-interval-ms (1..100)");
                }
                break;
            case kOptPsiInterval:
                if (!intArg(10, 10000, o.psiIntervalMs)) {
                    return bad("--psi-interval-ms (10..10000)");
                }
                break;
            case kOptStartPts:
                if (!intArg(0, (int64_t{1} << 33) - 1, o.startPts)) {
                    return bad("--start-pts (0..8589934591)");
                }
                break;
            case kOptCcError:
            case kOptDrop:
            case kOptTei:
            case kOptScramble: {
                PacketFault fault;
                if (!parsePacketFault(arg, fault)) {
                    return fail("bad value '" + arg + "' for " + name + " (PID:INDEX[:COUNT])");
                }
                auto& list = c == kOptCcError ? o.ccErrors
                             : c == kOptDrop  ? o.drops
                             : c == kOptTei   ? o.teiPackets
                                              : o.scrambled;
                list.push_back(fault);
                break;
            }
            case kOptScramblingValue:
                if (!intArg(1, 3, o.scramblingValue)) {
                    return bad("--scrambling-value (1..3)");
                }
                break;
            case kOptPcrJump: {
                TimedFault fault;
                if (!parseTimedFault(arg, -3600 * 1000, fault)) {
                    return bad("--pcr-jump (SEC:MS)");
                }
                o.pcrJumps.push_back(fault);
                break;
            }
            case kOptGap: {
                TimedFault fault;
                if (!parseTimedFault(arg, 1, fault)) {
                    return bad("--gap (SEC:MS, MS at least 1)");
                }
                o.gaps.push_back(fault);
                break;
            }
            case kOptTimebaseJump: {
                TimedFault fault;
                if (!parseTimedFault(arg, -3600 * 1000, fault)) {
                    return bad("--timebase-jump (SEC:MS)");
                }
                o.timebaseJumps.push_back(fault);
                break;
            }
            case kOptPacketSize:
                if (arg != "188" && arg != "204") {
                    return bad("--packet-size (188 or 204)");
                }
                o.packetSize = arg == "188" ? 188 : 204;
                break;
            case kOptVideoPesBytes:
                if (!intArg(1, 1 << 20, o.videoPesBytes)) {
                    return bad("--video-pes-bytes (1..1048576)");
                }
                break;
            case kOptAudioPesBytes:
                if (!intArg(1, 65000, o.audioPesBytes)) {
                    return bad("--audio-pes-bytes (1..65000)");
                }
                break;
            case kOptLatmConfigInterval:
                if (!intArg(1, 1000, o.latmConfigInterval)) {
                    return bad("--latm-config-interval (1..1000)");
                }
                break;
            case 'v':
                o.verbose = true;
                break;
            case 'h':
                return 2;
            case ':':
                return fail("option " + name + " needs a value");
            default:
                return fail("unknown option " + name);
        }
    }
    if (optind < argc) {
        return fail(std::string("unexpected argument '") + argv[optind] + "'");
    }
    if (o.output.empty()) {
        return fail("no output given (-o FILE, or -o - for standard output)");
    }
    if (latmAsAdts) {
        if (o.audioCodec != AudioCodec::kAacLatm) {
            return fail("--latm-as-adts needs --audio latm");
        }
        o.audioStreamType = 0x0F;
    }
    if (adtsAsLatm) {
        if (o.audioCodec != AudioCodec::kAacAdts) {
            return fail("--adts-as-latm needs --audio adts");
        }
        o.audioStreamType = 0x11;
    }
    std::vector<uint16_t> pids = {o.pmtPid, o.videoPid};
    if (o.audioCodec != AudioCodec::kNone) {
        pids.push_back(o.audioPid);
    }
    if (o.captionStream) {
        pids.push_back(o.captionPid);
    }
    std::sort(pids.begin(), pids.end());
    if (std::adjacent_find(pids.begin(), pids.end()) != pids.end()) {
        return fail("the PMT, video, audio and caption PIDs must all differ");
    }
    if (o.pcrPid >= 0 && o.pcrPid != o.videoPid &&
        std::binary_search(pids.begin(), pids.end(), static_cast<uint16_t>(o.pcrPid))) {
        return fail("--pcr-pid must be the video PID or a PID of its own");
    }
    // MPEG-1/2 audio carries at most two channels (ISO/IEC 11172-3 modes).
    if (o.audioChannels > 2 &&
        (o.audioCodec == AudioCodec::kMp2 || o.audioCodec == AudioCodec::kMp3)) {
        return fail("--audio-channels above 2 needs AAC (--audio latm or adts)");
    }
    if (o.syncMarks && o.audioCodec == AudioCodec::kNone) {
        return fail("--sync-marks needs audio (the tone burst is half of each mark)");
    }
    if (!o.captions.empty() && !o.captionStream) {
        return fail("--caption cannot be combined with --no-caption-stream");
    }
    const int64_t minRate = (o.audioCodec == AudioCodec::kNone ? 0 : o.effectiveAudioBitrate()) +
                            o.effectiveVideoBitrate() + 100000;
    if (o.muxRate > 0 && o.muxRate < minRate) {
        return fail("--mux-rate " + std::to_string(o.muxRate) + " is below the contents' " +
                    std::to_string(minRate) + " bit/s");
    }
    return 0;
}

}  // namespace TavoPlayer::tsgen
