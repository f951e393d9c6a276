#include "core/simd_level.h"

#include <cstdlib>
#include <cstring>

#if defined(__x86_64__) || defined(__i386__)
#include <cpuid.h>
#endif

#if defined(__arm__) && defined(__linux__)
#include <sys/auxv.h>
#ifndef HWCAP_NEON
#define HWCAP_NEON (1 << 12)
#endif
#endif

namespace tekoj {
namespace {

SimdLevel detect() {
#if defined(__x86_64__) || defined(__i386__)
    __builtin_cpu_init();
    // The AVX2 kernels (which the AVX-512 level runs too) are built with the
    // bit-manipulation sets every AVX2 processor has, unless a hypervisor
    // hides them: then the SSE2 level.
    unsigned a = 0, b = 0, c = 0, d = 0;
    const bool lzcnt = __get_cpuid(0x80000001u, &a, &b, &c, &d) != 0 && (c & (1u << 5)) != 0;
    const bool bits = lzcnt && __builtin_cpu_supports("bmi") && __builtin_cpu_supports("bmi2") &&
                      __builtin_cpu_supports("popcnt");
    if (bits && __builtin_cpu_supports("avx512f") && __builtin_cpu_supports("avx512bw")) return SimdLevel::avx512;
    if (bits && __builtin_cpu_supports("avx2")) return SimdLevel::avx2;
    if (__builtin_cpu_supports("sse2")) return SimdLevel::sse2;
    return SimdLevel::portable;
#elif defined(__arm__) && defined(__linux__)
    // /proc/cpuinfo is not trustworthy (emulators show the host's); the
    // kernel's hardware capability word is.
    return (getauxval(AT_HWCAP) & HWCAP_NEON) != 0 ? SimdLevel::neon : SimdLevel::portable;
#elif defined(__aarch64__)
    return SimdLevel::neon;
#else
    return SimdLevel::portable;
#endif
}

constexpr const char* kNames[] = {"portable", "sse2", "avx2", "avx512", "neon"};

SimdLevel choose() {
    const SimdLevel best = detect();
    const char* forced = std::getenv("TEKOJ_SIMD");
    if (forced == nullptr) return best;
    for (int i = 0; i < 5; ++i) {
        const auto level = static_cast<SimdLevel>(i);
        if (std::strcmp(forced, kNames[i]) == 0) return simd_supported(level) ? level : best;
    }
    return best;
}

}  // namespace

bool simd_supported(SimdLevel level) {
    if (level == SimdLevel::portable) return true;
    const SimdLevel best = detect();
    if (best == SimdLevel::neon || level == SimdLevel::neon) return best == level;
    return static_cast<int>(level) <= static_cast<int>(best);
}

SimdLevel simd_level() {
    // A function-local static is initialised exactly once, thread-safely; it
    // is the library's only process-wide state.
    static const SimdLevel level = choose();
    return level;
}

const char* simd_level_name(SimdLevel level) { return kNames[static_cast<int>(level)]; }

}  // namespace tekoj
