#!/bin/bash
# Runs a script of this tree in a bare Debian of another release, as root. The system is made by
# debootstrap and kept in build/test-on/RELEASE with its own builds: a second run is quick. The
# script sees this tree read-only, in a directory with a blank in its name.
#
# usage: scripts/test-on.sh RELEASE [SCRIPT [ARGUMENT...]]
#
#   scripts/test-on.sh trixie                              builds everything and runs all tests
#   scripts/test-on.sh bookworm scripts/test-packages.sh   makes the packages and tries them
set -euo pipefail
source "$(dirname "$0")/common.sh"
[ $# -gt 0 ] || wrong_usage "name a release"
release=$1
command=("${@:2}")
[ ${#command[@]} -gt 0 ] || command=(scripts/test.sh)
[[ $release =~ ^[a-z]+$ ]] || wrong_usage "'$release' is no release of Debian"
[ -x "${command[0]}" ] || wrong_usage "there is no script '${command[0]}'"
[ "$(id -u)" -eq 0 ] || fail "a system of its own needs root"
system=$build/test-on/$release

scripts/setup.sh systems
if [ ! -d "$system" ]; then
  echo "$script: fetching the base of $release"
  rm -rf "$system.new"
  mkdir -p "$system.new"
  debootstrap --variant=minbase "$release" "$system.new" >"$system.log" ||
    fail "the base of $release could not be fetched; $system.log tells why"
  mv "$system.new" "$system"
fi
mkdir -p "$system/the tree" "$system/the builds"
cp /etc/resolv.conf "$system/etc/"

# The mounts and the processes are gone when the script ends. The system becomes the root file system: below a mere
# chroot the kernel refuses the namespaces that tests make.
export system
# shellcheck disable=SC2016  # expanded by the inner shell
unshare --mount --pid --fork --kill-child bash -euc '
  mount --bind "$system" "$system"
  mount --bind "$PWD" "$system/the tree"
  mount -o remount,bind,ro "$system/the tree"
  mount --rbind /dev "$system/dev"
  mount -t proc proc "$system/proc"
  mount -t tmpfs tmpfs "$system/tmp"
  cd "$system"
  pivot_root . mnt
  umount --lazy /mnt
  exec env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin HOME=/root LC_ALL=C.UTF-8 \
    KELODR_BUILD_DIR="/the builds" "/the tree/$0" "$@"' "${command[@]}" </dev/null
