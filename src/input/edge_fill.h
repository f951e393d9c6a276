// Edge repetition shared by every input reader: the transform reads whole
// 8x8 blocks, so cells beyond the image's last column and last row must hold
// copies of the nearest image sample, never stale or uninitialised bytes.
#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>

namespace tekoj {

// Columns [written, padded) of `row` take the value at written - 1.
inline void fill_right(uint8_t* row, uint32_t written, uint32_t padded) {
    if (written == 0 || written >= padded) return;
    DORVATEKO_OsMemset(row + written, row[written - 1], padded - written);
}

// Rows [from, count) of `rows` become copies of row from - 1 (padded bytes each).
inline void fill_rows_below(uint8_t* const* rows, uint32_t from, uint32_t count, uint32_t padded) {
    if (from == 0) return;
    for (uint32_t r = from; r < count; ++r) DORVATEKO_OsMemcpy(rows[r], rows[from - 1], padded);
}

// Both fills for one component after a reader wrote `rows_written` rows of
// `written` samples each.
inline void fill_component_edges(uint8_t* const* rows, const ComponentInfo& comp, uint32_t written,
                                 uint32_t rows_written) {
    for (uint32_t r = 0; r < rows_written; ++r) fill_right(rows[r], written, comp.padded_width);
    fill_rows_below(rows, rows_written, comp.band_rows, comp.padded_width);
}

}  // namespace tekoj
