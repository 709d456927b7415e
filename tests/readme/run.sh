#!/bin/bash
# Runs PROGRAM in an empty directory and compares what it prints with EXPECTED.
#
# usage: run.sh PROGRAM EXPECTED
set -euo pipefail
scratch=$(mktemp -d)
trap 'rm -r "$scratch"' EXIT
cd "$scratch"
"$1" | diff "$2" -
