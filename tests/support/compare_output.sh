#!/bin/bash
# Runs PROGRAM in an empty directory, with INPUT if there is such a file, and compares what it prints
# with EXPECTED.
#
# usage: compare_output.sh PROGRAM EXPECTED [INPUT]
set -euo pipefail
# Where root has made the directory of the lock files, they are root's alone.
if [ -n "${TAKES_LOCKS:-}" ] && [ -d /tmp/.kelodr_lock ] && [ ! -w /tmp/.kelodr_lock ]; then
  echo "skipped: needs root"
  exit 77
fi
input=${3:-/dev/null}
[ -f "$input" ] || input=/dev/null
scratch=$(mktemp -d)
trap 'rm -rf "$scratch" "/tmp/.kelodr_lock$scratch"' EXIT
cd "$scratch"
"$1" <"$input" | diff "$2" -
