#include "StreamProbe.h"

#include <cstring>
#include <memory>

#include "platform/dtv/ProgramFinder.h"

namespace tavoplay {

namespace {

constexpr size_t kPacket = 188;

bool isVideo(uint8_t type) {
    return type == 0x1B || type == 0x02 || type == 0x01;
}
bool isAudio(uint8_t type) {
    return type == 0x11 || type == 0x0F || type == 0x03 || type == 0x04;
}

}  // namespace

AudioCoding codingFromStreamType(uint8_t streamType) {
    switch (streamType) {
        case 0x11:
            return AudioCoding::Latm;
        case 0x0F:
            return AudioCoding::Adts;
        case 0x03:
        case 0x04:
            return AudioCoding::MpegAudio;
        default:
            return AudioCoding::None;
    }
}

AudioCoding codingFromPayload(const uint8_t* d, size_t n) {
    if (n < 3)
        return AudioCoding::None;
    if (d[0] == 0x56 && (d[1] & 0xE0) == 0xE0)
        return AudioCoding::Latm;
    if (d[0] == 0xFF && (d[1] & 0xF0) == 0xF0 && (d[1] & 0x06) == 0)
        return AudioCoding::Adts;
    // MPEG audio: 11-bit sync, a version other than reserved, a layer other than
    // reserved, and a bit-rate index other than 15.
    if (d[0] == 0xFF && (d[1] & 0xE0) == 0xE0 && (d[1] & 0x18) != 0x08 && (d[1] & 0x06) != 0 &&
        (d[2] & 0xF0) != 0xF0)
        return AudioCoding::MpegAudio;
    return AudioCoding::None;
}

const char* codingName(AudioCoding coding) {
    switch (coding) {
        case AudioCoding::Latm:
            return "AAC (LATM/LOAS)";
        case AudioCoding::Adts:
            return "AAC (ADTS)";
        case AudioCoding::MpegAudio:
            return "MPEG audio";
        default:
            return "none";
    }
}

std::string ProbedProgram::uri() const {
    // A stream without PCR plays on its PTS: the clock runs on the streams' time
    // stamps when no PCR arrives, so the video PID stands in.
    const uint16_t pcr = pcrPid == 0x1FFF ? videoPid : pcrPid;
    // A chain the programme does not have gets a PID no stream uses: a missing key
    // reads as PID 0, which would feed the PAT to that chain's PES parser.
    constexpr uint16_t kUnused = 0x1FFE;
    return "MTV://tuner/live?pcrPid=" + std::to_string(pcr) +
           ";videoPid=" + std::to_string(videoPid) +
           ";audioPid=" + std::to_string(audioPids.empty() ? kUnused : audioPids.front()) +
           ";IsLATMAudio=" + (audioCoding == AudioCoding::Latm ? "1" : "0") +
           ";isMPEG2Audio=" + (audioCoding == AudioCoding::MpegAudio ? "1" : "0") +
           ";subtitlePid=" + std::to_string(captionPid != 0 ? captionPid : kUnused) + ";";
}

struct StreamProbe::State {
    std::unique_ptr<TavoPlayer::ProgramFinder> finder;
    std::vector<uint8_t> carry;
    AudioCoding payloadCoding = AudioCoding::None;
    bool payloadSeen = false;
    uint16_t audioPid = 0;
    size_t packets = 0;
    // 188, or 204 where each packet carries the ISDB-T 16-byte trailer (as the
    // demux, the probe takes the 188 bytes and skips the trailer).
    size_t stride = 0;
};

StreamProbe::StreamProbe(uint16_t program) : mState(new State) {
    mState->finder = TavoPlayer::ProgramFinder::forProgram(program);
}

StreamProbe::~StreamProbe() {
    delete mState;
}

bool StreamProbe::feed(const uint8_t* data, size_t size) {
    State& s = *mState;
    s.carry.insert(s.carry.end(), data, data + size);
    size_t i = 0;
    while (i + 2 * 204 <= s.carry.size() || (s.stride != 0 && i + s.stride <= s.carry.size())) {
        const uint8_t* p = s.carry.data() + i;
        if (p[0] != 0x47) {  // lost sync: look for the next sync byte
            ++i;
            continue;
        }
        if (s.stride == 0) {
            if (p[kPacket] == 0x47)
                s.stride = kPacket;
            else if (p[204] == 0x47)
                s.stride = 204;
            else {
                ++i;
                continue;
            }
        }
        ++s.packets;
        const uint16_t pid = static_cast<uint16_t>(((p[1] & 0x1F) << 8) | p[2]);
        s.finder->push(p);
        const auto& program = s.finder->program();
        if (program && s.audioPid == 0) {
            for (const auto& st : program->streams)
                if (isAudio(st.streamType)) {
                    s.audioPid = st.pid;
                    break;
                }
        }
        // The first audio PES: its payload follows the PES header (2.4.3.7).
        if (!s.payloadSeen && s.audioPid != 0 && pid == s.audioPid && (p[1] & 0x40) != 0 &&
            (p[3] & 0x10) != 0) {
            size_t offset = 4;
            if ((p[3] & 0x20) != 0)
                offset += 1u + p[4];
            if (offset + 9 <= kPacket && p[offset] == 0 && p[offset + 1] == 0 &&
                p[offset + 2] == 1) {
                const size_t es = offset + 9 + p[offset + 8];
                if (es < kPacket) {
                    s.payloadCoding = codingFromPayload(p + es, kPacket - es);
                    s.payloadSeen = true;
                }
            }
        }
        i += s.stride;
    }
    s.carry.erase(s.carry.begin(), s.carry.begin() + static_cast<std::ptrdiff_t>(i));
    const auto& program = s.finder->program();
    return program && (s.audioPid == 0 || s.payloadSeen);
}

std::string StreamProbe::finish(ProbedProgram* out) {
    const State& s = *mState;
    if (s.packets == 0)
        return "not an MPEG transport stream (no 0x47 sync byte)";
    if (!s.finder->havePat())
        return "no programme table (PAT) in the stream";
    const auto& program = s.finder->program();
    if (!program)
        return "no PMT for the programme";
    ProbedProgram p;
    p.programNumber = program->programNumber;
    p.pcrPid = program->pcrPid;
    for (const auto& st : program->streams) {
        if (isVideo(st.streamType) && p.videoPid == 0)
            p.videoPid = st.pid;
        if (isAudio(st.streamType))
            p.audioPids.push_back(st.pid);
    }
    if (const auto* caption = program->captionStream())
        p.captionPid = caption->pid;
    if (p.videoPid == 0)
        return "the programme has no video";
    if (!p.audioPids.empty()) {
        const AudioCoding declared = codingFromStreamType(program->stream(s.audioPid)->streamType);
        p.audioCoding = declared;
        if (s.payloadCoding != AudioCoding::None && s.payloadCoding != declared) {
            p.audioCoding = s.payloadCoding;
            p.audioCodingFromPayload = true;
        }
    }
    *out = p;
    return "";
}

}  // namespace tavoplay
