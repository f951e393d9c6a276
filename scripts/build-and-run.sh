#!/bin/sh
# Installs the build tools, builds the library and the command-line tool in
# build/, and encodes the tool's built-in sample image to
# build/tekoj-sample.jpg.
set -eu
cd "$(dirname "$0")/.."
SUDO=""
[ "$(id -u)" -eq 0 ] || SUDO="sudo"
export DEBIAN_FRONTEND=noninteractive
if ! command -v cmake >/dev/null || ! command -v g++ >/dev/null || ! command -v ninja >/dev/null \
   || ! command -v pkg-config >/dev/null || ! dpkg -s libpng-dev >/dev/null 2>&1; then
  $SUDO apt-get update -q
  $SUDO apt-get install -y -q cmake g++ ninja-build pkg-config libpng-dev
fi
cmake -S . -B build -G Ninja -DCMAKE_BUILD_TYPE=Release -DTEKOJ_BUILD_TOOLS=ON
cmake --build build
# The tool reports what it wrote (file, size, settings) on standard error.
build/tools/tekoj --sample build/tekoj-sample.jpg
