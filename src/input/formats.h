// What the library knows about each accepted pixel format, in one table:
// everything that creation, the band driver and the entry points ask of a
// format code.
#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>

namespace tekoj {

struct FormatTraits {
    uint8_t code;             // the format code (low byte of ImageInfo.format)
    uint8_t bytes_per_pixel;  // packed layouts; 0 for planar ones
    uint8_t components;       // components coded without an EncoderSettings record
    uint8_t band_height;      // image rows per band with the default sampling
    bool planar;              // samples come from planes (through plane_y/u/v), not through read_ptr
    bool rgb;                 // an RGB layout: its reader produces 4:2:0 samples only
    uint32_t (*read)(EncoderContext* ctx);  // fills one band of sample rows
};

// The traits of a format code; null for a code that is not accepted.
const FormatTraits* format_traits(uint32_t code);

}  // namespace tekoj
