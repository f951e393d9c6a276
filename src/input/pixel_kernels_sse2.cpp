// SSE2 row kernels of the input readers (every x86-64 processor has SSE2).
//
// Colour conversion works on one pixel per 32-bit lane: the mask 0x00FF00FF
// leaves the pixel's bytes 0 and 2 as two 16-bit words and a 16-bit shift
// leaves byte 1 (and byte 3, weighted 0), so two pmaddwd give the exact
// 32-bit sum of the three weighted channels. Nothing is rounded: the sums
// are those of the portable code, shifted the same way.
#include "input/pixel_kernels.h"

#if defined(__x86_64__) || defined(__i386__)

#include <emmintrin.h>

#include <cstddef>
#include <cstring>

namespace tekoj {
namespace {

// pmaddwd weights of one output for pixel bytes (c0, c2) and (c1, c3).
struct Dot {
    __m128i w02, w1;
};

// The three outputs' weights for a layout whose bytes 0, 1, 2 hold the
// channels with weights (a0, a1, a2) of each of Y, Cb and Cr.
struct Weights {
    Dot y, cb, cr;
};

Weights weights_for(bool bgr) {
    auto dot = [bgr](int32_t wr, int32_t wg, int32_t wb) {
        return Dot{_mm_set1_epi32(bgr ? word_pair(wb, wr) : word_pair(wr, wb)), _mm_set1_epi32(word_pair(wg, 0))};
    };
    return {dot(rgb::kYr, rgb::kYg, rgb::kYb), dot(rgb::kCbR, rgb::kCbG, rgb::kCbB),
            dot(rgb::kCrR, rgb::kCrG, rgb::kCrB)};
}

inline __m128i dot(__m128i lo, __m128i hi, const Dot& d) {
    return _mm_add_epi32(_mm_madd_epi16(lo, d.w02), _mm_madd_epi16(hi, d.w1));
}

// Four pixels' channel bytes 0 and 2 (lo) and 1 (hi) as 16-bit words.
struct Split {
    __m128i lo, hi;
};

inline Split split(__m128i px) { return {_mm_and_si128(px, _mm_set1_epi32(0x00FF00FF)), _mm_srli_epi16(px, 8)}; }

inline __m128i load4(const uint8_t* p) {
    uint32_t v;
    std::memcpy(&v, p, 4);
    return _mm_cvtsi32_si128(static_cast<int>(v));
}

// Four pixels as 32-bit lanes. Three-byte pixels are read four bytes each,
// so the fourth byte belongs to the next pixel (weighted 0); callers keep
// one byte of the row beyond the block.
template <int Bpp>
inline __m128i pixels4(const uint8_t* p) {
    if constexpr (Bpp == 4) {
        return _mm_loadu_si128(reinterpret_cast<const __m128i*>(p));
    } else {
        const __m128i a = _mm_unpacklo_epi32(load4(p), load4(p + 3));
        const __m128i b = _mm_unpacklo_epi32(load4(p + 6), load4(p + 9));
        return _mm_unpacklo_epi64(a, b);
    }
}

// Pixels a block of 16 may span: 16 whole pixels, plus the byte a
// three-byte load reads beyond the last one.
template <int Bpp>
constexpr uint32_t kBlockSpan = Bpp == 4 ? 16 : 17;

inline __m128i luma4(const Split& s, const Weights& w) { return _mm_srli_epi32(dot(s.lo, s.hi, w.y), 12); }

inline __m128i pack16(__m128i a, __m128i b, __m128i c, __m128i d) {
    return _mm_packus_epi16(_mm_packs_epi32(a, b), _mm_packs_epi32(c, d));
}

inline __m128i chroma4(__m128i lo, __m128i hi, const Dot& d) {
    return _mm_srli_epi32(_mm_add_epi32(dot(lo, hi, d), _mm_set1_epi32(rgb::kChromaBias)), 12);
}

// The even lanes of two four-pixel vectors, in order.
inline __m128i evens(__m128i a, __m128i b) {
    return _mm_castps_si128(_mm_shuffle_ps(_mm_castsi128_ps(a), _mm_castsi128_ps(b), _MM_SHUFFLE(2, 0, 2, 0)));
}

template <int Bpp, bool Bgr, PickLayout Layout>
void pick_upper(const uint8_t* src, uint32_t w, uint8_t* y, uint8_t* cb, uint8_t* cr) {
    const Weights wt = weights_for(Bgr);
    uint32_t x = 0;
    for (; x + kBlockSpan<Bpp> <= w; x += 16) {
        const uint8_t* p = src + static_cast<size_t>(x) * Bpp;
        Split s[4];
        for (int i = 0; i < 4; ++i) s[i] = split(pixels4<Bpp>(p + 4 * i * Bpp));
        const __m128i lum = pack16(luma4(s[0], wt), luma4(s[1], wt), luma4(s[2], wt), luma4(s[3], wt));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(y + x), lum);
        const __m128i lo0 = evens(s[0].lo, s[1].lo), lo1 = evens(s[2].lo, s[3].lo);
        const __m128i hi0 = evens(s[0].hi, s[1].hi), hi1 = evens(s[2].hi, s[3].hi);
        const __m128i b16 = _mm_packs_epi32(chroma4(lo0, hi0, wt.cb), chroma4(lo1, hi1, wt.cb));
        const __m128i r16 = _mm_packs_epi32(chroma4(lo0, hi0, wt.cr), chroma4(lo1, hi1, wt.cr));
        const __m128i c8 = _mm_packus_epi16(b16, r16);
        _mm_storel_epi64(reinterpret_cast<__m128i*>(cb + x / 2), c8);
        _mm_storel_epi64(reinterpret_cast<__m128i*>(cr + x / 2), _mm_srli_si128(c8, 8));
    }
    kPortableInputKernels.pick_upper[Layout](src + static_cast<size_t>(x) * Bpp, w - x, y + x, cb + x / 2, cr + x / 2);
}

template <int Bpp, bool Bgr, PickLayout Layout>
void pick_lower(const uint8_t* src, uint32_t w, uint8_t* y) {
    const Weights wt = weights_for(Bgr);
    uint32_t x = 0;
    for (; x + kBlockSpan<Bpp> <= w; x += 16) {
        const uint8_t* p = src + static_cast<size_t>(x) * Bpp;
        __m128i l[4];
        for (int i = 0; i < 4; ++i) l[i] = luma4(split(pixels4<Bpp>(p + 4 * i * Bpp)), wt);
        _mm_storeu_si128(reinterpret_cast<__m128i*>(y + x), pack16(l[0], l[1], l[2], l[3]));
    }
    kPortableInputKernels.pick_lower[Layout](src + static_cast<size_t>(x) * Bpp, w - x, y + x);
}

// RGB565: eight pixels per vector, channels expanded in 16-bit lanes, then
// paired into 32-bit lanes for pmaddwd.
struct Channels {
    __m128i r, g, b;
};

inline Channels expand565(__m128i p) {
    const __m128i r = _mm_add_epi16(_mm_and_si128(_mm_srli_epi16(p, 8), _mm_set1_epi16(0xF8)), _mm_set1_epi16(4));
    const __m128i g = _mm_add_epi16(_mm_and_si128(_mm_srli_epi16(p, 3), _mm_set1_epi16(0xFC)), _mm_set1_epi16(2));
    const __m128i b = _mm_add_epi16(_mm_and_si128(_mm_slli_epi16(p, 3), _mm_set1_epi16(0xF8)), _mm_set1_epi16(4));
    return {r, g, b};
}

// Y of eight pixels as eight 16-bit words.
inline __m128i luma8(const Channels& c, const Weights& wt) {
    const __m128i zero = _mm_setzero_si128();
    const __m128i lo = dot(_mm_unpacklo_epi16(c.r, c.b), _mm_unpacklo_epi16(c.g, zero), wt.y);
    const __m128i hi = dot(_mm_unpackhi_epi16(c.r, c.b), _mm_unpackhi_epi16(c.g, zero), wt.y);
    return _mm_packs_epi32(_mm_srli_epi32(lo, 12), _mm_srli_epi32(hi, 12));
}

// Sums of horizontal pairs of a 16-bit channel, one per 32-bit lane, with
// `round` added before the division by 4.
inline __m128i pair_average(__m128i upper, __m128i lower, int16_t round) {
    const __m128i s = _mm_add_epi16(upper, lower);
    const __m128i pairs = _mm_add_epi16(s, _mm_srli_epi32(s, 16));
    return _mm_and_si128(_mm_srli_epi16(_mm_add_epi16(pairs, _mm_set1_epi16(round)), 2), _mm_set1_epi32(0xFFFF));
}

void rgb565_blocks(const uint8_t* upper, const uint8_t* lower, uint32_t blocks, uint8_t* y0, uint8_t* y1, uint8_t* cb,
                   uint8_t* cr) {
    const Weights wt = weights_for(false);
    uint32_t k = 0;
    for (; k + 8 <= blocks; k += 8) {
        Channels u[2], l[2];
        __m128i cbv[2], crv[2];
        for (int h = 0; h < 2; ++h) {
            u[h] = expand565(_mm_loadu_si128(reinterpret_cast<const __m128i*>(upper + 4 * k + 16 * h)));
            l[h] = expand565(_mm_loadu_si128(reinterpret_cast<const __m128i*>(lower + 4 * k + 16 * h)));
            const __m128i ra = pair_average(u[h].r, l[h].r, 0);
            const __m128i ga = pair_average(u[h].g, l[h].g, 2);
            const __m128i ba = pair_average(u[h].b, l[h].b, 0);
            const __m128i lo = _mm_or_si128(ra, _mm_slli_epi32(ba, 16));
            cbv[h] = chroma4(lo, ga, wt.cb);
            crv[h] = chroma4(lo, ga, wt.cr);
        }
        _mm_storeu_si128(reinterpret_cast<__m128i*>(y0 + 2 * k),
                         _mm_packus_epi16(luma8(u[0], wt), luma8(u[1], wt)));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(y1 + 2 * k),
                         _mm_packus_epi16(luma8(l[0], wt), luma8(l[1], wt)));
        const __m128i c8 = _mm_packus_epi16(_mm_packs_epi32(cbv[0], cbv[1]), _mm_packs_epi32(crv[0], crv[1]));
        _mm_storel_epi64(reinterpret_cast<__m128i*>(cb + k), c8);
        _mm_storel_epi64(reinterpret_cast<__m128i*>(cr + k), _mm_srli_si128(c8, 8));
    }
    kPortableInputKernels.rgb565_blocks(upper + 4 * k, lower + 4 * k, blocks - k, y0 + 2 * k, y1 + 2 * k, cb + k,
                                        cr + k);
}

// Packed 4:2:2: eight groups (32 bytes) per step. Y sits in the even bytes,
// U and V alternate in the odd ones.
void split422(const uint8_t* s, uint32_t groups, uint8_t* y, uint8_t* cb, uint8_t* cr) {
    const __m128i low = _mm_set1_epi16(0x00FF);
    uint32_t k = 0;
    for (; k + 8 <= groups; k += 8) {
        const __m128i a = _mm_loadu_si128(reinterpret_cast<const __m128i*>(s + 4 * k));
        const __m128i b = _mm_loadu_si128(reinterpret_cast<const __m128i*>(s + 4 * k + 16));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(y + 2 * k),
                         _mm_packus_epi16(_mm_and_si128(a, low), _mm_and_si128(b, low)));
        const __m128i uv = _mm_packus_epi16(_mm_srli_epi16(a, 8), _mm_srli_epi16(b, 8));
        const __m128i c8 = _mm_packus_epi16(_mm_and_si128(uv, low), _mm_srli_epi16(uv, 8));
        _mm_storel_epi64(reinterpret_cast<__m128i*>(cb + k), c8);
        _mm_storel_epi64(reinterpret_cast<__m128i*>(cr + k), _mm_srli_si128(c8, 8));
    }
    kPortableInputKernels.split422(s + 4 * k, groups - k, y + 2 * k, cb + k, cr + k);
}

void luma422(const uint8_t* s, uint32_t groups, uint8_t* y) {
    const __m128i low = _mm_set1_epi16(0x00FF);
    uint32_t k = 0;
    for (; k + 8 <= groups; k += 8) {
        const __m128i a = _mm_loadu_si128(reinterpret_cast<const __m128i*>(s + 4 * k));
        const __m128i b = _mm_loadu_si128(reinterpret_cast<const __m128i*>(s + 4 * k + 16));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(y + 2 * k),
                         _mm_packus_epi16(_mm_and_si128(a, low), _mm_and_si128(b, low)));
    }
    kPortableInputKernels.luma422(s + 4 * k, groups - k, y + 2 * k);
}

// Halving down-scaler: four groups per 16 bytes. The words (Y0, Y1) of each
// group add by pmaddwd with (1, 1); (U, V) weighted (2048, 2) give 2U << 10
// plus 2V.
void halve422(const uint8_t* s, uint32_t dw, uint32_t* start, uint32_t* finish) {
    const __m128i ones = _mm_set1_epi16(1), uv_weights = _mm_set1_epi32(word_pair(2048, 2));
    uint32_t i = 0;
    for (; i + 4 <= dw; i += 4) {
        const __m128i g = _mm_loadu_si128(reinterpret_cast<const __m128i*>(s + 4 * i));
        const __m128i y = _mm_madd_epi16(_mm_and_si128(g, _mm_set1_epi16(0x00FF)), ones);
        const __m128i sum = _mm_add_epi32(_mm_slli_epi32(y, 20), _mm_madd_epi16(_mm_srli_epi16(g, 8), uv_weights));
        if (start != nullptr) _mm_storeu_si128(reinterpret_cast<__m128i*>(start + i), sum);
        if (finish != nullptr) {
            __m128i* f = reinterpret_cast<__m128i*>(finish + i);
            _mm_storeu_si128(f, _mm_add_epi32(_mm_loadu_si128(f), sum));
        }
    }
    kPortableInputKernels.halve422(s + 4 * i, dw - i, start != nullptr ? start + i : nullptr,
                                   finish != nullptr ? finish + i : nullptr);
}

// The low 8 bits of words shifted right: the top 8 of a 10-bit field.
inline __m128i top8(__m128i w, int shift) { return _mm_and_si128(_mm_srli_epi32(w, shift), _mm_set1_epi32(0xFF)); }

// Down-scaler row writer. The words come from the caller too, so every bit
// pattern must give the portable bytes: each value is masked, not saturated.
void yuv_row(const uint32_t* words, uint32_t count, uint8_t* y, uint8_t* u, uint8_t* v) {
    uint32_t i = 0;
    for (; i + 16 <= count; i += 16) {
        __m128i w[4];
        for (int j = 0; j < 4; ++j) w[j] = _mm_loadu_si128(reinterpret_cast<const __m128i*>(words + i + 4 * j));
        _mm_storeu_si128(reinterpret_cast<__m128i*>(y + i),
                         pack16(top8(w[0], 22), top8(w[1], 22), top8(w[2], 22), top8(w[3], 22)));
        if (u == nullptr) continue;
        const __m128i e0 = evens(w[0], w[1]), e1 = evens(w[2], w[3]);
        const __m128i uv = pack16(top8(e0, 12), top8(e1, 12), top8(e0, 2), top8(e1, 2));
        _mm_storel_epi64(reinterpret_cast<__m128i*>(u + i / 2), uv);
        _mm_storel_epi64(reinterpret_cast<__m128i*>(v + i / 2), _mm_srli_si128(uv, 8));
    }
    kPortableInputKernels.yuv_row(words + i, count - i, y + i, u != nullptr ? u + i / 2 : nullptr,
                                  v != nullptr ? v + i / 2 : nullptr);
}

const InputKernels kSse2 = {
    {pick_upper<3, false, kRgb888>, pick_upper<4, false, kRgba8888>, pick_upper<4, true, kBgra8888>},
    {pick_lower<3, false, kRgb888>, pick_lower<4, false, kRgba8888>, pick_lower<4, true, kBgra8888>},
    rgb565_blocks,
    split422,
    luma422,
    halve422,
    yuv_row,
};

}  // namespace

const InputKernels* input_kernels_sse2() { return &kSse2; }

}  // namespace tekoj

#else

namespace tekoj {
const InputKernels* input_kernels_sse2() { return nullptr; }
}  // namespace tekoj

#endif
