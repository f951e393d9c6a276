#include "core/forward_dct.h"

extern "C" {

EKO_API void __eko_jpeg_enc_do_forward_dct(const uint32_t* divisors, void* spare, uint8_t* const* rows,
                                           int16_t* output, BlockPosition* position) {
    (void)spare;
    for (uint32_t b = 0; b < position->block_count; ++b) {
        tekoj::forward_dct_block(rows, position->start_row, position->start_col, divisors, output);
        position->start_col += 8;
        output += 64;
    }
}

}  // extern "C"
