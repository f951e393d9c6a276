// AVX2 row kernels of the input readers: the arithmetic of the SSE2 ones
// (one pixel per 32-bit lane, exact pmaddwd sums) on twice the width, with
// the in-lane packs put back in pixel order by one permute.
#include "input/pixel_kernels.h"

#if defined(__x86_64__) || defined(__i386__)

#include <immintrin.h>

#include <cstddef>

namespace tekoj {
namespace {

struct Dot {
    __m256i w02, w1;
};

struct Weights {
    Dot y, cb, cr;
};

Weights weights_for(bool bgr) {
    auto dot = [bgr](int32_t wr, int32_t wg, int32_t wb) {
        return Dot{_mm256_set1_epi32(bgr ? word_pair(wb, wr) : word_pair(wr, wb)), _mm256_set1_epi32(word_pair(wg, 0))};
    };
    return {dot(rgb::kYr, rgb::kYg, rgb::kYb), dot(rgb::kCbR, rgb::kCbG, rgb::kCbB),
            dot(rgb::kCrR, rgb::kCrG, rgb::kCrB)};
}

inline __m256i dot(__m256i lo, __m256i hi, const Dot& d) {
    return _mm256_add_epi32(_mm256_madd_epi16(lo, d.w02), _mm256_madd_epi16(hi, d.w1));
}

struct Split {
    __m256i lo, hi;
};

inline Split split(__m256i px) {
    return {_mm256_and_si256(px, _mm256_set1_epi32(0x00FF00FF)), _mm256_srli_epi16(px, 8)};
}

inline __m128i load16(const uint8_t* p) { return _mm_loadu_si128(reinterpret_cast<const __m128i*>(p)); }

// Eight pixels as 32-bit lanes, in order. Three-byte pixels: pixels 0-3
// and 4-7 each come from a 16-byte load spread by a byte shuffle; the second
// load reads 4 bytes beyond the eighth pixel, which callers keep inside the
// row.
template <int Bpp>
inline __m256i pixels8(const uint8_t* p) {
    if constexpr (Bpp == 4) {
        return _mm256_loadu_si256(reinterpret_cast<const __m256i*>(p));
    } else {
        const __m256i spread = _mm256_setr_epi8(0, 1, 2, -1, 3, 4, 5, -1, 6, 7, 8, -1, 9, 10, 11, -1, 0, 1, 2, -1, 3, 4,
                                                5, -1, 6, 7, 8, -1, 9, 10, 11, -1);
        return _mm256_shuffle_epi8(_mm256_inserti128_si256(_mm256_castsi128_si256(load16(p)), load16(p + 12), 1),
                                   spread);
    }
}

// Pixels a block of 32 may span, counting what the last load reads beyond it.
template <int Bpp>
constexpr uint32_t kBlockSpan = Bpp == 4 ? 32 : 34;

inline __m256i luma8(const Split& s, const Weights& w) { return _mm256_srli_epi32(dot(s.lo, s.hi, w.y), 12); }

// 32 results of four 8-lane vectors as bytes in order. The packs work within
// 128-bit halves and leave 4-byte groups in the order 0 2 4 6 1 3 5 7.
inline __m256i pack32(__m256i a, __m256i b, __m256i c, __m256i d) {
    const __m256i bytes = _mm256_packus_epi16(_mm256_packs_epi32(a, b), _mm256_packs_epi32(c, d));
    return _mm256_permutevar8x32_epi32(bytes, _mm256_setr_epi32(0, 4, 1, 5, 2, 6, 3, 7));
}

inline __m256i chroma8(__m256i lo, __m256i hi, const Dot& d) {
    return _mm256_srli_epi32(_mm256_add_epi32(dot(lo, hi, d), _mm256_set1_epi32(rgb::kChromaBias)), 12);
}

// Lanes 0 and 2 of every 128-bit half of a and b: for pixel vectors 0-7 and
// 8-15 that is pixels 0 2 8 10 | 4 6 12 14, chroma columns 0 1 4 5 | 2 3 6 7.
inline __m256i evens(__m256i a, __m256i b) {
    return _mm256_castps_si256(
        _mm256_shuffle_ps(_mm256_castsi256_ps(a), _mm256_castsi256_ps(b), _MM_SHUFFLE(2, 0, 2, 0)));
}

// Stores 16 Cb and 16 Cr results given as two pairs of 8-lane vectors in
// the column order of evens(): 0 1 4 5 | 2 3 6 7 and 8 9 12 13 | 10 11 14 15.
inline void store_chroma(__m256i b0, __m256i b1, __m256i r0, __m256i r1, uint8_t* cb, uint8_t* cr) {
    // Bytes, per half: Cb 0 1 4 5 8 9 12 13, Cr likewise | Cb 2 3 6 7 10 11 14 15, Cr likewise.
    const __m256i bytes = _mm256_packus_epi16(_mm256_packs_epi32(b0, b1), _mm256_packs_epi32(r0, r1));
    // Cb of both halves in the low half, Cr in the high one, then the 2-byte
    // groups of each half's two quarters interleaved.
    const __m256i q = _mm256_permute4x64_epi64(bytes, _MM_SHUFFLE(3, 1, 2, 0));
    const __m256i ordered = _mm256_unpacklo_epi16(q, _mm256_srli_si256(q, 8));
    _mm_storeu_si128(reinterpret_cast<__m128i*>(cb), _mm256_castsi256_si128(ordered));
    _mm_storeu_si128(reinterpret_cast<__m128i*>(cr), _mm256_extracti128_si256(ordered, 1));
}

template <int Bpp, bool Bgr, PickLayout Layout>
void pick_upper(const uint8_t* src, uint32_t w, uint8_t* y, uint8_t* cb, uint8_t* cr) {
    const Weights wt = weights_for(Bgr);
    uint32_t x = 0;
    for (; x + kBlockSpan<Bpp> <= w; x += 32) {
        const uint8_t* p = src + static_cast<size_t>(x) * Bpp;
        Split s[4];
        for (int i = 0; i < 4; ++i) s[i] = split(pixels8<Bpp>(p + 8 * i * Bpp));
        const __m256i lum = pack32(luma8(s[0], wt), luma8(s[1], wt), luma8(s[2], wt), luma8(s[3], wt));
        _mm256_storeu_si256(reinterpret_cast<__m256i*>(y + x), lum);
        const __m256i lo0 = evens(s[0].lo, s[1].lo), lo1 = evens(s[2].lo, s[3].lo);
        const __m256i hi0 = evens(s[0].hi, s[1].hi), hi1 = evens(s[2].hi, s[3].hi);
        store_chroma(chroma8(lo0, hi0, wt.cb), chroma8(lo1, hi1, wt.cb), chroma8(lo0, hi0, wt.cr),
                     chroma8(lo1, hi1, wt.cr), cb + x / 2, cr + x / 2);
    }
    input_kernels_sse2()->pick_upper[Layout](src + static_cast<size_t>(x) * Bpp, w - x, y + x, cb + x / 2,
                                             cr + x / 2);
}

template <int Bpp, bool Bgr, PickLayout Layout>
void pick_lower(const uint8_t* src, uint32_t w, uint8_t* y) {
    const Weights wt = weights_for(Bgr);
    uint32_t x = 0;
    for (; x + kBlockSpan<Bpp> <= w; x += 32) {
        const uint8_t* p = src + static_cast<size_t>(x) * Bpp;
        __m256i l[4];
        for (int i = 0; i < 4; ++i) l[i] = luma8(split(pixels8<Bpp>(p + 8 * i * Bpp)), wt);
        _mm256_storeu_si256(reinterpret_cast<__m256i*>(y + x), pack32(l[0], l[1], l[2], l[3]));
    }
    input_kernels_sse2()->pick_lower[Layout](src + static_cast<size_t>(x) * Bpp, w - x, y + x);
}

// Packed 4:2:2: sixteen groups (64 bytes) per step.
void split422(const uint8_t* s, uint32_t groups, uint8_t* y, uint8_t* cb, uint8_t* cr) {
    const __m256i low = _mm256_set1_epi16(0x00FF);
    uint32_t k = 0;
    for (; k + 16 <= groups; k += 16) {
        const __m256i a = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(s + 4 * k));
        const __m256i b = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(s + 4 * k + 32));
        const __m256i lum = _mm256_packus_epi16(_mm256_and_si256(a, low), _mm256_and_si256(b, low));
        _mm256_storeu_si256(reinterpret_cast<__m256i*>(y + 2 * k), _mm256_permute4x64_epi64(lum, _MM_SHUFFLE(3, 1, 2, 0)));
        const __m256i uv = _mm256_permute4x64_epi64(
            _mm256_packus_epi16(_mm256_srli_epi16(a, 8), _mm256_srli_epi16(b, 8)), _MM_SHUFFLE(3, 1, 2, 0));
        const __m256i c = _mm256_permute4x64_epi64(
            _mm256_packus_epi16(_mm256_and_si256(uv, low), _mm256_srli_epi16(uv, 8)), _MM_SHUFFLE(3, 1, 2, 0));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(cb + k), _mm256_castsi256_si128(c));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(cr + k), _mm256_extracti128_si256(c, 1));
    }
    input_kernels_sse2()->split422(s + 4 * k, groups - k, y + 2 * k, cb + k, cr + k);
}

void luma422(const uint8_t* s, uint32_t groups, uint8_t* y) {
    const __m256i low = _mm256_set1_epi16(0x00FF);
    uint32_t k = 0;
    for (; k + 16 <= groups; k += 16) {
        const __m256i a = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(s + 4 * k));
        const __m256i b = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(s + 4 * k + 32));
        const __m256i lum = _mm256_packus_epi16(_mm256_and_si256(a, low), _mm256_and_si256(b, low));
        _mm256_storeu_si256(reinterpret_cast<__m256i*>(y + 2 * k), _mm256_permute4x64_epi64(lum, _MM_SHUFFLE(3, 1, 2, 0)));
    }
    input_kernels_sse2()->luma422(s + 4 * k, groups - k, y + 2 * k);
}

// Halving down-scaler: the SSE2 arithmetic on eight groups per step.
void halve422(const uint8_t* s, uint32_t dw, uint32_t* start, uint32_t* finish) {
    const __m256i ones = _mm256_set1_epi16(1), uv_weights = _mm256_set1_epi32(word_pair(2048, 2));
    uint32_t i = 0;
    for (; i + 8 <= dw; i += 8) {
        const __m256i g = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(s + 4 * i));
        const __m256i y = _mm256_madd_epi16(_mm256_and_si256(g, _mm256_set1_epi16(0x00FF)), ones);
        const __m256i sum =
            _mm256_add_epi32(_mm256_slli_epi32(y, 20), _mm256_madd_epi16(_mm256_srli_epi16(g, 8), uv_weights));
        if (start != nullptr) _mm256_storeu_si256(reinterpret_cast<__m256i*>(start + i), sum);
        if (finish != nullptr) {
            __m256i* f = reinterpret_cast<__m256i*>(finish + i);
            _mm256_storeu_si256(f, _mm256_add_epi32(_mm256_loadu_si256(f), sum));
        }
    }
    input_kernels_sse2()->halve422(s + 4 * i, dw - i, start != nullptr ? start + i : nullptr,
                                   finish != nullptr ? finish + i : nullptr);
}

// The low 8 bits of words shifted right (every bit pattern of the caller's
// words gives the portable bytes).
inline __m256i top8(__m256i w, int shift) {
    return _mm256_and_si256(_mm256_srli_epi32(w, shift), _mm256_set1_epi32(0xFF));
}

// Down-scaler row writer: 32 words per step.
void yuv_row(const uint32_t* words, uint32_t count, uint8_t* y, uint8_t* u, uint8_t* v) {
    uint32_t i = 0;
    for (; i + 32 <= count; i += 32) {
        __m256i w[4];
        for (int j = 0; j < 4; ++j) w[j] = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(words + i + 8 * j));
        _mm256_storeu_si256(reinterpret_cast<__m256i*>(y + i),
                            pack32(top8(w[0], 22), top8(w[1], 22), top8(w[2], 22), top8(w[3], 22)));
        if (u == nullptr) continue;
        const __m256i e0 = evens(w[0], w[1]), e1 = evens(w[2], w[3]);
        store_chroma(top8(e0, 12), top8(e1, 12), top8(e0, 2), top8(e1, 2), u + i / 2, v + i / 2);
    }
    input_kernels_sse2()->yuv_row(words + i, count - i, y + i, u != nullptr ? u + i / 2 : nullptr,
                                  v != nullptr ? v + i / 2 : nullptr);
}

// RGB565 averages 2x2 blocks across two rows; the work is in the shifts and
// pair sums, and the SSE2 kernel does it.
void rgb565_blocks(const uint8_t* upper, const uint8_t* lower, uint32_t blocks, uint8_t* y0, uint8_t* y1, uint8_t* cb,
                   uint8_t* cr) {
    input_kernels_sse2()->rgb565_blocks(upper, lower, blocks, y0, y1, cb, cr);
}

const InputKernels kAvx2 = {
    {pick_upper<3, false, kRgb888>, pick_upper<4, false, kRgba8888>, pick_upper<4, true, kBgra8888>},
    {pick_lower<3, false, kRgb888>, pick_lower<4, false, kRgba8888>, pick_lower<4, true, kBgra8888>},
    rgb565_blocks,
    split422,
    luma422,
    halve422,
    yuv_row,
};

}  // namespace

const InputKernels* input_kernels_avx2() { return &kAvx2; }

}  // namespace tekoj

#else

namespace tekoj {
const InputKernels* input_kernels_avx2() { return nullptr; }
}  // namespace tekoj

#endif
