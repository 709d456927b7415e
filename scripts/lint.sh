#!/bin/bash
# The static checks of the C++ sources: a build with clang's own warnings as errors, and clang-tidy
# over the library and the two floors below it.
#
# usage: scripts/lint.sh
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 0 "$@"

scripts/build.sh lint
printf '%s\0' src/*.cpp platform/*.cpp posix/*.cpp |
  xargs --null --max-args=4 --max-procs="$(nproc)" \
    clang-tidy -p "$build/lint" --quiet 2>/dev/null
echo "$script: nothing to complain about"
