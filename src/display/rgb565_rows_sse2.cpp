// SSE2 rows of the YUV 4:2:0 to RGB565 converters: sixteen pixels of each
// row per step, their eight chroma samples' contributions computed once in
// 16-bit lanes.
#include "display/rgb565_rows.h"

#if defined(__x86_64__) || defined(__i386__)

#include <emmintrin.h>

namespace tekoj {
namespace {

// (c * x + 32768) >> 16 for 16-bit x and c: the high half of the product
// plus the carry that adding 32768 to its low half makes.
inline __m128i round_mul(__m128i x, int16_t c) {
    const __m128i k = _mm_set1_epi16(c);
    return _mm_add_epi16(_mm_mulhi_epi16(x, k), _mm_srli_epi16(_mm_mullo_epi16(x, k), 15));
}

// Contributions of eight chroma samples to R, G and B (the table values).
struct Contribution {
    __m128i red, green, blue;
};

inline Contribution contribution(__m128i cb16, __m128i cr16) {
    const __m128i centre = _mm_set1_epi16(rgb565::kCentre);
    const __m128i xb = _mm_sub_epi16(cb16, centre), xr = _mm_sub_epi16(cr16, centre);
    const __m128i red = _mm_add_epi16(xr, round_mul(xr, rgb565::kRedRest));
    const __m128i blue = _mm_add_epi16(_mm_add_epi16(xb, xb), round_mul(xb, rgb565::kBlueRest));
    // Green sums two products: pmaddwd on (xr, xb) pairs, in 32 bits.
    const __m128i w = _mm_set1_epi32((static_cast<int32_t>(rgb565::kGreenCb) << 16) |
                                     static_cast<uint16_t>(rgb565::kGreenCrRest));
    const __m128i half = _mm_set1_epi32(32768);
    const __m128i lo = _mm_srai_epi32(_mm_add_epi32(_mm_madd_epi16(_mm_unpacklo_epi16(xr, xb), w), half), 16);
    const __m128i hi = _mm_srai_epi32(_mm_add_epi32(_mm_madd_epi16(_mm_unpackhi_epi16(xr, xb), w), half), 16);
    const __m128i green = _mm_sub_epi16(_mm_packs_epi32(lo, hi), xr);
    return {red, green, blue};
}

inline __m128i clamp255(__m128i v) { return _mm_min_epi16(_mm_max_epi16(v, _mm_setzero_si128()), _mm_set1_epi16(255)); }

// Eight pixels: luma words plus each contribution, clamped, packed 5-6-5.
inline __m128i pixels(__m128i y16, __m128i red, __m128i green, __m128i blue) {
    const __m128i r = clamp255(_mm_add_epi16(y16, red));
    const __m128i g = clamp255(_mm_add_epi16(y16, green));
    const __m128i b = clamp255(_mm_add_epi16(y16, blue));
    return _mm_or_si128(_mm_or_si128(_mm_slli_epi16(_mm_and_si128(r, _mm_set1_epi16(0xF8)), 8),
                                     _mm_slli_epi16(_mm_and_si128(g, _mm_set1_epi16(0xFC)), 3)),
                        _mm_srli_epi16(b, 3));
}

// Sixteen pixels of one row from the contributions of their eight samples.
inline void row16(const uint8_t* y, uint16_t* d, const Contribution& c) {
    const __m128i zero = _mm_setzero_si128();
    const __m128i luma = _mm_loadu_si128(reinterpret_cast<const __m128i*>(y));
    const __m128i lo = pixels(_mm_unpacklo_epi8(luma, zero), _mm_unpacklo_epi16(c.red, c.red),
                              _mm_unpacklo_epi16(c.green, c.green), _mm_unpacklo_epi16(c.blue, c.blue));
    const __m128i hi = pixels(_mm_unpackhi_epi8(luma, zero), _mm_unpackhi_epi16(c.red, c.red),
                              _mm_unpackhi_epi16(c.green, c.green), _mm_unpackhi_epi16(c.blue, c.blue));
    _mm_storeu_si128(reinterpret_cast<__m128i*>(d), lo);
    _mm_storeu_si128(reinterpret_cast<__m128i*>(d + 8), hi);
}

inline __m128i load8(const uint8_t* p) {
    return _mm_unpacklo_epi8(_mm_loadl_epi64(reinterpret_cast<const __m128i*>(p)), _mm_setzero_si128());
}

void planar(const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width, const uint8_t* cb,
            const uint8_t* cr) {
    size_t x = 0;
    for (; x + 16 <= width; x += 16) {
        const Contribution c = contribution(load8(cb + x / 2), load8(cr + x / 2));
        row16(y0 + x, d0 + x, c);
        if (y1 != nullptr) row16(y1 + x, d1 + x, c);
    }
    kPortableDisplayKernels.planar(y0 + x, y1 != nullptr ? y1 + x : nullptr, d0 + x, d1 != nullptr ? d1 + x : nullptr,
                                   width - x, cb + x / 2, cr + x / 2);
}

void interleaved(const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width, const uint8_t* vu) {
    size_t x = 0;
    for (; x + 16 <= width; x += 16) {
        const __m128i pairs = _mm_loadu_si128(reinterpret_cast<const __m128i*>(vu + x));
        const Contribution c = contribution(_mm_srli_epi16(pairs, 8), _mm_and_si128(pairs, _mm_set1_epi16(0x00FF)));
        row16(y0 + x, d0 + x, c);
        if (y1 != nullptr) row16(y1 + x, d1 + x, c);
    }
    kPortableDisplayKernels.interleaved(y0 + x, y1 != nullptr ? y1 + x : nullptr, d0 + x,
                                        d1 != nullptr ? d1 + x : nullptr, width - x, vu + x);
}

const DisplayKernels kSse2 = {planar, interleaved};

}  // namespace

const DisplayKernels* display_kernels_sse2() { return &kSse2; }

}  // namespace tekoj

#else

namespace tekoj {
const DisplayKernels* display_kernels_sse2() { return nullptr; }
}  // namespace tekoj

#endif
