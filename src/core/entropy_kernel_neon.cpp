// NEON block kernel: nonzero flags of the block in natural order, put into
// zig-zag order with table lookups and folded into the nonzero bitmap.
#if defined(__ARM_NEON) || defined(__ARM_NEON__)
#include "core/entropy_kernel.h"

#include <arm_neon.h>

namespace tekoj {
namespace {

// Lookup indexes into the flags of natural coefficients 0..31 (first
// lookup) and 32..63 (second, index minus 32; out-of-range indexes leave the
// first lookup's byte in place).
struct FlagLookups {
    uint8_t low[64];
    uint8_t high[64];
};

constexpr FlagLookups make_flag_lookups() {
    FlagLookups t{};
    for (int i = 0; i < 64; ++i) {
        t.low[i] = kZigzagToNatural[i];
        t.high[i] = static_cast<uint8_t>(kZigzagToNatural[i] - 32);
    }
    return t;
}

constexpr FlagLookups kFlagLookups = make_flag_lookups();
alignas(8) constexpr uint8_t kBitWeights[8] = {1, 2, 4, 8, 16, 32, 64, 128};

}  // namespace

void code_block_neon(BitState& bits, int32_t dc_diff, const int16_t* block, const uint32_t* dc, const uint32_t* ac) {
    uint8x8_t f[8];  // 0xFF for each nonzero coefficient, one row each
    for (int r = 0; r < 8; ++r) {
        const int16x8_t v = vld1q_s16(block + 8 * r);
        f[r] = vmovn_u16(vtstq_s16(v, v));
    }
    const uint8x8x4_t low = {{f[0], f[1], f[2], f[3]}};
    const uint8x8x4_t high = {{f[4], f[5], f[6], f[7]}};
    const uint8x8_t weights = vld1_u8(kBitWeights);
    uint8x8_t b[8];
    for (int j = 0; j < 8; ++j) {
        uint8x8_t z = vtbl4_u8(low, vld1_u8(kFlagLookups.low + 8 * j));
        z = vtbx4_u8(z, high, vld1_u8(kFlagLookups.high + 8 * j));
        b[j] = vand_u8(z, weights);
    }
    // Sum each group of eight weighted flags into one byte of the bitmap.
    const uint8x8_t s01 = vpadd_u8(b[0], b[1]), s23 = vpadd_u8(b[2], b[3]);
    const uint8x8_t s45 = vpadd_u8(b[4], b[5]), s67 = vpadd_u8(b[6], b[7]);
    const uint8x8_t s = vpadd_u8(vpadd_u8(s01, s23), vpadd_u8(s45, s67));
    const uint64_t mask = vget_lane_u64(vreinterpret_u64_u8(s), 0) & 0x7FFFFFFFFFFFFFFEull;
    code_block_from_mask(bits, dc_diff, dc, ac, mask,
                         [block](int p) { return clamp_ac(block[kZigzagToNatural[p]]); });
}

}  // namespace tekoj
#endif
