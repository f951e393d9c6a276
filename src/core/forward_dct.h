// Forward DCT with quantisation: the scaled integer AAN transform in 8-bit
// fixed point; the transform's output scale lives in the reciprocal divisors,
// so each coefficient costs one multiply and one shift.
//
// Range facts the fast paths rest on (interval bounds over every sample block
// of 0..255, checked by the equivalence tests): every intermediate of both
// passes, and every column-pass output x, satisfies |x| <= 21914 and so fits
// 16 bits; with a divisor word m <= 65536 the product x * m fits 32 bits
// (|x * m| < 2^31) and the coefficient fits 16 bits.
#pragma once

#include <TekoJEncoderInternal.h>

#include "core/simd_level.h"

#include <cstdint>

namespace tekoj {

namespace dct_detail {

// (x * k) >> 8 with an arithmetic shift: floor of the fixed-point product.
constexpr int32_t mul8(int32_t x, int32_t k) { return (x * k) >> 8; }

// One 8-point pass over in[0], in[step], ... in[7*step]; `shift` is the level
// shift of the row pass (512 twice), 0 for the column pass.
template <int Shift, typename In>
inline void butterfly(const In* in, int step, int32_t* out, int out_step) {
    const int32_t s0 = in[0], s1 = in[step], s2 = in[2 * step], s3 = in[3 * step];
    const int32_t s4 = in[4 * step], s5 = in[5 * step], s6 = in[6 * step], s7 = in[7 * step];
    const int32_t tmp0 = s0 + s7, tmp7 = s0 - s7, tmp1 = s1 + s6, tmp6 = s1 - s6;
    const int32_t tmp2 = s2 + s5, tmp5 = s2 - s5, tmp3 = s3 + s4, tmp4 = s3 - s4;

    const int32_t tmp10 = tmp0 + tmp3, tmp13 = tmp0 - tmp3, tmp11 = tmp1 + tmp2, tmp12 = tmp1 - tmp2;
    out[0] = (tmp10 - Shift) + (tmp11 - Shift);
    out[4 * out_step] = tmp10 - tmp11;
    const int32_t z1 = mul8(tmp12 + tmp13, 181);
    out[2 * out_step] = tmp13 + z1;
    out[6 * out_step] = tmp13 - z1;

    const int32_t t10 = tmp4 + tmp5, t11 = tmp5 + tmp6, t12 = tmp6 + tmp7;
    const int32_t z5 = mul8(t10 - t12, 98);
    const int32_t z2 = z5 + mul8(t10, 139);
    const int32_t z4 = z5 + mul8(t12, 334);
    const int32_t z3 = mul8(t11, 181);
    const int32_t z11 = tmp7 + z3, z13 = tmp7 - z3;
    out[5 * out_step] = z13 + z2;
    out[3 * out_step] = z13 - z2;
    out[1 * out_step] = z11 + z4;
    out[7 * out_step] = z11 - z4;
}

// Positive values truncate, negative ones round to nearest (ties up). Any
// 32-bit divisor word: the product is taken in 64 bits.
inline int16_t quantise_wide(int32_t x, uint32_t divisor) {
    const int64_t p = static_cast<int64_t>(x) * static_cast<int64_t>(divisor);
    return static_cast<int16_t>(x >= 0 ? (p >> 16) : ((p + 32768) >> 16));
}

// The same for divisor words up to 65536, where the product fits 32 bits.
inline int16_t quantise(int32_t x, uint32_t divisor) {
    const int32_t p = x * static_cast<int32_t>(divisor);
    return static_cast<int16_t>((p + ((x >> 31) & 32768)) >> 16);
}

// One block: row pass, column pass, then quant(i, x) for each output x at
// natural index i.
template <typename Quant>
inline void block(const uint8_t* const* rows, uint32_t col, Quant quant, int16_t* out) {
    int32_t work[64];
    for (int y = 0; y < 8; ++y) butterfly<512>(rows[y] + col, 1, work + 8 * y, 1);
    int32_t col_out[64];
    for (int u = 0; u < 8; ++u) butterfly<0>(work + u, 8, col_out + u, 8);
    for (int i = 0; i < 64; ++i) out[i] = quant(i, col_out[i]);
}

}  // namespace dct_detail

// The largest divisor word the transform kernels accept; every table the
// library builds stays within it (65536 / d for an integer d >= 1).
constexpr uint32_t kMaxKernelDivisor = 65536;

// One quantisation table in the forms the kernels use, built per band from
// the 32-bit divisor words: `divisors` itself (portable, NEON), and for the
// 16-bit lanes of SSE2/AVX2 the low half of each word (`mul`) and a mask
// that is all ones where the word is 32768 or more (`wide`): then
// x * m = x * int16(mul) + (x & wide) * 65536. `narrow` tells that every
// word is below 32768 (quantiser steps of 3 and more in the transform's
// scale: every quality up to 97), so `mul` holds the words
// themselves and no lane needs the wide correction.
struct QuantTable {
    const uint32_t* divisors;
    alignas(32) int16_t mul[64];
    alignas(32) int16_t wide[64];
    bool narrow;
};

void prepare_quant_table(const uint32_t* divisors, QuantTable& table);

// Transforms and quantises `count` horizontally adjacent blocks whose
// top-left samples are rows[0][col + 8 b], into count consecutive blocks of 64
// coefficients in natural order. `rows` points at the block row's first row
// pointer. Every divisor word must be at most kMaxKernelDivisor.
using FdctBlocksFn = void (*)(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                              int16_t* out);

// The kernel of a dispatch level (the portable one for levels this build or
// processor lacks), and the one of the process's level.
FdctBlocksFn fdct_blocks_for(SimdLevel level);
FdctBlocksFn fdct_blocks();

void fdct_blocks_portable(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                          int16_t* out);
void fdct_blocks_sse2(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                      int16_t* out);
void fdct_blocks_avx2(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                      int16_t* out);
void fdct_blocks_neon(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                      int16_t* out);

// Quantises `count` blocks of column-pass outputs x (natural order) exactly
// as the transform kernel of `level` does (the portable quantisation for
// levels this build or processor lacks): the tests sweep every 16-bit value
// against every quantiser step through it. Every divisor word must be at
// most kMaxKernelDivisor.
using QuantiseBlocksFn = void (*)(const int16_t* x, uint32_t count, const QuantTable& quant, int16_t* out);
QuantiseBlocksFn quantise_blocks_for(SimdLevel level);

void quantise_blocks_portable(const int16_t* x, uint32_t count, const QuantTable& quant, int16_t* out);
void quantise_blocks_sse2(const int16_t* x, uint32_t count, const QuantTable& quant, int16_t* out);
void quantise_blocks_avx2(const int16_t* x, uint32_t count, const QuantTable& quant, int16_t* out);
void quantise_blocks_neon(const int16_t* x, uint32_t count, const QuantTable& quant, int16_t* out);

}  // namespace tekoj
