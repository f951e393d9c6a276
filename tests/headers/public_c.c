/* The public header stands alone in strict C (built as C99 with -pedantic):
 * it pulls in none of the internal records. */
#include <TekoJEncoder.h>

#ifdef TEKOJ_ENCODER_INTERNAL_H
#error "the public header must not include the internal one"
#endif

/* The context stays opaque: a pointer is all an application holds. */
EncoderContext* tekoj_header_check_context(void);
EncoderContext* tekoj_header_check_context(void) { return (EncoderContext*)0; }
