#include "incremental/incremental_support.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <regex>

namespace tekoj_test {
namespace {

// One encode's output: builds the request, collects what comes back.
struct Output {
    Sink sink;
    OutputRequest request{};
    std::string path;
    Bytes streamed;
    size_t largest_piece = 0;

    explicit Output(Sink s) : sink(s) {
        static int serial = 0;
        if (sink == Sink::Memory) request = {EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(2048)), 2048};
        if (sink == Sink::Stream) request.kind = EKO_OUTPUT_STREAM;
        if (sink == Sink::File) {
            path = temp_path("incremental_" + std::to_string(++serial) + ".jpg");
            request = {EKO_OUTPUT_FILE, DORVATEKO_OsFopen(path.c_str(), "wb"), nullptr, 0};
        }
    }
    ~Output() {
        if (request.buffer != nullptr) DORVATEKO_OsFree(request.buffer);  // init refused it
        if (request.file != nullptr) DORVATEKO_OsFclose(request.file);
        if (!path.empty()) std::remove(path.c_str());
    }
    static uint32_t collect(void* arg, const uint8_t* data, uint32_t count) {
        auto* out = static_cast<Output*>(arg);
        out->streamed.insert(out->streamed.end(), data, data + count);
        out->largest_piece = std::max<size_t>(out->largest_piece, count);
        return count;
    }
    // The stream, or nothing when the finish call handed none back.
    Bytes finish(EncoderContext* ctx) {
        uint8_t* buffer = nullptr;
        uint32_t length = 0;
        eko_jpeg_enc_mcu_finish(ctx, &buffer, &length);
        Bytes out = sink == Sink::Stream ? streamed : Bytes(buffer, buffer + (buffer != nullptr ? length : 0));
        DORVATEKO_OsFree(buffer);
        if (sink == Sink::File) {
            DORVATEKO_OsFclose(request.file);
            request.file = nullptr;
            out = read_file(path);
        }
        return length == out.size() ? out : Bytes{};
    }
};

// Band b of a planar image in the band buffer's fixed regions.
Bytes band_buffer(const EncoderContext* ctx, const ImageInfo& info, uint32_t b) {
    if (ctx->format != EKO_FORMAT_YUV420 && ctx->format != EKO_FORMAT_GREY) return {};
    const size_t w = static_cast<size_t>(ctx->width), cw = (w + 1) >> 1;
    const size_t region[3] = {0, w * 16, w * 16 + cw * 8};
    Bytes band(w * 16 + cw * 16, 0);
    const auto* plane = static_cast<const uint8_t*>(info.data);
    for (int c = 0; c < ctx->num_components; ++c) {
        const ComponentInfo& k = ctx->comp_info[c];
        for (uint32_t r = 0; r < k.band_rows && b * k.band_rows + r < k.downsampled_height; ++r)
            std::memcpy(&band[region[c] + r * k.downsampled_width],
                        plane + static_cast<size_t>(b * k.band_rows + r) * k.downsampled_width, k.downsampled_width);
        plane += static_cast<size_t>(k.downsampled_width) * k.downsampled_height;
    }
    return band;
}

}  // namespace

Bytes encode(const ImageInfo& info, Job job) {
    Output out(job.sink);
    const EncodeOptions options{job.quality, nullptr, 0};
    EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &out.request, &options, job.settings);
    if (ctx == nullptr) return {};
    out.request.buffer = nullptr;  // the encoder's until finish
    if (job.sink == Sink::Stream) eko_jpeg_enc_mcu_set_stream(ctx, Output::collect, &out);
    job.hook(ctx, Stage::Created);
    auto& coefficients = job.coefficients;
    if (job.mode != Mode::Bands && coefficients.empty()) coefficients = library_coefficients(info, job.settings);
    const uint32_t rows = ctx->total_imcu_rows, per_row = ctx->mcus_per_row, blocks = ctx->blocks_in_mcu;
    uint32_t next = 0;
    bool ok = true;
    if (job.mode == Mode::Columns) {
        __eko_jpeg_enc_col_encoder_init(ctx);
        job.hook(ctx, Stage::SetUp);
        ok = ctx->columns != nullptr;
        for (uint32_t x = 0; ok && x < per_row; ++x) {
            auto lists = block_lists(coefficients, blocks, x, rows, per_row);
            job.hook(ctx, Stage::Unit);
            ok = __eko_jpeg_enc_col_entroy_encoder(ctx, lists.data(), &next) == 1 &&
                 next == (x + 1) * ctx->max_h_samp * 8u;
        }
        job.hook(ctx, Stage::BeforeJoin);
        ok = __eko_jpeg_enc_col_encoder_finish(ctx) == 1 && ok;
        job.hook(ctx, Stage::Joined);
    }
    // Each operation has two exported names; alternate between them.
    for (uint32_t b = 0; ok && job.mode != Mode::Columns && b < rows; ++b) {
        job.hook(ctx, Stage::Unit);
        if (job.mode == Mode::Rows) {
            auto lists = block_lists(coefficients, blocks, b * per_row, per_row, 1);
            ok = (b % 2 ? __OvidanJpegEncEntroyEncoder : __eko_jpeg_enc_entroy_encoder)(ctx, lists.data(), &next) == 1;
        } else {
            const Bytes band = band_buffer(ctx, info, b);
            ok = (b % 2 ? eko_jpeg_enc_col_muc_process : eko_jpeg_enc_muc_process)(
                     ctx, band.empty() ? nullptr : band.data(), &next) == 1;
        }
        ok = ok && next == (b + 1) * ctx->max_v_samp * 8u;
    }
    job.hook(ctx, Stage::Coded);
    const Bytes stream = out.finish(ctx);
    return ok && out.largest_piece <= 4096 ? stream : Bytes{};
}

Bytes pending(EncoderContext* ctx) {
    uint8_t* buffer = nullptr;
    uint32_t length = 0;
    eko_jpeg_enc_mcu__get_encdata(ctx, &buffer, &length);
    return Bytes(buffer, buffer + (buffer != nullptr ? length : 0));
}

std::vector<McuBlockList> block_lists(std::vector<int16_t>& coefficients, uint32_t blocks_in_mcu, uint32_t first,
                                      uint32_t count, uint32_t stride) {
    std::vector<McuBlockList> lists(count);
    for (uint32_t k = 0; k < count; ++k)
        for (uint32_t b = 0; b < blocks_in_mcu; ++b)
            lists[k].blocks[b] = &coefficients[(static_cast<size_t>(first + k * stride) * blocks_in_mcu + b) * 64];
    return lists;
}

std::vector<int16_t> library_coefficients(const ImageInfo& info, const EncoderSettings* settings) {
    const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
    const EncodeOptions options{75, nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, settings);
    int16_t* const* mcu = ctx->mcu_state->mcu_buffer;
    std::vector<int16_t> out;
    for (uint32_t band = 0; band < ctx->total_imcu_rows; ++band) {
        switch (ctx->format) {
            case EKO_FORMAT_RGB565: __eko_jpeg_enc_get_raw_rgb565_data(ctx); break;
            case EKO_FORMAT_RGB888: __eko_jpeg_enc_get_raw_rgb888_data(ctx); break;
            case EKO_FORMAT_RGBA8888: __eko_jpeg_enc_get_raw_rgba8888_data(ctx); break;
            case EKO_FORMAT_BGRA8888: __eko_jpeg_enc_get_raw_bgra8888_data(ctx); break;
            default: __eko_jpeg_enc_get_raw_data(ctx);
        }
        for (uint32_t x = 0; x < ctx->mcus_per_row; ++x) {
            uint32_t blkn = 0;
            for (int c = 0; c < ctx->comps_in_scan; ++c) {
                const ComponentInfo* k = ctx->cur_comp_info[c];
                for (uint32_t r = 0; r < k->mcu_height; ++r, blkn += k->mcu_width) {
                    // Blocks beyond the image repeat the DC of the block before.
                    const bool inside = band + 1 < ctx->total_imcu_rows || r < k->last_row_height;
                    const uint32_t count = !inside ? 0 : x + 1 < ctx->mcus_per_row ? k->mcu_width : k->last_col_width;
                    BlockPosition pos{r * 8, x * k->mcu_sample_width, count};
                    __eko_jpeg_enc_do_forward_dct(ctx->divisors[k->quant_tbl_no], nullptr,
                                                  ctx->sample_rows->row_arrays[k->component_index], mcu[blkn], &pos);
                    for (uint32_t j = count; j < k->mcu_width; ++j) {
                        std::memset(mcu[blkn + j], 0, 128);
                        mcu[blkn + j][0] = mcu[inside ? blkn + j - 1 : blkn - 1][0];
                    }
                }
            }
            out.insert(out.end(), mcu[0], mcu[0] + 64 * ctx->blocks_in_mcu);
        }
        ++ctx->mcu_state->imcu_row;
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
    // Every number of the case in order: format, size, quality, then the
    // record's fields as laid out.
    std::vector<uint32_t> n;
    const std::regex number("[0-9]+");
    for (auto it = std::sregex_iterator(item.begin() + item.find("\"format\""), item.end(), number);
         it != std::sregex_iterator(); ++it)
        n.push_back(static_cast<uint32_t>(std::stoul(it->str())));
    width = static_cast<int>(n.at(1));
    height = static_cast<int>(n.at(2));
    quality = n.at(3);
    EncoderSettings s{};
    s.num_components = static_cast<uint8_t>(n.at(4));
    s.num_quant_tables = static_cast<int32_t>(n.at(5));
    size_t k = 6;
    for (int32_t t = 0; t < s.num_quant_tables; ++t)
        for (int i = 0; i < 64; ++i) s.quant_tables[t][i] = static_cast<uint8_t>(n.at(k++));
    s.write_dri = n.at(k++);
    s.size_estimate = n.at(k++);
    for (auto& spec : s.component_specs)
        for (auto& value : spec) value = static_cast<uint8_t>(n.at(k++));
    return s;
}

}  // namespace tekoj_test
