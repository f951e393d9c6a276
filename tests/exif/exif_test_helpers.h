// Helpers of the EXIF tests: hex byte strings (bytes as digit pairs, spaces
// between any of them) and a minimal TIFF IFD reader.
#pragma once

#include "support/test_support.h"

#include <map>

namespace exif_test {

using tekoj_test::Bytes;

inline uint32_t le16(const uint8_t* p) { return p[0] | p[1] << 8; }
inline uint32_t le32(const uint8_t* p) { return le16(p) | le16(p + 2) << 16; }

inline Bytes hex(const std::string& text) {  // "1201 AA" -> {0x12, 0x01, 0xAA}
    Bytes out;
    for (size_t i = text.find_first_not_of(' '); i < text.size(); i = text.find_first_not_of(' ', i + 2))
        out.push_back(static_cast<uint8_t>(std::stoi(text.substr(i, 2), nullptr, 16)));
    return out;
}

struct Entry { uint32_t type, count, value; };  // value: the 4-byte field read as a LONG
using Ifd = std::map<uint32_t, Entry>;

// The IFD at `offset` of a TIFF block of `size` bytes; empty when it or an
// out-of-line value reaches past the block. `next` gets its next-IFD offset.
inline Ifd read_ifd(const uint8_t* base, uint32_t size, uint32_t offset, uint32_t* next = nullptr) {
    static const uint32_t kTypeSize[8] = {0, 1, 1, 2, 4, 8, 0, 1};
    const uint32_t n = offset + 2 <= size ? le16(base + offset) : 0;
    Ifd out;
    for (uint32_t i = 0; i < n && offset + 6 + 12 * n <= size; ++i) {
        const uint8_t* e = base + offset + 2 + 12 * i;
        const Entry entry{le16(e + 2), le32(e + 4), le32(e + 8)};
        const uint32_t bytes = kTypeSize[entry.type & 7] * entry.count;
        if (bytes > 4 && entry.value + bytes > size) return {};
        out[le16(e)] = entry;
    }
    if (next != nullptr && offset + 6 + 12 * n <= size) *next = le32(base + offset + 2 + 12 * n);
    return out;
}

}  // namespace exif_test
