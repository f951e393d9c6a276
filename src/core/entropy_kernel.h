// The bit writer and the block coding loop shared by every block kernel.
//
// Each SIMD target file includes this header and compiles the loop with its
// own instruction set, so everything here has internal linkage: a copy built
// for one target must never stand in for another's.
#pragma once

#include "core/entropy_coder.h"

#include <bit>
#include <cstdint>
#include <cstring>

namespace tekoj {

// Per-target kernels; each exists only in builds for its processor.
CoderKernels coder_kernels_sse2();
CoderKernels coder_kernels_avx2();
CoderKernels coder_kernels_avx512();
CoderKernels coder_kernels_neon();

namespace {

constexpr int kAccBits = static_cast<int>(sizeof(BitAcc) * 8);

// Whether any byte of the word is 0xFF: the classic zero-byte test on its
// complement.
inline bool has_ff_byte(BitAcc v) {
    constexpr BitAcc ones = ~BitAcc{0} / 0xFF;
    return ((~v - ones) & v & (ones << 7)) != 0;
}

inline void write_byte(uint8_t*& out, uint32_t b) {
    *out++ = static_cast<uint8_t>(b);
    if ((b & 0xFF) == 0xFF) *out++ = 0;
}

// Writes a full word byte by byte, stuffing after each 0xFF; out of line, so
// that the rare case does not crowd the inlined coding loop.
[[gnu::noinline]] inline uint8_t* write_word_stuffed(uint8_t* out, BitAcc v) {
    for (int s = kAccBits - 8; s >= 0; s -= 8) write_byte(out, static_cast<uint32_t>(v >> s) & 0xFF);
    return out;
}

// Writes the whole (full) accumulator, most significant byte first.
[[gnu::always_inline]] inline void flush_word(BitState& w) {
    const BitAcc v = w.acc;
    if (!has_ff_byte(v)) [[likely]] {
        BitAcc be;
        if constexpr (sizeof(BitAcc) == 8) {
            be = __builtin_bswap64(v);
        } else {
            be = __builtin_bswap32(v);
        }
        std::memcpy(w.out, &be, sizeof be);
        w.out += sizeof be;
    } else {
        w.out = write_word_stuffed(w.out, v);
    }
}

// Appends the low `size` bits of `code` (nothing above them set): at most 26
// bits, or with a 64-bit code into a 64-bit word at most 52 (two codes).
template <typename Code = uint32_t>
[[gnu::always_inline]] inline void put(BitState& w, Code code, int size) {
    w.free -= size;
    if (__builtin_expect(w.free >= 0, 1)) {
        w.acc = (w.acc << size) | code;
    } else {
        // Fill the word, write it, keep the rest of the code.
        w.acc = (w.acc << (size + w.free)) | (code >> -w.free);
        flush_word(w);
        w.acc = code;
        w.free += kAccBits;
    }
}

// Writes every whole waiting byte, leaving at most 7 bits.
inline void flush_whole_bytes(BitState& w) {
    int pending = kAccBits - w.free;
    while (pending >= 8) {
        pending -= 8;
        write_byte(w.out, static_cast<uint32_t>(w.acc >> pending) & 0xFF);
    }
    w.free = kAccBits - pending;
}

// One value of magnitude category k: the combined table entry (code already
// shifted left by k) with the k extra bits, the value itself when positive,
// the one's complement of its magnitude when negative.
[[gnu::always_inline]] inline void put_coded(BitState& w, uint32_t entry, int32_t x, int k) {
    const uint32_t extra = static_cast<uint32_t>(x + (x >> 31)) & ~(~0u << k);
    put(w, (entry >> 5) | extra, static_cast<int>(entry & 31));
}

inline int category(int32_t x) {
    const int32_t s = x >> 31;
    return std::bit_width(static_cast<uint32_t>((x ^ s) - s));
}

// The nonzero bitmap of a block's AC positions, in the order the scan loop
// consumes it. On 64-bit processors one word, position p at bit p, scanned
// with count-trailing-zeros; on 32-bit ones two words, position p at bit
// 31 - p % 32 of word p / 32, scanned with count-leading-zeros, which 32-bit
// ARM has as one instruction (trailing zeros take two).
#if UINTPTR_MAX > 0xFFFFFFFFu
using ScanWord = uint64_t;
inline constexpr bool kScanFromTop = false;
#else
using ScanWord = uint32_t;
inline constexpr bool kScanFromTop = true;
#endif
inline constexpr int kScanWordBits = static_cast<int>(sizeof(ScanWord) * 8);
inline constexpr int kScanWords = 64 / kScanWordBits;

struct ScanMap {
    ScanWord word[kScanWords];
};

inline constexpr ScanWord scan_bit(int p) {
    const int b = p % kScanWordBits;
    return kScanFromTop ? ScanWord{1} << (kScanWordBits - 1 - b) : ScanWord{1} << b;
}

// Zeros before the first set bit in scan order, and the word with that bit
// and everything before it consumed (two shifts: the count may be the
// word's width less one).
[[gnu::always_inline]] inline int first_set(ScanWord m) {
    if constexpr (kScanFromTop) return std::countl_zero(m);
    return std::countr_zero(m);
}
[[gnu::always_inline]] inline ScanWord skip_past(ScanWord m, int r) {
    if constexpr (kScanFromTop) return (m << r) << 1;
    return (m >> r) >> 1;
}

// Byte offsets of the coefficient at each zig-zag position in a block in
// natural order, and in one already in zig-zag order.
struct ScanOffsets {
    uint8_t natural[64];
    uint8_t zigzag[64];
};

constexpr ScanOffsets make_scan_offsets() {
    ScanOffsets t{};
    for (int p = 0; p < 64; ++p) {
        t.natural[p] = static_cast<uint8_t>(2 * kZigzagToNatural[p]);
        t.zigzag[p] = static_cast<uint8_t>(2 * p);
    }
    return t;
}

inline constexpr ScanOffsets kScanOffsets = make_scan_offsets();

// A biased value beyond +-1023 as +-1023 (category 10) is biased; out of
// line, so that the coding loop keeps the sign only where it needs it.
[[gnu::noinline]] inline uint32_t limited(uint32_t t) { return 0x3FFu ^ static_cast<uint32_t>(static_cast<int32_t>(t) >> 31); }

// Codes a block: the DC difference, then the AC positions set in `map`
// (positions 1..62 at most), limited to +-1023, then EOB. The value at
// position p is the int16 at byte offset offsets[p] of `values`, or
// values[p] when `offsets` is null (values already in zig-zag order).
[[gnu::always_inline]] inline void code_block_from_map(BitState& state, int32_t dc_diff, const uint32_t* dc,
                                                      const uint32_t* ac, const ScanMap& map, const int16_t* values,
                                                      const uint8_t* offsets) {
    // Word-sized signed counts throughout: no widening in the loop on 64-bit
    // processors.
    using Count = intptr_t;
    BitState w = state;
    {
        const int k = category(dc_diff);
        put_coded(w, dc[k], dc_diff, k);
    }
    const char* base = reinterpret_cast<const char*>(values);
    // Without offsets the values are in zig-zag order already.
    const uint8_t* order = offsets != nullptr ? offsets : kScanOffsets.zigzag;
    const uint32_t* ac_top = ac + 32;  // ac_top[16 * run - z]: the entry of category 32 - z
    const uint32_t* small = ac + 256;                          // see EkoCoderTables::ac
    auto code = [&](Count run, const uint8_t* at) __attribute__((always_inline)) {
        while (run > 15) [[unlikely]] {
            put(w, ac[0xF0] >> 5, static_cast<int>(ac[0xF0] & 31));
            run -= 16;
        }
        int16_t v;
        std::memcpy(&v, base + (offsets != nullptr ? static_cast<Count>(*at) : 2 * (at - order)), sizeof v);
        // Small values (nearly all): code, extra bits and length in one entry.
        const uint32_t index = static_cast<uint32_t>(v + static_cast<int32_t>(kSmallValueLimit));
        if (__builtin_expect(index <= 2 * kSmallValueLimit, 1)) {
            const uint32_t entry = small[run * kSmallRunStride + static_cast<Count>(index)];
            put(w, entry >> 5, static_cast<int>(entry & 31));
            return;
        }
        // Larger ones: category and extra bits computed: t is the value, less one when
        // negative (its low bits are the extra bits), t ^ sign the magnitude.
        const int32_t ts = v + (v >> 31);
        uint32_t t = static_cast<uint32_t>(ts);
        Count z = __builtin_clz(t ^ static_cast<uint32_t>(ts >> 31));  // 32 - category; the value is not 0
        if (__builtin_expect(z < 22, 0)) {
            t = limited(t);
            z = 22;
        }
        // The entry of category 32 - z.
        const uint32_t entry = ac_top[run * 16 - z];
        put(w, (entry >> 5) | ((t << z) >> z), static_cast<int>(entry & 31));
    };
    if constexpr (!kScanFromTop) {
        // One word: each position comes from the bitmap with its lowest bit
        // cleared, which is one step, so the loop's chain from position to
        // position stays short (shifting the word on would lengthen it).
        // Two neighbouring small values with short runs go into the word as
        // one code of up to 52 bits: half the appends.
        uint64_t m = map.word[0];
        Count last = 0;  // the DC position counts as coded
        auto small_entry = [&](Count run, Count p, uint32_t& entry) __attribute__((always_inline)) {
            int16_t v;
            std::memcpy(&v, base + (offsets != nullptr ? static_cast<Count>(offsets[p]) : 2 * p), sizeof v);
            const uint32_t index = static_cast<uint32_t>(v + static_cast<int32_t>(kSmallValueLimit));
            if (run > 15 || index > 2 * kSmallValueLimit) return false;
            entry = small[run * kSmallRunStride + static_cast<Count>(index)];
            return true;
        };
        while (m != 0) {
            const Count p = std::countr_zero(m);
            m &= m - 1;
            uint32_t first;
            if (!small_entry(p - last - 1, p, first)) {
                code(p - last - 1, order + p);
                last = p;
                continue;
            }
            last = p;
            uint32_t second;
            if (m == 0 || !small_entry(std::countr_zero(m) - last - 1, std::countr_zero(m), second)) {
                put(w, first >> 5, static_cast<int>(first & 31));
                continue;
            }
            last = std::countr_zero(m);
            m &= m - 1;
            const int second_size = static_cast<int>(second & 31);
            put<uint64_t>(w, static_cast<uint64_t>(first >> 5) << second_size | (second >> 5),
                     static_cast<int>(first & 31) + second_size);
        }
        put(w, ac[0] >> 5, static_cast<int>(ac[0] & 31));  // EOB
        state = w;
        return;
    }
    // `carry`: zeros since the last coded position that belong to the next
    // run (the DC position counts as coded, hence -1 before position 0).
    Count carry = -1;
#pragma GCC unroll 2
    for (int h = 0; h < kScanWords; ++h) {
        ScanWord m = map.word[h];
        if (m == 0) {
            carry += kScanWordBits;
            continue;
        }
        const uint8_t* at = order + h * kScanWordBits - 1;  // last position consumed
        Count r = first_set(m);
        m = skip_past(m, static_cast<int>(r));
        at += r + 1;
        code(r + carry, at);
        while (m != 0) {
            // The word was shifted by one at least, so r + 1 is below its
            // width and one shift does.
            r = first_set(m);
            const Count step = r + 1;
            m = kScanFromTop ? m << step : m >> step;
            at += step;
            code(r, at);
        }
        carry = order + (h + 1) * kScanWordBits - 1 - at;
    }
    put(w, ac[0] >> 5, static_cast<int>(ac[0] & 31));  // EOB
    state = w;
}

// The kernels of one target from its inline block coder: one block out of
// line, and the blocks of an MCU in one loop, so that the accumulator stays
// in registers from block to block.
template <void (*kCodeBlock)(BitState&, int32_t, const int16_t*, const uint32_t*, const uint32_t*)>
struct KernelsOf {
    static void block(BitState& bits, int32_t dc_diff, const int16_t* blk, const uint32_t* dc, const uint32_t* ac) {
        kCodeBlock(bits, dc_diff, blk, dc, ac);
    }
    static void mcu(BitState& bits, const CoderTables& t, int16_t* const* blocks, int32_t* last_dc) {
        BitState w = bits;
        for (uint32_t n = 0; n < t.blocks_in_mcu; ++n) {
            const uint32_t c = t.block_comp[n];
            int16_t* blk = blocks[n];
            int32_t diff = blk[0] - last_dc[c];
            // The pixel path never exceeds category 11; a caller's blocks might.
            diff = diff > 2047 ? 2047 : (diff < -2047 ? -2047 : diff);
            kCodeBlock(w, diff, blk, t.dc[t.block_dc[n]], t.ac[t.block_ac[n]]);
            blk[kZigzagToNatural[63]] = 0;
            last_dc[c] = blk[0];
        }
        bits = w;
    }
    static constexpr CoderKernels kernels{block, mcu};
};

}  // namespace
}  // namespace tekoj
