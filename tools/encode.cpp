// The encode driver: hands a source to the library's MCU-row interface one
// band (MCU row) at a time and takes the stream back through a callback, so
// that memory follows the image's width, not its area.
//
// How each input reaches the library:
//   RGB, 4:2:0        RGB888 reader, pointed at each band of rows
//   RGB, 4:2:2        converted here to a planar 4:2:2 band (band call)
//   RGB, 4:4:4        converted here to three full planes, planar reader run here
//   grey (any input)  one plane per band (band call)
//   I420              planes copied into the band call's buffer
//   NV21, NV12        the interleaved V/U reader, reading the frame in place
//   YUYV, UYVY        the packed 4:2:2 readers (4:2:0 or 4:2:2)
// With several threads, a 4:2:0 or grey frame (or, when asked for, RGB
// 4:2:0 or grey rows read whole) goes to the row-parallel calls instead.
// The readers that no format code selects are run here before the library's
// coding pass, as the band call would run the format's own reader.
#include "exif.h"

#include <TekoJEncoderInternal.h>

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <cstring>
#include <thread>

namespace tool {
namespace {

// The library's colour conversion (12 fractional bits), for the samples the
// tool prepares itself, so that every path converts alike.
inline uint8_t luma(int r, int g, int b) { return static_cast<uint8_t>((1225 * r + 2404 * g + 467 * b) >> 12); }
inline uint8_t blue_diff(int r, int g, int b) { return static_cast<uint8_t>(128 + ((-691 * r - 1357 * g + 2048 * b) >> 12)); }
inline uint8_t red_diff(int r, int g, int b) { return static_cast<uint8_t>(128 + ((2048 * r - 1715 * g - 333 * b) >> 12)); }

// The quality scaling of the library's own tables, for the settings record
// that chooses the sampling (the record replaces the quality's tables).
EncoderSettings sampling_settings(uint32_t sampling, uint32_t quality) {
    EncoderSettings s{};
    s.num_components = 3;
    s.num_quant_tables = 2;
    const uint32_t scale = quality >= 50 ? 200 - 2 * quality : 5000 / quality;
    for (int i = 0; i < 64; ++i) {
        const uint32_t l = (eko_luminanceQuantTbl[0][i] * scale + 50) / 100;
        const uint32_t c = (eko_chrominanceQuantTbl[0][i] * scale + 50) / 100;
        s.quant_tables[0][i] = static_cast<uint8_t>(std::clamp<uint32_t>(l, 1, 255));
        s.quant_tables[1][i] = static_cast<uint8_t>(std::clamp<uint32_t>(c, 1, 255));
    }
    s.write_dri = 1;
    const uint8_t h = sampling == 444 ? 1 : 2;
    const uint8_t specs[3][3] = {{0, h, 1}, {1, 1, 1}, {1, 1, 1}};
    std::memcpy(s.component_specs, specs, sizeof specs);
    return s;
}

// Where the library's stream pieces go. Runs inside the library, which must
// not be left by an exception: a failure is kept and raised after the call.
struct StreamState {
    std::function<void(const uint8_t*, size_t)> write;
    bool failed = false, closed = false;
    std::string file, message;
};

uint32_t on_stream(void* arg, const uint8_t* data, uint32_t count) noexcept {
    auto* state = static_cast<StreamState*>(arg);
    if (state->failed || state->closed) return 0;
    try {
        state->write(data, count);
    } catch (const Failure& f) {
        state->failed = true;
        state->file = f.file;
        state->message = f.what();
    } catch (const std::exception& e) {
        state->failed = true;
        state->message = e.what();
    }
    return count;
}

// Writes the stream with the APP1 segment after APP0: the first bytes are
// held until APP0 is complete.
class Splicer {
public:
    Splicer(Output& out, std::vector<uint8_t> app1) : out_(out), app1_(std::move(app1)), done_(app1_.empty()) {}
    void put(const uint8_t* p, size_t n) {
        if (done_) {
            out_.write(p, n);
            return;
        }
        head_.insert(head_.end(), p, p + n);
        const size_t at = app0_end(head_.data(), head_.size());
        if (at == 0 || head_.size() < at) return;
        out_.write(head_.data(), at);
        out_.write(app1_.data(), app1_.size());
        out_.write(head_.data() + at, head_.size() - at);
        done_ = true;
    }
    void finish() const {
        if (!done_) fail("encoder stream ends inside its header");
    }

private:
    Output& out_;
    std::vector<uint8_t> app1_, head_;
    bool done_;
};

// A temporary file for the stream while the thumbnail, which goes in front
// of it, is still being gathered.
class Spool {
public:
    Spool() : file_(std::tmpfile()) {
        if (file_ == nullptr) fail_system("temporary file", "cannot create");
    }
    ~Spool() { std::fclose(file_); }
    void write(const uint8_t* p, size_t n) {
        if (std::fwrite(p, 1, n, file_) != n) fail_system("temporary file", "cannot write");
    }
    void replay(Splicer& to) {
        if (std::fflush(file_) != 0 || std::fseek(file_, 0, SEEK_SET) != 0) fail_system("temporary file", "cannot read");
        std::vector<uint8_t> chunk(1 << 16);
        size_t n;
        while ((n = std::fread(chunk.data(), 1, chunk.size(), file_)) > 0) to.put(chunk.data(), n);
        if (std::ferror(file_)) fail_system("temporary file", "cannot read");
    }

private:
    std::FILE* file_;
};

// Owns the context until finish(); an encode abandoned on the way is
// finished with its stream discarded.
class Encoder {
public:
    Encoder(EncoderContext* ctx, StreamState& state) : ctx_(ctx), state_(state) {}
    ~Encoder() {
        if (ctx_ == nullptr) return;
        state_.closed = true;
        eko_jpeg_enc_mcu_finish(ctx_, nullptr, nullptr);
    }
    EncoderContext* operator->() const { return ctx_; }
    void check() const {
        if (state_.failed) throw Failure(state_.file, state_.message);
    }
    // The band call: the format's reader takes the band from `band`.
    void band(const uint8_t* band) {
        uint32_t next_row = 0;
        if (eko_jpeg_enc_muc_process(ctx_, band, &next_row) == 0) fail(library_error("cannot code a band"));
        check();
    }
    // The same with a reader that no format code selects.
    void band_through(uint32_t (*reader)(EncoderContext*)) {
        if (reader(ctx_) == 0 || __eko_jpeg_enc_compress_data(ctx_, ctx_->sample_rows->row_arrays) == 0)
            fail(library_error("cannot code a band"));
        ctx_->next_row = static_cast<uint16_t>(ctx_->next_row + ctx_->max_v_samp * 8u);
        check();
    }
    void finish() {
        uint8_t* buffer = nullptr;
        uint32_t length = 0;
        EncoderContext* ctx = ctx_;
        ctx_ = nullptr;
        eko_jpeg_enc_mcu_finish(ctx, &buffer, &length);
        check();
        if (length == 0) fail(library_error("cannot complete the stream"));
    }

private:
    EncoderContext* ctx_;
    StreamState& state_;
};

// Codes an image that lies whole in memory in the layout of `format` with
// several threads, each taking the next MCU row from a shared counter.
void encode_rows_parallel(const uint8_t* data, uint32_t w, uint32_t h, uint32_t format, uint32_t quality,
                          uint32_t threads, StreamState& state) {
    ImageInfo image{};
    image.width = static_cast<int32_t>(w);
    image.height = static_cast<int32_t>(h);
    image.data = data;
    image.format = format;
    OutputRequest request{};
    request.kind = EKO_OUTPUT_STREAM;
    EncodeOptions options{};
    options.quality = quality;
    EkoParallelEncode* e = eko_enc_jpeg_parallel_create(&image, &request, &options, nullptr, on_stream, &state, threads);
    if (e == nullptr) fail(library_error("the encoder refused the image"));
    const uint32_t rows = eko_enc_jpeg_parallel_row_count(e);
    std::atomic<uint32_t> next{0};
    auto work = [&](uint32_t worker) {
        for (uint32_t k; (k = next.fetch_add(1)) < rows;)
            if (eko_enc_jpeg_parallel_rows(e, worker, k, 1) == 0) break;
    };
    std::vector<std::thread> pool;
    for (uint32_t t = 1; t < std::min(threads, rows); ++t) pool.emplace_back(work, t);
    work(0);
    for (auto& t : pool) t.join();
    const bool ok = eko_enc_jpeg_parallel_finish(e, nullptr, nullptr) == 1;
    if (state.failed) throw Failure(state.file, state.message);
    if (!ok) fail(library_error("cannot code the image"));
}

}  // namespace

Summary encode(Source& src, const Options& o, Output& out, const std::function<void(double)>& progress) {
    const uint32_t w = src.width, h = src.height;
    const Layout layout = src.layout;
    Summary summary;
    summary.grey = o.grey || layout == Layout::Grey;
    summary.sampling = summary.grey ? 0 : o.sampling;
    const uint32_t sampling = summary.sampling;
    if (!summary.grey && is_frame(layout) && sampling != 420)
        fail("4:2:0 YUV input is coded 4:2:0 (--sampling 422 and 444 need RGB or packed 4:2:2 input)");
    if (!summary.grey && is_packed(layout) && sampling == 444) fail("packed 4:2:2 input is coded 4:2:0 or 4:2:2, not 4:4:4");

    // The format code the context is made for, and the reader run here when
    // the band call's own reader does not fit.
    uint32_t format = EKO_FORMAT_YUV420;
    uint32_t (*reader)(EncoderContext*) = nullptr;
    if (summary.grey) {
        format = EKO_FORMAT_GREY;
    } else if (layout == Layout::Rgb && sampling == 420) {
        format = EKO_FORMAT_RGB888;
    } else if (sampling == 444) {
        // Full-width chroma rows do not fit the band call's buffer; the
        // planar reader takes three separate planes instead.
        reader = __eko_jpeg_enc_get_raw_data;
    } else if (layout == Layout::Nv21 || layout == Layout::Nv12) {
        reader = __eko_jpeg_enc_get_raw_pvu_data;
    } else if (is_packed(layout)) {
        reader = sampling == 422 ? __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422 : __eko_jpeg_enc_get_raw_duoview422_data;
    }
    const uint32_t band_rows = summary.grey || sampling != 420 ? 8 : 16;

    // One band of source rows, and the band call's buffer: 16 luma rows and
    // 8 rows of each chroma plane (three 8-row planes for 4:4:4).
    const size_t cw = (w + 1) / 2, ch = (h + 1) / 2;
    std::vector<uint8_t> rows(is_frame(layout) ? 0 : size_t{row_bytes(layout, w)} * band_rows);
    std::vector<uint8_t> planar(size_t{w} * 16 + cw * 16);
    uint8_t* const pu = planar.data() + (sampling == 444 ? size_t{w} * 8 : size_t{w} * 16);
    uint8_t* const pv = sampling == 444 ? planar.data() + size_t{w} * 16 : pu + cw * 8;

    // NV12 is NV21 with U first: swap the pairs so the V/U reader takes it.
    const uint8_t* const fy = src.frame.data();
    uint8_t* const fc = src.frame.empty() ? nullptr : src.frame.data() + size_t{w} * h;
    if (layout == Layout::Nv12)
        for (size_t i = 0; i < cw * ch; ++i) std::swap(fc[2 * i], fc[2 * i + 1]);

    Exif exif(o);
    std::unique_ptr<Thumbnail> thumbnail;
    if (o.thumbnail) thumbnail = std::make_unique<Thumbnail>(w, h, layout == Layout::Grey ? 1 : 3, layout != Layout::Rgb);
    std::unique_ptr<Spool> spool;
    std::unique_ptr<Splicer> splicer;
    StreamState state;
    if (thumbnail) {
        spool = std::make_unique<Spool>();
        state.write = [&spool](const uint8_t* p, size_t n) { spool->write(p, n); };
    } else {
        splicer = std::make_unique<Splicer>(out, exif.segment());
        state.write = [&splicer](const uint8_t* p, size_t n) { splicer->put(p, n); };
    }

    // Several threads when the library can read the whole image in place: a
    // 4:2:0 or grey frame as it is, RGB 4:2:0 or grey rows once read whole
    // (only when asked for, since memory then follows the image's area).
    const bool frame_fits = is_frame(layout) && (summary.grey || layout == Layout::I420);
    const bool rows_fit = o.threads_given && ((format == EKO_FORMAT_RGB888 && layout == Layout::Rgb) ||
                                              (summary.grey && layout == Layout::Grey));
    const uint32_t threads = o.threads != 0 ? o.threads : std::max(1u, std::thread::hardware_concurrency());
    if (threads > 1 && !thumbnail && (frame_fits || rows_fit)) {
        std::vector<uint8_t> whole;
        if (rows_fit) {
            whole.resize(size_t{row_bytes(layout, w)} * h);
            for (uint32_t top = 0; top < h; top += band_rows)
                src.read_rows(whole.data() + size_t{row_bytes(layout, w)} * top, std::min(band_rows, h - top));
        }
        encode_rows_parallel(rows_fit ? whole.data() : fy, w, h, summary.grey ? uint32_t{EKO_FORMAT_GREY} : format, o.quality,
                             std::min(threads, 64u), state);
        progress(1.0);
        splicer->finish();
        return summary;
    }

    ImageInfo image{};
    image.width = static_cast<int32_t>(w);
    image.height = static_cast<int32_t>(h);
    image.data = format == EKO_FORMAT_RGB888 ? rows.data() : planar.data();
    image.format = format;
    OutputRequest request{};
    request.kind = EKO_OUTPUT_STREAM;
    EncodeOptions options{};
    options.quality = o.quality;
    const EncoderSettings settings = sampling_settings(sampling, o.quality);
    const bool with_settings = !summary.grey && sampling != 420;
    EncoderContext* ctx = eko_jpeg_enc_mcu_init(&image, &request, &options, with_settings ? &settings : nullptr);
    if (ctx == nullptr) fail(library_error("the encoder refused the image"));
    Encoder enc(ctx, state);
    if (eko_jpeg_enc_mcu_set_stream(ctx, on_stream, &state) == 0) fail(library_error("cannot start the stream"));
    enc.check();

    for (uint32_t top = 0; top < h; top += band_rows) {
        const uint32_t n = std::min(band_rows, h - top);
        if (is_frame(layout)) {
            const uint8_t* y0 = fy + size_t{top} * w;
            const size_t ctop = top / 2;
            if (summary.grey) {
                enc.band(y0);
            } else if (layout == Layout::I420) {
                const size_t crows = std::min<size_t>(8, ch - ctop);
                std::memcpy(planar.data(), y0, size_t{w} * n);
                std::memcpy(pu, fc + ctop * cw, cw * crows);
                std::memcpy(pv, fc + cw * ch + ctop * cw, cw * crows);
                enc.band(planar.data());
            } else {
                enc->plane_y = y0;
                enc->plane_v = fc + ctop * 2 * cw;
                enc.band_through(reader);
            }
            if (thumbnail) {
                const bool nv = layout != Layout::I420;
                for (uint32_t y = top; y < top + n; ++y) {
                    const uint8_t* yr = fy + size_t{y} * w;
                    const uint8_t* cr = fc + size_t{y / 2} * (nv ? 2 * cw : cw);
                    thumbnail->add_row(y, [&](uint32_t x, uint32_t* v) {
                        v[0] = yr[x];
                        v[1] = nv ? cr[(x / 2) * 2 + 1] : cr[x / 2];
                        v[2] = nv ? cr[(x / 2) * 2] : cr[cw * ch + x / 2];
                    });
                }
            }
        } else {
            src.read_rows(rows.data(), n);
            const size_t stride = row_bytes(layout, w);
            const size_t pixels = size_t{w} * n;
            const uint8_t* r = rows.data();
            if (layout == Layout::Uyvy)
                for (size_t i = 0; i < pixels * 2; i += 2) std::swap(rows[i], rows[i + 1]);
            if (summary.grey && layout == Layout::Grey) {
                enc.band(r);
            } else if (summary.grey) {
                for (size_t i = 0; i < pixels; ++i)
                    planar[i] = layout == Layout::Rgb ? luma(r[3 * i], r[3 * i + 1], r[3 * i + 2]) : r[2 * i];
                enc.band(planar.data());
            } else if (is_packed(layout) || sampling != 422) {
                if (sampling == 444) {
                    for (size_t i = 0; i < pixels; ++i) {
                        const int R = r[3 * i], G = r[3 * i + 1], B = r[3 * i + 2];
                        planar[i] = luma(R, G, B);
                        pu[i] = blue_diff(R, G, B);
                        pv[i] = red_diff(R, G, B);
                    }
                    enc->plane_y = planar.data();
                    enc->plane_u = pu;
                    enc->plane_v = pv;
                } else {
                    enc->read_ptr = r;
                }
                if (reader != nullptr) {
                    enc.band_through(reader);
                } else {
                    enc.band(nullptr);
                }
            } else {
                // RGB 4:2:2: each chroma sample the mean of its pixel pair.
                for (uint32_t y = 0; y < n; ++y) {
                    const uint8_t* p = r + y * stride;
                    uint8_t* ly = planar.data() + size_t{y} * w;
                    for (uint32_t x = 0; x < w; x += 2) {
                        const uint32_t x1 = std::min(x + 1, w - 1);
                        const int R0 = p[3 * x], G0 = p[3 * x + 1], B0 = p[3 * x + 2];
                        const int R1 = p[3 * x1], G1 = p[3 * x1 + 1], B1 = p[3 * x1 + 2];
                        ly[x] = luma(R0, G0, B0);
                        ly[x1] = luma(R1, G1, B1);
                        pu[y * cw + x / 2] = static_cast<uint8_t>((blue_diff(R0, G0, B0) + blue_diff(R1, G1, B1) + 1) / 2);
                        pv[y * cw + x / 2] = static_cast<uint8_t>((red_diff(R0, G0, B0) + red_diff(R1, G1, B1) + 1) / 2);
                    }
                }
                enc.band(planar.data());
            }
            if (thumbnail) {
                for (uint32_t y = 0; y < n; ++y) {
                    const uint8_t* p = r + y * stride;
                    thumbnail->add_row(top + y, [&](uint32_t x, uint32_t* v) {
                        if (layout == Layout::Grey) {
                            v[0] = p[x];
                        } else if (layout == Layout::Rgb) {
                            v[0] = p[3 * x], v[1] = p[3 * x + 1], v[2] = p[3 * x + 2];
                        } else {
                            v[0] = p[2 * x], v[1] = p[(x & ~1u) * 2 + 1], v[2] = p[(x & ~1u) * 2 + 3];
                        }
                    });
                }
            }
        }
        progress(static_cast<double>(top + n) / h);
    }
    enc.finish();

    if (thumbnail) {
        attach_thumbnail(exif, *thumbnail, summary.grey);
        summary.thumbnail_width = thumbnail->width;
        summary.thumbnail_height = thumbnail->height;
        splicer = std::make_unique<Splicer>(out, exif.segment());
        spool->replay(*splicer);
    }
    splicer->finish();
    return summary;
}

}  // namespace tool
