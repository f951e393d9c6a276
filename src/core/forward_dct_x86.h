// The forward transform on 16-bit lanes for SSE2 (one block per 128-bit
// register set) and AVX2 (two horizontally adjacent blocks, one per 128-bit
// lane: every shuffle used here stays within a lane). Included only by the
// per-target files, inside their instruction-set guard; the anonymous
// namespace keeps each file's copy its own.
//
// Exactness: all intermediates fit 16 bits (see forward_dct.h), so 16-bit
// adds never wrap, and the fixed-point products are taken exactly with the
// signed high multiply: (x * k) >> 8 = mulhi(x, k << 8), and for k << 8 beyond
// 32767, mulhi(x, (k << 8) - 65536) + x; 334 = 256 + 78 gives x + mulhi(x, 78 << 8).
#pragma once

#include "core/forward_dct.h"

#include <immintrin.h>

namespace tekoj {
namespace {

inline __m128i add16(__m128i a, __m128i b) { return _mm_add_epi16(a, b); }
inline __m128i sub16(__m128i a, __m128i b) { return _mm_sub_epi16(a, b); }
inline __m128i mulhi16(__m128i a, __m128i b) { return _mm_mulhi_epi16(a, b); }
inline __m128i mullo16(__m128i a, __m128i b) { return _mm_mullo_epi16(a, b); }
inline __m128i and_(__m128i a, __m128i b) { return _mm_and_si128(a, b); }
inline __m128i srai15(__m128i a) { return _mm_srai_epi16(a, 15); }
inline __m128i splat16(__m128i, int16_t v) { return _mm_set1_epi16(v); }
inline __m128i unpacklo16(__m128i a, __m128i b) { return _mm_unpacklo_epi16(a, b); }
inline __m128i unpackhi16(__m128i a, __m128i b) { return _mm_unpackhi_epi16(a, b); }
inline __m128i unpacklo32(__m128i a, __m128i b) { return _mm_unpacklo_epi32(a, b); }
inline __m128i unpackhi32(__m128i a, __m128i b) { return _mm_unpackhi_epi32(a, b); }
inline __m128i unpacklo64(__m128i a, __m128i b) { return _mm_unpacklo_epi64(a, b); }
inline __m128i unpackhi64(__m128i a, __m128i b) { return _mm_unpackhi_epi64(a, b); }

#ifdef __AVX2__
inline __m256i add16(__m256i a, __m256i b) { return _mm256_add_epi16(a, b); }
inline __m256i sub16(__m256i a, __m256i b) { return _mm256_sub_epi16(a, b); }
inline __m256i mulhi16(__m256i a, __m256i b) { return _mm256_mulhi_epi16(a, b); }
inline __m256i mullo16(__m256i a, __m256i b) { return _mm256_mullo_epi16(a, b); }
inline __m256i and_(__m256i a, __m256i b) { return _mm256_and_si256(a, b); }
inline __m256i srai15(__m256i a) { return _mm256_srai_epi16(a, 15); }
inline __m256i splat16(__m256i, int16_t v) { return _mm256_set1_epi16(v); }
inline __m256i unpacklo16(__m256i a, __m256i b) { return _mm256_unpacklo_epi16(a, b); }
inline __m256i unpackhi16(__m256i a, __m256i b) { return _mm256_unpackhi_epi16(a, b); }
inline __m256i unpacklo32(__m256i a, __m256i b) { return _mm256_unpacklo_epi32(a, b); }
inline __m256i unpackhi32(__m256i a, __m256i b) { return _mm256_unpackhi_epi32(a, b); }
inline __m256i unpacklo64(__m256i a, __m256i b) { return _mm256_unpacklo_epi64(a, b); }
inline __m256i unpackhi64(__m256i a, __m256i b) { return _mm256_unpackhi_epi64(a, b); }
#endif

// 8x8 transpose of 16-bit values held as eight registers (per 128-bit lane).
template <typename V>
inline void transpose8(V (&d)[8]) {
    const V t0 = unpacklo16(d[0], d[1]), t1 = unpackhi16(d[0], d[1]);
    const V t2 = unpacklo16(d[2], d[3]), t3 = unpackhi16(d[2], d[3]);
    const V t4 = unpacklo16(d[4], d[5]), t5 = unpackhi16(d[4], d[5]);
    const V t6 = unpacklo16(d[6], d[7]), t7 = unpackhi16(d[6], d[7]);
    const V u0 = unpacklo32(t0, t2), u1 = unpackhi32(t0, t2), u2 = unpacklo32(t1, t3), u3 = unpackhi32(t1, t3);
    const V u4 = unpacklo32(t4, t6), u5 = unpackhi32(t4, t6), u6 = unpacklo32(t5, t7), u7 = unpackhi32(t5, t7);
    d[0] = unpacklo64(u0, u4);
    d[1] = unpackhi64(u0, u4);
    d[2] = unpacklo64(u1, u5);
    d[3] = unpackhi64(u1, u5);
    d[4] = unpacklo64(u2, u6);
    d[5] = unpackhi64(u2, u6);
    d[6] = unpacklo64(u3, u7);
    d[7] = unpackhi64(u3, u7);
}

// The 8-point butterfly across registers: d[k] holds input k of every lane's
// transform and receives output k. LevelShift subtracts 1024 from output 0.
template <bool LevelShift, typename V>
inline void butterfly8(V (&d)[8]) {
    const V k98 = splat16(d[0], 98 << 8), k139 = splat16(d[0], static_cast<int16_t>((139 << 8) - 65536));
    const V k181 = splat16(d[0], static_cast<int16_t>((181 << 8) - 65536)), k78 = splat16(d[0], 78 << 8);
    const V tmp0 = add16(d[0], d[7]), tmp7 = sub16(d[0], d[7]), tmp1 = add16(d[1], d[6]), tmp6 = sub16(d[1], d[6]);
    const V tmp2 = add16(d[2], d[5]), tmp5 = sub16(d[2], d[5]), tmp3 = add16(d[3], d[4]), tmp4 = sub16(d[3], d[4]);
    const V tmp10 = add16(tmp0, tmp3), tmp13 = sub16(tmp0, tmp3), tmp11 = add16(tmp1, tmp2), tmp12 = sub16(tmp1, tmp2);
    d[0] = add16(tmp10, tmp11);
    if (LevelShift) d[0] = sub16(d[0], splat16(d[0], 1024));
    d[4] = sub16(tmp10, tmp11);
    const V s1213 = add16(tmp12, tmp13);
    const V z1 = add16(mulhi16(s1213, k181), s1213);
    d[2] = add16(tmp13, z1);
    d[6] = sub16(tmp13, z1);
    const V t10 = add16(tmp4, tmp5), t11 = add16(tmp5, tmp6), t12 = add16(tmp6, tmp7);
    const V z5 = mulhi16(sub16(t10, t12), k98);
    const V z2 = add16(z5, add16(mulhi16(t10, k139), t10));
    const V z4 = add16(z5, add16(mulhi16(t12, k78), t12));
    const V z3 = add16(mulhi16(t11, k181), t11);
    const V z11 = add16(tmp7, z3), z13 = sub16(tmp7, z3);
    d[5] = add16(z13, z2);
    d[3] = sub16(z13, z2);
    d[1] = add16(z11, z4);
    d[7] = sub16(z11, z4);
}

// Coefficient from column-pass output x and divisor word m, on 16-bit lanes:
// with p = x * m = x * mul + (x & wide) * 65536 (see QuantTable),
//   x >= 0: p >> 16 = mulhi(x, mul) + (x & wide);
//   x <  0: (p + 32768) >> 16 adds one more exactly when the low half of p
//           has its top bit set, i.e. subtracts (lo & x) >> 15.
template <typename V>
inline V quantise16(V x, V mul, V wide) {
    const V hi = add16(mulhi16(x, mul), and_(x, wide));
    return sub16(hi, srai15(and_(mullo16(x, mul), x)));
}

// Both passes over d (rows of samples, level shift included) leaving the
// coefficient rows v = 0..7 in d[v], not yet quantised.
template <typename V>
inline void transform8x8(V (&d)[8]) {
    transpose8(d);
    butterfly8<true>(d);
    transpose8(d);
    butterfly8<false>(d);
}

// Quantisation of one row v of a block on 128-bit registers.
inline __m128i quantise_row_128(__m128i x, const QuantTable& quant, int v) {
    const __m128i mul = _mm_load_si128(reinterpret_cast<const __m128i*>(quant.mul + 8 * v));
    const __m128i wide = _mm_load_si128(reinterpret_cast<const __m128i*>(quant.wide + 8 * v));
    return quantise16(x, mul, wide);
}

// One block on 128-bit registers.
inline void fdct_block_128(const uint8_t* const* rows, uint32_t col, const QuantTable& quant, int16_t* out) {
    const __m128i zero = _mm_setzero_si128();
    __m128i d[8];
    for (int y = 0; y < 8; ++y)
        d[y] = _mm_unpacklo_epi8(_mm_loadl_epi64(reinterpret_cast<const __m128i*>(rows[y] + col)), zero);
    transform8x8(d);
    for (int v = 0; v < 8; ++v)
        _mm_storeu_si128(reinterpret_cast<__m128i*>(out + 8 * v), quantise_row_128(d[v], quant, v));
}

}  // namespace
}  // namespace tekoj
