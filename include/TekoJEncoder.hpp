// libTekoJEncoder, C++ interface: a header-only layer over the C functions
// with owned results, RAII for the incremental encoder and error messages.
#pragma once

#include <TekoJEncoder.h>

#include <cstdint>
#include <string_view>
#include <utility>
#include <vector>

namespace tekoj {

// One message per library error code (see EkoError).
constexpr std::string_view error_message(uint32_t code) {
    switch (code) {
        case EKO_OK: return "no error";
        case EKO_ERR_ALLOC: return "memory allocation failed";
        case EKO_ERR_FORMAT: return "pixel format code not supported";
        case EKO_ERR_SAMPLING: return "component count, sampling factors or quantisation tables not supported";
        case EKO_ERR_DIMENSIONS: return "width or height outside 1..49999";
        case EKO_ERR_ARGUMENT: return "invalid argument";
        case EKO_ERR_WRITE: return "writing the output failed";
        case EKO_ERR_TOO_LARGE: return "output larger than its length field can describe";
        case EKO_ERR_STATE: return "call out of order";
        case EKO_ERR_OPEN: return "the output file could not be opened";
        default: return "unknown error";
    }
}

enum class Format : uint32_t {
    rgb565 = EKO_FORMAT_RGB565,
    rgb888 = EKO_FORMAT_RGB888,
    yuv420 = EKO_FORMAT_YUV420,
    grey = EKO_FORMAT_GREY,
    rgba8888 = EKO_FORMAT_RGBA8888,
    bgra8888 = EKO_FORMAT_BGRA8888,
};

// The image to encode; `exif` may point to an EXIF description.
struct Image {
    const void* pixels = nullptr;
    int32_t width = 0;
    int32_t height = 0;
    Format format = Format::rgb888;
    const ExifInfo* exif = nullptr;

    ImageInfo info() const {
        ImageInfo i{};
        i.width = width;
        i.height = height;
        i.data = pixels;
        i.format = static_cast<uint32_t>(format);
        i.exif_info = exif;
        return i;
    }
};

// A JPEG stream, or the code of the error that prevented it.
struct Encoded {
    std::vector<uint8_t> bytes;
    uint32_t error = EKO_OK;

    explicit operator bool() const { return error == EKO_OK; }
    std::string_view message() const { return error_message(error); }
};

namespace detail {
inline uint32_t append(void* arg, const uint8_t* data, uint32_t count) {
    auto* out = static_cast<std::vector<uint8_t>*>(arg);
    out->insert(out->end(), data, data + count);
    return count;
}
inline uint32_t failure_code() {
    const uint32_t code = eko_GetLastError();
    return code == EKO_OK ? EKO_ERR_ARGUMENT : code;
}
}  // namespace detail

// Encodes a whole image into memory owned by the result.
inline Encoded encode(const Image& image, uint32_t quality) {
    Encoded result;
    const ImageInfo info = image.info();
    const EncodeOptions options{quality, nullptr, 0};
    eko_SetError(EKO_OK);
    if (eko_enc_jpeg_to_stream_ex(&info, &detail::append, &options, &result.bytes) != 1) {
        result.bytes.clear();
        result.error = detail::failure_code();
    }
    return result;
}

// Encodes a whole image into a file; returns EKO_OK or the error code.
inline uint32_t encode_to_file(const Image& image, const char* path, uint32_t quality) {
    const ImageInfo info = image.info();
    eko_SetError(EKO_OK);
    return eko_enc_jpeg_to_file(&info, path, quality) == 1 ? EKO_OK : detail::failure_code();
}

// Incremental encoder: one band (MCU row) per call, into memory. The stream
// is completed and every resource released by finish() or the destructor.
class BandEncoder {
public:
    BandEncoder(const Image& image, uint32_t quality, const EncoderSettings* settings = nullptr) {
        const ImageInfo info = image.info();
        const EncodeOptions options{quality, nullptr, 0};
        const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096)),
                                    4096};
        eko_SetError(EKO_OK);
        context_ = request.buffer == nullptr ? nullptr : eko_jpeg_enc_mcu_init(&info, &request, &options, settings);
        if (context_ == nullptr) {
            error_ = detail::failure_code();
            DORVATEKO_OsFree(request.buffer);
        }
    }
    BandEncoder(const BandEncoder&) = delete;
    BandEncoder& operator=(const BandEncoder&) = delete;
    ~BandEncoder() { finish(); }

    explicit operator bool() const { return context_ != nullptr && error_ == EKO_OK; }
    uint32_t error() const { return error_; }

    // Codes one band; returns the image rows consumed so far, or 0 on error.
    uint32_t process(const uint8_t* band) {
        uint32_t next_row = 0;
        if (!*this) return 0;
        if (eko_jpeg_enc_muc_process(context_, band, &next_row) != 1) {
            error_ = detail::failure_code();
            return 0;
        }
        return next_row;
    }

    // Completes the stream and returns it (empty after an error).
    Encoded finish() {
        Encoded result;
        result.error = error_;
        if (context_ == nullptr) return result;
        uint8_t* buffer = nullptr;
        uint32_t length = 0;
        eko_jpeg_enc_mcu_finish(context_, &buffer, &length);
        context_ = nullptr;
        if (buffer != nullptr && error_ == EKO_OK) result.bytes.assign(buffer, buffer + length);
        if (buffer == nullptr && result.error == EKO_OK) result.error = detail::failure_code();
        DORVATEKO_OsFree(buffer);
        return result;
    }

private:
    EncoderContext* context_ = nullptr;
    uint32_t error_ = EKO_OK;
};

}  // namespace tekoj
