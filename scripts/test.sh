#!/bin/bash
# Installs what is missing, builds everything and runs all tests.
#
# usage: scripts/test.sh [PRESET]      the presets are in CMakePresets.json; "dev" without one
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 1 "$@"
preset=${1:-dev}

scripts/build.sh "$preset"
ctest --preset "$preset" --test-dir "$build/$preset" --parallel "$(nproc)"
