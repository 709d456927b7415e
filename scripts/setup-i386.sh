#!/bin/bash
# Prepares the 32-bit build: installs the 32-bit compiler runtime and unpacks the i386 packages of
# SQLite and JsonCpp into build/i386-sysroot. They cannot be installed beside the 64-bit ones on a
# machine whose versions differ from the archive's, so they are only unpacked.
set -euo pipefail
cd "$(dirname "$0")/.."
sysroot=build/i386-sysroot
packages=(libsqlite3-0 libsqlite3-dev libjsoncpp25 libjsoncpp-dev)

scripts/setup.sh i386
if [ -d "$sysroot" ]; then
  echo "setup-i386.sh: $sysroot is there"
  exit
fi

scratch=$(mktemp -d)
trap 'rm -r "$scratch"' EXIT
mkdir -p "$scratch/lists/partial" "$scratch/cache/archives/partial" "$scratch/root"

# apt-get as a 32-bit system would run it, away from this system's own state.
apt_i386() {
  apt-get --quiet --quiet -oAPT::Architecture=i386 -oAPT::Architectures=i386 \
    -oAPT::Sandbox::User=root -oDir::State::Lists="$scratch/lists" -oDir::Cache="$scratch/cache" "$@"
}

echo "setup-i386.sh: fetching ${packages[*]} for i386"
# A suite that cannot be read does not matter while another one has the packages.
apt_i386 update || true
(cd "$scratch" && apt_i386 download "${packages[@]}")
for archive in "$scratch"/*.deb; do
  dpkg --extract "$archive" "$scratch/root"
done
mkdir -p build
# Copied beside its place first: an interrupted run leaves no half sysroot.
rm -rf "$sysroot.new"
cp -r "$scratch/root" "$sysroot.new"
mv "$sysroot.new" "$sysroot"
