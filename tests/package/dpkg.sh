#!/bin/bash
# Installs the packages with dpkg on top of this system, uses drctl, purges them, and looks what they
# have left. All of that happens in a layer over this system that is gone afterwards. Needs root.
#
# usage: dpkg.sh PACKAGE...
set -euo pipefail
if [ "${KELODR_LAYER:-}" = "" ]; then
  mapfile -t packages < <(realpath -- "$@")
  KELODR_LAYER=$(mktemp -d)
  export KELODR_LAYER
  status=0
  unshare --mount --pid --fork --kill-child "$0" "${packages[@]}" || status=$?
  rmdir "$KELODR_LAYER"
  exit "$status"
fi

mount -t tmpfs tmpfs "$KELODR_LAYER"
mkdir "$KELODR_LAYER"/{upper,work,system}
mount -t overlay -o "lowerdir=/,upperdir=$KELODR_LAYER/upper,workdir=$KELODR_LAYER/work" overlay "$KELODR_LAYER/system"
mount --rbind /dev "$KELODR_LAYER/system/dev"
mount -t proc proc "$KELODR_LAYER/system/proc"
mkdir "$KELODR_LAYER/system/packages"
cp -- "$@" "$KELODR_LAYER/system/packages"
in_system() { chroot "$KELODR_LAYER/system" "$@"; }

in_system sh -c 'dpkg --install /packages/*.deb'
in_system drctl --db /packages/registry.db node add nas1 --address 192.0.2.10 --port 5566
in_system drctl --db /packages/registry.db node list | grep nas1
mapfile -t names < <(for package in "$@"; do dpkg-deb --field "$package" Package; done)
in_system dpkg --purge "${names[@]}"

# dpkg's own records, and what triggers write anew for the whole system, may differ.
left=$(cd "$KELODR_LAYER/upper" && find . -ipath '*kelodr*' -not -path './packages/*' -not -type c)
if [ -n "$left" ]; then
  printf 'left behind:\n%s\n' "$left"
  exit 1
fi
echo "installed, used and removed: nothing is left behind"
