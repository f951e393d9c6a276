// Error hook. The code of the last failure is kept per thread so that callers
// (and the C++ API) can say why a call returned 0; no operation reads it.
#include <TekoJEncoderInternal.h>

namespace {
thread_local uint32_t last_error = EKO_OK;
}

extern "C" {

EKO_API void eko_SetError(uint32_t code) { last_error = code; }

EKO_API uint32_t eko_GetLastError(void) { return last_error; }

}  // extern "C"
