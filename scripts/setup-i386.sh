#!/bin/bash
# Prepares the 32-bit build: installs the 32-bit compiler runtime and unpacks the i386 packages of
# SQLite and JsonCpp into build/i386-sysroot. They cannot be installed beside the 64-bit ones on a
# machine whose versions differ from the archive's, so they are only unpacked.
#
# usage: scripts/setup-i386.sh
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 0 "$@"
sysroot=$build/i386-sysroot

scripts/setup.sh i386
if [ -d "$sysroot" ]; then
  echo "$script: $sysroot is there"
  exit
fi

scratch=$(mktemp -d)
trap 'rm -r "$scratch"' EXIT
mkdir -p "$scratch/lists/partial" "$scratch/cache/archives/partial" "$scratch/root"

# as_i386 APT-COMMAND...: as a 32-bit system would run it, away from this system's own state.
as_i386() {
  "$1" --quiet --quiet -oAPT::Architecture=i386 -oAPT::Architectures=i386 \
    -oAPT::Sandbox::User=root -oDir::State::Lists="$scratch/lists" -oDir::Cache="$scratch/cache" "${@:2}"
}

# A suite that cannot be read does not matter while another one has the packages.
as_i386 apt-get update || true
jsoncpp=$(as_i386 apt-cache depends libjsoncpp-dev 2>/dev/null | sed -n 's/.*Depends: \(libjsoncpp[0-9]*\)$/\1/p')
packages=(libsqlite3-0 libsqlite3-dev libjsoncpp-dev "$jsoncpp")
echo "$script: fetching ${packages[*]} for i386"
(cd "$scratch" && as_i386 apt-get download "${packages[@]}") ||
  fail "the packages for i386 could not be fetched; is there a network?"
for archive in "$scratch"/*.deb; do
  dpkg --extract "$archive" "$scratch/root"
done
mkdir -p "$build"
# Copied beside its place first: an interrupted run leaves no half sysroot.
rm -rf "$sysroot.new"
cp -r "$scratch/root" "$sysroot.new"
mv "$sysroot.new" "$sysroot"
