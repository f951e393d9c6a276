// Forward transform with quantisation, NEON: one block per pass on 16-bit
// lanes. The eight sample rows are transposed as bytes, so the row pass
// starts with widening adds and subtracts; the fixed-point products are
// exact: vqdmulh(x, k << 7) is (2 x k 128) >> 16 = (x k) >> 8, and
// 334 = 256 + 78 adds x to the product by 78. Every constant sits in one
// register loaded once per call (multiplies by a lane), which keeps GCC from
// rebuilding scalar-duplicated constants through the stack inside the loop.
#if defined(__ARM_NEON) || defined(__ARM_NEON__)
#include "core/forward_dct.h"

#include <arm_neon.h>

namespace tekoj {
namespace {

// Lanes: 181, 98, 139 and 78 in the vqdmulh scale, then the quantisation's
// negative bias factor and the level shift.
alignas(16) constexpr int16_t kConstants[8] = {181 << 7, 98 << 7, 139 << 7, 78 << 7, -32768, 1024, 0, 0};

inline void transpose_bytes(uint8x8_t (&r)[8]) {
    const uint8x8x2_t a01 = vtrn_u8(r[0], r[1]), a23 = vtrn_u8(r[2], r[3]);
    const uint8x8x2_t a45 = vtrn_u8(r[4], r[5]), a67 = vtrn_u8(r[6], r[7]);
    const uint16x4x2_t b02 = vtrn_u16(vreinterpret_u16_u8(a01.val[0]), vreinterpret_u16_u8(a23.val[0]));
    const uint16x4x2_t b13 = vtrn_u16(vreinterpret_u16_u8(a01.val[1]), vreinterpret_u16_u8(a23.val[1]));
    const uint16x4x2_t b46 = vtrn_u16(vreinterpret_u16_u8(a45.val[0]), vreinterpret_u16_u8(a67.val[0]));
    const uint16x4x2_t b57 = vtrn_u16(vreinterpret_u16_u8(a45.val[1]), vreinterpret_u16_u8(a67.val[1]));
    const uint32x2x2_t c04 = vtrn_u32(vreinterpret_u32_u16(b02.val[0]), vreinterpret_u32_u16(b46.val[0]));
    const uint32x2x2_t c15 = vtrn_u32(vreinterpret_u32_u16(b13.val[0]), vreinterpret_u32_u16(b57.val[0]));
    const uint32x2x2_t c26 = vtrn_u32(vreinterpret_u32_u16(b02.val[1]), vreinterpret_u32_u16(b46.val[1]));
    const uint32x2x2_t c37 = vtrn_u32(vreinterpret_u32_u16(b13.val[1]), vreinterpret_u32_u16(b57.val[1]));
    r[0] = vreinterpret_u8_u32(c04.val[0]);
    r[4] = vreinterpret_u8_u32(c04.val[1]);
    r[1] = vreinterpret_u8_u32(c15.val[0]);
    r[5] = vreinterpret_u8_u32(c15.val[1]);
    r[2] = vreinterpret_u8_u32(c26.val[0]);
    r[6] = vreinterpret_u8_u32(c26.val[1]);
    r[3] = vreinterpret_u8_u32(c37.val[0]);
    r[7] = vreinterpret_u8_u32(c37.val[1]);
}

inline void transpose8(int16x8_t (&d)[8]) {
    const int16x8x2_t t01 = vtrnq_s16(d[0], d[1]), t23 = vtrnq_s16(d[2], d[3]);
    const int16x8x2_t t45 = vtrnq_s16(d[4], d[5]), t67 = vtrnq_s16(d[6], d[7]);
    const int32x4x2_t u02 = vtrnq_s32(vreinterpretq_s32_s16(t01.val[0]), vreinterpretq_s32_s16(t23.val[0]));
    const int32x4x2_t u13 = vtrnq_s32(vreinterpretq_s32_s16(t01.val[1]), vreinterpretq_s32_s16(t23.val[1]));
    const int32x4x2_t u46 = vtrnq_s32(vreinterpretq_s32_s16(t45.val[0]), vreinterpretq_s32_s16(t67.val[0]));
    const int32x4x2_t u57 = vtrnq_s32(vreinterpretq_s32_s16(t45.val[1]), vreinterpretq_s32_s16(t67.val[1]));
    auto join = [](int32x4_t a, int32x4_t b, bool high) {
        return vreinterpretq_s16_s32(high ? vcombine_s32(vget_high_s32(a), vget_high_s32(b))
                                          : vcombine_s32(vget_low_s32(a), vget_low_s32(b)));
    };
    d[0] = join(u02.val[0], u46.val[0], false);
    d[4] = join(u02.val[0], u46.val[0], true);
    d[2] = join(u02.val[1], u46.val[1], false);
    d[6] = join(u02.val[1], u46.val[1], true);
    d[1] = join(u13.val[0], u57.val[0], false);
    d[5] = join(u13.val[0], u57.val[0], true);
    d[3] = join(u13.val[1], u57.val[1], false);
    d[7] = join(u13.val[1], u57.val[1], true);
}

// The butterfly after its first stage: tmp[k] for k = 0..3 are the sums
// s_k + s_{7-k}, tmp[7-k] the differences. `k` holds the multipliers.
inline void butterfly_rest(const int16x8_t (&tmp)[8], int16x4_t k, int16x8_t (&d)[8]) {
    const int16x8_t tmp10 = vaddq_s16(tmp[0], tmp[3]), tmp13 = vsubq_s16(tmp[0], tmp[3]);
    const int16x8_t tmp11 = vaddq_s16(tmp[1], tmp[2]), tmp12 = vsubq_s16(tmp[1], tmp[2]);
    d[0] = vaddq_s16(tmp10, tmp11);
    d[4] = vsubq_s16(tmp10, tmp11);
    const int16x8_t z1 = vqdmulhq_lane_s16(vaddq_s16(tmp12, tmp13), k, 0);
    d[2] = vaddq_s16(tmp13, z1);
    d[6] = vsubq_s16(tmp13, z1);
    const int16x8_t t10 = vaddq_s16(tmp[4], tmp[5]), t11 = vaddq_s16(tmp[5], tmp[6]);
    const int16x8_t t12 = vaddq_s16(tmp[6], tmp[7]);
    const int16x8_t z5 = vqdmulhq_lane_s16(vsubq_s16(t10, t12), k, 1);
    const int16x8_t z2 = vaddq_s16(z5, vqdmulhq_lane_s16(t10, k, 2));
    const int16x8_t z4 = vaddq_s16(vaddq_s16(z5, t12), vqdmulhq_lane_s16(t12, k, 3));
    const int16x8_t z3 = vqdmulhq_lane_s16(t11, k, 0);
    const int16x8_t z11 = vaddq_s16(tmp[7], z3), z13 = vsubq_s16(tmp[7], z3);
    d[5] = vaddq_s16(z13, z2);
    d[3] = vsubq_s16(z13, z2);
    d[1] = vaddq_s16(z11, z4);
    d[7] = vsubq_s16(z11, z4);
}

// Divisor words below 32768, on 16-bit lanes: with A = vqdmulh(x, m) =
// floor(x m / 32768) (no saturation, as m > 0), nested floors give
//   x >= 0: floor(x m / 65536) = A >> 1,
//   x <  0: floor((x m + 32768) / 65536) = (A + 1) >> 1,
// that is (A - sign) >> 1 with the sign mask (-1 or 0): one halving subtract.
inline int16x8_t quantise8_narrow(int16x8_t x, const int16_t* m) {
    return vhsubq_s16(vqdmulhq_s16(x, vld1q_s16(m)), vshrq_n_s16(x, 15));
}

// Any divisor word up to 65536: the multiply in 32-bit lanes.
inline int16x4_t quantise4_wide(int16x4_t x, const uint32_t* m, int16x4_t c) {
    int32x4_t p = vmulq_s32(vmovl_s16(x), vreinterpretq_s32_u32(vld1q_u32(m)));
    p = vmlal_lane_s16(p, vshr_n_s16(x, 15), c, 0);
    return vshrn_n_s32(p, 16);
}

template <bool Narrow>
inline int16x8_t quantise_row(int16x8_t x, const QuantTable& quant, int v, int16x4_t c) {
    if constexpr (Narrow) return quantise8_narrow(x, quant.mul + 8 * v);
    const uint32_t* m = quant.divisors + 8 * v;
    return vcombine_s16(quantise4_wide(vget_low_s16(x), m, c), quantise4_wide(vget_high_s16(x), m + 4, c));
}

template <bool Narrow>
void blocks(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant, int16_t* out) {
    const int16x8_t constants = vld1q_s16(kConstants);
    const int16x4_t k = vget_low_s16(constants), c = vget_high_s16(constants);
    for (uint32_t b = 0; b < count; ++b, col += 8, out += 64) {
        uint8x8_t r[8];
        for (int y = 0; y < 8; ++y) r[y] = vld1_u8(rows[y] + col);
        transpose_bytes(r);  // r[u]: column u, one lane per row
        int16x8_t tmp[8], d[8];
        for (int i = 0; i < 4; ++i) {
            tmp[i] = vreinterpretq_s16_u16(vaddl_u8(r[i], r[7 - i]));
            tmp[7 - i] = vreinterpretq_s16_u16(vsubl_u8(r[i], r[7 - i]));
        }
        butterfly_rest(tmp, k, d);
        d[0] = vsubq_s16(d[0], vdupq_lane_s16(c, 1));
        transpose8(d);  // d[y]: row y of the row pass's outputs
        for (int i = 0; i < 4; ++i) {
            tmp[i] = vaddq_s16(d[i], d[7 - i]);
            tmp[7 - i] = vsubq_s16(d[i], d[7 - i]);
        }
        butterfly_rest(tmp, k, d);
        for (int v = 0; v < 8; ++v) vst1q_s16(out + 8 * v, quantise_row<Narrow>(d[v], quant, v, c));
    }
}

template <bool Narrow>
void quantise_rows(const int16_t* x, uint32_t count, const QuantTable& quant, int16_t* out) {
    const int16x4_t c = vget_high_s16(vld1q_s16(kConstants));
    for (uint32_t i = 0; i < 8 * count; ++i)
        vst1q_s16(out + 8 * i, quantise_row<Narrow>(vld1q_s16(x + 8 * i), quant, static_cast<int>(i % 8), c));
}

}  // namespace

void fdct_blocks_neon(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                      int16_t* out) {
    if (quant.narrow)
        blocks<true>(rows, col, count, quant, out);
    else
        blocks<false>(rows, col, count, quant, out);
}

void quantise_blocks_neon(const int16_t* x, uint32_t count, const QuantTable& quant, int16_t* out) {
    if (quant.narrow)
        quantise_rows<true>(x, count, quant, out);
    else
        quantise_rows<false>(x, count, quant, out);
}

}  // namespace tekoj
#endif
