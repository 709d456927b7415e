#!/bin/bash
# Installs what is missing, builds everything and runs all tests.
#
# usage: scripts/test.sh [PRESET]      the presets are in CMakePresets.json; "dev" without one
set -euo pipefail
cd "$(dirname "$0")/.."
preset=${1:-dev}

scripts/setup.sh build test examples
case $preset in
  i386*) scripts/setup-i386.sh ;;
esac
cmake --preset "$preset"
cmake --build --preset "$preset"
ctest --preset "$preset" --parallel "$(nproc)"
