// SSE2 block kernel: the AC coefficients gathered into zig-zag order with
// word inserts and tested against zero eight at a time.
#if defined(__x86_64__)
#include "core/entropy_kernel.h"

#include <emmintrin.h>

namespace tekoj {
namespace {

[[gnu::always_inline]] inline void code_block(BitState& bits, int32_t dc_diff, const int16_t* block, const uint32_t* dc,
                                              const uint32_t* ac) {
    alignas(16) int16_t zz[64];
    const __m128i zero = _mm_setzero_si128();
    uint64_t zeros = 0;
    for (int r = 0; r < 8; r += 2) {
        const uint8_t* n = kZigzagToNatural + 8 * r;
        __m128i a = _mm_set_epi16(block[n[7]], block[n[6]], block[n[5]], block[n[4]], block[n[3]], block[n[2]],
                                  block[n[1]], block[n[0]]);
        __m128i b = _mm_set_epi16(block[n[15]], block[n[14]], block[n[13]], block[n[12]], block[n[11]],
                                  block[n[10]], block[n[9]], block[n[8]]);
        _mm_store_si128(reinterpret_cast<__m128i*>(zz + 8 * r), a);
        _mm_store_si128(reinterpret_cast<__m128i*>(zz + 8 * r + 8), b);
        const __m128i z = _mm_packs_epi16(_mm_cmpeq_epi16(a, zero), _mm_cmpeq_epi16(b, zero));
        zeros |= static_cast<uint64_t>(static_cast<uint32_t>(_mm_movemask_epi8(z))) << (8 * r);
    }
    const uint64_t mask = ~zeros & 0x7FFFFFFFFFFFFFFEull;
    code_block_from_map(bits, dc_diff, dc, ac, ScanMap{{mask}}, zz, nullptr);
}

}  // namespace

CoderKernels coder_kernels_sse2() { return KernelsOf<code_block>::kernels; }

}  // namespace tekoj
#endif
