#include "sink/output_target.h"

#include <algorithm>

namespace tekoj {
namespace {

bool healthy(Sink s) { return *s.failed == 0; }

// ---- memory block: grows by copying into a larger block ----

bool grow_memory(Sink s, uint32_t extra) {
    OutputTarget* t = s.target;
    const uint64_t step = std::max<uint64_t>({extra, 4096u, t->capacity / 2u});
    const uint64_t wanted = static_cast<uint64_t>(t->capacity) + step;
    const uint64_t needed = static_cast<uint64_t>(t->capacity) + extra;
    if (needed > kMaxMemoryStream) {
        fail(s, EKO_ERR_TOO_LARGE);
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
        fail(s, EKO_ERR_ALLOC);
        return false;
    }
    t->buffer = grown;
    t->total = t->used;
    t->capacity = new_capacity;
    return true;
}

bool memory_direct(Sink s, const uint8_t* data, uint32_t count) { return write_bytes(s, data, count); }

// One growth to the exact size, so that a long join copies each byte once.
bool memory_reserve(Sink s, uint64_t count) {
    OutputTarget* t = s.target;
    const uint64_t needed = t->used + count;
    if (needed > kMaxMemoryStream) {
        fail(s, EKO_ERR_TOO_LARGE);
        return false;
    }
    if (needed <= t->capacity) return healthy(s);
    uint8_t* grown = eko_jpeg_enc_realloc(t->buffer, t->capacity, static_cast<uint32_t>(needed) - t->capacity);
    if (grown == nullptr) {
        // The old block went with the failed growth; nothing is left to write into.
        t->buffer = nullptr;
        t->capacity = t->used = t->total = 0;
        fail(s, EKO_ERR_ALLOC);
        return false;
    }
    t->buffer = grown;
    t->capacity = static_cast<uint32_t>(needed);
    return healthy(s);
}

bool memory_finish(Sink s) {
    s.target->total = s.target->used;
    return healthy(s);
}

// ---- file and stream: a work buffer handed on whenever it fills ----

// Passes `count` bytes on to the file or the callback; counts them in `total`.
template <bool File>
bool deliver(Sink s, const uint8_t* data, uint32_t count) {
    OutputTarget* t = s.target;
    if (static_cast<uint64_t>(t->total) + count > 0xFFFFFFFFu) {
        fail(s, EKO_ERR_TOO_LARGE);
        return false;
    }
    if constexpr (File) {
        if (DORVATEKO_OsFwrite(data, 1, count, t->file) != count) {
            fail(s, EKO_ERR_WRITE);
            return false;
        }
    } else {
        if (t->callback == nullptr) {
            fail(s, EKO_ERR_ARGUMENT);
            return false;
        }
        t->callback(t->callback_arg, data, count);  // its result is deliberately ignored
    }
    t->total += count;
    return true;
}

template <bool File>
bool hand_on(Sink s, uint32_t) {
    OutputTarget* t = s.target;
    const uint32_t count = t->used;
    t->used = 0;
    if (count == 0) return healthy(s);
    return deliver<File>(s, t->buffer, count) && healthy(s);
}

template <bool File>
bool direct(Sink s, const uint8_t* data, uint32_t count) {
    if (!hand_on<File>(s, 0)) return false;
    return count == 0 || deliver<File>(s, data, count);
}

template <bool File>
bool finish_handed_on(Sink s) {
    return hand_on<File>(s, 0);
}

bool nothing_to_reserve(Sink s, uint64_t) { return healthy(s); }

// ---- any other kind: nothing is written anywhere ----

bool discard(Sink s, uint32_t) {
    s.target->total += s.target->used;
    s.target->used = 0;
    return healthy(s);
}

bool discard_direct(Sink s, const uint8_t*, uint32_t count) {
    s.target->total += count;
    return discard(s, 0);
}

bool discard_finish(Sink s) { return discard(s, 0); }

bool write_pieces(Sink s, const uint8_t* data, uint32_t count) { return write_bytes(s, data, count); }

// A callback takes long runs straight from the caller's memory, in pieces no
// longer than its work buffer.
bool stream_run(Sink s, const uint8_t* data, uint32_t count) {
    if (!hand_on<false>(s, 0)) return false;
    while (count > 0) {
        const uint32_t piece = count < kWorkBufferSize ? count : kWorkBufferSize;
        if (!deliver<false>(s, data, piece)) return false;
        data += piece;
        count -= piece;
    }
    return healthy(s);
}

constexpr SinkKind kMemory{grow_memory, memory_direct, write_pieces, memory_reserve, memory_finish, kMaxMemoryStream};
constexpr SinkKind kFile{hand_on<true>, direct<true>, direct<true>, nothing_to_reserve, finish_handed_on<true>,
                         kWorkBufferSize};
constexpr SinkKind kStream{hand_on<false>, direct<false>, stream_run, nothing_to_reserve, finish_handed_on<false>,
                           kWorkBufferSize};
constexpr SinkKind kNowhere{discard, discard_direct, discard_direct, nothing_to_reserve, discard_finish,
                            kWorkBufferSize};

}  // namespace

void fail(Sink s, uint32_t code) {
    if (*s.failed == 0) *s.failed = code;
    eko_SetError(code);
}

const SinkKind& kind_of(const OutputTarget* t) {
    switch (t->kind) {
        case EKO_OUTPUT_MEMORY: return kMemory;
        case EKO_OUTPUT_FILE: return kFile;
        case EKO_OUTPUT_STREAM: return kStream;
        default: return kNowhere;
    }
}

bool make_room(Sink s, uint32_t margin, uint32_t growth) {
    if (!healthy(s)) return false;
    const OutputTarget* t = s.target;
    if (static_cast<uint64_t>(t->used) + margin < t->capacity) return true;
    return kind_of(t).make_room(s, growth);
}

bool ensure_room(Sink s, uint32_t bytes) {
    if (!healthy(s)) return false;
    OutputTarget* t = s.target;
    if (static_cast<uint64_t>(t->used) + bytes <= t->capacity) return true;
    const uint64_t missing = static_cast<uint64_t>(t->used) + bytes - t->capacity;
    if (missing > kMaxMemoryStream) {
        fail(s, EKO_ERR_TOO_LARGE);
        return false;
    }
    if (!kind_of(t).make_room(s, static_cast<uint32_t>(missing))) return false;
    if (static_cast<uint64_t>(t->used) + bytes > t->capacity) {
        fail(s, EKO_ERR_TOO_LARGE);
        return false;
    }
    return true;
}

bool write_bytes(Sink s, const uint8_t* data, uint32_t count) {
    OutputTarget* t = s.target;
    const SinkKind& kind = kind_of(t);
    while (count > 0) {
        if (!healthy(s)) return false;
        if (t->used == t->capacity && !kind.make_room(s, count)) return false;
        const uint32_t piece = std::min(count, t->capacity - t->used);
        DORVATEKO_OsMemcpy(t->buffer + t->used, data, piece);
        t->used += piece;
        data += piece;
        count -= piece;
    }
    return healthy(s);
}

bool write_direct(Sink s, const uint8_t* data, uint32_t count) {
    if (!healthy(s)) return false;
    return kind_of(s.target).write_direct(s, data, count);
}

bool finish_output(Sink s) {
    if (!healthy(s)) return false;
    return kind_of(s.target).finish(s);
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
