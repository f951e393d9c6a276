#include "support/test_support.h"
#include "support/fault_os_layer.h"

#include <turbojpeg.h>
#include <jpeglib.h>

#include <csetjmp>

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <iterator>
#include <unistd.h>

namespace tekoj_test {

Decoded decode_jpeg(const Bytes& jpeg, bool force_grey) {
    Decoded d;
    // One decompressor per thread: making one costs more than a small decode.
    thread_local const std::unique_ptr<void, int (*)(tjhandle)> handle(tjInitDecompress(), tjDestroy);
    tjhandle h = handle.get();
    int w = 0, hgt = 0, subsamp = 0, cs = 0;
    if (tjDecompressHeader3(h, jpeg.data(), static_cast<unsigned long>(jpeg.size()), &w, &hgt, &subsamp, &cs) != 0) {
        d.message = tjGetErrorStr2(h);
        return d;
    }
    const bool grey = force_grey || cs == TJCS_GRAY;
    d.width = w;
    d.height = hgt;
    d.components = grey ? 1 : 3;
    d.pixels.resize(static_cast<size_t>(w) * hgt * d.components);
    int rc = tjDecompress2(h, jpeg.data(), static_cast<unsigned long>(jpeg.size()), d.pixels.data(), w, 0, hgt,
                           grey ? TJPF_GRAY : TJPF_RGB, TJFLAG_ACCURATEDCT);
    if (rc != 0) {
        d.message = tjGetErrorStr2(h);
        d.warning = tjGetErrorCode(h) == TJERR_WARNING;
        d.ok = d.warning;
    } else {
        d.ok = true;
    }
    return d;
}

namespace {
struct ErrorManager : jpeg_error_mgr {
    jmp_buf jump;
};
}  // namespace

std::vector<int16_t> coefficients_of(const Bytes& jpeg) {
    jpeg_decompress_struct d;
    ErrorManager error;
    d.err = jpeg_std_error(&error);
    error.error_exit = [](j_common_ptr c) { longjmp(static_cast<ErrorManager*>(c->err)->jump, 1); };
    std::vector<int16_t> out;
    if (setjmp(error.jump)) {
        jpeg_destroy_decompress(&d);
        return {};
    }
    jpeg_create_decompress(&d);
    jpeg_mem_src(&d, jpeg.data(), jpeg.size());
    jpeg_read_header(&d, TRUE);
    jvirt_barray_ptr* planes = jpeg_read_coefficients(&d);
    for (JDIMENSION y = 0; y < d.MCU_rows_in_scan; ++y)
        for (JDIMENSION x = 0; x < d.MCUs_per_row; ++x)
            for (int c = 0; c < d.comps_in_scan; ++c) {
                const jpeg_component_info* k = d.cur_comp_info[c];
                const JDIMENSION h = k->MCU_height, w = k->MCU_width;  // blocks of the MCU
                auto rows = d.mem->access_virt_barray((j_common_ptr)&d, planes[k->component_index], y * h, h, FALSE);
                for (JDIMENSION r = 0; r < h; ++r) out.insert(out.end(), rows[r][x * w], rows[r][x * w] + 64 * w);
            }
    jpeg_finish_decompress(&d);
    const bool warned = error.num_warnings != 0;
    jpeg_destroy_decompress(&d);
    return warned ? std::vector<int16_t>{} : out;
}

double psnr(const uint8_t* a, const uint8_t* b, size_t count) {
    double se = 0;
    for (size_t i = 0; i < count; ++i) {
        double diff = static_cast<double>(a[i]) - b[i];
        se += diff * diff;
    }
    if (se == 0) return 99.0;
    return 10.0 * std::log10(255.0 * 255.0 * static_cast<double>(count) / se);
}

Bytes noise(size_t n, uint32_t seed) {
    Bytes b(n);
    for (auto& v : b) v = static_cast<uint8_t>((seed = seed * 1664525u + 1013904223u) >> 24);
    return b;
}

Bytes noise_with_extremes(size_t n, uint32_t seed) {
    Bytes b(n);
    for (auto& v : b) {
        seed = seed * 1664525u + 1013904223u;
        const uint32_t pick = seed >> 30;
        v = pick == 0 ? 0 : pick == 1 ? 255 : static_cast<uint8_t>(seed >> 16);
    }
    return b;
}

Bytes photo_rgb(int width, int height, uint32_t seed) {
    Bytes out(static_cast<size_t>(width) * height * 3);
    uint32_t s = seed * 2654435761u + 12345u;
    for (int y = 0; y < height; ++y) {
        for (int x = 0; x < width; ++x) {
            s = s * 1664525u + 1013904223u;
            const int noise = static_cast<int>((s >> 24) & 7) - 3;
            const double fx = static_cast<double>(x) / (width > 1 ? width - 1 : 1);
            const double fy = static_cast<double>(y) / (height > 1 ? height - 1 : 1);
            const double ring = std::sin((fx * fx + fy * fy) * 9.0);
            int r = static_cast<int>(40 + 170 * fx + 30 * ring) + noise;
            int g = static_cast<int>(60 + 120 * fy + 40 * std::cos(fx * 5.0)) + noise;
            int b = static_cast<int>(200 - 150 * fx * fy + 25 * ring) + noise;
            const size_t i = (static_cast<size_t>(y) * width + x) * 3;
            out[i] = static_cast<uint8_t>(r < 0 ? 0 : r > 255 ? 255 : r);
            out[i + 1] = static_cast<uint8_t>(g < 0 ? 0 : g > 255 ? 255 : g);
            out[i + 2] = static_cast<uint8_t>(b < 0 ? 0 : b > 255 ? 255 : b);
        }
    }
    return out;
}

int bytes_per_pixel(uint32_t format) {
    switch (format) {
        case EKO_FORMAT_RGB565: return 2;
        case EKO_FORMAT_RGB888: return 3;
        case EKO_FORMAT_RGBA8888:
        case EKO_FORMAT_BGRA8888: return 4;
        default: return 0;
    }
}

size_t image_size(uint32_t format, int width, int height) {
    const size_t n = static_cast<size_t>(width) * height;
    if (format == EKO_FORMAT_GREY) return n;
    if (format == EKO_FORMAT_YUV420) return n + 2 * static_cast<size_t>((width + 1) / 2) * ((height + 1) / 2);
    return n * bytes_per_pixel(format);
}

static uint8_t clamp255(int v) { return static_cast<uint8_t>(v < 0 ? 0 : v > 255 ? 255 : v); }

Bytes rgb_to_grey(const Bytes& rgb, int width, int height) {
    Bytes out(static_cast<size_t>(width) * height);
    for (size_t i = 0; i < out.size(); ++i)
        out[i] = clamp255(static_cast<int>(std::lround(0.299 * rgb[3 * i] + 0.587 * rgb[3 * i + 1] + 0.114 * rgb[3 * i + 2])));
    return out;
}

// Chroma of each 2x2 block's mean colour (what of the block lies inside).
Bytes rgb_to_yuv420(const Bytes& rgb, int width, int height) {
    const int cw = (width + 1) / 2, ch = (height + 1) / 2;
    Bytes out = rgb_to_grey(rgb, width, height);
    out.resize(image_size(EKO_FORMAT_YUV420, width, height));
    uint8_t* u = out.data() + static_cast<size_t>(width) * height;
    uint8_t* v = u + static_cast<size_t>(cw) * ch;
    for (int j = 0; j < ch; ++j)
        for (int i = 0; i < cw; ++i) {
            double sum[3] = {};
            int n = 0;
            for (int y = 2 * j; y < std::min(2 * j + 2, height); ++y)
                for (int x = 2 * i; x < std::min(2 * i + 2, width); ++x, ++n)
                    for (int k = 0; k < 3; ++k) sum[k] += rgb[(static_cast<size_t>(y) * width + x) * 3 + k];
            const double r = sum[0] / n, g = sum[1] / n, b = sum[2] / n;
            u[static_cast<size_t>(j) * cw + i] = clamp255(static_cast<int>(std::lround(128 - 0.168736 * r - 0.331264 * g + 0.5 * b)));
            v[static_cast<size_t>(j) * cw + i] = clamp255(static_cast<int>(std::lround(128 + 0.5 * r - 0.418688 * g - 0.081312 * b)));
        }
    return out;
}

Bytes rgb_to_format(const Bytes& rgb, int width, int height, uint32_t format) {
    const size_t n = static_cast<size_t>(width) * height;
    switch (format) {
        case EKO_FORMAT_YUV420: return rgb_to_yuv420(rgb, width, height);
        case EKO_FORMAT_GREY: return rgb_to_grey(rgb, width, height);
        case EKO_FORMAT_RGB888: return rgb;
        case EKO_FORMAT_RGB565: {
            Bytes out(n * 2);
            for (size_t i = 0; i < n; ++i) {
                uint16_t p = static_cast<uint16_t>(((rgb[3 * i] >> 3) << 11) | ((rgb[3 * i + 1] >> 2) << 5) | (rgb[3 * i + 2] >> 3));
                out[2 * i] = static_cast<uint8_t>(p);
                out[2 * i + 1] = static_cast<uint8_t>(p >> 8);
            }
            return out;
        }
        case EKO_FORMAT_RGBA8888:
        case EKO_FORMAT_BGRA8888: {
            Bytes out(n * 4);
            const bool bgr = format == EKO_FORMAT_BGRA8888;
            for (size_t i = 0; i < n; ++i) {
                out[4 * i] = rgb[3 * i + (bgr ? 2 : 0)];
                out[4 * i + 1] = rgb[3 * i + 1];
                out[4 * i + 2] = rgb[3 * i + (bgr ? 0 : 2)];
                out[4 * i + 3] = 0xA5;
            }
            return out;
        }
        default: return {};
    }
}

ImageInfo image_info(const void* data, int width, int height, uint32_t format) {
    ImageInfo info{};
    info.width = width;
    info.height = height;
    info.data = data;
    info.format = format;
    return info;
}

Bytes encode_to_memory(const ImageInfo& info, uint32_t quality) {
    uint8_t* block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096));
    int32_t length = 4096;
    if (eko_enc_jpeg_to_buffer(&info, &block, &length, quality) != 1) {
        DORVATEKO_OsFree(block);
        return {};
    }
    Bytes out(block, block + length);
    DORVATEKO_OsFree(block);
    return out;
}

EncoderSettings settings(uint32_t size_estimate, uint32_t write_dri, uint8_t h, uint8_t v, uint32_t quality) {
    EncoderSettings s{};
    s.num_components = 3, s.num_quant_tables = 2, s.write_dri = write_dri, s.size_estimate = size_estimate;
    const uint8_t specs[3][3] = {{0, h, v}, {1, 1, 1}, {1, 1, 1}};
    std::memcpy(s.component_specs, specs, sizeof specs);
    // The usual tables, scaled as for qualities 50..99.
    for (int i = 0, scale = 200 - 2 * static_cast<int>(quality); i < 64; ++i) {
        s.quant_tables[0][i] = uint8_t((eko_luminanceQuantTbl[0][i] * scale + 50) / 100);
        s.quant_tables[1][i] = uint8_t((eko_chrominanceQuantTbl[0][i] * scale + 50) / 100);
    }
    return s;
}

Context::Context(const ImageInfo& info, const EncoderSettings* settings, uint32_t quality) {
    const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(2048)), 2048};
    const EncodeOptions options{quality, nullptr, 0};
    ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, settings);
    if (ctx == nullptr) DORVATEKO_OsFree(request.buffer);  // refused: still ours
}

Context::~Context() {
    if (ctx != nullptr) release(ctx);
}

void Context::mark_band_rows() {
    for (int c = 0; c < ctx->num_components; ++c)
        for (uint32_t r = 0; r < ctx->comp_info[c].band_rows; ++r)
            std::memset(ctx->sample_rows->row_arrays[c][r], 0xEE, ctx->comp_info[c].padded_width);
}

Bytes Context::cells(int component, uint32_t row) const {
    const uint8_t* r = ctx->sample_rows->row_arrays[component][row];
    return Bytes(r, r + ctx->comp_info[component].padded_width);
}

Bytes Context::written(size_t from) const {
    return Bytes(ctx->output->buffer + from, ctx->output->buffer + ctx->output->used);
}

void release(EncoderContext* ctx) {
    DORVATEKO_OsFree(ctx->output->buffer);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
}

Bytes encode_in_steps(const ImageInfo& info, const EncoderSettings* settings, uint32_t quality) {
    Context c(info, settings, quality);
    if (c.ctx == nullptr) return {};
    EXPECT_EQ(__eko_jpeg_enc_make_header(c.ctx), 1u);
    for (; c->next_row < uint32_t(c->height); c->next_row = uint16_t(c->next_row + c->max_v_samp * 8))
        EXPECT_EQ(__eko_jpeg_enc_process_image_data(c.ctx), 1u);
    EXPECT_EQ(__eko_jpeg_enc_make_end_mark(c.ctx), 1u);
    return Bytes(c->output->buffer, c->output->buffer + c->output->total);
}

std::vector<Bytes> header_segments(const Bytes& j) {
    std::vector<Bytes> out{Bytes(j.begin(), j.begin() + std::min<long>(2, long(j.size())))};
    for (size_t i = 2; i + 4 <= j.size() && j[i] == 0xFF;) {
        const size_t len = size_t(j[i + 2]) << 8 | j[i + 3];
        out.emplace_back(j.begin() + long(i), j.begin() + long(std::min(i + 2 + len, j.size())));
        if (j[i + 1] == 0xDA) break;
        i += 2 + len;
    }
    return out;
}

Bytes segment(const Bytes& jpeg, uint8_t code) {
    for (Bytes& s : header_segments(jpeg))
        if (s.size() >= 2 && s[1] == code) return s;
    return {};
}

size_t find_marker(const Bytes& j, uint8_t code) {
    const uint8_t marker[2] = {0xFF, code};
    return size_t(std::search(j.begin(), j.end(), marker, marker + 2) - j.begin());
}

size_t open_descriptors() {
    using std::filesystem::directory_iterator;
    return size_t(std::distance(directory_iterator("/proc/self/fd"), directory_iterator{}));
}

NoLeak::~NoLeak() {
    EXPECT_EQ(live_blocks(), live);
    EXPECT_EQ(open_descriptors(), fds);
}

std::string member_name(int m) {
    static const char* const names[kMembers] = {
        "to_file", "to_file_ex", "to_file_full_buffer", "to_file_ex_full_buffer", "to_buffer", "to_buffer_ex",
        "to_buffer_full_buffer", "to_buffer_ex_full_buffer", "to_stream", "to_stream_ex"};
    return m >= 0 && m < kMembers ? names[m] : "?";
}

Call call_member(int m, const ImageInfo& info, uint32_t quality, const std::string& path, int32_t start,
                 int64_t fail_at) {
    Call c;
    const EncodeOptions options{quality, nullptr, 0};
    if (!is_memory_member(m)) start = 0;
    uint8_t* const block = start > 0 ? static_cast<uint8_t*>(DORVATEKO_OsMalloc(uint32_t(start))) : nullptr;
    uint8_t* buffer = block;
    int32_t length = start;
    OutputRequest request{99, nullptr, block, uint32_t(start)};  // the members set the kind themselves
    if (m == kToFileFull || m == kToFileExFull) request.file = DORVATEKO_OsFopen(path.c_str(), "wb");
    // The callback's result must not matter: 0 says "refused".
    const EkoStreamCallback sink = [](void* arg, const uint8_t* data, uint32_t n) -> uint32_t {
        auto* to = static_cast<Call*>(arg);
        to->out.insert(to->out.end(), data, data + n);
        to->largest_piece = std::max(to->largest_piece, n);
        to->pieces.emplace_back(data, Bytes(data, data + n));
        return 0;
    };
    if (fail_at >= 0) fail_allocation(fail_at);
    switch (m) {
        case kToFile: c.result = eko_enc_jpeg_to_file(&info, path.c_str(), quality); break;
        case kToFileEx: c.result = eko_enc_jpeg_to_file_ex(&info, path.c_str(), &options); break;
        case kToFileFull: c.result = eko_enc_jpeg_to_file_full_buffer(&info, &request, quality); break;
        case kToFileExFull: c.result = eko_enc_jpeg_to_file_ex_full_buffer(&info, &request, &options); break;
        case kToBuffer: c.result = eko_enc_jpeg_to_buffer(&info, &buffer, &length, quality); break;
        case kToBufferEx: c.result = eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options); break;
        case kToBufferFull: c.result = eko_enc_jpeg_to_buffer_full_buffer(&info, &request, quality); break;
        case kToBufferExFull: c.result = eko_enc_jpeg_to_buffer_ex_full_buffer(&info, &request, &options); break;
        case kToStream: c.result = eko_enc_jpeg_to_stream(&info, sink, quality, &c); break;
        default: c.result = eko_enc_jpeg_to_stream_ex(&info, sink, &options, &c);
    }
    if (fail_at >= 0) fail_allocation(-1);
    if (m == kToBufferFull || m == kToBufferExFull) buffer = request.buffer, length = int32_t(request.capacity);
    if (is_memory_member(m)) {
        c.kept = buffer == block && length == start;
        if (c.result == 1) c.out.assign(buffer, buffer + length);
        // eko_enc_jpeg_to_buffer enlarges a short block before anything else.
        const bool enlarged = m == kToBuffer && start < 2048 && buffer != nullptr && length == 2048;
        if (c.result == 0) { EXPECT_TRUE(c.kept || enlarged || (buffer == nullptr && length == 0)) << member_name(m); }
        DORVATEKO_OsFree(buffer);
    } else if (m <= kToFileExFull) {
        c.out.clear();
        if (c.result == 1 && std::filesystem::is_regular_file(path)) c.out = read_file(path);
    } else if (c.result == 0) {
        c.out.clear();
    }
    return c;
}

Bytes without_date(Bytes b) {
    static const char kPattern[] = "dddd:dd:dd dd:dd:dd";
    for (size_t i = 0; i + 19 <= b.size(); ++i) {
        size_t k = 0;
        while (k < 19 && (kPattern[k] == 'd' ? b[i + k] >= '0' && b[i + k] <= '9' : b[i + k] == uint8_t(kPattern[k]))) ++k;
        if (k == 19) std::fill(b.begin() + long(i), b.begin() + long(i + 19), uint8_t('#'));
    }
    return b;
}

Bytes read_file(const std::string& path) {
    std::ifstream f(path, std::ios::binary);
    return Bytes(std::istreambuf_iterator<char>(f), std::istreambuf_iterator<char>());
}

bool file_exists(const std::string& path) { return std::ifstream(path).good(); }

std::string golden_path(const std::string& name) { return std::string(TEKOJ_GOLDEN_DIR) + "/" + name; }

std::string temp_path(const std::string& name) {
    // In memory when the system offers it: some tests write thousands of files.
    static const std::string dir = std::filesystem::is_directory("/dev/shm") ? "/dev/shm" : "/tmp";
    return dir + "/tekoj_test_" + std::to_string(::getpid()) + "_" + name;
}

}  // namespace tekoj_test
