// Shared pieces of the fuzz harnesses: reading choices from the fuzzer's
// bytes, and the check every reported success must pass: libjpeg-turbo
// decodes the stream without an error or a warning, at the size asked for.
#pragma once

#include <TekoJEncoderInternal.h>

#include <turbojpeg.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

namespace tekoj_fuzz {

using Bytes = std::vector<uint8_t>;

// Takes values from the front of the input; zeros once it runs dry.
class Input {
public:
    Input(const uint8_t* data, size_t size) : p_(data), end_(data + size) {}
    uint32_t u8() { return p_ < end_ ? *p_++ : 0; }
    uint32_t u16() { return u8() | u8() << 8; }
    uint32_t u32() { return u16() | u16() << 16; }
    bool flag() { return (u8() & 1) != 0; }
    // A number in [lo, hi].
    uint32_t range(uint32_t lo, uint32_t hi) { return lo + (hi > lo ? u16() % (hi - lo + 1) : 0); }
    // `n` bytes: the rest of the input repeated (or a ramp when none is left),
    // in a block of exactly that size so that reading past it is caught.
    Bytes fill(size_t n) {
        Bytes out(n);
        const size_t left = size_t(end_ - p_);
        for (size_t i = 0; i < n; ++i) out[i] = left ? p_[i % left] : uint8_t(i * 7);
        return out;
    }
    Bytes take(size_t n) {
        Bytes out;
        while (n-- > 0 && p_ < end_) out.push_back(*p_++);
        return out;
    }
    size_t left() const { return size_t(end_ - p_); }

private:
    const uint8_t* p_;
    const uint8_t* end_;
};

[[noreturn]] inline void finding(const char* what, const char* detail = "") {
    std::fprintf(stderr, "FINDING: %s %s\n", what, detail);
    std::abort();
}

// Decodes `jpeg` and stops the run unless it is clean and `width` x `height`.
inline void expect_decodes(const Bytes& jpeg, int width, int height) {
    static tjhandle h = tjInitDecompress();
    int w = 0, hh = 0, subsamp = 0, cs = 0;
    if (tjDecompressHeader3(h, jpeg.data(), jpeg.size(), &w, &hh, &subsamp, &cs) != 0)
        finding("header not decodable:", tjGetErrorStr2(h));
    if (w != width || hh != height) finding("decoded size differs from the size asked for");
    const bool grey = cs == TJCS_GRAY;
    Bytes pixels(size_t(w) * hh * (grey ? 1 : 3));
    if (tjDecompress2(h, jpeg.data(), jpeg.size(), pixels.data(), w, 0, hh, grey ? TJPF_GRAY : TJPF_RGB, 0) != 0)
        finding(tjGetErrorCode(h) == TJERR_WARNING ? "decoder warning:" : "decoder error:", tjGetErrorStr2(h));
}

// A stream callback that collects the pieces and checks their size.
inline uint32_t collect(void* arg, const uint8_t* data, uint32_t count) {
    if (count == 0 || data == nullptr) finding("empty stream piece");
    static_cast<Bytes*>(arg)->insert(static_cast<Bytes*>(arg)->end(), data, data + count);
    return 0;
}

inline size_t image_bytes(uint32_t format, int w, int h) {
    const size_t n = size_t(w) * h;
    switch (format & 0xFF) {
        case EKO_FORMAT_RGB565: return 2 * n;
        case EKO_FORMAT_RGB888: return 3 * n;
        case EKO_FORMAT_YUV420: return n + 2 * size_t((w + 1) / 2) * ((h + 1) / 2);
        case EKO_FORMAT_GREY: return n;
        case EKO_FORMAT_RGBA8888:
        case EKO_FORMAT_BGRA8888: return 4 * n;
        default: return n;  // refused anyway; still a valid pointer
    }
}

// A random EncoderSettings record: mostly plausible, sometimes not.
inline EncoderSettings settings_from(Input& in) {
    EncoderSettings s{};
    const bool odd = in.u8() % 8 == 0;  // one record in eight may be anything
    s.num_components = uint8_t(odd ? in.range(0, 4) : in.flag() ? 3 : 1);
    s.num_quant_tables = odd ? int32_t(in.range(0, 5)) - 1 : int32_t(in.range(2, 4));
    // Tables from two bytes, so that the record leaves the input for the rest.
    const uint32_t base = in.u8(), step = in.u8();
    for (int t = 0; t < 4; ++t)
        for (uint32_t i = 0; i < 64; ++i)
            s.quant_tables[t][i] = uint8_t(odd ? (base + i * step * (t + 1)) & 0xFF : 1 + (base + i * step + t) % 60);
    s.write_dri = in.u8() % 4 != 0;
    s.size_estimate = in.flag() ? in.u32() : in.range(0, 20000);
    for (auto& c : s.component_specs) {
        c[0] = uint8_t(in.range(0, odd ? 4 : 1));
        c[1] = uint8_t(in.range(odd ? 0 : 1, odd ? 3 : 2)), c[2] = uint8_t(in.range(odd ? 0 : 1, odd ? 3 : 2));
    }
    if (!odd && s.num_components == 1) s.component_specs[0][0] = 0;
    return s;
}

}  // namespace tekoj_fuzz
