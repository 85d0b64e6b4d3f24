// Byte builders for 188-byte transport packets (ISO/IEC 13818-1, 2.4.3.2 and
// 2.4.3.4), for tests that need exact control over every header bit.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <utility>
#include <vector>

namespace TavoPlayer::test {

using TsPacket = std::array<uint8_t, 188>;

class TsPacketBuilder {
    using Bytes = std::vector<uint8_t>;
    using Clock = std::pair<uint64_t, uint16_t>;

public:
    TsPacketBuilder& pid(uint16_t v) { return set(mPid, v); }
    TsPacketBuilder& unitStart(bool on = true) { return set(mUnitStart, on); }
    TsPacketBuilder& continuity(uint8_t v) { return set(mContinuity, uint8_t(v & 0x0F)); }
    TsPacketBuilder& scrambling(uint8_t v) { return set(mScrambling, uint8_t(v & 3)); }
    TsPacketBuilder& transportError(bool on = true) { return set(mTransportError, on); }
    TsPacketBuilder& syncByte(uint8_t v) { return set(mSync, v); }
    // Forces adaptation_field_control (else derived: 1 payload only, 2 field only,
    // 3 both).
    TsPacketBuilder& adaptationControl(uint8_t v) { return set(mControl, uint8_t(v & 3)); }

    // Adaptation-field contents, laid out by the standard.
    TsPacketBuilder& discontinuity(bool on = true) { return set(mDiscontinuity, on); }
    TsPacketBuilder& randomAccess(bool on = true) { return set(mRandomAccess, on); }
    TsPacketBuilder& pcr(uint64_t base, uint16_t ext = 0) { return set(mPcr, Clock{base, ext}); }
    // Replaces everything after the header by these bytes (byte 4 onward), for
    // lengths and layouts the standard does not allow.
    TsPacketBuilder& rawAfterHeader(Bytes v) { return set(mRaw, std::move(v)); }

    // Payload; a short one is padded with adaptation-field stuffing, as a muxer does.
    TsPacketBuilder& payload(Bytes v) { return set(mPayload, std::move(v)); }

    TsPacket build() const;

private:
    template <typename F, typename V>
    TsPacketBuilder& set(F& field, V value) {
        field = std::move(value);
        return *this;
    }
    uint16_t mPid = 0x100;
    bool mUnitStart = false;
    uint8_t mContinuity = 0;
    uint8_t mScrambling = 0;
    bool mTransportError = false;
    uint8_t mSync = 0x47;
    std::optional<uint8_t> mControl;
    bool mDiscontinuity = false;
    bool mRandomAccess = false;
    std::optional<Clock> mPcr;
    std::optional<Bytes> mRaw;
    std::optional<Bytes> mPayload;
};

// A packet of `pid` carrying only a PCR (ISO/IEC 13818-1, 2.4.3.4: base in 90 kHz).
inline TsPacket pcrPacket(uint16_t pid, uint64_t base, uint16_t extension = 0,
                          bool discontinuity = false) {
    return TsPacketBuilder().pid(pid).pcr(base, extension).discontinuity(discontinuity).build();
}

// Cuts a whole PES packet into transport packets of one PID: unit start on the
// first, counters from *counter on (left at the next value), stuffing on the last.
std::vector<TsPacket> packetizePes(uint16_t pid, const std::vector<uint8_t>& pes, uint8_t* counter);

// n bytes counting up from `first`: a payload whose every byte is known.
std::vector<uint8_t> ramp(size_t n, uint8_t first = 0);

// Packets laid end to end, as the receiver writes them into a ring.
std::vector<uint8_t> concatPackets(const std::vector<TsPacket>& packets);

}  // namespace TavoPlayer::test
