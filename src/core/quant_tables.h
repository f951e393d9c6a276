#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>

namespace tekoj {

// Percentage scale of a clamped quality value (1..100): 5000/q below 50, 200-2q above.
uint32_t quality_scale(uint32_t quality);
// base * scale / 100, rounded, clamped to 1..255.
void scale_table(const uint8_t* base, uint32_t scale, uint8_t* out);
// Reciprocal divisor of quantiser q at natural index `index` (0 if q is 0).
uint32_t divisor_for(uint32_t q, int index);

// Installs the quantisation tables and divisors of the context's quality
// (or its settings record's tables). 0 after reporting an allocation failure.
uint32_t set_quality(EncoderContext* ctx);

}  // namespace tekoj
