#!/bin/bash
# Compares the binary interface of what the packages hold with that of the last release.
#
# usage: scripts/check-abi.sh            reports every change; fails on an incompatible one
#        scripts/check-abi.sh --update   makes this build the one to compare with
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 1 "$@"
library=$build/package/src/libkelodrcore.so.1
baseline=abi/libkelodrcore1.abi.gz

case ${1:-} in
  '' | --update) ;;
  *) wrong_usage "there is no option $1" ;;
esac
scripts/build.sh package
if [ "${1:-}" = --update ]; then
  abidw --headers-dir include --no-show-locs --no-corpus-path --drop-private-types "$library" |
    gzip --no-name --best >"$baseline"
  echo "$script: $baseline is this build's"
  exit
fi

gzip --decompress --stdout "$baseline" >"$build/package/baseline.abi"
status=0
abidiff --headers-dir2 include --drop-private-types "$build/package/baseline.abi" "$library" ||
  status=$?
# Bits of abidiff's exit status: 1 and 2 an error, 4 a change, 8 an incompatible one.
if ((status & 11)); then
  fail "programs linked against the last release break (abidiff: $status)"
fi
if ((status == 0)); then
  echo "$script: the binary interface is that of the last release"
fi
