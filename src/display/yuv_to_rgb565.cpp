// YUV 4:2:0 to RGB565 for previews on the device's display.
//
// Everything is table driven: the four chroma tables give each chroma byte's
// contribution to R, G and B, and the clamp table turns "luma plus
// contribution" into 0..255 without a branch. The tables are constant data
// built by the compiler, so the converters share nothing writable and may run
// on any thread.
//
// The chroma tables are centred on index 127, not 128, so a neutral chroma
// byte of 128 already adds a small tint (R +1, G -1, B +2). Callers compare
// previews against this exact output; the offset is part of the contract and
// must not be "corrected".
#include <TekoJEncoderInternal.h>

#include "display/rgb565_rows.h"

#include <cstddef>
#include <cstdint>

namespace {

// Arithmetic right shift, floor for negative values (C++20 defines >> so).
constexpr int32_t red_from_cr(int i) { return (91881 * (i - 127) + 32768) >> 16; }
constexpr int32_t blue_from_cb(int i) { return (116130 * (i - 127) + 32768) >> 16; }
// The two green terms stay in 16.16 fixed point; the rounding half rides on
// the Cb term so that one add and one shift per chroma sample suffice.
constexpr int32_t green_from_cr(int i) { return -46802 * (i - 127); }
constexpr int32_t green_from_cb(int i) { return -22554 * (i - 127) + 32768; }
constexpr uint8_t clamp_entry(int k) {
    return static_cast<uint8_t>(k <= 512 ? 0 : (k >= 767 ? 255 : k - 512));
}

// The exported tables are plain C arrays, so they are spelled out as brace
// lists of constexpr calls; the compiler evaluates every entry.
#define TEKOJ_T4(f, n) f(n), f(n + 1), f(n + 2), f(n + 3)
#define TEKOJ_T16(f, n) TEKOJ_T4(f, n), TEKOJ_T4(f, n + 4), TEKOJ_T4(f, n + 8), TEKOJ_T4(f, n + 12)
#define TEKOJ_T64(f, n) TEKOJ_T16(f, n), TEKOJ_T16(f, n + 16), TEKOJ_T16(f, n + 32), TEKOJ_T16(f, n + 48)
#define TEKOJ_T256(f, n) TEKOJ_T64(f, n), TEKOJ_T64(f, n + 64), TEKOJ_T64(f, n + 128), TEKOJ_T64(f, n + 192)

}  // namespace

extern "C" {

EKO_API extern constexpr int32_t eko_EnCrrTab[256] = {TEKOJ_T256(red_from_cr, 0)};
EKO_API extern constexpr int32_t eko_EnCbbTab[256] = {TEKOJ_T256(blue_from_cb, 0)};
EKO_API extern constexpr int32_t eko_EnCrgTab[256] = {TEKOJ_T256(green_from_cr, 0)};
EKO_API extern constexpr int32_t eko_EnCbgTab[256] = {TEKOJ_T256(green_from_cb, 0)};
EKO_API extern constexpr uint8_t eko_EnRangeTalbe[1024] = {TEKOJ_T256(clamp_entry, 0), TEKOJ_T256(clamp_entry, 256),
                                                    TEKOJ_T256(clamp_entry, 512), TEKOJ_T256(clamp_entry, 768)};

}  // extern "C"

namespace {

// The converters' own copy of the tables in one object: one base register
// reaches all five, which on 32-bit ARM leaves the pixel loop registers that
// five separately addressed (interposable) exported arrays would take.
struct Tables {
    int32_t crr[256], cbb[256], crg[256], cbg[256];
    uint8_t range[1024];
};
constexpr Tables kTables = {{TEKOJ_T256(red_from_cr, 0)},
                            {TEKOJ_T256(blue_from_cb, 0)},
                            {TEKOJ_T256(green_from_cr, 0)},
                            {TEKOJ_T256(green_from_cb, 0)},
                            {TEKOJ_T256(clamp_entry, 0), TEKOJ_T256(clamp_entry, 256), TEKOJ_T256(clamp_entry, 512),
                             TEKOJ_T256(clamp_entry, 768)}};

constexpr bool same_as_exported() {
    for (int i = 0; i < 256; ++i)
        if (kTables.crr[i] != eko_EnCrrTab[i] || kTables.cbb[i] != eko_EnCbbTab[i] || kTables.crg[i] != eko_EnCrgTab[i] ||
            kTables.cbg[i] != eko_EnCbgTab[i])
            return false;
    for (int k = 0; k < 1024; ++k)
        if (kTables.range[k] != eko_EnRangeTalbe[k]) return false;
    return true;
}
static_assert(same_as_exported());

}  // namespace

#undef TEKOJ_T256
#undef TEKOJ_T64
#undef TEKOJ_T16
#undef TEKOJ_T4

namespace {

static_assert(eko_EnCrrTab[0] == -178 && eko_EnCrrTab[127] == 0 && eko_EnCrrTab[128] == 1 && eko_EnCrrTab[255] == 179);
static_assert(eko_EnCbbTab[0] == -225 && eko_EnCbbTab[127] == 0 && eko_EnCbbTab[128] == 2 && eko_EnCbbTab[255] == 227);
static_assert(eko_EnCrgTab[0] == 5943854 && eko_EnCrgTab[255] == -5990656);
static_assert(eko_EnCbgTab[0] == 2897126 && eko_EnCbgTab[127] == 32768 && eko_EnCbgTab[255] == -2854144);
static_assert(eko_EnRangeTalbe[0] == 0 && eko_EnRangeTalbe[512] == 0 && eko_EnRangeTalbe[600] == 88 &&
              eko_EnRangeTalbe[767] == 255 && eko_EnRangeTalbe[1023] == 255);

// Luma plus any contribution lies in -225..482, well inside the clamp table
// once it is addressed from its middle.
constexpr const uint8_t* kClamp = kTables.range + 512;

// The three per-chroma-sample offsets, looked up once per 2x2 block.
struct Chroma {
    int32_t red;
    int32_t green;
    int32_t blue;
};

inline Chroma chroma_of(uint8_t cb, uint8_t cr) {
    return {kTables.crr[cr], (kTables.crg[cr] + kTables.cbg[cb]) >> 16, kTables.cbb[cb]};
}

inline uint16_t pixel_of(uint8_t luma, const Chroma& c) {
    const int32_t y = luma;
    const uint32_t r = kClamp[y + c.red];
    const uint32_t g = kClamp[y + c.green];
    const uint32_t b = kClamp[y + c.blue];
    return static_cast<uint16_t>(((r >> 3) << 11) | ((g >> 2) << 5) | (b >> 3));
}

// Where the Cb/Cr pair of each chroma sample of a chroma row lives: in two
// planes, or as the pair V, U of an interleaved row. `next` returns the
// contributions of the next sample, left to right.
struct PlanarRow {
    const uint8_t* u;  // Cb
    const uint8_t* v;  // Cr
    Chroma next() { return chroma_of(*u++, *v++); }
};

struct InterleavedRow {
    const uint8_t* vu;
    Chroma next() {
        const Chroma c = chroma_of(vu[1], vu[0]);
        vu += 2;
        return c;
    }
};

// Converts the luma row(s) that share one chroma row: two rows for every row
// pair, one for the last row of an odd height. The pointers walk rather than
// being indexed, which leaves the loop registers enough on 32-bit ARM.
template <bool TwoRows, typename ChromaRow>
inline void convert_rows(ChromaRow chroma, const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1,
                         size_t width) {
    for (const uint8_t* const end = y0 + (width & ~size_t{1}); y0 != end; y0 += 2, d0 += 2) {
        const Chroma c = chroma.next();
        d0[0] = pixel_of(y0[0], c);
        d0[1] = pixel_of(y0[1], c);
        if constexpr (TwoRows) {
            d1[0] = pixel_of(y1[0], c);
            d1[1] = pixel_of(y1[1], c);
            y1 += 2, d1 += 2;
        }
    }
    if (width & 1) {
        // An odd width leaves a last chroma column that serves one pixel column.
        const Chroma c = chroma.next();
        d0[0] = pixel_of(y0[0], c);
        if constexpr (TwoRows) d1[0] = pixel_of(y1[0], c);
    }
}

template <typename ChromaRow>
void rows_of(const ChromaRow& chroma, const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width) {
    if (y1 != nullptr) {
        convert_rows<true>(chroma, y0, y1, d0, d1, width);
    } else {
        convert_rows<false>(chroma, y0, y1, d0, d1, width);
    }
}

void planar_rows(const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width, const uint8_t* cb,
                 const uint8_t* cr) {
    rows_of(PlanarRow{cb, cr}, y0, y1, d0, d1, width);
}

void interleaved_rows(const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1, size_t width,
                      const uint8_t* vu) {
    rows_of(InterleavedRow{vu}, y0, y1, d0, d1, width);
}

// Row pairs share chroma row j; an odd height's last row has its own.
// `rows(j, y0, y1, d0, d1)` converts one chroma row's luma rows.
template <typename Rows>
void convert_frame(const uint8_t* luma, size_t width, size_t height, uint16_t* dst, const Rows& rows) {
    for (size_t j = 0; j < (height >> 1); ++j) {
        const size_t top = 2 * j * width;
        rows(j, luma + top, luma + top + width, dst + top, dst + top + width);
    }
    if (height & 1) {
        const size_t last = (height - 1) * width;
        rows(height >> 1, luma + last, nullptr, dst + last, nullptr);
    }
}

inline bool usable(const uint8_t* source, int32_t width, int32_t height, const uint16_t* destination) {
    eko_SetError(!source || !destination ? EKO_ERR_ARGUMENT : width <= 0 || height <= 0 ? EKO_ERR_DIMENSIONS : EKO_OK);
    return source != nullptr && destination != nullptr && width > 0 && height > 0;
}

}  // namespace

namespace tekoj {

const DisplayKernels kPortableDisplayKernels = {planar_rows, interleaved_rows};

const DisplayKernels* display_kernels_for(SimdLevel level) {
    if (!simd_supported(level)) return nullptr;
    switch (level) {
        case SimdLevel::portable: return &kPortableDisplayKernels;
        case SimdLevel::sse2: return display_kernels_sse2();
        case SimdLevel::avx2:
        case SimdLevel::avx512: return display_kernels_avx2();  // AVX2 already ~9x the tables
        case SimdLevel::neon: return display_kernels_neon();
    }
    return nullptr;
}

const DisplayKernels& display_kernels() {
    static const DisplayKernels* const chosen = [] {
        const DisplayKernels* k = display_kernels_for(simd_level());
        return k != nullptr ? k : &kPortableDisplayKernels;
    }();
    return *chosen;
}

}  // namespace tekoj

extern "C" {

EKO_API uint32_t eko_DuoYUV420toRGB565(const uint8_t* source, int32_t width, int32_t height, uint16_t* destination) {
    if (!usable(source, width, height, destination)) return 0;
    const size_t w = static_cast<size_t>(width);
    const size_t h = static_cast<size_t>(height);
    const size_t cw = (w + 1) >> 1;
    const size_t ch = (h + 1) >> 1;
    const uint8_t* u = source + w * h;
    const uint8_t* v = u + cw * ch;
    const auto planar = tekoj::display_kernels().planar;
    convert_frame(source, w, h, destination, [&](size_t j, const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1) {
        planar(y0, y1, d0, d1, w, u + j * cw, v + j * cw);
    });
    return 1;
}

EKO_API uint32_t eko_DuoPYV0420toRGB565(const uint8_t* source, int32_t width, int32_t height,
                                        uint16_t* destination) {
    if (!usable(source, width, height, destination)) return 0;
    const size_t w = static_cast<size_t>(width);
    const size_t h = static_cast<size_t>(height);
    const uint8_t* vu = source + w * h;
    const size_t row_bytes = 2 * ((w + 1) >> 1);
    const auto interleaved = tekoj::display_kernels().interleaved;
    convert_frame(source, w, h, destination, [&](size_t j, const uint8_t* y0, const uint8_t* y1, uint16_t* d0, uint16_t* d1) {
        interleaved(y0, y1, d0, d1, w, vu + j * row_bytes);
    });
    return 1;
}

}  // extern "C"
