#include "AACTestUtil.h"

#include <cinttypes>
#include <cstdio>
#include <filesystem>

#include "PesRecordTestUtil.h"

namespace TavoPlayer::test {

void BitSink::put(uint32_t value, unsigned int bits) {
    for (unsigned int i = bits; i-- > 0;) {
        if (mBits % 8 == 0) {
            mBytes.push_back(0);
        }
        if (i < 32 && ((value >> i) & 1u)) {  // fields wider than 32 bits are zero-extended
            mBytes.back() |= static_cast<uint8_t>(0x80u >> (mBits % 8));
        }
        ++mBits;
    }
}

void BitSink::putBytes(const std::vector<uint8_t>& bytes) {
    for (uint8_t b : bytes) {
        put(b, 8);
    }
}

void writeAsc(BitSink& sink, const AscFields& asc) {
    if (asc.hierarchicalExtension != 0) {
        sink.put(asc.hierarchicalExtension, 5);
        sink.put(asc.samplingFrequencyIndex, 4);
        sink.put(asc.channelConfiguration, 4);
        sink.put(asc.extensionSamplingFrequencyIndex, 4);
        sink.put(asc.aot, 5);
    } else {
        sink.put(asc.aot, 5);
        sink.put(asc.samplingFrequencyIndex, 4);
        sink.put(asc.channelConfiguration, 4);
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

namespace {

void latmValue(BitSink& sink, uint32_t value) {
    uint32_t bytes = value > 0xFFFFFF ? 3 : value > 0xFFFF ? 2 : value > 0xFF ? 1 : 0;
    sink.put(bytes, 2);
    for (uint32_t i = bytes + 1; i-- > 0;) {
        sink.put((value >> (8 * i)) & 0xFF, 8);
    }
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
                for (uint32_t v = o.otherDataBits; v > 0; v >>= 8) {
                    parts.insert(parts.begin(), v & 0xFF);
                }
                for (size_t i = 0; i < parts.size(); ++i) {
                    mux.put(i + 1 < parts.size() ? 1 : 0, 1);
                    mux.put(parts[i], 8);
                }
            }
        }
        mux.put(o.crc ? 1 : 0, 1);
        if (o.crc) {
            mux.put(0xA5, 8);
        }
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
    if (o.crc) {
        s.put(0xBEEF, 16);
    }
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

std::vector<Unit> drain(AACMediaExtractor& extractor, size_t outputSize, int idleCalls) {
    std::vector<Unit> units;
    std::vector<uint8_t> buffer(outputSize);
    int idle = 0;
    while (idle < idleCalls) {
        unsigned long length = 0;
        long long pts = 0;
        unsigned char flags = 0;
        const unsigned int result =
            extractor.getDecodableUnit(buffer.data(), buffer.size(), &length, &pts, &flags);
        if (result == MediaExtractor::RESULT_NO_INPUT && length == 0) {
            ++idle;
            continue;
        }
        idle = 0;
        if (result == MediaExtractor::RESULT_RING_FAULT) {
            break;
        }
        if (length > 0) {
            units.push_back(
                {std::vector<uint8_t>(buffer.begin(), buffer.begin() + length), pts, flags});
        }
    }
    return units;
}

std::string dumpUnits(const std::vector<Unit>& units) {
    std::string out;
    char line[96];
    for (const auto& u : units) {
        std::snprintf(line, sizeof(line), "%lld %u %zu %016" PRIx64 "\n", u.pts,
                      static_cast<unsigned int>(u.flags), u.bytes.size(),
                      fnv1a64(u.bytes.data(), u.bytes.size()));
        out += line;
    }
    return out;
}

std::string sharedStream(const std::string& name) {
    const std::filesystem::path path = std::filesystem::path(TAVO_SHARED_STREAMS_DIR) / name;
    return std::filesystem::exists(path) ? path.string() : std::string();
}

std::vector<PesPayload> pesPayloadsOfPid(const std::vector<uint8_t>& ts, uint16_t pid) {
    std::vector<std::vector<uint8_t>> packets;
    for (size_t at = 0; at + 188 <= ts.size(); at += 188) {
        const uint8_t* p = &ts[at];
        if (p[0] != 0x47 || (((p[1] & 0x1F) << 8) | p[2]) != pid) {
            continue;
        }
        size_t payload = 4;
        if (p[3] & 0x20) {
            payload += 1 + p[4];
        }
        if (!(p[3] & 0x10) || payload >= 188) {
            continue;
        }
        if (p[1] & 0x40) {
            packets.emplace_back();
        }
        if (!packets.empty()) {
            packets.back().insert(packets.back().end(), p + payload, p + 188);
        }
    }
    std::vector<PesPayload> out;
    uint64_t lastPts = 0;  // a PES without PTS carries the last one seen, as the TS parser does
    for (const auto& pes : packets) {
        if (pes.size() < 9 || pes[0] != 0 || pes[1] != 0 || pes[2] != 1) {
            continue;
        }
        PesPayload unit;
        unit.pts = lastPts;
        const size_t headerEnd = 9u + pes[8];
        if ((pes[7] & 0x80) && pes.size() >= 14) {
            unit.pts = (static_cast<uint64_t>(pes[9] & 0x0E) << 29) |
                       (static_cast<uint64_t>(pes[10]) << 22) |
                       (static_cast<uint64_t>(pes[11] & 0xFE) << 14) |
                       (static_cast<uint64_t>(pes[12]) << 7) | (pes[13] >> 1);
            lastPts = unit.pts;
        }
        // PES_packet_length bounds the payload when given; otherwise all of it.
        size_t end = pes.size();
        const size_t packetLength = (static_cast<size_t>(pes[4]) << 8) | pes[5];
        if (packetLength != 0 && 6 + packetLength < end) {
            end = 6 + packetLength;
        }
        if (headerEnd <= end) {
            unit.es.assign(pes.begin() + static_cast<long>(headerEnd),
                           pes.begin() + static_cast<long>(end));
            out.push_back(std::move(unit));
        }
    }
    return out;
}

}  // namespace TavoPlayer::test
