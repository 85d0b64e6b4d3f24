#include "decoder/TransportBitReader.h"

#include <cstring>

#if defined(__SSE2__)
#include <emmintrin.h>
#endif
#if defined(__x86_64__) && defined(__GNUC__)
#include <immintrin.h>
#define TAVO_BITREADER_AVX2 1
#endif

namespace TavoPlayer {

namespace {

#if defined(TAVO_BITREADER_AVX2)
// The shifted copy of readBytes 32 bytes per step, for processors with AVX2 (chosen
// at run time: the build targets the x86-64 baseline). Same scheme as the SSE2 loop
// below; needs count >= 32 and reads at[0 .. count].
__attribute__((target("avx2"))) void shiftedCopyAvx2(const uint8_t* at, uint8_t* out,
                                                     uint32_t count, unsigned int offset) {
    const unsigned int back = 8u - offset;
    const __m128i shiftLeft = _mm_cvtsi32_si128(static_cast<int>(offset));
    const __m128i shiftRight = _mm_cvtsi32_si128(static_cast<int>(back));
    const __m256i keepHigh = _mm256_set1_epi8(static_cast<char>((0xFFu << offset) & 0xFFu));
    const __m256i keepLow = _mm256_set1_epi8(static_cast<char>(0xFFu >> back));
    // Not a lambda: it would not inherit the target attribute.
    uint32_t i = 0;
    while (i < count) {
        const uint32_t from = i + 32 <= count ? i : count - 32;  // the rest overlaps
        const __m256i head = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(at + from));
        const __m256i tail = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(at + from + 1));
        const __m256i high = _mm256_and_si256(_mm256_sll_epi16(head, shiftLeft), keepHigh);
        const __m256i low = _mm256_and_si256(_mm256_srl_epi16(tail, shiftRight), keepLow);
        _mm256_storeu_si256(reinterpret_cast<__m256i*>(out + from), _mm256_or_si256(high, low));
        i = from + 32;
    }
}

bool haveAvx2() {
    static const bool have = __builtin_cpu_supports("avx2") != 0;
    return have;
}
#endif

}  // namespace

uint32_t TransportBitReader::peekNearEnd(const uint8_t* at, unsigned int offset,
                                         unsigned int count) {
    // At most 5 bytes for 32 bits at an odd offset.
    const unsigned int spanBytes = (offset + count + 7u) >> 3;
    uint64_t word = 0;
    for (unsigned int i = 0; i < spanBytes; ++i) {
        word = (word << 8) | at[i];
    }
    word >>= spanBytes * 8u - offset - count;
    return static_cast<uint32_t>(word & ((count == 32) ? 0xFFFFFFFFull : ((1ull << count) - 1)));
}

void TransportBitReader::readBytes(uint8_t* out, uint32_t count) {
    if (count == 0) {
        return;
    }
    const uint64_t bits = static_cast<uint64_t>(count) * 8u;
    if (bits > mSizeBits - mPositionBits) {
        mOverrun = true;
        return;
    }
    const uint8_t* at = mData + (mPositionBits >> 3);
    const unsigned int offset = static_cast<unsigned int>(mPositionBits & 7u);
    if (offset == 0) {
        std::memcpy(out, at, count);
    } else {
        // Each output byte takes the low (8 - offset) bits of one input byte and the
        // high `offset` bits of the next; the last input byte touched is still inside
        // the data because the whole field is.
#if defined(TAVO_BITREADER_AVX2)
        if (count >= 32 && haveAvx2()) {
            shiftedCopyAvx2(at, out, count, offset);
            mPositionBits += bits;
            return;
        }
#endif
        const unsigned int back = 8u - offset;
        uint32_t i = 0;
#if defined(__SSE2__)
        // Sixteen output bytes per step: the same byte-wise shift done on two
        // overlapping loads, with 16-bit lane shifts masked back to byte lanes (bits
        // that crossed into a neighbouring byte are cleared). LATM access units start
        // one bit past a byte boundary whenever useSameStreamMux is set, so this loop
        // carries nearly every LOAS byte; the loads stay within [at, at + count], which
        // the bound check above guarantees to be inside the data.
        const __m128i shiftLeft = _mm_cvtsi32_si128(static_cast<int>(offset));
        const __m128i shiftRight = _mm_cvtsi32_si128(static_cast<int>(back));
        const __m128i keepHigh = _mm_set1_epi8(static_cast<char>((0xFFu << offset) & 0xFFu));
        const __m128i keepLow = _mm_set1_epi8(static_cast<char>(0xFFu >> back));
        const auto shift16 = [&](uint32_t from) {
            const __m128i head = _mm_loadu_si128(reinterpret_cast<const __m128i*>(at + from));
            const __m128i tail = _mm_loadu_si128(reinterpret_cast<const __m128i*>(at + from + 1));
            const __m128i high = _mm_and_si128(_mm_sll_epi16(head, shiftLeft), keepHigh);
            const __m128i low = _mm_and_si128(_mm_srl_epi16(tail, shiftRight), keepLow);
            _mm_storeu_si128(reinterpret_cast<__m128i*>(out + from), _mm_or_si128(high, low));
        };
        for (; i + 16 <= count; i += 16) {
            shift16(i);
        }
        if (i < count && count >= 16) {
            // The last sixteen bytes once more, overlapping what is done, instead of a
            // byte loop over the rest.
            shift16(count - 16);
            i = count;
        }
#elif __BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__
        // Eight output bytes per step from a big-endian 64-bit load and the byte after
        // it.
        for (; i + 8 <= count; i += 8) {
            uint64_t word;
            std::memcpy(&word, at + i, sizeof(word));
            word = __builtin_bswap64(word);
            word = (word << offset) | (at[i + 8] >> back);
            word = __builtin_bswap64(word);
            std::memcpy(out + i, &word, sizeof(word));
        }
#endif
        for (; i < count; ++i) {
            out[i] = static_cast<uint8_t>((at[i] << offset) | (at[i + 1] >> back));
        }
    }
    mPositionBits += bits;
}

}  // namespace TavoPlayer
