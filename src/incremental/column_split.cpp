// Column-split mode: the caller delivers the image as MCU columns, left to
// right, each holding one MCU of every MCU row. A JPEG scan lists MCUs row by
// row, so every MCU row gets its own entropy-coded stream (a memory target
// with its own coder state), and the finish step joins the rows, top to
// bottom, with restart markers between them.
//
// Each row stream must hold only its own MCUs: a row begins where a decoder
// expects data after a restart marker (empty accumulator, predictors 0) and
// the join writes the markers. The block coder's own restart insertion, which
// counts MCUs in delivery order, is therefore suspended from set-up to join.
#include "sink/output_target.h"
#include "core/band_driver.h"
#include "core/entropy_coder.h"
#include "incremental/incremental.h"

namespace tekoj {
namespace {

// The block coder's margin per block; a row buffer smaller than one MCU's
// margin would grow before its first MCU anyway.
constexpr int32_t kMarginPerBlock = 128;
constexpr uint32_t kSmallRowBuffer = 4096;

// Starting size of each row buffer: a quarter more than the caller's
// estimate of the whole stream, spread over the MCU rows. The estimate is a
// signed 32-bit number and the product wraps as 32-bit arithmetic does.
uint32_t row_capacity(const EncoderContext* ctx) {
    const int32_t estimate = static_cast<int32_t>(ctx->settings->size_estimate);
    const int32_t spread = static_cast<int32_t>(static_cast<uint32_t>(estimate) * 10u) >> 3;
    const int32_t rows = static_cast<int32_t>(ctx->mcu_rows_in_scan);
    int32_t share = (spread + rows - 1) / rows;
    if (share < static_cast<int32_t>(ctx->blocks_in_mcu) * kMarginPerBlock) share = kSmallRowBuffer;
    return static_cast<uint32_t>(share);
}

// The five coder-state words move between the context and a row's record.
void load_state(EntropyState* es, const RowStream* row) {
    es->put_buffer = row->saved_state[0];
    es->put_bits = static_cast<int32_t>(row->saved_state[1]);
    for (int c = 0; c < 3; ++c) es->last_dc_val[c] = static_cast<int32_t>(row->saved_state[2 + c]);
}

void save_state(const EntropyState* es, RowStream* row) {
    row->saved_state[0] = es->put_buffer;
    row->saved_state[1] = static_cast<uint32_t>(es->put_bits);
    for (int c = 0; c < 3; ++c) row->saved_state[2 + c] = static_cast<uint32_t>(es->last_dc_val[c]);
}

// Width in pixels of the image's MCU columns together.
uint32_t columns_width(const EncoderContext* ctx) { return ctx->mcus_per_row * ctx->max_h_samp * 8u; }

// Checks each row's MCU of the column against that row's predictors before
// any is coded, so a refused column leaves every row stream untouched.
bool column_codable(EncoderContext* ctx, const McuBlockList* mcus) {
    EntropyState* es = ctx->entropy;
    RowStream current{};
    save_state(es, &current);
    bool ok = true;
    for (uint32_t r = 0; r < ctx->total_imcu_rows && ok; ++r) {
        load_state(es, ctx->columns[r]);
        ok = mcu_codable(ctx, mcus[r].blocks);
    }
    load_state(es, &current);
    return ok;
}

bool make_row_streams(EncoderContext* ctx, uint32_t capacity) {
    const uint32_t count = ctx->total_imcu_rows;
    const uint64_t table_bytes = static_cast<uint64_t>(count) * sizeof(RowStream*);
    auto** rows = static_cast<RowStream**>(DORVATEKO_OsMalloc(static_cast<uint32_t>(table_bytes)));
    if (rows == nullptr) return false;
    // Zero-filled, so that a set-up failing part-way can be released.
    DORVATEKO_OsMemset(rows, 0, static_cast<uint32_t>(table_bytes));
    ctx->columns = rows;
    for (uint32_t r = 0; r < count; ++r) {
        auto* row = static_cast<RowStream*>(DORVATEKO_OsMalloc(sizeof(RowStream)));
        if (row == nullptr) return false;
        DORVATEKO_OsMemset(row, 0, sizeof(RowStream));
        rows[r] = row;
        auto* target = static_cast<OutputTarget*>(DORVATEKO_OsMalloc(sizeof(OutputTarget)));
        if (target == nullptr) return false;
        DORVATEKO_OsMemset(target, 0, sizeof(OutputTarget));
        row->row_target = target;
        target->kind = EKO_OUTPUT_MEMORY;
        target->buffer = static_cast<uint8_t*>(DORVATEKO_OsMalloc(capacity));
        if (target->buffer == nullptr) return false;
        target->capacity = capacity;
    }
    return true;
}

void release_row(EncoderContext* ctx, uint32_t r) {
    RowStream* row = ctx->columns[r];
    DORVATEKO_OsFree(row->row_target->buffer);
    DORVATEKO_OsFree(row->row_target);
    DORVATEKO_OsFree(row);
    ctx->columns[r] = nullptr;
}

// Joins the rows into the main target: one preparation for everything that
// follows (a memory block grows once, to the exact size of the joined
// stream plus the bytes completion appends), then each row as the target
// passes long runs on (copied, written to the file straight from the row's
// buffer, or handed to a callback in work-buffer pieces), RST markers between.
bool join_rows(EncoderContext* ctx, uint64_t row_bytes) {
    const uint32_t count = ctx->total_imcu_rows;
    const Sink main = sink_of(ctx);
    const SinkKind& kind = kind_of(main.target);
    if (!kind.reserve(main, row_bytes + 2u * (count - 1) + 6u)) return false;
    for (uint32_t r = 0; r < count; ++r) {
        const OutputTarget* t = ctx->columns[r]->row_target;
        if (!kind.write_run(main, t->buffer, t->used)) return false;
        if (r + 1 < count) {
            const uint8_t marker[2] = {0xFF, static_cast<uint8_t>(0xD0u + (r & 7u))};
            if (!write_bytes(main, marker, 2)) return false;
        }
        release_row(ctx, r);
    }
    return true;
}

// Pads each row's last bits to a byte, in its own stream. Returns the bytes
// of all rows together, or -1 when a row buffer could not grow.
int64_t flush_rows(EncoderContext* ctx) {
    EntropyState* es = ctx->entropy;
    uint64_t total = 0;
    for (uint32_t r = 0; r < ctx->total_imcu_rows; ++r) {
        RowStream* row = ctx->columns[r];
        ctx->output = row->row_target;
        load_state(es, row);
        // The pad byte and its stuffed zero.
        if (!ensure_room(ctx, 2)) return -1;
        pad_final_byte(ctx);
        save_state(es, row);
        total += row->row_target->used;
    }
    return static_cast<int64_t>(total);
}

}  // namespace
}  // namespace tekoj

extern "C" {

EKO_API uint32_t __eko_jpeg_enc_col_encoder_init(EncoderContext* context) {
    using namespace tekoj;
    eko_SetError(EKO_OK);
    if (context == nullptr) return refuse(EKO_ERR_ARGUMENT);
    // The row buffers are sized from the settings record; and without a
    // restart interval in the header the markers of the join would be
    // invalid (an EncoderSettings record with write_dri 0 leaves it out).
    if (context->has_settings == 0 || context->settings == nullptr || context->restart_interval == 0)
        return refuse(EKO_ERR_ARGUMENT);
    if (context->failed != 0) return refuse(context->failed);
    if (context->finished != 0 || coding_started(context) || !output_ready(context)) return refuse(EKO_ERR_STATE);

    if (!make_row_streams(context, row_capacity(context))) {
        release_row_streams(context);
        return refuse(EKO_ERR_ALLOC);
    }
    context->saved_output = context->output;
    context->restart_suspended = 1;
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_col_entroy_encoder(EncoderContext* context, McuBlockList* mcus,
                                                   uint32_t* next_col_out) {
    using namespace tekoj;
    eko_SetError(EKO_OK);
    if (context == nullptr || mcus == nullptr || next_col_out == nullptr) return refuse(EKO_ERR_ARGUMENT);
    if (context->failed != 0) return refuse(context->failed);
    if (context->columns == nullptr || context->col_next_row >= columns_width(context)) return refuse(EKO_ERR_STATE);
    if (!column_codable(context, mcus)) return refuse(EKO_ERR_ARGUMENT);

    EntropyState* es = context->entropy;
    for (uint32_t r = 0; r < context->total_imcu_rows; ++r) {
        RowStream* row = context->columns[r];
        context->output = row->row_target;
        load_state(es, row);
        if (!encode_mcu(context, mcus[r].blocks)) return 0;  // a row buffer could not grow
        save_state(es, row);
    }
    context->mcu_state->imcu_row = 0;
    tekoj::setup_band(context);
    context->col_next_row += context->max_h_samp * 8u;
    *next_col_out = context->col_next_row;
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_col_encoder_finish(EncoderContext* context) {
    using namespace tekoj;
    eko_SetError(EKO_OK);
    if (context == nullptr) return refuse(EKO_ERR_ARGUMENT);
    if (context->columns == nullptr) return 1;
    if (context->failed != 0) {
        release_row_streams(context);
        return refuse(context->failed);
    }
    // Rows missing some of their MCUs cannot form a valid scan; the caller
    // may still deliver the remaining columns.
    if (context->col_next_row < columns_width(context)) return refuse(EKO_ERR_STATE);

    const int64_t row_bytes = flush_rows(context);
    OutputTarget* main = context->saved_output;
    context->output = main;
    // EOI follows the last row directly: nothing is pending in the coder.
    EntropyState* es = context->entropy;
    es->put_buffer = 0;
    es->put_bits = 0;
    es->last_dc_val[0] = es->last_dc_val[1] = es->last_dc_val[2] = 0;

    const bool ok = row_bytes >= 0 && join_rows(context, static_cast<uint64_t>(row_bytes));
    release_row_streams(context);  // whatever a failure left behind; also ends the suspension
    if (!ok) return 0;
    // Every MCU row is in the stream now: no band or column may follow.
    context->mcu_state->imcu_row = context->total_imcu_rows;
    return 1;
}

}  // extern "C"
