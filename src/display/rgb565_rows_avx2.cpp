// AVX2 rows of the YUV 4:2:0 to RGB565 converters: the arithmetic of the
// SSE2 rows on 32 pixels per step. Chroma samples 0-7 and 8-15 sit in the
// two 128-bit halves, and so, after unpacking, do the luma pixels they serve
// (0-7 and 16-23, then 8-15 and 24-31); the halves are put in order when
// stored.
#include "display/rgb565_rows.h"

#if defined(__x86_64__) || defined(__i386__)

#include <immintrin.h>

namespace tekoj {
namespace {

inline __m256i round_mul(__m256i x, int16_t c) {
    const __m256i k = _mm256_set1_epi16(c);
    return _mm256_add_epi16(_mm256_mulhi_epi16(x, k), _mm256_srli_epi16(_mm256_mullo_epi16(x, k), 15));
}

struct Contribution {
    __m256i red, green, blue;
};

inline Contribution contribution(__m256i cb16, __m256i cr16) {
    const __m256i centre = _mm256_set1_epi16(rgb565::kCentre);
    const __m256i xb = _mm256_sub_epi16(cb16, centre), xr = _mm256_sub_epi16(cr16, centre);
    const __m256i red = _mm256_add_epi16(xr, round_mul(xr, rgb565::kRedRest));
    const __m256i blue = _mm256_add_epi16(_mm256_add_epi16(xb, xb), round_mul(xb, rgb565::kBlueRest));
    const __m256i w = _mm256_set1_epi32((static_cast<int32_t>(rgb565::kGreenCb) << 16) |
                                        static_cast<uint16_t>(rgb565::kGreenCrRest));
    const __m256i half = _mm256_set1_epi32(32768);
    const __m256i lo =
        _mm256_srai_epi32(_mm256_add_epi32(_mm256_madd_epi16(_mm256_unpacklo_epi16(xr, xb), w), half), 16);
    const __m256i hi =
        _mm256_srai_epi32(_mm256_add_epi32(_mm256_madd_epi16(_mm256_unpackhi_epi16(xr, xb), w), half), 16);
    const __m256i green = _mm256_sub_epi16(_mm256_packs_epi32(lo, hi), xr);
    return {red, green, blue};
}

inline __m256i clamp255(__m256i v) {
    return _mm256_min_epi16(_mm256_max_epi16(v, _mm256_setzero_si256()), _mm256_set1_epi16(255));
}

inline __m256i pixels(__m256i y16, __m256i red, __m256i green, __m256i blue) {
    const __m256i r = clamp255(_mm256_add_epi16(y16, red));
    const __m256i g = clamp255(_mm256_add_epi16(y16, green));
    const __m256i b = clamp255(_mm256_add_epi16(y16, blue));
    return _mm256_or_si256(_mm256_or_si256(_mm256_slli_epi16(_mm256_and_si256(r, _mm256_set1_epi16(0xF8)), 8),
                                           _mm256_slli_epi16(_mm256_and_si256(g, _mm256_set1_epi16(0xFC)), 3)),
                           _mm256_srli_epi16(b, 3));
}

inline void row32(const uint8_t* y, uint16_t* d, const Contribution& c) {
    const __m256i zero = _mm256_setzero_si256();
    const __m256i luma = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(y));
    const __m256i lo = pixels(_mm256_unpacklo_epi8(luma, zero), _mm256_unpacklo_epi16(c.red, c.red),
                              _mm256_unpacklo_epi16(c.green, c.green), _mm256_unpacklo_epi16(c.blue, c.blue));
    const __m256i hi = pixels(_mm256_unpackhi_epi8(luma, zero), _mm256_unpackhi_epi16(c.red, c.red),
                              _mm256_unpackhi_epi16(c.green, c.green), _mm256_unpackhi_epi16(c.blue, c.blue));
    _mm256_storeu_si256(reinterpret_cast<__m256i*>(d), _mm256_permute2x128_si256(lo, hi, 0x20));
    _mm256_storeu_si256(reinterpret_cast<__m256i*>(d + 16), _mm256_permute2x128_si256(lo, hi, 0x31));
}

inline __m256i load16(const uint8_t* p) {
    return _mm256_cvtepu8_epi16(_mm_loadu_si128(reinterpret_cast<const __m128i*>(p)));
}

void planar(const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width, const uint8_t* cb,
            const uint8_t* cr) {
    size_t x = 0;
    for (; x + 32 <= width; x += 32) {
        const Contribution c = contribution(load16(cb + x / 2), load16(cr + x / 2));
        row32(y0 + x, d0 + x, c);
        if (y1 != nullptr) row32(y1 + x, d1 + x, c);
    }
    display_kernels_sse2()->planar(y0 + x, y1 != nullptr ? y1 + x : nullptr, d0 + x, d1 != nullptr ? d1 + x : nullptr,
                                   width - x, cb + x / 2, cr + x / 2);
}

void interleaved(const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width, const uint8_t* vu) {
    size_t x = 0;
    for (; x + 32 <= width; x += 32) {
        const __m256i pairs = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(vu + x));
        const Contribution c =
            contribution(_mm256_srli_epi16(pairs, 8), _mm256_and_si256(pairs, _mm256_set1_epi16(0x00FF)));
        row32(y0 + x, d0 + x, c);
        if (y1 != nullptr) row32(y1 + x, d1 + x, c);
    }
    display_kernels_sse2()->interleaved(y0 + x, y1 != nullptr ? y1 + x : nullptr, d0 + x,
                                        d1 != nullptr ? d1 + x : nullptr, width - x, vu + x);
}

const DisplayKernels kAvx2 = {planar, interleaved};

}  // namespace

const DisplayKernels* display_kernels_avx2() { return &kAvx2; }

}  // namespace tekoj

#else

namespace tekoj {
const DisplayKernels* display_kernels_avx2() { return nullptr; }
}  // namespace tekoj

#endif
