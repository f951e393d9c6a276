#!/bin/sh
# Installs a built tree into a fresh prefix and builds two outside programs
# against it, one found through find_package(TekoJEncoder), one through
# pkg-config, then runs both.
#   consumers.sh BUILD_DIR WORK_DIR C_COMPILER CXX_COMPILER
set -eu
build=$1 work=$2 cc=$3 cxx=$4
here=$(cd "$(dirname "$0")" && pwd)
prefix=$work/prefix
rm -rf "$work"
mkdir -p "$work"
cmake --install "$build" --prefix "$prefix" >/dev/null

libdir=$(dirname "$(find "$prefix" -name TekoJEncoder.pc)")/..
if [ -e "$libdir/libTekoJEncoder.so" ]; then
  # A shared install: the SONAME names the major version, with its links.
  real=$(readlink -f "$libdir/libTekoJEncoder.so")
  soname=$(readelf -d "$real" | sed -n 's/.*Library soname: \[\(.*\)\].*/\1/p')
  [ -n "$soname" ] && [ -e "$libdir/$soname" ] || { echo "no SONAME link ($real: '$soname')"; exit 1; }
  case "$soname" in libTekoJEncoder.so.[0-9]*) ;; *) echo "unexpected SONAME $soname"; exit 1 ;; esac
  static=""
else
  [ -e "$libdir/libTekoJEncoder.a" ] || { echo "no library installed under $libdir"; exit 1; }
  static="--static"
fi
for h in TekoJEncoder.h TekoJEncoderInternal.h TekoJEncoder.hpp; do
  [ -e "$prefix/include/$h" ] || { echo "header $h not installed"; exit 1; }
done

echo "-- find_package consumer"
cmake -S "$here/cmake_consumer" -B "$work/cmake" -DCMAKE_PREFIX_PATH="$prefix" \
  -DCMAKE_CXX_COMPILER="$cxx" >/dev/null
cmake --build "$work/cmake" >/dev/null
"$work/cmake/consumer" "$work/cmake.jpg"

echo "-- pkg-config consumer"
flags=$(PKG_CONFIG_PATH="$libdir/pkgconfig" PKG_CONFIG_LIBDIR="$libdir/pkgconfig" \
        pkg-config $static --cflags --libs TekoJEncoder)
# shellcheck disable=SC2086
"$cc" -std=c99 -Wall -Wextra -Werror -pedantic -o "$work/pc-consumer" "$here/pc_consumer.c" $flags
LD_LIBRARY_PATH="$libdir" "$work/pc-consumer"
echo "consumers built and ran against $prefix"
