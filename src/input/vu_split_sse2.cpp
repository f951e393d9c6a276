// Interleaved V/U split, SSE2: 16 pairs per step (also serves the AVX2 and
// AVX-512 levels; the loop is bound by memory, not by register width).
#if defined(__SSE2__) && (defined(__x86_64__) || defined(__i386__))
#include "input/vu_split.h"

#include <emmintrin.h>

namespace tekoj {

void split_vu_sse2(const uint8_t* src, uint32_t n, uint8_t* cr, uint8_t* cb) {
    const __m128i low = _mm_set1_epi16(0x00FF);
    uint32_t x = 0;
    for (; x + 16 <= n; x += 16) {
        const __m128i a = _mm_loadu_si128(reinterpret_cast<const __m128i*>(src + 2 * x));
        const __m128i b = _mm_loadu_si128(reinterpret_cast<const __m128i*>(src + 2 * x + 16));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(cr + x),
                         _mm_packus_epi16(_mm_and_si128(a, low), _mm_and_si128(b, low)));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(cb + x),
                         _mm_packus_epi16(_mm_srli_epi16(a, 8), _mm_srli_epi16(b, 8)));
    }
    split_vu_portable(src + 2 * x, n - x, cr + x, cb + x);
}

}  // namespace tekoj
#endif
