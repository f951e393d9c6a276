// Encodes one raw frame N times, with this library or with TurboJPEG, so that
// an instruction counter (scripts/arm-icount-bench.sh runs it under qemu-arm)
// can take the cost of one encode as half the difference between 3 and 1
// repetitions. Timing under emulation means nothing; instruction counts do.
//
//   arm_icount_bench prepare image.jpg frame.rgb WIDTH HEIGHT
//       decodes the top-left WIDTH x HEIGHT crop of image.jpg to raw RGB888
//   arm_icount_bench ours|turbo|parallel FORMAT QUALITY REPS frame.rgb WIDTH HEIGHT
//       FORMAT: rgb888 rgba8888 bgra8888 rgb565 yuv420 grey (both), nv21
//       packed422 packed422k downscale rgb565conv pyv565conv (ours only);
//       parallel: the whole-image formats through the row-parallel calls
//
// All codings are 4:2:0 (grey: one component) with the fast integer DCT, to
// memory. The derived inputs (YUV planes, packed 4:2:2, RGB565) are built
// before the repetitions, so their cost cancels out of the difference.
#include <TekoJEncoderInternal.h>
#include <turbojpeg.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

namespace {

using Bytes = std::vector<uint8_t>;

int fail(const char* what) {
    std::fprintf(stderr, "arm_icount_bench: %s\n", what);
    return 1;
}

bool read_file(const char* path, Bytes& out) {
    FILE* f = std::fopen(path, "rb");
    if (f == nullptr) return false;
    uint8_t chunk[65536];
    size_t n;
    while ((n = std::fread(chunk, 1, sizeof chunk, f)) > 0) out.insert(out.end(), chunk, chunk + n);
    std::fclose(f);
    return true;
}

int prepare(const char* jpeg_path, const char* raw_path, int w, int h) {
    Bytes jpeg;
    if (!read_file(jpeg_path, jpeg)) return fail("cannot read the JPEG");
    tjhandle t = tjInitDecompress();
    int iw, ih, subsamp, cs;
    if (tjDecompressHeader3(t, jpeg.data(), jpeg.size(), &iw, &ih, &subsamp, &cs) != 0 || iw < w || ih < h)
        return fail("JPEG header unreadable or image too small");
    Bytes rgb(static_cast<size_t>(iw) * ih * 3);
    if (tjDecompress2(t, jpeg.data(), jpeg.size(), rgb.data(), iw, 0, ih, TJPF_RGB, 0) != 0) return fail("decode");
    tjDestroy(t);
    FILE* f = std::fopen(raw_path, "wb");
    if (f == nullptr) return fail("cannot write the raw frame");
    const int x0 = 0, y0 = 0;
    for (int y = 0; y < h; ++y) std::fwrite(&rgb[(static_cast<size_t>(y0 + y) * iw + x0) * 3], 3, w, f);
    return std::fclose(f) == 0 ? 0 : fail("write");
}

// Inputs derived from the RGB frame (BT.601, full range).
struct Frame {
    int w = 0, h = 0;
    Bytes rgb, rgba, bgra, rgb565, yuv, grey, nv21, packed;
};

void derive(Frame& f) {
    const int w = f.w, h = f.h, cw = (w + 1) / 2, ch = (h + 1) / 2;
    const size_t n = static_cast<size_t>(w) * h, cn = static_cast<size_t>(cw) * ch;
    f.rgba.resize(n * 4);
    f.bgra.resize(n * 4);
    f.rgb565.resize(n * 2);
    f.grey.resize(n);
    f.yuv.resize(n + 2 * cn);
    f.nv21.resize(n + 2 * cn);
    f.packed.resize(static_cast<size_t>(w / 2) * 4 * h);
    uint8_t* u = f.yuv.data() + n;
    uint8_t* v = u + cn;
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const size_t i = static_cast<size_t>(y) * w + x;
            const uint8_t* p = &f.rgb[i * 3];
            const uint8_t r = p[0], g = p[1], b = p[2];
            const uint8_t rgba[4] = {r, g, b, 255}, bgra[4] = {b, g, r, 255};
            std::memcpy(&f.rgba[i * 4], rgba, 4);
            std::memcpy(&f.bgra[i * 4], bgra, 4);
            const unsigned px = (r >> 3) << 11 | (g >> 2) << 5 | b >> 3;
            f.rgb565[i * 2] = static_cast<uint8_t>(px);
            f.rgb565[i * 2 + 1] = static_cast<uint8_t>(px >> 8);
            const uint8_t yy = static_cast<uint8_t>((77 * r + 150 * g + 29 * b) >> 8);
            const uint8_t uu = static_cast<uint8_t>(128 + ((-43 * r - 85 * g + 128 * b) >> 8));
            const uint8_t vv = static_cast<uint8_t>(128 + ((128 * r - 107 * g - 21 * b) >> 8));
            f.grey[i] = f.yuv[i] = f.nv21[i] = yy;
            if ((x & 1) == 0 && (y & 1) == 0) {
                const size_t c = static_cast<size_t>(y / 2) * cw + x / 2;
                u[c] = uu;
                v[c] = vv;
                f.nv21[n + 2 * c] = vv;
                f.nv21[n + 2 * c + 1] = uu;
            }
            if ((x & 1) == 0 && x + 1 < w) {
                uint8_t* g4 = &f.packed[(static_cast<size_t>(y) * (w / 2) + x / 2) * 4];
                g4[0] = yy;
                g4[1] = uu;
                g4[3] = vv;
            } else if ((x & 1) == 1) {
                f.packed[(static_cast<size_t>(y) * (w / 2) + x / 2) * 4 + 2] = yy;
            }
        }
}

// One encode through the exported coding steps with a reader no format code
// selects (interleaved V/U, packed 4:2:2).
bool encode_steps(const Frame& f, const std::string& format, uint32_t quality, Bytes& out) {
    const bool keep422 = format == "packed422k";
    EncoderSettings settings{3, {}, 2, {}, {}, 1, 0, {{0, 2, 1}, {1, 1, 1}, {1, 1, 1}}};
    std::memset(settings.quant_tables, 8, sizeof settings.quant_tables);
    const uint8_t* data = format == "nv21" ? f.nv21.data() : f.packed.data();
    ImageInfo info{f.w, f.h, data, 0, 0, 0, 0, 0, EKO_FORMAT_YUV420, nullptr};
    OutputRequest req{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(1 << 20)), 1 << 20};
    const EncodeOptions options{quality, nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &req, &options, keep422 ? &settings : nullptr);
    if (ctx == nullptr) return false;
    uint32_t (*read)(EncoderContext*) = format == "nv21" ? __eko_jpeg_enc_get_raw_pvu_data
                                        : keep422        ? __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422
                                                         : __eko_jpeg_enc_get_raw_duoview422_data;
    ctx->plane_y = data;
    ctx->plane_v = data + static_cast<size_t>(f.w) * f.h;
    ctx->read_ptr = data;
    __eko_jpeg_enc_make_header(ctx);
    for (uint32_t band = 0; band < ctx->total_imcu_rows; ++band, ++ctx->sample_rows->band_counter) {
        read(ctx);
        __eko_jpeg_enc_compress_data(ctx, ctx->sample_rows->row_arrays);
    }
    const bool ok = __eko_jpeg_enc_make_end_mark(ctx) == 1;
    out.assign(ctx->output->buffer, ctx->output->buffer + ctx->output->total);
    DORVATEKO_OsFree(ctx->output->buffer);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    return ok;
}

struct Whole {
    const char* name;
    uint32_t format;  // ours
    int turbo_pf;     // TJPF_*, or -1: planar YUV, -2: not available
};

constexpr Whole kWhole[] = {{"rgb888", EKO_FORMAT_RGB888, TJPF_RGB},     {"rgba8888", EKO_FORMAT_RGBA8888, TJPF_RGBA},
                            {"bgra8888", EKO_FORMAT_BGRA8888, TJPF_BGRA}, {"rgb565", EKO_FORMAT_RGB565, -2},
                            {"yuv420", EKO_FORMAT_YUV420, -1},           {"grey", EKO_FORMAT_GREY, TJPF_GRAY}};

const uint8_t* whole_data(const Frame& f, const std::string& name) {
    if (name == "rgb888") return f.rgb.data();
    if (name == "rgba8888") return f.rgba.data();
    if (name == "bgra8888") return f.bgra.data();
    if (name == "rgb565") return f.rgb565.data();
    if (name == "yuv420") return f.yuv.data();
    return f.grey.data();
}

}  // namespace

int main(int argc, char** argv) {
    if (argc == 6 && std::strcmp(argv[1], "prepare") == 0)
        return prepare(argv[2], argv[3], std::atoi(argv[4]), std::atoi(argv[5]));
    if (argc != 8) return fail("usage: ours|turbo FORMAT QUALITY REPS frame.rgb WIDTH HEIGHT (or prepare ...)");
    const std::string who = argv[1], format = argv[2];
    const int quality = std::atoi(argv[3]), reps = std::atoi(argv[4]);
    Frame f;
    f.w = std::atoi(argv[6]);
    f.h = std::atoi(argv[7]);
    if (!read_file(argv[5], f.rgb) || f.rgb.size() != static_cast<size_t>(f.w) * f.h * 3) return fail("raw frame");
    derive(f);
    const Whole* whole = nullptr;
    for (const Whole& c : kWhole)
        if (format == c.name) whole = &c;

    size_t bytes = 0;
    Bytes scratch;
    if (who == "turbo") {
        if (whole == nullptr || whole->turbo_pf == -2) return fail("no TurboJPEG counterpart for this format");
        tjhandle t = tjInitCompress();
        const int subsamp = whole->turbo_pf == TJPF_GRAY ? TJSAMP_GRAY : TJSAMP_420;
        unsigned long cap = tjBufSize(f.w, f.h, subsamp);
        unsigned char* out = tjAlloc(static_cast<int>(cap));
        for (int i = 0; i < reps; ++i) {
            unsigned long size = cap;
            const int flags = TJFLAG_FASTDCT | TJFLAG_NOREALLOC;
            const int rc = whole->turbo_pf == -1
                               ? tjCompressFromYUV(t, f.yuv.data(), f.w, 1, f.h, TJSAMP_420, &out, &size, quality, flags)
                               : tjCompress2(t, whole_data(f, format), f.w, 0, f.h, whole->turbo_pf, &out, &size,
                                             subsamp, quality, flags);
            if (rc != 0) return fail(tjGetErrorStr2(t));
            bytes = size;
        }
        tjFree(out);
        tjDestroy(t);
    } else if (who == "parallel" && whole != nullptr) {
        // The row-parallel calls driven from this one thread, two workers
        // taking turns row by row: the path's own cost, without threads.
        ImageInfo info{f.w, f.h, whole_data(f, format), 0, 0, 0, 0, 0, whole->format, nullptr};
        const EncodeOptions options{static_cast<uint32_t>(quality), nullptr, 0};
        for (int i = 0; i < reps; ++i) {
            const uint32_t cap = static_cast<uint32_t>(f.w * f.h * 2 + 65536);
            const OutputRequest req{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(cap)), cap};
            EkoParallelEncode* e = eko_enc_jpeg_parallel_create(&info, &req, &options, nullptr, nullptr, nullptr, 2);
            const uint32_t rows = eko_enc_jpeg_parallel_row_count(e);
            for (uint32_t k = 0; k < rows; ++k)
                if (eko_enc_jpeg_parallel_rows(e, k & 1, k, 1) != 1) return fail("parallel rows failed");
            uint8_t* block = nullptr;
            uint32_t length = 0;
            if (eko_enc_jpeg_parallel_finish(e, &block, &length) != 1) return fail("parallel finish failed");
            DORVATEKO_OsFree(block);
            bytes = length;
        }
    } else if (who != "ours") {
        return fail("first argument: ours, parallel or turbo");
    } else if (whole != nullptr) {
        ImageInfo info{f.w, f.h, whole_data(f, format), 0, 0, 0, 0, 0, whole->format, nullptr};
        const int32_t cap = f.w * f.h * 2 + 65536;
        for (int i = 0; i < reps; ++i) {
            int32_t length = cap;
            uint8_t* block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(static_cast<uint32_t>(cap)));
            if (eko_enc_jpeg_to_buffer(&info, &block, &length, static_cast<uint32_t>(quality)) != 1)
                return fail("encode failed");
            DORVATEKO_OsFree(block);
            bytes = static_cast<size_t>(length);
        }
    } else if (format == "nv21" || format == "packed422" || format == "packed422k") {
        for (int i = 0; i < reps; ++i) {
            if (!encode_steps(f, format, static_cast<uint32_t>(quality), scratch)) return fail("encode failed");
            bytes = scratch.size();
        }
    } else if (format == "downscale") {
        // Packed 4:2:2 frame to planar 4:2:0 at half size.
        const int dw = f.w / 2, dh = f.h / 2;
        scratch.resize(static_cast<size_t>(dw) * dh + 2 * static_cast<size_t>((dw + 1) / 2) * ((dh + 1) / 2));
        for (int i = 0; i < reps; ++i)
            __eko_jpeg_enc_down_scale_yuv422(f.packed.data(), f.w, f.h, f.w / 2 * 4, scratch.data(), dw, dh);
        bytes = scratch.size();
    } else if (format == "rgb565conv" || format == "pyv565conv") {
        std::vector<uint16_t> out(static_cast<size_t>(f.w) * f.h);
        const uint8_t* src = format == "rgb565conv" ? f.yuv.data() : f.nv21.data();
        for (int i = 0; i < reps; ++i)
            (format == "rgb565conv" ? eko_DuoYUV420toRGB565 : eko_DuoPYV0420toRGB565)(src, f.w, f.h, out.data());
        bytes = out.size() * 2;
    } else {
        return fail("unknown format");
    }
    std::printf("%s %s q%d x%d: %zu bytes\n", who.c_str(), format.c_str(), quality, reps, bytes);
    return 0;
}
