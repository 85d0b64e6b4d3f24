// PESParsedData: the header fields of one PES packet (ISO/IEC 13818-1, 2.4.3.6,
// Table 2-21), as PESPacketParser reads them.
//
// One instance is reused for every packet. Parsing never clears it, so a field that
// a packet does not carry (most often the PTS or DTS) keeps the value of an earlier
// packet; the TS parser module stamps records with those values on purpose.
#pragma once

#include <cstdint>

namespace TavoPlayer {

class PESParsedData {
public:
    static constexpr uint32_t kPrivateDataSize = 16;

    PESParsedData();

    uint8_t mStreamId;
    uint16_t mPESPacketLength;  // as written; not used for sizing
    uint8_t mScramblingControl;
    uint8_t mPriority;
    uint8_t mDataAlignmentIndicator;
    uint8_t mCopyright;
    uint8_t mOriginalOrCopy;
    uint8_t mPTSDTSFlags;
    uint8_t mESCRFlag;
    uint8_t mESRateFlag;
    uint8_t mDSMTrickModeFlag;
    uint8_t mAdditionalCopyInfoFlag;
    uint8_t mCRCFlag;
    uint8_t mExtensionFlag;
    uint8_t mHeaderDataLength;
    uint64_t mPTS;  // 33 bits, 90 kHz
    uint64_t mDTS;  // 33 bits, 90 kHz
    uint64_t mESCRBase;
    uint16_t mESCRExtension;
    uint32_t mESRate;
    uint8_t mDSMTrickMode;  // never filled: the byte is skipped
    uint8_t mAdditionalCopyInfo;
    uint16_t mPreviousPESCRC;
    uint8_t mPESPrivateDataFlag;
    uint8_t mPackHeaderFieldFlag;
    uint8_t mProgramPacketSequenceCounterFlag;
    uint8_t mPSTDBufferFlag;
    uint8_t mPESExtensionFlag2;
    uint8_t mPESPrivateData[kPrivateDataSize];
    uint8_t mPackFieldLength;
    uint8_t mProgramPacketSequenceCounter;
    uint8_t mMPEG1MPEG2Identifier;
    uint8_t mOriginalStuffLength;
    uint8_t mPSTDBufferScale;
    uint16_t mPSTDBufferSize;
    uint8_t mPESExtensionFieldLength;
    uint8_t mStreamIdExtensionFlag;
    uint8_t mStreamIdExtension;

    // Inside the packet that was parsed last.
    const uint8_t* mElementaryStream;
    uint32_t mElementaryStreamSize;
};

}  // namespace TavoPlayer
