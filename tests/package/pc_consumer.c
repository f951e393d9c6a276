/* An outside C program built with the flags pkg-config gives: encodes a
 * small grey ramp to memory and checks the stream's ends and the version. */
#include <TekoJEncoder.h>

#include <stdio.h>

int main(void) {
    uint8_t pixels[24 * 10];
    uint8_t* block = NULL;
    int32_t length = 0;
    ImageInfo info = {0};
    unsigned i;
    for (i = 0; i < sizeof pixels; ++i) pixels[i] = (uint8_t)(i * 7);
    info.width = 24;
    info.height = 10;
    info.data = pixels;
    info.format = EKO_FORMAT_GREY;
    if (eko_GetVersion() != TEKOJ_VERSION) {
        fprintf(stderr, "library version %u, header %u\n", (unsigned)eko_GetVersion(), (unsigned)TEKOJ_VERSION);
        return 1;
    }
    if (!eko_enc_jpeg_to_buffer(&info, &block, &length, 80) || length < 4 || block[0] != 0xFF || block[1] != 0xD8 ||
        block[length - 2] != 0xFF || block[length - 1] != 0xD9) {
        fprintf(stderr, "encode failed (error %u)\n", (unsigned)eko_GetLastError());
        return 1;
    }
    DORVATEKO_OsFree(block);
    return 0;
}
