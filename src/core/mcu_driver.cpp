// Scan geometry and the band (MCU-row) driver: reads one band through the
// format's reader, transforms each block of every MCU and hands the MCU to
// the block coder. Blocks wholly outside the image become cheap dummies.
#include "sink/output_target.h"
#include "core/entropy_coder.h"
#include "core/forward_dct.h"
#include "input/formats.h"
#include "input/readers.h"
#include "core/band_driver.h"

#include <cstring>

namespace tekoj {
namespace {

// Zero block whose DC repeats `dc`: codes as a zero difference and EOB.
inline void dummy_block(int16_t* blk, int16_t dc) {
    std::memset(blk, 0, 64 * sizeof(int16_t));
    blk[0] = dc;
}

}  // namespace

// The driver transforms runs of MCUs ahead of the coder: one kernel call per
// block row of a component covers the whole run, so the call and the
// kernel's set-up are paid once per run rather than once per block. The
// run's coefficients live on the stack (kRunBlocks blocks, 7.5 KiB).
constexpr uint32_t kRunBlocks = 60;

bool compress_band(EncoderContext* ctx, uint8_t** const* row_arrays) {
    McuState* st = ctx->mcu_state;
    const uint32_t last_col = ctx->mcus_per_row - 1;
    const bool last_band = st->imcu_row == ctx->total_imcu_rows - 1;
    // The transform kernel of the process's SIMD level, and the scan's
    // quantisation tables in the forms it takes (prepared once per band).
    const FdctBlocksFn fdct = fdct_blocks();
    QuantTable quant[4];
    for (QuantTable& q : quant) q.divisors = nullptr;
    for (int c = 0; c < ctx->comps_in_scan; ++c) {
        const uint8_t t = ctx->cur_comp_info[c]->quant_tbl_no;
        if (quant[t].divisors != ctx->divisors[t]) prepare_quant_table(ctx->divisors[t], quant[t]);
    }
    const uint32_t run_mcus = kRunBlocks / ctx->blocks_in_mcu;
    alignas(16) int16_t coef[kRunBlocks * 64];
    // One coder for the whole band: the accumulator carries over from MCU to
    // MCU and is written out a whole word at a time.
    RowCoder coder;
    begin_coding(coder, ctx);
    for (uint32_t y = st->mcu_vert_offset; y < st->mcu_rows_per_imcu_row; ++y) {
        for (uint32_t x0 = st->mcu_ctr; x0 <= last_col;) {
            const uint32_t n = last_col + 1 - x0 < run_mcus ? last_col + 1 - x0 : run_mcus;
            // Strip k holds block row r of component c for the n MCUs, in MCU
            // block order; width[k] blocks per MCU.
            int16_t* strip[10];
            uint32_t width[10];
            uint32_t k = 0;
            int16_t* next = coef;
            for (int c = 0; c < ctx->comps_in_scan; ++c) {
                const ComponentInfo* comp = ctx->cur_comp_info[c];
                const uint32_t w = comp->mcu_width, blocks = n * w;
                const uint32_t count = x0 + n - 1 < last_col ? blocks : blocks - w + comp->last_col_width;
                uint8_t* const* rows = row_arrays[comp->component_index] + y * 8;
                for (uint32_t r = 0; r < comp->mcu_height; ++r, ++k, next += 64 * blocks, rows += 8) {
                    strip[k] = next;
                    width[k] = w;
                    if (!last_band || y + r < comp->last_row_height) {
                        fdct(rows, x0 * comp->mcu_sample_width, count, quant[comp->quant_tbl_no], next);
                        // Blocks past the right edge repeat the DC to their left.
                        for (uint32_t j = count; j < blocks; ++j) dummy_block(next + 64 * j, next[64 * (j - 1)]);
                    } else {
                        // Rows below the image repeat the DC of the MCU's block
                        // before them in coding order.
                        for (uint32_t j = 0; j < blocks; ++j)
                            dummy_block(next + 64 * j, strip[k - 1][64 * ((j / w) * width[k - 1] + width[k - 1] - 1)]);
                    }
                }
            }
            // The first MCU's blocks, and how far each block steps per MCU.
            int16_t* mcu[10];
            uint32_t step[10];
            uint32_t blocks = 0;
            for (uint32_t s = 0; s < k; ++s)
                for (uint32_t h = 0; h < width[s]; ++h, ++blocks) {
                    mcu[blocks] = strip[s] + 64 * h;
                    step[blocks] = 64 * width[s];
                }
            for (uint32_t i = 0; i < n; ++i) {
                if (!code_mcu(coder, *ctx->coder_tables, mcu)) return false;
                for (uint32_t b = 0; b < blocks; ++b) mcu[b] += step[b];
            }
            x0 += n;
        }
        st->mcu_ctr = 0;
    }
    end_coding(coder, ctx);
    ++st->imcu_row;
    tekoj::setup_band(ctx);
    return true;
}

bool process_band(EncoderContext* ctx) {
    if (ctx->failed != 0) return false;
    SampleRowSet* rows = ctx->sample_rows;
    uint8_t** arrays[3] = {rows->row_arrays[0], rows->row_arrays[1], rows->row_arrays[2]};
    InPlaceRows in_place;
    if (!read_planar_in_place(ctx, in_place, arrays)) format_traits(ctx->format)->read(ctx);
    const bool ok = compress_band(ctx, arrays);
    ++rows->band_counter;
    rows->band_flag = 0;
    return ok;
}

}  // namespace tekoj

namespace tekoj {

uint32_t set_component(EncoderContext* context, uint32_t index, uint32_t id, uint8_t h, uint8_t v,
                       uint8_t quant_tbl_no, uint8_t dc_tbl_no, uint8_t ac_tbl_no) {
    ComponentInfo* comp = &context->comp_info[index];
    comp->component_id = static_cast<uint8_t>(id);
    comp->component_index = static_cast<uint8_t>(index);
    comp->h_samp_factor = h;
    comp->v_samp_factor = v;
    comp->quant_tbl_no = quant_tbl_no;
    comp->dc_tbl_no = dc_tbl_no;
    comp->ac_tbl_no = ac_tbl_no;
    if (h > context->max_h_samp) context->max_h_samp = h;
    if (v > context->max_v_samp) context->max_v_samp = v;
    return 1;
}

uint32_t setup_scan(EncoderContext* context) {
    const uint32_t width = static_cast<uint32_t>(context->width);
    const uint32_t height = static_cast<uint32_t>(context->height);
    if (context->comps_in_scan == 1) {
        ComponentInfo* comp = context->cur_comp_info[0];
        context->mcus_per_row = comp->width_in_blocks;
        context->mcu_rows_in_scan = comp->height_in_blocks;
        comp->mcu_width = comp->mcu_height = comp->mcu_blocks = 1;
        comp->mcu_sample_width = 8;
        comp->last_col_width = 1;
        const uint32_t rem = comp->height_in_blocks % comp->v_samp_factor;
        comp->last_row_height = rem == 0 ? comp->v_samp_factor : rem;
        context->blocks_in_mcu = 1;
        context->mcu_membership[0] = 0;
        return 1;
    }
    const uint32_t mcu_w = context->max_h_samp * 8u, mcu_h = context->max_v_samp * 8u;
    context->mcus_per_row = (width + mcu_w - 1) / mcu_w;
    context->mcu_rows_in_scan = (height + mcu_h - 1) / mcu_h;
    uint32_t blocks = 0;
    for (int c = 0; c < context->comps_in_scan; ++c) {
        ComponentInfo* comp = context->cur_comp_info[c];
        const uint32_t h = comp->h_samp_factor, v = comp->v_samp_factor;
        comp->mcu_width = h;
        comp->mcu_height = v;
        comp->mcu_blocks = h * v;
        comp->mcu_sample_width = h * 8;
        const uint32_t wrem = comp->width_in_blocks % h;
        comp->last_col_width = wrem == 0 ? h : wrem;
        const uint32_t hrem = comp->height_in_blocks % v;
        comp->last_row_height = hrem == 0 ? v : hrem;
        if (blocks + h * v > 10) {
            eko_SetError(EKO_ERR_SAMPLING);
            return 0;
        }
        for (uint32_t k = 0; k < h * v; ++k) context->mcu_membership[blocks + k] = static_cast<uint32_t>(c);
        blocks += h * v;
    }
    context->blocks_in_mcu = static_cast<uint8_t>(blocks);
    return 1;
}

uint32_t setup_band(EncoderContext* context) {
    McuState* st = context->mcu_state;
    const bool last = st->imcu_row == context->total_imcu_rows - 1;
    if (context->comps_in_scan > 1) {
        st->mcu_rows_per_imcu_row = 1;
    } else {
        const ComponentInfo* comp = context->cur_comp_info[0];
        st->mcu_rows_per_imcu_row = last ? comp->last_row_height : comp->v_samp_factor;
    }
    if (last) {
        for (int c = 0; c < context->comps_in_scan; ++c) {
            ComponentInfo* comp = context->cur_comp_info[c];
            const uint32_t rem = comp->downsampled_height % comp->band_rows;
            comp->rows_this_band = rem == 0 ? comp->band_rows : rem;
        }
    }
    st->mcu_ctr = 0;
    st->mcu_vert_offset = 0;
    return 1;
}

}  // namespace tekoj

extern "C" {

EKO_API uint32_t __eko_jpeg_enc_compress_data(EncoderContext* context, uint8_t** const* row_arrays) {
    return tekoj::compress_band(context, row_arrays) ? 1 : 0;
}

EKO_API uint32_t __eko_jpeg_enc_process_image_data(EncoderContext* context) {
    return tekoj::process_band(context) ? 1 : 0;
}

EKO_API uint32_t __eko_jpeg_enc_set_component_info(EncoderContext* context, uint32_t index, uint32_t id, uint8_t h,
                                                   uint8_t v, uint8_t quant_tbl_no, uint8_t dc_tbl_no,
                                                   uint8_t ac_tbl_no) {
    return tekoj::set_component(context, index, id, h, v, quant_tbl_no, dc_tbl_no, ac_tbl_no);
}
EKO_API uint32_t __eko_jpeg_enc_setup_scan(EncoderContext* context) { return tekoj::setup_scan(context); }
EKO_API uint32_t __eko_jpeg_enc_setup_imcu(EncoderContext* context) { return tekoj::setup_band(context); }

}  // extern "C"
