// Byte builders for 188-byte transport packets (ISO/IEC 13818-1, 2.4.3.2 and
// 2.4.3.4), for tests that need exact control over every header bit.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <vector>

namespace TavoPlayer::test {

using TsPacket = std::array<uint8_t, 188>;

class TsPacketBuilder {
public:
    TsPacketBuilder& pid(uint16_t pid);
    TsPacketBuilder& unitStart(bool on = true);
    TsPacketBuilder& continuity(uint8_t counter);
    TsPacketBuilder& scrambling(uint8_t control);
    TsPacketBuilder& transportError(bool on = true);
    TsPacketBuilder& priority(bool on = true);
    TsPacketBuilder& syncByte(uint8_t byte);
    // Forces adaptation_field_control (else derived: 1 payload only, 2 field only,
    // 3 both).
    TsPacketBuilder& adaptationControl(uint8_t control);

    // Adaptation-field contents, laid out by the standard.
    TsPacketBuilder& discontinuity(bool on = true);
    TsPacketBuilder& randomAccess(bool on = true);
    TsPacketBuilder& pcr(uint64_t base, uint16_t extension = 0);
    TsPacketBuilder& opcr(uint64_t base, uint16_t extension = 0);
    TsPacketBuilder& spliceCountdown(uint8_t countdown);
    TsPacketBuilder& privateData(std::vector<uint8_t> bytes);
    // The adaptation_field_extension: length byte, flags byte, then `body` as given.
    TsPacketBuilder& extension(uint8_t length, uint8_t flags, std::vector<uint8_t> body);
    // Replaces everything after the header by these bytes (byte 4 onward), for
    // lengths and layouts the standard does not allow.
    TsPacketBuilder& rawAfterHeader(std::vector<uint8_t> bytes);

    // Payload; a short one is padded with adaptation-field stuffing, as a muxer does.
    TsPacketBuilder& payload(std::vector<uint8_t> bytes);

    TsPacket build() const;

private:
    uint16_t mPid = 0x100;
    bool mUnitStart = false;
    uint8_t mContinuity = 0;
    uint8_t mScrambling = 0;
    bool mTransportError = false;
    bool mPriority = false;
    uint8_t mSync = 0x47;
    std::optional<uint8_t> mControl;
    bool mDiscontinuity = false;
    bool mRandomAccess = false;
    std::optional<std::pair<uint64_t, uint16_t>> mPcr;
    std::optional<std::pair<uint64_t, uint16_t>> mOpcr;
    std::optional<uint8_t> mSplice;
    std::optional<std::vector<uint8_t>> mPrivate;
    std::optional<std::vector<uint8_t>> mExtension;
    std::optional<std::vector<uint8_t>> mRaw;
    std::optional<std::vector<uint8_t>> mPayload;
};

// Cuts a whole PES packet into transport packets of one PID: unit start on the
// first, counters from *counter on (left at the next value), stuffing on the last.
std::vector<TsPacket> packetizePes(uint16_t pid, const std::vector<uint8_t>& pes, uint8_t* counter);

// Packets laid end to end, as the receiver writes them into a ring.
std::vector<uint8_t> concatPackets(const std::vector<TsPacket>& packets);

}  // namespace TavoPlayer::test
