// PESPacketParser::parse over arbitrary bytes taken as one assembled PES packet,
// in an exact-size buffer so that the sanitizers see any read past its end. When
// the header fits, the elementary stream must end exactly where the packet ends.
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "QuietFuzzInitialize.h"
#include "tsparser/PESPacketParser.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size == 0 || size > (1u << 20))
        return 0;
    auto pes = std::make_unique<uint8_t[]>(size);
    memcpy(pes.get(), data, size);
    TavoPlayer::PESPacketParser parser;
    TavoPlayer::PESParsedData parsed;
    const uint32_t ok = parser.parse(pes.get(), static_cast<uint32_t>(size), &parsed);
    if (ok != 0) {
        const uint8_t* es = parsed.mElementaryStream;
        const size_t start = static_cast<size_t>(es - pes.get());
        if (start != 6 && start != 9u + parsed.mHeaderDataLength)
            abort();
        if (start <= size && es + parsed.mElementaryStreamSize != pes.get() + size)
            abort();
    }
    return 0;
}
