// EXIF segment and thumbnail of the tool, and small helpers around the
// library's whole-image entry points.
#pragma once

#include "tool.h"

// The tool also drives exported internal steps: the readers that no format
// code selects, and the coding pass that follows them.
#include <TekoJEncoderInternal.h>

namespace tool {

// `what`, followed by the reason the library gave for its last failure.
std::string library_error(const std::string& what);
// A complete JPEG stream of `image` from the whole-image memory entry point.
std::vector<uint8_t> encode_to_memory(const ImageInfo& image, uint32_t quality);
// Offset just past SOI and APP0 of a stream, 0 while fewer than 6 bytes are known.
size_t app0_end(const uint8_t* stream, size_t count);

class Exif {
public:
    explicit Exif(const Options& options);
    Exif(const Exif&) = delete;
    Exif& operator=(const Exif&) = delete;
    bool present = false;
    void set_thumbnail(std::vector<uint8_t> jpeg, uint32_t width, uint32_t height);
    // The APP1 segment from its marker on; empty without EXIF.
    std::vector<uint8_t> segment() const;

private:
    std::string make, model;
    GpsInfo gps{};
    ExifInfo info{};
    std::vector<uint8_t> thumbnail;
};

// Box-filtered down-scale, gathered row by row as the bands go past.
class Thumbnail {
public:
    // `channels` 1 (grey) or 3 (RGB, or Y, Cb, Cr when `ycbcr`).
    Thumbnail(uint32_t width, uint32_t height, uint32_t channels, bool ycbcr);
    // Adds source row `y`; pixel(x, v) stores the channels of pixel x in v.
    template <typename Pixel>
    void add_row(uint32_t y, Pixel&& pixel) {
        uint64_t* row = &sums_[static_cast<size_t>(uint64_t{y} * height / source_height_) * width * channels_];
        uint32_t v[3] = {};
        for (uint32_t x = 0; x < column_.size(); ++x) {
            pixel(x, v);
            uint64_t* cell = row + static_cast<size_t>(column_[x]) * channels_;
            for (uint32_t c = 0; c < channels_; ++c) cell[c] += v[c];
        }
    }
    // The averaged pixels as RGB888, or grey.
    std::vector<uint8_t> pixels(bool grey) const;
    uint32_t width = 0, height = 0;

private:
    uint32_t channels_;
    bool ycbcr_;
    uint32_t source_height_;
    std::vector<uint32_t> column_;  // thumbnail column of each source column
    std::vector<uint64_t> count_, sums_;
};

// Encodes the thumbnail and puts it in `exif`, within the segment's limit.
void attach_thumbnail(Exif& exif, const Thumbnail& thumbnail, bool grey);

}  // namespace tool
