/* The internal header in strict C (built as C99 with -pedantic). */
#include <TekoJEncoderInternal.h>

size_t tekoj_header_check_context_size(void);
size_t tekoj_header_check_context_size(void) { return sizeof(EncoderContext); }
