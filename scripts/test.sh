#!/bin/bash
# Installs what is missing, builds everything and runs all tests.
#
# usage: scripts/test.sh [PRESET]      the presets are in CMakePresets.json; "dev" without one
set -euo pipefail
cd "$(dirname "$0")/.."
preset=${1:-dev}

scripts/build.sh "$preset"
ctest --preset "$preset" --parallel "$(nproc)"
