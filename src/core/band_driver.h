// The band (MCU-row) driver, shared by the whole-image entry points and the
// MCU-row interface.
#pragma once

#include <TekoJEncoderInternal.h>

namespace tekoj {

// Reads the next band through the format's reader and codes it. Returns
// false once the encode has failed.
bool process_band(EncoderContext* ctx);

// Codes the current band from already filled sample rows.
bool compress_band(EncoderContext* ctx, uint8_t** const* row_arrays);

// Scan geometry: registers component `index`, computes the MCU layout
// (false after reporting error 7), prepares the counters of band imcu_row.
uint32_t set_component(EncoderContext* ctx, uint32_t index, uint32_t id, uint8_t h, uint8_t v, uint8_t quant_tbl_no,
                   uint8_t dc_tbl_no, uint8_t ac_tbl_no);
uint32_t setup_scan(EncoderContext* ctx);
uint32_t setup_band(EncoderContext* ctx);

}  // namespace tekoj
