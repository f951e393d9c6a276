#!/bin/sh
# The project's whole check, as CI runs it on a fresh Debian 12 machine:
#   1. g++ Release: library, tool, tests and benchmarks; the whole suite
#      (installed-tree consumers and the export list included);
#   2. the static library, installed and linked by the same outside consumers;
#   3. clang: everything built, warnings are errors;
#   4. g++ with AddressSanitizer and UndefinedBehaviorSanitizer: the suite;
#   5. armhf cross build (Debian's arm-linux-gnueabihf tool chain): the suite
#      under qemu-arm, once with the NEON paths the emulated processor
#      reports and once on the portable paths;
#   6. scripts/test-hardening.sh (fuzzing, ThreadSanitizer) when present.
# Every stage has its own build folder (build-test-*); build/ belongs to
# scripts/build-and-run.sh. Warnings are errors in every stage here
# (TEKOJ_WERROR), which consumers' builds do not impose.
set -eu
cd "$(dirname "$0")/.."
SUDO=""
[ "$(id -u)" -eq 0 ] || SUDO="sudo"
export DEBIAN_FRONTEND=noninteractive

ARCH_PACKAGES="libgtest-dev:armhf libjpeg62-turbo-dev:armhf libturbojpeg0-dev:armhf libpng-dev:armhf libstdc++6:armhf"
PACKAGES="cmake g++ clang ninja-build pkg-config libgtest-dev libbenchmark-dev libjpeg-dev libturbojpeg0-dev \
libpng-dev libimage-exiftool-perl exiv2 binutils libclang-rt-14-dev g++-arm-linux-gnueabihf qemu-user $ARCH_PACKAGES"
missing=""
for p in $PACKAGES; do dpkg -s "$p" >/dev/null 2>&1 || missing="$missing $p"; done
if [ -n "$missing" ]; then
  dpkg --print-foreign-architectures | grep -qx armhf || $SUDO dpkg --add-architecture armhf
  $SUDO apt-get update -q
  # shellcheck disable=SC2086
  $SUDO apt-get install -y -q $missing
fi

JOBS=${JOBS:-$(nproc)}
CHECKS="-DTEKOJ_WERROR=ON -DTEKOJ_BUILD_TESTS=ON"
CTEST="ctest --output-on-failure --no-tests=error -j $JOBS"
start=$(date +%s)
stage() { echo "== $1 ($(( $(date +%s) - start )) s)"; }

stage "g++ Release: build and tests"
# shellcheck disable=SC2086
cmake -S . -B build-test-gcc -G Ninja -DCMAKE_BUILD_TYPE=Release $CHECKS -DTEKOJ_BUILD_TOOLS=ON -DTEKOJ_BUILD_BENCH=ON
cmake --build build-test-gcc -j "$JOBS"
(cd build-test-gcc && $CTEST)

stage "static library: install and outside consumers"
cmake -S . -B build-test-static -G Ninja -DCMAKE_BUILD_TYPE=Release -DTEKOJ_WERROR=ON -DBUILD_SHARED_LIBS=OFF
cmake --build build-test-static -j "$JOBS"
sh tests/package/consumers.sh build-test-static "$PWD/build-test-static/consumers" gcc g++

stage "clang: build, warnings are errors"
# shellcheck disable=SC2086
cmake -S . -B build-test-clang -G Ninja -DCMAKE_BUILD_TYPE=Release $CHECKS -DTEKOJ_BUILD_TOOLS=ON \
  -DTEKOJ_BUILD_BENCH=ON -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++
cmake --build build-test-clang -j "$JOBS"

stage "AddressSanitizer + UndefinedBehaviorSanitizer: build and tests"
# shellcheck disable=SC2086
cmake -S . -B build-test-asan -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo $CHECKS -DTEKOJ_BUILD_TOOLS=ON \
  -DTEKOJ_SANITIZE=ON
cmake --build build-test-asan -j "$JOBS"
(cd build-test-asan && ASAN_OPTIONS=detect_leaks=1 $CTEST)

stage "armhf cross build: tests under qemu-arm"
# shellcheck disable=SC2086
cmake -S . -B build-test-armhf -G Ninja -DCMAKE_BUILD_TYPE=Release $CHECKS -DTEKOJ_BUILD_TOOLS=ON \
  -DCMAKE_TOOLCHAIN_FILE=cmake/toolchains/armhf.cmake
cmake --build build-test-armhf -j "$JOBS"
# qemu-arm reports NEON in the hardware capabilities, so the run-time choice
# takes the NEON paths; the second run pins the portable ones.
(cd build-test-armhf && TEKOJ_SIMD=neon $CTEST)
(cd build-test-armhf && TEKOJ_SIMD=portable $CTEST)

if [ -f scripts/test-hardening.sh ]; then
  stage "hardening: fuzzing and ThreadSanitizer"
  sh scripts/test-hardening.sh
fi

stage "all stages passed"
