/*
 * libTekoJEncoder: baseline JPEG encoder, C interface.
 *
 * Every record below is laid out word by word as the library's callers on
 * 32-bit ARM expect it: fields in their fixed order, fixed-width types, one
 * pointer per word. The layout checks at the end of this header hold whenever
 * pointers are 32 bits wide.
 *
 * Functions return 1 for success and 0 for failure (creation: a context or
 * null). The reason of the last failure on the calling thread can be read
 * with eko_GetLastError().
 */
#ifndef TEKOJ_ENCODER_H
#define TEKOJ_ENCODER_H

#include <stddef.h>
#include <stdint.h>

#if defined(_WIN32)
#define EKO_API __declspec(dllexport)
#else
#define EKO_API __attribute__((visibility("default")))
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* ------------------------------------------------------------------------ */
/* Error codes                                                               */
/* ------------------------------------------------------------------------ */

typedef enum EkoError {
    EKO_OK = 0,
    EKO_ERR_ALLOC = 3,        /* an allocation failed */
    EKO_ERR_FORMAT = 6,       /* pixel format code not accepted */
    EKO_ERR_SAMPLING = 7,     /* component count, sampling or tables not supported */
    EKO_ERR_DIMENSIONS = 14,  /* width or height outside 1..49999 */
    EKO_ERR_ARGUMENT = 20,    /* a null pointer or an out-of-range argument */
    EKO_ERR_WRITE = 21,       /* the file refused bytes (disc full, I/O error) */
    EKO_ERR_TOO_LARGE = 22,   /* the stream or a segment exceeds its length field */
    EKO_ERR_STATE = 23,       /* call out of order (e.g. a band after the last) */
    EKO_ERR_OPEN = 24         /* the output file could not be opened */
} EkoError;

/* ------------------------------------------------------------------------ */
/* Input format codes                                                        */
/* ------------------------------------------------------------------------ */

enum {
    EKO_FORMAT_RGB565 = 0,   /* little-endian 16-bit words, 5-6-5 */
    EKO_FORMAT_RGB888 = 1,   /* bytes R, G, B */
    EKO_FORMAT_YUV420 = 2,   /* planar Y, U, V in one buffer */
    EKO_FORMAT_GREY = 4,     /* one 8-bit plane */
    EKO_FORMAT_RGBA8888 = 7, /* bytes R, G, B, A */
    EKO_FORMAT_BGRA8888 = 8  /* bytes B, G, R, A */
};

enum {
    EKO_OUTPUT_FILE = 0,
    EKO_OUTPUT_MEMORY = 1,
    EKO_OUTPUT_STREAM = 4
};

/* ------------------------------------------------------------------------ */
/* Caller records                                                            */
/* ------------------------------------------------------------------------ */

struct ExifInfo;
struct EncoderContext;

typedef struct ImageInfo {
    int32_t width;
    int32_t height;
    const void* data;
    uint32_t band_mode;
    uint32_t band_continued;
    uint32_t band_open_end;
    int32_t total_height;
    int32_t band_top_row;
    uint32_t format; /* only the low byte counts */
    const struct ExifInfo* exif_info;
} ImageInfo;

typedef struct EncodeOptions {
    uint32_t quality;
    const uint32_t* extra; /* null, or two words the encoder ignores */
    uint32_t reserved;     /* never read */
} EncodeOptions;

typedef struct OutputRequest {
    uint32_t kind;     /* EKO_OUTPUT_FILE, EKO_OUTPUT_MEMORY or EKO_OUTPUT_STREAM */
    void* file;        /* kind 0: a handle from DORVATEKO_OsFopen */
    uint8_t* buffer;   /* kind 1: a block from DORVATEKO_OsMalloc */
    uint32_t capacity; /* kind 1: its size in bytes */
} OutputRequest;

typedef struct EncoderSettings {
    uint8_t num_components;
    uint8_t reserved0[3];
    int32_t num_quant_tables;
    uint8_t quant_tables[4][64]; /* natural order */
    uint8_t reserved1[8];
    uint32_t write_dri;
    uint32_t size_estimate;
    uint8_t component_specs[3][3]; /* (quant table, h, v) per component */
} EncoderSettings;

/* Stream callback: receives consecutive pieces of the stream. Its result is
 * not examined. */
typedef uint32_t (*EkoStreamCallback)(void* callback_arg, const uint8_t* data, uint32_t count);

/* ------------------------------------------------------------------------ */
/* EXIF description                                                          */
/* ------------------------------------------------------------------------ */

typedef struct ExifRational {
    uint32_t numerator;
    uint32_t denominator;
} ExifRational;

typedef struct GpsInfo {
    uint32_t reserved0;
    char latitude_ref[4];
    ExifRational latitude[3];
    char longitude_ref[4];
    ExifRational longitude[3];
    uint8_t altitude_ref;
    uint8_t reserved1[3];
    ExifRational altitude;
    ExifRational time_stamp[3];
    uint32_t reserved2;
    const char* processing_method;
} GpsInfo;

typedef struct ExifInfo {
    uint32_t reserved0[5];
    const char* make;
    const char* model;
    uint32_t orientation;
    ExifRational x_resolution;
    ExifRational y_resolution;
    uint32_t resolution_unit;
    uint32_t reserved1;
    uint32_t ycbcr_positioning;
    uint32_t reserved2;
    ExifRational exposure_time;
    uint32_t reserved3;
    uint32_t stamp_date_time;
    uint32_t reserved4;
    uint32_t flash;
    uint32_t reserved5[4];
    uint16_t white_balance;
    uint16_t reserved6;
    uint32_t reserved7[2];
    ExifRational focal_length;
    uint32_t iso_speed;
    uint32_t reserved8[2];
    ExifRational f_number;
    uint32_t reserved9[3];
    uint32_t has_thumbnail;
    uint32_t thumb_width;
    uint32_t thumb_height;
    uint32_t thumb_compression;
    uint32_t reserved10;
    uint32_t thumb_length;
    uint32_t reserved11[4];
    const uint8_t* thumb_data;
    ExifRational thumb_x_resolution;
    ExifRational thumb_y_resolution;
    const GpsInfo* gps;
} ExifInfo;

/* ------------------------------------------------------------------------ */
/* Encoder records (owned by the library, exposed for the exported steps)    */
/* ------------------------------------------------------------------------ */

typedef struct OutputTarget {
    uint32_t kind;
    uint32_t capacity;
    uint32_t used;
    uint32_t total;
    void* file;
    uint8_t* buffer;
    EkoStreamCallback callback;
    void* callback_arg;
} OutputTarget;

typedef struct ComponentInfo {
    uint8_t component_id;
    uint8_t component_index;
    uint8_t h_samp_factor;
    uint8_t v_samp_factor;
    uint8_t quant_tbl_no;
    uint8_t dc_tbl_no;
    uint8_t ac_tbl_no;
    uint32_t width_in_blocks;
    uint32_t height_in_blocks;
    uint32_t downsampled_width;
    uint32_t downsampled_height;
    uint32_t padded_width;
    uint32_t padded_height;
    uint32_t band_rows;
    uint32_t rows_this_band;
    uint32_t mcu_width;
    uint32_t mcu_height;
    uint32_t mcu_blocks;
    uint32_t mcu_sample_width;
    uint32_t last_col_width;
    uint32_t last_row_height;
} ComponentInfo;

typedef struct McuState {
    uint32_t imcu_row;
    uint32_t mcu_ctr;
    uint32_t mcu_vert_offset;
    uint32_t mcu_rows_per_imcu_row;
    int16_t* mcu_buffer[10];
} McuState;

typedef struct SampleRowSet {
    uint32_t band_counter;
    uint32_t band_flag;
    uint8_t** row_arrays[3];
} SampleRowSet;

typedef struct HuffmanSpec {
    uint8_t bits[17];
    uint8_t huffval[256];
} HuffmanSpec;

typedef struct DcCodeTable {
    uint16_t code[15];
    uint8_t size[15];
} DcCodeTable;

typedef struct AcCodeTable {
    uint16_t code[256];
    uint8_t size[256];
} AcCodeTable;

typedef struct EntropyState {
    uint32_t put_buffer;
    int32_t put_bits;
    int32_t last_dc_val[3];
    DcCodeTable* dc_codes[2];
    AcCodeTable* ac_codes[2];
} EntropyState;

typedef struct WorkingState {
    uint32_t put_buffer;
    int32_t put_bits;
    int32_t last_dc_val[3];
    struct EncoderContext* context;
} WorkingState;

/* Ten pointers to the coefficient blocks of one MCU, in MCU block order. */
typedef struct McuBlockList {
    int16_t* blocks[10];
} McuBlockList;

typedef struct RowStream {
    OutputTarget* row_target;
    uint32_t saved_state[5];
} RowStream;

/* Start row, start column and block count of a forward-transform call. */
typedef struct BlockPosition {
    uint32_t start_row;
    uint32_t start_col;
    uint32_t block_count;
} BlockPosition;

/* Output cursor of the 4:2:0 row writer of the down-scaler. */
typedef struct Yuv420Cursor {
    uint8_t* y;
    uint8_t* u;
    uint8_t* v;
} Yuv420Cursor;

typedef struct EncoderContext {
    int32_t width;
    int32_t height;
    uint8_t num_components;
    uint8_t max_h_samp;
    uint8_t max_v_samp;
    uint8_t format;
    uint32_t total_imcu_rows;
    uint16_t next_row;
    uint8_t default_sampling[6];
    uint32_t mcus_per_row;
    uint32_t mcu_rows_in_scan;
    uint8_t blocks_in_mcu;
    uint8_t comps_in_scan;
    uint32_t quality;
    ComponentInfo* comp_info;
    ComponentInfo* cur_comp_info[3];
    uint32_t* divisors[4];
    uint32_t* quant_tbl[4];
    HuffmanSpec* dc_spec[2];
    HuffmanSpec* ac_spec[2];
    uint32_t mcu_membership[10];
    SampleRowSet* sample_rows;
    McuState* mcu_state;
    EntropyState* entropy;
    OutputTarget* output;
    uint8_t nbits_table[4096];
    const uint8_t* plane_y;
    const uint8_t* plane_u;
    const uint8_t* plane_v;
    const uint8_t* read_ptr;
    uint8_t* natural_order;
    const ExifInfo* exif_info;
    uint8_t* work_buffer;
    uint32_t has_settings;
    uint32_t restart_index;
    int32_t restart_mcu_count;
    uint32_t restart_interval;
    const EncoderSettings* settings;
    RowStream** columns;
    uint32_t col_next_row;
    OutputTarget* saved_output;
    /* Library-private bookkeeping, after every documented field. */
    uint32_t failed;           /* error code that stopped this encode, 0 while healthy */
    uint32_t restart_suspended; /* nonzero: the block coder inserts no restart markers */
    uint32_t finished;          /* nonzero once the stream has been completed */
} EncoderContext;

/* ------------------------------------------------------------------------ */
/* Operating-system layer (built in by default; see TEKOJ_EXTERNAL_OS_LAYER) */
/* ------------------------------------------------------------------------ */

EKO_API void* DORVATEKO_OsMalloc(uint32_t size);
EKO_API void DORVATEKO_OsFree(void* block);
EKO_API void* DORVATEKO_OsRealloc(void* block, uint32_t size);
EKO_API void* DORVATEKO_OsMemcpy(void* dst, const void* src, uint32_t count);
EKO_API void* DORVATEKO_OsMemset(void* dst, int32_t value, uint32_t count);
EKO_API void* DORVATEKO_OsFopen(const char* path, const char* mode);
EKO_API uint32_t DORVATEKO_OsFwrite(const void* data, uint32_t size, uint32_t count, void* file);
EKO_API int32_t DORVATEKO_OsFclose(void* file);

/* ------------------------------------------------------------------------ */
/* Errors                                                                    */
/* ------------------------------------------------------------------------ */

EKO_API void eko_SetError(uint32_t code);
/* The reason of the last call on the calling thread: every exported call
 * that can fail starts from EKO_OK, so after a success this is 0 and after a
 * failure the code belongs to that call. */
EKO_API uint32_t eko_GetLastError(void);

/* ------------------------------------------------------------------------ */
/* Whole-image entry points                                                  */
/* ------------------------------------------------------------------------ */

EKO_API uint32_t eko_enc_jpeg_to_file(const ImageInfo* image_info, const char* file_name, uint32_t quality);
EKO_API uint32_t eko_enc_jpeg_to_file_ex(const ImageInfo* image_info, const char* file_name,
                                         const EncodeOptions* options);
EKO_API uint32_t eko_enc_jpeg_to_file_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                  uint32_t quality);
EKO_API uint32_t eko_enc_jpeg_to_file_ex_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                     const EncodeOptions* options);
/* Ownership of the memory block after the buffer members (and the request's
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
EKO_API uint32_t eko_enc_jpeg_to_buffer_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                    uint32_t quality);
EKO_API uint32_t eko_enc_jpeg_to_buffer_ex_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                       const EncodeOptions* options);
EKO_API uint32_t eko_enc_jpeg_to_stream(const ImageInfo* image_info, EkoStreamCallback callback, uint32_t quality,
                                        void* callback_arg);
EKO_API uint32_t eko_enc_jpeg_to_stream_ex(const ImageInfo* image_info, EkoStreamCallback callback,
                                           const EncodeOptions* options, void* callback_arg);

/* ------------------------------------------------------------------------ */
/* MCU-row interface                                                         */
/* ------------------------------------------------------------------------ */

/* A successful init owns the memory block of a kind-1 request until
 * eko_jpeg_enc_mcu_finish hands the stream back (null and 0 when the encode
 * failed, the block then released). */
EKO_API EncoderContext* eko_jpeg_enc_mcu_init(const ImageInfo* image_info, const OutputRequest* output_request,
                                              const EncodeOptions* options, const EncoderSettings* settings);
EKO_API uint32_t eko_jpeg_enc_muc_process(EncoderContext* context, const uint8_t* band, uint32_t* next_row_out);
EKO_API uint32_t eko_jpeg_enc_col_muc_process(EncoderContext* context, const uint8_t* band,
                                              uint32_t* next_row_out);
EKO_API uint8_t* eko_jpeg_enc_mcu__get_encdata(EncoderContext* context, uint8_t** buffer_out,
                                               uint32_t* length_out);
EKO_API void eko_jpeg_enc_mcu_finish(EncoderContext* context, uint8_t** buffer_out, uint32_t* length_out);
/* Installs the stream callback (non-null) and its argument (may be null) on
 * a context created with kind 4. Refused (error 23) once anything has been
 * coded or handed on; band, driver and column-split calls on a kind-4 context
 * are refused until it is installed. */
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

/* Row entropy drivers and column-split mode. */
EKO_API uint32_t __eko_jpeg_enc_entroy_encoder(EncoderContext* context, McuBlockList* mcus,
                                               uint32_t* next_row_out);
EKO_API uint32_t __OvidanJpegEncEntroyEncoder(EncoderContext* context, McuBlockList* mcus,
                                              uint32_t* next_row_out);
EKO_API uint32_t __eko_jpeg_enc_col_encoder_init(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_col_entroy_encoder(EncoderContext* context, McuBlockList* mcus,
                                                   uint32_t* next_col_out);
EKO_API uint32_t __eko_jpeg_enc_col_encoder_finish(EncoderContext* context);

/* ------------------------------------------------------------------------ */
/* Encoder lifecycle and output target                                       */
/* ------------------------------------------------------------------------ */

EKO_API EncoderContext* __eko_jpeg_enc_initiaize(const ImageInfo* image_info, const OutputRequest* output_request,
                                                 const EncodeOptions* options, const EncoderSettings* settings);
EKO_API uint32_t __eko_jpeg_enc_initail_setup(EncoderContext* context);
EKO_API void __eko_jpeg_enc_release_mem(EncoderContext* context);

EKO_API void __eko_jpeg_enc_write_2bytes(OutputTarget* target, const void* value);
EKO_API void __eko_jpeg_enc_write_4bytes(OutputTarget* target, const void* first, const void* second);
EKO_API uint8_t* eko_jpeg_enc_realloc(uint8_t* old_block, uint32_t old_size, uint32_t extra_size);

EKO_API uint32_t __eko_jpeg_enc_finish_compression(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_make_end_mark(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_make_without_end_mark(EncoderContext* context);

/* ------------------------------------------------------------------------ */
/* Coding core                                                               */
/* ------------------------------------------------------------------------ */

EKO_API extern const uint8_t eko_luminanceQuantTbl[15][64];
EKO_API extern const uint8_t eko_chrominanceQuantTbl[15][64];

EKO_API uint32_t __eko_jpeg_enc_set_quality(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_set_quant_table(EncoderContext* context, const uint8_t* table, uint32_t slot);

EKO_API uint32_t __eko_jpeg_enc_prepare_huffman_code(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_set_huffman_spec_tbl(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_create_huffman_tbl(EncoderContext* context, const uint8_t* bits,
                                                   const uint8_t* values, HuffmanSpec** slot);
EKO_API uint32_t __eko_jpeg_enc_prepare_derived_tbl(EncoderContext* context, uint32_t table, AcCodeTable** slot);

EKO_API void __eko_jpeg_enc_do_forward_dct(const uint32_t* divisors, void* spare, uint8_t* const* rows,
                                           int16_t* output, BlockPosition* position);

EKO_API uint32_t __eko_jpeg_enc_write_bits(WorkingState* state, uint32_t value, uint32_t size);
EKO_API uint32_t __eko_jpeg_enc_encode_1mcu_blk(EncoderContext* context, int16_t* const* blocks);
EKO_API uint32_t __eko_jpeg_write_restart_marker(EncoderContext* context, WorkingState* state);

EKO_API uint32_t __eko_jpeg_enc_set_component_info(EncoderContext* context, uint32_t index, uint32_t id, uint8_t h,
                                                   uint8_t v, uint8_t quant_tbl_no, uint8_t dc_tbl_no,
                                                   uint8_t ac_tbl_no);
EKO_API uint32_t __eko_jpeg_enc_setup_scan(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_setup_imcu(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_compress_data(EncoderContext* context, uint8_t** const* row_arrays);
EKO_API uint32_t __eko_jpeg_enc_process_image_data(EncoderContext* context);

EKO_API uint32_t __eko_jpeg_enc_make_header(EncoderContext* context);
EKO_API void __eko_jpeg_enc_write_app0_marker(EncoderContext* context);
EKO_API void __eko_jpeg_enc_write_dqt_marker(EncoderContext* context, uint32_t table);
EKO_API void __eko_jpeg_enc_write_sof_marker(EncoderContext* context);
EKO_API void __eko_jpeg_enc_write_dht_marker(EncoderContext* context, uint32_t table, uint32_t is_ac);
EKO_API void __eko_jpeg_enc_write_sos_marker(EncoderContext* context);

/* ------------------------------------------------------------------------ */
/* Pixel input                                                               */
/* ------------------------------------------------------------------------ */

EKO_API uint8_t** __eko_jpeg_enc_alloc_sample_arry(EncoderContext* context, uint32_t row_length,
                                                   uint32_t row_count);
EKO_API uint32_t __eko_jpeg_enc_get_raw_data(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_get_raw_pvu_data(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_get_raw_duoview422_data(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_get_raw_rgb565_data(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_get_raw_rgb888_data(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_get_raw_rgba8888_data(EncoderContext* context);
EKO_API uint32_t __eko_jpeg_enc_get_raw_bgra8888_data(EncoderContext* context);

EKO_API void __eko_jpeg_enc_down_scale_yuv422(const uint8_t* source, int32_t source_width, int32_t source_height,
                                              int32_t source_stride, uint8_t* destination,
                                              int32_t destination_width, int32_t destination_height);
EKO_API void __eko_jpeg_enc_write_yuv_to_yuv420(const uint32_t* words, int32_t count, Yuv420Cursor* cursor,
                                                int32_t row_index);

/* ------------------------------------------------------------------------ */
/* EXIF                                                                      */
/* ------------------------------------------------------------------------ */

EKO_API void __eko_WriteSHORT_LE(uint8_t* p, uint32_t value);
EKO_API void __eko_WriteLONG_LE(uint8_t* p, uint32_t value);
EKO_API void __eko_WriteRATIONAL(uint8_t* p, uint32_t numerator, uint32_t denominator);
EKO_API void __eko_WriteASCII(uint8_t* dst, const void* src, uint32_t count);
EKO_API void __eko_WriteUNDEFINED(uint8_t* dst, const void* src, uint32_t count);
EKO_API uint32_t __eko_WriteASCII_String(uint8_t* dst, const char* src);
EKO_API uint32_t __eko_GetStringSize(const char* s);
EKO_API uint8_t* __eko_WriteSHORTTag(uint8_t* base, uint8_t* entry, uint32_t tag, uint32_t value);
EKO_API uint8_t* __eko_WriteLONGTag(uint8_t* base, uint8_t* entry, uint32_t tag, uint32_t value);
EKO_API uint8_t* __eko_WriteRATIONALTag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag,
                                        uint32_t numerator, uint32_t denominator);
EKO_API uint8_t* __eko_WriteGPSInfoTag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag,
                                       const uint32_t* values, uint32_t count);
EKO_API uint8_t* __eko_WriteASCIITag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag,
                                     const char* string);
EKO_API uint8_t* __eko_WriteBYTESTag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag,
                                     const uint8_t* data, uint32_t count);
EKO_API void __eko_WriteUNDEFINEDTag(uint8_t* base, uint8_t* entry, uint32_t* data_offset, uint32_t tag,
                                     const uint8_t* data, uint32_t count);
EKO_API uint32_t __eko_CreateExif(uint8_t* dst, const ExifInfo* exif);
EKO_API void __eko_jpeg_enc_write_app1_marker(EncoderContext* context);

/* ------------------------------------------------------------------------ */
/* Display conversion                                                        */
/* ------------------------------------------------------------------------ */

EKO_API extern const int32_t eko_EnCrrTab[256];
EKO_API extern const int32_t eko_EnCbbTab[256];
EKO_API extern const int32_t eko_EnCrgTab[256];
EKO_API extern const int32_t eko_EnCbgTab[256];
EKO_API extern const uint8_t eko_EnRangeTalbe[1024];

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
#else
#define EKO_LAYOUT_CHECK(cond, msg) _Static_assert(cond, msg)
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
EKO_LAYOUT_CHECK(sizeof(OutputTarget) == 32, "OutputTarget is eight words");
EKO_LAYOUT_CHECK(sizeof(WorkingState) == 24, "WorkingState is six words");
EKO_LAYOUT_CHECK(sizeof(McuBlockList) == 40, "McuBlockList is ten pointers");
EKO_LAYOUT_CHECK(sizeof(RowStream) == 24, "RowStream is six words");
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
