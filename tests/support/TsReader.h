// A transport stream reader of the tests' own, written from ISO/IEC 13818-1 and
// independent of the production parsers, for tests that check what those parsers or
// the stream generator produce.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <vector>

namespace TavoPlayer::test {

struct ParsedPacket {
    uint64_t position = 0;  // packet number in the file
    uint16_t pid = 0;
    uint8_t scrambling = 0, adaptationControl = 0, cc = 0;
    bool tei = false, pusi = false, hasPcr = false, discontinuity = false;
    int64_t pcr27 = 0;  // base * 300 + extension
    std::vector<uint8_t> payload;
};

struct Pes {
    uint64_t firstPacket = 0;  // position of the packet that started it
    bool hasPts = false;
    int64_t pts = 0;
    std::vector<uint8_t> payload;  // elementary stream bytes
};

// Per PID, the indices among that PID's packets where something holds.
using PacketIndices = std::map<uint16_t, std::vector<size_t>>;

// Reads 188-byte packets (or 204-byte ones, ignoring their last 16 bytes);
// every packet must start with 0x47.
struct TsFile {
    explicit TsFile(const std::vector<uint8_t>& bytes, size_t packetSize = 188);
    std::vector<const ParsedPacket*> packetsOf(uint16_t pid) const;
    // Whole PES packets of a PID (a PES ends where the next one starts; the
    // last one at the end of the file).
    std::vector<Pes> pesOf(uint16_t pid) const;
    PacketIndices where(const std::function<bool(const ParsedPacket&)>& predicate) const;
    // Where the continuity counter does not follow ISO/IEC 13818-1, 2.4.3.3.
    PacketIndices continuityErrors() const;

    bool valid = true;
    std::vector<ParsedPacket> packets;
};

}  // namespace TavoPlayer::test
