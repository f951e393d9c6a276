// Header writer: SOI, JFIF APP0, (EXIF APP1), DQT, SOF0, DHT, DRI and SOS.
#include "core/header_writer.h"

#include "core/entropy_coder.h"
#include "exif/exif_block.h"
#include "sink/output_target.h"

namespace tekoj {
namespace {

constexpr uint8_t kApp0[18] = {0xFF, 0xE0, 0x00, 0x10, 'J', 'F', 'I', 'F', 0x00, 0x01,
                               0x01, 0x00, 0x00, 0x01, 0x00, 0x01, 0x00, 0x00};

// Everything after APP1: four DQT (69 bytes each), SOF0 (17), four DHT (at
// most 183 each), DRI (6) and SOS (14) stay well below this.
constexpr uint32_t kHeaderTailRoom = 1280;

void put_marker(OutputTarget* t, uint32_t code, uint32_t length) {
    put_u16(t, code);
    put_u16(t, length);
}

void write_app0(EncoderContext* context) {
    OutputTarget* t = context->output;
    DORVATEKO_OsMemcpy(t->buffer + t->used, kApp0, sizeof kApp0);
    t->used += sizeof kApp0;
}

void write_dqt(EncoderContext* context, uint32_t table) {
    OutputTarget* t = context->output;
    put_marker(t, 0xFFDB, 67);
    put_byte(t, table);
    const uint32_t* q = context->quant_tbl[table];
    for (int k = 0; k < 64; ++k) put_byte(t, q[context->natural_order[k]] & 0xFF);
}

void write_sof(EncoderContext* context) {
    OutputTarget* t = context->output;
    put_marker(t, 0xFFC0, 8 + 3u * context->num_components);
    put_byte(t, 8);
    put_u16(t, static_cast<uint32_t>(context->height));
    put_u16(t, static_cast<uint32_t>(context->width));
    put_byte(t, context->num_components);
    for (uint32_t c = 0; c < context->num_components; ++c) {
        const ComponentInfo& comp = context->comp_info[c];
        put_byte(t, comp.component_id);
        put_byte(t, (comp.h_samp_factor << 4) + comp.v_samp_factor);
        put_byte(t, comp.quant_tbl_no);
    }
}

void write_dht(EncoderContext* context, uint32_t table, uint32_t is_ac) {
    OutputTarget* t = context->output;
    const HuffmanSpec* spec = is_ac ? context->ac_spec[table] : context->dc_spec[table];
    uint32_t symbols = 0;
    for (int l = 1; l <= 16; ++l) symbols += spec->bits[l];
    put_marker(t, 0xFFC4, 19 + symbols);
    put_byte(t, is_ac ? 16 + table : table);
    DORVATEKO_OsMemcpy(t->buffer + t->used, spec->bits + 1, 16);
    t->used += 16;
    DORVATEKO_OsMemcpy(t->buffer + t->used, spec->huffval, symbols);
    t->used += symbols;
}

void write_sos(EncoderContext* context) {
    OutputTarget* t = context->output;
    put_marker(t, 0xFFDA, 6 + 2u * context->num_components);
    put_byte(t, context->comps_in_scan);
    for (uint32_t c = 0; c < context->comps_in_scan; ++c) {
        const ComponentInfo* comp = context->cur_comp_info[c];
        put_byte(t, comp->component_id);
        put_byte(t, (comp->dc_tbl_no << 4) + comp->ac_tbl_no);
    }
    put_byte(t, 0);
    put_byte(t, 63);
    put_byte(t, 0);
}

}  // namespace

uint32_t write_header(EncoderContext* context) {
    EncoderContext* ctx = context;
    // A memory target may start with less room than the header needs (or no
    // block at all): make the room before writing instead of trusting it.
    if (!ensure_room(ctx, 2 + sizeof kApp0)) return 0;
    put_u16(ctx->output, 0xFFD8);
    write_app0(ctx);
    write_app1(ctx);
    if (ctx->failed != 0 || !ensure_room(ctx, kHeaderTailRoom)) return 0;

    if (ctx->num_components == 1) {
        write_dqt(ctx, 0);
        write_sof(ctx);
        write_dht(ctx, 0, 0);
        write_dht(ctx, 0, 1);
    } else {
        const int32_t tables = ctx->has_settings ? ctx->settings->num_quant_tables : 2;
        for (int32_t q = 0; q < tables; ++q) write_dqt(ctx, static_cast<uint32_t>(q));
        write_sof(ctx);
        write_dht(ctx, 0, 0);
        write_dht(ctx, 0, 1);
        write_dht(ctx, 1, 0);
        write_dht(ctx, 1, 1);
    }
    uint32_t dri = 0;
    if (ctx->has_settings) {
        dri = ctx->settings->write_dri != 0 ? ctx->mcus_per_row : 0;
    } else {
        dri = ctx->restart_interval;
    }
    if (dri != 0) {
        put_marker(ctx->output, 0xFFDD, 4);
        put_u16(ctx->output, dri);
    }
    write_sos(ctx);
    return 1;
}

}  // namespace tekoj

extern "C" {

EKO_API void __eko_jpeg_enc_write_app0_marker(EncoderContext* context) { tekoj::write_app0(context); }
EKO_API void __eko_jpeg_enc_write_dqt_marker(EncoderContext* context, uint32_t table) {
    tekoj::write_dqt(context, table);
}
EKO_API void __eko_jpeg_enc_write_sof_marker(EncoderContext* context) { tekoj::write_sof(context); }
EKO_API void __eko_jpeg_enc_write_dht_marker(EncoderContext* context, uint32_t table, uint32_t is_ac) {
    tekoj::write_dht(context, table, is_ac);
}
EKO_API void __eko_jpeg_enc_write_sos_marker(EncoderContext* context) { tekoj::write_sos(context); }
EKO_API uint32_t __eko_jpeg_enc_make_header(EncoderContext* context) { return tekoj::write_header(context); }

}  // extern "C"
