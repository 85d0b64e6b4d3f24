// ProgramFinder: learns, from the packets of PID 0 and of the PMT PIDs, which
// programme carries a given elementary PID and what its PMT says (PCR PID, stream
// types, descriptors).
//
// A recording is created with only its video and audio PIDs; the PCR and caption
// PIDs, and the stream types a player needs to read the file, come from the
// programme's own tables (ISO/IEC 13818-1, 2.4.4.3 PAT and 2.4.4.8 PMT). The
// sections are decoded by libdvbpsi, which reassembles sections that span packets
// and checks their CRC.
//
// Pure: packets in, a programme out; one thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

namespace TavoPlayer {

struct ProgramStream {
    uint8_t streamType = 0;
    uint16_t pid = 0;
    std::vector<uint8_t> descriptors;  // the ES_info descriptor loop, raw
};

struct ProgramInfo {
    uint16_t transportStreamId = 1;
    uint16_t programNumber = 1;
    uint16_t pmtPid = 0x1000;
    uint16_t pcrPid = 0x1FFF;
    std::vector<uint8_t> descriptors;  // the program_info descriptor loop, raw
    std::vector<ProgramStream> streams;

    const ProgramStream* stream(uint16_t pid) const;
    // The first caption stream: a PES of private data (stream_type 0x06) whose
    // stream_identifier_descriptor carries a component tag 0x30..0x37 (ARIB STD-B10,
    // as ABNT NBR 15608-1 assigns the caption tags), or that has the
    // data_component_descriptor with data_component_id 0x0008 (ARIB STD-B24 captions).
    const ProgramStream* captionStream() const;
};

class ProgramFinder {
public:
    // Looks for the programme whose PMT lists `pid`.
    explicit ProgramFinder(uint16_t pid);
    // Looks for the programme of that program_number instead; 0 takes the first
    // programme whose PMT arrives (a capture may hold the PMT of only some).
    static std::unique_ptr<ProgramFinder> forProgram(uint16_t programNumber);
    ~ProgramFinder();
    ProgramFinder(const ProgramFinder&) = delete;
    ProgramFinder& operator=(const ProgramFinder&) = delete;

    // Feeds one 188-byte packet of PID 0 or of a PMT PID; other PIDs are ignored.
    void push(const uint8_t* packet);
    // The PMT PIDs the PAT named so far (what to filter next).
    const std::vector<uint16_t>& pmtPids() const { return mPmtPids; }
    bool havePat() const { return mHavePat; }
    // Set once the programme has been found.
    const std::optional<ProgramInfo>& program() const { return mProgram; }

    // Called back by the library; public for the C callbacks only.
    struct Decoders;

private:
    uint16_t mPid;
    bool mByProgram = false;
    uint16_t mProgramNumber = 0;
    bool mHavePat = false;
    uint16_t mTransportStreamId = 0;
    std::vector<uint16_t> mPmtPids;
    std::optional<ProgramInfo> mProgram;
    std::unique_ptr<Decoders> mDecoders;
};

}  // namespace TavoPlayer
