// Speed of the display conversions and the down-scaler, in megapixels per
// second: both YUV 4:2:0 to RGB565 converters on 1920x1080 frames, and the
// packed 4:2:2 down-scaler from 3840x2160 to 1920x1080. Each measurement is
// the best of several timed runs, to keep scheduler noise out.
//
//   tekoj_display_bench [repetitions]
#include <TekoJEncoderInternal.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;

std::vector<uint8_t> noise(size_t size, uint32_t seed) {
    std::vector<uint8_t> v(size);
    for (auto& b : v) b = static_cast<uint8_t>((seed = seed * 1664525u + 1013904223u) >> 24);
    return v;
}

// Seconds of the fastest of `runs` calls of f.
template <typename F>
double best_of(int runs, F&& f) {
    double best = 1e30;
    for (int i = 0; i < runs; ++i) {
        const auto t0 = Clock::now();
        f();
        const double s = std::chrono::duration<double>(Clock::now() - t0).count();
        if (s < best) best = s;
    }
    return best;
}

// Keeps the optimiser from discarding a result that nobody reads.
volatile uint32_t g_sink;

}  // namespace

int main(int argc, char** argv) {
    const int runs = argc > 1 ? std::atoi(argv[1]) : 20;
    const int w = 1920, h = 1080;
    const double mp = w * h / 1e6;

    const auto yuv = noise(size_t(w) * h * 3 / 2, 1);
    std::vector<uint16_t> rgb565(size_t(w) * h);
    const double planar = best_of(runs, [&] { g_sink = eko_DuoYUV420toRGB565(yuv.data(), w, h, rgb565.data()); });
    g_sink = rgb565[12345];
    const double interleaved =
        best_of(runs, [&] { g_sink = eko_DuoPYV0420toRGB565(yuv.data(), w, h, rgb565.data()); });
    g_sink = rgb565[54321];

    const int sw = 3840, sh = 2160;
    const auto packed = noise(size_t(sw) * sh * 2, 2);
    std::vector<uint8_t> small(size_t(w) * h * 3 / 2);
    const double scale = best_of(runs, [&] {
        __eko_jpeg_enc_down_scale_yuv422(packed.data(), sw, sh, sw, small.data(), w, h);
    });
    g_sink = small[777];

    std::printf("eko_DuoYUV420toRGB565   %dx%d        %8.1f MP/s  (%.2f ms)\n", w, h, mp / planar, planar * 1e3);
    std::printf("eko_DuoPYV0420toRGB565  %dx%d        %8.1f MP/s  (%.2f ms)\n", w, h, mp / interleaved,
                interleaved * 1e3);
    std::printf("down_scale_yuv422       %dx%d->%dx%d %8.1f MP/s out, %.1f MP/s in  (%.2f ms)\n", sw, sh, w, h,
                mp / scale, sw * double(sh) / 1e6 / scale, scale * 1e3);
    return 0;
}
