// Splitting an interleaved V/U chroma row (V first in each byte pair) into
// the Cr and Cb sample rows, with a SIMD kernel per level chosen once.
#pragma once

#include "core/simd_level.h"

#include <cstdint>

namespace tekoj {

// cr[x] = src[2x], cb[x] = src[2x + 1] for x < n; reads exactly 2n bytes.
using SplitVuFn = void (*)(const uint8_t* src, uint32_t n, uint8_t* cr, uint8_t* cb);

void split_vu_portable(const uint8_t* src, uint32_t n, uint8_t* cr, uint8_t* cb);
void split_vu_sse2(const uint8_t* src, uint32_t n, uint8_t* cr, uint8_t* cb);
void split_vu_neon(const uint8_t* src, uint32_t n, uint8_t* cr, uint8_t* cb);

SplitVuFn split_vu_for(SimdLevel level);

}  // namespace tekoj
