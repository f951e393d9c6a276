// libTekoJEncoder, C++ interface (C++17 and later), header-only over the C
// functions.
//
//   tekoj::Encoder enc;
//   enc.quality(90);
//   std::vector<uint8_t> jpeg = enc.encode(tekoj::ImageView(pixels, w, h, tekoj::PixelFormat::rgb888, stride));
//
// - ImageView describes the caller's pixels, with a row stride per plane; it
//   never owns them. The encoder copies one band (16 rows) at a time into the
//   layout the library reads, never the whole frame.
// - Besides the C formats it takes NV21, NV12 (luma plus interleaved chroma)
//   and packed 4:2:2 YUYV and UYVY.
// - Output goes to a std::vector, a file, or any callable sink taking
//   (const uint8_t* data, size_t size); a sink may return bool, false meaning
//   "stop" (reported as EKO_ERR_WRITE).
// - Failures throw tekoj::Error (code() and a readable what()); an exception
//   thrown by a sink reaches the caller unchanged. The try_ members throw
//   nothing and return the error code instead.
// - An optional EXIF description (tekoj::Exif, plain strings and numbers) and
//   an EXIF thumbnail that the library down-scales and encodes itself.
#ifndef TEKOJ_ENCODER_HPP
#define TEKOJ_ENCODER_HPP

#include <TekoJEncoderInternal.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <functional>
#include <memory>
#include <mutex>
#include <new>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <thread>
#include <tuple>
#include <type_traits>
#include <utility>
#include <vector>

namespace tekoj {

// A readable sentence for each EkoError code.
inline std::string_view error_message(uint32_t code) noexcept {
    switch (code) {
        case EKO_OK: return "no error";
        case EKO_ERR_ALLOC: return "memory allocation failed";
        case EKO_ERR_FORMAT: return "pixel format not supported";
        case EKO_ERR_SAMPLING: return "component count, sampling factors or quantisation tables not supported";
        case EKO_ERR_DIMENSIONS: return "width or height outside 1..49999";
        case EKO_ERR_ARGUMENT: return "invalid argument (null pointer, stride shorter than a row, value out of range)";
        case EKO_ERR_WRITE: return "writing the output failed";
        case EKO_ERR_TOO_LARGE: return "output larger than its length field can describe";
        case EKO_ERR_STATE: return "call out of order";
        case EKO_ERR_OPEN: return "the output file could not be opened";
        default: return "unknown error";
    }
}

class Error : public std::runtime_error {
public:
    explicit Error(uint32_t code)
        : std::runtime_error("TekoJEncoder: " + std::string(error_message(code))), code_(code) {}
    uint32_t code() const noexcept { return code_; }

private:
    uint32_t code_;
};

enum class PixelFormat {
    rgb565,    // little-endian 16-bit words
    rgb888,    // R, G, B
    rgba8888,  // R, G, B, A (A ignored)
    bgra8888,  // B, G, R, A (A ignored)
    grey,      // one 8-bit plane
    i420,      // planes Y, U (Cb), V (Cr), chroma halved both ways
    nv21,      // plane Y, then one plane of V, U pairs (Android camera default)
    nv12,      // plane Y, then one plane of U, V pairs
    yuyv,      // packed 4:2:2: Y0 U Y1 V per two pixels
    uyvy,      // packed 4:2:2: U Y0 V Y1 per two pixels
};

// The caller's pixels: width, height, format and up to three planes, each
// with its own row stride in bytes. Views are cheap to copy and own nothing;
// the pixels must stay valid during an encode.
struct ImageView {
    int32_t width = 0;
    int32_t height = 0;
    PixelFormat format = PixelFormat::rgb888;
    std::array<const uint8_t*, 3> plane{};
    std::array<size_t, 3> stride{};

    ImageView() = default;

    // One block of memory. `stride` (bytes from one row to the next; 0:
    // tightly packed) applies to the packed formats and to the luma plane of
    // the YUV ones. The chroma planes follow the luma plane (height rows):
    // i420 with tight rows of (width + 1) / 2 bytes (U then V, each
    // (height + 1) / 2 rows; use planar() for padded chroma rows); nv21 and
    // nv12 with rows as long as the luma stride (at least width rounded up
    // to even).
    ImageView(const void* pixels, int32_t w, int32_t h, PixelFormat f, size_t row_stride = 0)
        : width(w), height(h), format(f) {
        const auto* p = static_cast<const uint8_t*>(pixels);
        const size_t rows = h > 0 ? static_cast<size_t>(h) : 0;
        const size_t chroma_rows = (rows + 1) / 2;
        const size_t cw = w > 0 ? (static_cast<size_t>(w) + 1) / 2 : 0;
        stride[0] = row_stride != 0 ? row_stride : row_bytes(f, w);
        plane[0] = p;
        if (p == nullptr) return;
        if (f == PixelFormat::i420) {
            stride[1] = stride[2] = cw;
            plane[1] = p + stride[0] * rows;
            plane[2] = plane[1] + cw * chroma_rows;
        } else if (f == PixelFormat::nv21 || f == PixelFormat::nv12) {
            stride[1] = std::max(stride[0], 2 * cw);
            plane[1] = p + stride[0] * rows;
        }
    }

    // Three separate planes (i420).
    static ImageView planar(int32_t w, int32_t h, const uint8_t* y, size_t y_stride, const uint8_t* u,
                            size_t u_stride, const uint8_t* v, size_t v_stride) {
        ImageView view;
        view.width = w;
        view.height = h;
        view.format = PixelFormat::i420;
        view.plane = {y, u, v};
        view.stride = {y_stride, u_stride, v_stride};
        return view;
    }

    // A luma plane and an interleaved chroma plane (nv21 or nv12).
    static ImageView semi_planar(PixelFormat f, int32_t w, int32_t h, const uint8_t* y, size_t y_stride,
                                 const uint8_t* chroma, size_t chroma_stride) {
        ImageView view;
        view.width = w;
        view.height = h;
        view.format = f;
        view.plane = {y, chroma, nullptr};
        view.stride = {y_stride, chroma_stride, 0};
        return view;
    }

    // Bytes of one row of plane 0 without padding.
    static size_t row_bytes(PixelFormat f, int32_t w) noexcept {
        const size_t n = w > 0 ? static_cast<size_t>(w) : 0;
        switch (f) {
            case PixelFormat::rgb565: return 2 * n;
            case PixelFormat::rgb888: return 3 * n;
            case PixelFormat::rgba8888:
            case PixelFormat::bgra8888: return 4 * n;
            case PixelFormat::yuyv:
            case PixelFormat::uyvy: return 2 * ((n + 1) / 2) * 2;
            default: return n;
        }
    }
};

struct Rational {
    uint32_t numerator = 0;
    uint32_t denominator = 0;  // 0/0: left out
};

struct Gps {
    char latitude_ref = 'N';  // 'N' or 'S'
    std::array<Rational, 3> latitude{};  // degrees, minutes, seconds
    char longitude_ref = 'E';  // 'E' or 'W'
    std::array<Rational, 3> longitude{};
    std::optional<bool> below_sea_level;  // unset: no altitude reference
    Rational altitude{};                   // metres
    std::array<Rational, 3> time_stamp{};  // UTC hours, minutes, seconds
    std::string processing_method;         // empty: left out
};

// The EXIF description. Empty strings and zero numbers are left out of the
// segment (white_balance is always written); the values are those of
// ExifInfo in <TekoJEncoder.h>.
struct Exif {
    std::string make;
    std::string model;
    uint32_t orientation = 0;  // 1 upright .. 8
    Rational x_resolution{};
    Rational y_resolution{};
    uint32_t resolution_unit = 0;  // 2 inches, 3 centimetres
    uint32_t ycbcr_positioning = 0;
    Rational exposure_time{};
    bool stamp_date_time = false;  // DateTime = local time of the encode
    uint32_t flash = 0;
    uint16_t white_balance = 0;  // 0 auto, 1 manual
    Rational focal_length{};
    uint32_t iso_speed = 0;
    Rational f_number{};
    std::optional<Gps> gps;
};

// An EXIF thumbnail made by the library from the image itself: down-scaled
// to fit max_width x max_height (aspect kept, never enlarged) and encoded as
// JPEG; quality is lowered if needed to keep the EXIF segment within 64 KB.
struct Thumbnail {
    int32_t max_width = 160;
    int32_t max_height = 120;
    uint32_t quality = 75;
};

// What the non-throwing encode gives back.
struct Result {
    std::vector<uint8_t> bytes;
    uint32_t error = EKO_OK;
    explicit operator bool() const noexcept { return error == EKO_OK; }
    std::string_view message() const noexcept { return error_message(error); }
};

namespace detail {

// Pieces of the stream go to a type-erased sink; after a sink failure the
// rest of the stream is dropped and the encode stops at the next band.
struct SinkState {
    void* sink = nullptr;
    bool (*call)(void* sink, const uint8_t* data, size_t size) = nullptr;
    bool failed = false;
    std::exception_ptr exception;
};

inline uint32_t sink_trampoline(void* arg, const uint8_t* data, uint32_t count) {
    auto* state = static_cast<SinkState*>(arg);
    if (state->failed) return 0;
    try {
        if (!state->call(state->sink, data, count)) state->failed = true;
    } catch (...) {
        state->failed = true;
        state->exception = std::current_exception();
    }
    return state->failed ? 0 : count;
}

template <class Sink>
bool call_sink(void* sink, const uint8_t* data, size_t size) {
    auto& fn = *static_cast<std::remove_reference_t<Sink>*>(sink);
    if constexpr (std::is_void_v<decltype(fn(data, size))>) {
        fn(data, size);
        return true;
    } else {
        return static_cast<bool>(fn(data, size));
    }
}

// A null function pointer is refused before anything is coded.
template <class Sink>
bool null_sink(const Sink& sink) {
    if constexpr (std::is_pointer_v<Sink>)
        return sink == nullptr;
    else
        return false;
}

template <class Sink>
SinkState make_sink(Sink& sink) {
    SinkState state;
    state.sink = const_cast<void*>(static_cast<const void*>(std::addressof(sink)));
    state.call = &call_sink<Sink>;
    return state;
}

inline bool is_yuv(PixelFormat f) {
    return f == PixelFormat::i420 || f == PixelFormat::nv21 || f == PixelFormat::nv12 || f == PixelFormat::yuyv ||
           f == PixelFormat::uyvy;
}

// Checks pointers and strides; the library checks the dimensions.
inline uint32_t check_view(const ImageView& v) {
    if (v.width < 1 || v.height < 1 || v.width > 49999 || v.height > 49999) return EKO_ERR_DIMENSIONS;
    const size_t cw = (static_cast<size_t>(v.width) + 1) / 2;
    if (v.plane[0] == nullptr || v.stride[0] < ImageView::row_bytes(v.format, v.width)) return EKO_ERR_ARGUMENT;
    switch (v.format) {
        case PixelFormat::i420:
            if (v.plane[1] == nullptr || v.plane[2] == nullptr || v.stride[1] < cw || v.stride[2] < cw)
                return EKO_ERR_ARGUMENT;
            break;
        case PixelFormat::nv21:
        case PixelFormat::nv12:
            if (v.plane[1] == nullptr || v.stride[1] < 2 * cw) return EKO_ERR_ARGUMENT;
            break;
        default: break;
    }
    return EKO_OK;
}

inline uint32_t library_format(PixelFormat f) {
    switch (f) {
        case PixelFormat::rgb565: return EKO_FORMAT_RGB565;
        case PixelFormat::rgb888: return EKO_FORMAT_RGB888;
        case PixelFormat::rgba8888: return EKO_FORMAT_RGBA8888;
        case PixelFormat::bgra8888: return EKO_FORMAT_BGRA8888;
        case PixelFormat::grey: return EKO_FORMAT_GREY;
        default: return EKO_FORMAT_YUV420;  // every YUV input is coded 4:2:0
    }
}

// Copies `count` bytes of a packed 4:2:2 row, turning UYVY into the YUYV
// order the library's reader takes.
inline void copy_422_row(uint8_t* dst, const uint8_t* src, size_t count, bool uyvy) {
    if (!uyvy) {
        std::copy(src, src + count, dst);
        return;
    }
    for (size_t i = 0; i + 3 < count; i += 4) {
        dst[i] = src[i + 1];
        dst[i + 1] = src[i];
        dst[i + 2] = src[i + 3];
        dst[i + 3] = src[i + 2];
    }
}

// One band of the view, copied into the layout the library's readers take
// (rows packed without padding), and the read positions set to it.
class BandCopier {
public:
    BandCopier(const ImageView& v, uint32_t band_rows) : v_(v), band_rows_(band_rows) {
        const size_t w = static_cast<size_t>(v.width);
        cw_ = (w + 1) / 2;
        switch (v.format) {
            case PixelFormat::i420: buffer_.resize(w * band_rows + 2 * cw_ * (band_rows / 2)); break;
            case PixelFormat::nv21:
            case PixelFormat::nv12: buffer_.resize(w * band_rows + 2 * cw_ * (band_rows / 2)); break;
            case PixelFormat::yuyv:
            case PixelFormat::uyvy: buffer_.resize((w / 2) * 4 * band_rows + 1); break;
            default: buffer_.resize(ImageView::row_bytes(v.format, v.width) * band_rows); break;
        }
    }

    const uint8_t* data() const { return buffer_.data(); }

    // Copies the band that starts at image row `top` and points the
    // context's read positions at it.
    void load(EncoderContext* ctx, uint32_t top) {
        const size_t w = static_cast<size_t>(v_.width);
        const uint32_t rows = std::min<uint32_t>(band_rows_, static_cast<uint32_t>(v_.height) - top);
        const uint32_t crows = (rows + 1) / 2, ctop = top / 2;
        uint8_t* out = buffer_.data();
        switch (v_.format) {
            case PixelFormat::i420: {
                uint8_t* u = out + w * band_rows_;
                uint8_t* vv = u + cw_ * (band_rows_ / 2);
                copy_rows(out, v_.plane[0], v_.stride[0], top, rows, w);
                copy_rows(u, v_.plane[1], v_.stride[1], ctop, crows, cw_);
                copy_rows(vv, v_.plane[2], v_.stride[2], ctop, crows, cw_);
                ctx->plane_y = out;
                ctx->plane_u = u;
                ctx->plane_v = vv;
                break;
            }
            case PixelFormat::nv21:
            case PixelFormat::nv12: {
                uint8_t* vu = out + w * band_rows_;
                copy_rows(out, v_.plane[0], v_.stride[0], top, rows, w);
                copy_rows(vu, v_.plane[1], v_.stride[1], ctop, crows, 2 * cw_);
                // The library's reader takes V first in each pair.
                if (v_.format == PixelFormat::nv12)
                    for (size_t i = 0; i < 2 * cw_ * crows; i += 2) std::swap(vu[i], vu[i + 1]);
                ctx->plane_y = out;
                ctx->plane_v = vu;
                break;
            }
            case PixelFormat::yuyv:
            case PixelFormat::uyvy: {
                const size_t n = (w / 2) * 4;
                for (uint32_t r = 0; r < rows; ++r)
                    copy_422_row(out + n * r, v_.plane[0] + v_.stride[0] * (top + r), n,
                                 v_.format == PixelFormat::uyvy);
                ctx->read_ptr = out;
                break;
            }
            case PixelFormat::grey:
                copy_rows(out, v_.plane[0], v_.stride[0], top, rows, w);
                ctx->plane_y = out;
                break;
            default:
                copy_rows(out, v_.plane[0], v_.stride[0], top, rows, ImageView::row_bytes(v_.format, v_.width));
                ctx->read_ptr = out;
                break;
        }
    }

private:
    static void copy_rows(uint8_t* dst, const uint8_t* src, size_t stride, uint32_t top, uint32_t rows,
                          size_t n) {
        for (uint32_t r = 0; r < rows; ++r) std::copy_n(src + stride * (top + r), n, dst + n * r);
    }

    const ImageView& v_;
    uint32_t band_rows_;
    size_t cw_ = 0;
    std::vector<uint8_t> buffer_;
};

// Releases a context made by the library's creation step.
struct ContextGuard {
    EncoderContext* ctx = nullptr;
    ~ContextGuard() {
        if (ctx == nullptr) return;
        if (ctx->work_buffer != nullptr) DORVATEKO_OsFree(ctx->work_buffer);
        ctx->work_buffer = nullptr;
        __eko_jpeg_enc_release_mem(ctx);
        DORVATEKO_OsFree(ctx);
    }
};

inline ExifRational rational(const Rational& r) { return ExifRational{r.numerator, r.denominator}; }

// The C records for an Exif description; they point into `exif` and `gps`.
struct ExifRecords {
    ExifInfo info{};
    GpsInfo gps{};
};

inline void fill_exif(const Exif& e, ExifRecords& out) {
    ExifInfo& x = out.info;
    x.make = e.make.empty() ? nullptr : e.make.c_str();
    x.model = e.model.empty() ? nullptr : e.model.c_str();
    x.orientation = e.orientation;
    x.x_resolution = rational(e.x_resolution);
    x.y_resolution = rational(e.y_resolution);
    x.resolution_unit = e.resolution_unit;
    x.ycbcr_positioning = e.ycbcr_positioning;
    x.exposure_time = rational(e.exposure_time);
    x.stamp_date_time = e.stamp_date_time ? 1 : 0;
    x.flash = e.flash;
    x.white_balance = e.white_balance;
    x.focal_length = rational(e.focal_length);
    x.iso_speed = e.iso_speed;
    x.f_number = rational(e.f_number);
    if (e.gps) {
        const Gps& g = *e.gps;
        GpsInfo& o = out.gps;
        o.latitude_ref[0] = g.latitude_ref;
        o.longitude_ref[0] = g.longitude_ref;
        for (int i = 0; i < 3; ++i) {
            o.latitude[i] = rational(g.latitude[i]);
            o.longitude[i] = rational(g.longitude[i]);
            o.time_stamp[i] = rational(g.time_stamp[i]);
        }
        o.altitude_ref = g.below_sea_level ? (*g.below_sea_level ? 1 : 0) : 0xFF;
        o.altitude = rational(g.altitude);
        o.processing_method = g.processing_method.empty() ? nullptr : g.processing_method.c_str();
        x.gps = &o;
    }
}

}  // namespace detail

// Runs each job it is given on some thread, in any order, and may return
// before they finish (a thread pool's submit). Parallel encodes wait for
// their jobs themselves.
using Executor = std::function<void(std::function<void()> job)>;

namespace detail {

// The library reads C formats from the caller's memory itself when their
// rows (and i420 planes) lie exactly as its format codes describe.
inline bool library_reads_directly(const ImageView& v) {
    const size_t w = static_cast<size_t>(v.width), h = static_cast<size_t>(v.height);
    const size_t cw = (w + 1) / 2, ch = (h + 1) / 2;
    switch (v.format) {
        case PixelFormat::rgb565:
        case PixelFormat::rgb888:
        case PixelFormat::rgba8888:
        case PixelFormat::bgra8888:
        case PixelFormat::grey: return v.stride[0] == ImageView::row_bytes(v.format, v.width);
        case PixelFormat::i420:
            return v.stride[0] == w && v.stride[1] == cw && v.stride[2] == cw && v.plane[1] == v.plane[0] + w * h &&
                   v.plane[2] == v.plane[1] + cw * ch;
        default: return false;
    }
}

// Codes every MCU row of `encode`: the calling thread and up to `threads` - 1
// more (std::threads, or jobs handed to `executor`) take rows in order from a
// shared counter, so that a row waits only for rows being coded.
inline void run_rows(EkoParallelEncode* encode, uint32_t threads, const Executor* executor) {
    const uint32_t rows = eko_enc_jpeg_parallel_row_count(encode);
    std::atomic<uint32_t> next{0};
    auto work = [encode, rows, &next](uint32_t worker) {
        for (uint32_t row; (row = next.fetch_add(1)) < rows;)
            if (eko_enc_jpeg_parallel_rows(encode, worker, row, 1) != 1) break;
    };
    const uint32_t helpers = std::min(threads, rows) - 1;
    std::mutex lock;
    std::condition_variable finished;
    uint32_t running = 0;
    std::vector<std::thread> pool;
    for (uint32_t w = 1; w <= helpers; ++w) {
        // A helper that cannot be started leaves its rows to the others.
        try {
            if (executor == nullptr || !*executor) {
                pool.emplace_back(work, w);
                continue;
            }
            {
                std::lock_guard<std::mutex> g(lock);
                ++running;
            }
            (*executor)([&, w] {
                work(w);
                std::lock_guard<std::mutex> g(lock);
                if (--running == 0) finished.notify_one();
            });
        } catch (...) {
            if (executor != nullptr && *executor) {
                std::lock_guard<std::mutex> g(lock);
                --running;
            }
        }
    }
    work(0);
    for (auto& t : pool) t.join();
    std::unique_lock<std::mutex> g(lock);
    finished.wait(g, [&] { return running == 0; });
}

// Codes `v` with several threads through the row-parallel calls; the same
// results as encode_view.
inline uint32_t encode_parallel(const ImageView& v, uint32_t quality, const ExifInfo* exif, SinkState& state,
                                unsigned threads, const Executor* executor) noexcept {
    try {
        ImageInfo info{};
        info.width = v.width;
        info.height = v.height;
        info.data = v.plane[0];
        info.format = library_format(v.format);
        info.exif_info = exif;
        const EncodeOptions options{quality, nullptr, 0};
        const OutputRequest request{EKO_OUTPUT_STREAM, nullptr, nullptr, 0};
        const unsigned cores = threads != 0 ? threads : std::max(1u, std::thread::hardware_concurrency());
        const uint32_t workers = std::min(cores, 64u);
        eko_SetError(EKO_OK);
        EkoParallelEncode* encode =
            eko_enc_jpeg_parallel_create(&info, &request, &options, nullptr, &sink_trampoline, &state, workers);
        if (encode == nullptr) {
            const uint32_t code = eko_GetLastError();
            return code != EKO_OK ? code : static_cast<uint32_t>(EKO_ERR_ARGUMENT);
        }
        run_rows(encode, workers, executor);
        const bool ok = eko_enc_jpeg_parallel_finish(encode, nullptr, nullptr) == 1;
        if (state.failed) return EKO_ERR_WRITE;
        if (ok) return EKO_OK;
        const uint32_t code = eko_GetLastError();
        return code != EKO_OK ? code : static_cast<uint32_t>(EKO_ERR_STATE);
    } catch (const std::bad_alloc&) {
        return EKO_ERR_ALLOC;
    }
}

// Codes `v` band by band into the sink. Returns the error code; sink
// failures show as EKO_ERR_WRITE with the sink's exception in `state`.
// With `threads` other than 1 (0: one per core) a view the library can read
// directly is coded by several threads into the same bytes.
inline uint32_t encode_view(const ImageView& v, uint32_t quality, const ExifInfo* exif, SinkState& state,
                            unsigned threads = 1, const Executor* executor = nullptr) noexcept {
    try {
        if (const uint32_t bad = check_view(v); bad != EKO_OK) return bad;
        if (threads != 1 && library_reads_directly(v))
            return encode_parallel(v, quality, exif, state, threads, executor);
        const uint32_t band_rows = v.format == PixelFormat::grey ? 8 : 16;
        BandCopier band(v, band_rows);
        ImageInfo info{};
        info.width = v.width;
        info.height = v.height;
        info.data = band.data();
        info.format = library_format(v.format);
        const EncodeOptions options{quality, nullptr, 0};
        const OutputRequest request{EKO_OUTPUT_STREAM, nullptr, nullptr, 0};
        eko_SetError(EKO_OK);
        ContextGuard guard{__eko_jpeg_enc_initiaize(&info, &request, &options, nullptr)};
        EncoderContext* ctx = guard.ctx;
        if (ctx == nullptr) {
            const uint32_t code = eko_GetLastError();
            return code != EKO_OK ? code : static_cast<uint32_t>(EKO_ERR_ARGUMENT);
        }
        ctx->output->callback = &sink_trampoline;
        ctx->output->callback_arg = &state;
        ctx->exif_info = exif;
        __eko_jpeg_enc_make_header(ctx);
        // NV21/NV12 and packed 4:2:2 go through their exported readers, the
        // other formats through the reader their format code selects.
        uint32_t (*reader)(EncoderContext*) = nullptr;
        if (v.format == PixelFormat::nv21 || v.format == PixelFormat::nv12)
            reader = &__eko_jpeg_enc_get_raw_pvu_data;
        else if (v.format == PixelFormat::yuyv || v.format == PixelFormat::uyvy)
            reader = &__eko_jpeg_enc_get_raw_duoview422_data;
        for (uint32_t top = 0; top < static_cast<uint32_t>(v.height) && ctx->failed == 0 && !state.failed;
             top += band_rows) {
            band.load(ctx, top);
            if (reader == nullptr) {
                __eko_jpeg_enc_process_image_data(ctx);
            } else {
                reader(ctx);
                __eko_jpeg_enc_compress_data(ctx, ctx->sample_rows->row_arrays);
            }
        }
        if (ctx->failed == 0 && !state.failed) __eko_jpeg_enc_make_end_mark(ctx);
        if (state.failed) return EKO_ERR_WRITE;
        return ctx->failed;
    } catch (const std::bad_alloc&) {
        return EKO_ERR_ALLOC;
    }
}

// Fits w x h into the thumbnail box, keeping the aspect ratio.
inline std::pair<int32_t, int32_t> thumbnail_size(int32_t w, int32_t h, const Thumbnail& t) {
    const int64_t mw = std::min<int64_t>(std::max(t.max_width, 1), w);
    const int64_t mh = std::min<int64_t>(std::max(t.max_height, 1), h);
    int64_t tw = mw, th = static_cast<int64_t>(h) * mw / w;
    if (th > mh) {
        th = mh;
        tw = static_cast<int64_t>(w) * mh / h;
    }
    return {static_cast<int32_t>(std::max<int64_t>(tw, 1)), static_cast<int32_t>(std::max<int64_t>(th, 1))};
}

// Y, Cb, Cr of one pixel of the view, with the library's RGB weights.
inline std::array<uint8_t, 3> yuv_at(const ImageView& v, size_t x, size_t y) {
    const uint8_t* row = v.plane[0] + v.stride[0] * y;
    int r = 0, g = 0, b = 0;
    switch (v.format) {
        case PixelFormat::grey: return {row[x], 128, 128};
        case PixelFormat::i420:
            return {row[x], v.plane[1][v.stride[1] * (y / 2) + x / 2], v.plane[2][v.stride[2] * (y / 2) + x / 2]};
        case PixelFormat::nv21:
        case PixelFormat::nv12: {
            const uint8_t* c = v.plane[1] + v.stride[1] * (y / 2) + (x / 2) * 2;
            return v.format == PixelFormat::nv21 ? std::array<uint8_t, 3>{row[x], c[1], c[0]}
                                                 : std::array<uint8_t, 3>{row[x], c[0], c[1]};
        }
        case PixelFormat::yuyv:
        case PixelFormat::uyvy: {
            const uint8_t* q = row + (x / 2) * 4;
            return v.format == PixelFormat::yuyv ? std::array<uint8_t, 3>{q[(x & 1) * 2], q[1], q[3]}
                                                 : std::array<uint8_t, 3>{q[(x & 1) * 2 + 1], q[0], q[2]};
        }
        case PixelFormat::rgb565: {
            const int p = row[2 * x] | (row[2 * x + 1] << 8);
            r = ((p & 0xF800) >> 8) + 4;
            g = ((p & 0x07E0) >> 3) + 2;
            b = ((p << 3) & 0xFF) + 4;
            break;
        }
        case PixelFormat::rgb888: r = row[3 * x], g = row[3 * x + 1], b = row[3 * x + 2]; break;
        case PixelFormat::rgba8888: r = row[4 * x], g = row[4 * x + 1], b = row[4 * x + 2]; break;
        case PixelFormat::bgra8888: b = row[4 * x], g = row[4 * x + 1], r = row[4 * x + 2]; break;
    }
    const auto floor_shift = [](int value) { return value >= 0 ? value >> 12 : -((-value + 4095) >> 12); };
    return {static_cast<uint8_t>((1225 * r + 2404 * g + 467 * b) >> 12),
            static_cast<uint8_t>(128 + floor_shift(-691 * r - 1357 * g + 2048 * b)),
            static_cast<uint8_t>(128 + floor_shift(2048 * r - 1715 * g - 333 * b))};
}

// The thumbnail's JPEG stream. A packed 4:2:2 view goes to the library's
// down-scaler as it is; other formats are first sampled into a packed 4:2:2
// image about twice the thumbnail's size, so that memory stays bounded by
// the thumbnail, not the frame. The library then scales and encodes it.
inline uint32_t make_thumbnail(const ImageView& v, const Thumbnail& t, size_t budget, std::vector<uint8_t>& jpeg,
                               int32_t& tw, int32_t& th) {
    std::tie(tw, th) = thumbnail_size(v.width, v.height, t);
    const uint8_t* source = v.plane[0];
    int32_t sw = v.width, sh = v.height;
    size_t stride_px = v.stride[0] / 2;
    std::vector<uint8_t> packed;
    if (v.format != PixelFormat::yuyv || v.stride[0] % 2 != 0) {
        const int32_t step = std::max(1, std::min(v.width / (2 * tw), v.height / (2 * th)));
        sw = v.width / step;
        sh = v.height / step;
        stride_px = static_cast<size_t>(sw + (sw & 1));
        packed.assign(stride_px * 2 * static_cast<size_t>(sh), 0);
        for (int32_t y = 0; y < sh; ++y) {
            uint8_t* out = packed.data() + stride_px * 2 * static_cast<size_t>(y);
            for (int32_t x = 0; x < sw; x += 2) {
                const auto a = yuv_at(v, static_cast<size_t>(x) * step, static_cast<size_t>(y) * step);
                const auto b = yuv_at(v, static_cast<size_t>(std::min(x + 1, sw - 1)) * step,
                                      static_cast<size_t>(y) * step);
                out[2 * x] = a[0];
                out[2 * x + 1] = a[1];
                out[2 * x + 2] = b[0];
                out[2 * x + 3] = a[2];
            }
        }
        source = packed.data();
    }
    const size_t cw = (static_cast<size_t>(tw) + 1) / 2, ch = (static_cast<size_t>(th) + 1) / 2;
    std::vector<uint8_t> planes(static_cast<size_t>(tw) * th + 2 * cw * ch);
    eko_SetError(EKO_OK);
    __eko_jpeg_enc_down_scale_yuv422(source, sw, sh, static_cast<int32_t>(stride_px), planes.data(), tw, th);
    if (eko_GetLastError() != EKO_OK) return eko_GetLastError();

    ImageInfo info{};
    info.width = tw;
    info.height = th;
    info.data = planes.data();
    info.format = EKO_FORMAT_YUV420;
    for (uint32_t q = std::min<uint32_t>(std::max<uint32_t>(t.quality, 1), 100);; q = q > 20 ? q - 15 : q / 2) {
        jpeg.clear();
        const auto append = [](void* arg, const uint8_t* data, uint32_t count) -> uint32_t {
            auto* out = static_cast<std::vector<uint8_t>*>(arg);
            out->insert(out->end(), data, data + count);
            return count;
        };
        if (eko_enc_jpeg_to_stream(&info, append, q, &jpeg) != 1) return eko_GetLastError();
        if (jpeg.size() <= budget) return EKO_OK;
        if (q <= 1) return EKO_ERR_TOO_LARGE;
    }
}

}  // namespace detail

// Encodes images with one set of options. An Encoder holds only its options
// (it can be reused and copied); each encode is independent.
class Encoder {
public:
    Encoder& quality(uint32_t q) {
        if (q < 1 || q > 100) throw Error(EKO_ERR_ARGUMENT);
        quality_ = q;
        return *this;
    }
    Encoder& exif(Exif description) {
        exif_ = std::move(description);
        return *this;
    }
    Encoder& thumbnail(Thumbnail t = Thumbnail{}) {
        thumbnail_ = t;
        return *this;
    }
    Encoder& no_thumbnail() {
        thumbnail_.reset();
        return *this;
    }
    // Threads per encode (0: one per core), started as std::threads or handed
    // to `executor`. Views whose pixels the library reads in place (the C
    // formats with tight rows) are coded by rows in parallel, to the same
    // bytes; other views are coded on the calling thread.
    Encoder& threads(unsigned count, Executor executor = {}) {
        threads_ = count;
        executor_ = std::move(executor);
        return *this;
    }

    // Throwing members.
    std::vector<uint8_t> encode(const ImageView& view) const {
        std::vector<uint8_t> out;
        encode_to(view, [&out](const uint8_t* data, size_t size) { out.insert(out.end(), data, data + size); });
        return out;
    }
    template <class Sink>
    void encode_to(const ImageView& view, Sink&& sink) const {
        if (detail::null_sink(sink)) throw Error(EKO_ERR_ARGUMENT);
        detail::SinkState state = detail::make_sink(sink);
        const uint32_t code = run(view, state);
        if (state.exception) std::rethrow_exception(state.exception);
        if (code != EKO_OK) throw Error(code);
    }
    // Writes the file; on failure a regular file is removed again.
    void encode_to_file(const ImageView& view, const std::string& path) const {
        const uint32_t code = try_encode_to_file(view, path);
        if (code != EKO_OK) throw Error(code);
    }

    // Non-throwing members: the error code (EKO_OK on success). A sink's
    // exception is swallowed and reported as EKO_ERR_WRITE.
    Result try_encode(const ImageView& view) const noexcept {
        Result result;
        auto sink = [&result](const uint8_t* data, size_t size) {
            result.bytes.insert(result.bytes.end(), data, data + size);
        };
        detail::SinkState state = detail::make_sink(sink);
        result.error = run(view, state);
        if (state.exception) {
            try {
                std::rethrow_exception(state.exception);
            } catch (const std::bad_alloc&) {
                result.error = EKO_ERR_ALLOC;
            } catch (...) {
            }
        }
        if (result.error != EKO_OK) result.bytes = std::vector<uint8_t>();
        return result;
    }
    template <class Sink>
    uint32_t try_encode_to(const ImageView& view, Sink&& sink) const noexcept {
        if (detail::null_sink(sink)) return EKO_ERR_ARGUMENT;
        detail::SinkState state = detail::make_sink(sink);
        return run(view, state);
    }
    uint32_t try_encode_to_file(const ImageView& view, const std::string& path) const noexcept {
        if (const uint32_t bad = detail::check_view(view); bad != EKO_OK) return bad;
        std::FILE* file = std::fopen(path.c_str(), "wb");
        if (file == nullptr) return EKO_ERR_OPEN;
        auto sink = [file](const uint8_t* data, size_t size) { return std::fwrite(data, 1, size, file) == size; };
        detail::SinkState state = detail::make_sink(sink);
        uint32_t code = run(view, state);
        if (std::fclose(file) != 0 && code == EKO_OK) code = EKO_ERR_WRITE;
        // Remove what was written, but only a regular file: the path may name
        // a device or a pipe.
        std::error_code ignored;
        if (code != EKO_OK && std::filesystem::is_regular_file(path, ignored)) std::filesystem::remove(path, ignored);
        return code;
    }

private:
    uint32_t run(const ImageView& view, detail::SinkState& state) const noexcept {
        if (const uint32_t bad = detail::check_view(view); bad != EKO_OK) return bad;
        if (!exif_ && !thumbnail_) return detail::encode_view(view, quality_, nullptr, state, threads_, &executor_);
        try {
            detail::ExifRecords records;
            detail::fill_exif(exif_ ? *exif_ : empty_exif(), records);
            std::vector<uint8_t> thumb;
            if (thumbnail_) {
                // The segment's length field counts 65535 bytes; the TIFF
                // block without the thumbnail tells how many remain.
                ExifInfo probe = records.info;
                probe.has_thumbnail = 1;
                probe.thumb_width = probe.thumb_height = probe.thumb_compression = probe.thumb_length = 1;
                probe.thumb_x_resolution = probe.thumb_y_resolution = ExifRational{72, 1};
                const Exif& e = exif_ ? *exif_ : empty_exif();
                std::vector<uint8_t> scratch(4096 + e.make.size() + e.model.size() +
                                             (e.gps ? e.gps->processing_method.size() : 0));
                const size_t tiff = __eko_CreateExif(scratch.data(), &probe);
                if (tiff + 8 >= 65535) return EKO_ERR_TOO_LARGE;
                int32_t tw = 0, th = 0;
                const uint32_t code = detail::make_thumbnail(view, *thumbnail_, 65535 - 8 - tiff, thumb, tw, th);
                if (code != EKO_OK) return code;
                ExifInfo& x = records.info;
                x.has_thumbnail = 1;
                x.thumb_width = static_cast<uint32_t>(tw);
                x.thumb_height = static_cast<uint32_t>(th);
                x.thumb_compression = 6;  // JPEG
                x.thumb_length = static_cast<uint32_t>(thumb.size());
                x.thumb_data = thumb.data();
                x.thumb_x_resolution = x.thumb_y_resolution = ExifRational{72, 1};
            }
            return detail::encode_view(view, quality_, &records.info, state, threads_, &executor_);
        } catch (const std::bad_alloc&) {
            return EKO_ERR_ALLOC;
        }
    }

    static const Exif& empty_exif() {
        static const Exif none;
        return none;
    }

    uint32_t quality_ = 85;
    unsigned threads_ = 1;
    Executor executor_;
    std::optional<Exif> exif_;
    std::optional<Thumbnail> thumbnail_;
};

}  // namespace tekoj

#endif  // TEKOJ_ENCODER_HPP
