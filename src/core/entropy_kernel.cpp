// The portable block kernel, which defines the bytes every SIMD kernel must
// reproduce, and the choice of kernel for a SIMD level.
#include "core/entropy_kernel.h"
#include "core/simd_level.h"

namespace tekoj {
namespace {

// Nonzero AC positions 1..62 in zig-zag order, built in two 32-bit halves.
inline uint64_t nonzero_mask(const int16_t* block) {
    uint32_t lo = 0, hi = 0;
#pragma GCC unroll 32
    for (int k = 1; k < 32; ++k) lo |= static_cast<uint32_t>(block[kZigzagToNatural[k]] != 0) << k;
#pragma GCC unroll 32
    for (int k = 32; k < 63; ++k) hi |= static_cast<uint32_t>(block[kZigzagToNatural[k]] != 0) << (k - 32);
    return static_cast<uint64_t>(hi) << 32 | lo;
}

void code_block_portable(BitState& bits, int32_t dc_diff, const int16_t* block, const uint32_t* dc,
                         const uint32_t* ac) {
    code_block_from_mask(bits, dc_diff, dc, ac, nonzero_mask(block),
                         [block](int p) { return clamp_ac(block[kZigzagToNatural[p]]); });
}

}  // namespace

BlockKernel block_kernel_for(int level) {
    switch (static_cast<SimdLevel>(level)) {
#if defined(__x86_64__) || defined(__i386__)
        case SimdLevel::sse2: return code_block_sse2;
        case SimdLevel::avx2:
        case SimdLevel::avx512: return code_block_avx2;
#elif defined(__arm__) || defined(__aarch64__)
        case SimdLevel::neon: return code_block_neon;
#endif
        default: return code_block_portable;
    }
}

}  // namespace tekoj
