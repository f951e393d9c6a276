// Helpers of the incremental tests: whole encodes through the MCU-row
// interface, the row driver or column-split mode into any target.
#pragma once

#include "support/test_support.h"

#include <functional>

namespace tekoj_test {

enum class Mode { Bands, Rows, Columns };
// Where a hook may look at or poke the context: after init, after the column
// set-up, before each band or column, before and after the join, at the end.
enum class Stage { Created, SetUp, Unit, BeforeJoin, Joined, Coded };

// Tests name only the fields they set.
#pragma GCC diagnostic ignored "-Wmissing-field-initializers"
struct Job {
    const EncoderSettings* settings = nullptr;
    Mode mode = Mode::Bands;
    uint32_t sink = EKO_OUTPUT_MEMORY;
    std::vector<int16_t> coefficients;  // empty: those of the band-by-band stream
    std::function<void(EncoderContext*, Stage)> hook = [](EncoderContext*, Stage) {};
    int64_t fail_at = -1;  // >= 0: that allocation of the library's calls fails
};

// A whole encode; planar bands are cut from info.data. Empty when a call
// failed, a reported count was wrong or a stream piece passed 4096 bytes.
Bytes encode(const ImageInfo& info, Job job);
// The quantised coefficients of a stream: MCU rows, MCUs, blocks in MCU order.
std::vector<int16_t> coefficients_of(const Bytes& jpeg);
// MCUs first, first + stride, ... (`count` of them, `blocks` each) as block
// lists.
std::vector<McuBlockList> block_lists(std::vector<int16_t>& coefficients, uint32_t blocks, uint32_t first,
                                      uint32_t count, uint32_t stride);
// Three components, luma sampled h x v, chroma 1x1, the usual tables scaled
// to `quality` (50..99).
EncoderSettings settings(uint32_t size_estimate = 0, uint32_t write_dri = 1, uint8_t h = 2, uint8_t v = 2,
                         uint32_t quality = 90);

}  // namespace tekoj_test
