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

}  // namespace tekoj
