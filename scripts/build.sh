#!/bin/bash
# Installs what a preset needs, configures it and builds it in build/PRESET.
#
# usage: scripts/build.sh [PRESET]      the presets are in CMakePresets.json; "dev" without one
set -euo pipefail
cd "$(dirname "$0")/.."
preset=${1:-dev}

groups=(build test examples)
case $preset in
  release) groups=(build examples) ;;
  lint | package) groups=(build examples "$preset") ;;
  bench | fuzz) groups=(build "$preset") ;;
  system-platform) groups=(build) ;;
  storm) groups=(build test) ;;
  coverage) groups+=(coverage) ;;
  i386*) scripts/setup-i386.sh ;;
esac
scripts/setup.sh "${groups[@]}"
cmake --preset "$preset"
cmake --build --preset "$preset"
