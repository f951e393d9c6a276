// TIFF field writers: one 12-byte IFD entry per call, little-endian ("II"),
// values longer than four bytes appended to the data area behind the IFD.
//
// Inline values shorter than four bytes are padded with zeros, so that the
// block never carries whatever the output buffer held before.
#include "exif/tiff_writers.h"

#include <cstring>

namespace {

using tekoj::kIfdEntrySize;

// Tag, type and count: the first eight bytes of an entry.
void write_entry_head(uint8_t* entry, uint32_t tag, uint32_t type, uint32_t count) {
    __eko_WriteSHORT_LE(entry, tag);
    __eko_WriteSHORT_LE(entry + 2, type);
    __eko_WriteLONG_LE(entry + 4, count);
}

// Value field of `count` bytes of `data`: inline (zero-padded) when it fits,
// else appended to the data area with its offset in the entry.
void write_value_bytes(uint8_t* base, uint8_t* entry, uint32_t* data_offset, const void* data, uint32_t count) {
    uint8_t* field = entry + 8;
    if (count <= 4) {
        DORVATEKO_OsMemset(field, 0, 4);
        __eko_WriteUNDEFINED(field, data, count);
        return;
    }
    __eko_WriteUNDEFINED(base + *data_offset, data, count);
    __eko_WriteLONG_LE(field, *data_offset);
    *data_offset += count;
}

}  // namespace

namespace tekoj {

uint8_t* write_ascii_tag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag, const char* text,
                         uint32_t length) {
    const uint32_t n = length + 1;
    write_entry_head(entry, tag, kTiffAscii, n);
    uint8_t* stored = base + *data_offset;
    __eko_WriteASCII(stored, text, length);
    stored[length] = 0;
    uint8_t* field = entry + 8;
    if (n <= 4) {
        // A short string stands in the entry and, unreferenced, in the data
        // area too; readers look only at the entry.
        DORVATEKO_OsMemset(field, 0, 4);
        __eko_WriteASCII(field, stored, n);
    } else {
        __eko_WriteLONG_LE(field, *data_offset);
    }
    *data_offset += n;
    return entry + kIfdEntrySize;
}

}  // namespace tekoj

extern "C" {

EKO_API void __eko_WriteSHORT_LE(uint8_t* p, uint32_t value) {
    p[0] = static_cast<uint8_t>(value);
    p[1] = static_cast<uint8_t>(value >> 8);
}

EKO_API void __eko_WriteLONG_LE(uint8_t* p, uint32_t value) {
    p[0] = static_cast<uint8_t>(value);
    p[1] = static_cast<uint8_t>(value >> 8);
    p[2] = static_cast<uint8_t>(value >> 16);
    p[3] = static_cast<uint8_t>(value >> 24);
}

EKO_API void __eko_WriteRATIONAL(uint8_t* p, uint32_t numerator, uint32_t denominator) {
    __eko_WriteLONG_LE(p, numerator);
    __eko_WriteLONG_LE(p + 4, denominator);
}

// Empty copies never reach the OS layer, whose memcpy may not accept a null
// source even for zero bytes.
EKO_API void __eko_WriteASCII(uint8_t* dst, const void* src, uint32_t count) {
    if (count != 0) DORVATEKO_OsMemcpy(dst, src, count);
}

EKO_API void __eko_WriteUNDEFINED(uint8_t* dst, const void* src, uint32_t count) {
    if (count != 0) DORVATEKO_OsMemcpy(dst, src, count);
}

EKO_API uint32_t __eko_WriteASCII_String(uint8_t* dst, const char* src) {
    // A null string is written as the empty one, as __eko_GetStringSize
    // counts it.
    const uint32_t length = src == nullptr ? 0 : static_cast<uint32_t>(std::strlen(src));
    __eko_WriteASCII(dst, src, length);
    dst[length] = 0;
    return length + 1;
}

EKO_API uint32_t __eko_GetStringSize(const char* s) {
    return s == nullptr ? 1 : static_cast<uint32_t>(std::strlen(s)) + 1;
}

EKO_API uint8_t* __eko_WriteSHORTTag(uint8_t* /*base*/, uint8_t* entry, uint32_t tag, uint32_t value) {
    write_entry_head(entry, tag, tekoj::kTiffShort, 1);
    __eko_WriteSHORT_LE(entry + 8, value);
    __eko_WriteSHORT_LE(entry + 10, 0);
    return entry + kIfdEntrySize;
}

EKO_API uint8_t* __eko_WriteLONGTag(uint8_t* /*base*/, uint8_t* entry, uint32_t tag, uint32_t value) {
    write_entry_head(entry, tag, tekoj::kTiffLong, 1);
    __eko_WriteLONG_LE(entry + 8, value);
    return entry + kIfdEntrySize;
}

EKO_API uint8_t* __eko_WriteRATIONALTag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag,
                                        uint32_t numerator, uint32_t denominator) {
    write_entry_head(entry, tag, tekoj::kTiffRational, 1);
    __eko_WriteRATIONAL(base + *data_offset, numerator, denominator);
    __eko_WriteLONG_LE(entry + 8, *data_offset);
    *data_offset += 8;
    return entry + kIfdEntrySize;
}

EKO_API uint8_t* __eko_WriteGPSInfoTag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag,
                                       const uint32_t* values, uint32_t count) {
    write_entry_head(entry, tag, tekoj::kTiffRational, count);
    // Every pair the count announces is written (GPS uses 1 or 3), so no
    // announced value is left as stale buffer bytes.
    uint8_t* p = base + *data_offset;
    for (uint32_t i = 0; i < count; ++i) __eko_WriteRATIONAL(p + 8 * i, values[2 * i], values[2 * i + 1]);
    __eko_WriteLONG_LE(entry + 8, *data_offset);
    *data_offset += 8 * count;
    return entry + kIfdEntrySize;
}

EKO_API uint8_t* __eko_WriteASCIITag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag,
                                     const char* string) {
    if (string == nullptr) {
        write_entry_head(entry, tag, tekoj::kTiffAscii, 0);
        __eko_WriteLONG_LE(entry + 8, 0);
        return entry + kIfdEntrySize;
    }
    return tekoj::write_ascii_tag(base, entry, data_offset, tag, string,
                                  static_cast<uint32_t>(std::strlen(string)));
}

EKO_API uint8_t* __eko_WriteBYTESTag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag,
                                     const uint8_t* data, uint32_t count) {
    write_entry_head(entry, tag, tekoj::kTiffByte, count);
    write_value_bytes(base, entry, data_offset, data, count);
    return entry + kIfdEntrySize;
}

EKO_API void __eko_WriteUNDEFINEDTag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag,
                                     const uint8_t* data, uint32_t count) {
    if (data == nullptr) count = 0;
    write_entry_head(entry, tag, tekoj::kTiffUndefined, count);
    write_value_bytes(base, entry, data_offset, data, count);
}

}  // extern "C"
