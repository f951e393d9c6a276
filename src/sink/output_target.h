// Output target: the one buffer every byte of a stream passes through, and the
// few points at which room is made. Each output kind (memory block, file,
// stream callback) brings one small set of operations, chosen once by kind:
// make room (grow the block, or hand the filled work buffer on), pass a run
// of bytes on in one piece, finish. Nothing above this layer needs to know
// which kind it writes to.
#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>

namespace tekoj {

// Largest stream a memory target may hold: its length is handed back through
// a signed 32-bit variable.
inline constexpr uint32_t kMaxMemoryStream = 0x7FFFFFFFu;
// Size of the staging buffer of file and stream targets.
inline constexpr uint32_t kWorkBufferSize = 4096;

// A target together with the failure slot of the encode it belongs to (the
// first error code, 0 while healthy). Every operation below fails at once
// once the slot is set.
struct Sink {
    OutputTarget* target;
    uint32_t* failed;
};

inline Sink sink_of(EncoderContext* ctx) { return {ctx->output, &ctx->failed}; }

// Records the failure (first code wins) and reports the code.
void fail(Sink sink, uint32_t code);
inline void fail(EncoderContext* ctx, uint32_t code) {
    if (ctx == nullptr) {
        eko_SetError(code);
        return;
    }
    fail(sink_of(ctx), code);
}

// Appends one byte / a big-endian 16-bit number. No room check: callers make
// room first.
inline void put_byte(OutputTarget* t, uint32_t b) { t->buffer[t->used++] = static_cast<uint8_t>(b); }
inline void put_u16(OutputTarget* t, uint32_t v) {
    t->buffer[t->used] = static_cast<uint8_t>(v >> 8);
    t->buffer[t->used + 1] = static_cast<uint8_t>(v);
    t->used += 2;
}

// The operations of one output kind.
struct SinkKind {
    // Makes room after buffer[used]: a memory block grows by at least
    // `extra` bytes (geometrically: never less than 4096 bytes nor half its
    // size); a file or stream target hands its filled part on and starts
    // its buffer again empty.
    bool (*make_room)(Sink sink, uint32_t extra);
    // Hands what is buffered on, then passes `data` on in one piece (a memory
    // block copies it in).
    bool (*write_direct)(Sink sink, const uint8_t* data, uint32_t count);
    // Passes a run of bytes on as this kind passes long runs: a memory block
    // copies it in, a file takes it in one piece, a stream callback in
    // pieces of at most 4096 bytes straight from `data`.
    bool (*write_run)(Sink sink, const uint8_t* data, uint32_t count);
    // Prepares for `count` more bytes: a memory block grows once to exactly
    // the size needed; the others need nothing.
    bool (*reserve)(Sink sink, uint64_t count);
    // Completes the output: hands the rest on, or fixes the stream length.
    bool (*finish)(Sink sink);
    // The longest run the buffer can ever take in one piece.
    uint32_t longest_run;
};

// The operations of a target's kind; a kind other than 0, 1 and 4 is never
// grown nor handed on.
const SinkKind& kind_of(const OutputTarget* t);

// The fixed make-room point: when fewer than `margin` bytes are free, the
// target makes room (a memory block by at least `growth`). Returns false
// once the encode has failed.
bool make_room(Sink sink, uint32_t margin, uint32_t growth);

// Guarantees `bytes` free bytes at buffer[used]. A file or stream target can
// only offer its work buffer, so `bytes` must not exceed its longest run;
// longer runs go through write_bytes.
bool ensure_room(Sink sink, uint32_t bytes);

// Appends a run of bytes of any length, making room as needed.
bool write_bytes(Sink sink, const uint8_t* data, uint32_t count);

// Hands what is buffered on, then passes `data` on in one piece (memory
// targets get a plain copy). Used for EXIF thumbnails and joined rows.
bool write_direct(Sink sink, const uint8_t* data, uint32_t count);

// Completes the output (see SinkKind::finish).
bool finish_output(Sink sink);

// The same steps on a context's current target.
inline bool make_room(EncoderContext* ctx, uint32_t margin, uint32_t growth) {
    return make_room(sink_of(ctx), margin, growth);
}
inline bool ensure_room(EncoderContext* ctx, uint32_t bytes) { return ensure_room(sink_of(ctx), bytes); }
inline bool write_bytes(EncoderContext* ctx, const uint8_t* data, uint32_t count) {
    return write_bytes(sink_of(ctx), data, count);
}
inline bool write_direct(EncoderContext* ctx, const uint8_t* data, uint32_t count) {
    return write_direct(sink_of(ctx), data, count);
}

}  // namespace tekoj
