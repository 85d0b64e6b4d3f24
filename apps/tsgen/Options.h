#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace TavoPlayer::tsgen {

enum class AudioCodec { kNone, kAacLatm, kAacAdts, kMp2, kMp3 };

// A fault applied to the packets of one PID: packets [index, index + count)
// counted among the packets the multiplexer produced for that PID (0-based).
struct PacketFault {
    uint16_t pid = 0;
    uint64_t index = 0;
    uint64_t count = 1;
};

// A change of the transport's timing that starts at a stream time.
struct TimedFault {
    double startSec = 0;
    int64_t amountMs = 0;
};

struct CaptionEvent {
    double timeSec = 0;
    std::vector<uint8_t> bytes;  // ABNT NBR 15606-1 Latin 8-bit codes, control codes included
};

// Everything the command line can say; defaults describe an ISDB-Tb-like
// full-segment service (1080i at 29.97 Hz, H.264, AAC in LOAS/LATM, captions).
struct Options {
    std::string output;
    double durationSec = 10.0;
    int width = 1920;
    int height = 1080;
    int fpsNum = 30000;
    int fpsDen = 1001;
    bool interlaced = true;
    int64_t videoBitrate = 0;  // 0: chosen from the picture size
    int gop = 15;
    int bframes = 2;
    std::string preset = "ultrafast";
    bool aud = true;
    bool picStruct = true;
    bool stripVui = false;

    AudioCodec audioCodec = AudioCodec::kAacLatm;
    int audioRate = 48000;
    int audioChannels = 2;
    int64_t audioBitrate = 0;  // 0: codec default
    int audioFramesPerPes = 1;
    int latmConfigInterval = 1;  // StreamMuxConfig in every n-th LOAS frame
    double toneHz = 0;           // 0: chosen from the seed
    // Lip-sync marks: a dark, silent programme with a white picture and a tone
    // burst at the same PTS about once a second (see syncMarkPeriodFrames).
    bool syncMarks = false;

    bool captionStream = true;
    std::vector<CaptionEvent> captions;
    double captionManagementIntervalSec = 5.0;

    uint16_t programNumber = 1;
    uint16_t transportStreamId = 1;
    uint16_t pmtPid = 0x1000;
    uint16_t videoPid = 0x111;
    uint16_t audioPid = 0x112;
    uint16_t captionPid = 0x130;
    int pcrPid = -1;           // -1: the video PID carries the PCR
    int audioStreamType = -1;  // -1: the stream type of the audio codec

    int64_t muxRate = 0;  // bits per second; 0: chosen from the contents
    int pcrIntervalMs = 40;
    int psiIntervalMs = 100;
    int64_t startPts = 126000;
    uint32_t seed = 1;
    bool verbose = false;

    std::vector<PacketFault> ccErrors;
    std::vector<PacketFault> drops;
    std::vector<PacketFault> teiPackets;
    std::vector<PacketFault> scrambled;
    int scramblingValue = 2;
    std::vector<TimedFault> pcrJumps;
    std::vector<TimedFault> gaps;
    std::vector<TimedFault> timebaseJumps;
    int packetSize = 188;   // 204: each packet followed by 16 bytes (ISDB-T trailer)
    int videoPesBytes = 0;  // 0: one access unit per PES
    int audioPesBytes = 0;  // 0: audioFramesPerPes frames per PES

    uint16_t effectivePcrPid() const {
        return pcrPid < 0 ? videoPid : static_cast<uint16_t>(pcrPid);
    }
    int effectiveAudioStreamType() const;
    int64_t effectiveVideoBitrate() const;
    int64_t effectiveAudioBitrate() const;
    int64_t effectiveMuxRate() const;
    // Pictures from one sync mark to the next: the frame rate rounded (30 at
    // 29.97 Hz, so a mark every 1.001 s); the first mark is this picture, not 0,
    // so that the audio encoder's priming never cuts a burst.
    int syncMarkPeriodFrames() const;
    // The first audio sample of mark k (k >= 1), counted from the first
    // picture's PTS in samples of audioRate.
    int64_t syncMarkSample(int64_t k) const;
};

}  // namespace TavoPlayer::tsgen
