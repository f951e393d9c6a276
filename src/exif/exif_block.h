// EXIF block builder internals shared with the APP1 writer (and its tests).
#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>
#include <ctime>

namespace tekoj {

// Length of the DateTime text, "YYYY:MM:DD HH:MM:SS", without its NUL.
inline constexpr uint32_t kExifDateLength = 19;

// Exact size in bytes of the TIFF block __eko_CreateExif writes for `exif`
// (thumbnail bytes not included), computed without writing anything. 64 bits
// wide so that absurd string lengths cannot wrap it into a plausible size.
uint64_t exif_block_size(const ExifInfo* exif);

// Formats a broken-down local time as the 19 DateTime characters and a NUL.
// `out` is cleared first; the year is clamped to four digits so the text
// always keeps its fixed width.
void format_exif_date(const std::tm& local, char out[kExifDateLength + 1]);

// Writes the APP1 segment of the context's EXIF description (nothing when
// it has none); a refused description fails the encode.
void write_app1(EncoderContext* ctx);

}  // namespace tekoj
