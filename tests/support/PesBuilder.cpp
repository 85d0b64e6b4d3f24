#include "PesBuilder.h"

namespace TavoPlayer::test {

namespace {

// The five bytes of a 33-bit time stamp with its 4-bit prefix and marker bits
// (ISO/IEC 13818-1, 2.4.3.7).
void writeTimeStamp(uint8_t* out, uint8_t prefix, uint64_t time) {
    out[0] = static_cast<uint8_t>((prefix << 4) | ((time >> 29) & 0x0E) | 1);
    out[1] = static_cast<uint8_t>(time >> 22);
    out[2] = static_cast<uint8_t>(((time >> 14) & 0xFE) | 1);
    out[3] = static_cast<uint8_t>(time >> 7);
    out[4] = static_cast<uint8_t>(((time << 1) & 0xFE) | 1);
}

}  // namespace

std::vector<uint8_t> PesBuilder::build() const {
    std::vector<uint8_t> pes{0x00, 0x00, 0x01, mStreamId, 0x00, 0x00};
    if (mOptionalHeader) {
        std::vector<uint8_t> fields;
        uint8_t flags7 = 0;
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
        fields.insert(fields.end(), mStuffing, 0xFF);
        pes.push_back(mByte6);
        pes.push_back(flags7);
        pes.push_back(mHeaderDataLength ? *mHeaderDataLength : static_cast<uint8_t>(fields.size()));
        pes.insert(pes.end(), fields.begin(), fields.end());
    }
    pes.insert(pes.end(), mPayload.begin(), mPayload.end());
    const size_t after = pes.size() - 6;
    const uint16_t length = after > 0xFFFF ? 0 : static_cast<uint16_t>(after);
    pes[4] = static_cast<uint8_t>(length >> 8);
    pes[5] = static_cast<uint8_t>(length);
    return pes;
}

}  // namespace TavoPlayer::test
