#!/bin/bash
# Builds the library as an archive, without presets, installs it, and builds the consumer against
# it: with CMake and with the flags of pkg-config.
#
# usage: static.sh WORK VERSION LIBDIR CMAKE-OPTION...      environment: CXX CXXFLAGS LDFLAGS
set -euo pipefail
work=$1 version=$2 libdir=$3
source_dir=$(cd "$(dirname "$0")" && pwd)
rm -rf "$work"

cmake -S "$source_dir/../.." -B "$work/build" -DBUILD_SHARED_LIBS=OFF -DKELODR_BUILD_TESTS=OFF \
  -DKELODR_BUILD_EXAMPLES=OFF "${@:4}"
cmake --build "$work/build"
cmake --install "$work/build" --prefix "$work/installed"
[ -f "$work/installed/$libdir/libkelodrcore.a" ]

cmake -S "$source_dir/consumer" -B "$work/consumer" -DCMAKE_PREFIX_PATH="$work/installed" \
  -DVERSION="$version" "${@:4}"
cmake --build "$work/consumer"
"$work/consumer/consumer" "$version"

LIBDIR=$libdir "$source_dir/build_with_flags.sh" pkg-config "$work/installed" "$version"
