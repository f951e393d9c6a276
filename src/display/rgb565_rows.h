// Row kernels of the YUV 4:2:0 to RGB565 converters, one table per SIMD
// level. A call converts the one or two luma rows that share a chroma row;
// every level writes exactly the words of the portable table.
//
// The vector kernels compute the table entries instead of looking them up:
// each chroma table is (c * x + 32768) >> 16 with x = chroma - 127, and its
// constant splits into a multiple of 65536 (an exact shift of x) plus a
// remainder small enough for 16-bit multiplies, so the floor is the same
// integer. The clamp table is a saturation to 0..255.
#pragma once

#include "core/simd_level.h"

#include <cstddef>
#include <cstdint>

namespace tekoj {

struct DisplayKernels {
    // Luma row y0 (and y1 when not null) of `width` pixels into d0 (and d1),
    // with chroma sample k serving pixels 2k and 2k + 1: from the planes'
    // rows cb and cr, or from the pairs V, U of the interleaved row vu.
    void (*planar)(const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width, const uint8_t* cb,
                   const uint8_t* cr);
    void (*interleaved)(const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width,
                        const uint8_t* vu);
};

// The table of the process's SIMD level, chosen on first use.
const DisplayKernels& display_kernels();

// One level's table, or null where this build or processor lacks it.
const DisplayKernels* display_kernels_for(SimdLevel level);
const DisplayKernels* display_kernels_sse2();
const DisplayKernels* display_kernels_avx2();
const DisplayKernels* display_kernels_neon();

// The table lookups themselves: the reference, and the vector kernels' tail.
extern const DisplayKernels kPortableDisplayKernels;

// The split constants: red 91881 = 65536 + 26345, green from Cr
// -46802 = -65536 + 18734, blue 116130 = 2 * 65536 - 14942.
namespace rgb565 {
constexpr int16_t kRedRest = 26345, kGreenCrRest = 18734, kGreenCb = -22554, kBlueRest = -14942;
constexpr int kCentre = 127;
}  // namespace rgb565

}  // namespace tekoj
