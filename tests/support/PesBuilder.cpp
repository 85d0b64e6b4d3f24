#include "PesBuilder.h"

namespace TavoPlayer::test {

PesBuilder& PesBuilder::streamId(uint8_t id) {
    mStreamId = id;
    return *this;
}
PesBuilder& PesBuilder::pts(uint64_t pts) {
    mPts = pts;
    return *this;
}
PesBuilder& PesBuilder::dts(uint64_t dts) {
    mDts = dts;
    return *this;
}
PesBuilder& PesBuilder::optionalFields(uint8_t flags7, std::vector<uint8_t> bytes) {
    mExtraFlags = flags7;
    mExtraFields = std::move(bytes);
    return *this;
}
PesBuilder& PesBuilder::stuffing(uint8_t count) {
    mStuffing = count;
    return *this;
}
PesBuilder& PesBuilder::byte6(uint8_t value) {
    mByte6 = value;
    return *this;
}
PesBuilder& PesBuilder::headerDataLength(uint8_t length) {
    mHeaderDataLength = length;
    return *this;
}
PesBuilder& PesBuilder::lengthField(uint16_t length) {
    mLengthField = length;
    return *this;
}
PesBuilder& PesBuilder::noOptionalHeader() {
    mOptionalHeader = false;
    return *this;
}
PesBuilder& PesBuilder::payload(std::vector<uint8_t> bytes) {
    mPayload = std::move(bytes);
    return *this;
}

void PesBuilder::writeTimeStamp(uint8_t* out, uint8_t prefix, uint64_t time) {
    out[0] = static_cast<uint8_t>((prefix << 4) | ((time >> 29) & 0x0E) | 1);
    out[1] = static_cast<uint8_t>(time >> 22);
    out[2] = static_cast<uint8_t>(((time >> 14) & 0xFE) | 1);
    out[3] = static_cast<uint8_t>(time >> 7);
    out[4] = static_cast<uint8_t>(((time << 1) & 0xFE) | 1);
}

std::vector<uint8_t> PesBuilder::build() const {
    std::vector<uint8_t> pes{0x00, 0x00, 0x01, mStreamId, 0x00, 0x00};
    if (mOptionalHeader) {
        std::vector<uint8_t> fields;
        uint8_t flags7 = mExtraFlags;
        if (mPts) {
            flags7 |= mDts ? 0xC0 : 0x80;
            uint8_t stamp[5];
            writeTimeStamp(stamp, mDts ? 3 : 2, *mPts);
            fields.insert(fields.end(), stamp, stamp + 5);
            if (mDts) {
                writeTimeStamp(stamp, 1, *mDts);
                fields.insert(fields.end(), stamp, stamp + 5);
            }
        }
        fields.insert(fields.end(), mExtraFields.begin(), mExtraFields.end());
        fields.insert(fields.end(), mStuffing, 0xFF);
        pes.push_back(mByte6);
        pes.push_back(flags7);
        pes.push_back(mHeaderDataLength ? *mHeaderDataLength : static_cast<uint8_t>(fields.size()));
        pes.insert(pes.end(), fields.begin(), fields.end());
    }
    pes.insert(pes.end(), mPayload.begin(), mPayload.end());
    const size_t after = pes.size() - 6;
    const uint16_t length =
        mLengthField ? *mLengthField : (after > 0xFFFF ? 0 : static_cast<uint16_t>(after));
    pes[4] = static_cast<uint8_t>(length >> 8);
    pes[5] = static_cast<uint8_t>(length);
    return pes;
}

}  // namespace TavoPlayer::test
