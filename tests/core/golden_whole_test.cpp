// Exact-byte checks of whole-image and band-mode streams against the stored
// golden outputs.
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <fstream>
#include <regex>
#include <sstream>

using namespace tekoj_test;

namespace {

struct GoldenCase {
    std::string name, kind;
    uint32_t format = 0, quality = 0;
    int width = 0, height = 0;
    std::vector<int> band_heights;
};

// The cases file is a flat JSON list; the fields we need are scalars and one
// integer list, which a few regular expressions read reliably.
std::vector<GoldenCase> load_cases(const std::string& kind_filter) {
    std::ifstream f(golden_path("cases.json"));
    std::stringstream ss;
    ss << f.rdbuf();
    const std::string text = ss.str();
    std::vector<GoldenCase> out;
    size_t pos = 0;
    while ((pos = text.find("\"name\"", pos)) != std::string::npos) {
        size_t end = text.find("\"name\"", pos + 1);
        const std::string obj = text.substr(pos, end == std::string::npos ? std::string::npos : end - pos);
        auto field = [&](const char* key) {
            std::smatch m;
            std::regex re(std::string("\"") + key + "\": ?(\"([^\"]*)\"|(-?[0-9]+))");
            if (!std::regex_search(obj, m, re)) return std::string();
            return m[2].matched ? m[2].str() : m[3].str();
        };
        GoldenCase c;
        c.name = field("name");
        c.kind = field("kind");
        if (c.kind == kind_filter) {
            c.format = static_cast<uint32_t>(std::stoul(field("format")));
            c.width = std::stoi(field("width"));
            c.height = std::stoi(field("height"));
            c.quality = static_cast<uint32_t>(std::stoul(field("quality")));
            std::smatch m;
            if (std::regex_search(obj, m, std::regex("\"band_heights\":\\s*\\[([0-9,\\s]*)\\]"))) {
                std::stringstream list(m[1].str());
                std::string item;
                while (std::getline(list, item, ',')) c.band_heights.push_back(std::stoi(item));
            }
            out.push_back(c);
        }
        pos += 1;
    }
    return out;
}

}  // namespace

TEST(GoldenWhole, EveryCaseMatchesByteForByte) {
    const auto cases = load_cases("whole");
    ASSERT_FALSE(cases.empty());
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        const Bytes input = read_file(golden_path(c.name + ".in"));
        const Bytes expected = read_file(golden_path(c.name + ".expected"));
        ASSERT_EQ(input.size(), image_size(c.format, c.width, c.height));
        const ImageInfo info = image_info(input.data(), c.width, c.height, c.format);
        const Bytes got = encode_to_memory(info, c.quality);
        ASSERT_EQ(got.size(), expected.size());
        EXPECT_TRUE(got == expected);
    }
}

TEST(GoldenWhole, BandsJoinToTheExpectedStream) {
    const auto cases = load_cases("bands");
    ASSERT_FALSE(cases.empty());
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        const Bytes input = read_file(golden_path(c.name + ".in"));
        const Bytes expected = read_file(golden_path(c.name + ".expected"));
        const int bpp = bytes_per_pixel(c.format);
        Bytes joined;
        int top = 0;
        for (size_t b = 0; b < c.band_heights.size(); ++b) {
            ImageInfo info = image_info(input.data() + static_cast<size_t>(top) * c.width * bpp, c.width,
                                        c.band_heights[b], c.format);
            info.band_mode = 1;
            info.band_continued = b > 0;
            info.band_open_end = b + 1 < c.band_heights.size();
            info.total_height = c.height;
            info.band_top_row = top;
            const Bytes piece = encode_to_memory(info, c.quality);
            ASSERT_FALSE(piece.empty());
            joined.insert(joined.end(), piece.begin(), piece.end());
            top += c.band_heights[b];
        }
        ASSERT_EQ(joined.size(), expected.size());
        EXPECT_TRUE(joined == expected);
    }
}
