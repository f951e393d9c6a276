// The portable block kernel, which defines the bytes every SIMD kernel must
// reproduce, and the choice of kernels for a SIMD level.
#include "core/entropy_kernel.h"
#include "core/simd_level.h"

namespace tekoj {
namespace {

// Nonzero AC positions 1..62 in zig-zag order.
inline ScanMap nonzero_map(const int16_t* block) {
    ScanMap m{};
#pragma GCC unroll 62
    for (int k = 1; k < 63; ++k) m.word[k / kScanWordBits] |= block[kZigzagToNatural[k]] != 0 ? scan_bit(k) : 0;
    return m;
}

[[gnu::always_inline]] inline void code_block_portable(BitState& bits, int32_t dc_diff, const int16_t* block,
                                                      const uint32_t* dc, const uint32_t* ac) {
    code_block_from_map(bits, dc_diff, dc, ac, nonzero_map(block), block, kScanOffsets.natural);
}

}  // namespace

CoderKernels coder_kernels_for(int level) {
    switch (static_cast<SimdLevel>(level)) {
#if defined(__x86_64__) || defined(__i386__)
        case SimdLevel::sse2: return coder_kernels_sse2();
        case SimdLevel::avx2: return coder_kernels_avx2();
        case SimdLevel::avx512: return coder_kernels_avx512();
#elif defined(__arm__) || defined(__aarch64__)
        case SimdLevel::neon: return coder_kernels_neon();
#endif
        default: return KernelsOf<code_block_portable>::kernels;
    }
}

}  // namespace tekoj
