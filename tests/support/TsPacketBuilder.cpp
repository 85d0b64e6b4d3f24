#include "TsPacketBuilder.h"

#include <algorithm>
#include <numeric>
#include <stdexcept>

namespace TavoPlayer::test {
namespace {

// PCR: 33-bit base, 6 reserved bits, 9-bit extension (ISO/IEC 13818-1, 2.4.3.5).
void appendClock(std::vector<uint8_t>* out, uint64_t base, uint16_t extension) {
    out->push_back(static_cast<uint8_t>(base >> 25));
    out->push_back(static_cast<uint8_t>(base >> 17));
    out->push_back(static_cast<uint8_t>(base >> 9));
    out->push_back(static_cast<uint8_t>(base >> 1));
    out->push_back(static_cast<uint8_t>(((base & 1) << 7) | 0x7E | ((extension >> 8) & 1)));
    out->push_back(static_cast<uint8_t>(extension));
}

}  // namespace

TsPacket TsPacketBuilder::build() const {
    TsPacket packet;
    packet.fill(0xFF);

    // Adaptation field body: flags byte and optional parts.
    const bool anyField = mDiscontinuity || mRandomAccess || mPcr;
    std::vector<uint8_t> field;
    if (anyField) {
        // ISO/IEC 13818-1, 2.4.3.4: the flags byte, then the parts in flag order.
        field.push_back(
            static_cast<uint8_t>(mDiscontinuity << 7 | mRandomAccess << 6 | mPcr.has_value() << 4));
        if (mPcr)
            appendClock(&field, mPcr->first, mPcr->second);
    }
    const size_t payloadSize = mPayload ? mPayload->size() : 0;
    const bool hasField = anyField || (mPayload && payloadSize < 184) || !mPayload;
    if (mPayload && payloadSize + (hasField ? 1 + field.size() : 0) > 184) {
        throw std::length_error("TsPacketBuilder: payload does not fit");
    }
    if (hasField) {
        // Stuffing fills the field so the payload ends the packet (2.4.3.5).
        const size_t fieldLength = 183 - payloadSize;
        if (field.empty() && fieldLength > 0)
            field.push_back(0x00);  // flags, all clear
        field.resize(fieldLength, 0xFF);
    }

    uint8_t control = mPayload ? (hasField ? 3 : 1) : 2;
    if (mControl)
        control = *mControl;

    packet[0] = mSync;
    packet[1] = static_cast<uint8_t>((mTransportError ? 0x80 : 0) | (mUnitStart ? 0x40 : 0) |
                                     ((mPid >> 8) & 0x1F));
    packet[2] = static_cast<uint8_t>(mPid);
    packet[3] = static_cast<uint8_t>((mScrambling << 6) | (control << 4) | mContinuity);
    if (mRaw) {
        std::copy_n(mRaw->begin(), std::min<size_t>(mRaw->size(), 184), packet.begin() + 4);
        return packet;
    }
    size_t at = 4;
    if (hasField) {
        packet[at++] = static_cast<uint8_t>(field.size());
        std::copy(field.begin(), field.end(), packet.begin() + at);
        at += field.size();
    }
    if (mPayload)
        std::copy(mPayload->begin(), mPayload->end(), packet.begin() + at);
    return packet;
}

std::vector<TsPacket> packetizePes(uint16_t pid, const std::vector<uint8_t>& pes,
                                   uint8_t* counter) {
    std::vector<TsPacket> packets;
    size_t offset = 0;
    do {
        const size_t take = std::min<size_t>(184, pes.size() - offset);
        TsPacketBuilder builder;
        builder.pid(pid).unitStart(offset == 0).continuity(*counter);
        builder.payload(std::vector<uint8_t>(pes.begin() + offset, pes.begin() + offset + take));
        packets.push_back(builder.build());
        *counter = (*counter + 1) & 0x0F;
        offset += take;
    } while (offset < pes.size());
    return packets;
}

std::vector<uint8_t> ramp(size_t n, uint8_t first) {
    std::vector<uint8_t> v(n);
    std::iota(v.begin(), v.end(), first);  // wraps after 0xFF
    return v;
}

std::vector<uint8_t> concatPackets(const std::vector<TsPacket>& packets) {
    std::vector<uint8_t> bytes;
    for (const auto& p : packets)
        bytes.insert(bytes.end(), p.begin(), p.end());
    return bytes;
}

}  // namespace TavoPlayer::test
