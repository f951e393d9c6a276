// Encoder context: creation validates the caller's records and allocates
// every working buffer of one encode; release frees them again.
#include "api/context.h"
#include "sink/output_target.h"
#include "core/band_driver.h"
#include "core/entropy_coder.h"
#include "core/huffman_tables.h"
#include "core/quant_tables.h"
#include "input/formats.h"

namespace tekoj {
namespace {

constexpr int32_t kMaxDimension = 49999;

// An EncoderSettings record must describe a geometry the readers and the
// transform can serve: 1 or 3 components, factors of at least 1, at most
// four tables with non-zero entries, every component naming an installed
// table, and a component count the format's reader fills.
bool settings_usable(const EncoderContext* ctx) {
    const EncoderSettings* s = ctx->settings;
    const uint32_t n = s->num_components;
    if (n != 1 && n != 3) return false;
    if (s->num_quant_tables > 4) return false;
    const int32_t tables = s->num_quant_tables < 0 ? 0 : s->num_quant_tables;
    for (int32_t t = 0; t < tables; ++t)
        for (int i = 0; i < 64; ++i)
            if (s->quant_tables[t][i] == 0) return false;
    for (uint32_t c = 0; c < n; ++c) {
        const uint8_t* spec = s->component_specs[c];
        if (spec[0] >= tables) return false;
        // A single component's header carries table 0 alone (see the header
        // writer), so a component naming another table would be undecodable.
        if (n == 1 && spec[0] != 0) return false;
        if (n == 3 && (spec[1] == 0 || spec[2] == 0)) return false;
    }
    if (ctx->format == EKO_FORMAT_GREY && n != 1) return false;
    if (format_traits(ctx->format)->rgb) {
        // The RGB readers produce 4:2:0 samples only.
        if (n != 3) return false;
        const uint8_t(*c)[3] = s->component_specs;
        if (c[0][1] != 2 || c[0][2] != 2 || c[1][1] != 1 || c[1][2] != 1 || c[2][1] != 1 || c[2][2] != 1)
            return false;
    }
    return true;
}

}  // namespace

bool allocate_band_rows(EncoderContext* ctx) {
    for (uint32_t c = 0; c < ctx->num_components && c < 3; ++c) {
        const ComponentInfo& comp = ctx->comp_info[c];
        const uint32_t row_length = comp.width_in_blocks * ctx->max_h_samp * 8u / comp.h_samp_factor;
        ctx->sample_rows->row_arrays[c] = __eko_jpeg_enc_alloc_sample_arry(ctx, row_length, comp.band_rows);
        if (ctx->sample_rows->row_arrays[c] == nullptr) return false;
    }
    return true;
}

void release_band_rows(EncoderContext* ctx) {
    for (uint32_t c = 0; c < ctx->num_components && c < 3; ++c) {
        // The row array and its rows are one block.
        uint8_t** rows = ctx->sample_rows->row_arrays[c];
        if (rows != nullptr) DORVATEKO_OsFree(rows);
        ctx->sample_rows->row_arrays[c] = nullptr;
    }
}

void discard_context(EncoderContext* ctx) {
    if (ctx->work_buffer != nullptr) DORVATEKO_OsFree(ctx->work_buffer);
    ctx->work_buffer = nullptr;
    tekoj::release_buffers(ctx);
    DORVATEKO_OsFree(ctx);
}

}  // namespace tekoj

namespace tekoj {

EncoderContext* create_context(const ImageInfo* image_info, const OutputRequest* output_request,
                               const EncodeOptions* options, const EncoderSettings* settings) {
    eko_SetError(EKO_OK);
    if (image_info == nullptr || output_request == nullptr || options == nullptr) {
        eko_SetError(EKO_ERR_ARGUMENT);
        return nullptr;
    }
    const uint32_t kind = output_request->kind;
    if (kind != EKO_OUTPUT_FILE && kind != EKO_OUTPUT_MEMORY && kind != EKO_OUTPUT_STREAM) {
        eko_SetError(EKO_ERR_ARGUMENT);
        return nullptr;
    }

    auto* ctx = static_cast<EncoderContext*>(DORVATEKO_OsMalloc(sizeof(EncoderContext)));
    if (ctx == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return nullptr;
    }
    DORVATEKO_OsMemset(ctx, 0, sizeof(EncoderContext));
    if (settings != nullptr) {
        ctx->settings = settings;
        ctx->has_settings = 1;
    }
    ctx->width = image_info->width;
    ctx->height = image_info->height;
    ctx->format = static_cast<uint8_t>(image_info->format & 0xFF);
    ctx->quality = options->quality;
    static constexpr uint8_t kDefaultSampling[6] = {2, 2, 1, 1, 1, 1};
    for (int i = 0; i < 6; ++i) ctx->default_sampling[i] = kDefaultSampling[i];
    const auto* data = static_cast<const uint8_t*>(image_info->data);
    ctx->read_ptr = data;

    const FormatTraits* format = format_traits(ctx->format);
    if (format == nullptr) {
        eko_SetError(EKO_ERR_FORMAT);
        DORVATEKO_OsFree(ctx);
        return nullptr;
    }
    ctx->num_components = ctx->comps_in_scan = format->components;
    if (format->planar) {
        ctx->plane_y = data;
        if (format->components == 3) {
            // Offsets in the platform's size type: 49999 x 49999 overflows int.
            const size_t w = static_cast<size_t>(ctx->width > 0 ? ctx->width : 0);
            const size_t h = static_cast<size_t>(ctx->height > 0 ? ctx->height : 0);
            ctx->plane_u = data == nullptr ? nullptr : data + w * h;
            ctx->plane_v = ctx->plane_u == nullptr ? nullptr : ctx->plane_u + ((w + 1) >> 1) * ((h + 1) >> 1);
        }
    }
    if (ctx->has_settings) ctx->num_components = ctx->comps_in_scan = settings->num_components;

    if (setup_context(ctx) != 1) {
        release_buffers(ctx);
        DORVATEKO_OsFree(ctx);
        return nullptr;
    }

    OutputTarget* t = ctx->output;
    t->kind = kind;
    if (kind == EKO_OUTPUT_MEMORY) {
        t->buffer = output_request->buffer;
        // A missing block has no room whatever the caller claims.
        t->capacity = output_request->buffer == nullptr ? 0 : output_request->capacity;
    } else {
        ctx->work_buffer = static_cast<uint8_t*>(DORVATEKO_OsMalloc(kWorkBufferSize));
        if (ctx->work_buffer == nullptr) {
            eko_SetError(EKO_ERR_ALLOC);
            release_buffers(ctx);
            DORVATEKO_OsFree(ctx);
            return nullptr;
        }
        t->buffer = ctx->work_buffer;
        t->capacity = kWorkBufferSize;
        t->file = output_request->file;
    }

    ctx->restart_index = 0;
    ctx->restart_mcu_count = -1;
    ctx->restart_interval = ctx->mcus_per_row;
    // Without a DRI marker in the header a decoder would not expect markers.
    if (ctx->has_settings && settings->write_dri == 0) ctx->restart_interval = 0;
    return ctx;
}

uint32_t setup_context(EncoderContext* context) {
    EncoderContext* ctx = context;
    if (ctx->height < 1 || ctx->width < 1 || ctx->height > kMaxDimension || ctx->width > kMaxDimension) {
        eko_SetError(EKO_ERR_DIMENSIONS);
        return 0;
    }
    if (ctx->num_components > 3 || (ctx->has_settings && !settings_usable(ctx))) {
        eko_SetError(EKO_ERR_SAMPLING);
        return 0;
    }
    if (set_quality(ctx) != 1) return 0;

    ctx->natural_order = static_cast<uint8_t*>(DORVATEKO_OsMalloc(64));
    if (ctx->natural_order == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    DORVATEKO_OsMemcpy(ctx->natural_order, kZigzagToNatural, 64);

    ctx->mcu_state = static_cast<McuState*>(DORVATEKO_OsMalloc(sizeof(McuState)));
    if (ctx->mcu_state == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    DORVATEKO_OsMemset(ctx->mcu_state, 0, sizeof(McuState));
    constexpr uint32_t kBlockBytes = 64 * sizeof(int16_t);
    auto* coefficients = static_cast<int16_t*>(DORVATEKO_OsMalloc(10 * kBlockBytes));
    if (coefficients == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    DORVATEKO_OsMemset(coefficients, 0, 10 * kBlockBytes);
    for (int k = 0; k < 10; ++k) ctx->mcu_state->mcu_buffer[k] = coefficients + 64 * k;

    ctx->sample_rows = static_cast<SampleRowSet*>(DORVATEKO_OsMalloc(sizeof(SampleRowSet)));
    if (ctx->sample_rows == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    DORVATEKO_OsMemset(ctx->sample_rows, 0, sizeof(SampleRowSet));

    const uint32_t n = ctx->num_components;
    ctx->comp_info =
        static_cast<ComponentInfo*>(DORVATEKO_OsMalloc(n * static_cast<uint32_t>(sizeof(ComponentInfo))));
    if (ctx->comp_info == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    DORVATEKO_OsMemset(ctx->comp_info, 0, n * static_cast<uint32_t>(sizeof(ComponentInfo)));

    const EncoderSettings* s = ctx->has_settings ? ctx->settings : nullptr;
    if (n == 3) {
        for (uint32_t c = 0; c < 3; ++c) {
            const uint8_t t = c == 0 ? 0 : 1;
            if (s != nullptr) {
                set_component(ctx, c, c + 1, s->component_specs[c][1], s->component_specs[c][2],
                                                  s->component_specs[c][0], t, t);
            } else {
                set_component(ctx, c, c + 1, ctx->default_sampling[2 * c],
                                                  ctx->default_sampling[2 * c + 1], t, t, t);
            }
        }
        if (ctx->max_h_samp < 1 || ctx->max_h_samp > 2 || ctx->max_v_samp < 1 || ctx->max_v_samp > 2) {
            eko_SetError(EKO_ERR_SAMPLING);
            return 0;
        }
    } else {
        // A single component is always coded 1x1, whatever the record says,
        // so that its geometry matches its sample rows.
        set_component(ctx, 0, 1, 1, 1, s != nullptr ? s->component_specs[0][0] : 0, 0, 0);
        ctx->max_h_samp = ctx->max_v_samp = 1;
    }

    const int32_t mh = ctx->max_h_samp * 8, mv = ctx->max_v_samp * 8;
    for (uint32_t c = 0; c < n; ++c) {
        ComponentInfo* comp = &ctx->comp_info[c];
        ctx->cur_comp_info[c] = comp;
        const int32_t h = comp->h_samp_factor, v = comp->v_samp_factor;
        comp->width_in_blocks = static_cast<uint32_t>((ctx->width * h + mh - 1) / mh);
        comp->padded_width = comp->width_in_blocks * 8;
        comp->height_in_blocks = static_cast<uint32_t>((ctx->height * v + mv - 1) / mv);
        comp->padded_height = comp->height_in_blocks * 8;
        comp->downsampled_width = static_cast<uint32_t>((ctx->width * h + ctx->max_h_samp - 1) / ctx->max_h_samp);
        comp->downsampled_height = static_cast<uint32_t>((ctx->height * v + ctx->max_v_samp - 1) / ctx->max_v_samp);
        comp->band_rows = comp->rows_this_band = static_cast<uint32_t>(v) * 8;
    }
    if (!tekoj::allocate_band_rows(ctx)) return 0;
    ctx->total_imcu_rows = static_cast<uint32_t>((ctx->height + mv - 1) / mv);

    if (prepare_huffman(ctx) != 1) return 0;
    if (setup_scan(ctx) != 1) return 0;
    setup_band(ctx);
    if (!build_coder_tables(ctx)) return 0;

    ctx->output = static_cast<OutputTarget*>(DORVATEKO_OsMalloc(sizeof(OutputTarget)));
    if (ctx->output == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    DORVATEKO_OsMemset(ctx->output, 0, sizeof(OutputTarget));
    return 1;
}

void release_buffers(EncoderContext* context) {
    EncoderContext* ctx = context;
    if (ctx == nullptr) return;
    auto release = [](void* p) {
        if (p != nullptr) DORVATEKO_OsFree(p);
    };
    if (ctx->sample_rows != nullptr) {
        tekoj::release_band_rows(ctx);
        release(ctx->sample_rows);
    }
    for (int t = 0; t < 4; ++t) release(ctx->divisors[t]);
    for (int t = 0; t < 4; ++t) release(ctx->quant_tbl[t]);
    release(ctx->dc_spec[0]);
    release(ctx->dc_spec[1]);
    release(ctx->ac_spec[0]);
    release(ctx->ac_spec[1]);
    if (ctx->mcu_state != nullptr) {
        release(ctx->mcu_state->mcu_buffer[0]);
        release(ctx->mcu_state);
    }
    if (ctx->entropy != nullptr) {
        release(ctx->entropy->dc_codes[0]);
        release(ctx->entropy->ac_codes[0]);
        release(ctx->entropy->dc_codes[1]);
        release(ctx->entropy->ac_codes[1]);
        release(ctx->entropy);
    }
    release(ctx->coder_tables);
    release(ctx->comp_info);
    release(ctx->natural_order);
    release(ctx->output);
}

}  // namespace tekoj

extern "C" {

EKO_API EncoderContext* __eko_jpeg_enc_initiaize(const ImageInfo* image_info, const OutputRequest* output_request,
                                                 const EncodeOptions* options, const EncoderSettings* settings) {
    return tekoj::create_context(image_info, output_request, options, settings);
}
EKO_API uint32_t __eko_jpeg_enc_initail_setup(EncoderContext* context) { return tekoj::setup_context(context); }
EKO_API void __eko_jpeg_enc_release_mem(EncoderContext* context) { tekoj::release_buffers(context); }

}  // extern "C"
