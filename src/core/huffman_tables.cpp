// Huffman tables: the four standard tables (code counts and symbols), the derived code tables the
// block coder looks codes up in, and the magnitude-category table.
#include "core/huffman_tables.h"

#include <TekoJEncoderInternal.h>

#include <array>
#include <cstring>

namespace tekoj {

const uint8_t kDcLumaBits[17] = {0, 0, 1, 5, 1, 1, 1, 1, 1, 1, 0, 0, 0, 0, 0, 0, 0};
const uint8_t kDcLumaValues[12] = {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11};
const uint8_t kDcChromaBits[17] = {0, 0, 3, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0, 0, 0, 0};
const uint8_t kDcChromaValues[12] = {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11};

const uint8_t kAcLumaBits[17] = {0, 0, 2, 1, 3, 3, 2, 4, 3, 5, 5, 4, 4, 0, 0, 1, 0x7d};
const uint8_t kAcLumaValues[162] = {
    0x01, 0x02, 0x03, 0x00, 0x04, 0x11, 0x05, 0x12, 0x21, 0x31, 0x41, 0x06, 0x13, 0x51, 0x61, 0x07, 0x22, 0x71,
    0x14, 0x32, 0x81, 0x91, 0xa1, 0x08, 0x23, 0x42, 0xb1, 0xc1, 0x15, 0x52, 0xd1, 0xf0, 0x24, 0x33, 0x62, 0x72,
    0x82, 0x09, 0x0a, 0x16, 0x17, 0x18, 0x19, 0x1a, 0x25, 0x26, 0x27, 0x28, 0x29, 0x2a, 0x34, 0x35, 0x36, 0x37,
    0x38, 0x39, 0x3a, 0x43, 0x44, 0x45, 0x46, 0x47, 0x48, 0x49, 0x4a, 0x53, 0x54, 0x55, 0x56, 0x57, 0x58, 0x59,
    0x5a, 0x63, 0x64, 0x65, 0x66, 0x67, 0x68, 0x69, 0x6a, 0x73, 0x74, 0x75, 0x76, 0x77, 0x78, 0x79, 0x7a, 0x83,
    0x84, 0x85, 0x86, 0x87, 0x88, 0x89, 0x8a, 0x92, 0x93, 0x94, 0x95, 0x96, 0x97, 0x98, 0x99, 0x9a, 0xa2, 0xa3,
    0xa4, 0xa5, 0xa6, 0xa7, 0xa8, 0xa9, 0xaa, 0xb2, 0xb3, 0xb4, 0xb5, 0xb6, 0xb7, 0xb8, 0xb9, 0xba, 0xc2, 0xc3,
    0xc4, 0xc5, 0xc6, 0xc7, 0xc8, 0xc9, 0xca, 0xd2, 0xd3, 0xd4, 0xd5, 0xd6, 0xd7, 0xd8, 0xd9, 0xda, 0xe1, 0xe2,
    0xe3, 0xe4, 0xe5, 0xe6, 0xe7, 0xe8, 0xe9, 0xea, 0xf1, 0xf2, 0xf3, 0xf4, 0xf5, 0xf6, 0xf7, 0xf8, 0xf9, 0xfa};

const uint8_t kAcChromaBits[17] = {0, 0, 2, 1, 2, 4, 4, 3, 4, 7, 5, 4, 4, 0, 1, 2, 0x77};
const uint8_t kAcChromaValues[162] = {
    0x00, 0x01, 0x02, 0x03, 0x11, 0x04, 0x05, 0x21, 0x31, 0x06, 0x12, 0x41, 0x51, 0x07, 0x61, 0x71, 0x13, 0x22,
    0x32, 0x81, 0x08, 0x14, 0x42, 0x91, 0xa1, 0xb1, 0xc1, 0x09, 0x23, 0x33, 0x52, 0xf0, 0x15, 0x62, 0x72, 0xd1,
    0x0a, 0x16, 0x24, 0x34, 0xe1, 0x25, 0xf1, 0x17, 0x18, 0x19, 0x1a, 0x26, 0x27, 0x28, 0x29, 0x2a, 0x35, 0x36,
    0x37, 0x38, 0x39, 0x3a, 0x43, 0x44, 0x45, 0x46, 0x47, 0x48, 0x49, 0x4a, 0x53, 0x54, 0x55, 0x56, 0x57, 0x58,
    0x59, 0x5a, 0x63, 0x64, 0x65, 0x66, 0x67, 0x68, 0x69, 0x6a, 0x73, 0x74, 0x75, 0x76, 0x77, 0x78, 0x79, 0x7a,
    0x82, 0x83, 0x84, 0x85, 0x86, 0x87, 0x88, 0x89, 0x8a, 0x92, 0x93, 0x94, 0x95, 0x96, 0x97, 0x98, 0x99, 0x9a,
    0xa2, 0xa3, 0xa4, 0xa5, 0xa6, 0xa7, 0xa8, 0xa9, 0xaa, 0xb2, 0xb3, 0xb4, 0xb5, 0xb6, 0xb7, 0xb8, 0xb9, 0xba,
    0xc2, 0xc3, 0xc4, 0xc5, 0xc6, 0xc7, 0xc8, 0xc9, 0xca, 0xd2, 0xd3, 0xd4, 0xd5, 0xd6, 0xd7, 0xd8, 0xd9, 0xda,
    0xe2, 0xe3, 0xe4, 0xe5, 0xe6, 0xe7, 0xe8, 0xe9, 0xea, 0xf2, 0xf3, 0xf4, 0xf5, 0xf6, 0xf7, 0xf8, 0xf9, 0xfa};

namespace {

constexpr int count_codes(const uint8_t* bits) {
    int n = 0;
    for (int l = 1; l <= 16; ++l) n += bits[l];
    return n;
}

// Canonical DC codes of the two standard DC tables, by magnitude category.
constexpr uint16_t kDcLumaCode[12] = {0, 2, 3, 4, 5, 6, 14, 30, 62, 126, 254, 510};
constexpr uint8_t kDcLumaSize[12] = {2, 3, 3, 3, 3, 3, 4, 5, 6, 7, 8, 9};
constexpr uint16_t kDcChromaCode[12] = {0, 1, 2, 6, 14, 30, 62, 126, 254, 510, 1022, 2046};
constexpr uint8_t kDcChromaSize[12] = {2, 2, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11};

DcCodeTable* make_dc_table(const uint16_t* codes, const uint8_t* sizes) {
    auto* t = static_cast<DcCodeTable*>(DORVATEKO_OsMalloc(sizeof(DcCodeTable)));
    if (t == nullptr) return nullptr;
    DORVATEKO_OsMemset(t, 0, sizeof(DcCodeTable));
    std::memcpy(t->code, codes, 12 * sizeof(uint16_t));
    std::memcpy(t->size, sizes, 12);
    return t;
}

}  // namespace
}  // namespace tekoj

namespace tekoj {

uint32_t create_huffman_spec(EncoderContext* context, const uint8_t* bits, const uint8_t* values,
                             HuffmanSpec** slot) {
    (void)context;
    auto* spec = static_cast<HuffmanSpec*>(DORVATEKO_OsMalloc(sizeof(HuffmanSpec)));
    if (spec == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    DORVATEKO_OsMemset(spec, 0, sizeof(HuffmanSpec));
    std::memcpy(spec->bits, bits, 17);
    std::memcpy(spec->huffval, values, static_cast<size_t>(count_codes(bits)));
    *slot = spec;
    return 1;
}

uint32_t set_huffman_specs(EncoderContext* context) {
    using namespace tekoj;
    uint32_t ok = create_huffman_spec(context, kDcLumaBits, kDcLumaValues, &context->dc_spec[0]);
    ok = create_huffman_spec(context, kAcLumaBits, kAcLumaValues, &context->ac_spec[0]) && ok;
    ok = create_huffman_spec(context, kDcChromaBits, kDcChromaValues, &context->dc_spec[1]) && ok;
    ok = create_huffman_spec(context, kAcChromaBits, kAcChromaValues, &context->ac_spec[1]) && ok;
    return ok;
}

uint32_t prepare_code_table(EncoderContext* context, uint32_t table, AcCodeTable** slot) {
    auto* t = static_cast<AcCodeTable*>(DORVATEKO_OsMalloc(sizeof(AcCodeTable)));
    *slot = t;
    if (t == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    const HuffmanSpec* spec = context->ac_spec[table];
    // Canonical code assignment: codes of one length are consecutive, and the
    // next length starts at twice the next code.
    DORVATEKO_OsMemset(t->size, 0, sizeof t->size);
    DORVATEKO_OsMemset(t->code, 0, sizeof t->code);
    uint32_t code = 0;
    int p = 0;
    for (int len = 1; len <= 16; ++len) {
        for (int i = 0; i < spec->bits[len]; ++i, ++p) {
            const uint8_t symbol = spec->huffval[p];
            t->code[symbol] = static_cast<uint16_t>(code++);
            t->size[symbol] = static_cast<uint8_t>(len);
        }
        code <<= 1;
    }
    return 1;
}

uint32_t prepare_huffman(EncoderContext* context) {
    uint8_t* nbits = context->nbits_table;
    nbits[0] = 0;
    for (uint32_t v = 1; v < 4096; ++v) nbits[v] = static_cast<uint8_t>(32 - __builtin_clz(v));

    if (set_huffman_specs(context) != 1) return 0;

    auto* entropy = static_cast<EntropyState*>(DORVATEKO_OsMalloc(sizeof(EntropyState)));
    if (entropy == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    DORVATEKO_OsMemset(entropy, 0, sizeof(EntropyState));
    context->entropy = entropy;

    entropy->dc_codes[0] = make_dc_table(kDcLumaCode, kDcLumaSize);
    if (entropy->dc_codes[0] == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    entropy->dc_codes[1] = make_dc_table(kDcChromaCode, kDcChromaSize);
    if (entropy->dc_codes[1] == nullptr) {
        eko_SetError(EKO_ERR_ALLOC);
        return 0;
    }
    if (prepare_code_table(context, 0, &entropy->ac_codes[0]) != 1) return 0;
    return prepare_code_table(context, 1, &entropy->ac_codes[1]);
}

}  // namespace tekoj

extern "C" {

EKO_API uint32_t __eko_jpeg_enc_create_huffman_tbl(EncoderContext* context, const uint8_t* bits,
                                                   const uint8_t* values, HuffmanSpec** slot) {
    return tekoj::create_huffman_spec(context, bits, values, slot);
}
EKO_API uint32_t __eko_jpeg_enc_set_huffman_spec_tbl(EncoderContext* context) {
    return tekoj::set_huffman_specs(context);
}
EKO_API uint32_t __eko_jpeg_enc_prepare_derived_tbl(EncoderContext* context, uint32_t table, AcCodeTable** slot) {
    return tekoj::prepare_code_table(context, table, slot);
}
EKO_API uint32_t __eko_jpeg_enc_prepare_huffman_code(EncoderContext* context) {
    return tekoj::prepare_huffman(context);
}

}  // extern "C"

static_assert(sizeof(tekoj::kAcLumaValues) == 162 && sizeof(tekoj::kAcChromaValues) == 162);
