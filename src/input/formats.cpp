#include "input/formats.h"

namespace tekoj {
namespace {

constexpr FormatTraits kFormats[] = {
    {EKO_FORMAT_RGB565, 2, 3, 16, false, true, __eko_jpeg_enc_get_raw_rgb565_data},
    {EKO_FORMAT_RGB888, 3, 3, 16, false, true, __eko_jpeg_enc_get_raw_rgb888_data},
    {EKO_FORMAT_YUV420, 0, 3, 16, true, false, __eko_jpeg_enc_get_raw_data},
    {EKO_FORMAT_GREY, 1, 1, 8, true, false, __eko_jpeg_enc_get_raw_data},
    {EKO_FORMAT_RGBA8888, 4, 3, 16, false, true, __eko_jpeg_enc_get_raw_rgba8888_data},
    {EKO_FORMAT_BGRA8888, 4, 3, 16, false, true, __eko_jpeg_enc_get_raw_bgra8888_data},
};

}  // namespace

const FormatTraits* format_traits(uint32_t code) {
    for (const FormatTraits& f : kFormats)
        if (f.code == code) return &f;
    return nullptr;
}

}  // namespace tekoj
