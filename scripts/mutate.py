#!/usr/bin/env python3
"""Mutation test of the unit suite.

Applies single-point changes to the library's sources one at a time (a
comparison flipped, a constant moved by one, a clamp or a refusal dropped),
rebuilds the test binary and runs it. A mutant is killed when the suite fails
(or hangs); it survives when the suite still passes. Prints the kill rate.

The mutants are applied to a copy of the tree in build-mutate/tree, never to
the working sources, so an interrupted run leaves nothing changed.

  scripts/mutate.py                 every mutant
  scripts/mutate.py -k quant dct    only mutants whose label holds a word
  scripts/mutate.py --list          the mutants, without running them

A mutant whose text is no longer found (the code moved on) is reported as
stale and not counted; one that does not compile is reported as invalid.
"""
import argparse
import os
import shutil
import subprocess
import sys
import time

ROOT = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))

# (label, file under src/, exact text, replacement)
MUTANTS = [
    # Huffman and entropy coding
    ("chroma DC code of category 11", "core/huffman_tables.cpp", "254, 510, 1022, 2046}", "254, 510, 1022, 2047}"),
    ("luma DC code size of category 11", "core/huffman_tables.cpp", "4, 5, 6, 7, 8, 9}", "4, 5, 6, 7, 8, 8}"),
    ("AC value clamp dropped", "core/entropy_kernel.h", "return x > 1023 ? 1023 : (x < -1023 ? -1023 : x);",
     "return x;"),
    ("restart marker number wraps at 4", "core/entropy_coder.cpp", "0xD0 + (rc.restart.index & 7)",
     "0xD0 + (rc.restart.index & 3)"),
    ("zero run of 16 counted as 15", "core/entropy_kernel.h", "run -= 16;", "run -= 15;"),
    ("pad byte filled with a 0 bit", "core/entropy_coder.cpp", "((1u << fill) - 1)", "((1u << fill) - 2)"),
    ("byte stuffing after FE", "core/entropy_kernel.h", "if ((b & 0xFF) == 0xFF) *out++ = 0;",
     "if ((b & 0xFF) == 0xFE) *out++ = 0;"),
    ("restart due one MCU late", "core/entropy_coder.h", "const bool due = phase == 0;", "const bool due = phase == 1;"),
    ("DC difference limit 2048", "core/entropy_coder.cpp", "if (diff > 2047 || diff < -2047) return false;",
     "if (diff > 2048 || diff < -2048) return false;"),
    ("AC limit 1024 in the look-ahead", "core/entropy_coder.cpp", "if (x > 1023 || x < -1023) return false;",
     "if (x > 1024 || x < -1024) return false;"),
    # Quantisation and transform
    ("divisor rounding constant", "core/quant_tables.cpp", "(q * kAanScale[index] + 1024) >> 11",
     "(q * kAanScale[index] + 0) >> 11"),
    ("quality scale above 50 off by one", "core/quant_tables.cpp", "200 - 2 * quality", "201 - 2 * quality"),
    ("table scaling rounds down", "core/quant_tables.cpp", "(base[i] * scale + 50) / 100", "(base[i] * scale + 49) / 100"),
    ("table entries clamped at 254", "core/quant_tables.cpp", "v > 255 ? 255 : v", "v > 254 ? 254 : v"),
    ("quality above 100 not clamped", "core/quant_tables.cpp", "if (context->quality > 100) context->quality = 100;",
     "if (context->quality > 101) context->quality = 100;"),
    ("negative coefficients round down", "core/forward_dct.h", "((p + 32768) >> 16)", "((p + 32767) >> 16)"),
    ("DCT rotation constant", "core/forward_dct.h", "mul8(tmp12 + tmp13, 181)", "mul8(tmp12 + tmp13, 182)"),
    # Header
    ("header tail room 128 bytes", "core/header_writer.cpp", "kHeaderTailRoom = 1280;", "kHeaderTailRoom = 128;"),
    ("DRI despite write_dri 0", "core/header_writer.cpp", "ctx->settings->write_dri != 0 ? ctx->mcus_per_row : 0",
     "ctx->mcus_per_row"),
    ("SOF sampling byte v, h", "core/header_writer.cpp", "(comp.h_samp_factor << 4) + comp.v_samp_factor",
     "(comp.v_samp_factor << 4) + comp.h_samp_factor"),
    ("one DQT too few with a settings record", "core/header_writer.cpp", "for (int32_t q = 0; q < tables; ++q)",
     "for (int32_t q = 1; q < tables; ++q)"),
    # Creation
    ("vertical factor 0 accepted", "api/context.cpp", "(spec[1] == 0 || spec[2] == 0)", "(spec[1] == 0)"),
    ("one component naming table 1 accepted", "api/context.cpp", "if (n == 1 && spec[0] != 0) return false;", ""),
    ("four quantisation tables refused", "api/context.cpp", "if (s->num_quant_tables > 4) return false;",
     "if (s->num_quant_tables >= 4) return false;"),
    ("largest dimension 50000", "api/context.cpp", "kMaxDimension = 49999;", "kMaxDimension = 50000;"),
    ("restart interval one MCU too long", "api/context.cpp", "ctx->restart_interval = ctx->mcus_per_row;",
     "ctx->restart_interval = ctx->mcus_per_row + 1;"),
    ("creation keeps a stale error", "api/context.cpp",
     "    eko_SetError(EKO_OK);\n    if (image_info == nullptr", "    if (image_info == nullptr"),
    # Entry points
    ("total_height 50000 accepted", "api/entry_points.cpp", "info->total_height <= 49999", "info->total_height <= 50000"),
    ("later band at top row 0 accepted", "api/entry_points.cpp", "info->band_top_row > 0 &&", "info->band_top_row >= 0 &&"),
    ("later band's restart number", "api/entry_points.cpp", "static_cast<uint32_t>((n - 1) % 8)",
     "static_cast<uint32_t>(n % 8)"),
    ("failed close ignored", "api/entry_points.cpp", "const bool closed = DORVATEKO_OsFclose(file) == 0;",
     "const bool closed = DORVATEKO_OsFclose(file) == 0 || true;"),
    ("null pixels accepted", "api/entry_points.cpp", "info != nullptr && info->data != nullptr;", "info != nullptr;"),
    ("creation failure clears the caller's block", "api/entry_points.cpp",
     "    if (r.outcome == Outcome::CreationFailed) return 0;\n    *buffer_io", "    *buffer_io"),
    ("smallest memory block 1024", "api/entry_points.cpp", "kMinMemoryBlock = 2048;", "kMinMemoryBlock = 1024;"),
    ("unopenable file reported as a bad argument", "api/entry_points.cpp", "eko_SetError(EKO_ERR_OPEN);",
     "eko_SetError(EKO_ERR_ARGUMENT);"),
    # Output target and completion
    ("memory grows by 1024", "sink/output_target.cpp", "{extra, 4096u, t->capacity / 2u}", "{extra, 1024u, t->capacity / 2u}"),
    ("short write unnoticed", "sink/output_target.cpp", "if (DORVATEKO_OsFwrite(data, 1, count, t->file) != count) {",
     "if (DORVATEKO_OsFwrite(data, 1, count, t->file) > count) {"),
    ("end margin of 1 byte", "api/stream_end.cpp", "make_room(ctx, 10, 10)", "make_room(ctx, 1, 10)"),
    # Incremental interface
    ("restart count not simulated in the row driver's look-ahead", "incremental/row_driver.cpp",
     "        clock.tick();\n        store_restart(ctx, clock);", "        store_restart(ctx, clock);"),
    ("predictors not walked in the row driver's look-ahead", "incremental/row_driver.cpp",
     "for (uint32_t n = 0; n < ctx->blocks_in_mcu; ++n) es->last_dc_val[ctx->mcu_membership[n]] = blocks[n][0];", ""),
    ("extra column after the last accepted", "incremental/column_split.cpp",
     "context->col_next_row >= columns_width(context)", "context->col_next_row > columns_width(context)"),
    ("row buffer share of the estimate", "incremental/column_split.cpp", "* 10u) >> 3", "* 10u) >> 2"),
    ("join markers wrap at 4", "incremental/column_split.cpp", "static_cast<uint8_t>(0xD0u + (r & 7u))",
     "static_cast<uint8_t>(0xD0u + (r & 3u))"),
    ("join before the last column", "incremental/column_split.cpp",
     "if (context->col_next_row < columns_width(context)) return refuse(EKO_ERR_STATE);", ""),
    ("join grown short of the end", "incremental/column_split.cpp", "2u * (count - 1) + 6u))", "2u * (count - 1) + 4u))"),
    ("stream callback replaced after coding", "incremental/mcu_rows.cpp",
     "context->finished != 0 || coding_started(context)) return refuse(EKO_ERR_STATE);",
     "context->finished != 0) return refuse(EKO_ERR_STATE);"),
    ("encdata reports the total", "incremental/mcu_rows.cpp", "*length_out = context->output->used;",
     "*length_out = context->output->total;"),
    ("finish with unjoined columns hands a stream back", "incremental/mcu_rows.cpp",
     "        release_row_streams(context);\n        fail(context, EKO_ERR_STATE);", "        release_row_streams(context);"),
    ("band buffer overrun not refused", "incremental/mcu_rows.cpp",
     "if (!band_regions_fit(ctx)) return", "if (false && !band_regions_fit(ctx)) return"),
    ("band after the last accepted", "incremental/incremental.h",
     "return ctx->mcu_state->imcu_row >= ctx->total_imcu_rows;", "return ctx->mcu_state->imcu_row > ctx->total_imcu_rows;"),
    # EXIF
    ("4-byte inline boundary of strings", "exif/tiff_writers.cpp", "    if (n <= 4) {", "    if (n < 4) {"),
    ("4-byte inline boundary of byte values", "exif/tiff_writers.cpp", "    if (count <= 4) {", "    if (count < 4) {"),
    ("date month 0-based", "exif/exif_block.cpp", "two(local.tm_mon + 1)", "two(local.tm_mon)"),
    ("GPS altitude reference 1 left out", "exif/exif_block.cpp", "if (g.altitude_ref <= 1)", "if (g.altitude_ref < 1)"),
    ("APP1 length 65535 refused", "exif/app1_writer.cpp", "if (segment_length > kMaxSegmentLength) {",
     "if (segment_length >= kMaxSegmentLength) {"),
    # Input readers and conversions
    ("down-scaler's second tap moved", "input/down_scaler.cpp", "next_second = (3 * sh) >> 2;",
     "next_second = (3 * sh + 2) >> 2;"),
    ("down-scaler's first tap moved", "input/down_scaler.cpp", "next_first = sh >> 2;", "next_first = (sh + 2) >> 2;"),
    ("packed reader takes Cr for Cb", "input/pixel_kernels.cpp", "cb[k] = s[1];", "cb[k] = s[3];"),
    ("interleaved V/U swapped", "input/sample_rows.cpp", "crrows[r][x] = src[2 * x];", "crrows[r][x] = src[2 * x + 1];"),
    ("RGB565 last odd column dropped", "display/yuv_to_rgb565.cpp", "    if (width & 1) {", "    if (false) {"),
    ("RGB565 refusal without reason", "display/yuv_to_rgb565.cpp",
     "width <= 0 || height <= 0 ? EKO_ERR_DIMENSIONS : EKO_OK", "EKO_OK"),
]


def run(cmd, cwd, timeout=None):
    return subprocess.run(cmd, cwd=cwd, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, timeout=timeout)


def copy_tree(dst):
    """Copies the tracked sources (as they are in the working tree) to dst."""
    files = subprocess.run(["git", "ls-files", "-z", "--cached", "--others", "--exclude-standard"], cwd=ROOT, stdout=subprocess.PIPE, check=True).stdout
    for rel in filter(None, files.decode().split("\0")):
        src = os.path.join(ROOT, rel)
        if not os.path.isfile(src):
            continue
        target = os.path.join(dst, rel)
        os.makedirs(os.path.dirname(target), exist_ok=True)
        # A plain copy: its time is now, so the build sees the change even
        # when the source is older than the copy's last build.
        if not os.path.exists(target) or open(src, "rb").read() != open(target, "rb").read():
            shutil.copyfile(src, target)


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("-k", nargs="*", default=[], help="run only mutants whose label holds one of these words")
    parser.add_argument("--list", action="store_true", help="list the mutants and stop")
    parser.add_argument("--jobs", default="2", help="build jobs (default 2)")
    parser.add_argument("--timeout", type=int, default=120, help="seconds before a test run counts as hung")
    args = parser.parse_args()

    chosen = [m for m in MUTANTS if not args.k or any(w.lower() in m[0].lower() for w in args.k)]
    if args.list:
        for label, path, _, _ in chosen:
            print(f"{path:32} {label}")
        return 0

    work = os.path.join(ROOT, "build-mutate")
    tree = os.path.join(work, "tree")
    build = os.path.join(work, "build")
    copy_tree(tree)
    if not os.path.exists(os.path.join(build, "build.ninja")):
        r = run(["cmake", "-S", tree, "-B", build, "-G", "Ninja", "-DCMAKE_BUILD_TYPE=Release",
                 "-DTEKOJ_BUILD_TESTS=ON", "-DTEKOJ_WERROR=ON", "-DTEKOJ_BUILD_BENCH=OFF", "-DTEKOJ_BUILD_TOOLS=OFF"],
                ROOT)
        if r.returncode != 0:
            sys.stdout.write(r.stdout.decode())
            return 1
    build_cmd = ["cmake", "--build", build, "-j", args.jobs, "--target", "tekoj_tests"]
    test_cmd = [os.path.join(build, "tests", "tekoj_tests"), "--gtest_brief=1"]
    if run(build_cmd, ROOT).returncode != 0 or run(test_cmd, build, args.timeout).returncode != 0:
        print("the unmutated suite does not build or pass; nothing to measure")
        return 1

    killed, survived, stale, invalid = [], [], [], []
    start = time.time()
    for i, (label, path, old, new) in enumerate(chosen, 1):
        file = os.path.join(tree, "src", path)
        original = open(file).read()
        if original.count(old) != 1:
            stale.append(label)
            print(f"[{i}/{len(chosen)}] stale     {label}")
            continue
        try:
            open(file, "w").write(original.replace(old, new))
            if run(build_cmd, ROOT).returncode != 0:
                invalid.append(label)
                verdict = "invalid"
            else:
                try:
                    verdict = "killed" if run(test_cmd, build, args.timeout).returncode != 0 else "SURVIVED"
                except subprocess.TimeoutExpired:
                    verdict = "killed"  # a hang is noticed too
                (killed if verdict == "killed" else survived).append(label)
        finally:
            open(file, "w").write(original)
        print(f"[{i}/{len(chosen)}] {verdict:9} {label}", flush=True)
    run(build_cmd, ROOT)  # leave the copy built unmutated

    counted = len(killed) + len(survived)
    rate = 100.0 * len(killed) / counted if counted else 0.0
    print(f"\nkilled {len(killed)} of {counted} mutants ({rate:.1f} %); "
          f"{len(stale)} stale, {len(invalid)} invalid; {time.time() - start:.0f} s")
    for label in survived:
        print(f"  survived: {label}")
    return 0


if __name__ == "__main__":
    sys.exit(main())
