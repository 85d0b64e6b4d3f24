// Runs the tsgen program and reads what it wrote with a packet reader of the
// tests' own, independent of tsgen's multiplexer.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <vector>

namespace TavoPlayer::test {

struct CommandResult {
    int exitCode = -1;
    std::string out, err;  // standard output (unless redirected) and standard error
};

CommandResult runCommand(const std::string& command);
// "56 E0 11" -> {0x56, 0xE0, 0x11}; stops at the first word that is not hex.
std::vector<uint8_t> hex(const std::string& text);
bool contains(const std::vector<uint8_t>& bytes, const std::string& hexBytes);
// What libavcodec complains about while decoding every stream of `file`.
std::string decodeErrors(const std::string& file);

struct TsPacket {
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
    std::vector<const TsPacket*> packetsOf(uint16_t pid) const;
    // Whole PES packets of a PID (a PES ends where the next one starts; the
    // last one at the end of the file).
    std::vector<Pes> pesOf(uint16_t pid) const;
    PacketIndices where(const std::function<bool(const TsPacket&)>& predicate) const;
    // Where the continuity counter does not follow ISO/IEC 13818-1, 2.4.3.3.
    PacketIndices continuityErrors() const;

    bool valid = true;
    std::vector<TsPacket> packets;
};

// Time of one packet slot at a constant transport rate, in 27 MHz ticks.
constexpr int64_t ticks27PerPacket(int64_t muxRate) {
    return 188 * 8 * 27000000LL / muxRate;
}
// PCR steps that differ from what the byte distance predicts at `muxRate`:
// (packet position of the later PCR, excess in 27 MHz ticks).
std::vector<std::pair<uint64_t, int64_t>> pcrAnomalies(const TsFile& ts, int64_t muxRate);

// tsgen's output for `args`, made once per test process and shared by the
// tests that ask for the same arguments; read as 204-byte packets where asked.
struct Generated {
    CommandResult run;
    std::string file;
    std::vector<uint8_t> bytes;
    TsFile ts;
    ::testing::AssertionResult ok() const {
        return ::testing::AssertionResult(run.exitCode == 0 && ts.valid)
               << "tsgen exit " << run.exitCode << ", " << bytes.size() << " bytes: " << run.err;
    }
};
const Generated& tsgen(const std::string& args);

// NAL unit types of an Annex B byte stream, in order.
std::vector<int> nalTypes(const std::vector<uint8_t>& es);

}  // namespace TavoPlayer::test
