// Image sources: PNM, Y4M, raw YUV and the built-in sample. Row layouts are
// read a band at a time as the encoder asks for them, so memory follows the
// width; the planar YUV layouts keep their planes apart in the file and are
// read one frame at a time.
#include "tool.h"

#include <cmath>
#include <cstring>

namespace tool {

void check_dimensions(uint64_t width, uint64_t height) {
    if (width < 1 || height < 1 || width > 49999 || height > 49999)
        fail("image is " + std::to_string(width) + "x" + std::to_string(height) +
             " pixels; the encoder takes 1 to 49999 on each side");
}

namespace {

// ---------------------------------------------------------------------------
// PNM: P2 and P5 grey, P3 and P6 RGB, maxval up to 65535, '#' comments.

bool is_space(int c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r' || c == '\v' || c == '\f'; }

void skip_space_and_comments(Input& in) {
    for (;;) {
        const int c = in.peek();
        if (is_space(c)) {
            in.get();
        } else if (c == '#') {
            while (in.peek() != -1 && in.get() != '\n') {
            }
        } else {
            return;
        }
    }
}

uint64_t read_number(Input& in, const char* what) {
    skip_space_and_comments(in);
    if (in.peek() < '0' || in.peek() > '9') {
        if (in.peek() == -1) fail(std::string("file ends early: no ") + what);
        fail(std::string("PNM ") + what + " is not a number");
    }
    uint64_t v = 0;
    while (in.peek() >= '0' && in.peek() <= '9') {
        v = v * 10 + static_cast<uint64_t>(in.get() - '0');
        if (v > 0xFFFFFFFFull) fail(std::string("PNM ") + what + " is far too large");
    }
    return v;
}

class PnmSource : public Source {
public:
    PnmSource(Input& in, bool ascii, uint32_t channels, uint32_t maxval)
        : in_(in), ascii_(ascii), channels_(channels), maxval_(maxval) {}

    void read_rows(uint8_t* dst, uint32_t count) override {
        const size_t samples = static_cast<size_t>(width) * channels_;
        if (!ascii_ && maxval_ > 255) wide_.resize(samples * 2);
        for (uint32_t r = 0; r < count; ++r, dst += samples) {
            if (ascii_) {
                for (size_t i = 0; i < samples; ++i) {
                    const uint64_t v = read_number(in_, "sample");
                    if (v > maxval_) fail("sample " + std::to_string(v) + " above maxval " + std::to_string(maxval_));
                    dst[i] = scale(static_cast<uint32_t>(v));
                }
            } else if (maxval_ <= 255) {
                in_.read_exact(dst, samples);
                if (maxval_ != 255)
                    for (size_t i = 0; i < samples; ++i) dst[i] = scale(dst[i]);
            } else {
                in_.read_exact(wide_.data(), wide_.size());
                for (size_t i = 0; i < samples; ++i) dst[i] = scale(static_cast<uint32_t>(wide_[2 * i] << 8 | wide_[2 * i + 1]));
            }
        }
    }

private:
    // Rounded to the nearest 8-bit value; samples above maxval count as maxval.
    uint8_t scale(uint32_t v) const {
        if (v >= maxval_) return 255;
        return static_cast<uint8_t>((v * 255u + maxval_ / 2) / maxval_);
    }
    Input& in_;
    bool ascii_;
    uint32_t channels_, maxval_;
    std::vector<uint8_t> wide_;
};

std::unique_ptr<Source> open_pnm(Input& in) {
    in.get();
    const int type = in.get();
    if (type != '2' && type != '3' && type != '5' && type != '6')
        fail(std::string("PNM type P") + static_cast<char>(type) + " is not supported (P2, P3, P5 and P6 are)");
    const uint64_t width = read_number(in, "width");
    const uint64_t height = read_number(in, "height");
    const uint64_t maxval = read_number(in, "maxval");
    if (maxval < 1 || maxval > 65535) fail("PNM maxval " + std::to_string(maxval) + " is outside 1 to 65535");
    check_dimensions(width, height);
    if (!is_space(in.get())) fail("PNM header does not end in white space");
    const bool rgb = type == '3' || type == '6';
    auto s = std::make_unique<PnmSource>(in, type == '2' || type == '3', rgb ? 3 : 1, static_cast<uint32_t>(maxval));
    s->width = static_cast<uint32_t>(width);
    s->height = static_cast<uint32_t>(height);
    s->layout = rgb ? Layout::Rgb : Layout::Grey;
    s->description = std::string("PNM P") + static_cast<char>(type);
    return s;
}

// ---------------------------------------------------------------------------
// YUV: Y4M frames and raw files. Row layouts stream from the file; planar
// frames are read whole.

// Bytes of one frame, in 64-bit arithmetic; chroma planes are rounded up.
uint64_t frame_bytes(Layout layout, uint64_t w, uint64_t h) {
    if (is_frame(layout)) return w * h + 2 * ((w + 1) / 2) * ((h + 1) / 2);
    return static_cast<uint64_t>(row_bytes(layout, 1)) * w * h;
}

class YuvSource : public Source {
public:
    explicit YuvSource(Input& in) : in_(in) {}
    void read_rows(uint8_t* dst, uint32_t count) override {
        in_.read_exact(dst, static_cast<size_t>(row_bytes(layout, width)) * count);
    }
    // Loads the frame for the planar layouts; the row layouts read on demand.
    void start() {
        if (!is_frame(layout)) return;
        const uint64_t bytes = frame_bytes(layout, width, height);
        if (bytes > SIZE_MAX) fail("frame of " + std::to_string(bytes) + " bytes does not fit in memory");
        frame.resize(static_cast<size_t>(bytes));
        in_.read_exact(frame.data(), frame.size());
    }

private:
    Input& in_;
};

std::string read_line(Input& in, const char* what) {
    std::string line;
    for (;;) {
        const int c = in.get();
        if (c == -1) fail(std::string("file ends early in the ") + what);
        if (c == '\n') return line;
        if (line.size() > 4096) fail(std::string("Y4M ") + what + " is too long");
        line += static_cast<char>(c);
    }
}

std::unique_ptr<Source> open_y4m(Input& in, uint64_t frame) {
    const std::string header = read_line(in, "stream header");
    uint64_t width = 0, height = 0;
    std::string colour = "420jpeg";
    size_t at = 0;
    while ((at = header.find(' ', at)) != std::string::npos) {
        if (++at >= header.size()) break;
        const size_t end = std::min(header.find(' ', at), header.size());
        const char tag = header[at];
        const std::string value = header.substr(at + 1, end - at - 1);
        int64_t n = 0;
        if (tag == 'W' || tag == 'H') {
            if (!parse_integer(value, 1, 0x7FFFFFFF, n)) fail("Y4M " + std::string(1, tag) + " '" + value + "' is not a size");
            (tag == 'W' ? width : height) = static_cast<uint64_t>(n);
        } else if (tag == 'C') {
            colour = value;
        }
    }
    if (width == 0 || height == 0) fail("Y4M header has no W or H");
    check_dimensions(width, height);
    auto s = std::make_unique<YuvSource>(in);
    s->width = static_cast<uint32_t>(width);
    s->height = static_cast<uint32_t>(height);
    if (colour == "mono") {
        s->layout = Layout::Grey;
    } else if (colour == "420jpeg" || colour == "420paldv" || colour == "420mpeg2" || colour == "420") {
        s->layout = Layout::I420;
    } else {
        fail("Y4M colour space C" + colour + " is not supported (4:2:0 and mono are)");
    }
    for (uint64_t i = 0;; ++i) {
        const std::string line = read_line(in, "frame header");
        if (line.compare(0, 5, "FRAME") != 0) fail("Y4M frame " + std::to_string(i) + " does not start with FRAME");
        if (i == frame) break;
        in.skip(frame_bytes(s->layout, width, height));
    }
    s->description = "Y4M frame " + std::to_string(frame);
    s->start();
    return s;
}

std::unique_ptr<Source> open_raw(Input& in, const ReadOptions& o) {
    check_dimensions(o.raw_width, o.raw_height);
    auto s = std::make_unique<YuvSource>(in);
    s->width = o.raw_width;
    s->height = o.raw_height;
    s->layout = o.raw_layout;
    s->description = "raw YUV";
    // At most 49999^2 * 3 / 2 bytes a frame, so 2^31 frames stay below 2^63.
    in.skip(o.frame * frame_bytes(s->layout, s->width, s->height));
    s->start();
    return s;
}

// ---------------------------------------------------------------------------
// The built-in sample: a 1024x768 scene with a sky gradient, a sun, rolling
// hills and a textured field, so that smooth areas, edges and detail all
// show. Rows are drawn on demand.

class SampleSource : public Source {
public:
    SampleSource() {
        width = 1024;
        height = 768;
        layout = Layout::Rgb;
        description = "built-in sample";
    }
    void read_rows(uint8_t* dst, uint32_t count) override {
        for (uint32_t i = 0; i < count; ++i, ++row_) {
            for (uint32_t x = 0; x < width; ++x, dst += 3) {
                const double fx = x / 1023.0, fy = row_ / 767.0;
                double r = 90 + 80 * fy, g = 150 + 60 * fy, b = 235 - 40 * fy;
                const double dx = x - 760.0, dy = row_ - 170.0;
                if (dx * dx + dy * dy < 70.0 * 70.0) r = 255, g = 220, b = 120;
                const double hill = 430 + 60 * std::sin(fx * 7.0) + 25 * std::sin(fx * 23.0 + 1.0);
                if (row_ > hill) {
                    const double tex = 18 * std::sin(x * 0.9 + row_ * 0.35) * std::sin(row_ * 0.7);
                    r = 60 + 40 * fx + tex;
                    g = 140 - 50 * (fy - 0.55) + tex;
                    b = 50 + tex / 2;
                }
                dst[0] = static_cast<uint8_t>(std::fmin(255, std::fmax(0, r)));
                dst[1] = static_cast<uint8_t>(std::fmin(255, std::fmax(0, g)));
                dst[2] = static_cast<uint8_t>(std::fmin(255, std::fmax(0, b)));
            }
        }
    }

private:
    uint32_t row_ = 0;
};

}  // namespace

std::unique_ptr<Source> sample_source() { return std::make_unique<SampleSource>(); }

std::unique_ptr<Source> open_source(Input& in, const ReadOptions& options) {
    if (options.raw_width != 0) return open_raw(in, options);
    static const uint8_t png_signature[8] = {0x89, 'P', 'N', 'G', '\r', '\n', 0x1A, '\n'};
    auto starts_with = [&in](const uint8_t* magic, size_t n) {
        for (size_t i = 0; i < n; ++i)
            if (in.peek(i) != magic[i]) return false;
        return true;
    };
    if (in.peek() == -1) fail("file is empty");
    if (starts_with(png_signature, 8)) return open_png(in, options.background);
    if (in.peek(0) == 'P' && in.peek(1) >= '1' && in.peek(1) <= '7') return open_pnm(in);
    if (starts_with(reinterpret_cast<const uint8_t*>("YUV4MPEG2 "), 10)) return open_y4m(in, options.frame);
    fail("not a PNG, PNM or Y4M image (raw YUV needs --size WxH)");
}

}  // namespace tool
