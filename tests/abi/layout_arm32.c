/* Compiled for 32-bit ARM only: the header's layout assertions must hold. */
#include <TekoJEncoderInternal.h>

_Static_assert(sizeof(void*) == 4, "built for a 32-bit target");
_Static_assert(sizeof(EncoderSettings) == 292, "EncoderSettings size");
_Static_assert(offsetof(OutputTarget, buffer) == 20, "OutputTarget buffer word");
