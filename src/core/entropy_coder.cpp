// Block coder: the row coder's steps (room before each MCU and block, the
// restart step, the blocks through the level's kernel), the combined code
// tables, and the exported coding steps as adapters.
#include "core/entropy_coder.h"

#include "core/entropy_kernel.h"
#include "core/simd_level.h"
#include "sink/output_target.h"

#include <bit>

namespace tekoj {
namespace {

// Room the cursor may run ahead of the target's exact fill count: the bytes
// of a full accumulator, each possibly stuffed.
constexpr uint32_t kPendingBytes = 2 * sizeof(BitAcc);

// Writes the whole waiting bytes and brings the target's fill count up to
// the cursor, so that the target is exactly as a byte-wise writer leaves it.
void sync(RowCoder& rc) {
    flush_whole_bytes(rc.bits);
    rc.sink.target->used = static_cast<uint32_t>(rc.bits.out - rc.sink.target->buffer);
}

// The make-room point before each MCU. Decided from the cursor while that is
// clearly far from the threshold; near it, from the exact fill count.
bool room_for_mcu(RowCoder& rc, uint32_t margin) {
    OutputTarget* t = rc.sink.target;
    const uint64_t upper = static_cast<uint64_t>(rc.bits.out - t->buffer) + kPendingBytes;
    if (upper + margin < t->capacity && *rc.sink.failed == 0) return true;
    sync(rc);
    const bool ok = make_room(rc.sink, margin, 4096);
    rc.bits.out = t->buffer + t->used;
    return ok;
}

// Makes at least a worst-case block free at the cursor; the margin before
// each MCU does not cover dense blocks.
bool room_for_block(RowCoder& rc) {
    constexpr uint32_t kNeed = kBlockWorstCase + kPendingBytes;
    OutputTarget* t = rc.sink.target;
    if (t->capacity - static_cast<uint64_t>(rc.bits.out - t->buffer) >= kNeed) return true;
    sync(rc);
    bool ok = kind_of(t).make_room(rc.sink, kNeed);
    if (ok && t->capacity - t->used < kNeed) {
        fail(rc.sink, EKO_ERR_TOO_LARGE);
        ok = false;
    }
    rc.bits.out = t->buffer + t->used;
    return ok;
}

// Completes the waiting byte with 1-bits and writes it.
void pad_to_byte(BitState& w) {
    flush_whole_bytes(w);
    const int pending = kAccBits - w.free;
    if (pending > 0) {
        const int fill = 8 - pending;
        write_byte(w.out, static_cast<uint32_t>((w.acc << fill) | ((1u << fill) - 1)) & 0xFF);
    }
    w.acc = 0;
    w.free = kAccBits;
}

// A restart marker: the waiting bits padded with 1-bits, RSTn (not
// stuffed), the predictors back to 0.
void write_restart(RowCoder& rc, int comps_in_scan) {
    pad_to_byte(rc.bits);
    rc.bits.out[0] = 0xFF;
    rc.bits.out[1] = static_cast<uint8_t>(0xD0 + (rc.restart.index & 7));
    rc.bits.out += 2;
    for (int c = 0; c < comps_in_scan && c < 3; ++c) rc.last_dc[c] = 0;
    ++rc.restart.index;
}

// The restart step, run before every MCU.
bool restart_step(RowCoder& rc, int comps_in_scan) {
    if (!rc.restart.tick()) return true;
    if (!room_for_block(rc)) return false;
    write_restart(rc, comps_in_scan);
    return true;
}

// A combined table entry: the code shifted left by the k extra bits in the
// upper bits, the total length in the low five.
uint32_t combined(uint32_t code, uint32_t size, uint32_t k) {
    return size == 0 ? 0 : ((code << k) << 5) | (size + k);
}

void load_bits(BitState& w, const EntropyState* es) {
    const int pending = es->put_bits > 0 && es->put_bits < 24 ? es->put_bits : 0;
    w.acc = pending > 0 ? (es->put_buffer >> (24 - pending)) & ((1u << pending) - 1) : 0;
    w.free = kAccBits - pending;
}

void store_bits(BitState& w, EntropyState* es) {
    flush_whole_bytes(w);
    const int pending = kAccBits - w.free;
    es->put_bits = pending;
    es->put_buffer = pending > 0 ? static_cast<uint32_t>(w.acc & ((1u << pending) - 1)) << (24 - pending) : 0;
}

}  // namespace

bool build_coder_tables(EncoderContext* ctx) {
    auto* t = static_cast<CoderTables*>(DORVATEKO_OsMalloc(sizeof(CoderTables)));
    if (t == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return false;
    }
    DORVATEKO_OsMemset(t, 0, sizeof(CoderTables));
    ctx->coder_tables = t;
    const EntropyState* es = ctx->entropy;
    for (int n = 0; n < 2; ++n) {
        const DcCodeTable* dc = es->dc_codes[n];
        const AcCodeTable* ac = es->ac_codes[n];
        for (uint32_t k = 0; k < 12; ++k) t->dc[n][k] = combined(dc->code[k], dc->size[k], k);
        for (uint32_t s = 0; s < 256; ++s) t->ac[n][s] = combined(ac->code[s], ac->size[s], s & 15);
        // Small values with their extra bits: one lookup codes them.
        constexpr int32_t kLimit = static_cast<int32_t>(kSmallValueLimit);
        for (uint32_t run = 0; run < 16; ++run)
            for (int32_t v = -kLimit; v <= kLimit; ++v) {
                const uint32_t magnitude = static_cast<uint32_t>(v < 0 ? -v : v);
                const uint32_t k = static_cast<uint32_t>(std::bit_width(magnitude));
                const uint32_t entry = t->ac[n][(run << 4) | k];
                const uint32_t extra = static_cast<uint32_t>(v < 0 ? v - 1 : v) & ((1u << k) - 1);
                // (A symbol the table lacks codes as the other paths do: its
                // extra bits with no length.)
                t->ac[n][256 + kSmallRunStride * run + static_cast<uint32_t>(v + kLimit)] = entry | extra << 5;
            }
    }
    const CoderKernels kernels = coder_kernels_for(static_cast<int>(simd_level()));
    t->kernel = kernels.block;
    t->mcu_kernel = kernels.mcu;
    t->blocks_in_mcu = ctx->blocks_in_mcu;
    // A restart marker flushes at most a stuffed accumulator and writes three
    // bytes more.
    t->mcu_room = kBlockWorstCase * ctx->blocks_in_mcu + 2 * kPendingBytes + 4;
    t->comps_in_scan = ctx->comps_in_scan;
    for (uint32_t b = 0; b < ctx->blocks_in_mcu && b < 10; ++b) {
        const uint32_t c = ctx->mcu_membership[b];
        const ComponentInfo* comp = ctx->cur_comp_info[c];
        t->block_comp[b] = static_cast<uint8_t>(c);
        t->block_dc[b] = comp->dc_tbl_no & 1;
        t->block_ac[b] = comp->ac_tbl_no & 1;
    }
    return true;
}

RestartClock load_restart(const EncoderContext* ctx) {
    RestartClock clock{ctx->restart_suspended != 0 ? 0 : ctx->restart_interval, ctx->restart_mcu_count, 0,
                       ctx->restart_index};
    if (clock.interval != 0 && clock.count > 0) clock.phase = static_cast<uint32_t>(clock.count) % clock.interval;
    return clock;
}

void store_restart(EncoderContext* ctx, const RestartClock& clock) {
    ctx->restart_mcu_count = clock.count;
    ctx->restart_index = clock.index;
}

void begin_coding(RowCoder& rc, EncoderContext* ctx) {
    const EntropyState* es = ctx->entropy;
    load_bits(rc.bits, es);
    rc.sink = sink_of(ctx);
    rc.bits.out = rc.sink.target->buffer + rc.sink.target->used;
    for (int c = 0; c < 3; ++c) rc.last_dc[c] = es->last_dc_val[c];
    rc.restart = load_restart(ctx);
}

void end_coding(RowCoder& rc, EncoderContext* ctx) {
    EntropyState* es = ctx->entropy;
    store_bits(rc.bits, es);
    OutputTarget* t = rc.sink.target;
    if (t->buffer != nullptr) t->used = static_cast<uint32_t>(rc.bits.out - t->buffer);
    for (int c = 0; c < 3; ++c) es->last_dc_val[c] = rc.last_dc[c];
    store_restart(ctx, rc.restart);
}

void start_row(RowCoder& rc, Sink sink) {
    rc.bits = BitState{0, kAccBits, sink.target->buffer + sink.target->used};
    rc.last_dc[0] = rc.last_dc[1] = rc.last_dc[2] = 0;
    rc.restart = RestartClock{0, -1, 0, 0};
    rc.sink = sink;
}

bool finish_row(RowCoder& rc) {
    if (*rc.sink.failed != 0 || !room_for_block(rc)) return false;
    pad_to_byte(rc.bits);
    rc.sink.target->used = static_cast<uint32_t>(rc.bits.out - rc.sink.target->buffer);
    return true;
}

bool code_mcu(RowCoder& rc, const CoderTables& t, int16_t* const* blocks) {
    // Room for every block's worst case after a restart marker: then neither
    // the make-room point below nor any block would make room, and the MCU
    // goes through in one kernel call.
    const OutputTarget* target = rc.sink.target;
    if (target->capacity - static_cast<uint64_t>(rc.bits.out - target->buffer) >= t.mcu_room &&
        *rc.sink.failed == 0) [[likely]] {
        if (rc.restart.tick()) write_restart(rc, t.comps_in_scan);
        t.mcu_kernel(rc.bits, t, blocks, rc.last_dc);
        return true;
    }
    if (!room_for_mcu(rc, 128u * t.blocks_in_mcu)) return false;
    if (!restart_step(rc, t.comps_in_scan)) return false;
    // With room for every block's worst case, no block would make room: code
    // them in one go.
    if (target->capacity - static_cast<uint64_t>(rc.bits.out - target->buffer) >=
        uint64_t{kBlockWorstCase} * t.blocks_in_mcu + kPendingBytes) {
        t.mcu_kernel(rc.bits, t, blocks, rc.last_dc);
        return true;
    }
    for (uint32_t n = 0; n < t.blocks_in_mcu; ++n) {
        if (!room_for_block(rc)) return false;
        const uint32_t c = t.block_comp[n];
        int16_t* blk = blocks[n];
        int32_t diff = blk[0] - rc.last_dc[c];
        // The pixel path never exceeds category 11; a caller's blocks might.
        diff = diff > 2047 ? 2047 : (diff < -2047 ? -2047 : diff);
        t.kernel(rc.bits, diff, blk, t.dc[t.block_dc[n]], t.ac[t.block_ac[n]]);
        blk[kZigzagToNatural[63]] = 0;
        rc.last_dc[c] = blk[0];
    }
    return true;
}

bool encode_mcu(EncoderContext* ctx, int16_t* const* blocks) {
    if (ctx->failed != 0) return false;
    RowCoder rc;
    begin_coding(rc, ctx);
    const bool ok = code_mcu(rc, *ctx->coder_tables, blocks);
    if (ok) end_coding(rc, ctx);
    return ok;
}

void put_bits(RowCoder& rc, uint32_t code, int size) {
    if (size > 16) {
        put(rc.bits, (code >> 16) & ((1u << (size - 16)) - 1), size - 16);
        size = 16;
    }
    put(rc.bits, code & ((1u << size) - 1), size);
}

void pad_final_byte(EncoderContext* ctx) {
    RowCoder rc;
    begin_coding(rc, ctx);
    put_bits(rc, 0x7F, 7);
    end_coding(rc, ctx);
}

bool mcu_codable(const EncoderContext* ctx, int16_t* const* blocks) {
    const EntropyState* es = ctx->entropy;
    int32_t pred[3] = {es->last_dc_val[0], es->last_dc_val[1], es->last_dc_val[2]};
    RestartClock clock = load_restart(ctx);
    if (clock.tick()) pred[0] = pred[1] = pred[2] = 0;
    for (uint32_t n = 0; n < ctx->blocks_in_mcu; ++n) {
        const int16_t* blk = blocks[n];
        if (blk == nullptr) return false;
        const uint32_t c = ctx->mcu_membership[n];
        const int32_t diff = blk[0] - pred[c];
        if (diff > 2047 || diff < -2047) return false;
        pred[c] = blk[0];
        for (int k = 1; k < 63; ++k) {
            const int32_t x = blk[kZigzagToNatural[k]];
            if (x > 1023 || x < -1023) return false;
        }
    }
    return true;
}

}  // namespace tekoj

// The exported coding steps: adapters over the coder above, which the
// library itself never calls.
namespace {

// A coder over a caller's WorkingState (the same five words as the
// EntropyState) and its context's output.
tekoj::RowCoder coder_of(WorkingState* state) {
    tekoj::RowCoder rc;
    EntropyState es{state->put_buffer, state->put_bits, {0, 0, 0}, {nullptr, nullptr}, {nullptr, nullptr}};
    tekoj::load_bits(rc.bits, &es);
    rc.sink = tekoj::sink_of(state->context);
    rc.bits.out = rc.sink.target->buffer + rc.sink.target->used;
    for (int c = 0; c < 3; ++c) rc.last_dc[c] = state->last_dc_val[c];
    rc.restart = tekoj::load_restart(state->context);
    return rc;
}

void give_back(tekoj::RowCoder& rc, WorkingState* state) {
    EntropyState es{};
    tekoj::store_bits(rc.bits, &es);
    state->put_buffer = es.put_buffer;
    state->put_bits = es.put_bits;
    for (int c = 0; c < 3; ++c) state->last_dc_val[c] = rc.last_dc[c];
    OutputTarget* t = state->context->output;
    t->used = static_cast<uint32_t>(rc.bits.out - t->buffer);
}

}  // namespace

extern "C" {

EKO_API uint32_t __eko_jpeg_enc_write_bits(WorkingState* state, uint32_t value, uint32_t size) {
    tekoj::RowCoder rc = coder_of(state);
    tekoj::put_bits(rc, value, static_cast<int>(size > 24 ? 24 : size));
    give_back(rc, state);
    return 1;
}

EKO_API uint32_t __eko_jpeg_write_restart_marker(EncoderContext* context, WorkingState* state) {
    if (context == nullptr || state == nullptr) return 0;
    tekoj::RowCoder rc = coder_of(state);
    if (rc.restart.tick()) tekoj::write_restart(rc, context->comps_in_scan);
    tekoj::store_restart(context, rc.restart);
    give_back(rc, state);
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_encode_1mcu_blk(EncoderContext* context, int16_t* const* blocks) {
    return tekoj::encode_mcu(context, blocks) ? 1 : 0;
}

}  // extern "C"
