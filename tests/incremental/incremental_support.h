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
// MCUs first, first + stride, ... (`count` of them, `blocks` each) as block
// lists.
std::vector<McuBlockList> block_lists(std::vector<int16_t>& coefficients, uint32_t blocks, uint32_t first,
                                      uint32_t count, uint32_t stride);
}  // namespace tekoj_test
