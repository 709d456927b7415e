#!/bin/bash
# Runs the fuzz targets on their seeds and what libFuzzer makes of them.
#
# usage: scripts/fuzz.sh [INPUTS [TARGET...]]     INPUTS: how many for each target, 100000 without
#
# New inputs go to build/fuzz/corpus, inputs that break a promise to build/fuzz/found.
set -euo pipefail
source "$(dirname "$0")/common.sh"
inputs=${1:-100000}
targets=("${@:2}")
[ ${#targets[@]} -gt 0 ] || targets=(bulk command key_value literal request response)
takes_number INPUTS "$inputs"
for target in "${targets[@]}"; do
  [ -f "fuzz/${target}_fuzz.cpp" ] || wrong_usage "there is no fuzz target '$target'"
done

scripts/build.sh fuzz
for target in "${targets[@]}"; do
  echo "$script: $target, $inputs inputs"
  mkdir -p "$build/fuzz/corpus/$target" "$build/fuzz/found"
  "$build/fuzz/fuzz/${target}_fuzz" -runs="$inputs" -max_len=4096 -timeout=25 -verbosity=0 \
    -print_final_stats=1 -artifact_prefix="$build/fuzz/found/$target-" \
    "$build/fuzz/corpus/$target" "fuzz/corpus/$target"
done
