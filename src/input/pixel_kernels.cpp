// Portable row kernels of the input readers and the choice of a table.
#include "input/pixel_kernels.h"

#include <cstddef>

namespace tekoj {
namespace {

// Offsets of R, G and B within a pixel, and the pixel size.
template <int R, int G, int B, int Bpp>
struct ByteLayout {
    static constexpr int r = R, g = G, b = B, bpp = Bpp;
};
using Rgb888 = ByteLayout<0, 1, 2, 3>;
using Rgba8888 = ByteLayout<0, 1, 2, 4>;
using Bgra8888 = ByteLayout<2, 1, 0, 4>;

template <typename L>
void pick_upper(const uint8_t* px, uint32_t w, uint8_t* y, uint8_t* cb, uint8_t* cr) {
    for (uint32_t k = 0; k < (w >> 1); ++k, px += 2 * L::bpp) {
        const int32_t r = px[L::r], g = px[L::g], b = px[L::b];
        y[2 * k] = rgb::luma(r, g, b);
        y[2 * k + 1] = rgb::luma(px[L::bpp + L::r], px[L::bpp + L::g], px[L::bpp + L::b]);
        cb[k] = rgb::chroma_b(r, g, b);
        cr[k] = rgb::chroma_r(r, g, b);
    }
    if (w & 1) {
        const int32_t r = px[L::r], g = px[L::g], b = px[L::b];
        y[w - 1] = rgb::luma(r, g, b);
        cb[w >> 1] = rgb::chroma_b(r, g, b);
        cr[w >> 1] = rgb::chroma_r(r, g, b);
    }
}

template <typename L>
void pick_lower(const uint8_t* px, uint32_t w, uint8_t* y) {
    for (uint32_t x = 0; x < w; ++x, px += L::bpp) y[x] = rgb::luma(px[L::r], px[L::g], px[L::b]);
}

struct Rgb {
    int32_t r, g, b;
};

// Each 5- or 6-bit field moves to the top of a byte plus half a step.
inline Rgb expand565(const uint8_t* p) {
    const uint32_t v = static_cast<uint32_t>(p[0]) | (static_cast<uint32_t>(p[1]) << 8);
    return {static_cast<int32_t>(((v & 0xF800) >> 8) + 4), static_cast<int32_t>(((v & 0x07E0) >> 3) + 2),
            static_cast<int32_t>(((v << 3) & 0xFF) + 4)};
}

void rgb565_blocks(const uint8_t* upper, const uint8_t* lower, uint32_t blocks, uint8_t* y0, uint8_t* y1, uint8_t* cb,
                   uint8_t* cr) {
    for (uint32_t k = 0; k < blocks; ++k, upper += 4, lower += 4) {
        const Rgb a = expand565(upper), c = expand565(upper + 2), d = expand565(lower), e = expand565(lower + 2);
        y0[2 * k] = rgb::luma(a.r, a.g, a.b);
        y0[2 * k + 1] = rgb::luma(c.r, c.g, c.b);
        y1[2 * k] = rgb::luma(d.r, d.g, d.b);
        y1[2 * k + 1] = rgb::luma(e.r, e.g, e.b);
        // Green alone gets the rounding term of the average.
        const int32_t ra = (a.r + c.r + d.r + e.r) >> 2;
        const int32_t ga = (a.g + c.g + d.g + e.g + 2) >> 2;
        const int32_t ba = (a.b + c.b + d.b + e.b) >> 2;
        cb[k] = rgb::chroma_b(ra, ga, ba);
        cr[k] = rgb::chroma_r(ra, ga, ba);
    }
}

void split422(const uint8_t* s, uint32_t groups, uint8_t* y, uint8_t* cb, uint8_t* cr) {
    for (uint32_t k = 0; k < groups; ++k, s += 4) {
        y[2 * k] = s[0];
        cb[k] = s[1];
        y[2 * k + 1] = s[2];
        cr[k] = s[3];
    }
}

void luma422(const uint8_t* s, uint32_t groups, uint8_t* y) {
    for (uint32_t k = 0; k < groups; ++k, s += 4) {
        y[2 * k] = s[0];
        y[2 * k + 1] = s[2];
    }
}

void halve422(const uint8_t* s, uint32_t dw, uint32_t* start, uint32_t* finish) {
    for (uint32_t i = 0; i < dw; ++i, s += 4) {
        const uint32_t sum = (static_cast<uint32_t>(s[0]) + s[2]) << 20 | static_cast<uint32_t>(s[1]) << 11 |
                             static_cast<uint32_t>(s[3]) << 1;
        if (start != nullptr) start[i] = sum;
        if (finish != nullptr) finish[i] += sum;
    }
}

// Each field holds a sum of four samples below 1024: the byte is its top 8
// bits. Chroma comes from the even column of each pair, not averaged.
void yuv_row(const uint32_t* words, uint32_t count, uint8_t* y, uint8_t* u, uint8_t* v) {
    for (uint32_t i = 0; i < count; ++i) y[i] = static_cast<uint8_t>(words[i] >> 22);
    if (u == nullptr) return;
    for (uint32_t k = 0; 2 * k < count; ++k) {
        u[k] = static_cast<uint8_t>(words[2 * k] >> 12);
        v[k] = static_cast<uint8_t>(words[2 * k] >> 2);
    }
}

}  // namespace

const InputKernels kPortableInputKernels = {
    {pick_upper<Rgb888>, pick_upper<Rgba8888>, pick_upper<Bgra8888>},
    {pick_lower<Rgb888>, pick_lower<Rgba8888>, pick_lower<Bgra8888>},
    rgb565_blocks,
    split422,
    luma422,
    halve422,
    yuv_row,
};

const InputKernels* input_kernels_for(SimdLevel level) {
    if (!simd_supported(level)) return nullptr;
    switch (level) {
        case SimdLevel::portable: return &kPortableInputKernels;
        case SimdLevel::sse2: return input_kernels_sse2();
        // No AVX-512 kernels: with the AVX2 ones the readers take about 2 %
        // of an RGB encode, too little for wider vectors to pay.
        case SimdLevel::avx2:
        case SimdLevel::avx512: return input_kernels_avx2();
        case SimdLevel::neon: return input_kernels_neon();
    }
    return nullptr;
}

const InputKernels& input_kernels() {
    static const InputKernels* const chosen = [] {
        const InputKernels* k = input_kernels_for(simd_level());
        return k != nullptr ? k : &kPortableInputKernels;
    }();
    return *chosen;
}

}  // namespace tekoj
