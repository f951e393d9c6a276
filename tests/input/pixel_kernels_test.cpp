// Every SIMD level's input row kernels (RGB readers, packed 4:2:2 readers,
// down-scaler) against the portable ones, byte for byte: random rows
// (extremes included) of every width from 1 to 48 and a few large odd ones,
// and rows of real photographs. Each kernel is called
// directly through each level's table, whatever level the process runs, so
// one run (and the sanitizer build) covers every level the processor has.
// Sources and outputs are buffers of exactly the described size: a vector
// loop that reads or writes one byte too far shows under the sanitizer.
#include "input/pixel_kernels.h"

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <functional>
#include <string>
#include <vector>

namespace {

using namespace tekoj;
using tekoj_test::Bytes;

// One kernel call on `w` pixels of `src`; returns every output byte.
struct KernelCase {
    const char* name;
    uint32_t bytes_per_pixel;  // source bytes per pixel (4:2:2: per group of two)
    std::function<Bytes(const InputKernels&, const Bytes& src, uint32_t w)> run;
};

// Concatenation of outputs of the given sizes after `fill` wrote them; each
// output is its own exact-size buffer.
Bytes outputs(std::initializer_list<size_t> sizes, const std::function<void(std::vector<Bytes>&)>& fill) {
    std::vector<Bytes> out;
    for (size_t s : sizes) out.emplace_back(s, 0xEE);
    fill(out);
    Bytes all;
    for (const Bytes& o : out) all.insert(all.end(), o.begin(), o.end());
    return all;
}

std::vector<KernelCase> kernel_cases() {
    std::vector<KernelCase> cases;
    const char* names[] = {"RGB888", "RGBA8888", "BGRA8888"};
    for (int layout = 0; layout < kPickLayouts; ++layout) {
        const uint32_t bpp = layout == kRgb888 ? 3 : 4;
        // The upper row of a pair (luma and chroma), then the lower (luma).
        cases.push_back({names[layout], bpp, [layout](const InputKernels& k, const Bytes& src, uint32_t w) {
                             return outputs({w, (w + 1) / 2, (w + 1) / 2, w}, [&](std::vector<Bytes>& o) {
                                 k.pick_upper[layout](src.data(), w, o[0].data(), o[1].data(), o[2].data());
                                 k.pick_lower[layout](src.data(), w, o[3].data());
                             });
                         }});
    }
    // RGB565 and packed 4:2:2 take the source as an upper and a lower row
    // (or as one row of groups) of the even part of the width.
    cases.push_back({"RGB565", 4, [](const InputKernels& k, const Bytes& src, uint32_t w) {
                         const uint32_t blocks = w / 2;
                         const Bytes upper(src.begin(), src.begin() + 4 * blocks);
                         const Bytes lower(src.end() - 4 * blocks, src.end());
                         return outputs({2 * blocks, 2 * blocks, blocks, blocks}, [&](std::vector<Bytes>& o) {
                             k.rgb565_blocks(upper.data(), lower.data(), blocks, o[0].data(), o[1].data(), o[2].data(),
                                             o[3].data());
                         });
                     }});
    cases.push_back({"4:2:2", 2, [](const InputKernels& k, const Bytes& src, uint32_t w) {
                         const uint32_t groups = w / 2;
                         const Bytes row(src.begin(), src.begin() + 4 * groups);
                         return outputs({2 * groups, groups, groups, 2 * groups}, [&](std::vector<Bytes>& o) {
                             k.split422(row.data(), groups, o[0].data(), o[1].data(), o[2].data());
                             k.luma422(row.data(), groups, o[3].data());
                         });
                     }});
    // Down-scaler: halving `w` groups into accumulator rows (start only,
    // finish only, both apart, both the same row), and the row writer with and
    // without chroma, on the source read as 32-bit words.
    cases.push_back({"halve 4:2:2", 4, [](const InputKernels& k, const Bytes& src, uint32_t w) {
                         std::vector<uint32_t> a(w), b(w);
                         for (uint32_t i = 0; i < w; ++i) a[i] = b[i] = 0x01002003u * i;
                         k.halve422(src.data(), w, a.data(), nullptr);
                         k.halve422(src.data(), w, nullptr, b.data());
                         k.halve422(src.data(), w, a.data(), b.data());
                         k.halve422(src.data(), w, b.data(), b.data());
                         a.insert(a.end(), b.begin(), b.end());
                         return Bytes(reinterpret_cast<const uint8_t*>(a.data()), reinterpret_cast<const uint8_t*>(a.data() + a.size()));
                     }});
    cases.push_back({"down-scale rows", 4, [](const InputKernels& k, const Bytes& src, uint32_t w) {
                         std::vector<uint32_t> words(w);
                         std::memcpy(words.data(), src.data(), 4 * static_cast<size_t>(w));
                         return outputs({w, w, (w + 1) / 2, (w + 1) / 2}, [&](std::vector<Bytes>& o) {
                             k.yuv_row(words.data(), w, o[0].data(), nullptr, nullptr);
                             k.yuv_row(words.data(), w, o[1].data(), o[2].data(), o[3].data());
                         });
                     }});
    return cases;
}

struct Level {
    std::string name;
    const InputKernels* kernels;
};

std::vector<Level> vector_levels() {
    std::vector<Level> levels;
    for (SimdLevel l : {SimdLevel::sse2, SimdLevel::avx2, SimdLevel::avx512, SimdLevel::neon})
        if (const InputKernels* k = input_kernels_for(l)) levels.push_back({simd_level_name(l), k});
    return levels;
}

void expect_levels_match(const Bytes& src, uint32_t w, const std::string& what) {
    for (const KernelCase& c : kernel_cases()) {
        const Bytes sized(src.begin(), src.begin() + static_cast<std::ptrdiff_t>(c.bytes_per_pixel) * w);
        const Bytes expected = c.run(kPortableInputKernels, sized, w);
        for (const Level& level : vector_levels()) {
            const Bytes got = c.run(*level.kernels, sized, w);
            const auto diff = std::mismatch(got.begin(), got.end(), expected.begin()).first - got.begin();
            ASSERT_EQ(diff, static_cast<std::ptrdiff_t>(expected.size()))
                << c.name << " " << level.name << " " << what << ": first differing output byte";
        }
    }
}

TEST(PixelKernels, EveryLevelMatchesPortableOnRandomRows) {
    if (vector_levels().empty()) GTEST_SKIP() << "no SIMD level on this processor";
    std::vector<uint32_t> widths;
    for (uint32_t w = 1; w <= 48; ++w) widths.push_back(w);
    for (uint32_t w : {63u, 64u, 65u, 97u, 1001u, 3841u}) widths.push_back(w);
    for (uint32_t w : widths)
        for (uint32_t seed = 1; seed <= 4; ++seed)
            expect_levels_match(tekoj_test::noise_with_extremes(4 * w, seed * 7919 + w), w, "width " + std::to_string(w));
}

TEST(PixelKernels, EveryLevelMatchesPortableOnPhotographs) {
    if (vector_levels().empty()) GTEST_SKIP() << "no SIMD level on this processor";
    for (const char* file : {"elephants-3840x2160.jpg", "wood-2560x1920.jpg"}) {
        const std::string path = std::string(TEKOJ_IMAGES_DIR) + "/" + file;
        if (!tekoj_test::file_exists(path)) GTEST_SKIP() << path << " missing";
        const tekoj_test::Decoded d = tekoj_test::decode_jpeg(tekoj_test::read_file(path));
        ASSERT_TRUE(d.ok) << path;
        const size_t stride = static_cast<size_t>(d.width) * 3;
        for (int row = 0; row < d.height; row += d.height / 7) {
            // The photograph's RGB pixels, and the same bytes read as the
            // four-byte and 16-bit layouts (two rows' worth, so every layout
            // sees real neighbouring values).
            const uint8_t* p = d.pixels.data() + row * stride;
            const size_t avail = std::min<size_t>(2 * stride, d.pixels.size() - row * stride);
            const uint32_t w = static_cast<uint32_t>(std::min<size_t>(avail / 4, d.width)) - (row & 1);
            expect_levels_match(Bytes(p, p + 4 * static_cast<size_t>(w)), w, path + " row " + std::to_string(row));
        }
    }
}

}  // namespace
