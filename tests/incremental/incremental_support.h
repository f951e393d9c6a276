// Helpers of the incremental tests: complete encodes through the MCU-row
// interface, the row driver or column-split mode into any target, and the
// coefficients the library itself computes for an image.
#pragma once

#include "support/test_support.h"

#include <functional>
#include <string>
#include <vector>

namespace tekoj_test {

enum class Sink { Memory, File, Stream };
enum class Mode { Bands, Rows, Columns };
// Points of an encode at which a test may look at or poke the context:
// after init, after the column set-up call, before each band or column,
// before and after the join call, after the last band or column.
enum class Stage { Created, SetUp, Unit, BeforeJoin, Joined, Coded };

// What one encode does; tests name only the fields they set, which is what
// designated initialisers are for.
#pragma GCC diagnostic ignored "-Wmissing-field-initializers"
struct Job {
    const EncoderSettings* settings = nullptr;
    Mode mode = Mode::Bands;
    Sink sink = Sink::Memory;
    std::vector<int16_t> coefficients;  // empty: the library's own
    uint32_t quality = 75;
    std::function<void(EncoderContext*, Stage)> hook = [](EncoderContext*, Stage) {};
};

// A whole encode; planar band buffers are cut from info.data. Empty when a
// call failed, a reported count was wrong or a stream piece passed 4096.
Bytes encode(const ImageInfo& info, Job job);

// MCUs first, first + stride, ... as McuBlockList entries.
std::vector<McuBlockList> block_lists(std::vector<int16_t>& coefficients, uint32_t blocks_in_mcu, uint32_t first,
                                      uint32_t count, uint32_t stride);

// What the pixel path hands the block coder: MCU rows top to bottom, MCUs
// left to right, blocks in MCU order.
std::vector<int16_t> library_coefficients(const ImageInfo& info, const EncoderSettings* settings);

// Our own tables, the given luma sampling (chroma 1x1), DRI and estimate.
EncoderSettings settings_420(uint32_t size_estimate = 0, uint32_t write_dri = 1, uint8_t h = 2, uint8_t v = 2);
// The settings, size and quality of a golden case.
EncoderSettings golden_settings(const std::string& name, int& width, int& height, uint32_t& quality);

// The bytes the context's current target holds.
Bytes pending(EncoderContext* ctx);

}  // namespace tekoj_test
