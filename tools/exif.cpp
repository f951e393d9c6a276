// EXIF for the tool: the APP1 segment that the library builds from an ExifInfo
// record, and the down-scaled thumbnail that may go into it.
//
// The MCU-row interface, which the tool codes through, never writes APP1.
// The whole-image entry points do, and the segment does not depend on the
// image, so the segment is taken from the header of a one-pixel encode and
// placed after APP0 of the real stream.
#include "exif.h"

#include <cmath>
#include <cstring>

namespace tool {

std::string library_error(const std::string& what) {
    const uint32_t code = eko_GetLastError();
    const char* reason = "encoder error";
    switch (code) {
        case EKO_ERR_ALLOC: reason = "out of memory"; break;
        case EKO_ERR_FORMAT: reason = "pixel format refused"; break;
        case EKO_ERR_SAMPLING: reason = "sampling refused"; break;
        case EKO_ERR_DIMENSIONS: reason = "dimensions refused"; break;
        case EKO_ERR_ARGUMENT: reason = "argument refused"; break;
        case EKO_ERR_WRITE: reason = "write failed"; break;
        case EKO_ERR_TOO_LARGE: reason = "stream or segment too large"; break;
        case EKO_ERR_STATE: reason = "call out of order"; break;
        default: break;
    }
    return what + ": " + reason + " (library code " + std::to_string(code) + ")";
}

std::vector<uint8_t> encode_to_memory(const ImageInfo& image, uint32_t quality) {
    int32_t length = 4096;
    auto* block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(static_cast<uint32_t>(length)));
    if (block == nullptr) fail("out of memory");
    if (eko_enc_jpeg_to_buffer(&image, &block, &length, quality) == 0) {
        const std::string message = library_error("cannot encode");
        if (block != nullptr) DORVATEKO_OsFree(block);
        fail(message);
    }
    std::vector<uint8_t> jpeg(block, block + length);
    DORVATEKO_OsFree(block);
    return jpeg;
}

size_t app0_end(const uint8_t* p, size_t n) {
    if (n < 6) return 0;
    if (p[0] != 0xFF || p[1] != 0xD8 || p[2] != 0xFF || p[3] != 0xE0) fail("encoder stream does not start with SOI, APP0");
    return 4 + (static_cast<size_t>(p[4]) << 8 | p[5]);
}

namespace {

void to_degrees_minutes_seconds(double value, ExifRational out[3]) {
    value = std::fabs(value);
    uint32_t degrees = static_cast<uint32_t>(value);
    const double minutes_exact = (value - degrees) * 60;
    uint32_t minutes = static_cast<uint32_t>(minutes_exact);
    uint32_t milliseconds = static_cast<uint32_t>(std::lround((minutes_exact - minutes) * 60000));
    if (milliseconds >= 60000) {
        milliseconds -= 60000;
        if (++minutes == 60) minutes = 0, ++degrees;
    }
    out[0] = {degrees, 1};
    out[1] = {minutes, 1};
    out[2] = {milliseconds, 1000};
}

}  // namespace

Exif::Exif(const Options& o) {
    present = !o.make.empty() || !o.model.empty() || o.orientation != 0 || o.datestamp || o.gps || o.thumbnail;
    make = o.make;
    model = o.model;
    if (!make.empty()) info.make = make.c_str();
    if (!model.empty()) info.model = model.c_str();
    info.orientation = o.orientation;
    info.stamp_date_time = o.datestamp ? 1 : 0;
    if (o.gps) {
        std::strcpy(gps.latitude_ref, o.latitude < 0 ? "S" : "N");
        std::strcpy(gps.longitude_ref, o.longitude < 0 ? "W" : "E");
        to_degrees_minutes_seconds(o.latitude, gps.latitude);
        to_degrees_minutes_seconds(o.longitude, gps.longitude);
        gps.altitude_ref = 0xFF;  // above 1: not recorded
        if (o.has_altitude) {
            gps.altitude_ref = o.altitude < 0 ? 1 : 0;
            gps.altitude = {static_cast<uint32_t>(std::lround(std::fabs(o.altitude) * 100)), 100};
        }
        info.gps = &gps;
    }
}

void Exif::set_thumbnail(std::vector<uint8_t> jpeg, uint32_t width, uint32_t height) {
    thumbnail = std::move(jpeg);
    info.has_thumbnail = 1;
    info.thumb_width = width;
    info.thumb_height = height;
    info.thumb_compression = 6;  // JPEG
    info.thumb_length = static_cast<uint32_t>(thumbnail.size());
    info.thumb_data = thumbnail.data();
}

std::vector<uint8_t> Exif::segment() const {
    if (!present) return {};
    const uint8_t pixel = 128;
    ImageInfo image{};
    image.width = image.height = 1;
    image.data = &pixel;
    image.format = EKO_FORMAT_GREY;
    image.exif_info = &info;
    const std::vector<uint8_t> jpeg = encode_to_memory(image, 50);
    const size_t at = app0_end(jpeg.data(), jpeg.size());
    if (at + 4 > jpeg.size() || jpeg[at] != 0xFF || jpeg[at + 1] != 0xE1) fail("encoder wrote no APP1 segment");
    const size_t end = at + 2 + (static_cast<size_t>(jpeg[at + 2]) << 8 | jpeg[at + 3]);
    if (end > jpeg.size()) fail("encoder wrote a malformed APP1 segment");
    return {jpeg.begin() + static_cast<std::ptrdiff_t>(at), jpeg.begin() + static_cast<std::ptrdiff_t>(end)};
}

// ---------------------------------------------------------------------------

Thumbnail::Thumbnail(uint32_t width, uint32_t height, uint32_t channels, bool ycbcr)
    : channels_(channels), ycbcr_(ycbcr), source_height_(height) {
    // At most 160x120 (120x160 upright), never enlarged.
    const double scale = std::min({1.0, (width >= height ? 160.0 : 120.0) / width, (width >= height ? 120.0 : 160.0) / height});
    this->width = std::max<uint32_t>(1, static_cast<uint32_t>(std::lround(width * scale)));
    this->height = std::max<uint32_t>(1, static_cast<uint32_t>(std::lround(height * scale)));
    column_.resize(width);
    std::vector<uint32_t> per_column(this->width), per_row(this->height);
    for (uint32_t x = 0; x < width; ++x) ++per_column[column_[x] = static_cast<uint32_t>(uint64_t{x} * this->width / width)];
    for (uint32_t y = 0; y < height; ++y) ++per_row[static_cast<uint32_t>(uint64_t{y} * this->height / height)];
    count_.resize(static_cast<size_t>(this->width) * this->height);
    for (uint32_t ty = 0; ty < this->height; ++ty)
        for (uint32_t tx = 0; tx < this->width; ++tx) count_[size_t{ty} * this->width + tx] = uint64_t{per_column[tx]} * per_row[ty];
    sums_.assign(count_.size() * channels, 0);
}

std::vector<uint8_t> Thumbnail::pixels(bool grey) const {
    const size_t n = count_.size();
    std::vector<uint8_t> out(n * (grey ? 1 : 3));
    for (size_t i = 0; i < n; ++i) {
        double v[3];
        for (uint32_t c = 0; c < channels_; ++c) v[c] = static_cast<double>(sums_[i * channels_ + c]) / count_[i];
        auto put = [](double x) { return static_cast<uint8_t>(std::lround(std::fmin(255, std::fmax(0, x)))); };
        if (channels_ == 1) {
            out[i] = put(v[0]);
        } else if (ycbcr_ && grey) {
            out[i] = put(v[0]);
        } else if (ycbcr_) {
            out[3 * i] = put(v[0] + 1.402 * (v[2] - 128));
            out[3 * i + 1] = put(v[0] - 0.344136 * (v[1] - 128) - 0.714136 * (v[2] - 128));
            out[3 * i + 2] = put(v[0] + 1.772 * (v[1] - 128));
        } else if (grey) {
            out[i] = put(0.299 * v[0] + 0.587 * v[1] + 0.114 * v[2]);
        } else {
            for (int c = 0; c < 3; ++c) out[3 * i + c] = put(v[c]);
        }
    }
    return out;
}

// A thumbnail and the EXIF around it must fit the APP1 segment's 16-bit
// length; a detailed one is re-encoded at lower qualities until it does.
void attach_thumbnail(Exif& exif, const Thumbnail& thumbnail, bool grey) {
    const std::vector<uint8_t> pixels = thumbnail.pixels(grey);
    ImageInfo image{};
    image.width = static_cast<int32_t>(thumbnail.width);
    image.height = static_cast<int32_t>(thumbnail.height);
    image.data = pixels.data();
    image.format = grey ? EKO_FORMAT_GREY : EKO_FORMAT_RGB888;
    // The segment without thumbnail bytes; they add themselves and the
    // 12-byte IFD1 entry that records their length.
    exif.set_thumbnail({}, thumbnail.width, thumbnail.height);
    const size_t room = 65535 - (exif.segment().size() - 2) - 12;
    for (uint32_t quality : {80u, 60u, 40u, 20u, 5u}) {
        std::vector<uint8_t> jpeg = encode_to_memory(image, quality);
        if (jpeg.size() <= room) {
            exif.set_thumbnail(std::move(jpeg), thumbnail.width, thumbnail.height);
            return;
        }
    }
    fail("thumbnail does not fit in the 64 KB EXIF segment");
}

}  // namespace tool
