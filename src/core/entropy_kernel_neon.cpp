// NEON block kernel: the coefficients' zero flags as bytes, put into zig-zag
// order with table lookups and summed into the nonzero bitmap.
#if defined(__ARM_NEON) || defined(__ARM_NEON__)
#include "core/entropy_kernel.h"

#include <arm_neon.h>

namespace tekoj {
namespace {

// Zig-zag positions 8j..8j+7 take their coefficients from natural 0..31 only
// (j = 0, 3), from 32..63 only (j = 4, 7), or from both (the rest, two
// lookups: the second's out-of-range indexes keep the first's bytes).
struct FlagLookups {
    uint8_t idx[12][8];
};

constexpr FlagLookups make_flag_lookups() {
    FlagLookups t{};
    // Rows: j = 0, 3, 4 (minus 32), 7 (minus 32), then low and high rows of
    // j = 1, 2, 5, 6.
    const int single[4] = {0, 3, 4, 7};
    for (int r = 0; r < 4; ++r)
        for (int i = 0; i < 8; ++i) t.idx[r][i] = static_cast<uint8_t>(kZigzagToNatural[8 * single[r] + i] - (r >= 2 ? 32 : 0));
    const int mixed[4] = {1, 2, 5, 6};
    for (int r = 0; r < 4; ++r)
        for (int i = 0; i < 8; ++i) {
            t.idx[4 + 2 * r][i] = kZigzagToNatural[8 * mixed[r] + i];
            t.idx[5 + 2 * r][i] = static_cast<uint8_t>(kZigzagToNatural[8 * mixed[r] + i] - 32);
        }
    return t;
}

alignas(16) constexpr FlagLookups kFlagLookups = make_flag_lookups();

// Bit weights of the eight flags of a byte of the bitmap: zig-zag position 8j
// lands in bit 7 of byte j when the scan runs from the top of each word,
// in bit 0 otherwise.
alignas(8) constexpr uint8_t kBitWeights[8] = {
    kScanFromTop ? 128 : 1, kScanFromTop ? 64 : 2, kScanFromTop ? 32 : 4, kScanFromTop ? 16 : 8,
    kScanFromTop ? 8 : 16,  kScanFromTop ? 4 : 32, kScanFromTop ? 2 : 64, kScanFromTop ? 1 : 128};

// 0xFF for each zero coefficient of two rows: a coefficient is zero when
// both its bytes are, and a de-interleaving load brings them side by side.
inline uint8x16_t zero_bytes(const int16_t* row) {
    const uint8x16x2_t b = vld2q_u8(reinterpret_cast<const uint8_t*>(row));
    return vceqq_u8(vorrq_u8(b.val[0], b.val[1]), vdupq_n_u8(0));
}

}  // namespace

namespace {

[[gnu::always_inline]] inline void code_block(BitState& bits, int32_t dc_diff, const int16_t* block, const uint32_t* dc,
                                              const uint32_t* ac) {
    // 0xFF for each zero coefficient, natural order, two rows per vector.
    const uint8x16_t f01 = zero_bytes(block), f23 = zero_bytes(block + 16);
    const uint8x16_t f45 = zero_bytes(block + 32), f67 = zero_bytes(block + 48);
    const uint8x8x4_t low = {{vget_low_u8(f01), vget_high_u8(f01), vget_low_u8(f23), vget_high_u8(f23)}};
    const uint8x8x4_t high = {{vget_low_u8(f45), vget_high_u8(f45), vget_low_u8(f67), vget_high_u8(f67)}};
    const uint8x16_t i0 = vld1q_u8(kFlagLookups.idx[0]), i1 = vld1q_u8(kFlagLookups.idx[2]);
    const uint8x16_t i2 = vld1q_u8(kFlagLookups.idx[4]), i3 = vld1q_u8(kFlagLookups.idx[6]);
    const uint8x16_t i4 = vld1q_u8(kFlagLookups.idx[8]), i5 = vld1q_u8(kFlagLookups.idx[10]);
    const uint8x8_t weights = vld1_u8(kBitWeights);
    const uint8x8_t z0 = vtbl4_u8(low, vget_low_u8(i0));
    const uint8x8_t z3 = vtbl4_u8(low, vget_high_u8(i0));
    const uint8x8_t z4 = vtbl4_u8(high, vget_low_u8(i1));
    const uint8x8_t z7 = vtbl4_u8(high, vget_high_u8(i1));
    const uint8x8_t z1 = vtbx4_u8(vtbl4_u8(low, vget_low_u8(i2)), high, vget_high_u8(i2));
    const uint8x8_t z2 = vtbx4_u8(vtbl4_u8(low, vget_low_u8(i3)), high, vget_high_u8(i3));
    const uint8x8_t z5 = vtbx4_u8(vtbl4_u8(low, vget_low_u8(i4)), high, vget_high_u8(i4));
    const uint8x8_t z6 = vtbx4_u8(vtbl4_u8(low, vget_low_u8(i5)), high, vget_high_u8(i5));
    // Sum each group of eight weighted flags into one byte of the bitmap.
    const uint8x8_t s01 = vpadd_u8(vbic_u8(weights, z0), vbic_u8(weights, z1));
    const uint8x8_t s23 = vpadd_u8(vbic_u8(weights, z2), vbic_u8(weights, z3));
    const uint8x8_t s45 = vpadd_u8(vbic_u8(weights, z4), vbic_u8(weights, z5));
    const uint8x8_t s67 = vpadd_u8(vbic_u8(weights, z6), vbic_u8(weights, z7));
    uint8x8_t s = vpadd_u8(vpadd_u8(s01, s23), vpadd_u8(s45, s67));
    ScanMap map;
    if constexpr (kScanFromTop) {
        // Byte j holds positions 8j..8j+7; each word takes four bytes, the
        // first position at its top.
        s = vrev32_u8(s);
        const uint32x2_t words = vreinterpret_u32_u8(s);
        map.word[0] = vget_lane_u32(words, 0) & 0x7FFFFFFFu;  // not DC
        map.word[1] = vget_lane_u32(words, 1) & 0xFFFFFFFEu;  // never position 63
    } else {
        map.word[0] = static_cast<ScanWord>(vget_lane_u64(vreinterpret_u64_u8(s), 0) & 0x7FFFFFFFFFFFFFFEull);
    }
    code_block_from_map(bits, dc_diff, dc, ac, map, block, kScanOffsets.natural);
}

}  // namespace

CoderKernels coder_kernels_neon() { return KernelsOf<code_block>::kernels; }

}  // namespace tekoj
#endif
