// Forward transform with quantisation, NEON: one block per pass on 16-bit
// lanes. The fixed-point products are exact: vqdmulh(x, k << 7) is
// (2 x k 128) >> 16 = (x k) >> 8, and 334 = 256 + 78 adds x to the product
// by 78. The quantisation product fits 32 bits (forward_dct.h).
#if defined(__ARM_NEON) || defined(__ARM_NEON__)
#include "core/forward_dct.h"

#include <arm_neon.h>

namespace tekoj {
namespace {

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

template <bool LevelShift>
inline void butterfly8(int16x8_t (&d)[8]) {
    const int16x8_t tmp0 = vaddq_s16(d[0], d[7]), tmp7 = vsubq_s16(d[0], d[7]);
    const int16x8_t tmp1 = vaddq_s16(d[1], d[6]), tmp6 = vsubq_s16(d[1], d[6]);
    const int16x8_t tmp2 = vaddq_s16(d[2], d[5]), tmp5 = vsubq_s16(d[2], d[5]);
    const int16x8_t tmp3 = vaddq_s16(d[3], d[4]), tmp4 = vsubq_s16(d[3], d[4]);
    const int16x8_t tmp10 = vaddq_s16(tmp0, tmp3), tmp13 = vsubq_s16(tmp0, tmp3);
    const int16x8_t tmp11 = vaddq_s16(tmp1, tmp2), tmp12 = vsubq_s16(tmp1, tmp2);
    d[0] = vaddq_s16(tmp10, tmp11);
    if (LevelShift) d[0] = vsubq_s16(d[0], vdupq_n_s16(1024));
    d[4] = vsubq_s16(tmp10, tmp11);
    const int16x8_t z1 = vqdmulhq_n_s16(vaddq_s16(tmp12, tmp13), 181 << 7);
    d[2] = vaddq_s16(tmp13, z1);
    d[6] = vsubq_s16(tmp13, z1);
    const int16x8_t t10 = vaddq_s16(tmp4, tmp5), t11 = vaddq_s16(tmp5, tmp6), t12 = vaddq_s16(tmp6, tmp7);
    const int16x8_t z5 = vqdmulhq_n_s16(vsubq_s16(t10, t12), 98 << 7);
    const int16x8_t z2 = vaddq_s16(z5, vqdmulhq_n_s16(t10, 139 << 7));
    const int16x8_t z4 = vaddq_s16(vaddq_s16(z5, t12), vqdmulhq_n_s16(t12, 78 << 7));
    const int16x8_t z3 = vqdmulhq_n_s16(t11, 181 << 7);
    const int16x8_t z11 = vaddq_s16(tmp7, z3), z13 = vsubq_s16(tmp7, z3);
    d[5] = vaddq_s16(z13, z2);
    d[3] = vsubq_s16(z13, z2);
    d[1] = vaddq_s16(z11, z4);
    d[7] = vsubq_s16(z11, z4);
}

// (x * m + (x < 0 ? 32768 : 0)) >> 16 for four lanes: the bias is the sign
// mask (-1 or 0) times -32768.
inline int16x4_t quantise4(int16x4_t x, const uint32_t* m) {
    int32x4_t p = vmulq_s32(vmovl_s16(x), vreinterpretq_s32_u32(vld1q_u32(m)));
    p = vmlal_n_s16(p, vshr_n_s16(x, 15), -32768);
    return vshrn_n_s32(p, 16);
}

}  // namespace

void fdct_blocks_neon(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                      int16_t* out) {
    for (uint32_t b = 0; b < count; ++b, col += 8, out += 64) {
        int16x8_t d[8];
        for (int y = 0; y < 8; ++y) d[y] = vreinterpretq_s16_u16(vmovl_u8(vld1_u8(rows[y] + col)));
        transpose8(d);
        butterfly8<true>(d);
        transpose8(d);
        butterfly8<false>(d);
        for (int v = 0; v < 8; ++v) {
            const uint32_t* m = quant.divisors + 8 * v;
            vst1q_s16(out + 8 * v, vcombine_s16(quantise4(vget_low_s16(d[v]), m), quantise4(vget_high_s16(d[v]), m + 4)));
        }
    }
}

}  // namespace tekoj
#endif
