// Header writer: SOI, JFIF APP0, (EXIF APP1), DQT, SOF0, DHT, DRI and SOS.
#pragma once

#include <TekoJEncoderInternal.h>

#include <cstdint>

namespace tekoj {

// Writes the whole header into the context's fresh target. Returns 0 when
// its room could not be made or the EXIF segment was refused.
uint32_t write_header(EncoderContext* ctx);

}  // namespace tekoj
