#!/bin/bash
# Makes the Debian packages and checks what a user of them gets: dependencies, hardening, programs
# that build and run, and an installation that leaves nothing behind when it is removed.
#
# usage: scripts/test-packages.sh         the packages of this machine
#        scripts/test-packages.sh i386    those for 32 bits; they are not installed
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 1 "$@"
case ${1:-} in
  '') preset=package toolchain=() libraries= ;;
  i386)
    preset=package-i386
    toolchain=(-DCMAKE_TOOLCHAIN_FILE="$PWD/cmake/i386.cmake" -DKELODR_I386_SYSROOT="$build/i386-sysroot")
    libraries=:$build/i386-sysroot/usr/lib/i386-linux-gnu
    ;;
  *) wrong_usage "there are no packages for '$1'" ;;
esac
packages=$build/$preset

scripts/build.sh "$preset"
rm -f "$packages"/*.deb
cpack --config "$packages/CPackConfig.cmake" -B "$packages"

root=$packages/root
rm -rf "$root"
for deb in "$packages"/*.deb; do
  dpkg-deb --extract "$deb" "$root"
done
libdir=$(dirname "$(find "$root/usr/lib" -name libkelodrcore.so)")

# expect_dependency PACKAGE DEPENDENCY
expect_dependency() {
  dpkg-deb --field "$packages/$1"_*.deb Depends | grep -qE "(^|, )$2" ||
    fail "$1 does not depend on $2"
}
expect_dependency libkelodrcore1 uuid-runtime
expect_dependency libkelodrcore1 libsqlite3-0
expect_dependency libkelodrcore1 'libjsoncpp[0-9]+'
expect_dependency libkelodrcore-dev libjsoncpp-dev
expect_dependency libkelodrcore-dev 'libkelodrcore1 \(= '
expect_dependency kelodr-examples 'libkelodrcore1 \(= '

echo "== lintian"
lintian --allow-root --fail-on error "$packages"/*.deb
echo "== hardening"
tests/package/hardening.sh "$libdir/libkelodrcore.so.1"
echo "== exported symbols"
tests/package/symbols.sh "$libdir/libkelodrcore.so.1" tests/package/exported_symbols.txt
echo "== a program built against the packages"
cmake -S tests/package/consumer -B "$packages/consumer" -DCMAKE_PREFIX_PATH="$root/usr" \
  -DCMAKE_FIND_ROOT_PATH="$root" "${toolchain[@]}" \
  -DVERSION="$(dpkg-deb --field "$packages"/libkelodrcore1_*.deb Version)"
cmake --build "$packages/consumer"
LD_LIBRARY_PATH=$libdir$libraries "$packages/consumer/consumer"
echo "== drctl of the packages"
LD_LIBRARY_PATH=$libdir$libraries "$root/usr/bin/drctl" --db "$packages/registry.db" volume scan
if [ "$preset" = package ]; then
  echo "== installed and removed"
  tests/package/dpkg.sh "$packages"/*.deb
fi
echo "$script: the packages work"
