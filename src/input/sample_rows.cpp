// Band sample rows and the planar readers (planar YUV 4:2:0, grey, and a luma
// plane followed by an interleaved V/U plane).
#include "input/edge_fill.h"
#include "input/readers.h"
#include "input/sample_row_layout.h"
#include "input/vu_split.h"

extern "C" {

EKO_API uint8_t** __eko_jpeg_enc_alloc_sample_arry(EncoderContext* context, uint32_t row_length,
                                                   uint32_t row_count) {
    (void)context;
    // One block: the row pointers, then the rows at a fixed aligned stride.
    const tekoj::SampleRowLayout layout = tekoj::sample_row_layout(row_length, row_count);
    auto* block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(layout.block_size));
    if (block == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return nullptr;
    }
    auto** rows = reinterpret_cast<uint8_t**>(block);
    uint8_t* first = tekoj::first_sample_row(rows, row_count);
    for (uint32_t r = 0; r < row_count; ++r) rows[r] = first + static_cast<size_t>(r) * layout.stride;
    return rows;
}

EKO_API uint32_t __eko_jpeg_enc_get_raw_data(EncoderContext* context) {
    const uint8_t** planes[3] = {&context->plane_y, &context->plane_u, &context->plane_v};
    for (int c = 0; c < context->num_components && c < 3; ++c) {
        const ComponentInfo& comp = context->comp_info[c];
        uint8_t* const* rows = context->sample_rows->row_arrays[c];
        const uint8_t* p = *planes[c];
        const uint32_t n = comp.downsampled_width;
        for (uint32_t r = 0; r < comp.rows_this_band; ++r) {
            DORVATEKO_OsMemcpy(rows[r], p, n);
            p += n;
        }
        tekoj::fill_component_edges(rows, comp, n, comp.rows_this_band);
        *planes[c] = p;
    }
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_get_raw_pvu_data(EncoderContext* context) {
    const ComponentInfo& y = context->comp_info[0];
    uint8_t* const* yrows = context->sample_rows->row_arrays[0];
    for (uint32_t r = 0; r < y.rows_this_band; ++r) {
        DORVATEKO_OsMemcpy(yrows[r], context->plane_y, y.downsampled_width);
        context->plane_y += y.downsampled_width;
    }
    tekoj::fill_component_edges(yrows, y, y.downsampled_width, y.rows_this_band);

    const ComponentInfo& cb = context->comp_info[1];
    const ComponentInfo& cr = context->comp_info[2];
    uint8_t* const* cbrows = context->sample_rows->row_arrays[1];
    uint8_t* const* crrows = context->sample_rows->row_arrays[2];
    const uint32_t n = cb.downsampled_width;
    static const tekoj::SplitVuFn split = tekoj::split_vu_for(tekoj::simd_level());
    for (uint32_t r = 0; r < cb.rows_this_band; ++r) {
        split(context->plane_v, n, crrows[r], cbrows[r]);  // V comes first in each pair
        context->plane_v += 2 * static_cast<size_t>(n);
    }
    tekoj::fill_component_edges(cbrows, cb, n, cb.rows_this_band);
    tekoj::fill_component_edges(crrows, cr, n, cb.rows_this_band);
    return 1;
}

}  // extern "C"

namespace tekoj {

void split_vu_portable(const uint8_t* src, uint32_t n, uint8_t* cr, uint8_t* cb) {
    for (uint32_t x = 0; x < n; ++x) {
        cr[x] = src[2 * x];
        cb[x] = src[2 * x + 1];
    }
}

SplitVuFn split_vu_for(SimdLevel level) {
    if (!simd_supported(level)) return split_vu_portable;
#if defined(__x86_64__) || (defined(__i386__) && defined(__SSE2__))
    if (level == SimdLevel::sse2 || level == SimdLevel::avx2 || level == SimdLevel::avx512) return split_vu_sse2;
#endif
#if defined(__arm__) || defined(__aarch64__)
    if (level == SimdLevel::neon) return split_vu_neon;
#endif
    return split_vu_portable;
}

bool read_planar_in_place(EncoderContext* ctx, InPlaceRows& storage, uint8_t** (&arrays)[3]) {
    if (!format_traits(ctx->format)->planar) return false;
    const uint32_t components = ctx->num_components < 3 ? ctx->num_components : 3;
    for (uint32_t c = 0; c < components; ++c) {
        const ComponentInfo& comp = ctx->comp_info[c];
        if (comp.downsampled_width != comp.padded_width || comp.rows_this_band != comp.band_rows ||
            comp.band_rows > 16)
            return false;
    }
    const uint8_t** planes[3] = {&ctx->plane_y, &ctx->plane_u, &ctx->plane_v};
    for (uint32_t c = 0; c < components; ++c) {
        const ComponentInfo& comp = ctx->comp_info[c];
        for (uint32_t r = 0; r < comp.band_rows; ++r)
            storage.rows[c][r] = const_cast<uint8_t*>(*planes[c] + static_cast<size_t>(r) * comp.downsampled_width);
        *planes[c] += static_cast<size_t>(comp.band_rows) * comp.downsampled_width;
        arrays[c] = storage.rows[c];
    }
    return true;
}

void seek_band(EncoderContext* ctx, const ReadOrigin& origin, uint32_t band) {
    const FormatTraits* format = format_traits(ctx->format);
    if (format->planar) {
        // Each earlier band took band_rows rows of every component's plane.
        const uint8_t** planes[3] = {&ctx->plane_y, &ctx->plane_u, &ctx->plane_v};
        for (uint32_t c = 0; c < ctx->num_components && c < 3; ++c) {
            const ComponentInfo& comp = ctx->comp_info[c];
            const size_t skip = static_cast<size_t>(band) * comp.band_rows * comp.downsampled_width;
            *planes[c] = origin.plane[c] == nullptr ? nullptr : origin.plane[c] + skip;
        }
        return;
    }
    const size_t bytes_per_pixel = format->bytes_per_pixel;
    const size_t rows = static_cast<size_t>(band) * ctx->max_v_samp * 8u;
    ctx->read_ptr = origin.read_ptr + rows * static_cast<size_t>(ctx->width) * bytes_per_pixel;
}

}  // namespace tekoj
