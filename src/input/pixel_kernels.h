// Row kernels of the input readers, one table per SIMD level. The readers
// walk bands and rows and fill the edges; these kernels do the per-pixel
// work of one row (or one row pair) and nothing else, so a vector version
// only has to match the portable one on a single row. Every level's table
// writes exactly the bytes of the portable table; the portable kernels are
// the definition.
//
// A kernel reads exactly the source bytes its arguments describe and writes
// exactly the output cells it names: vector loops handle their tails
// themselves and never rely on slack after a row.
#pragma once

#include "core/simd_level.h"

#include <cstdint>

namespace tekoj {

// Pixel byte orders of the picking RGB readers, the index of their kernels.
enum PickLayout { kRgb888 = 0, kRgba8888 = 1, kBgra8888 = 2, kPickLayouts = 3 };

struct InputKernels {
    // Upper row of a pair: Y of each of the w pixels, and Cb/Cr of every
    // even pixel (chroma column k from pixel 2k, (w + 1) / 2 columns).
    void (*pick_upper[kPickLayouts])(const uint8_t* src, uint32_t w, uint8_t* y, uint8_t* cb, uint8_t* cr);
    // Lower row of a pair: Y of each of the w pixels.
    void (*pick_lower[kPickLayouts])(const uint8_t* src, uint32_t w, uint8_t* y);
    // RGB565: `blocks` 2x2 blocks of the rows `upper` and `lower` (2 * blocks
    // pixels each): Y of every pixel, Cb/Cr of each block's average.
    void (*rgb565_blocks)(const uint8_t* upper, const uint8_t* lower, uint32_t blocks, uint8_t* y0, uint8_t* y1,
                          uint8_t* cb, uint8_t* cr);
    // Packed 4:2:2 groups Y0 U Y1 V: `groups` groups into 2 * groups Y samples
    // and one Cb and one Cr each; the luma variant drops the chroma.
    void (*split422)(const uint8_t* src, uint32_t groups, uint8_t* y, uint8_t* cb, uint8_t* cr);
    void (*luma422)(const uint8_t* src, uint32_t groups, uint8_t* y);
    // Down-scaler halving the width of a packed 4:2:2 row: output column i
    // takes the source pixels of group i, whose two sample words add to
    // (Y0 + Y1) << 20 | 2U << 10 | 2V. The sum is stored into start[i] and
    // then added to finish[i], each only when not null; the two may be the
    // same row, which then receives the sum twice.
    void (*halve422)(const uint8_t* src, uint32_t dw, uint32_t* start, uint32_t* finish);
    // Down-scaler row writer: Y of `count` sums of four sample words, and when
    // u is not null U and V of the even ones ((count + 1) / 2 each).
    void (*yuv_row)(const uint32_t* words, uint32_t count, uint8_t* y, uint8_t* u, uint8_t* v);
};

// The table of the process's SIMD level, chosen on first use.
const InputKernels& input_kernels();

// The table of one level, or null where this build or processor lacks it
// (tests compare every available level with the portable one).
const InputKernels* input_kernels_for(SimdLevel level);

// Per-level tables; null where the file was compiled for another processor.
const InputKernels* input_kernels_sse2();
const InputKernels* input_kernels_avx2();
const InputKernels* input_kernels_neon();

// The portable table: the reference every level matches, and the tail
// handler of the vector kernels.
extern const InputKernels kPortableInputKernels;

// Colour conversion in fixed point with 12 fractional bits. The weights of
// each row sum to 4096 (luma) or 0 (chroma), so no result leaves 0..255;
// adding 128 << 12 before the shift keeps the chroma sums non-negative, so a
// vector may shift them logically.
namespace rgb {
constexpr int32_t kYr = 1225, kYg = 2404, kYb = 467;
constexpr int32_t kCbR = -691, kCbG = -1357, kCbB = 2048;
constexpr int32_t kCrR = 2048, kCrG = -1715, kCrB = -333;
constexpr int32_t kChromaBias = 128 << 12;

inline uint8_t luma(int32_t r, int32_t g, int32_t b) { return static_cast<uint8_t>((kYr * r + kYg * g + kYb * b) >> 12); }
// The chroma sums with one multiply fewer: as their weights sum to 0, each
// rewrites exactly in the differences r - g and b - g (for Cb,
// -691 r - 1357 g + 2048 b = 2048 (b - g) - 691 (r - g)). Fewer constants
// also leave the portable loops registers enough on 32-bit ARM.
inline uint8_t chroma_b(int32_t r, int32_t g, int32_t b) {
    return static_cast<uint8_t>(128 + ((((b - g) << 11) + kCbR * (r - g)) >> 12));
}
inline uint8_t chroma_r(int32_t r, int32_t g, int32_t b) {
    return static_cast<uint8_t>(128 + ((((r - g) << 11) + kCrB * (b - g)) >> 12));
}
static_assert(kYr + kYg + kYb == 4096 && kCbR + kCbG + kCbB == 0 && kCrR + kCrG + kCrB == 0);
static_assert(kCbB == 2048 && kCrR == 2048);
}  // namespace rgb

// Two 16-bit weights in one 32-bit lane, `low` for the lane's low word: the
// operand of pmaddwd-style multiply-adds.
constexpr int32_t word_pair(int32_t low, int32_t high) {
    return static_cast<int32_t>((static_cast<uint32_t>(low) & 0xFFFF) | (static_cast<uint32_t>(high) << 16));
}

}  // namespace tekoj
