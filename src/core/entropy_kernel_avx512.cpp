// AVX-512 block kernel: two word permutes put the block into zig-zag order,
// which the coding loop then reads straight, and one test per half gives the
// nonzero bitmap in that order.
#if defined(__x86_64__)
#if defined(__GNUC__) && !defined(__clang__)
// GCC 12's own AVX-512 header seeds many intrinsics with an "undefined"
// vector that its flow analysis then reports as maybe uninitialised.
#pragma GCC diagnostic ignored "-Wmaybe-uninitialized"
#endif
#include "core/entropy_kernel.h"

#include <immintrin.h>

namespace tekoj {
namespace {

// Natural index of zig-zag positions 0..31 and 32..63, as word permutes of
// the block's two halves take them.
struct ZigzagPermutes {
    alignas(64) uint16_t first[32];
    alignas(64) uint16_t second[32];
};

constexpr ZigzagPermutes make_permutes() {
    ZigzagPermutes t{};
    for (int i = 0; i < 32; ++i) {
        t.first[i] = kZigzagToNatural[i];
        t.second[i] = kZigzagToNatural[32 + i];
    }
    return t;
}

constexpr ZigzagPermutes kPermutes = make_permutes();

[[gnu::always_inline]] inline void code_block(BitState& bits, int32_t dc_diff, const int16_t* block, const uint32_t* dc,
                                              const uint32_t* ac) {
    const __m512i a = _mm512_loadu_si512(block), b = _mm512_loadu_si512(block + 32);
    const __m512i z0 = _mm512_permutex2var_epi16(a, _mm512_load_si512(kPermutes.first), b);
    const __m512i z1 = _mm512_permutex2var_epi16(a, _mm512_load_si512(kPermutes.second), b);
    alignas(64) int16_t zz[64];
    _mm512_store_si512(zz, z0);
    _mm512_store_si512(zz + 32, z1);
    const uint64_t nonzero = (static_cast<uint64_t>(_mm512_test_epi16_mask(z1, z1)) << 32 |
                              _mm512_test_epi16_mask(z0, z0)) &
                             0x7FFFFFFFFFFFFFFEull;
    code_block_from_map(bits, dc_diff, dc, ac, ScanMap{{nonzero}}, zz, nullptr);
}

}  // namespace

CoderKernels coder_kernels_avx512() { return KernelsOf<code_block>::kernels; }

}  // namespace tekoj
#endif
