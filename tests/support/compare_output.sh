#!/bin/bash
# Runs PROGRAM in an empty directory, with INPUT if there is such a file, and compares what it prints
# with EXPECTED; as many times as RUNS says, each time in what the run before left.
#
# usage: compare_output.sh PROGRAM EXPECTED [INPUT]
set -euo pipefail
# Where root has made the directory of the lock files, they are root's alone.
if [ -n "${TAKES_LOCKS:-}" ] && [ -d /tmp/.kelodr_lock ] && [ ! -w /tmp/.kelodr_lock ]; then
  echo "skipped: needs a /tmp where this user can make locks"
  exit 77
fi
input=${3:-/dev/null}
[ -f "$input" ] || input=/dev/null
scratch=$(mktemp -d)
trap 'rm -rf "$scratch" "/tmp/.kelodr_lock$scratch"' EXIT
cd "$scratch"
for ((run = 0; run < ${RUNS:-1}; ++run)); do
  "$1" <"$input" | diff "$2" -
done
