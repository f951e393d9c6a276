// Forward transform with quantisation, AVX2: two horizontally adjacent blocks
// per pass, block b in the low 128-bit lane and block b + 1 in the high one,
// so one 16-byte load brings a row of both.
#if defined(__AVX2__) && (defined(__x86_64__) || defined(__i386__))
#include "core/forward_dct_x86.h"

namespace tekoj {
namespace {

// Quantises and stores the rows d[v] of blocks b (low lane) and b + 1 (high
// lane) into out and out + 64.
inline void quantise_store_pair(const __m256i (&d)[8], const QuantTable& quant, int16_t* out) {
    for (int v = 0; v < 8; ++v) {
        const __m256i mul =
            _mm256_broadcastsi128_si256(_mm_load_si128(reinterpret_cast<const __m128i*>(quant.mul + 8 * v)));
        const __m256i wide =
            _mm256_broadcastsi128_si256(_mm_load_si128(reinterpret_cast<const __m128i*>(quant.wide + 8 * v)));
        const __m256i q = quantise16(d[v], mul, wide);
        _mm_storeu_si128(reinterpret_cast<__m128i*>(out + 8 * v), _mm256_castsi256_si128(q));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(out + 64 + 8 * v), _mm256_extracti128_si256(q, 1));
    }
}

}  // namespace

void fdct_blocks_avx2(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                      int16_t* out) {
    uint32_t b = 0;
    for (; b + 2 <= count; b += 2, col += 16, out += 128) {
        __m256i d[8];
        for (int y = 0; y < 8; ++y)
            d[y] = _mm256_cvtepu8_epi16(_mm_loadu_si128(reinterpret_cast<const __m128i*>(rows[y] + col)));
        transform8x8(d);
        quantise_store_pair(d, quant, out);
    }
    if (b < count) fdct_block_128(rows, col, quant, out);
}

void quantise_blocks_avx2(const int16_t* x, uint32_t count, const QuantTable& quant, int16_t* out) {
    uint32_t b = 0;
    for (; b + 2 <= count; b += 2, x += 128, out += 128) {
        __m256i d[8];
        for (int v = 0; v < 8; ++v)
            d[v] = _mm256_loadu2_m128i(reinterpret_cast<const __m128i*>(x + 64 + 8 * v),
                                       reinterpret_cast<const __m128i*>(x + 8 * v));
        quantise_store_pair(d, quant, out);
    }
    if (b < count) quantise_blocks_sse2(x, 1, quant, out);
}

}  // namespace tekoj
#endif
