#include "incremental/incremental_support.h"

#include <algorithm>
#include <cstdio>
#include <cstring>

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

std::vector<McuBlockList> block_lists(std::vector<int16_t>& coefficients, uint32_t blocks, uint32_t first,
                                      uint32_t count, uint32_t stride) {
    std::vector<McuBlockList> lists(count);
    for (uint32_t k = 0; k < count; ++k)
        for (uint32_t b = 0; b < blocks; ++b)
            lists[k].blocks[b] = &coefficients[(static_cast<size_t>(first + k * stride) * blocks + b) * 64];
    return lists;
}

}  // namespace tekoj_test
