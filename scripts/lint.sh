#!/bin/bash
# The static checks of the C++ sources: a build with clang's own warnings as errors, and clang-tidy
# over the library and the platform layer.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/build.sh lint
mapfile -t sources < <(git ls-files 'src/*.cpp' 'platform/*.cpp')
printf '%s\n' "${sources[@]}" |
  xargs --max-args=4 --max-procs="$(nproc)" clang-tidy -p build/lint --quiet 2>/dev/null
echo "lint.sh: nothing to complain about"
