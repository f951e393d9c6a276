// The version of the library that is actually loaded, so that a program can
// tell a header/library mismatch.
#include <TekoJEncoder.h>

extern "C" EKO_API uint32_t eko_GetVersion(void) { return TEKOJ_VERSION; }
