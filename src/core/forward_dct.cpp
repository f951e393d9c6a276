#include "core/forward_dct.h"

namespace tekoj {

void prepare_quant_table(const uint32_t* divisors, QuantTable& table) {
    table.divisors = divisors;
    table.narrow = true;
    for (int i = 0; i < 64; ++i) {
        table.narrow = table.narrow && divisors[i] < 32768;
        table.mul[i] = static_cast<int16_t>(static_cast<uint16_t>(divisors[i] & 0xFFFF));
        table.wide[i] = static_cast<int16_t>(divisors[i] >= 32768 ? -1 : 0);
    }
}

void fdct_blocks_portable(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                          int16_t* out) {
    const uint32_t* d = quant.divisors;
    for (uint32_t b = 0; b < count; ++b, col += 8, out += 64)
        dct_detail::block(rows, col, [d](int i, int32_t x) { return dct_detail::quantise(x, d[i]); }, out);
}

void quantise_blocks_portable(const int16_t* x, uint32_t count, const QuantTable& quant, int16_t* out) {
    for (uint32_t i = 0; i < 64 * count; ++i) out[i] = dct_detail::quantise(x[i], quant.divisors[i % 64]);
}

QuantiseBlocksFn quantise_blocks_for(SimdLevel level) {
    if (!simd_supported(level)) return quantise_blocks_portable;
    switch (level) {
#if defined(__x86_64__) || (defined(__i386__) && defined(__SSE2__))
        case SimdLevel::sse2: return quantise_blocks_sse2;
        case SimdLevel::avx2:
        case SimdLevel::avx512: return quantise_blocks_avx2;
#endif
#if defined(__arm__) || defined(__aarch64__)
        case SimdLevel::neon: return quantise_blocks_neon;
#endif
        default: return quantise_blocks_portable;
    }
}

FdctBlocksFn fdct_blocks_for(SimdLevel level) {
    if (!simd_supported(level)) return fdct_blocks_portable;
    switch (level) {
#if defined(__x86_64__) || (defined(__i386__) && defined(__SSE2__))
        case SimdLevel::sse2: return fdct_blocks_sse2;
        case SimdLevel::avx2:
        case SimdLevel::avx512: return fdct_blocks_avx2;
#endif
#if defined(__arm__) || defined(__aarch64__)
        case SimdLevel::neon: return fdct_blocks_neon;
#endif
        default: return fdct_blocks_portable;
    }
}

FdctBlocksFn fdct_blocks() {
    static const FdctBlocksFn chosen = fdct_blocks_for(simd_level());
    return chosen;
}

}  // namespace tekoj

extern "C" {

// Exported step with a caller's row pointers and divisor table. A table with
// words beyond what the kernels take goes through the 64-bit reference.
EKO_API void __eko_jpeg_enc_do_forward_dct(const uint32_t* divisors, void* spare, uint8_t* const* rows,
                                           int16_t* output, BlockPosition* position) {
    (void)spare;
    const uint32_t count = position->block_count;
    if (count == 0) return;
    bool fits = true;
    for (int i = 0; i < 64; ++i) fits = fits && divisors[i] <= tekoj::kMaxKernelDivisor;
    if (fits) {
        tekoj::QuantTable quant;
        tekoj::prepare_quant_table(divisors, quant);
        tekoj::fdct_blocks()(rows + position->start_row, position->start_col, count, quant, output);
    } else {
        const auto quant = [divisors](int i, int32_t x) { return tekoj::dct_detail::quantise_wide(x, divisors[i]); };
        for (uint32_t b = 0; b < count; ++b, output += 64)
            tekoj::dct_detail::block(rows + position->start_row, position->start_col + 8 * b, quant, output);
    }
    position->start_col += 8 * count;
}

}  // extern "C"
