// Forward DCT with quantisation: the scaled integer AAN transform in 8-bit
// fixed point; the transform's output scale lives in the reciprocal divisors,
// so each coefficient costs one multiply and one shift.
#pragma once

#include <TekoJEncoderInternal.h>

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

// Positive values truncate, negative ones round to nearest (ties up).
inline int16_t quantise(int32_t x, uint32_t divisor) {
    const int64_t p = static_cast<int64_t>(x) * static_cast<int64_t>(divisor);
    return static_cast<int16_t>(x >= 0 ? (p >> 16) : ((p + 32768) >> 16));
}

}  // namespace dct_detail

// Transforms and quantises the 8x8 block whose top-left sample is
// rows[row][col], into 64 coefficients in natural order.
inline void forward_dct_block(uint8_t* const* rows, uint32_t row, uint32_t col, const uint32_t* divisors,
                              int16_t* out) {
    int32_t work[64];
    for (int y = 0; y < 8; ++y) dct_detail::butterfly<512>(rows[row + y] + col, 1, work + 8 * y, 1);
    int32_t col_out[64];
    for (int u = 0; u < 8; ++u) dct_detail::butterfly<0>(work + u, 8, col_out + u, 8);
    for (int i = 0; i < 64; ++i) out[i] = dct_detail::quantise(col_out[i], divisors[i]);
}

}  // namespace tekoj
