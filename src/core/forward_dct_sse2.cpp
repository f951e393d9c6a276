// Forward transform with quantisation, SSE2: one block per pass.
#if defined(__SSE2__) && (defined(__x86_64__) || defined(__i386__))
#include "core/forward_dct_x86.h"

namespace tekoj {

void fdct_blocks_sse2(const uint8_t* const* rows, uint32_t col, uint32_t count, const QuantTable& quant,
                      int16_t* out) {
    for (uint32_t b = 0; b < count; ++b, col += 8, out += 64) fdct_block_128(rows, col, quant, out);
}

}  // namespace tekoj
#endif
