// Runs the tsgen program and reads what it wrote with a packet reader of the
// tests' own, independent of tsgen's multiplexer.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace TavoPlayer::test {

struct CommandResult {
    int exitCode = -1;
    std::string out;  // standard output, when captured
    std::string err;  // standard error
};

// Runs a shell command; standard output goes to `out` unless redirected in the command.
CommandResult runCommand(const std::string& command);

// A fresh temporary folder, removed with the object.
class TempDir {
public:
    TempDir();
    ~TempDir();
    TempDir(const TempDir&) = delete;
    TempDir& operator=(const TempDir&) = delete;
    std::string path(const std::string& name) const { return mPath + "/" + name; }

private:
    std::string mPath;
};

// Runs tsgen with the arguments (already quoted for the shell) writing to `file`.
CommandResult runTsgen(const std::string& file, const std::string& args);
std::vector<uint8_t> readFile(const std::string& file);

struct TsPacket {
    uint64_t position = 0;  // packet number in the file
    uint16_t pid = 0;
    bool tei = false;
    bool pusi = false;
    uint8_t scrambling = 0;
    uint8_t adaptationControl = 0;
    uint8_t cc = 0;
    bool hasPcr = false;
    bool randomAccess = false;
    bool discontinuity = false;
    int64_t pcr27 = 0;  // base * 300 + extension
    std::vector<uint8_t> payload;
};

struct Pes {
    uint64_t firstPacket = 0;  // position of the packet that started it
    uint8_t streamId = 0;
    uint16_t lengthField = 0;
    bool hasPts = false;
    bool hasDts = false;
    int64_t pts = 0;
    int64_t dts = 0;
    std::vector<uint8_t> payload;  // elementary stream bytes
};

struct PmtStream {
    uint8_t streamType = 0;
    uint16_t pid = 0;
    std::vector<std::vector<uint8_t>> descriptors;  // tag, length, body
};

struct Pmt {
    uint16_t programNumber = 0;
    uint16_t pcrPid = 0;
    std::vector<PmtStream> streams;
};

// Reads 188-byte packets (or 204-byte ones, ignoring their last 16 bytes);
// every packet must start with 0x47.
class TsFile {
public:
    explicit TsFile(const std::vector<uint8_t>& bytes, size_t packetSize = 188);
    bool valid() const { return mValid; }
    const std::vector<TsPacket>& packets() const { return mPackets; }
    std::vector<const TsPacket*> packetsOf(uint16_t pid) const;
    // Whole PES packets of a PID (a PES ends where the next one starts; the
    // last one at the end of the file).
    std::vector<Pes> pesOf(uint16_t pid) const;
    // The first PAT's programmes (program_number -> PMT PID) and that PMT.
    std::map<uint16_t, uint16_t> pat() const;
    bool pmt(uint16_t pmtPid, Pmt& pmt) const;
    // Positions (index among the PID's packets) where the continuity counter
    // does not follow ISO/IEC 13818-1, 2.4.3.3.
    std::vector<size_t> continuityErrors(uint16_t pid) const;

private:
    bool mValid = true;
    std::vector<TsPacket> mPackets;
};

// ffprobe's view of a file as "section.key=value" lines (flat format).
std::map<std::string, std::string> ffprobe(const std::string& file, const std::string& extra = "");

// NAL unit types of an Annex B byte stream, in order.
std::vector<int> nalTypes(const std::vector<uint8_t>& es);

}  // namespace TavoPlayer::test
