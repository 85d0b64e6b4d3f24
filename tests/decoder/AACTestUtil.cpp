#include "AACTestUtil.h"

namespace TavoPlayer::test {

namespace {

// AudioSpecificConfig with a GASpecificConfig for channel configurations 1..7.
void writeAsc(BitSink& sink, const AscFields& asc) {
    const bool hierarchical = asc.hierarchicalExtension != 0;
    sink.put(hierarchical ? asc.hierarchicalExtension : asc.aot, 5);
    sink.put(asc.samplingFrequencyIndex, 4);
    sink.put(asc.channelConfiguration, 4);
    if (hierarchical) {
        sink.put(asc.extensionSamplingFrequencyIndex, 4);
        sink.put(asc.aot, 5);  // the core's object type
    }
    sink.put(asc.frameLengthFlag, 1);
    sink.put(0, 1);  // dependsOnCoreCoder
    sink.put(0, 1);  // extensionFlag
    if (asc.backwardCompatibleSbr) {
        sink.put(0x2B7, 11);
        sink.put(5, 5);  // extensionAudioObjectType SBR
        sink.put(1, 1);  // sbrPresentFlag
        sink.put(asc.extensionSamplingFrequencyIndex, 4);
        if (asc.backwardCompatiblePs) {
            sink.put(0x548, 11);
            sink.put(1, 1);
        }
    }
}

void latmValue(BitSink& sink, uint32_t value) {
    uint32_t bytes = value > 0xFFFFFF ? 3 : value > 0xFFFF ? 2 : value > 0xFF ? 1 : 0;
    sink.put(bytes, 2);
    for (uint32_t i = bytes + 1; i-- > 0;)
        sink.put((value >> (8 * i)) & 0xFF, 8);
}

}  // namespace

std::vector<uint8_t> loasFrame(const LoasOptions& o,
                               const std::vector<std::vector<uint8_t>>& payloads) {
    BitSink mux;
    mux.put(o.useSameStreamMux ? 1 : 0, 1);
    if (!o.useSameStreamMux) {
        mux.put(o.audioMuxVersion, 1);
        if (o.audioMuxVersion == 1) {
            mux.put(o.audioMuxVersionA, 1);
            latmValue(mux, 0xFF);  // taraBufferFullness
        }
        mux.put(1, 1);  // allStreamsSameTimeFraming
        mux.put(static_cast<uint32_t>(payloads.size() - 1), 6);
        mux.put(o.numProgram, 4);
        mux.put(o.numLayer, 3);
        if (o.audioMuxVersion == 1) {
            BitSink asc;
            writeAsc(asc, o.asc);
            latmValue(mux, static_cast<uint32_t>(asc.bitCount() + o.ascFillBits));
        }
        writeAsc(mux, o.asc);
        mux.put(0, o.ascFillBits);
        mux.put(o.frameLengthType, 3);
        mux.put(0xFF, 8);  // latmBufferFullness
        mux.put(o.otherDataBits > 0 ? 1 : 0, 1);
        if (o.otherDataBits > 0) {
            if (o.audioMuxVersion == 1) {
                latmValue(mux, o.otherDataBits);
            } else {
                // Escape-coded in bytes, most significant first.
                std::vector<uint32_t> parts;
                for (uint32_t v = o.otherDataBits; v > 0; v >>= 8)
                    parts.insert(parts.begin(), v & 0xFF);
                for (size_t i = 0; i < parts.size(); ++i) {
                    mux.put(i + 1 < parts.size() ? 1 : 0, 1);
                    mux.put(parts[i], 8);
                }
            }
        }
        mux.put(o.crc ? 1 : 0, 1);
        if (o.crc)
            mux.put(0xA5, 8);
    }
    for (const auto& payload : payloads) {
        size_t left = payload.size();
        while (left >= 255) {
            mux.put(255, 8);
            left -= 255;
        }
        mux.put(static_cast<uint32_t>(left), 8);
        mux.putBytes(payload);
    }
    mux.put(0, o.otherDataBits);
    mux.align();
    BitSink frame;
    frame.put(0x2B7, 11);
    frame.put(static_cast<uint32_t>(mux.bytes().size()), 13);
    frame.putBytes(mux.bytes());
    return frame.bytes();
}

std::vector<uint8_t> adtsFrame(const AdtsOptions& o, const std::vector<uint8_t>& payload) {
    const uint32_t header = o.crc ? 9 : 7;
    BitSink s;
    s.put(0xFFF, 12);
    s.put(0, 1);  // ID: MPEG-4
    s.put(0, 2);  // layer
    s.put(o.crc ? 0 : 1, 1);
    s.put(o.profile, 2);
    s.put(o.samplingFrequencyIndex, 4);
    s.put(0, 1);
    s.put(o.channelConfiguration, 3);
    s.put(0, 4);
    s.put(header + static_cast<uint32_t>(payload.size()), 13);
    s.put(0x7FF, 11);
    s.put(o.rawDataBlocks, 2);
    if (o.crc)
        s.put(0xBEEF, 16);
    s.putBytes(payload);
    return s.bytes();
}

std::vector<uint8_t> patternPayload(size_t size, uint32_t seed) {
    std::vector<uint8_t> out(size);
    uint32_t x = seed * 2654435761u + 1;
    for (auto& b : out) {
        x = x * 1103515245u + 12345u;
        b = static_cast<uint8_t>(x >> 16);
    }
    return out;
}

}  // namespace TavoPlayer::test
