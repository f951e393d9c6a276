#!/bin/sh
# Where the ARM instructions of one encode go, per function: the armhf
# benchmark program (non-PIE, library linked in) runs under qemu-arm with a
# plugin that counts every translated block's executions
# (bench/arm_hotblocks.c); 1 and 3 repetitions, half the difference per
# encode, divided by the pixel count, as scripts/arm-icount-bench.sh does.
#
#   scripts/arm-profile.sh [FORMAT [QUALITY [FUNCTION]]]   defaults: yuv420 75
# FORMAT: rgb888 rgba8888 bgra8888 rgb565 yuv420 nv21 yuyv grey ...
# (see bench/arm_icount_bench.cpp). With FUNCTION (a substring of a mangled
# name), also that function's hottest blocks with their addresses, for
# `arm-linux-gnueabihf-objdump -d --start-address=...`.
# Environment: TEKOJ_SIMD forces our level; BUILD_DIR.
set -eu
cd "$(dirname "$0")/.."
ROOT=$(pwd)
IMAGE=${IMAGE:-$ROOT/../shared/images/elephants-3840x2160.jpg}
[ -f "$IMAGE" ] || IMAGE=/work/shared/images/elephants-3840x2160.jpg
BUILD_DIR=${BUILD_DIR:-build-armhf-profile}
FORMAT=${1:-yuv420} QUALITY=${2:-75} FUNCTION=${3:-}
W=1920 H=1088
skip() { echo "arm-profile: skipped: $1"; exit 0; }
command -v arm-linux-gnueabihf-g++ >/dev/null 2>&1 || skip "no arm-linux-gnueabihf-g++"
command -v qemu-arm >/dev/null 2>&1 || skip "no qemu-arm"
command -v python3 >/dev/null 2>&1 || skip "no python3"
[ -f /usr/lib/arm-linux-gnueabihf/pkgconfig/libturbojpeg.pc ] || skip "no armhf libturbojpeg (libturbojpeg0-dev:armhf)"
[ -f "$IMAGE" ] || skip "no image $IMAGE"

cmake -S . -B "$BUILD_DIR" -G Ninja -DCMAKE_BUILD_TYPE=Release -DCMAKE_TOOLCHAIN_FILE=cmake/toolchains/armhf.cmake \
  -DTEKOJ_BUILD_BENCH=ON -DTEKOJ_BUILD_TESTS=OFF -DTEKOJ_BUILD_TOOLS=OFF -DBUILD_SHARED_LIBS=OFF \
  -DCMAKE_POSITION_INDEPENDENT_CODE=OFF -DCMAKE_CXX_FLAGS=-fno-pie -DCMAKE_EXE_LINKER_FLAGS=-no-pie >/dev/null 2>&1 ||
  skip "armhf configure failed"
cmake --build "$BUILD_DIR" -j 2 --target arm_icount_bench >/dev/null
BIN=$BUILD_DIR/bench/arm_icount_bench
PLUGIN=$BUILD_DIR/libarm_hotblocks.so
[ "$PLUGIN" -nt bench/arm_hotblocks.c ] ||
  cc -shared -fPIC -O2 bench/arm_hotblocks.c -o "$PLUGIN" -Wl,--unresolved-symbols=ignore-all
RAW=$BUILD_DIR/frame-${W}x${H}.rgb
[ -f "$RAW" ] || qemu-arm -cpu max "$BIN" prepare "$IMAGE" "$RAW" $W $H >/dev/null
[ -e /lib/ld-linux-armhf.so.3 ] || export QEMU_LD_PREFIX=/usr/arm-linux-gnueabihf
OURS_ENV=""
[ -n "${TEKOJ_SIMD:-}" ] && OURS_ENV="-E TEKOJ_SIMD=$TEKOJ_SIMD"
for n in 1 3; do
  # shellcheck disable=SC2086
  HOT_OUT=$BUILD_DIR/hot-$n.txt qemu-arm -cpu max $OURS_ENV -plugin "$PLUGIN" "$BIN" ours "$FORMAT" "$QUALITY" $n "$RAW" $W $H >/dev/null
done
arm-linux-gnueabihf-nm -C --defined-only -n "$BIN" >"$BUILD_DIR/symbols.txt"
arm-linux-gnueabihf-nm --defined-only -n "$BIN" >"$BUILD_DIR/symbols-mangled.txt"
echo "ARM instructions per pixel of one ${FORMAT} q${QUALITY} encode, ${W}x${H}, by function"
python3 - "$BUILD_DIR" $((W * H)) "$FUNCTION" <<'PY'
import bisect, collections, sys
build, pixels, function = sys.argv[1], float(sys.argv[2]), sys.argv[3]
def symbols(path):
    out = []
    for line in open(path):
        parts = line.rstrip('\n').split(' ', 2)
        if len(parts) == 3 and parts[1] in 'tTwW':
            out.append((int(parts[0], 16) & ~1, parts[2]))
    out.sort()
    return out
demangled, mangled = symbols(build + '/symbols.txt'), symbols(build + '/symbols-mangled.txt')
starts = [a for a, _ in demangled]
def owner(addr, table):
    i = bisect.bisect_right(starts, addr) - 1
    return table[i][1] if i >= 0 and addr < 0x1000000 else '(shared libraries)'
def load(n):
    blocks = {}
    for line in open(f'{build}/hot-{n}.txt'):
        a, size, count = line.split()
        a = int(a, 16)
        size0, count0 = blocks.get(a, (int(size), 0))
        blocks[a] = (size0, count0 + int(count))
    return blocks
one, three = load(1), load(3)
per_block = {a: (size, (count - one.get(a, (size, 0))[1]) / 2) for a, (size, count) in three.items()}
by_function = collections.Counter()
for a, (size, execs) in per_block.items():
    by_function[owner(a, demangled)] += size * execs
total = sum(by_function.values())
for name, n in by_function.most_common(12):
    if n <= 0: break
    print(f'{n / pixels:8.2f} {100 * n / total:5.1f}%  {name[:100]}')
print(f'{total / pixels:8.2f}        total')
if function:
    print(f'hottest blocks of functions matching {function!r}: address, instructions, executions per encode')
    rows = [(size * execs, a, size, execs) for a, (size, execs) in per_block.items() if function in owner(a, mangled)]
    for n, a, size, execs in sorted(rows, reverse=True)[:12]:
        print(f'  {a:08x} {size:4d} {execs:12.0f}  {100 * n / total:5.1f}%')
PY
