// The SIMD level the process uses, chosen once from what the CPU reports.
// Every fast path produces exactly the bytes of the portable one, so the level
// only changes speed; TEKOJ_SIMD=portable|sse2|avx2|avx512|neon forces a level
// (for tests and benchmarks). A forced level the CPU lacks falls back to the
// best one it has, never to an instruction it would fault on.
#pragma once

namespace tekoj {

enum class SimdLevel { portable = 0, sse2 = 1, avx2 = 2, avx512 = 3, neon = 4 };

// The level in effect: detected (or forced) on the first call, then fixed.
SimdLevel simd_level();

// Whether the CPU running the process can execute `level`.
bool simd_supported(SimdLevel level);

// Name of a level as TEKOJ_SIMD spells it.
const char* simd_level_name(SimdLevel level);

}  // namespace tekoj
