// NEON row kernels of the input readers. The structure loads (vld3, vld4)
// split the channels; seen as 16-bit lanes, each channel vector holds the
// even pixels in its low bytes and the odd ones in its high bytes, which is
// exactly the split that chroma from even pixels needs. The colour
// conversion works on 8-bit lanes (see below).
#include "input/pixel_kernels.h"

#if defined(__ARM_NEON) || defined(__ARM_NEON__)

#include <arm_neon.h>

#include <cstddef>

namespace tekoj {
namespace {

// Colour conversion on 8-bit lanes with widening byte multiplies.
// Each weight splits as w = 64 hi + lo with 0 <= lo < 64 (hi negative for
// the negative chroma weights), so that both partial sums of three byte
// products fit 16 bits: the fixed-point sum is S = 64 H + L with L >= 0, and
// the result floor(S / 4096) = (H + (L >> 6)) >> 6. The chroma bias 128 << 12
// goes into H as 8192. H alone may wrap modulo 2^16 (negative chroma
// weights), but H + (L >> 6) = floor(S / 64) lies in 0..16383, so the sum
// taken modulo 2^16 and then shifted is exact.
//   Y:  1225 = 64 * 19 + 9,   2404 = 64 * 37 + 36,  467 = 64 * 7 + 19
//   Cb: 2048 = 64 * 32,       -691 = 64 * -11 + 13, -1357 = 64 * -22 + 51
//   Cr: 2048 = 64 * 32,      -1715 = 64 * -27 + 13,  -333 = 64 * -6 + 51
static_assert(19 * 64 + 9 == rgb::kYr && 37 * 64 + 36 == rgb::kYg && 7 * 64 + 19 == rgb::kYb);
static_assert(-11 * 64 + 13 == rgb::kCbR && -22 * 64 + 51 == rgb::kCbG && 32 * 64 == rgb::kCbB);
static_assert(32 * 64 == rgb::kCrR && -27 * 64 + 13 == rgb::kCrG && -6 * 64 + 51 == rgb::kCrB);
static_assert(rgb::kChromaBias == 8192 * 64);

struct Bytes3 {
    uint8x8_t r, g, b;
};

inline uint8x8_t finish(uint16x8_t h, uint16x8_t l) { return vshrn_n_u16(vsraq_n_u16(h, l, 6), 6); }

inline uint8x8_t luma_bytes(const Bytes3& c) {
    uint16x8_t h = vmull_u8(c.r, vdup_n_u8(19));
    h = vmlal_u8(h, c.g, vdup_n_u8(37));
    h = vmlal_u8(h, c.b, vdup_n_u8(7));
    uint16x8_t l = vmull_u8(c.r, vdup_n_u8(9));
    l = vmlal_u8(l, c.g, vdup_n_u8(36));
    l = vmlal_u8(l, c.b, vdup_n_u8(19));
    return finish(h, l);
}

inline uint8x8_t cb_bytes(const Bytes3& c) {
    uint16x8_t h = vmlal_u8(vdupq_n_u16(8192), c.b, vdup_n_u8(32));
    h = vmlsl_u8(h, c.r, vdup_n_u8(11));
    h = vmlsl_u8(h, c.g, vdup_n_u8(22));
    const uint16x8_t l = vmlal_u8(vmull_u8(c.r, vdup_n_u8(13)), c.g, vdup_n_u8(51));
    return finish(h, l);
}

inline uint8x8_t cr_bytes(const Bytes3& c) {
    uint16x8_t h = vmlal_u8(vdupq_n_u16(8192), c.r, vdup_n_u8(32));
    h = vmlsl_u8(h, c.g, vdup_n_u8(27));
    h = vmlsl_u8(h, c.b, vdup_n_u8(6));
    const uint16x8_t l = vmlal_u8(vmull_u8(c.g, vdup_n_u8(13)), c.b, vdup_n_u8(51));
    return finish(h, l);
}

// Sixteen pixels' channels. The row loops below step their pointers on
// rather than index from the row start: no index arithmetic per step.
struct Pixels16 {
    uint8x16_t r, g, b;
};

template <int Bpp, bool Bgr>
inline Pixels16 load16(const uint8_t* p) {
    if constexpr (Bpp == 3) {
        const uint8x16x3_t v = vld3q_u8(p);
        return {v.val[0], v.val[1], v.val[2]};
    } else {
        const uint8x16x4_t v = vld4q_u8(p);
        return {v.val[Bgr ? 2 : 0], v.val[1], v.val[Bgr ? 0 : 2]};
    }
}

inline uint8x16_t luma16(const Pixels16& p) {
    return vcombine_u8(luma_bytes({vget_low_u8(p.r), vget_low_u8(p.g), vget_low_u8(p.b)}),
                       luma_bytes({vget_high_u8(p.r), vget_high_u8(p.g), vget_high_u8(p.b)}));
}

// The even pixels' channels: seen as 16-bit lanes, the low byte of each.
inline Bytes3 even8(const Pixels16& p) {
    return {vmovn_u16(vreinterpretq_u16_u8(p.r)), vmovn_u16(vreinterpretq_u16_u8(p.g)),
            vmovn_u16(vreinterpretq_u16_u8(p.b))};
}

template <int Bpp, bool Bgr, PickLayout Layout>
void pick_upper(const uint8_t* src, uint32_t w, uint8_t* y, uint8_t* cb, uint8_t* cr) {
    for (uint32_t n = w / 16; n > 0; --n, src += 16 * Bpp, y += 16, cb += 8, cr += 8) {
        const Pixels16 px = load16<Bpp, Bgr>(src);
        vst1q_u8(y, luma16(px));
        const Bytes3 even = even8(px);
        vst1_u8(cb, cb_bytes(even));
        vst1_u8(cr, cr_bytes(even));
    }
    kPortableInputKernels.pick_upper[Layout](src, w % 16, y, cb, cr);
}

template <int Bpp, bool Bgr, PickLayout Layout>
void pick_lower(const uint8_t* src, uint32_t w, uint8_t* y) {
    for (uint32_t n = w / 16; n > 0; --n, src += 16 * Bpp, y += 16) vst1q_u8(y, luma16(load16<Bpp, Bgr>(src)));
    kPortableInputKernels.pick_lower[Layout](src, w % 16, y);
}

// Each 5- or 6-bit field moves to the top of a byte plus half a step
// (the low bits are clear, so the half step is an or).
inline Bytes3 expand565(uint16x8_t p) {
    return {vorr_u8(vand_u8(vshrn_n_u16(p, 8), vdup_n_u8(0xF8)), vdup_n_u8(4)),
            vorr_u8(vand_u8(vshrn_n_u16(p, 3), vdup_n_u8(0xFC)), vdup_n_u8(2)),
            vorr_u8(vshl_n_u8(vmovn_u16(p), 3), vdup_n_u8(4))};
}

// Sum of four bytes per lane, for the block average.
inline uint16x8_t sum4(uint8x8_t a, uint8x8_t b, uint8x8_t c, uint8x8_t d) {
    return vaddq_u16(vaddl_u8(a, b), vaddl_u8(c, d));
}

void rgb565_blocks(const uint8_t* upper, const uint8_t* lower, uint32_t blocks, uint8_t* y0, uint8_t* y1, uint8_t* cb,
                   uint8_t* cr) {
    for (uint32_t n = blocks / 8; n > 0; --n, upper += 32, lower += 32, y0 += 16, y1 += 16, cb += 8, cr += 8) {
        // Even and odd pixels of 16-pixel runs of both rows.
        const uint16x8x2_t u = vld2q_u16(reinterpret_cast<const uint16_t*>(upper));
        const uint16x8x2_t l = vld2q_u16(reinterpret_cast<const uint16_t*>(lower));
        const Bytes3 ue = expand565(u.val[0]), uo = expand565(u.val[1]);
        const Bytes3 le = expand565(l.val[0]), lo = expand565(l.val[1]);
        vst2_u8(y0, (uint8x8x2_t{{luma_bytes(ue), luma_bytes(uo)}}));
        vst2_u8(y1, (uint8x8x2_t{{luma_bytes(le), luma_bytes(lo)}}));
        // Green alone gets the rounding term of the average: a rounding shift.
        const Bytes3 avg{vshrn_n_u16(sum4(ue.r, uo.r, le.r, lo.r), 2), vrshrn_n_u16(sum4(ue.g, uo.g, le.g, lo.g), 2),
                         vshrn_n_u16(sum4(ue.b, uo.b, le.b, lo.b), 2)};
        vst1_u8(cb, cb_bytes(avg));
        vst1_u8(cr, cr_bytes(avg));
    }
    kPortableInputKernels.rgb565_blocks(upper, lower, blocks % 8, y0, y1, cb, cr);
}

// Packed 4:2:2: sixteen groups per step, split into Y0, U, Y1 and V by one
// structure load.
void split422(const uint8_t* s, uint32_t groups, uint8_t* y, uint8_t* cb, uint8_t* cr) {
    uint32_t k = 0;
    for (; k + 16 <= groups; k += 16) {
        const uint8x16x4_t v = vld4q_u8(s + 4 * k);
        vst2q_u8(y + 2 * k, (uint8x16x2_t{{v.val[0], v.val[2]}}));
        vst1q_u8(cb + k, v.val[1]);
        vst1q_u8(cr + k, v.val[3]);
    }
    kPortableInputKernels.split422(s + 4 * k, groups - k, y + 2 * k, cb + k, cr + k);
}

void luma422(const uint8_t* s, uint32_t groups, uint8_t* y) {
    uint32_t k = 0;
    for (; k + 16 <= groups; k += 16) {
        const uint8x16x4_t v = vld4q_u8(s + 4 * k);
        vst2q_u8(y + 2 * k, (uint8x16x2_t{{v.val[0], v.val[2]}}));
    }
    kPortableInputKernels.luma422(s + 4 * k, groups - k, y + 2 * k);
}

// Halving down-scaler: sixteen groups per step; (Y0 + Y1) << 20 | U << 11 |
// V << 1 assembled by widening shifts.
inline uint32x4_t halve4(uint16x4_t y, uint16x4_t u, uint16x4_t v) {
    return vorrq_u32(vorrq_u32(vshlq_n_u32(vshll_n_u16(y, 16), 4), vshll_n_u16(u, 11)), vshll_n_u16(v, 1));
}

inline void halve_store(uint32x4_t sum, uint32_t* start, uint32_t* finish, uint32_t i) {
    if (start != nullptr) vst1q_u32(start + i, sum);
    if (finish != nullptr) vst1q_u32(finish + i, vaddq_u32(vld1q_u32(finish + i), sum));
}

void halve422(const uint8_t* s, uint32_t dw, uint32_t* start, uint32_t* finish) {
    uint32_t i = 0;
    for (; i + 16 <= dw; i += 16) {
        const uint8x16x4_t g = vld4q_u8(s + 4 * i);
        const uint16x8_t ylo = vaddl_u8(vget_low_u8(g.val[0]), vget_low_u8(g.val[2]));
        const uint16x8_t yhi = vaddl_u8(vget_high_u8(g.val[0]), vget_high_u8(g.val[2]));
        const uint16x8_t ulo = vmovl_u8(vget_low_u8(g.val[1])), uhi = vmovl_u8(vget_high_u8(g.val[1]));
        const uint16x8_t vlo = vmovl_u8(vget_low_u8(g.val[3])), vhi = vmovl_u8(vget_high_u8(g.val[3]));
        halve_store(halve4(vget_low_u16(ylo), vget_low_u16(ulo), vget_low_u16(vlo)), start, finish, i);
        halve_store(halve4(vget_high_u16(ylo), vget_high_u16(ulo), vget_high_u16(vlo)), start, finish, i + 4);
        halve_store(halve4(vget_low_u16(yhi), vget_low_u16(uhi), vget_low_u16(vhi)), start, finish, i + 8);
        halve_store(halve4(vget_high_u16(yhi), vget_high_u16(uhi), vget_high_u16(vhi)), start, finish, i + 12);
    }
    kPortableInputKernels.halve422(s + 4 * i, dw - i, start != nullptr ? start + i : nullptr,
                                   finish != nullptr ? finish + i : nullptr);
}

// Down-scaler row writer: sixteen words per step, even and odd apart.
// Narrowing keeps the low bits, so no mask is needed after the shift.
template <int Shift>
inline uint8x8_t top8(uint32x4_t a, uint32x4_t b) {
    return vmovn_u16(vcombine_u16(vmovn_u32(vshrq_n_u32(a, Shift)), vmovn_u32(vshrq_n_u32(b, Shift))));
}

void yuv_row(const uint32_t* words, uint32_t count, uint8_t* y, uint8_t* u, uint8_t* v) {
    uint32_t i = 0;
    for (; i + 16 <= count; i += 16) {
        const uint32x4x2_t a = vld2q_u32(words + i), b = vld2q_u32(words + i + 8);  // even, odd
        vst2_u8(y + i, (uint8x8x2_t{{top8<22>(a.val[0], b.val[0]), top8<22>(a.val[1], b.val[1])}}));
        if (u == nullptr) continue;
        vst1_u8(u + i / 2, top8<12>(a.val[0], b.val[0]));
        vst1_u8(v + i / 2, top8<2>(a.val[0], b.val[0]));
    }
    kPortableInputKernels.yuv_row(words + i, count - i, y + i, u != nullptr ? u + i / 2 : nullptr,
                                  v != nullptr ? v + i / 2 : nullptr);
}

const InputKernels kNeon = {
    {pick_upper<3, false, kRgb888>, pick_upper<4, false, kRgba8888>, pick_upper<4, true, kBgra8888>},
    {pick_lower<3, false, kRgb888>, pick_lower<4, false, kRgba8888>, pick_lower<4, true, kBgra8888>},
    rgb565_blocks,
    split422,
    luma422,
    halve422,
    yuv_row,
};

}  // namespace

const InputKernels* input_kernels_neon() { return &kNeon; }

}  // namespace tekoj

#else

namespace tekoj {
const InputKernels* input_kernels_neon() { return nullptr; }
}  // namespace tekoj

#endif
