// Byte builder for PES packets (ISO/IEC 13818-1, 2.4.3.6), for tests that need the
// optional header's fields at exact positions.
#pragma once

#include <cstdint>
#include <optional>
#include <utility>
#include <vector>

namespace TavoPlayer::test {

class PesBuilder {
public:
    explicit PesBuilder(uint8_t streamId = 0xE0) : mStreamId(streamId) {}

    PesBuilder& pts(uint64_t v) { return set(mPts, v); }
    PesBuilder& dts(uint64_t v) { return set(mDts, v); }
    PesBuilder& stuffing(uint8_t v) { return set(mStuffing, v); }
    // Overrides byte 6 (default 0x80: start bits '10', nothing else set).
    PesBuilder& byte6(uint8_t v) { return set(mByte6, v); }
    // Overrides PES_header_data_length (default: the size of the fields written).
    PesBuilder& headerDataLength(uint8_t v) { return set(mHeaderDataLength, v); }
    // Leaves out the optional header, as for padding or private_stream_2.
    PesBuilder& noOptionalHeader() { return set(mOptionalHeader, false); }
    PesBuilder& payload(std::vector<uint8_t> v) { return set(mPayload, std::move(v)); }

    std::vector<uint8_t> build() const;

private:
    template <typename F, typename V>
    PesBuilder& set(F& field, V value) {
        field = std::move(value);
        return *this;
    }
    uint8_t mStreamId;
    std::optional<uint64_t> mPts;
    std::optional<uint64_t> mDts;
    uint8_t mStuffing = 0;
    uint8_t mByte6 = 0x80;
    std::optional<uint8_t> mHeaderDataLength;
    bool mOptionalHeader = true;
    std::vector<uint8_t> mPayload;
};

}  // namespace TavoPlayer::test
