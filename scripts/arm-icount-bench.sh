#!/bin/sh
# ARM instructions per pixel of one encode, ours against libjpeg-turbo with its
# NEON forced on, counted under qemu-arm (../shared/tools/arm-icount): each
# case runs with 1 and 3 repetitions and half the difference is one encode.
#
#   scripts/arm-icount-bench.sh [quick|parallel]     quick: RGB888, YUV 4:2:0, grey only;
#                                                    parallel: the row-parallel calls' overhead
# Environment: TEKOJ_SIMD forces our level (portable, neon); BUILD_DIR.
# Skips (status 0) where the cross tool chain, qemu-arm or armhf TurboJPEG is absent.
set -eu
cd "$(dirname "$0")/.."
ROOT=$(pwd)
ICOUNT=${ARM_ICOUNT:-$ROOT/../shared/tools/arm-icount/arm-icount}
[ -x "$ICOUNT" ] || ICOUNT=/work/shared/tools/arm-icount/arm-icount
IMAGE=${IMAGE:-$ROOT/../shared/images/elephants-3840x2160.jpg}
[ -f "$IMAGE" ] || IMAGE=/work/shared/images/elephants-3840x2160.jpg
BUILD_DIR=${BUILD_DIR:-build-armhf-bench}
W=1920 H=1088
skip() { echo "arm-icount-bench: skipped: $1"; exit 0; }
command -v arm-linux-gnueabihf-g++ >/dev/null 2>&1 || skip "no arm-linux-gnueabihf-g++"
command -v qemu-arm >/dev/null 2>&1 || skip "no qemu-arm"
[ -x "$ICOUNT" ] || skip "no arm-icount tool"
[ -f /usr/lib/arm-linux-gnueabihf/pkgconfig/libturbojpeg.pc ] || skip "no armhf libturbojpeg (libturbojpeg0-dev:armhf)"
[ -f "$IMAGE" ] || skip "no image $IMAGE"

cmake -S . -B "$BUILD_DIR" -G Ninja -DCMAKE_BUILD_TYPE=Release -DCMAKE_TOOLCHAIN_FILE=cmake/toolchains/armhf.cmake \
  -DTEKOJ_BUILD_BENCH=ON -DTEKOJ_BUILD_TESTS=OFF -DTEKOJ_BUILD_TOOLS=OFF >/dev/null 2>&1 || skip "armhf configure failed"
cmake --build "$BUILD_DIR" -j 2 --target arm_icount_bench >/dev/null
BIN=$BUILD_DIR/bench/arm_icount_bench
RAW=$BUILD_DIR/frame-${W}x${H}.rgb
[ -f "$RAW" ] || "$ICOUNT" "$BIN" prepare "$IMAGE" "$RAW" $W $H >/dev/null

count() {  # who env format q reps -> instruction count
  ARM_ICOUNT_ENV="$2" "$ICOUNT" "$BIN" "$1" "$3" "$4" "$5" "$RAW" $W $H 2>&1 | awk '/^icount/ {print $2}'
}
per_pixel() {  # who env format q -> instructions per pixel of one encode
  one=$(count "$1" "$2" "$3" "$4" 1)
  three=$(count "$1" "$2" "$3" "$4" 3)
  awk -v a="$one" -v b="$three" -v n=$((W * H)) 'BEGIN { printf "%.1f", (b - a) / 2 / n }'
}

OURS_ENV=""
[ -n "${TEKOJ_SIMD:-}" ] && OURS_ENV="TEKOJ_SIMD=$TEKOJ_SIMD"
# Rows of ours against OTHER at qualities 75 and 90, with EXPR of a (ours)
# and b (other) as the last column.
compare() {  # other other_env expr format...
  other=$1 other_env=$2 expr=$3
  shift 3
  for fmt in "$@"; do
    for q in 75 90; do
      o=$(per_pixel ours "$OURS_ENV" $fmt $q)
      t=$(per_pixel "$other" "$other_env" $fmt $q)
      printf '%-11s %3s %8s %8s %8s\n' $fmt $q "$o" "$t" "$(awk -v a="$o" -v b="$t" "BEGIN { printf \"%.2f\", $expr }")"
    done
  done
}

if [ "${1:-}" = parallel ]; then
  # The row-parallel path, driven from one thread, against the whole-image call.
  echo "ARM instructions per pixel, ${W}x${H} crop, single-threaded call against the row-parallel calls"
  printf '%-11s %3s %8s %8s %8s\n' input q whole parallel 'extra %'
  compare parallel "$OURS_ENV" '(b / a - 1) * 100' rgb888 yuv420 grey
  exit 0
fi
echo "ARM instructions per pixel, ${W}x${H} top-left crop of $(basename "$IMAGE"), 4:2:0, fast DCT, to memory"
echo "ours: TEKOJ_SIMD=${TEKOJ_SIMD:-auto}; libjpeg-turbo: JSIMD_FORCENEON=1"
printf '%-11s %3s %8s %8s %8s\n' input q ours turbo ratio
compare turbo "JSIMD_FORCENEON=1" 'a / b' rgb888 yuv420 grey
[ "${1:-}" = quick ] && exit 0
compare turbo "JSIMD_FORCENEON=1" 'a / b' rgba8888 bgra8888
for fmt in rgb565 nv21 packed422 packed422k; do
  for q in 75 90; do
    printf '%-11s %3s %8s %8s %7s\n' $fmt $q "$(per_pixel ours "$OURS_ENV" $fmt $q)" - -
  done
done
echo "conversions (per source pixel):"
for fmt in downscale rgb565conv pyv565conv; do
  printf '%-11s %3s %8s %8s %7s\n' $fmt - "$(per_pixel ours "$OURS_ENV" $fmt 75)" - -
done
