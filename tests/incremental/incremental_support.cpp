#include "incremental/incremental_support.h"

#include <cstdio>
#include <cstring>
#include <regex>

namespace tekoj_test {

namespace {
uint32_t collect(void* arg, const uint8_t* data, uint32_t count) {
    auto* out = static_cast<Output*>(arg);
    out->streamed.insert(out->streamed.end(), data, data + count);
    if (count > out->largest_piece) out->largest_piece = count;
    return count;
}
}  // namespace

Output::Output(Sink s, uint32_t capacity) : sink(s) {
    if (sink == Sink::Memory) {
        request = {EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(capacity)), capacity};
    } else if (sink == Sink::File) {
        static int serial = 0;
        path = temp_path("incremental_" + std::to_string(++serial) + ".jpg");
        request = {EKO_OUTPUT_FILE, DORVATEKO_OsFopen(path.c_str(), "wb"), nullptr, 0};
    } else {
        request = {EKO_OUTPUT_STREAM, nullptr, nullptr, 0};
    }
}

Output::~Output() {
    // Still ours when init refused the request.
    if (request.buffer != nullptr) DORVATEKO_OsFree(request.buffer);
    if (request.file != nullptr) DORVATEKO_OsFclose(request.file);
    if (!path.empty()) std::remove(path.c_str());
}

bool Output::attach(EncoderContext* ctx) {
    if (ctx != nullptr) request.buffer = nullptr;  // the encoder owns the block now
    return sink != Sink::Stream || eko_jpeg_enc_mcu_set_stream(ctx, collect, this) == 1;
}

Bytes Output::finish(EncoderContext* ctx) {
    uint8_t* buffer = nullptr;
    uint32_t length = 0;
    eko_jpeg_enc_mcu_finish(ctx, &buffer, &length);
    if (sink == Sink::Memory) {
        Bytes out(buffer, buffer + (buffer != nullptr ? length : 0));
        DORVATEKO_OsFree(buffer);
        return out;
    }
    if (sink == Sink::Stream) return length == streamed.size() ? streamed : Bytes{};
    DORVATEKO_OsFclose(request.file);
    request.file = nullptr;
    const Bytes out = read_file(path);
    return length == out.size() && length != 0 ? out : Bytes{};
}

Planes yuv420_planes(const Bytes& rgb, int width, int height) {
    const Bytes yuv = rgb_to_yuv420(rgb, width, height);
    Planes p;
    p.width = width;
    p.height = height;
    p.chroma_width = (width + 1) / 2;
    p.chroma_height = (height + 1) / 2;
    const size_t ny = static_cast<size_t>(width) * height, nc = static_cast<size_t>(p.chroma_width) * p.chroma_height;
    p.y.assign(yuv.begin(), yuv.begin() + ny);
    p.u.assign(yuv.begin() + ny, yuv.begin() + ny + nc);
    p.v.assign(yuv.begin() + ny + nc, yuv.end());
    return p;
}

Bytes band_buffer(const Planes& p, int index, int luma_rows, int chroma_rows) {
    const size_t w = p.width, cw = (w + 1) >> 1;
    Bytes band(w * 16 + 2 * cw * 8, 0);
    for (int r = 0; r < luma_rows && index * luma_rows + r < p.height; ++r)
        std::memcpy(&band[r * w], &p.y[(index * luma_rows + r) * w], w);
    for (int r = 0; r < chroma_rows && !p.u.empty() && index * chroma_rows + r < p.chroma_height; ++r) {
        const size_t src = (index * chroma_rows + r) * static_cast<size_t>(p.chroma_width);
        std::memcpy(&band[w * 16 + r * cw], &p.u[src], p.chroma_width);
        std::memcpy(&band[w * 16 + cw * 8 + r * cw], &p.v[src], p.chroma_width);
    }
    return band;
}

Planes band_planes(const Bytes& rgb, const Bytes& pixels, int width, int height, uint32_t format) {
    if (format == EKO_FORMAT_YUV420) return yuv420_planes(rgb, width, height);
    Planes p;
    if (format == EKO_FORMAT_GREY) p.y = pixels, p.width = width, p.height = height;
    return p;
}

Bytes encode_bands(const ImageInfo& info, const Planes* planes, uint32_t quality, Sink sink,
                   const EncoderSettings* settings) {
    Output out(sink);
    const EncodeOptions options{quality, nullptr, 0};
    EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &out.request, &options, settings);
    if (!out.attach(ctx) || ctx == nullptr) return {};
    const uint32_t rows = ctx->max_v_samp * 8u;
    const int chroma_rows = ctx->comp_info[ctx->num_components - 1].v_samp_factor * 8;
    bool ok = true;
    uint32_t next = 0;
    for (uint32_t b = 0; ok && next < static_cast<uint32_t>(info.height); ++b) {
        const Bytes band = planes != nullptr ? band_buffer(*planes, static_cast<int>(b), static_cast<int>(rows),
                                                           chroma_rows)
                                             : Bytes{};
        ok = eko_jpeg_enc_col_muc_process(ctx, band.empty() ? nullptr : band.data(), &next) == 1 &&
             next == (b + 1) * rows;
    }
    const Bytes stream = out.finish(ctx);
    return ok && out.largest_piece <= 4096 ? stream : Bytes{};
}

std::vector<int16_t> library_coefficients(const ImageInfo& info, const EncoderSettings* settings, uint32_t quality) {
    const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
    const EncodeOptions options{quality, nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, settings);
    std::vector<int16_t> out;
    if (ctx == nullptr) return out;
    McuState* st = ctx->mcu_state;
    int16_t* const* mcu = st->mcu_buffer;
    for (uint32_t band = 0; band < ctx->total_imcu_rows; ++band) {
        switch (ctx->format) {
            case EKO_FORMAT_RGB565: __eko_jpeg_enc_get_raw_rgb565_data(ctx); break;
            case EKO_FORMAT_RGB888: __eko_jpeg_enc_get_raw_rgb888_data(ctx); break;
            case EKO_FORMAT_RGBA8888: __eko_jpeg_enc_get_raw_rgba8888_data(ctx); break;
            case EKO_FORMAT_BGRA8888: __eko_jpeg_enc_get_raw_bgra8888_data(ctx); break;
            default: __eko_jpeg_enc_get_raw_data(ctx);
        }
        // The block layout of one MCU, dummies beyond the image included.
        for (uint32_t x = 0; x < ctx->mcus_per_row; ++x) {
            uint32_t blkn = 0;
            for (int c = 0; c < ctx->comps_in_scan; ++c) {
                const ComponentInfo* comp = ctx->cur_comp_info[c];
                const uint32_t count = x + 1 < ctx->mcus_per_row ? comp->mcu_width : comp->last_col_width;
                for (uint32_t r = 0; r < comp->mcu_height; ++r, blkn += comp->mcu_width) {
                    const bool inside = band + 1 < ctx->total_imcu_rows || r < comp->last_row_height;
                    BlockPosition pos{r * 8, x * comp->mcu_sample_width, inside ? count : 0};
                    __eko_jpeg_enc_do_forward_dct(ctx->divisors[comp->quant_tbl_no], nullptr,
                                                  ctx->sample_rows->row_arrays[comp->component_index],
                                                  mcu[blkn], &pos);
                    for (uint32_t j = pos.block_count; j < comp->mcu_width; ++j) {
                        std::memset(mcu[blkn + j], 0, 128);
                        mcu[blkn + j][0] = inside ? mcu[blkn + j - 1][0] : mcu[blkn - 1][0];
                    }
                }
            }
            out.insert(out.end(), mcu[0], mcu[0] + 64 * ctx->blocks_in_mcu);
        }
        ++st->imcu_row;
        __eko_jpeg_enc_setup_imcu(ctx);
    }
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    return out;
}

EncoderSettings settings_420(uint32_t size_estimate, uint32_t write_dri, uint8_t h, uint8_t v) {
    EncoderSettings s{};
    s.num_components = 3;
    s.num_quant_tables = 2;
    for (int i = 0; i < 64; ++i) {
        s.quant_tables[0][i] = static_cast<uint8_t>(4 + i / 2);
        s.quant_tables[1][i] = static_cast<uint8_t>(6 + i);
    }
    s.write_dri = write_dri;
    s.size_estimate = size_estimate;
    const uint8_t specs[3][3] = {{0, h, v}, {1, 1, 1}, {1, 1, 1}};
    std::memcpy(s.component_specs, specs, sizeof specs);
    return s;
}

EncoderSettings golden_settings(const std::string& name, int& width, int& height, uint32_t& quality) {
    const Bytes file = read_file(golden_path("cases.json"));
    const std::string text(file.begin(), file.end());
    const size_t start = text.find("\"name\": \"" + name + "\"");
    const std::string item = text.substr(start, text.find("\"name\"", start + 1) - start);
    auto scalar = [&](const char* key) {
        std::smatch m;
        std::regex_search(item, m, std::regex(std::string("\"") + key + "\": ?([0-9]+)"));
        return static_cast<uint32_t>(std::stoul(m[1].str()));
    };
    width = static_cast<int>(scalar("width"));
    height = static_cast<int>(scalar("height"));
    quality = scalar("quality");
    // The record's numbers in field order: component and table counts, the
    // tables, write_dri, size_estimate, then the component triples.
    std::vector<uint32_t> n;
    const std::string settings = item.substr(item.find("\"settings\""));
    const std::regex number("[0-9]+");
    for (auto it = std::sregex_iterator(settings.begin(), settings.end(), number); it != std::sregex_iterator(); ++it)
        n.push_back(static_cast<uint32_t>(std::stoul(it->str())));
    EncoderSettings s{};
    s.num_components = static_cast<uint8_t>(n.at(0));
    s.num_quant_tables = static_cast<int32_t>(n.at(1));
    size_t k = 2;
    for (int32_t t = 0; t < s.num_quant_tables; ++t)
        for (int i = 0; i < 64; ++i) s.quant_tables[t][i] = static_cast<uint8_t>(n.at(k++));
    s.write_dri = n.at(k++);
    s.size_estimate = n.at(k++);
    for (int c = 0; c < 3; ++c)
        for (int j = 0; j < 3; ++j) s.component_specs[c][j] = static_cast<uint8_t>(n.at(k++));
    return s;
}

std::vector<McuBlockList> block_lists(std::vector<int16_t>& coefficients, uint32_t blocks_in_mcu, uint32_t first,
                                      uint32_t count, uint32_t stride) {
    std::vector<McuBlockList> lists(count);
    for (uint32_t k = 0; k < count; ++k)
        for (uint32_t b = 0; b < blocks_in_mcu; ++b)
            lists[k].blocks[b] = &coefficients[(static_cast<size_t>(first + k * stride) * blocks_in_mcu + b) * 64];
    return lists;
}

Bytes encode_coefficients(const ImageInfo& info, const EncoderSettings* settings, uint32_t quality,
                          std::vector<int16_t> coefficients, Sink sink, bool columns) {
    Output out(sink);
    const EncodeOptions options{quality, nullptr, 0};
    EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &out.request, &options, settings);
    if (!out.attach(ctx) || ctx == nullptr) return {};
    const uint32_t rows = ctx->total_imcu_rows, per_row = ctx->mcus_per_row, blocks = ctx->blocks_in_mcu;
    bool ok = true;
    uint32_t next = 0;
    if (!columns) {
        for (uint32_t r = 0; r < rows && ok; ++r) {
            auto lists = block_lists(coefficients, blocks, r * per_row, per_row, 1);
            ok = __eko_jpeg_enc_entroy_encoder(ctx, lists.data(), &next) == 1;
        }
    } else {
        ok = __eko_jpeg_enc_col_encoder_init(ctx) == 1;
        for (uint32_t x = 0; x < per_row && ok; ++x) {
            auto lists = block_lists(coefficients, blocks, x, rows, per_row);
            ok = __eko_jpeg_enc_col_entroy_encoder(ctx, lists.data(), &next) == 1 &&
                 next == (x + 1) * ctx->max_h_samp * 8u;
        }
        ok = ok && __eko_jpeg_enc_col_encoder_finish(ctx) == 1;
    }
    Bytes stream = out.finish(ctx);
    return ok ? stream : Bytes{};
}

}  // namespace tekoj_test
