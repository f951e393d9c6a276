// AVX2 block kernel: the zero test runs on the block in natural order, and
// byte shuffles put the 64 flags into zig-zag order before they become the
// nonzero bitmap.
#if defined(__x86_64__)
#include "core/entropy_kernel.h"

#include <immintrin.h>

namespace tekoj {
namespace {

// Shuffle controls: for zig-zag bytes 16c..16c+15, which bytes of the flags
// of natural coefficients 16s..16s+15 they take (0x80: none).
struct FlagShuffles {
    alignas(16) int8_t idx[4][4][16];
};

constexpr FlagShuffles make_flag_shuffles() {
    FlagShuffles t{};
    for (int c = 0; c < 4; ++c)
        for (int s = 0; s < 4; ++s)
            for (int i = 0; i < 16; ++i) {
                const int n = kZigzagToNatural[16 * c + i] - 16 * s;
                t.idx[c][s][i] = static_cast<int8_t>(n >= 0 && n < 16 ? n : 0x80);
            }
    return t;
}

constexpr FlagShuffles kFlagShuffles = make_flag_shuffles();

}  // namespace

namespace {

[[gnu::always_inline]] inline void code_block(BitState& bits, int32_t dc_diff, const int16_t* block, const uint32_t* dc,
                                              const uint32_t* ac) {
    const __m128i zero = _mm_setzero_si128();
    __m128i flags[4];  // 0xFF for each zero coefficient, natural order
    for (int s = 0; s < 4; ++s) {
        const __m128i a = _mm_loadu_si128(reinterpret_cast<const __m128i*>(block + 16 * s));
        const __m128i b = _mm_loadu_si128(reinterpret_cast<const __m128i*>(block + 16 * s + 8));
        flags[s] = _mm_packs_epi16(_mm_cmpeq_epi16(a, zero), _mm_cmpeq_epi16(b, zero));
    }
    uint64_t zeros = 0;
    for (int c = 0; c < 4; ++c) {
        __m128i z = zero;
        for (int s = 0; s < 4; ++s)
            z = _mm_or_si128(z, _mm_shuffle_epi8(flags[s], _mm_load_si128(reinterpret_cast<const __m128i*>(
                                                             kFlagShuffles.idx[c][s]))));
        zeros |= static_cast<uint64_t>(static_cast<uint32_t>(_mm_movemask_epi8(z))) << (16 * c);
    }
    const uint64_t mask = ~zeros & 0x7FFFFFFFFFFFFFFEull;
    code_block_from_map(bits, dc_diff, dc, ac, ScanMap{{mask}}, block, kScanOffsets.natural);
}

}  // namespace

CoderKernels coder_kernels_avx2() { return KernelsOf<code_block>::kernels; }

}  // namespace tekoj
#endif
