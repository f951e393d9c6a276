// Output target: the one buffer every byte of a stream passes through, and the
// few points at which room is made (grow a memory block, or hand a filled
// work buffer to the file or the stream callback).
#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>

namespace tekoj {

// Largest stream a memory target may hold: its length is handed back through
// a signed 32-bit variable.
inline constexpr uint32_t kMaxMemoryStream = 0x7FFFFFFFu;
// Size of the staging buffer of file and stream targets.
inline constexpr uint32_t kWorkBufferSize = 4096;

// Marks the encode as failed (first code wins) and reports the code.
void fail(EncoderContext* ctx, uint32_t code);

// Appends one byte / a big-endian 16-bit number. No room check: callers make
// room first.
inline void put_byte(OutputTarget* t, uint32_t b) { t->buffer[t->used++] = static_cast<uint8_t>(b); }
inline void put_u16(OutputTarget* t, uint32_t v) {
    t->buffer[t->used] = static_cast<uint8_t>(v >> 8);
    t->buffer[t->used + 1] = static_cast<uint8_t>(v);
    t->used += 2;
}

// Grows a memory target by at least `extra` bytes (geometrically: never less
// than 4096 bytes nor half the current capacity). Fails the encode when the
// block cannot be allocated or would pass kMaxMemoryStream.
bool grow_memory(EncoderContext* ctx, OutputTarget* t, uint32_t extra);

// Hands the filled part of a file or stream target on and starts it again
// empty. Detects short writes and 32-bit overflow of `total`.
bool hand_on(EncoderContext* ctx, OutputTarget* t);

// The fixed make-room point: when fewer than `margin` bytes are free, a memory
// target grows (by at least `growth`), a file or stream target hands on.
// Returns false once the encode has failed.
bool make_room(EncoderContext* ctx, uint32_t margin, uint32_t growth);

// Guarantees `bytes` free bytes at buffer[used] of the context's current
// target. A file or stream target can only offer its work buffer, so `bytes`
// must not exceed 4096 there; larger runs go through write_bytes.
bool ensure_room(EncoderContext* ctx, uint32_t bytes);

// Appends a run of bytes of any length, handing on or growing as needed.
bool write_bytes(EncoderContext* ctx, const uint8_t* data, uint32_t count);

// Hands what is buffered on, then passes `data` to the file or callback in
// one piece (memory targets get a plain copy). Used for EXIF thumbnails.
bool write_direct(EncoderContext* ctx, const uint8_t* data, uint32_t count);

}  // namespace tekoj
