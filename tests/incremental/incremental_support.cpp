#include "incremental/incremental_support.h"
#include "support/fault_os_layer.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <span>

#include <jpeglib.h>

namespace tekoj_test {

Bytes encode(const ImageInfo& info, Job job) {
    if (job.mode != Mode::Bands && job.coefficients.empty())
        job.coefficients = coefficients_of(encode(info, {.settings = job.settings}));
    const std::string path = temp_path("incremental.jpg");
    void* file = job.sink == EKO_OUTPUT_FILE ? DORVATEKO_OsFopen(path.c_str(), "wb") : nullptr;
    // A memory target starts in a block of ours that the header fits in.
    auto* buffer = static_cast<uint8_t*>(job.sink == EKO_OUTPUT_MEMORY ? DORVATEKO_OsMalloc(2048) : nullptr);
    const OutputRequest request{job.sink, file, buffer, buffer != nullptr ? 2048u : 0u};
    const EncodeOptions options{75, nullptr, 0};
    if (job.fail_at >= 0) fail_allocation(job.fail_at);
    EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &request, &options, job.settings);
    Bytes out;
    uint32_t length = 0, next = 0;
    bool ok = ctx != nullptr;
    if (!ok && job.fail_at >= 0) fail_allocation(-1);
    if (!ok) DORVATEKO_OsFree(buffer);  // refused, still ours
    if (ok) {
        job.hook(ctx, Stage::Created);
        // A piece over 4096 bytes is dropped, which spoils the stream.
        if (job.sink == EKO_OUTPUT_STREAM)
            eko_jpeg_enc_mcu_set_stream(ctx, [](void* to, const uint8_t* data, uint32_t count) {
                if (count <= 4096) static_cast<Bytes*>(to)->insert(static_cast<Bytes*>(to)->end(), data, data + count);
                return count;
            }, &out);
        const uint32_t rows = ctx->total_imcu_rows, per_row = ctx->mcus_per_row, blocks = ctx->blocks_in_mcu;
        const bool columns = job.mode == Mode::Columns, planar = job.mode == Mode::Bands &&
                             (ctx->format == EKO_FORMAT_YUV420 || ctx->format == EKO_FORMAT_GREY);
        if (columns) __eko_jpeg_enc_col_encoder_init(ctx);
        if (columns) job.hook(ctx, Stage::SetUp);
        ok = !columns || ctx->columns != nullptr;
        // Planar bands go in the band buffer's fixed regions. Each call has
        // two exported names, used in turn.
        const size_t w = static_cast<size_t>(ctx->width), region[3] = {0, w * 16, w * 16 + (w + 1) / 2 * 8};
        for (uint32_t u = 0; ok && u < (columns ? per_row : rows); ++u) {
            job.hook(ctx, Stage::Unit);
            auto lists = block_lists(job.coefficients, blocks, columns ? u : u * per_row,
                                     job.mode == Mode::Bands ? 0 : columns ? rows : per_row, columns ? per_row : 1);
            Bytes band(w * 32);
            const auto* plane = static_cast<const uint8_t*>(info.data);
            for (int c = 0; planar && c < ctx->num_components; ++c) {
                const ComponentInfo& k = ctx->comp_info[c];
                const size_t top = u * k.band_rows, n = std::min<size_t>(k.band_rows, k.downsampled_height - top);
                std::memcpy(&band[region[c]], plane + top * k.downsampled_width, n * k.downsampled_width);
                plane += static_cast<size_t>(k.downsampled_width) * k.downsampled_height;
            }
            ok = (columns                  ? __eko_jpeg_enc_col_entroy_encoder(ctx, lists.data(), &next)
                  : job.mode == Mode::Rows ? (u % 2 ? __OvidanJpegEncEntroyEncoder : __eko_jpeg_enc_entroy_encoder)(
                                                 ctx, lists.data(), &next)
                                           : (u % 2 ? eko_jpeg_enc_col_muc_process : eko_jpeg_enc_muc_process)(
                                                 ctx, planar ? band.data() : nullptr, &next)) == 1 &&
                 next == (u + 1) * 8u * (columns ? ctx->max_h_samp : ctx->max_v_samp);
        }
        if (columns) job.hook(ctx, Stage::BeforeJoin);
        ok = (!columns || __eko_jpeg_enc_col_encoder_finish(ctx) == 1) && ok;
        if (columns) job.hook(ctx, Stage::Joined);
        job.hook(ctx, Stage::Coded);
        eko_jpeg_enc_mcu_finish(ctx, &buffer, &length);  // no block for a file or stream
        if (job.fail_at >= 0) fail_allocation(-1);
        if (buffer != nullptr) out.assign(buffer, buffer + length);
        DORVATEKO_OsFree(buffer);
    }
    if (file != nullptr && DORVATEKO_OsFclose(file) == 0) out = read_file(path);
    std::remove(path.c_str());
    return ok && out.size() == length ? out : Bytes{};
}

std::vector<int16_t> coefficients_of(const Bytes& jpeg) {
    jpeg_error_mgr error{};
    jpeg_decompress_struct d{.err = jpeg_std_error(&error)};
    jpeg_create_decompress(&d);
    jpeg_mem_src(&d, jpeg.data(), jpeg.size());
    jpeg_read_header(&d, TRUE);
    jvirt_barray_ptr* planes = jpeg_read_coefficients(&d);
    std::vector<int16_t> out;
    for (JDIMENSION y = 0; y < d.MCU_rows_in_scan; ++y)
        for (JDIMENSION x = 0; x < d.MCUs_per_row; ++x)
            for (const jpeg_component_info* k : std::span(d.cur_comp_info, d.comps_in_scan)) {
                const JDIMENSION h = k->MCU_height, w = k->MCU_width;  // blocks of the MCU
                auto rows = d.mem->access_virt_barray((j_common_ptr)&d, planes[k->component_index], y * h, h, FALSE);
                for (JDIMENSION r = 0; r < h; ++r) out.insert(out.end(), rows[r][x * w], rows[r][x * w] + 64 * w);
            }
    jpeg_destroy_decompress(&d);
    return out;
}

std::vector<McuBlockList> block_lists(std::vector<int16_t>& coefficients, uint32_t blocks, uint32_t first,
                                      uint32_t count, uint32_t stride) {
    std::vector<McuBlockList> lists(count);
    for (uint32_t k = 0; k < count; ++k)
        for (uint32_t b = 0; b < blocks; ++b)
            lists[k].blocks[b] = &coefficients[(static_cast<size_t>(first + k * stride) * blocks + b) * 64];
    return lists;
}

EncoderSettings settings(uint32_t size_estimate, uint32_t write_dri, uint8_t h, uint8_t v, uint32_t quality) {
    EncoderSettings s{.num_components = 3, .num_quant_tables = 2, .write_dri = write_dri,
                      .size_estimate = size_estimate, .component_specs = {{0, h, v}, {1, 1, 1}, {1, 1, 1}}};
    // The usual tables, scaled as for qualities 50..99.
    for (int i = 0, scale = 200 - 2 * static_cast<int>(quality); i < 64; ++i) {
        s.quant_tables[0][i] = uint8_t((eko_luminanceQuantTbl[0][i] * scale + 50) / 100);
        s.quant_tables[1][i] = uint8_t((eko_chrominanceQuantTbl[0][i] * scale + 50) / 100);
    }
    return s;
}

}  // namespace tekoj_test
