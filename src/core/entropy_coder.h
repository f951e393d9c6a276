// Block entropy coding: baseline Huffman coding of coefficient blocks, byte
// stuffing and restart markers.
#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>

namespace tekoj {

// Natural (row-major) index of each zig-zag position.
inline constexpr uint8_t kZigzagToNatural[64] = {
    0,  1,  8,  16, 9,  2,  3,  10, 17, 24, 32, 25, 18, 11, 4,  5,  12, 19, 26, 33, 40, 48,
    41, 34, 27, 20, 13, 6,  7,  14, 21, 28, 35, 42, 49, 56, 57, 50, 43, 36, 29, 22, 15, 23,
    30, 37, 44, 51, 58, 59, 52, 45, 38, 31, 39, 46, 53, 60, 61, 54, 47, 55, 62, 63};

// Codes one MCU (restart marker first, when one is due). Returns false once
// the encode has failed (its output could not be grown or handed on).
bool encode_mcu(EncoderContext* ctx, int16_t* const* blocks);

// True when every block of the MCU can be coded with the baseline tables:
// DC differences (from the predictors the coder will use) of magnitude at
// most 2047 and AC values of magnitude at most 1023. Reads nothing but the
// blocks and the coder state.
bool mcu_codable(const EncoderContext* ctx, int16_t* const* blocks);

}  // namespace tekoj
