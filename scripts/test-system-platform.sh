#!/bin/bash
# Runs all tests once more on a library that links the platform's two libraries, which stand here as
# shared libraries of their own. The test programs are those of the dev preset: only the library
# under them is another one.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/build.sh dev
cmake --build --preset dev --target kelocore kelorandom
scripts/build.sh system-platform

export LD_LIBRARY_PATH=$PWD/build/system-platform/src
ldd build/dev/tests/err_test | grep -q "$LD_LIBRARY_PATH/libkelodrcore"
ctest --preset dev --parallel "$(nproc)" --exclude-regex '^(Package|valgrind|Headers)\.'
