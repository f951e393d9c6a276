// Forward transform with quantisation, SSE2: one block per pass.
#if defined(__SSE2__) && (defined(__x86_64__) || defined(__i386__))
#include "core/forward_dct_x86.h"

namespace tekoj {

void fdct_blocks_sse2(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                      int16_t* out) {
    for (uint32_t b = 0; b < count; ++b, col += 8, out += 64) fdct_block_128(rows, col, quant, out);
}

void quantise_blocks_sse2(const int16_t* x, uint32_t count, const QuantTable& quant, int16_t* out) {
    for (uint32_t i = 0; i < 8 * count; ++i) {
        const __m128i row = _mm_loadu_si128(reinterpret_cast<const __m128i*>(x + 8 * i));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(out + 8 * i), quantise_row_128(row, quant, static_cast<int>(i % 8)));
    }
}

}  // namespace tekoj
#endif
