#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>

namespace tekoj {

// The four standard tables (DC/AC, luminance/chrominance): code counts per
// length (17 bytes, entry 0 unused) and symbols in code order.
extern const uint8_t kDcLumaBits[17];
extern const uint8_t kDcLumaValues[12];
extern const uint8_t kDcChromaBits[17];
extern const uint8_t kDcChromaValues[12];
extern const uint8_t kAcLumaBits[17];
extern const uint8_t kAcLumaValues[162];
extern const uint8_t kAcChromaBits[17];
extern const uint8_t kAcChromaValues[162];

// Builds the magnitude table, the standard Huffman specifications and the
// code tables of an encode. 0 after reporting an allocation failure.
uint32_t prepare_huffman(EncoderContext* ctx);

}  // namespace tekoj
