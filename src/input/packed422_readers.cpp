// Readers for packed 4:2:2 camera frames: every two horizontally adjacent
// pixels share one 4-byte group Y0, U (Cb), Y1, V (Cr), and a row of a w-pixel
// frame is exactly (w >> 1) groups.
//
// One reader codes the frame 4:2:0 (the encoder's default sampling), keeping
// the chroma of the upper row of every row pair; the other keeps 4:2:2 for an
// encoder set up with Y 2x1. Like every reader they fill one band of sample
// rows per call, read through read_ptr and leave it at the next band.
#include <TekoJEncoderInternal.h>

#include "input/edge_fill.h"
#include "input/pixel_kernels.h"

#include <cstdint>

namespace {

// A packed row of an odd-width frame holds no sample for the last pixel. It
// gets a copy of the last Y sample, and the last chroma column a copy of the
// last chroma sample, by the same right-edge repetition that pads every row
// up to padded_width.
//
// A frame one pixel wide holds no group at all, so nothing can be read; its
// band is filled with mid grey rather than left with stale bytes.
constexpr uint8_t kNoData = 128;

struct Band {
    const ComponentInfo* comp[3];
    uint8_t** rows[3];
};

// The components the packed readers need, or false when the context cannot
// take a three-component band of the expected shape. `luma_rows_per_chroma`
// is 1 for 4:2:2 and 2 for 4:2:0; a context set up for another sampling is
// refused rather than written beyond its chroma rows.
bool band_of(const EncoderContext* ctx, uint32_t luma_rows_per_chroma, Band& band) {
    if (ctx == nullptr || ctx->num_components < 3 || ctx->comp_info == nullptr || ctx->sample_rows == nullptr)
        return false;
    for (int c = 0; c < 3; ++c) {
        band.comp[c] = &ctx->comp_info[c];
        band.rows[c] = ctx->sample_rows->row_arrays[c];
        if (band.rows[c] == nullptr) return false;
    }
    // Chroma rows must hold one row per luma row (4:2:2) or per luma pair.
    const uint32_t chroma_needed = (band.comp[0]->band_rows + luma_rows_per_chroma - 1) / luma_rows_per_chroma;
    return band.comp[1]->band_rows >= chroma_needed && band.comp[2]->band_rows >= chroma_needed;
}

void fill_no_data(const Band& band) {
    for (int c = 0; c < 3; ++c)
        for (uint32_t r = 0; r < band.comp[c]->band_rows; ++r)
            DORVATEKO_OsMemset(band.rows[c][r], kNoData, band.comp[c]->padded_width);
}

// Repeats the last written sample to the right and the last written row down
// to the end of the band, for all three components.
void fill_edges(const Band& band, uint32_t groups, uint32_t luma_rows, uint32_t chroma_rows) {
    tekoj::fill_component_edges(band.rows[0], *band.comp[0], 2 * groups, luma_rows);
    tekoj::fill_component_edges(band.rows[1], *band.comp[1], groups, chroma_rows);
    tekoj::fill_component_edges(band.rows[2], *band.comp[2], groups, chroma_rows);
}

inline uint32_t luma_rows_of(const Band& band) {
    const ComponentInfo& y = *band.comp[0];
    return y.rows_this_band < y.band_rows ? y.rows_this_band : y.band_rows;
}

}  // namespace

extern "C" {

EKO_API uint32_t __eko_jpeg_enc_get_raw_duoview422_data(EncoderContext* context) {
    Band band{};
    eko_SetError(EKO_OK);
    if (!band_of(context, 2, band)) return eko_SetError(context ? EKO_ERR_SAMPLING : EKO_ERR_ARGUMENT), 0u;
    const uint32_t groups = band.comp[0]->downsampled_width >> 1;
    if (groups == 0) {
        fill_no_data(band);
        return 1;
    }
    const uint32_t rows = luma_rows_of(band);
    const uint32_t row_bytes = groups * 4;
    const tekoj::InputKernels& k = tekoj::input_kernels();
    const uint8_t* s = context->read_ptr;
    uint32_t pairs = 0;
    for (uint32_t r = 0; r < rows; r += 2, ++pairs) {
        k.split422(s, groups, band.rows[0][r], band.rows[1][pairs], band.rows[2][pairs]);
        s += row_bytes;
        // The lower row's chroma is dropped: 4:2:0 keeps the upper row's.
        // With an odd row count the last pair has no lower row in the
        // caller's buffer; the single last row then stands for both, which
        // the row repetition below provides.
        if (r + 1 < rows) {
            k.luma422(s, groups, band.rows[0][r + 1]);
            s += row_bytes;
        }
    }
    context->read_ptr = s;
    fill_edges(band, groups, rows, pairs);
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(EncoderContext* context) {
    Band band{};
    eko_SetError(EKO_OK);
    if (!band_of(context, 1, band)) return eko_SetError(context ? EKO_ERR_SAMPLING : EKO_ERR_ARGUMENT), 0u;
    const uint32_t groups = band.comp[0]->downsampled_width >> 1;
    if (groups == 0) {
        fill_no_data(band);
        return 1;
    }
    const uint32_t rows = luma_rows_of(band);
    const auto split = tekoj::input_kernels().split422;
    const uint8_t* s = context->read_ptr;
    for (uint32_t r = 0; r < rows; ++r, s += groups * 4)
        split(s, groups, band.rows[0][r], band.rows[1][r], band.rows[2][r]);
    context->read_ptr = s;
    fill_edges(band, groups, rows, rows);
    return 1;
}

}  // extern "C"
