// Block entropy coding: baseline Huffman coding of coefficient blocks, byte
// stuffing and restart markers.
//
// The coder is split in two: the read-only CoderTables of one encode (code
// tables, the MCU's block layout, the block kernel), built once, and a
// RowCoder that holds everything that changes while coding (bit accumulator,
// output cursor, DC predictors, restart clock). Several row coders can work
// on one encode with the same tables.
#pragma once

#include <TekoJEncoderInternal.h>

#include "sink/output_target.h"

#include <cstdint>

namespace tekoj {

// Natural (row-major) index of each zig-zag position.
inline constexpr uint8_t kZigzagToNatural[64] = {
    0,  1,  8,  16, 9,  2,  3,  10, 17, 24, 32, 25, 18, 11, 4,  5,  12, 19, 26, 33, 40, 48,
    41, 34, 27, 20, 13, 6,  7,  14, 21, 28, 35, 42, 49, 56, 57, 50, 43, 36, 29, 22, 15, 23,
    30, 37, 44, 51, 58, 59, 52, 45, 38, 31, 39, 46, 53, 60, 61, 54, 47, 55, 62, 63};

// The bit accumulator is one machine word: 64-bit shifts cost several
// instructions on 32-bit processors.
#if UINTPTR_MAX > 0xFFFFFFFFu
using BitAcc = uint64_t;
#else
using BitAcc = uint32_t;
#endif

// Bits waiting to be written: `acc` holds them at its low end (anything above
// them was written already), `free` counts the unused bits of the word, `out`
// is where the next byte goes.
struct BitState {
    BitAcc acc;
    int32_t free;
    uint8_t* out;
};

// Codes one block: the DC difference (already limited to the baseline range)
// and AC positions 1 to 62 of `block` (natural order) with their values
// limited to +-1023, then EOB. `dc` and `ac` are combined code tables (see
// CoderTables). Never writes more than kBlockWorstCase bytes.
using BlockKernel = void (*)(BitState& bits, int32_t dc_diff, const int16_t* block, const uint32_t* dc,
                             const uint32_t* ac);

// Bytes a block can produce at worst: DC (22 bits), 62 AC values of 26 bits,
// EOB; every byte possibly stuffed; plus the bits still waiting from earlier
// codes and a restart marker with its pad byte.
inline constexpr uint32_t kBlockWorstCase = 2 * ((22 + 62 * 26 + 16 + 7) / 8) + 16;

}  // namespace tekoj

struct EkoCoderTables;

namespace tekoj {

// Codes the blocks of one MCU as BlockKernel does each, with the DC
// differences from and back into `last_dc` (per scan component) and the
// last zig-zag position of each block cleared after coding. The caller has
// made room for blocks_in_mcu * kBlockWorstCase bytes.
using McuKernel = void (*)(BitState& bits, const ::EkoCoderTables& tables, int16_t* const* blocks, int32_t* last_dc);

// Each AC table in the coder's tables (EkoCoderTables::ac): 256 symbol
// entries, then a row of kSmallRunStride entries per run for the values
// within +-kSmallValueLimit.
inline constexpr uint32_t kSmallValueLimit = 63;
inline constexpr uint32_t kSmallRunStride = 2 * kSmallValueLimit + 2;
inline constexpr uint32_t kAcTableWords = 256 + 16 * kSmallRunStride;

}  // namespace tekoj

// Read-only coding tables of one encode. A code table entry holds, for one
// symbol with k extra bits (k = the DC category, or the low four bits of an
// AC symbol), the Huffman code shifted left by k in its upper bits and the
// total length (code + k) in its low five bits, so that coding a value is
// one lookup and an OR of the extra bits.
// (Declared outside the namespace: the context names it.)
struct EkoCoderTables {
    uint32_t dc[2][16];
    // Per AC table: the 256 symbol entries, then the entries of small
    // values with their extra bits already in place: [256 +
    // kSmallRunStride * run + value + kSmallValueLimit] for runs 0..15 and
    // values within +-kSmallValueLimit.
    uint32_t ac[2][tekoj::kAcTableWords];
    tekoj::BlockKernel kernel;   // one block
    tekoj::McuKernel mcu_kernel;  // all blocks of an MCU, when room for all is certain
    uint32_t mcu_room;  // free bytes that let an MCU through without room checks
    uint8_t blocks_in_mcu;
    uint8_t comps_in_scan;
    uint8_t block_comp[10];  // scan component of each block of the MCU
    uint8_t block_dc[10];    // DC table of each block
    uint8_t block_ac[10];    // AC table of each block
};

namespace tekoj {

using CoderTables = ::EkoCoderTables;

// Restart bookkeeping: whether a marker is due before the next MCU, counted
// without a division per MCU.
struct RestartClock {
    uint32_t interval;  // MCUs per restart interval; 0: no markers
    int32_t count;      // MCUs coded so far, -1 before the first
    uint32_t phase;     // count mod interval
    uint32_t index;     // number of the next RST marker

    // Advances past the MCU about to be coded; true when a marker goes
    // before it.
    bool tick() {
        if (interval == 0) return false;
        if (count == -1) {
            count = 1;
            phase = 1 % interval;
            return false;
        }
        const bool due = phase == 0;
        ++count;
        if (++phase == interval) phase = 0;
        return due;
    }
};

// Everything that changes while one run of MCUs is coded: the bits, the
// predictors, the restart clock, and the target its bytes go to.
struct RowCoder {
    BitState bits;
    int32_t last_dc[3];
    RestartClock restart;
    Sink sink;
};

// Builds the context's CoderTables from its Huffman tables and MCU layout.
// Runs once per encode, after the scan set-up.
bool build_coder_tables(EncoderContext* ctx);

// The restart clock of the context (suspended column-split mode counts as
// no markers), and its write-back.
RestartClock load_restart(const EncoderContext* ctx);
void store_restart(EncoderContext* ctx, const RestartClock& clock);

// Takes up the context's coder state (EntropyState, restart fields, output
// cursor) / writes it back, with at most 7 bits left waiting.
void begin_coding(RowCoder& rc, EncoderContext* ctx);
void end_coding(RowCoder& rc, EncoderContext* ctx);

// A coder for one MCU row of its own, coded into `sink` from its current fill
// count: empty accumulator, predictors 0, no restart markers (whoever joins
// the rows puts them between). finish_row pads the last byte with 1-bits.
void start_row(RowCoder& rc, Sink sink);
bool finish_row(RowCoder& rc);

// Codes one MCU (restart marker first, when one is due) with the encode's
// read-only tables. Returns false once the coder's output has failed (it
// could not be grown or handed on). Touches nothing but `rc`, its target and
// the blocks, so coders of separate rows can run at once.
bool code_mcu(RowCoder& rc, const CoderTables& tables, int16_t* const* blocks);

// One MCU with the context's own coder state.
bool encode_mcu(EncoderContext* ctx, int16_t* const* blocks);

// Appends `size` (at most 16) bits of `code` to a coder's output.
void put_bits(RowCoder& rc, uint32_t code, int size);

// The context's waiting bits completed with 1-bits (the fill before EOI).
void pad_final_byte(EncoderContext* ctx);

// True when every block of the MCU can be coded with the baseline tables:
// DC differences (from the predictors the coder will use) of magnitude at
// most 2047 and AC values of magnitude at most 1023. Reads nothing but the
// blocks and the coder state.
bool mcu_codable(const EncoderContext* ctx, int16_t* const* blocks);

// The coding kernels of a SIMD level (the portable ones where the level has
// none or this build lacks them).
struct CoderKernels {
    BlockKernel block;
    McuKernel mcu;
};
CoderKernels coder_kernels_for(int simd_level);

}  // namespace tekoj
