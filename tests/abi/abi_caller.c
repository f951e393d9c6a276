/*
 * A caller written in plain C from the record layouts alone, without the
 * library's header, linked against the shared library as an application is.
 * Encodes images to memory, to a file (by name and by handle) and to a
 * stream, checks that every output is the same stream and decodes it with
 * libjpeg-turbo. Exits non-zero on the first failure.
 */
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <turbojpeg.h>

typedef struct ImageInfo {
    int32_t width;
    int32_t height;
    const void* data;
    uint32_t band_mode;
    uint32_t band_continued;
    uint32_t band_open_end;
    int32_t total_height;
    int32_t band_top_row;
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
extern uint32_t eko_GetLastError(void);
extern const uint8_t eko_luminanceQuantTbl[15][64];
extern uint32_t eko_enc_jpeg_to_file(const ImageInfo* info, const char* name, uint32_t quality);
extern uint32_t eko_enc_jpeg_to_file_ex_full_buffer(const ImageInfo* info, OutputRequest* request,
                                                    const EncodeOptions* options);
extern uint32_t eko_enc_jpeg_to_buffer(const ImageInfo* info, uint8_t** buffer, int32_t* length, uint32_t quality);
extern uint32_t eko_enc_jpeg_to_buffer_ex(const ImageInfo* info, uint8_t** buffer, int32_t* length,
                                          const EncodeOptions* options);
extern uint32_t eko_enc_jpeg_to_buffer_full_buffer(const ImageInfo* info, OutputRequest* request, uint32_t quality);
extern uint32_t eko_enc_jpeg_to_stream(const ImageInfo* info, StreamCallback callback, uint32_t quality, void* arg);
extern uint32_t eko_enc_jpeg_to_stream_ex(const ImageInfo* info, StreamCallback callback,
                                          const EncodeOptions* options, void* arg);

static int failures = 0;
#define CHECK(cond)                                                      \
    do {                                                                 \
        if (!(cond)) {                                                   \
            fprintf(stderr, "%s:%d: check failed: %s\n", __FILE__, __LINE__, #cond); \
            ++failures;                                                  \
        }                                                                \
    } while (0)

typedef struct Sink {
    uint8_t* data;
    size_t size;
    size_t largest_piece;
} Sink;

static uint32_t collect(void* arg, const uint8_t* data, uint32_t count) {
    Sink* sink = (Sink*)arg;
    sink->data = (uint8_t*)realloc(sink->data, sink->size + count);
    memcpy(sink->data + sink->size, data, count);
    sink->size += count;
    if (count > sink->largest_piece) sink->largest_piece = count;
    return 0;
}

static int same(const uint8_t* a, size_t na, const uint8_t* b, size_t nb) {
    return na == nb && memcmp(a, b, na) == 0;
}

static uint8_t* read_whole_file(const char* path, size_t* size) {
    FILE* f = fopen(path, "rb");
    uint8_t* data = NULL;
    *size = 0;
    if (f == NULL) return NULL;
    fseek(f, 0, SEEK_END);
    *size = (size_t)ftell(f);
    fseek(f, 0, SEEK_SET);
    data = (uint8_t*)malloc(*size ? *size : 1);
    if (fread(data, 1, *size, f) != *size) *size = 0;
    fclose(f);
    return data;
}

/* Encodes one image through every output kind and decodes the stream. */
static void check_image(uint32_t format, int w, int h, int bpp, uint32_t quality, const char* path) {
    size_t n = (size_t)w * h * bpp, i;
    uint8_t* pixels = (uint8_t*)malloc(n);
    uint8_t *memory = (uint8_t*)DORVATEKO_OsMalloc(100), *other = NULL, *from_file = NULL;
    int32_t length = 100, other_length = 0;
    size_t file_size = 0;
    ImageInfo info;
    EncodeOptions options;
    OutputRequest request;
    Sink sink = {NULL, 0, 0}, sink_ex = {NULL, 0, 0};
    char handle_path[512];

    for (i = 0; i < n; ++i) pixels[i] = (uint8_t)(((i % (size_t)(w * bpp)) * 3 + (i / (size_t)(w * bpp)) * 5) & 0xFF);
    memset(&info, 0, sizeof info);
    info.width = w;
    info.height = h;
    info.data = pixels;
    info.format = format;
    options.quality = quality;
    options.extra = NULL;
    options.reserved = 0;

    CHECK(eko_enc_jpeg_to_buffer(&info, &memory, &length, quality) == 1);
    CHECK(memory != NULL && length > 2 && memory[0] == 0xFF && memory[1] == 0xD8);
    CHECK(memory[length - 2] == 0xFF && memory[length - 1] == 0xD9);

    CHECK(eko_enc_jpeg_to_buffer_ex(&info, &other, &other_length, &options) == 1);
    CHECK(same(memory, (size_t)length, other, (size_t)other_length));
    DORVATEKO_OsFree(other);

    request.kind = 1;
    request.file = NULL;
    request.buffer = NULL;
    request.capacity = 0;
    CHECK(eko_enc_jpeg_to_buffer_full_buffer(&info, &request, quality) == 1);
    CHECK(same(memory, (size_t)length, request.buffer, request.capacity));
    DORVATEKO_OsFree(request.buffer);

    CHECK(eko_enc_jpeg_to_file(&info, path, quality) == 1);
    from_file = read_whole_file(path, &file_size);
    CHECK(same(memory, (size_t)length, from_file, file_size));
    free(from_file);

    snprintf(handle_path, sizeof handle_path, "%s.handle", path);
    request.kind = 0;
    request.file = DORVATEKO_OsFopen(handle_path, "wb");
    CHECK(request.file != NULL);
    CHECK(eko_enc_jpeg_to_file_ex_full_buffer(&info, &request, &options) == 1);
    from_file = read_whole_file(handle_path, &file_size);
    CHECK(same(memory, (size_t)length, from_file, file_size));
    free(from_file);
    remove(handle_path);

    CHECK(eko_enc_jpeg_to_stream(&info, collect, quality, &sink) == 1);
    CHECK(eko_enc_jpeg_to_stream_ex(&info, collect, &options, &sink_ex) == 1);
    CHECK(same(memory, (size_t)length, sink.data, sink.size));
    CHECK(same(memory, (size_t)length, sink_ex.data, sink_ex.size));
    CHECK(sink.largest_piece <= 4096);
    free(sink.data);
    free(sink_ex.data);

    {
        tjhandle t = tjInitDecompress();
        int dw = 0, dh = 0, sub = 0, cs = 0;
        const int grey = format == 4;
        unsigned char* out = (unsigned char*)malloc((size_t)w * h * 3);
        CHECK(tjDecompressHeader3(t, memory, (unsigned long)length, &dw, &dh, &sub, &cs) == 0);
        CHECK(dw == w && dh == h);
        CHECK(grey ? cs == TJCS_GRAY : sub == TJSAMP_420);
        CHECK(tjDecompress2(t, memory, (unsigned long)length, out, w, 0, h, grey ? TJPF_GRAY : TJPF_RGB, 0) == 0);
        if (grey) {
            double error = 0;
            for (i = 0; i < n; ++i) error += abs((int)out[i] - (int)pixels[i]);
            CHECK(error / (double)n < 4.0);
        }
        free(out);
        tjDestroy(t);
    }
    DORVATEKO_OsFree(memory);
    free(pixels);
}

int main(int argc, char** argv) {
    const char* path = argc > 1 ? argv[1] : "abi_caller_out.jpg";
    uint8_t pixels[64] = {0};
    uint8_t* block = NULL;
    int32_t length = 0;
    ImageInfo info;

    CHECK(eko_luminanceQuantTbl[0][0] == 16 && eko_luminanceQuantTbl[0][63] == 99);

    check_image(1, 97, 45, 3, 85, path);  /* RGB888 */
    check_image(4, 61, 33, 1, 95, path);  /* grey */
    check_image(7, 16, 16, 4, 50, path);  /* RGBA8888 */
    check_image(0, 1, 1, 2, 75, path);    /* RGB565 */

    /* A refused format: result 0, the reason readable, nothing handed back. */
    memset(&info, 0, sizeof info);
    info.width = 8;
    info.height = 8;
    info.data = pixels;
    info.format = 3;
    {
        EncodeOptions options = {75, NULL, 0};
        CHECK(eko_enc_jpeg_to_buffer_ex(&info, &block, &length, &options) == 0);
    }
    CHECK(eko_GetLastError() == 6);
    CHECK(block == NULL && length == 0);
    DORVATEKO_OsFree(block);
    remove(path);

    if (failures != 0) fprintf(stderr, "%d checks failed\n", failures);
    return failures == 0 ? 0 : 1;
}
