// TSPacketParser::parse over arbitrary bytes: the input is cut into 188-byte
// packets fed to one parser in order (continuity state carried across), each in
// an exact-size buffer so that the sanitizers see any read outside it. The
// payload a packet reports must lie inside that packet.
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "QuietFuzzInitialize.h"
#include "tsparser/TSPacketParser.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using TavoPlayer::TSPacketParser;
    constexpr size_t kPacket = TSPacketParser::kPacketSize;
    TSPacketParser parser;
    TavoPlayer::TSParsedData parsed;
    for (size_t at = 0; at < size; at += kPacket) {
        auto packet = std::make_unique<uint8_t[]>(kPacket);
        const size_t n = size - at < kPacket ? size - at : kPacket;
        memcpy(packet.get(), data + at, n);
        memset(packet.get() + n, 0xFF, kPacket - n);
        const uint32_t r = parser.parse(packet.get(), &parsed);
        if ((r & TSPacketParser::RESULT_PAYLOAD) && !(r & TSPacketParser::RESULT_ERROR)) {
            if (parsed.mPayload < packet.get() ||
                parsed.mPayload + parsed.mPayloadLength > packet.get() + kPacket) {
                abort();
            }
        }
        // Skip comes alone; header codes (16 and up, with the error bit) are not results.
        if (r < 16 && (r & TSPacketParser::RESULT_SKIP) && r != TSPacketParser::RESULT_SKIP) {
            abort();
        }
        if (r >= 16 && !(r & TSPacketParser::RESULT_ERROR))
            abort();
    }
    return 0;
}
