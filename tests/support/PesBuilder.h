// Byte builder for PES packets (ISO/IEC 13818-1, 2.4.3.6), for tests that need the
// optional header's fields at exact positions.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

namespace TavoPlayer::test {

class PesBuilder {
public:
    explicit PesBuilder(uint8_t streamId = 0xE0) : mStreamId(streamId) {}

    PesBuilder& streamId(uint8_t id);
    PesBuilder& pts(uint64_t pts);
    PesBuilder& dts(uint64_t dts);
    // Extra optional fields after PTS/DTS (ESCR, ES rate, ...): flag bits for
    // byte 7 and their bytes, in order.
    PesBuilder& optionalFields(uint8_t flags7, std::vector<uint8_t> bytes);
    PesBuilder& stuffing(uint8_t count);
    // Overrides byte 6 (default 0x80: start bits '10', nothing else set).
    PesBuilder& byte6(uint8_t value);
    // Overrides PES_header_data_length (default: the size of the fields written).
    PesBuilder& headerDataLength(uint8_t length);
    // Overrides PES_packet_length (default: the real length, or 0 above 65535).
    PesBuilder& lengthField(uint16_t length);
    // Leaves out the optional header, as for padding or private_stream_2.
    PesBuilder& noOptionalHeader();
    PesBuilder& payload(std::vector<uint8_t> bytes);

    std::vector<uint8_t> build() const;

    // The five bytes of a 33-bit time stamp with its 4-bit prefix and marker bits.
    static void writeTimeStamp(uint8_t* out, uint8_t prefix, uint64_t time);

private:
    uint8_t mStreamId;
    std::optional<uint64_t> mPts;
    std::optional<uint64_t> mDts;
    uint8_t mExtraFlags = 0;
    std::vector<uint8_t> mExtraFields;
    uint8_t mStuffing = 0;
    uint8_t mByte6 = 0x80;
    std::optional<uint8_t> mHeaderDataLength;
    std::optional<uint16_t> mLengthField;
    bool mOptionalHeader = true;
    std::vector<uint8_t> mPayload;
};

}  // namespace TavoPlayer::test
