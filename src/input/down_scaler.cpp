// Down-scaler from packed 4:2:2 (groups Y0 U Y1 V) to planar 4:2:0 in one
// buffer, the layout of input format 2, so a camera frame can be shrunk and
// handed straight to the encoder.
//
// Every output pixel averages four point samples of the source: the quarter
// and three-quarter positions of its footprint, horizontally and vertically.
// The three sums of a pixel travel packed in one 32-bit word (Y << 20 |
// U << 10 | V); a field holds at most 4 x 255 = 1020 < 1024, so one integer
// add accumulates all three without carries between them.
#include <TekoJEncoderInternal.h>

#include "input/pixel_kernels.h"

#include <cstddef>
#include <cstdint>

namespace {

inline uint32_t sample_word(const uint8_t* row, uint32_t x) {
    // Both pixels of a group carry the group's U (byte 1) and V (byte 3).
    const uint32_t group = (2 * x) & ~3u;
    return static_cast<uint32_t>(row[2 * x]) << 20 | static_cast<uint32_t>(row[group + 1]) << 10 | row[group + 3];
}

// Tap positions along one axis: output cell i of `dst` cells over `src`
// source cells samples floor((src/4 + i*src) / dst) and
// floor((3*src/4 + i*src) / dst). Stepping i by one moves each numerator by
// src, i.e. the quotient by src / dst with the remainder carried over, so the
// walk needs neither division nor multiplication per cell.
struct TapWalk {
    uint32_t step_q;  // src / dst
    uint32_t step_r;  // src % dst
    uint32_t dst;
    uint32_t first, first_rem;
    uint32_t second, second_rem;

    TapWalk(uint32_t src, uint32_t dst_cells)
        : step_q(src / dst_cells),
          step_r(src % dst_cells),
          dst(dst_cells),
          first((src >> 2) / dst_cells),
          first_rem((src >> 2) % dst_cells),
          second(((3 * static_cast<uint64_t>(src)) >> 2) / dst_cells),
          second_rem(static_cast<uint32_t>(((3 * static_cast<uint64_t>(src)) >> 2) % dst_cells)) {}

    void advance() {
        first += step_q;
        first_rem += step_r;
        if (first_rem >= dst) {
            first_rem -= dst;
            ++first;
        }
        second += step_q;
        second_rem += step_r;
        if (second_rem >= dst) {
            second_rem -= dst;
            ++second;
        }
    }
};

// What one source row contributes, and to which accumulator row(s).
enum class RowRole { kStarts, kFinishes, kBoth };

// Accumulates one source row's two horizontal taps per output column. A row
// that starts an output row initialises its words; a row that finishes one
// adds to them. When the same row does both for the same output row (start
// and finish the same accumulator row), the store-then-add counts its taps
// twice, which keeps the four-sample average exact.
template <RowRole Role>
void accumulate_row(const uint8_t* row, uint32_t sw, uint32_t dw, uint32_t* start, uint32_t* finish) {
    TapWalk walk(sw, dw);
    for (uint32_t i = 0; i < dw; ++i, walk.advance()) {
        const uint32_t pair = sample_word(row, walk.first) + sample_word(row, walk.second);
        if constexpr (Role == RowRole::kStarts) {
            start[i] = pair;
        } else if constexpr (Role == RowRole::kFinishes) {
            finish[i] += pair;
        } else {
            start[i] = pair;
            finish[i] += pair;
        }
    }
}

// One output row from `count` accumulated words; 4:2:0 keeps the chroma of
// even rows only.
void write_row(const uint32_t* words, uint32_t count, Yuv420Cursor& cursor, int32_t row_index) {
    const bool chroma = (row_index & 1) == 0;
    tekoj::input_kernels().yuv_row(words, count, cursor.y, chroma ? cursor.u : nullptr, cursor.v);
    cursor.y += count;
    if (chroma) {
        cursor.u += (count + 1) >> 1;
        cursor.v += (count + 1) >> 1;
    }
}

inline bool acceptable(const uint8_t* source, int32_t sw, int32_t sh, int32_t stride, const uint8_t* destination,
                       int32_t dw, int32_t dh) {
    if (source == nullptr || destination == nullptr) return false;
    if (sw <= 0 || sh <= 0 || dw <= 0 || dh <= 0) return false;
    // Only reduction: an enlarged output would leave cells no source row or
    // column ever reaches.
    if (dw > sw || dh > sh) return false;
    // A row must hold every group it starts; an odd width still ends in a
    // whole group, so the stride has to cover the width rounded up to even.
    if (stride < sw + (sw & 1)) return false;
    // Two accumulator rows of 4-byte words must fit the allocator's size.
    if (static_cast<uint32_t>(dw) > (UINT32_MAX >> 3)) return false;
    return true;
}

}  // namespace

extern "C" {

EKO_API void __eko_jpeg_enc_write_yuv_to_yuv420(const uint32_t* words, int32_t count, Yuv420Cursor* cursor,
                                                int32_t row_index) {
    eko_SetError(EKO_OK);
    if (words == nullptr || cursor == nullptr || count <= 0) {
        eko_SetError(EKO_ERR_ARGUMENT);
        return;
    }
    write_row(words, static_cast<uint32_t>(count), *cursor, row_index);
}

EKO_API void __eko_jpeg_enc_down_scale_yuv422(const uint8_t* source, int32_t source_width, int32_t source_height,
                                              int32_t source_stride, uint8_t* destination,
                                              int32_t destination_width, int32_t destination_height) {
    eko_SetError(EKO_OK);
    if (!acceptable(source, source_width, source_height, source_stride, destination, destination_width,
                    destination_height)) {
        eko_SetError(EKO_ERR_ARGUMENT);
        return;
    }
    const uint32_t sw = static_cast<uint32_t>(source_width);
    const uint32_t dw = static_cast<uint32_t>(destination_width);
    const int64_t sh = source_height;
    const int64_t dh = destination_height;
    const size_t row_bytes = 2 * static_cast<size_t>(source_stride);

    auto* accumulators = static_cast<uint32_t*>(DORVATEKO_OsMalloc(dw * 8));
    if (accumulators == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return;
    }
    uint32_t* const acc_rows[2] = {accumulators, accumulators + dw};

    const size_t luma_size = static_cast<size_t>(dw) * static_cast<size_t>(dh);
    const size_t chroma_size = static_cast<size_t>((dw + 1) >> 1) * static_cast<size_t>((dh + 1) >> 1);
    Yuv420Cursor cursor{destination, destination + luma_size, destination + luma_size + chroma_size};

    // Vertical walk: source row y is the first tap of the next output row to
    // start when 0 <= A - y*dh < dh, and the second tap of the next output row
    // to finish when 0 <= B - y*dh < dh. Output row k lives in accumulator
    // row k mod 2; at most two output rows are open at any time.
    int64_t next_first = sh >> 2;
    int64_t next_second = (3 * sh) >> 2;
    int64_t scaled_y = 0;
    uint32_t start_slot = 0;
    uint32_t finish_slot = 0;
    int32_t rows_written = 0;
    const uint8_t* row = source;
    // Halving the width (the common preview case) takes both taps of column i
    // from group i: a contiguous pass that vector kernels do.
    const auto halve = sw == 2 * dw ? tekoj::input_kernels().halve422 : nullptr;
    for (int64_t y = 0; y < sh; ++y, scaled_y += dh, row += row_bytes) {
        const bool starts = next_first - scaled_y >= 0 && next_first - scaled_y < dh;
        const bool finishes = next_second - scaled_y >= 0 && next_second - scaled_y < dh;
        uint32_t* start = acc_rows[start_slot];
        uint32_t* finish = acc_rows[finish_slot];
        if (halve != nullptr) {
            if (starts || finishes) halve(row, dw, starts ? start : nullptr, finishes ? finish : nullptr);
        } else if (starts && finishes) {
            accumulate_row<RowRole::kBoth>(row, sw, dw, start, finish);
        } else if (starts) {
            accumulate_row<RowRole::kStarts>(row, sw, dw, start, finish);
        } else if (finishes) {
            accumulate_row<RowRole::kFinishes>(row, sw, dw, start, finish);
        }
        if (finishes) {
            write_row(finish, dw, cursor, rows_written++);
            next_second += sh;
            finish_slot ^= 1;
        }
        if (starts) {
            next_first += sh;
            start_slot ^= 1;
        }
    }
    DORVATEKO_OsFree(accumulators);
}

}  // extern "C"
