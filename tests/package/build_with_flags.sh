#!/bin/bash
# Builds the consumer with the flags of pkg-config, or with plain ones, and runs it.
#
# usage: build_with_flags.sh pkg-config|plain PREFIX VERSION
#        environment: CXX CXXFLAGS LDFLAGS LIBDIR JSONCPP_INCLUDE
set -euo pipefail
how=$1 prefix=$2 version=$3
source_dir=$(cd "$(dirname "$0")" && pwd)

if [ "$how" = pkg-config ]; then
  export PKG_CONFIG_PATH=$prefix/$LIBDIR/pkgconfig
  [ "$(pkg-config --modversion kelodrcore)" = "$version" ]
  flags=$(pkg-config --cflags --libs kelodrcore)
else
  flags="-I$prefix/include -I$JSONCPP_INCLUDE -L$prefix/$LIBDIR -lkelodrcore -ljsoncpp"
fi

program=$prefix/../consumer-$how
# shellcheck disable=SC2086  # the flags are words
$CXX -std=c++17 $CXXFLAGS -Weffc++ -Wnon-virtual-dtor "$source_dir/consumer/consumer.cpp" \
  -o "$program" $LDFLAGS $flags "-Wl,-rpath,$prefix/$LIBDIR" 2> >(tee "$program.log" >&2)
"$program" "$version"
if grep 'kelodrcore/.*warning' "$program.log"; then exit 1; fi
