#!/bin/bash
# Builds the consumer with the flags of pkg-config, or with plain ones, and runs it.
#
# usage: build_with_flags.sh pkg-config|plain PREFIX VERSION
#        environment: CXX CXXFLAGS LDFLAGS LIBDIR JSONCPP_INCLUDE
set -euo pipefail
how=$1 prefix=$2 version=$3
source_dir=$(cd "$(dirname "$0")" && pwd)

# Each word may be quoted, for blanks in paths.
compiler=() linker=()
eval "compiler=($CXX -std=c++17 $CXXFLAGS -Weffc++ -Wnon-virtual-dtor) linker=($LDFLAGS)"
if [ "$how" = pkg-config ]; then
  export PKG_CONFIG_PATH=$prefix/$LIBDIR/pkgconfig
  [ "$(pkg-config --modversion kelodrcore)" = "$version" ]
  eval "flags=($(pkg-config --cflags --libs kelodrcore))"
else
  flags=("-I$prefix/include" "-I$JSONCPP_INCLUDE" "-L$prefix/$LIBDIR" -lkelodrcore -ljsoncpp)
fi

program=$prefix/../consumer-$how
"${compiler[@]}" "$source_dir/consumer/consumer.cpp" -o "$program" \
  "${linker[@]}" "${flags[@]}" "-Wl,-rpath,$prefix/$LIBDIR" 2> >(tee "$program.log" >&2)
"$program" "$version"
if grep 'kelodrcore/.*warning' "$program.log"; then exit 1; fi
