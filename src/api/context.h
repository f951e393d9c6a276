// Encoder context helpers shared by the entry points and the MCU-row
// interface.
#pragma once

#include <TekoJEncoderInternal.h>

namespace tekoj {

// Frees everything a context owns and the record itself, including the work
// buffer that only a completed stream would have freed already.
void discard_context(EncoderContext* ctx);

// The band sample rows of every component, allocated from the components'
// geometry into the context's SampleRowSet (false after reporting error 3,
// what was allocated left for release), and freed again.
bool allocate_band_rows(EncoderContext* ctx);
void release_band_rows(EncoderContext* ctx);

}  // namespace tekoj
