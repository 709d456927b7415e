#!/bin/bash
# Makes the Debian packages, unpacks them into a directory of their own, and checks what a user of
# them gets: hardening, dependencies, programs that build and run.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/build.sh package
rm -f build/package/*.deb
cpack --preset package

root=$PWD/build/package/root
rm -rf "$root"
for deb in build/package/*.deb; do
  dpkg-deb --extract "$deb" "$root"
done
libdir=$(dirname "$(find "$root/usr/lib" -name libkelodrcore.so)")

# expect_dependency PACKAGE DEPENDENCY
expect_dependency() {
  dpkg-deb --field build/package/"$1"_*.deb Depends | grep -qF "$2" ||
    { echo "test-packages.sh: $1 does not depend on $2" >&2; exit 1; }
}
expect_dependency libkelodrcore1 uuid-runtime
expect_dependency libkelodrcore1 libsqlite3-0
expect_dependency libkelodrcore1 libjsoncpp25
expect_dependency libkelodrcore-dev libjsoncpp-dev
expect_dependency libkelodrcore-dev "libkelodrcore1 (= "
expect_dependency kelodr-examples "libkelodrcore1 (= "

echo "== hardening"
tests/package/hardening.sh "$libdir/libkelodrcore.so.1"
echo "== exported symbols"
tests/package/symbols.sh "$libdir/libkelodrcore.so.1" tests/package/exported_symbols.txt
echo "== a program built against the packages"
cmake -S tests/package/consumer -B build/package/consumer -DCMAKE_PREFIX_PATH="$root/usr" \
  -DVERSION="$(dpkg-deb --field build/package/libkelodrcore1_*.deb Version)"
cmake --build build/package/consumer
build/package/consumer/consumer
echo "== drctl of the packages"
LD_LIBRARY_PATH=$libdir "$root/usr/bin/drctl" --db build/package/registry.db node count
echo "test-packages.sh: the packages work"
