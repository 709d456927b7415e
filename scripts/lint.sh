#!/bin/bash
# The static checks of the C++ sources: a build with clang's own warnings as errors, and clang-tidy
# over the library and the platform layer.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup.sh build examples lint
cmake -S . -B build/lint -G Ninja -DCMAKE_CXX_COMPILER=clang++ -DCMAKE_BUILD_TYPE=Release \
  -DCMAKE_EXPORT_COMPILE_COMMANDS=ON -DKELODR_WERROR=ON -DKELODR_BUILD_EXAMPLES=ON
cmake --build build/lint
mapfile -t sources < <(git ls-files 'src/*.cpp' 'platform/*.cpp')
printf '%s\n' "${sources[@]}" |
  xargs --max-args=4 --max-procs="$(nproc)" clang-tidy -p build/lint --quiet 2>/dev/null
echo "lint.sh: nothing to complain about"
