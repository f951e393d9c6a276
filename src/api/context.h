// Encoder context helpers shared by the entry points and the MCU-row
// interface.
#pragma once

#include <TekoJEncoderInternal.h>

namespace tekoj {

// Frees everything a context owns and the record itself, including the work
// buffer that only a completed stream would have freed already.
void discard_context(EncoderContext* ctx);

}  // namespace tekoj
