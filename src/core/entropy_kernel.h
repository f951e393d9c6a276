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

// Per-target block kernels; each exists only in builds for its processor.
void code_block_sse2(BitState& bits, int32_t dc_diff, const int16_t* block, const uint32_t* dc, const uint32_t* ac);
void code_block_avx2(BitState& bits, int32_t dc_diff, const int16_t* block, const uint32_t* dc, const uint32_t* ac);
void code_block_neon(BitState& bits, int32_t dc_diff, const int16_t* block, const uint32_t* dc, const uint32_t* ac);

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

// Writes the whole (full) accumulator, most significant byte first.
inline void flush_word(BitState& w) {
    const BitAcc v = w.acc;
    if (!has_ff_byte(v)) {
        BitAcc be;
        if constexpr (sizeof(BitAcc) == 8) {
            be = __builtin_bswap64(v);
        } else {
            be = __builtin_bswap32(v);
        }
        std::memcpy(w.out, &be, sizeof be);
        w.out += sizeof be;
    } else {
        for (int s = kAccBits - 8; s >= 0; s -= 8) write_byte(w.out, static_cast<uint32_t>(v >> s) & 0xFF);
    }
}

// Appends the low `size` bits of `code` (nothing above them set); size is at
// most 26.
inline void put(BitState& w, uint32_t code, int size) {
    const int free = w.free - size;
    if (free >= 0) {
        w.acc = (w.acc << size) | code;
        w.free = free;
    } else {
        // Fill the word, write it, keep the rest of the code.
        w.acc = (w.acc << (size + free)) | (code >> -free);
        flush_word(w);
        w.acc = code;
        w.free = free + kAccBits;
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
inline void put_coded(BitState& w, uint32_t entry, int32_t x, int k) {
    const uint32_t extra = static_cast<uint32_t>(x + (x >> 31)) & ((1u << k) - 1);
    put(w, (entry >> 5) | extra, static_cast<int>(entry & 31));
}

inline int category(int32_t x) {
    const int32_t s = x >> 31;
    return std::bit_width(static_cast<uint32_t>((x ^ s) - s));
}

inline int32_t clamp_ac(int32_t x) { return x > 1023 ? 1023 : (x < -1023 ? -1023 : x); }

// Codes a block whose nonzero AC positions (1..62, zig-zag order) are the
// bits of `mask`; `value(p)` gives the limited value at position p.
template <typename Value>
inline void code_block_from_mask(BitState& state, int32_t dc_diff, const uint32_t* dc, const uint32_t* ac,
                                 uint64_t mask, Value value) {
    BitState w = state;  // a local copy stays in registers despite the byte stores
    {
        const int k = category(dc_diff);
        put_coded(w, dc[k], dc_diff, k);
    }
    int prev = 0;
    auto code_at = [&](int p) {
        int run = p - prev - 1;
        prev = p;
        while (run > 15) {
            put(w, ac[0xF0] >> 5, static_cast<int>(ac[0xF0] & 31));
            run -= 16;
        }
        const int32_t x = value(p);
        const int k = category(x);
        put_coded(w, ac[(run << 4) + k], x, k);
    };
#if UINTPTR_MAX > 0xFFFFFFFFu
    while (mask != 0) {
        code_at(std::countr_zero(mask));
        mask &= mask - 1;
    }
#else
    // Two 32-bit halves: 64-bit bit scans are several instructions here.
    for (uint32_t m = static_cast<uint32_t>(mask); m != 0; m &= m - 1) code_at(std::countr_zero(m));
    for (uint32_t m = static_cast<uint32_t>(mask >> 32); m != 0; m &= m - 1) code_at(32 + std::countr_zero(m));
#endif
    put(w, ac[0] >> 5, static_cast<int>(ac[0] & 31));  // EOB
    state = w;
}

}  // namespace
}  // namespace tekoj
