// Shared pieces of the incremental interface: the checks every coding call
// makes before it touches the stream, and the release of the column-split
// row streams, which the context's own release does not cover.
#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>

namespace tekoj {

// Reports `code` and yields the refused call's result.
inline uint32_t refuse(uint32_t code) {
    eko_SetError(code);
    return 0;
}

// The stream's own target: while column-split mode is set up, `output` is
// switched between the row streams and the main target waits in
// `saved_output`.
inline OutputTarget* main_target(EncoderContext* ctx) {
    return ctx->columns != nullptr ? ctx->saved_output : ctx->output;
}

// Every MCU row is in the stream: all bands were coded, or the column-split
// join has run.
inline bool image_complete(const EncoderContext* ctx) {
    return ctx->mcu_state->imcu_row >= ctx->total_imcu_rows;
}

// Whether anything has been coded since the header, or handed on to a file
// or callback. (A memory target's `total` only records its last growth.)
inline bool coding_started(EncoderContext* ctx) {
    const OutputTarget* t = main_target(ctx);
    return ctx->mcu_state->imcu_row != 0 || ctx->columns != nullptr || ctx->col_next_row != 0 ||
           (t->kind != EKO_OUTPUT_MEMORY && t->total != 0);
}

// A stream target cannot hand anything on before its callback is installed.
inline bool output_ready(EncoderContext* ctx) {
    const OutputTarget* t = main_target(ctx);
    return t->kind != EKO_OUTPUT_STREAM || t->callback != nullptr;
}

// Checks shared by the band call and the row driver: a healthy encode, not
// in column-split mode, with MCU rows left to code and an output that can
// take them. Reports why when it says no.
bool may_code_rows(EncoderContext* ctx);

// Frees every row stream made so far (a partly built table included), puts
// the main target back as the context's output and lets the block coder
// insert restart markers again. Nothing happens when no table exists.
void release_row_streams(EncoderContext* ctx);

// Frees everything the context owns, the record itself included.
void release_context(EncoderContext* ctx);

}  // namespace tekoj
