/*
 * libTekoJEncoder: baseline JPEG encoder, C interface.
 *
 * This header is all an application needs. It compiles as C99 and later and
 * as C++. The exported internal steps (the encoder's working records and its
 * __eko_ coding steps) live in <TekoJEncoderInternal.h>, which this header
 * does not include.
 *
 * Conventions
 * - Functions return 1 for success and 0 for failure (creation: a context or
 *   null). After a failure eko_GetLastError() tells why (EkoError below).
 * - Every call runs on the caller's thread, callbacks included. Separate
 *   encodes share no writable state and may run on separate threads.
 * - The caller owns its pixels and records; the library never writes into
 *   them. The library owns everything it allocates during a call and frees it
 *   before the call returns, except the memory output block handed back.
 * - Memory output blocks come from DORVATEKO_OsMalloc and go back with
 *   DORVATEKO_OsFree (never plain malloc/free: an integrator may route these
 *   through another allocator).
 * - Records are laid out word by word as callers on 32-bit ARM expect them:
 *   fields in fixed order, fixed-width types, one pointer per word. The
 *   layout checks at the end of this header hold whenever pointers are 32
 *   bits wide.
 */
#ifndef TEKOJ_ENCODER_H
#define TEKOJ_ENCODER_H

#include <stddef.h>
#include <stdint.h>

/* Version of this header; eko_GetVersion() gives the library's. */
#define TEKOJ_VERSION_MAJOR 1
#define TEKOJ_VERSION_MINOR 1
#define TEKOJ_VERSION_PATCH 0
#define TEKOJ_VERSION (TEKOJ_VERSION_MAJOR * 10000 + TEKOJ_VERSION_MINOR * 100 + TEKOJ_VERSION_PATCH)

#if defined(_WIN32)
#define EKO_API __declspec(dllexport)
#else
#define EKO_API __attribute__((visibility("default")))
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* ------------------------------------------------------------------------ */
/* Errors                                                                    */
/* ------------------------------------------------------------------------ */

/* Why a call failed, kept per thread (eko_GetLastError). */
typedef enum EkoError {
    EKO_OK = 0,
    EKO_ERR_ALLOC = 3,        /* an allocation failed */
    EKO_ERR_FORMAT = 6,       /* pixel format code not accepted */
    EKO_ERR_SAMPLING = 7,     /* component count, sampling or tables not supported */
    EKO_ERR_DIMENSIONS = 14,  /* width or height outside 1..49999 */
    EKO_ERR_ARGUMENT = 20,    /* a null pointer, an out-of-range argument or
                                 band words that cannot form one stream */
    EKO_ERR_WRITE = 21,       /* the file refused bytes (disc full, I/O error) */
    EKO_ERR_TOO_LARGE = 22,   /* the stream passes 4 GiB, or the EXIF segment
                                 (thumbnail included) its 64 KB length field */
    EKO_ERR_STATE = 23,       /* call out of order (e.g. a band after the last) */
    EKO_ERR_OPEN = 24         /* the output file could not be opened */
} EkoError;

/* The reason of the last call on the calling thread: every exported call
 * that can fail starts from EKO_OK, so after a success this is 0 and after a
 * failure the code belongs to that call. */
EKO_API uint32_t eko_GetLastError(void);

/* TEKOJ_VERSION of the library actually loaded (major * 10000 + minor * 100
 * + patch); compare with the header's to detect a mismatched install. */
EKO_API uint32_t eko_GetVersion(void);

/* ------------------------------------------------------------------------ */
/* Pixel formats                                                             */
/* ------------------------------------------------------------------------ */

/* ImageInfo.format codes (only the low byte counts; others give
 * EKO_ERR_FORMAT). W and H are the width and height; rows are packed
 * top to bottom with no gap (stride = row size). Colour input is coded
 * with 4:2:0 chroma.
 *
 * EKO_FORMAT_YUV420: three planes in one buffer, Y then U (Cb) then V (Cr):
 *   Y at offset 0,       W * H bytes
 *   U at offset W * H,   ((W + 1) / 2) * ((H + 1) / 2) bytes
 *   V right after U,     ((W + 1) / 2) * ((H + 1) / 2) bytes
 *   (chroma sizes round up: a 5 x 3 image is 15 + 6 + 6 = 27 bytes).
 * EKO_FORMAT_GREY:     W * H bytes.
 * EKO_FORMAT_RGB565:   W * H little-endian 16-bit words, red in bits 15-11,
 *                      green 10-5, blue 4-0.
 * EKO_FORMAT_RGB888:   W * H * 3 bytes R, G, B.
 * EKO_FORMAT_RGBA8888: W * H * 4 bytes R, G, B, A (A ignored).
 * EKO_FORMAT_BGRA8888: W * H * 4 bytes B, G, R, A (A ignored).
 *
 * A luma plane followed by an interleaved V/U plane (NV21) and packed
 * 4:2:2 (Y0 U Y1 V) have exported readers but no format code; the C++
 * interface in <TekoJEncoder.hpp> takes them (and NV12, UYVY, and any row
 * stride). */
enum {
    EKO_FORMAT_RGB565 = 0,
    EKO_FORMAT_RGB888 = 1,
    EKO_FORMAT_YUV420 = 2,
    EKO_FORMAT_GREY = 4,
    EKO_FORMAT_RGBA8888 = 7,
    EKO_FORMAT_BGRA8888 = 8
};

/* OutputRequest.kind codes. */
enum {
    EKO_OUTPUT_FILE = 0,   /* an open file handle from DORVATEKO_OsFopen */
    EKO_OUTPUT_MEMORY = 1, /* a growable block from DORVATEKO_OsMalloc */
    EKO_OUTPUT_STREAM = 4  /* a callback that receives the stream in pieces */
};

/* ------------------------------------------------------------------------ */
/* Caller records                                                            */
/* ------------------------------------------------------------------------ */

struct ExifInfo;
/* Opaque to applications: created by eko_jpeg_enc_mcu_init, released by
 * eko_jpeg_enc_mcu_finish. */
typedef struct EncoderContext EncoderContext;

/* The image (or, in band mode, one horizontal band of it).
 *
 * Band mode: only eko_enc_jpeg_to_buffer and eko_enc_jpeg_to_buffer_ex read
 * the five band words; every other entry point codes width x height as one
 * whole image whatever they hold (set them to 0). To code a tall image in
 * pieces, call the buffer entry point once per band, each time describing the
 * band alone in width, height, data and format, and append the outputs in
 * order: they join into one JPEG stream, because every MCU row is its own
 * restart interval and each later band starts with the next restart marker.
 *   band_mode      nonzero on every call of a banded encode.
 *   band_continued 0 on the first band (it writes the header, announcing
 *                  total_height rows, and the EXIF segment); nonzero on later
 *                  bands (no header, exif_info ignored).
 *   band_open_end  nonzero on every band but the last (no end marker).
 *   total_height   first band: the whole image's height (>= height).
 *   band_top_row   later bands: the band's first row in the whole image.
 * Every band but the last must be a multiple of 16 rows (8 for grey) high,
 * all bands share width, format and quality, and band_top_row of each later
 * band is the sum of the heights before it; other words are refused with
 * EKO_ERR_ARGUMENT. */
typedef struct ImageInfo {
    int32_t width;                    /* 1..49999 */
    int32_t height;                   /* 1..49999 */
    const void* data;                 /* pixels as `format` says; read only */
    uint32_t band_mode;
    uint32_t band_continued;
    uint32_t band_open_end;
    int32_t total_height;
    int32_t band_top_row;
    uint32_t format;                  /* EKO_FORMAT_*; only the low byte counts */
    const struct ExifInfo* exif_info; /* null, or an EXIF description (below);
                                         whole-image entry points only */
} ImageInfo;

typedef struct EncodeOptions {
    uint32_t quality;      /* 1 (smallest) .. 100 (best); 0 counts as 1, above 100 as 100 */
    const uint32_t* extra; /* null, or two words the encoder ignores */
    uint32_t reserved;     /* never read */
} EncodeOptions;

/* Output of the _full_buffer entry points and of eko_jpeg_enc_mcu_init. */
typedef struct OutputRequest {
    uint32_t kind;     /* EKO_OUTPUT_*; the _full_buffer entry points set it themselves */
    void* file;        /* kind 0: a handle from DORVATEKO_OsFopen(path, "wb") */
    uint8_t* buffer;   /* kind 1: a block from DORVATEKO_OsMalloc (may be replaced) */
    uint32_t capacity; /* kind 1: its size in bytes; the buffer entry point
                          stores the stream length here on success */
} OutputRequest;

/* Optional settings of the MCU-row interface (the whole-image entry points
 * always use the built-in layout): component count, own quantisation tables
 * and sampling factors. The band call's buffer holds 4:2:0 (Y 2x2) and 4:2:2
 * (Y 2x1) planar input and grey; other samplings (4:4:4) are for the
 * column-split drivers, which take ready coefficients (the band call refuses
 * them with EKO_ERR_SAMPLING). RGB input is always 4:2:0. */
typedef struct EncoderSettings {
    uint8_t num_components;         /* 1 (grey) or 3 */
    uint8_t reserved0[3];
    int32_t num_quant_tables;       /* tables supplied below, 0..4 */
    uint8_t quant_tables[4][64];    /* natural (row-major) order, entries 1..255 */
    uint8_t reserved1[8];
    uint32_t write_dri;             /* nonzero: the header carries the DRI marker */
    uint32_t size_estimate;         /* expected coded size (column-split mode only) */
    uint8_t component_specs[3][3];  /* per component: quant table, h, v */
} EncoderSettings;

/* Stream callback: receives consecutive pieces of the stream, each at most
 * 4096 bytes (an EXIF thumbnail comes in one piece of its own length). It
 * runs inside the encoding call; its result is not examined. */
typedef uint32_t (*EkoStreamCallback)(void* callback_arg, const uint8_t* data, uint32_t count);

/* ------------------------------------------------------------------------ */
/* EXIF description                                                          */
/* ------------------------------------------------------------------------ */

/* An APP1 segment is written after the JFIF header when ImageInfo.exif_info
 * is set. A field that is 0 (a rational with both words 0, a null string) is
 * left out unless said otherwise; the reserved words are never read. The
 * whole segment, thumbnail included, must stay within 65535 bytes
 * (EKO_ERR_TOO_LARGE otherwise). Strings are copied up to their NUL. */
typedef struct ExifRational {
    uint32_t numerator;
    uint32_t denominator;
} ExifRational;

typedef struct GpsInfo {
    uint32_t reserved0;
    char latitude_ref[4];       /* "N" or "S"; written only then */
    ExifRational latitude[3];   /* degrees, minutes, seconds */
    char longitude_ref[4];      /* "E" or "W"; written only then */
    ExifRational longitude[3];  /* degrees, minutes, seconds */
    uint8_t altitude_ref;       /* 0 above sea level, 1 below; other values: left out */
    uint8_t reserved1[3];
    ExifRational altitude;      /* metres */
    ExifRational time_stamp[3]; /* UTC hours, minutes, seconds */
    uint32_t reserved2;
    const char* processing_method; /* e.g. "GPS" or "NETWORK"; null: left out */
} GpsInfo;

typedef struct ExifInfo {
    uint32_t reserved0[5];
    const char* make;             /* camera maker */
    const char* model;            /* camera model */
    uint32_t orientation;         /* 1 upright, 3 turned 180, 6 turn 90 clockwise
                                     to view, 8 turn 90 anticlockwise (TIFF 1..8) */
    ExifRational x_resolution;    /* pixels per resolution unit, e.g. 72/1 */
    ExifRational y_resolution;
    uint32_t resolution_unit;     /* 2 inches, 3 centimetres */
    uint32_t reserved1;
    uint32_t ycbcr_positioning;   /* 1 centred, 2 co-sited */
    uint32_t reserved2;
    ExifRational exposure_time;   /* seconds, e.g. 1/125 */
    uint32_t reserved3;
    uint32_t stamp_date_time;     /* nonzero: DateTime = local time of the encode,
                                     "YYYY:MM:DD HH:MM:SS" */
    uint32_t reserved4;
    uint32_t flash;               /* EXIF Flash bits, e.g. 1 fired, 0x10 off (0: left out) */
    uint32_t reserved5[4];
    uint16_t white_balance;       /* 0 auto, 1 manual; always written */
    uint16_t reserved6;
    uint32_t reserved7[2];
    ExifRational focal_length;    /* millimetres */
    uint32_t iso_speed;           /* ISO speed rating */
    uint32_t reserved8[2];
    ExifRational f_number;        /* e.g. 28/10 for f/2.8 */
    uint32_t reserved9[3];
    uint32_t has_thumbnail;       /* nonzero: write IFD1 and append thumb_data */
    uint32_t thumb_width;         /* thumbnail pixels */
    uint32_t thumb_height;
    uint32_t thumb_compression;   /* 6 for a JPEG thumbnail (the usual value) */
    uint32_t reserved10;
    uint32_t thumb_length;        /* bytes at thumb_data: a complete JPEG stream */
    uint32_t reserved11[4];
    const uint8_t* thumb_data;    /* copied unchanged; the caller keeps ownership */
    ExifRational thumb_x_resolution;
    ExifRational thumb_y_resolution;
    const GpsInfo* gps;           /* null: no GPS block */
} ExifInfo;

/* ------------------------------------------------------------------------ */
/* Operating-system layer                                                    */
/* ------------------------------------------------------------------------ */

/* All memory and file access of the library goes through these (built in
 * over the C library; TEKOJ_EXTERNAL_OS_LAYER takes them from the decoder
 * library instead). Applications use them for the blocks and files they
 * exchange with the library: memory output blocks and kind-0 file handles.
 * Sizes are 32-bit: one block holds at most 4 GiB - 1. */
EKO_API void* DORVATEKO_OsMalloc(uint32_t size);
EKO_API void DORVATEKO_OsFree(void* block);
EKO_API void* DORVATEKO_OsRealloc(void* block, uint32_t size);
EKO_API void* DORVATEKO_OsMemcpy(void* dst, const void* src, uint32_t count);
EKO_API void* DORVATEKO_OsMemset(void* dst, int32_t value, uint32_t count);
EKO_API void* DORVATEKO_OsFopen(const char* path, const char* mode);
EKO_API uint32_t DORVATEKO_OsFwrite(const void* data, uint32_t size, uint32_t count, void* file);
EKO_API int32_t DORVATEKO_OsFclose(void* file);

/* ------------------------------------------------------------------------ */
/* Whole-image entry points                                                  */
/* ------------------------------------------------------------------------ */

/* One call codes the image (and its EXIF description) into a complete JPEG
 * stream: SOI, JFIF APP0, APP1 when exif_info is set, tables, frame header,
 * one scan with a restart marker after every MCU row, EOI. Members named _ex
 * take an EncodeOptions record, the others a bare quality.
 *
 * To a file: file_name is opened ("wb"), written and closed. Refused
 * arguments are caught before the open and leave no file; a file that cannot
 * be opened gives EKO_ERR_OPEN; after a later failure the file is closed but
 * not removed. The _full_buffer members take the handle in request->file
 * instead and close it too, in every case. */
EKO_API uint32_t eko_enc_jpeg_to_file(const ImageInfo* image_info, const char* file_name, uint32_t quality);
EKO_API uint32_t eko_enc_jpeg_to_file_ex(const ImageInfo* image_info, const char* file_name,
                                         const EncodeOptions* options);
EKO_API uint32_t eko_enc_jpeg_to_file_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                  uint32_t quality);
EKO_API uint32_t eko_enc_jpeg_to_file_ex_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                     const EncodeOptions* options);

/* To memory (band mode: see ImageInfo). *buffer_io holds a block from
 * DORVATEKO_OsMalloc and *length_io its size. The library grows the block as
 * needed (DORVATEKO_OsRealloc-style: the old block is freed) and on success
 * stores the block holding the stream in *buffer_io and the stream length in
 * *length_io; the caller frees it with DORVATEKO_OsFree.
 * eko_enc_jpeg_to_buffer first enlarges a block smaller than 2048 bytes
 * (a null block with length 0 is fine); a negative length is refused.
 *
 * Ownership of the memory block after the buffer members (and the request's
 * block of the _full_buffer members) return:
 *  - 1: the variables hold the stream's block, which may differ from the one
 *    passed in (that one has then been freed), and the stream's length; the
 *    caller frees the block with DORVATEKO_OsFree.
 *  - 0 with a non-null block: the call was refused or creation failed before
 *    any byte was written. The caller's variables are as they were, and the
 *    block is still the caller's. (eko_enc_jpeg_to_buffer first enlarges a
 *    block shorter than 2048 bytes; after that the variables hold the
 *    enlarged block and 2048.)
 *  - 0 with null and 0: the encode failed while writing (the block could not
 *    grow, or the stream outgrew its length field); the library has already
 *    freed the block. Nothing is left to free.
 * So a non-null block after any result is the caller's to free. */
EKO_API uint32_t eko_enc_jpeg_to_buffer(const ImageInfo* image_info, uint8_t** buffer_io, int32_t* length_io,
                                        uint32_t quality);
EKO_API uint32_t eko_enc_jpeg_to_buffer_ex(const ImageInfo* image_info, uint8_t** buffer_io, int32_t* length_io,
                                           const EncodeOptions* options);
/* As above with the block in request->buffer and its size in
 * request->capacity; on success request->buffer holds the stream's block and
 * request->capacity the stream length (not the block size). No band mode. */
EKO_API uint32_t eko_enc_jpeg_to_buffer_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                    uint32_t quality);
EKO_API uint32_t eko_enc_jpeg_to_buffer_ex_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                       const EncodeOptions* options);

/* To a callback (see EkoStreamCallback); nothing is allocated for the caller.
 * No band mode. eko_enc_jpeg_to_stream refuses a null callback_arg. */
EKO_API uint32_t eko_enc_jpeg_to_stream(const ImageInfo* image_info, EkoStreamCallback callback, uint32_t quality,
                                        void* callback_arg);
EKO_API uint32_t eko_enc_jpeg_to_stream_ex(const ImageInfo* image_info, EkoStreamCallback callback,
                                           const EncodeOptions* options, void* callback_arg);

/* ------------------------------------------------------------------------ */
/* MCU-row interface: one band per call                                      */
/* ------------------------------------------------------------------------ */

/* For images produced band by band. A band is 16 image rows (8 for grey, 8
 * for 4:2:2 settings); the stream carries JFIF but never EXIF.
 *
 * eko_jpeg_enc_mcu_init creates the encoder and writes the header. Output:
 * kind 1 takes a DORVATEKO_OsMalloc block that the encoder owns (and may
 * replace) until finish hands it back; kind 0 a handle the caller opened and
 * closes after finish (the C library may hold the stream's tail until then,
 * so a close that fails, a full disc for one, means the file is incomplete
 * even though finish reported the length); kind 4 needs
 * eko_jpeg_enc_mcu_set_stream before the first band. settings may be null
 * (4:2:0, or grey for EKO_FORMAT_GREY). Samplings whose rows do not fit the
 * band layout below (4:4:4, chroma doubled vertically) are accepted here
 * for the coefficient drivers and refused by the band calls (EKO_ERR_SAMPLING).
 *
 * eko_jpeg_enc_muc_process (and its twin eko_jpeg_enc_col_muc_process) codes
 * the next band, top to bottom, and stores the rows consumed so far in
 * *next_row_out; call it until that reaches the image height. For planar
 * and grey input `band` is one band laid out at fixed offsets whatever the
 * real number of rows (W = width, C = (W + 1) / 2):
 *   Y at 0 (16 rows of W bytes), U at 16 * W (8 rows of C), V at 16 * W + 8 * C.
 * Only the rows left in the image are read in the last band. For RGB formats
 * `band` is not read: the whole image must be at ImageInfo.data.
 *
 * eko_jpeg_enc_mcu__get_encdata reports the bytes produced so far that are
 * still in the encoder's buffer (kind 1: all of them) without taking them.
 *
 * eko_jpeg_enc_mcu_finish appends EOI, hands back the kind-1 block and the
 * stream length (either out-pointer may be null; the caller then frees the
 * block with DORVATEKO_OsFree) and releases the encoder; the context must not
 * be used again. After a failed encode it hands back null and 0 and has freed
 * the block itself. A null context is ignored. */
EKO_API EncoderContext* eko_jpeg_enc_mcu_init(const ImageInfo* image_info, const OutputRequest* output_request,
                                              const EncodeOptions* options, const EncoderSettings* settings);
EKO_API uint32_t eko_jpeg_enc_muc_process(EncoderContext* context, const uint8_t* band, uint32_t* next_row_out);
EKO_API uint32_t eko_jpeg_enc_col_muc_process(EncoderContext* context, const uint8_t* band,
                                              uint32_t* next_row_out);
EKO_API uint8_t* eko_jpeg_enc_mcu__get_encdata(EncoderContext* context, uint8_t** buffer_out,
                                               uint32_t* length_out);
EKO_API void eko_jpeg_enc_mcu_finish(EncoderContext* context, uint8_t** buffer_out, uint32_t* length_out);
/* Installs the stream callback (non-null) and its argument (may be null) on
 * a context created with kind 4. Refused (EKO_ERR_STATE) once anything has
 * been coded or handed on; band calls on a kind-4 context are refused until
 * it is installed. */
EKO_API uint32_t eko_jpeg_enc_mcu_set_stream(EncoderContext* context, EkoStreamCallback callback,
                                             void* callback_arg);

/* ------------------------------------------------------------------------ */
/* Row-parallel encoding                                                     */
/* ------------------------------------------------------------------------ */

/* One image coded by several of the caller's threads at once, into exactly
 * the stream that the whole-image entry points produce. Every MCU row is a
 * restart interval of its own, so rows are coded apart, each by one worker
 * into a row buffer of its own, and handed on in image order: a file or
 * stream target receives each row as soon as every earlier row is done, a
 * memory target gets each row appended once. The library starts no thread;
 * the caller's threads call eko_enc_jpeg_parallel_rows, each with its own
 * worker number.
 *
 * create: image_info (EXIF included; the band words are ignored), output
 *   (kind 0 with an open file, which the caller closes after finish; kind 1
 *   with a block from DORVATEKO_OsMalloc, which belongs to the encode until
 *   finish; kind 4 with `callback`, which then gets the stream in pieces of
 *   at most 4096 bytes, called from whichever worker thread hands rows on,
 *   one call at a time), options, settings (null, or an EncoderSettings
 *   record as for eko_jpeg_enc_mcu_init: with write_dri 0 the rows cannot be
 *   coded apart and are coded one after another in row order) and the number
 *   of workers, 1 to 64. All working memory is allocated here: each worker's
 *   sample rows and coefficient blocks, and a window of row buffers (two per
 *   worker, more for short rows); memory does not grow with the image
 *   height. Null on failure (the caller's block then still the caller's).
 * row_count: the number of MCU rows (16 image rows each for 4:2:0, 8 for
 *   grey), numbered from 0; 0 for a null encode.
 * rows: worker `worker` codes rows first_row .. first_row + row_count - 1.
 *   Calls with different workers may run at the same time; one worker is
 *   used by one call at a time (error 23 otherwise). A row more than a
 *   window ahead of the first row not yet handed on waits until it is, so
 *   hand the rows out in rising order (say, each thread taking the next row
 *   from a shared counter): a row waits only for rows that other calls have
 *   taken. Any failure (an allocation, a write, a row coded twice) fails the
 *   whole encode; every call then returns 0 as soon as it can.
 * finish: once every rows call has returned. Appends EOI after the last
 *   row, hands the memory stream over through buffer_out and length_out
 *   (null and 0 after a failure, the block then freed; both may be null for
 *   kinds 0 and 4) and frees the encode. Returns 1 when every row was coded
 *   and the stream is complete. */
typedef struct EkoParallelEncode EkoParallelEncode;

EKO_API EkoParallelEncode* eko_enc_jpeg_parallel_create(const ImageInfo* image_info, const OutputRequest* output,
                                                        const EncodeOptions* options,
                                                        const EncoderSettings* settings, EkoStreamCallback callback,
                                                        void* callback_arg, uint32_t workers);
EKO_API uint32_t eko_enc_jpeg_parallel_row_count(const EkoParallelEncode* encode);
EKO_API uint32_t eko_enc_jpeg_parallel_rows(EkoParallelEncode* encode, uint32_t worker, uint32_t first_row,
                                            uint32_t row_count);
EKO_API uint32_t eko_enc_jpeg_parallel_finish(EkoParallelEncode* encode, uint8_t** buffer_out,
                                              uint32_t* length_out);

/* ------------------------------------------------------------------------ */
/* Tables and conversions for display                                        */
/* ------------------------------------------------------------------------ */

/* The standard quantisation tables at the 15 built-in quality steps, natural
 * order (row 14 is the finest); a starting point for EncoderSettings. */
EKO_API extern const uint8_t eko_luminanceQuantTbl[15][64];
EKO_API extern const uint8_t eko_chrominanceQuantTbl[15][64];

/* YUV 4:2:0 to RGB565 for a preview. `source` is EKO_FORMAT_YUV420 layout
 * (eko_DuoYUV420toRGB565: U plane first) or the same with V before U
 * (eko_DuoPYV0420toRGB565); `destination` holds width * height 16-bit
 * pixels. Return 1, or 0 for a null pointer or a size below 1. */
EKO_API uint32_t eko_DuoYUV420toRGB565(const uint8_t* source, int32_t width, int32_t height, uint16_t* destination);
EKO_API uint32_t eko_DuoPYV0420toRGB565(const uint8_t* source, int32_t width, int32_t height,
                                        uint16_t* destination);

#ifdef __cplusplus
} /* extern "C" */
#endif

/* ------------------------------------------------------------------------ */
/* Word layout of the caller's records on 32-bit targets                     */
/* ------------------------------------------------------------------------ */

#if defined(__cplusplus)
#define EKO_LAYOUT_CHECK(cond, msg) static_assert(cond, msg)
#elif defined(__STDC_VERSION__) && __STDC_VERSION__ >= 201112L
#define EKO_LAYOUT_CHECK(cond, msg) _Static_assert(cond, msg)
#else
/* C99: a negative array size stops the build. */
#define EKO_LAYOUT_CHECK_CAT2(a, b) a##b
#define EKO_LAYOUT_CHECK_CAT(a, b) EKO_LAYOUT_CHECK_CAT2(a, b)
#define EKO_LAYOUT_CHECK(cond, msg) \
    typedef char EKO_LAYOUT_CHECK_CAT(eko_layout_check_, __LINE__)[(cond) ? 1 : -1]
#endif

#if defined(__SIZEOF_POINTER__) && __SIZEOF_POINTER__ == 4
EKO_LAYOUT_CHECK(sizeof(ImageInfo) == 40, "ImageInfo is ten words");
EKO_LAYOUT_CHECK(offsetof(ImageInfo, format) == 32 && offsetof(ImageInfo, exif_info) == 36, "ImageInfo words 8, 9");
EKO_LAYOUT_CHECK(sizeof(EncodeOptions) == 12, "EncodeOptions is three words");
EKO_LAYOUT_CHECK(sizeof(OutputRequest) == 16, "OutputRequest is four words");
EKO_LAYOUT_CHECK(offsetof(EncoderSettings, num_quant_tables) == 4, "EncoderSettings table count");
EKO_LAYOUT_CHECK(offsetof(EncoderSettings, quant_tables) == 8, "EncoderSettings tables");
EKO_LAYOUT_CHECK(offsetof(EncoderSettings, write_dri) == 272, "EncoderSettings write_dri");
EKO_LAYOUT_CHECK(offsetof(EncoderSettings, size_estimate) == 276, "EncoderSettings size_estimate");
EKO_LAYOUT_CHECK(offsetof(EncoderSettings, component_specs) == 280, "EncoderSettings component_specs");
EKO_LAYOUT_CHECK(sizeof(GpsInfo) == 104, "GpsInfo is 26 words");
EKO_LAYOUT_CHECK(offsetof(GpsInfo, processing_method) == 100, "GpsInfo processing_method");
EKO_LAYOUT_CHECK(sizeof(ExifInfo) == 220, "ExifInfo is 55 words");
EKO_LAYOUT_CHECK(offsetof(ExifInfo, make) == 20, "ExifInfo make");
EKO_LAYOUT_CHECK(offsetof(ExifInfo, white_balance) == 104, "ExifInfo white_balance");
EKO_LAYOUT_CHECK(offsetof(ExifInfo, has_thumbnail) == 156, "ExifInfo has_thumbnail");
EKO_LAYOUT_CHECK(offsetof(ExifInfo, thumb_data) == 196, "ExifInfo thumb_data");
EKO_LAYOUT_CHECK(offsetof(ExifInfo, gps) == 216, "ExifInfo gps");
#endif

#endif /* TEKOJ_ENCODER_H */
