// NEON rows of the YUV 4:2:0 to RGB565 converters: sixteen pixels of each
// row per step. The products of the chroma contributions are formed in 32
// bits and narrowed with rounding (vrshrn adds the 32768 before the shift),
// luma plus contribution saturates to 0..255 as it narrows, and shift-insert
// packs the three fields.
#include "display/rgb565_rows.h"

#if defined(__ARM_NEON) || defined(__ARM_NEON__)

#include <arm_neon.h>

namespace tekoj {
namespace {

struct Contribution {
    int16x8_t red, green, blue;
};

// The multipliers as vector lanes, loaded once per row (a multiply by a lane
// keeps GCC from rebuilding a duplicated constant in every iteration): red,
// blue, green from Cr, green from Cb.
constexpr int16_t kRests[4] = {rgb565::kRedRest, rgb565::kBlueRest, rgb565::kGreenCrRest, rgb565::kGreenCb};

// (c * x + 32768) >> 16 of eight samples, c in lane L of k.
template <int L>
inline int16x8_t round_mul(int16x8_t x, int16x4_t k) {
    return vcombine_s16(vrshrn_n_s32(vmull_lane_s16(vget_low_s16(x), k, L), 16),
                        vrshrn_n_s32(vmull_lane_s16(vget_high_s16(x), k, L), 16));
}

inline int16x4_t green4(int16x4_t xr, int16x4_t xb, int16x4_t k) {
    return vrshrn_n_s32(vmlal_lane_s16(vmull_lane_s16(xr, k, 2), xb, k, 3), 16);
}

inline Contribution contribution(uint8x8_t cb, uint8x8_t cr, int16x4_t k) {
    const uint8x8_t centre = vdup_n_u8(rgb565::kCentre);
    const int16x8_t xb = vreinterpretq_s16_u16(vsubl_u8(cb, centre));
    const int16x8_t xr = vreinterpretq_s16_u16(vsubl_u8(cr, centre));
    const int16x8_t red = vaddq_s16(xr, round_mul<0>(xr, k));
    const int16x8_t blue = vaddq_s16(vaddq_s16(xb, xb), round_mul<1>(xb, k));
    const int16x8_t green = vsubq_s16(
        vcombine_s16(green4(vget_low_s16(xr), vget_low_s16(xb), k), green4(vget_high_s16(xr), vget_high_s16(xb), k)),
        xr);
    return {red, green, blue};
}

// Eight pixels: luma plus each contribution, saturated to bytes, packed.
inline uint16x8_t pixels(uint8x8_t y, int16x8_t red, int16x8_t green, int16x8_t blue) {
    const int16x8_t y16 = vreinterpretq_s16_u16(vmovl_u8(y));
    const uint8x8_t r = vqmovun_s16(vaddq_s16(y16, red));
    const uint8x8_t g = vqmovun_s16(vaddq_s16(y16, green));
    const uint8x8_t b = vqmovun_s16(vaddq_s16(y16, blue));
    uint16x8_t p = vshll_n_u8(r, 8);
    p = vsriq_n_u16(p, vshll_n_u8(g, 8), 5);
    return vsriq_n_u16(p, vshll_n_u8(b, 8), 11);
}

inline void row16(const uint8_t* y, uint16_t* d, const Contribution& c) {
    const uint8x16_t luma = vld1q_u8(y);
    const int16x8x2_t red = vzipq_s16(c.red, c.red), green = vzipq_s16(c.green, c.green),
                      blue = vzipq_s16(c.blue, c.blue);
    vst1q_u16(d, pixels(vget_low_u8(luma), red.val[0], green.val[0], blue.val[0]));
    vst1q_u16(d + 8, pixels(vget_high_u8(luma), red.val[1], green.val[1], blue.val[1]));
}

void planar(const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width, const uint8_t* cb,
            const uint8_t* cr) {
    const int16x4_t k = vld1_s16(kRests);
    size_t x = 0;
    for (; x + 16 <= width; x += 16) {
        const Contribution c = contribution(vld1_u8(cb + x / 2), vld1_u8(cr + x / 2), k);
        row16(y0 + x, d0 + x, c);
        if (y1 != nullptr) row16(y1 + x, d1 + x, c);
    }
    kPortableDisplayKernels.planar(y0 + x, y1 != nullptr ? y1 + x : nullptr, d0 + x, d1 != nullptr ? d1 + x : nullptr,
                                   width - x, cb + x / 2, cr + x / 2);
}

void interleaved(const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width, const uint8_t* vu) {
    const int16x4_t k = vld1_s16(kRests);
    size_t x = 0;
    for (; x + 16 <= width; x += 16) {
        const uint8x8x2_t pairs = vld2_u8(vu + x);  // V (Cr), U (Cb)
        const Contribution c = contribution(pairs.val[1], pairs.val[0], k);
        row16(y0 + x, d0 + x, c);
        if (y1 != nullptr) row16(y1 + x, d1 + x, c);
    }
    kPortableDisplayKernels.interleaved(y0 + x, y1 != nullptr ? y1 + x : nullptr, d0 + x,
                                        d1 != nullptr ? d1 + x : nullptr, width - x, vu + x);
}

const DisplayKernels kNeon = {planar, interleaved};

}  // namespace

const DisplayKernels* display_kernels_neon() { return &kNeon; }

}  // namespace tekoj

#else

namespace tekoj {
const DisplayKernels* display_kernels_neon() { return nullptr; }
}  // namespace tekoj

#endif
