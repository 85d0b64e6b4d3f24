// StreamProbe: finds what tavoplay needs to open the "MTV" URI of a transport
// stream: the programme's PCR, video, audio and caption PIDs (from its PAT and PMT,
// ISO/IEC 13818-1, 2.4.4) and the audio coding, taken from the first audio PES
// payload where the PMT's stream type and the payload disagree.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace tavoplay {

enum class AudioCoding { None, Latm, Adts, MpegAudio };

struct ProbedProgram {
    uint16_t programNumber = 0;
    uint16_t pcrPid = 0x1FFF;
    uint16_t videoPid = 0;
    std::vector<uint16_t> audioPids;  // in PMT order; the first is played
    uint16_t captionPid = 0;
    AudioCoding audioCoding = AudioCoding::None;
    bool audioCodingFromPayload = false;  // the payload overruled the PMT

    // "MTV://tuner/live?pcrPid=...;" with every key the broadcast controller reads.
    std::string uri() const;
};

// The coding a payload's first bytes announce: LOAS AudioSyncStream 0x2B7
// (ISO/IEC 14496-3, 1.7.2), ADTS 0xFFF with layer 0 (14496-3, 1.A.2), or an MPEG
// audio frame header (ISO/IEC 11172-3, 2.4.2.3); None when none matches.
AudioCoding codingFromPayload(const uint8_t* data, size_t size);
// The coding a PMT stream_type names (0x11 LATM, 0x0F ADTS, 0x03/0x04 MPEG audio).
AudioCoding codingFromStreamType(uint8_t streamType);
const char* codingName(AudioCoding coding);

// Reads 188-byte packets (after re-synchronising on 0x47) until the programme and
// the first audio payload are known, or `maxBytes` are read. `program` 0 takes the
// first programme of the PAT. Returns an empty string on success, else the reason.
class StreamProbe {
public:
    explicit StreamProbe(uint16_t program);
    ~StreamProbe();

    // Feeds bytes; true once everything is known.
    bool feed(const uint8_t* data, size_t size);
    // Call after the last feed: the reason when the programme cannot be played.
    std::string finish(ProbedProgram* out);

private:
    struct State;
    State* mState;
};

}  // namespace tavoplay
