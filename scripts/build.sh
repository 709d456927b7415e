#!/bin/bash
# Installs what a preset needs, configures it and builds it in build/PRESET.
#
# usage: scripts/build.sh [PRESET [TARGET...]]    the presets are in CMakePresets.json; "dev" without one
#
# KELODR_BUILD_DIR in the environment is used in place of build/, by all scripts.
set -euo pipefail
source "$(dirname "$0")/common.sh"
preset=${1:-dev}
presets=$(sed -n '/"buildPresets"/,/]/s/.*{"name": "\([^"]*\)".*/\1/p' CMakePresets.json)
grep --quiet --line-regexp --fixed-strings -e "$preset" <<<"$presets" ||
  wrong_usage "there is no preset '$preset'; there are: ${presets//$'\n'/ }"

groups=(build test examples)
options=()
targets=("${@:2}")
case $preset in
  release | release-i386) groups=(build examples) ;;
  package*) groups=(build examples package) ;;
  lint) groups=(build examples lint) ;;
  bench | fuzz) groups=(build "$preset") ;;
  system-platform) groups=(build) options=(-D "CMAKE_LIBRARY_PATH=$build/dev/platform") ;;
  storm) groups=(build test) targets=(storm power) ;;
  tsan) targets=(threads_test) ;;
  asan | i386-asan) groups+=(fuzz) ;;
  coverage) groups+=(coverage) ;;
esac
if [[ $preset == *i386* ]]; then
  groups+=(i386)
  options+=(-D "KELODR_I386_SYSROOT=$build/i386-sysroot")
fi
scripts/setup.sh "${groups[@]}"
if [[ $preset == *i386* ]]; then scripts/setup-i386.sh; fi
cmake --preset "$preset" -B "$build/$preset" "${options[@]}"
cmake --build "$build/$preset" ${targets:+--target "${targets[@]}"}
