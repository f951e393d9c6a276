// Helpers of the incremental tests: band buffers, the library's own
// coefficients of an image, and encodes through the MCU-row interface, the
// row driver or column-split mode into a memory block, a file or a callback.
#pragma once

#include "support/test_support.h"

#include <TekoJEncoder.h>

#include <string>
#include <vector>

namespace tekoj_test {

enum class Sink { Memory, File, Stream };

// An output of one encode: builds the request and collects the stream.
struct Output {
    explicit Output(Sink sink, uint32_t capacity = 2048);
    ~Output();
    Sink sink;
    OutputRequest request{};
    std::string path;
    Bytes streamed;
    size_t largest_piece = 0;
    // Installs the callback for a stream sink; true otherwise.
    bool attach(EncoderContext* ctx);
    // Finishes the encode and returns the stream (empty when none came back).
    Bytes finish(EncoderContext* ctx);
};

// Planes of an image as the band buffer's readers take them.
struct Planes {
    Bytes y, u, v;
    int width = 0, height = 0, chroma_width = 0, chroma_height = 0;
};
Planes yuv420_planes(const Bytes& rgb, int width, int height);

// Band `index` laid out in the band buffer's fixed regions; `luma_rows` and
// `chroma_rows` per band.
Bytes band_buffer(const Planes& p, int index, int luma_rows, int chroma_rows);

// Planes of the band buffer for the planar formats 2 (from `rgb`) and 4
// (`pixels`); empty for the RGB formats, whose band pointer is not read.
Planes band_planes(const Bytes& rgb, const Bytes& pixels, int width, int height, uint32_t format);

// Codes `info` band by band through the MCU-row interface, `planes` feeding
// the band buffer (null for RGB). Empty when a call failed, a row count was
// not the expected one or a stream piece exceeded 4096 bytes.
Bytes encode_bands(const ImageInfo& info, const Planes* planes, uint32_t quality, Sink sink,
                   const EncoderSettings* settings = nullptr);

// What the pixel path hands to the block coder: MCU rows top to bottom, MCUs
// left to right, blocks in MCU order, 64 values each.
std::vector<int16_t> library_coefficients(const ImageInfo& info, const EncoderSettings* settings, uint32_t quality);

// Settings with the library's quality-75 tables, the given sampling of Y
// (Cb and Cr 1x1), DRI and a size estimate.
EncoderSettings settings_420(uint32_t size_estimate = 0, uint32_t write_dri = 1, uint8_t h = 2, uint8_t v = 2);

// The EncoderSettings record of a golden case of cases.json, with the case's
// size and quality.
EncoderSettings golden_settings(const std::string& name, int& width, int& height, uint32_t& quality);

// McuBlockList entries for MCUs first..first+count-1 of `coefficients`, with
// `stride` MCUs between consecutive entries.
std::vector<McuBlockList> block_lists(std::vector<int16_t>& coefficients, uint32_t blocks_in_mcu, uint32_t first,
                                      uint32_t count, uint32_t stride);

// Whole encodes from coefficients: row driver (`columns` false) or
// column-split mode. Empty when a call failed.
Bytes encode_coefficients(const ImageInfo& info, const EncoderSettings* settings, uint32_t quality,
                          std::vector<int16_t> coefficients, Sink sink, bool columns);

}  // namespace tekoj_test
