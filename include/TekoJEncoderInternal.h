/*
 * libTekoJEncoder: the exported internal steps.
 *
 * Applications need only <TekoJEncoder.h>. This header adds the encoder's
 * working records (the full EncoderContext among them) and every coding step
 * that the library exports under its __eko_ name: creation and release, the
 * byte writers, tables, transform, entropy coder, band driver, header writer,
 * the input readers that no format code selects, the down-scaler, the EXIF
 * writers and the column-split drivers. They are for callers that assemble an
 * encode from its steps (and for the library's own sources); their contracts
 * are those of a single encode on one context and they check little.
 */
#ifndef TEKOJ_ENCODER_INTERNAL_H
#define TEKOJ_ENCODER_INTERNAL_H

#include "TekoJEncoder.h"

#ifdef __cplusplus
extern "C" {
#endif

/* ------------------------------------------------------------------------ */
/* Encoder records (owned by the library)                                    */
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

struct EncoderContext {
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
    struct EkoCoderTables* coder_tables; /* the block coder's read-only tables */
};

/* Error hook: records the code that eko_GetLastError() reports. */
EKO_API void eko_SetError(uint32_t code);

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
/* Display conversion tables                                                 */
/* ------------------------------------------------------------------------ */

EKO_API extern const int32_t eko_EnCrrTab[256];
EKO_API extern const int32_t eko_EnCbbTab[256];
EKO_API extern const int32_t eko_EnCrgTab[256];
EKO_API extern const int32_t eko_EnCbgTab[256];
EKO_API extern const uint8_t eko_EnRangeTalbe[1024];

#ifdef __cplusplus
} /* extern "C" */
#endif

#if defined(__SIZEOF_POINTER__) && __SIZEOF_POINTER__ == 4
EKO_LAYOUT_CHECK(sizeof(OutputTarget) == 32, "OutputTarget is eight words");
EKO_LAYOUT_CHECK(sizeof(WorkingState) == 24, "WorkingState is six words");
EKO_LAYOUT_CHECK(sizeof(McuBlockList) == 40, "McuBlockList is ten pointers");
EKO_LAYOUT_CHECK(sizeof(RowStream) == 24, "RowStream is six words");
#endif

#endif /* TEKOJ_ENCODER_INTERNAL_H */
