// Interleaved V/U split, NEON: one de-interleaving load per 16 pairs.
#if defined(__ARM_NEON) || defined(__ARM_NEON__)
#include "input/vu_split.h"

#include <arm_neon.h>

namespace tekoj {

void split_vu_neon(const uint8_t* src, uint32_t n, uint8_t* cr, uint8_t* cb) {
    uint32_t x = 0;
    for (; x + 16 <= n; x += 16) {
        const uint8x16x2_t vu = vld2q_u8(src + 2 * x);
        vst1q_u8(cr + x, vu.val[0]);
        vst1q_u8(cb + x, vu.val[1]);
    }
    split_vu_portable(src + 2 * x, n - x, cr + x, cb + x);
}

}  // namespace tekoj
#endif
