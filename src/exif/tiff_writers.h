// Internal helpers shared by the TIFF field writers and the EXIF block
// builder.
#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>

namespace tekoj {

// Size of one IFD entry: tag, type, count, value-or-offset.
inline constexpr uint32_t kIfdEntrySize = 12;

// TIFF field types used by the EXIF writers.
enum TiffType : uint32_t {
    kTiffByte = 1,
    kTiffAscii = 2,
    kTiffShort = 3,
    kTiffLong = 4,
    kTiffRational = 5,
    kTiffUndefined = 7,
};

// An ASCII entry whose text is `length` characters at `text` (no NUL needed
// there): `length` + 1 bytes, the NUL included, always go to the data area,
// and a value of up to four bytes is also copied into the entry. Lets the
// builder write strings whose length it has bounded itself.
uint8_t* write_ascii_tag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag, const char* text,
                         uint32_t length);

}  // namespace tekoj
