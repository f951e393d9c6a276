// Row entropy driver: codes one band of caller-supplied quantised
// coefficient blocks exactly where the band driver would have coded the
// blocks it computed itself, restart markers included.
#include "sink/output_target.h"
#include "core/band_driver.h"
#include "core/entropy_coder.h"
#include "incremental/incremental.h"

namespace tekoj {
namespace {

// MCUs the current band still holds, counted as the driver walks them.
uint32_t mcus_left_in_band(const EncoderContext* ctx) {
    const McuState* st = ctx->mcu_state;
    if (st->mcu_vert_offset >= st->mcu_rows_per_imcu_row) return 0;
    return (st->mcu_rows_per_imcu_row - st->mcu_vert_offset) * ctx->mcus_per_row - st->mcu_ctr;
}

// Checks every MCU of the band before any is coded, so that a refused band
// leaves the stream untouched and can be corrected and handed in again. The
// predictors are walked as the coder will walk them: reset by a due restart
// marker, then each component's last DC value. The coder state is put back
// afterwards.
bool band_codable(EncoderContext* ctx, const McuBlockList* mcus, uint32_t count) {
    EntropyState* es = ctx->entropy;
    const int32_t saved_dc[3] = {es->last_dc_val[0], es->last_dc_val[1], es->last_dc_val[2]};
    const RestartClock saved_clock = load_restart(ctx);
    RestartClock clock = saved_clock;
    bool ok = true;
    for (uint32_t k = 0; k < count; ++k) {
        int16_t* const* blocks = mcus[k].blocks;
        ok = mcu_codable(ctx, blocks);
        if (!ok) break;
        clock.tick();
        store_restart(ctx, clock);
        // Every scan component owns at least one block of the MCU, so this
        // leaves each predictor at the value the coder will leave.
        for (uint32_t n = 0; n < ctx->blocks_in_mcu; ++n) es->last_dc_val[ctx->mcu_membership[n]] = blocks[n][0];
    }
    for (int c = 0; c < 3; ++c) es->last_dc_val[c] = saved_dc[c];
    store_restart(ctx, saved_clock);
    return ok;
}

uint32_t code_band(EncoderContext* ctx, McuBlockList* mcus, uint32_t* next_row_out) {
    eko_SetError(EKO_OK);
    if (ctx == nullptr || mcus == nullptr || next_row_out == nullptr) return refuse(EKO_ERR_ARGUMENT);
    if (!may_code_rows(ctx)) return 0;
    if (!band_codable(ctx, mcus, mcus_left_in_band(ctx))) return refuse(EKO_ERR_ARGUMENT);

    McuState* st = ctx->mcu_state;
    const uint32_t last_col = ctx->mcus_per_row - 1;
    const McuBlockList* p = mcus;
    for (uint32_t y = st->mcu_vert_offset; y < st->mcu_rows_per_imcu_row; ++y) {
        for (uint32_t x = st->mcu_ctr; x <= last_col; ++x) {
            if (!encode_mcu(ctx, p->blocks)) return 0;  // the output failed; the context says why
            ++p;
        }
        st->mcu_ctr = 0;
    }
    ++st->imcu_row;
    tekoj::setup_band(ctx);
    ctx->next_row = static_cast<uint16_t>(ctx->next_row + ctx->max_v_samp * 8u);
    *next_row_out = ctx->next_row;
    return 1;
}

}  // namespace
}  // namespace tekoj

extern "C" {

EKO_API uint32_t __eko_jpeg_enc_entroy_encoder(EncoderContext* context, McuBlockList* mcus,
                                               uint32_t* next_row_out) {
    return tekoj::code_band(context, mcus, next_row_out);
}

EKO_API uint32_t __OvidanJpegEncEntroyEncoder(EncoderContext* context, McuBlockList* mcus,
                                              uint32_t* next_row_out) {
    return tekoj::code_band(context, mcus, next_row_out);
}

}  // extern "C"
