// A caller written in plain C from the record layouts alone, without the
// library's header, linked against the shared library as an application is.
// Encodes images to memory, to a file (by name and by handle) and to a
// stream, checks that every output is the same stream and decodes it with
// libjpeg-turbo. Exits non-zero if any check failed.
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <turbojpeg.h>

typedef struct ImageInfo {
    int32_t width, height;
    const void* data;
    uint32_t band_mode, band_continued, band_open_end;
    int32_t total_height, band_top_row;
    uint32_t format;
    const void* exif_info;
} ImageInfo;

typedef struct EncodeOptions {
    uint32_t quality;
    const uint32_t* extra;
    uint32_t reserved;
} EncodeOptions;

typedef struct OutputRequest {
    uint32_t kind;
    void* file;
    uint8_t* buffer;
    uint32_t capacity;
} OutputRequest;

typedef uint32_t (*StreamCallback)(void* arg, const uint8_t* data, uint32_t count);

extern void* DORVATEKO_OsMalloc(uint32_t size);
extern void DORVATEKO_OsFree(void* block);
extern void* DORVATEKO_OsFopen(const char* path, const char* mode);
extern uint32_t eko_enc_jpeg_to_file(const ImageInfo* info, const char* name, uint32_t quality);
extern uint32_t eko_enc_jpeg_to_file_ex_full_buffer(const ImageInfo* info, OutputRequest* request,
                                                    const EncodeOptions* options);
extern uint32_t eko_enc_jpeg_to_buffer(const ImageInfo* info, uint8_t** buffer, int32_t* length, uint32_t quality);
extern uint32_t eko_enc_jpeg_to_buffer_full_buffer(const ImageInfo* info, OutputRequest* request, uint32_t quality);
extern uint32_t eko_enc_jpeg_to_stream_ex(const ImageInfo* info, StreamCallback callback,
                                          const EncodeOptions* options, void* arg);

static int failures = 0;
#define CHECK(cond)                                                                        \
    do {                                                                                   \
        if (!(cond)) fprintf(stderr, "%s:%d: check failed: %s\n", __FILE__, __LINE__, #cond), ++failures; \
    } while (0)

typedef struct Sink { uint8_t data[1 << 20]; size_t size, largest_piece; } Sink;

static uint32_t collect(void* arg, const uint8_t* data, uint32_t count) {
    Sink* sink = (Sink*)arg;
    if (sink->size + count <= sizeof sink->data) memcpy(sink->data + sink->size, data, count);
    sink->size += count;
    if (count > sink->largest_piece) sink->largest_piece = count;
    return 0;
}

// Whether the file at `path` holds exactly the n bytes at `expected`.
static int file_holds(const char* path, const uint8_t* expected, size_t n) {
    static uint8_t data[1 << 20];
    FILE* f = fopen(path, "rb");
    const size_t size = f ? fread(data, 1, sizeof data, f) : 0;
    if (f) fclose(f);
    return size == n && memcmp(data, expected, n) == 0;
}

// Encodes one image through every output kind and decodes the stream.
static void check_image(uint32_t format, int w, int h, int bpp, uint32_t quality, const char* path) {
    static uint8_t pixels[1 << 16], out[1 << 16];
    static Sink sink;
    uint8_t* memory = (uint8_t*)DORVATEKO_OsMalloc(100);
    int32_t length = 100;
    size_t i, n = (size_t)w * h * bpp;
    ImageInfo info = {w, h, pixels, 0, 0, 0, 0, 0, format, NULL};
    EncodeOptions options = {quality, NULL, 0};
    OutputRequest request = {1, NULL, NULL, 0};
    tjhandle t = tjInitDecompress();
    int dw = 0, dh = 0, sub = 0, cs = 0, grey = format == 4;

    for (i = 0; i < n; ++i) pixels[i] = (uint8_t)(((i % (size_t)(w * bpp)) * 3 + (i / (size_t)(w * bpp)) * 5) & 0xFF);
    CHECK(eko_enc_jpeg_to_buffer(&info, &memory, &length, quality) == 1);
    CHECK(memory != NULL && length > 4 && memory[0] == 0xFF && memory[1] == 0xD8 && memory[length - 1] == 0xD9);
    CHECK(eko_enc_jpeg_to_buffer_full_buffer(&info, &request, quality) == 1);
    CHECK(request.capacity == (uint32_t)length && memcmp(memory, request.buffer, (size_t)length) == 0);
    DORVATEKO_OsFree(request.buffer);

    CHECK(eko_enc_jpeg_to_file(&info, path, quality) == 1 && file_holds(path, memory, (size_t)length));
    request.kind = 0;
    request.file = DORVATEKO_OsFopen(path, "wb");
    CHECK(request.file != NULL && eko_enc_jpeg_to_file_ex_full_buffer(&info, &request, &options) == 1);
    CHECK(file_holds(path, memory, (size_t)length));

    sink.size = sink.largest_piece = 0;
    CHECK(eko_enc_jpeg_to_stream_ex(&info, collect, &options, &sink) == 1);
    CHECK(sink.size == (size_t)length && memcmp(memory, sink.data, sink.size) == 0 && sink.largest_piece <= 4096);

    CHECK(tjDecompressHeader3(t, memory, (unsigned long)length, &dw, &dh, &sub, &cs) == 0);
    CHECK(dw == w && dh == h && (grey ? cs == TJCS_GRAY : sub == TJSAMP_420));
    CHECK(tjDecompress2(t, memory, (unsigned long)length, out, w, 0, h, grey ? TJPF_GRAY : TJPF_RGB, 0) == 0);
    tjDestroy(t);
    DORVATEKO_OsFree(memory);
}

int main(int argc, char** argv) {
    const char* path = argc > 1 ? argv[1] : "abi_caller_out.jpg";
    check_image(1, 97, 45, 3, 85, path); // RGB888
    check_image(4, 61, 33, 1, 95, path); // grey
    check_image(0, 1, 1, 2, 75, path);   // RGB565
    remove(path);
    if (failures != 0) fprintf(stderr, "%d checks failed\n", failures);
    return failures == 0 ? 0 : 1;
}
