// TSParsedData: the fields of one 188-byte transport packet (ISO/IEC 13818-1,
// 2.4.3.2 and 2.4.3.4), as TSPacketParser reads them.
//
// One instance is reused for every packet of a PID. Parsing never clears it: the
// adaptation-field values (flags, PCR, private data and the rest) are written only
// when a packet carries them and otherwise keep an earlier packet's values. The TS
// parser module relies on that (a PCR flag, once seen, stays set), so do not "fix"
// it by clearing the record between packets.
//
// Header bits are stored as 0/1 bytes, except the adaptation-field extension flags,
// which keep their bit in place (ltw 0x80, piecewise rate 0x40, seamless splice 0x20).
#pragma once

#include <cstdint>

namespace TavoPlayer {

class TSParsedData {
public:
    TSParsedData();
    ~TSParsedData();
    TSParsedData(const TSParsedData&) = delete;
    TSParsedData& operator=(const TSParsedData&) = delete;

    // Replaces the private-data copy with `length` bytes from `bytes` (null for none).
    void setPrivateData(const uint8_t* bytes, uint8_t length);

    uint8_t mTransportErrorIndicator;
    uint8_t mPayloadUnitStartIndicator;
    uint8_t mTransportPriority;
    uint16_t mPID;  // 0xFFFF until a packet has been parsed
    uint8_t mTransportScramblingControl;
    uint8_t mAdaptationFieldControl;
    uint8_t mContinuityCounter;

    uint8_t mAdaptationFieldLength;
    uint8_t mDiscontinuityIndicator;
    uint8_t mRandomAccessIndicator;
    uint8_t mElementaryStreamPriorityIndicator;
    uint8_t mPCRFlag;
    uint8_t mOPCRFlag;
    uint8_t mSplicingPointFlag;
    uint8_t mTransportPrivateDataFlag;
    uint8_t mAdaptationFieldExtensionFlag;
    uint64_t mPCRBase;  // 33 bits, 90 kHz
    uint16_t mPCRExtension;
    uint64_t mOPCRBase;
    uint16_t mOPCRExtension;
    uint8_t mSpliceCountdown;
    uint8_t mTransportPrivateDataLength;
    uint8_t* mTransportPrivateData;  // owned heap copy, or null

    uint8_t mAdaptationFieldExtensionLength;
    uint8_t mLtwFlag;             // 0 or 0x80
    uint8_t mPiecewiseRateFlag;   // 0 or 0x40
    uint8_t mSeamlessSpliceFlag;  // 0 or 0x20
    uint8_t mLtwValidFlag;
    uint16_t mLtwOffset;
    uint32_t mPiecewiseRate;
    uint8_t mSpliceType;
    uint64_t mDTSNextAU;  // 33 bits

    // Inside the packet that was parsed last; valid while that packet is.
    const uint8_t* mPayload;
    uint32_t mPayloadLength;
};

}  // namespace TavoPlayer
