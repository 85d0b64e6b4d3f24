#include "support/TsReader.h"

namespace TavoPlayer::test {

TsFile::TsFile(const std::vector<uint8_t>& bytes, size_t packetSize) {
    valid = !bytes.empty() && bytes.size() % packetSize == 0 && packetSize >= 188;
    for (size_t off = 0; valid && off < bytes.size(); off += packetSize) {
        // ISO/IEC 13818-1, 2.4.3.2 and 2.4.3.4: header, adaptation field, PCR.
        const uint8_t* p = bytes.data() + off;
        ParsedPacket t;
        t.position = off / packetSize;
        t.pid = static_cast<uint16_t>(((p[1] & 0x1F) << 8) | p[2]);
        t.scrambling = p[3] >> 6;
        t.adaptationControl = (p[3] >> 4) & 3;
        t.cc = p[3] & 0x0F;
        t.tei = (p[1] & 0x80) != 0;
        t.pusi = (p[1] & 0x40) != 0;
        const uint8_t length = (t.adaptationControl & 2) ? p[4] : 0;
        valid = p[0] == 0x47 && length <= 183;
        if (valid && length > 0) {
            t.discontinuity = (p[5] & 0x80) != 0;
            t.hasPcr = (p[5] & 0x10) != 0;
            const uint64_t base = (uint64_t{p[6]} << 25) | (uint64_t{p[7]} << 17) |
                                  (uint64_t{p[8]} << 9) | (uint64_t{p[9]} << 1) | (p[10] >> 7);
            t.pcr27 = t.hasPcr ? int64_t(base * 300 + (((p[10] & 1U) << 8) | p[11])) : 0;
        }
        if (valid && (t.adaptationControl & 1))
            t.payload.assign(p + ((t.adaptationControl & 2) ? 5 + length : 4), p + 188);
        packets.push_back(std::move(t));
    }
}

std::vector<const ParsedPacket*> TsFile::packetsOf(uint16_t pid) const {
    std::vector<const ParsedPacket*> out;
    for (const auto& p : packets)
        if (p.pid == pid)
            out.push_back(&p);
    return out;
}

namespace {

int64_t readTimestamp(const uint8_t* q) {
    return (int64_t{q[0] & 0x0E} << 29) | (int64_t{q[1]} << 22) | (int64_t{q[2] & 0xFE} << 14) |
           (int64_t{q[3]} << 7) | (q[4] >> 1);
}

// ISO/IEC 13818-1, 2.4.3.6: the PES header, its PTS and the bytes that
// PES_packet_length bounds (0: all that follow).
void finishPes(const std::vector<uint8_t>& b, uint64_t first, std::vector<Pes>& out) {
    if (b.size() < 9 || b[0] != 0 || b[1] != 0 || b[2] != 1 || 9u + b[8] > b.size())
        return;
    const size_t length = (b[4] << 8) | b[5];
    const size_t end = (length != 0 && 6 + length <= b.size()) ? 6 + length : b.size();
    const bool hasPts = (b[7] & 0x80) != 0;
    out.push_back({first, hasPts, hasPts ? readTimestamp(&b[9]) : 0,
                   std::vector<uint8_t>(b.begin() + 9 + b[8], b.begin() + int64_t(end))});
}

}  // namespace

std::vector<Pes> TsFile::pesOf(uint16_t pid) const {
    std::vector<Pes> out;
    std::vector<uint8_t> bytes;  // the PES being gathered; none before the first unit start
    uint64_t first = 0;
    for (const auto* p : packetsOf(pid)) {
        if (p->pusi && !p->payload.empty()) {
            finishPes(bytes, first, out);
            bytes.assign(p->payload.begin(), p->payload.end());
            first = p->position;
        } else if (!bytes.empty()) {
            bytes.insert(bytes.end(), p->payload.begin(), p->payload.end());
        }
    }
    finishPes(bytes, first, out);
    return out;
}

PacketIndices TsFile::where(const std::function<bool(const ParsedPacket&)>& predicate) const {
    PacketIndices out;
    std::map<uint16_t, size_t> count;
    for (const auto& p : packets) {
        const size_t index = count[p.pid]++;
        if (predicate(p))
            out[p.pid].push_back(index);
    }
    return out;
}

PacketIndices TsFile::continuityErrors() const {
    std::map<uint16_t, uint8_t> last;
    return where([&](const ParsedPacket& p) {
        // Packets without payload keep the counter, packets with payload advance
        // it; null packets have none to keep.
        const auto it = last.find(p.pid);
        const bool error = p.pid != 0x1FFF && it != last.end() &&
                           p.cc != ((it->second + (p.adaptationControl & 1)) & 0x0F);
        last[p.pid] = p.cc;
        return error;
    });
}

}  // namespace TavoPlayer::test
