#include "TsgenTestUtil.h"

#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>

namespace TavoPlayer::test {

CommandResult runCommand(const std::string& command) {
    CommandResult result;
    char errName[] = "/tmp/tsgen_test_err_XXXXXX";
    const int errFd = mkstemp(errName);
    if (errFd < 0) {
        return result;
    }
    close(errFd);
    const std::string full = "(" + command + ") 2>" + errName;
    FILE* pipe = popen(full.c_str(), "r");
    if (pipe != nullptr) {
        std::array<char, 4096> buffer{};
        size_t n = 0;
        while ((n = fread(buffer.data(), 1, buffer.size(), pipe)) > 0) {
            result.out.append(buffer.data(), n);
        }
        const int status = pclose(pipe);
        result.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    std::ifstream err(errName);
    result.err.assign(std::istreambuf_iterator<char>(err), std::istreambuf_iterator<char>());
    unlink(errName);
    return result;
}

TempDir::TempDir() {
    char name[] = "/tmp/tsgen_test_XXXXXX";
    const char* made = mkdtemp(name);
    mPath = made ? made : "/tmp";
}

TempDir::~TempDir() {
    std::error_code ec;
    if (mPath != "/tmp") {
        std::filesystem::remove_all(mPath, ec);
    }
}

CommandResult runTsgen(const std::string& file, const std::string& args) {
    return runCommand(std::string(TAVO_TSGEN_PATH) + " -o '" + file + "' " + args);
}

std::vector<uint8_t> readFile(const std::string& file) {
    std::ifstream in(file, std::ios::binary);
    return std::vector<uint8_t>(std::istreambuf_iterator<char>(in),
                                std::istreambuf_iterator<char>());
}

TsFile::TsFile(const std::vector<uint8_t>& bytes, size_t packetSize) {
    if (bytes.empty() || bytes.size() % packetSize != 0 || packetSize < 188) {
        mValid = false;
        return;
    }
    for (size_t off = 0; off < bytes.size(); off += packetSize) {
        const uint8_t* p = bytes.data() + off;
        if (p[0] != 0x47) {
            mValid = false;
            return;
        }
        TsPacket t;
        t.position = off / packetSize;
        t.tei = (p[1] & 0x80) != 0;
        t.pusi = (p[1] & 0x40) != 0;
        t.pid = static_cast<uint16_t>(((p[1] & 0x1F) << 8) | p[2]);
        t.scrambling = p[3] >> 6;
        t.adaptationControl = (p[3] >> 4) & 3;
        t.cc = p[3] & 0x0F;
        size_t payloadStart = 4;
        if (t.adaptationControl & 2) {
            const uint8_t length = p[4];
            if (length > 183) {
                mValid = false;
                return;
            }
            if (length > 0) {
                t.discontinuity = (p[5] & 0x80) != 0;
                t.randomAccess = (p[5] & 0x40) != 0;
                t.hasPcr = (p[5] & 0x10) != 0;
                if (t.hasPcr) {
                    const uint64_t base = (uint64_t{p[6]} << 25) | (uint64_t{p[7]} << 17) |
                                          (uint64_t{p[8]} << 9) | (uint64_t{p[9]} << 1) |
                                          (p[10] >> 7);
                    const uint32_t ext = ((p[10] & 1U) << 8) | p[11];
                    t.pcr27 = static_cast<int64_t>(base * 300 + ext);
                }
            }
            payloadStart = 5 + length;
        }
        if (t.adaptationControl & 1) {
            t.payload.assign(p + payloadStart, p + 188);
        }
        mPackets.push_back(std::move(t));
    }
}

std::vector<const TsPacket*> TsFile::packetsOf(uint16_t pid) const {
    std::vector<const TsPacket*> out;
    for (const auto& p : mPackets) {
        if (p.pid == pid) {
            out.push_back(&p);
        }
    }
    return out;
}

namespace {

int64_t readTimestamp(const uint8_t* q) {
    return (int64_t{q[0] & 0x0E} << 29) | (int64_t{q[1]} << 22) | (int64_t{q[2] & 0xFE} << 14) |
           (int64_t{q[3]} << 7) | (q[4] >> 1);
}

bool finishPes(const std::vector<uint8_t>& bytes, uint64_t first, Pes& pes) {
    if (bytes.size() < 9 || bytes[0] != 0 || bytes[1] != 0 || bytes[2] != 1) {
        return false;
    }
    pes.firstPacket = first;
    pes.streamId = bytes[3];
    pes.lengthField = static_cast<uint16_t>((bytes[4] << 8) | bytes[5]);
    const uint8_t flags = bytes[7] >> 6;
    const size_t headerEnd = 9 + bytes[8];
    if (headerEnd > bytes.size()) {
        return false;
    }
    pes.hasPts = (flags & 2) != 0;
    pes.hasDts = flags == 3;
    if (pes.hasPts) {
        pes.pts = readTimestamp(&bytes[9]);
    }
    if (pes.hasDts) {
        pes.dts = readTimestamp(&bytes[14]);
    }
    size_t end = bytes.size();
    if (pes.lengthField != 0 && 6u + pes.lengthField <= bytes.size()) {
        end = 6u + pes.lengthField;
    }
    pes.payload.assign(bytes.begin() + static_cast<std::ptrdiff_t>(headerEnd),
                       bytes.begin() + static_cast<std::ptrdiff_t>(end));
    return true;
}

}  // namespace

std::vector<Pes> TsFile::pesOf(uint16_t pid) const {
    std::vector<Pes> out;
    std::vector<uint8_t> bytes;
    uint64_t first = 0;
    bool open = false;
    for (const auto& p : mPackets) {
        if (p.pid != pid || p.payload.empty()) {
            continue;
        }
        if (p.pusi) {
            Pes pes;
            if (open && finishPes(bytes, first, pes)) {
                out.push_back(std::move(pes));
            }
            bytes.clear();
            first = p.position;
            open = true;
        }
        if (open) {
            bytes.insert(bytes.end(), p.payload.begin(), p.payload.end());
        }
    }
    Pes pes;
    if (open && finishPes(bytes, first, pes)) {
        out.push_back(std::move(pes));
    }
    return out;
}

namespace {

bool firstSection(const std::vector<const TsPacket*>& packets, uint8_t tableId,
                  std::vector<uint8_t>& section) {
    for (const auto* p : packets) {
        if (!p->pusi || p->payload.empty()) {
            continue;
        }
        const size_t start = 1 + p->payload[0];
        if (start + 3 > p->payload.size() || p->payload[start] != tableId) {
            continue;
        }
        const size_t length = ((p->payload[start + 1] & 0x0F) << 8) | p->payload[start + 2];
        if (start + 3 + length > p->payload.size()) {
            continue;
        }
        section.assign(p->payload.begin() + static_cast<std::ptrdiff_t>(start),
                       p->payload.begin() + static_cast<std::ptrdiff_t>(start + 3 + length));
        return true;
    }
    return false;
}

}  // namespace

std::map<uint16_t, uint16_t> TsFile::pat() const {
    std::map<uint16_t, uint16_t> programs;
    std::vector<uint8_t> s;
    if (!firstSection(packetsOf(0), 0x00, s) || s.size() < 12) {
        return programs;
    }
    for (size_t i = 8; i + 4 <= s.size() - 4; i += 4) {
        programs[static_cast<uint16_t>((s[i] << 8) | s[i + 1])] =
            static_cast<uint16_t>(((s[i + 2] & 0x1F) << 8) | s[i + 3]);
    }
    return programs;
}

bool TsFile::pmt(uint16_t pmtPid, Pmt& pmt) const {
    std::vector<uint8_t> s;
    if (!firstSection(packetsOf(pmtPid), 0x02, s) || s.size() < 16) {
        return false;
    }
    pmt.programNumber = static_cast<uint16_t>((s[3] << 8) | s[4]);
    pmt.pcrPid = static_cast<uint16_t>(((s[8] & 0x1F) << 8) | s[9]);
    const size_t infoLength = ((s[10] & 0x0F) << 8) | s[11];
    size_t i = 12 + infoLength;
    const size_t end = s.size() - 4;  // CRC_32
    while (i + 5 <= end) {
        PmtStream es;
        es.streamType = s[i];
        es.pid = static_cast<uint16_t>(((s[i + 1] & 0x1F) << 8) | s[i + 2]);
        const size_t esInfo = ((s[i + 3] & 0x0F) << 8) | s[i + 4];
        size_t d = i + 5;
        while (d + 2 <= i + 5 + esInfo && d + 2 + s[d + 1] <= end) {
            es.descriptors.emplace_back(s.begin() + static_cast<std::ptrdiff_t>(d),
                                        s.begin() + static_cast<std::ptrdiff_t>(d + 2 + s[d + 1]));
            d += 2 + s[d + 1];
        }
        pmt.streams.push_back(std::move(es));
        i += 5 + esInfo;
    }
    return true;
}

std::vector<size_t> TsFile::continuityErrors(uint16_t pid) const {
    std::vector<size_t> errors;
    const auto packets = packetsOf(pid);
    for (size_t i = 1; i < packets.size(); ++i) {
        const uint8_t last = packets[i - 1]->cc;
        // Packets without payload keep the counter; packets with payload advance it.
        const uint8_t expected =
            (packets[i]->adaptationControl & 1) ? static_cast<uint8_t>((last + 1) & 0x0F) : last;
        if (packets[i]->cc != expected) {
            errors.push_back(i);
        }
    }
    return errors;
}

std::map<std::string, std::string> ffprobe(const std::string& file, const std::string& extra) {
    const auto r =
        runCommand("ffprobe -v error -show_programs -show_streams -show_format -of flat " + extra +
                   " '" + file + "'");
    std::map<std::string, std::string> values;
    std::istringstream lines(r.out);
    std::string line;
    while (std::getline(lines, line)) {
        const auto eq = line.find('=');
        if (eq == std::string::npos) {
            continue;
        }
        std::string value = line.substr(eq + 1);
        if (value.size() >= 2 && value.front() == '"' && value.back() == '"') {
            value = value.substr(1, value.size() - 2);
        }
        values[line.substr(0, eq)] = value;
    }
    return values;
}

std::vector<int> nalTypes(const std::vector<uint8_t>& es) {
    std::vector<int> types;
    for (size_t i = 0; i + 3 < es.size(); ++i) {
        if (es[i] == 0 && es[i + 1] == 0 && es[i + 2] == 1) {
            types.push_back(es[i + 3] & 0x1F);
            i += 2;
        }
    }
    return types;
}

}  // namespace TavoPlayer::test
