#include "core/entropy_coder.h"

#include "api/output_target.h"

#include <bit>

namespace tekoj {
namespace {

// Bytes a block can produce at worst: DC (22 bits), 62 AC values of 26 bits,
// EOB; every byte possibly stuffed; plus the bits still waiting from earlier
// codes and a restart marker with its pad byte.
constexpr uint32_t kBlockWorstCase = 2 * ((22 + 62 * 26 + 16 + 7) / 8) + 16;

inline bool restart_due(const EncoderContext* ctx) {
    return ctx->restart_interval != 0 && ctx->restart_suspended == 0 && ctx->restart_mcu_count != -1 &&
           static_cast<uint32_t>(ctx->restart_mcu_count) % ctx->restart_interval == 0;
}

// The coder's working state: a 64-bit accumulator holding `bits` pending bits
// at its low end, and a write cursor into the output target.
struct BitWriter {
    uint64_t acc;
    int bits;
    uint8_t* out;

    inline void put(uint32_t code, int size) {
        acc = (acc << size) | code;
        bits += size;
        if (bits >= 32) flush32();
    }

    inline void flush32() {
        const uint32_t w = static_cast<uint32_t>(acc >> (bits - 32));
        bits -= 32;
        const uint32_t inv = ~w;
        if (((inv - 0x01010101u) & ~inv & 0x80808080u) == 0) {
            out[0] = static_cast<uint8_t>(w >> 24);
            out[1] = static_cast<uint8_t>(w >> 16);
            out[2] = static_cast<uint8_t>(w >> 8);
            out[3] = static_cast<uint8_t>(w);
            out += 4;
        } else {
            for (int s = 24; s >= 0; s -= 8) emit_byte(static_cast<uint8_t>(w >> s));
        }
    }

    inline void emit_byte(uint8_t b) {
        *out++ = b;
        if (b == 0xFF) *out++ = 0;
    }

    // Writes out every whole byte, leaving fewer than 8 bits pending.
    inline void flush_bytes() {
        while (bits >= 8) {
            bits -= 8;
            emit_byte(static_cast<uint8_t>(acc >> bits));
        }
        acc &= (uint64_t{1} << bits) - 1;
    }

    // Completes a partial byte with 1-bits and writes it.
    inline void pad_to_byte() {
        flush_bytes();
        if (bits > 0) {
            const int fill = 8 - bits;
            emit_byte(static_cast<uint8_t>((acc << fill) | ((1u << fill) - 1)));
        }
        acc = 0;
        bits = 0;
    }
};

// Magnitude category of a value and its extra bits: the value itself when
// positive, the one's complement of its magnitude when negative.
struct Magnitude {
    int bits;
    uint32_t extra;
};

inline Magnitude magnitude(int32_t x) {
    const uint32_t a = static_cast<uint32_t>(x < 0 ? -x : x);
    const int k = std::bit_width(a);
    const uint32_t v = static_cast<uint32_t>(x < 0 ? x - 1 : x);
    return {k, v & ((1u << k) - 1)};
}

inline void code_block(BitWriter& w, const int16_t* blk, int32_t diff, const DcCodeTable* dc,
                       const AcCodeTable* ac) {
    {
        // The pixel path never exceeds category 11; a caller's blocks might.
        if (diff > 2047) diff = 2047;
        if (diff < -2047) diff = -2047;
        const Magnitude m = magnitude(diff);
        w.put((static_cast<uint32_t>(dc->code[m.bits]) << m.bits) | m.extra, dc->size[m.bits] + m.bits);
    }
    // Positions 1..62 in zig-zag order; position 63 is never coded, every
    // block ends with EOB.
    uint64_t mask = 0;
    int16_t zz[64];
    for (int k = 1; k < 63; ++k) {
        const int16_t x = blk[kZigzagToNatural[k]];
        zz[k] = x;
        mask |= static_cast<uint64_t>(x != 0) << k;
    }
    int prev = 0;
    while (mask != 0) {
        const int p = std::countr_zero(mask);
        mask &= mask - 1;
        int run = p - prev - 1;
        prev = p;
        while (run > 15) {
            w.put(ac->code[0xF0], ac->size[0xF0]);
            run -= 16;
        }
        int32_t x = zz[p];
        // Values beyond the baseline tables' largest category cannot be coded.
        if (x > 1023) x = 1023;
        if (x < -1023) x = -1023;
        const Magnitude m = magnitude(x);
        const int sym = (run << 4) + m.bits;
        w.put((static_cast<uint32_t>(ac->code[sym]) << m.bits) | m.extra, ac->size[sym] + m.bits);
    }
    w.put(ac->code[0], ac->size[0]);
}

// Makes at least kBlockWorstCase bytes free at the cursor, syncing `used`.
bool room_for_block(EncoderContext* ctx, BitWriter& w) {
    OutputTarget* t = ctx->output;
    t->used = static_cast<uint32_t>(w.out - t->buffer);
    if (t->capacity - t->used >= kBlockWorstCase) return true;
    bool ok = t->kind == EKO_OUTPUT_MEMORY ? grow_memory(ctx, t, kBlockWorstCase) : hand_on(ctx, t);
    if (ok && t->capacity - t->used < kBlockWorstCase) {
        fail(ctx, EKO_ERR_TOO_LARGE);
        ok = false;
    }
    w.out = t->buffer + t->used;
    return ok;
}

}  // namespace

bool encode_mcu(EncoderContext* ctx, int16_t* const* blocks) {
    if (!make_room(ctx, 128u * ctx->blocks_in_mcu, 4096)) return false;
    EntropyState* es = ctx->entropy;
    OutputTarget* t = ctx->output;
    BitWriter w{es->put_bits > 0 ? (es->put_buffer >> (24 - es->put_bits)) & ((1u << es->put_bits) - 1) : 0,
                es->put_bits, t->buffer + t->used};
    int32_t last_dc[3] = {es->last_dc_val[0], es->last_dc_val[1], es->last_dc_val[2]};

    // Restart step.
    if (ctx->restart_interval != 0 && ctx->restart_suspended == 0) {
        if (ctx->restart_mcu_count == -1) {
            ctx->restart_mcu_count = 1;
        } else {
            if (static_cast<uint32_t>(ctx->restart_mcu_count) % ctx->restart_interval == 0) {
                if (!room_for_block(ctx, w)) return false;
                w.pad_to_byte();
                *w.out++ = 0xFF;
                *w.out++ = static_cast<uint8_t>(0xD0 + (ctx->restart_index & 7));
                for (int c = 0; c < ctx->comps_in_scan && c < 3; ++c) last_dc[c] = 0;
                ++ctx->restart_index;
            }
            ++ctx->restart_mcu_count;
        }
    }

    for (uint32_t n = 0; n < ctx->blocks_in_mcu; ++n) {
        if (!room_for_block(ctx, w)) return false;
        const uint32_t c = ctx->mcu_membership[n];
        const ComponentInfo* comp = ctx->cur_comp_info[c];
        int16_t* blk = blocks[n];
        code_block(w, blk, blk[0] - last_dc[c], es->dc_codes[comp->dc_tbl_no], es->ac_codes[comp->ac_tbl_no]);
        blk[kZigzagToNatural[63]] = 0;
        last_dc[c] = blk[0];
    }

    w.flush_bytes();
    t->used = static_cast<uint32_t>(w.out - t->buffer);
    es->put_bits = w.bits;
    es->put_buffer = w.bits > 0 ? static_cast<uint32_t>(w.acc << (24 - w.bits)) : 0;
    for (int c = 0; c < 3; ++c) es->last_dc_val[c] = last_dc[c];
    return true;
}

bool mcu_codable(const EncoderContext* ctx, int16_t* const* blocks) {
    int32_t pred[3] = {ctx->entropy->last_dc_val[0], ctx->entropy->last_dc_val[1], ctx->entropy->last_dc_val[2]};
    if (restart_due(ctx)) pred[0] = pred[1] = pred[2] = 0;
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

extern "C" {

EKO_API uint32_t __eko_jpeg_enc_write_bits(WorkingState* state, uint32_t value, uint32_t size) {
    OutputTarget* t = state->context->output;
    const uint32_t v = size >= 32 ? value : value & ((1u << size) - 1);
    int32_t n = state->put_bits + static_cast<int32_t>(size);
    state->put_buffer |= v << (24 - n);
    for (int i = 0; i < 2 && n >= 8; ++i) {
        const uint8_t b = static_cast<uint8_t>(state->put_buffer >> 16);
        tekoj::put_byte(t, b);
        if (b == 0xFF) tekoj::put_byte(t, 0);
        state->put_buffer <<= 8;
        n -= 8;
    }
    state->put_bits = n;
    return 1;
}

EKO_API uint32_t __eko_jpeg_write_restart_marker(EncoderContext* context, WorkingState* state) {
    if (context == nullptr || state == nullptr) return 0;
    if (context->restart_interval == 0 || context->restart_suspended != 0) return 1;
    if (context->restart_mcu_count == -1) {
        context->restart_mcu_count = 1;
        return 1;
    }
    if (static_cast<uint32_t>(context->restart_mcu_count) % context->restart_interval == 0) {
        if (state->put_bits != 0) __eko_jpeg_enc_write_bits(state, 0x7F, 7);
        state->put_bits = 0;
        state->put_buffer = 0;
        const uint16_t marker = static_cast<uint16_t>(0xFFD0 + (context->restart_index & 7));
        __eko_jpeg_enc_write_2bytes(context->output, &marker);
        for (int c = 0; c < context->comps_in_scan && c < 3; ++c) state->last_dc_val[c] = 0;
        ++context->restart_index;
    }
    ++context->restart_mcu_count;
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_encode_1mcu_blk(EncoderContext* context, int16_t* const* blocks) {
    return tekoj::encode_mcu(context, blocks) ? 1 : 0;
}

}  // extern "C"
