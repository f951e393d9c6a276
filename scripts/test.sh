#!/bin/sh
# Installs every test dependency, builds the library, tools, tests and
# benchmarks (g++ Release, clang warnings check, g++ with AddressSanitizer and
# UndefinedBehaviorSanitizer) and runs the whole test suite in both g++ builds.
set -eu
cd "$(dirname "$0")/.."
SUDO=""
[ "$(id -u)" -eq 0 ] || SUDO="sudo"
export DEBIAN_FRONTEND=noninteractive
PACKAGES="cmake g++ clang ninja-build pkg-config libgtest-dev libbenchmark-dev libjpeg-dev libturbojpeg0-dev \
libpng-dev libimage-exiftool-perl exiv2 binutils"
missing=""
for p in $PACKAGES; do dpkg -s "$p" >/dev/null 2>&1 || missing="$missing $p"; done
if [ -n "$missing" ]; then
  $SUDO apt-get update -q
  $SUDO apt-get install -y -q $missing
fi
JOBS=$(nproc)

echo "== Release build (g++) and tests"
cmake -S . -B build -G Ninja -DCMAKE_BUILD_TYPE=Release
cmake --build build -j "$JOBS"
(cd build && ctest --output-on-failure -j "$JOBS")

echo "== clang build (warnings are errors)"
cmake -S . -B build-clang -G Ninja -DCMAKE_BUILD_TYPE=Release -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++
cmake --build build-clang -j "$JOBS"

echo "== AddressSanitizer + UndefinedBehaviorSanitizer build and tests"
cmake -S . -B build-asan -G Ninja -DCMAKE_BUILD_TYPE=RelWithDebInfo -DTEKOJ_SANITIZE=ON -DTEKOJ_BUILD_BENCH=OFF
cmake --build build-asan -j "$JOBS"
(cd build-asan && ASAN_OPTIONS=detect_leaks=1 ctest --output-on-failure -j "$JOBS")
echo "== all tests passed"
