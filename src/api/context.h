// Encoder context helpers shared by the entry points and the MCU-row
// interface.
#pragma once

#include <TekoJEncoderInternal.h>

namespace tekoj {

// Frees everything a context owns and the record itself, including the work
// buffer that only a completed stream would have freed already.
void discard_context(EncoderContext* ctx);

// Creation: validates the caller's records and allocates every buffer of
// one encode (null after reporting why); the set-up step it runs; the
// release of every buffer the context owns (the record itself and the
// output block excepted).
EncoderContext* create_context(const ImageInfo* image_info, const OutputRequest* output_request,
                               const EncodeOptions* options, const EncoderSettings* settings);
uint32_t setup_context(EncoderContext* ctx);
void release_buffers(EncoderContext* ctx);

// Completes the stream: the last byte padded with 1-bits, EOI unless more
// bands follow, the rest handed on or the memory stream's length fixed.
bool complete_stream(EncoderContext* ctx, bool with_eoi);

// The band sample rows of every component, allocated from the components'
// geometry into the context's SampleRowSet (false after reporting error 3,
// what was allocated left for release), and freed again.
bool allocate_band_rows(EncoderContext* ctx);
void release_band_rows(EncoderContext* ctx);

}  // namespace tekoj
