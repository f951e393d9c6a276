// Input readers: fill one band of component sample rows from the caller's
// pixels, in the layout that the context's format code names. The reader of
// each format is found through its entry in the format table.
#pragma once

#include <TekoJEncoderInternal.h>

#include "input/formats.h"

namespace tekoj {

// Runs the reader of the context's format for the current band.
inline void read_band(EncoderContext* ctx) { format_traits(ctx->format)->read(ctx); }

// Where a reader starts: the read positions that creation gave a context.
struct ReadOrigin {
    const uint8_t* read_ptr;
    const uint8_t* plane[3];
};

inline ReadOrigin read_origin(const EncoderContext* ctx) {
    return {ctx->read_ptr, {ctx->plane_y, ctx->plane_u, ctx->plane_v}};
}

// Rows of a band read in place: up to 16 image rows for each of 3 components.
struct InPlaceRows {
    uint8_t* rows[3][16];
};

// A planar band whose every component row fills whole blocks (the width a
// multiple of the block width, no rows past the image) needs no copy and no
// edge fill: this points `arrays` at rows inside the caller's planes and
// advances the read positions as the reader would, and returns true. The
// band driver only reads its rows, so the caller's pixels stay untouched.
// Otherwise returns false and changes nothing: the format's reader copies.
bool read_planar_in_place(EncoderContext* ctx, InPlaceRows& storage, uint8_t** (&arrays)[3]);

// Points the read positions at the first image row of band `band`, as if
// the bands before it had been read from `origin`, so that any band can be
// read on its own.
void seek_band(EncoderContext* ctx, const ReadOrigin& origin, uint32_t band);

}  // namespace tekoj
