// Fuzz target for the MPEG-4 audio transport decoder: arbitrary bytes handed in with
// arbitrary fill sizes, as LOAS or ADTS. Every access unit reported must lie inside
// the buffered bytes and be readable to its last bit; no read may leave the buffer.
//
// Input layout: byte 0 bit 0 picks ADTS (1) or LOAS (0), the other bits the fill size
// (1 + value * 17 bytes); the rest is the stream.
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "decoder/TransportDecoder.h"

using namespace TavoPlayer;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1) {
        return 0;
    }
    const TRANSPORT_TYPE type = (data[0] & 1) ? TT_MP4_ADTS : TT_MP4_LOAS;
    const uint32_t fill = 1u + (data[0] >> 1) * 17u;
    HANDLE_TRANSPORTDEC handle = transportDec_Open(type, 0, 1);
    transportDec_SetParam(handle, TPDEC_PARAM_IGNORE_BUFFERFULLNESS, 1);
    std::vector<uint8_t> unit;
    size_t at = 1;
    while (at < size) {
        const uint32_t chunk = static_cast<uint32_t>(std::min<size_t>(fill, size - at));
        uint32_t valid = chunk;
        while (valid > 0) {
            const uint32_t before = valid;
            if (transportDec_FillData(handle, data + at, chunk, &valid, 0) != TRANSPORTDEC_OK ||
                valid > before) {
                std::abort();
            }
            for (int reads = 0; reads < 100000; ++reads) {
                const TRANSPORTDEC_ERROR error = transportDec_ReadAccessUnit(handle, 0);
                if (error == TRANSPORTDEC_NOT_ENOUGH_BITS) {
                    break;
                }
                if (error != TRANSPORTDEC_OK) {
                    continue;
                }
                const uint32_t bits = transportDec_GetAuBitsTotal(handle, 0);
                TransportBitReader* reader = transportDec_GetBitstream(handle, 0);
                if (bits % 8 != 0 || reader == nullptr || reader->bitsLeft() < bits ||
                    transportDec_GetAuBitsRemaining(handle, 0) != static_cast<int32_t>(bits)) {
                    std::abort();
                }
                unit.resize(bits / 8);
                reader->readBytes(unit.data(), bits / 8);
                if (reader->overrun() || transportDec_GetAuBitsRemaining(handle, 0) != 0) {
                    std::abort();
                }
                transportDec_EndAccessUnit(handle);
            }
        }
        at += chunk;
    }
    transportDec_Close(&handle);
    return 0;
}
