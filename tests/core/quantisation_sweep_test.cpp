// The quantisation of every level's transform kernel against the 64-bit
// reference, on every 16-bit input value and every divisor word a table can
// hold (65536 / d for each quantiser step d from 1 to 2040 in the
// transform's scale, that is raw values 1 to 255 at every position). The
// words below 32768 run through the kernels' narrow 16-bit path; the first
// group, with the words 65536 and 32768, through the wide one.
#include "core/forward_dct.h"

#include <gtest/gtest.h>

#include <set>
#include <vector>

namespace {

std::vector<std::vector<uint32_t>> divisor_groups() {
    std::vector<std::vector<uint32_t>> groups(1);
    for (uint32_t d = 1; d <= 64; ++d) groups[0].push_back(65536 / d);
    std::set<uint32_t> narrow;
    for (uint32_t d = 3; d <= 2040; ++d) narrow.insert(65536 / d);
    for (uint32_t m : narrow) {
        if (groups.back().size() == 64 || groups.size() == 1) groups.emplace_back();
        groups.back().push_back(m);
    }
    while (groups.back().size() < 64) groups.back().push_back(groups.back().front());
    return groups;
}

TEST(QuantisationSweep, EveryLevelMatchesTheWideReferenceOnEveryValueAndWord) {
    constexpr tekoj::SimdLevel kLevels[] = {tekoj::SimdLevel::portable, tekoj::SimdLevel::sse2,
                                            tekoj::SimdLevel::avx2, tekoj::SimdLevel::neon};
    // Block b of the sweep holds the value b - 32768 at every position.
    constexpr uint32_t kBlocks = 65536;
    std::vector<int16_t> x(64 * kBlocks), got(64 * kBlocks);
    for (uint32_t b = 0; b < kBlocks; ++b)
        for (int i = 0; i < 64; ++i) x[64 * b + i] = static_cast<int16_t>(static_cast<int32_t>(b) - 32768);
    const auto groups = divisor_groups();
    for (tekoj::SimdLevel level : kLevels) {
        if (!tekoj::simd_supported(level)) continue;
        const tekoj::QuantiseBlocksFn quantise = tekoj::quantise_blocks_for(level);
        for (size_t g = 0; g < groups.size(); ++g) {
            tekoj::QuantTable quant;
            tekoj::prepare_quant_table(groups[g].data(), quant);
            ASSERT_EQ(quant.narrow, g != 0);
            quantise(x.data(), kBlocks, quant, got.data());
            for (uint32_t k = 0; k < 64 * kBlocks; ++k) {
                const int16_t want = tekoj::dct_detail::quantise_wide(x[k], groups[g][k % 64]);
                ASSERT_EQ(got[k], want) << tekoj::simd_level_name(level) << " x " << x[k] << " word "
                                        << groups[g][k % 64];
            }
        }
    }
}

}  // namespace
