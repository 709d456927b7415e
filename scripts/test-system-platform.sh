#!/bin/bash
# Runs the unit and process tests once more on a library that links the platform's two libraries, which stand here as
# shared libraries of their own. The test programs are those of the dev preset: only the library under them is another one.
#
# usage: scripts/test-system-platform.sh
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 0 "$@"

scripts/build.sh dev
cmake --build "$build/dev" --target kelocore kelorandom
scripts/build.sh system-platform

export LD_LIBRARY_PATH=$build/system-platform/src
ldd "$build/dev/tests/err_test" | grep -q "$LD_LIBRARY_PATH/libkelodrcore"
ctest --test-dir "$build/dev" --output-on-failure --no-tests=error --parallel $((2 * $(nproc))) --label-regex '^(unit|process)$'
