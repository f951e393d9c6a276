// Exact-byte checks of whole-image and band-mode streams against the stored
// golden outputs (tests/data/golden; each name gives format, size and quality).
#include "support/test_support.h"

#include <gtest/gtest.h>

using namespace tekoj_test;

namespace {

struct GoldenCase {
    const char* name;
    uint32_t format;
    int width, height;
    uint32_t quality;
};

constexpr GoldenCase kWhole[] = {
    {"whole-yuv420-17x20-q75-pattern", EKO_FORMAT_YUV420, 17, 20, 75},
    {"whole-grey-33x17-q50-pattern", EKO_FORMAT_GREY, 33, 17, 50},
    {"whole-rgb565-33x17-q90-pattern", EKO_FORMAT_RGB565, 33, 17, 90},
    {"whole-rgb888-17x20-q100-pattern", EKO_FORMAT_RGB888, 17, 20, 100},
    {"whole-rgba8888-7x5-q1-pattern", EKO_FORMAT_RGBA8888, 7, 5, 1},
    {"whole-bgra8888-64x48-q75-pattern", EKO_FORMAT_BGRA8888, 64, 48, 75},
    {"whole-rgb888-96x64-q85-photo", EKO_FORMAT_RGB888, 96, 64, 85},
    {"whole-yuv420-100x75-q90-photo", EKO_FORMAT_YUV420, 100, 75, 90},
    {"whole-grey-1x1-q75-pattern", EKO_FORMAT_GREY, 1, 1, 75},
    {"whole-rgb565-1x7-q75-pattern", EKO_FORMAT_RGB565, 1, 7, 75},
    {"whole-rgb565-50x33-q60-photo", EKO_FORMAT_RGB565, 50, 33, 60},
    {"whole-bgra8888-31x9-q95-photo", EKO_FORMAT_BGRA8888, 31, 9, 95},
};

}  // namespace

TEST(GoldenWhole, EveryCaseMatchesByteForByte) {
    for (const GoldenCase& c : kWhole) {
        SCOPED_TRACE(c.name);
        const Bytes input = read_file(golden_path(std::string(c.name) + ".in"));
        ASSERT_EQ(input.size(), image_size(c.format, c.width, c.height));
        const Bytes got = encode_to_memory(image_info(input.data(), c.width, c.height, c.format), c.quality);
        EXPECT_TRUE(got == read_file(golden_path(std::string(c.name) + ".expected")));
    }
}

TEST(GoldenWhole, BandsJoinToTheExpectedStream) {
    const std::string name = "bands-rgb888-64x40-q80-16-16-8";
    const Bytes input = read_file(golden_path(name + ".in"));
    const int width = 64, height = 40, bands[] = {16, 16, 8};
    Bytes joined;
    for (int b = 0, top = 0; b < 3; top += bands[b++]) {
        ImageInfo info = image_info(input.data() + size_t(top) * width * 3, width, bands[b], EKO_FORMAT_RGB888);
        info.band_mode = 1;
        info.band_continued = b > 0;
        info.band_open_end = b < 2;
        info.total_height = height;
        info.band_top_row = top;
        const Bytes piece = encode_to_memory(info, 80);
        ASSERT_FALSE(piece.empty());
        joined.insert(joined.end(), piece.begin(), piece.end());
    }
    EXPECT_TRUE(joined == read_file(golden_path(name + ".expected")));
}
