// Layout of one component's band sample rows: a single allocation holding the
// row-pointer array, then every row at one stride. Rows start on 64-byte
// boundaries, and the stride leaves at least 64 bytes after each row's
// length, so a full vector store that starts inside a row stays inside the
// block; the transform and the readers can so work on whole registers.
#pragma once

#include <cstddef>
#include <cstdint>

namespace tekoj {

constexpr uint32_t kSampleRowAlign = 64;

struct SampleRowLayout {
    uint32_t stride;      // bytes from one row to the next
    uint32_t block_size;  // bytes of the whole allocation
};

constexpr SampleRowLayout sample_row_layout(uint32_t row_length, uint32_t row_count) {
    const uint32_t stride = (row_length + 2 * kSampleRowAlign - 1) / kSampleRowAlign * kSampleRowAlign;
    const uint32_t pointers = row_count * static_cast<uint32_t>(sizeof(uint8_t*));
    return {stride, pointers + kSampleRowAlign + row_count * stride};
}

// The first row of a block whose pointer array `rows` has `row_count` entries.
inline uint8_t* first_sample_row(uint8_t** rows, uint32_t row_count) {
    const auto end = reinterpret_cast<uintptr_t>(rows + row_count);
    return reinterpret_cast<uint8_t*>((end + kSampleRowAlign - 1) & ~static_cast<uintptr_t>(kSampleRowAlign - 1));
}

}  // namespace tekoj
