#include "api/output_target.h"

#include <algorithm>

namespace tekoj {

void fail(EncoderContext* ctx, uint32_t code) {
    if (ctx != nullptr && ctx->failed == 0) ctx->failed = code;
    eko_SetError(code);
}

bool grow_memory(EncoderContext* ctx, OutputTarget* t, uint32_t extra) {
    const uint64_t step = std::max<uint64_t>({extra, 4096u, t->capacity / 2u});
    const uint64_t wanted = static_cast<uint64_t>(t->capacity) + step;
    const uint64_t needed = static_cast<uint64_t>(t->capacity) + extra;
    if (needed > kMaxMemoryStream) {
        fail(ctx, EKO_ERR_TOO_LARGE);
        return false;
    }
    const uint32_t new_capacity = static_cast<uint32_t>(std::min<uint64_t>(wanted, kMaxMemoryStream));
    uint8_t* grown;
    if (t->buffer == nullptr) {
        grown = static_cast<uint8_t*>(DORVATEKO_OsMalloc(new_capacity));
        if (grown == nullptr) eko_SetError(EKO_ERR_ALLOC);
    } else {
        grown = eko_jpeg_enc_realloc(t->buffer, t->capacity, new_capacity - t->capacity);
    }
    if (grown == nullptr) {
        // The old block is gone either way; the target has no buffer now.
        t->buffer = nullptr;
        t->capacity = 0;
        t->used = 0;
        t->total = 0;
        fail(ctx, EKO_ERR_ALLOC);
        return false;
    }
    t->buffer = grown;
    t->total = t->used;
    t->capacity = new_capacity;
    return true;
}

bool hand_on(EncoderContext* ctx, OutputTarget* t) {
    const uint32_t count = t->used;
    t->used = 0;
    if (count == 0) return ctx->failed == 0;
    if (static_cast<uint64_t>(t->total) + count > 0xFFFFFFFFu) {
        fail(ctx, EKO_ERR_TOO_LARGE);
        return false;
    }
    if (t->kind == EKO_OUTPUT_FILE) {
        if (DORVATEKO_OsFwrite(t->buffer, 1, count, t->file) != count) {
            fail(ctx, EKO_ERR_WRITE);
            return false;
        }
    } else if (t->kind == EKO_OUTPUT_STREAM) {
        if (t->callback == nullptr) {
            fail(ctx, EKO_ERR_ARGUMENT);
            return false;
        }
        t->callback(t->callback_arg, t->buffer, count);  // its result is deliberately ignored
    }
    t->total += count;
    return ctx->failed == 0;
}

bool make_room(EncoderContext* ctx, uint32_t margin, uint32_t growth) {
    if (ctx->failed != 0) return false;
    OutputTarget* t = ctx->output;
    if (static_cast<uint64_t>(t->used) + margin < t->capacity) return true;
    if (t->kind == EKO_OUTPUT_MEMORY) return grow_memory(ctx, t, growth);
    return hand_on(ctx, t);
}

bool ensure_room(EncoderContext* ctx, uint32_t bytes) {
    if (ctx->failed != 0) return false;
    OutputTarget* t = ctx->output;
    if (static_cast<uint64_t>(t->used) + bytes <= t->capacity) return true;
    if (t->kind == EKO_OUTPUT_MEMORY) {
        const uint64_t missing = static_cast<uint64_t>(t->used) + bytes - t->capacity;
        if (missing > kMaxMemoryStream) {
            fail(ctx, EKO_ERR_TOO_LARGE);
            return false;
        }
        return grow_memory(ctx, t, static_cast<uint32_t>(missing));
    }
    if (!hand_on(ctx, t)) return false;
    if (bytes > t->capacity) {
        fail(ctx, EKO_ERR_TOO_LARGE);
        return false;
    }
    return true;
}

bool write_bytes(EncoderContext* ctx, const uint8_t* data, uint32_t count) {
    OutputTarget* t = ctx->output;
    if (t->kind == EKO_OUTPUT_MEMORY) {
        if (!ensure_room(ctx, count)) return false;
        DORVATEKO_OsMemcpy(t->buffer + t->used, data, count);
        t->used += count;
        return true;
    }
    while (count > 0) {
        if (t->used == t->capacity && !hand_on(ctx, t)) return false;
        const uint32_t piece = std::min(count, t->capacity - t->used);
        DORVATEKO_OsMemcpy(t->buffer + t->used, data, piece);
        t->used += piece;
        data += piece;
        count -= piece;
    }
    return ctx->failed == 0;
}

bool write_direct(EncoderContext* ctx, const uint8_t* data, uint32_t count) {
    OutputTarget* t = ctx->output;
    if (t->kind == EKO_OUTPUT_MEMORY) return write_bytes(ctx, data, count);
    if (!hand_on(ctx, t)) return false;
    if (count == 0) return true;
    if (static_cast<uint64_t>(t->total) + count > 0xFFFFFFFFu) {
        fail(ctx, EKO_ERR_TOO_LARGE);
        return false;
    }
    if (t->kind == EKO_OUTPUT_FILE) {
        if (DORVATEKO_OsFwrite(data, 1, count, t->file) != count) {
            fail(ctx, EKO_ERR_WRITE);
            return false;
        }
    } else {
        if (t->callback == nullptr) {
            fail(ctx, EKO_ERR_ARGUMENT);
            return false;
        }
        t->callback(t->callback_arg, data, count);
    }
    t->total += count;
    return true;
}

}  // namespace tekoj

extern "C" {

EKO_API void __eko_jpeg_enc_write_2bytes(OutputTarget* target, const void* value) {
    // The marker writers also pass the address of a 32-bit word; its low 16
    // bits are the first two bytes on the little-endian targets we serve, so
    // reading 16 bits through the pointer is what they mean.
    uint16_t v;
    __builtin_memcpy(&v, value, sizeof v);
    tekoj::put_u16(target, v);
}

EKO_API void __eko_jpeg_enc_write_4bytes(OutputTarget* target, const void* first, const void* second) {
    __eko_jpeg_enc_write_2bytes(target, first);
    __eko_jpeg_enc_write_2bytes(target, second);
}

EKO_API uint8_t* eko_jpeg_enc_realloc(uint8_t* old_block, uint32_t old_size, uint32_t extra_size) {
    if (old_block == nullptr) return nullptr;
    const uint64_t size = static_cast<uint64_t>(old_size) + extra_size;
    uint8_t* grown = nullptr;
    if (size <= 0xFFFFFFFFu) grown = static_cast<uint8_t*>(DORVATEKO_OsMalloc(static_cast<uint32_t>(size)));
    if (grown != nullptr) {
        DORVATEKO_OsMemcpy(grown, old_block, old_size);
    } else {
        eko_SetError(EKO_ERR_ALLOC);
    }
    DORVATEKO_OsFree(old_block);
    return grown;
}

}  // extern "C"
