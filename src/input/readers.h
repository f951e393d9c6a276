// Input readers: fill one band of component sample rows from the caller's
// pixels, in the layout that the context's format code names.
#pragma once

#include <TekoJEncoderInternal.h>

namespace tekoj {

// Runs the reader of the context's format for the current band.
void read_band(EncoderContext* ctx);

}  // namespace tekoj
