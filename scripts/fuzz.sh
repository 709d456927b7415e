#!/bin/bash
# Runs the fuzz targets, several side by side, on their seeds and what libFuzzer makes of them.
#
# usage: scripts/fuzz.sh [AMOUNT [TARGET...]]   AMOUNT: inputs for each target, 100000 without, or
#                                               seconds for each, such as 10s
#        scripts/fuzz.sh --keep [TARGET...]     puts the smallest of the inputs that reach most into
#                                               fuzz/corpus/, in place of those that are there
#
# New inputs go to build/fuzz/corpus, inputs that break a promise to build/fuzz/found, what a target
# says to build/fuzz/TARGET.log. Without TARGET all fuzz/TARGET_fuzz.cpp run.
set -euo pipefail
source "$(dirname "$0")/common.sh"
amount=${1:-100000}
case $amount in
  --keep) action=keep ;;
  *s) action=run limit=-max_total_time=${amount%s} ;;
  *) action=run limit=-runs=$amount ;;
esac
[ "$action" = keep ] || takes_number AMOUNT "${amount%s}"
targets=("${@:2}")
[ ${#targets[@]} -gt 0 ] || mapfile -t targets < <(basename --multiple --suffix=_fuzz.cpp fuzz/*_fuzz.cpp)
for target in "${targets[@]}"; do
  [ -f "fuzz/${target}_fuzz.cpp" ] || wrong_usage "there is no fuzz target '$target'"
done

# run TARGET
run() {
  local log="$build/fuzz/$1.log"
  mkdir -p "$build/fuzz/corpus/$1" "$build/fuzz/found" "fuzz/corpus/$1"
  "$build/fuzz/fuzz/$1_fuzz" "$limit" -max_len=512 -timeout=25 -verbosity=0 -print_final_stats=1 \
    -artifact_prefix="$build/fuzz/found/$1-" "$build/fuzz/corpus/$1" "fuzz/corpus/$1" &>"$log" ||
    { cat "$log" && return 1; }
  echo "$script: $1, $(sed -n 's/^stat::number_of_executed_units: //p' "$log") inputs"
}

# keep TARGET     The inputs written by hand have names that libFuzzer does not give.
keep() {
  local merged corpus="fuzz/corpus/$1"
  merged=$(mktemp --directory)
  mkdir -p "$build/fuzz/corpus/$1" "$corpus"
  "$build/fuzz/fuzz/$1_fuzz" -set_cover_merge=1 -max_len=256 -verbosity=0 "$merged" "$corpus" \
    "$build/fuzz/corpus/$1" &>"$build/fuzz/$1.log"
  find "$corpus" -regextype egrep -regex '.*/[0-9a-f]{40}' -delete
  find "$merged" -type f -printf '%s %p\n' | sort --numeric-sort | head --lines=200 |
    cut --delimiter=' ' --fields=2 | xargs --no-run-if-empty cp --target-directory="$corpus"
  rm -r "$merged"
  echo "$script: $1, $(find "$corpus" -type f | wc --lines) inputs are kept"
}

scripts/build.sh fuzz
export -f run keep
export build script limit="${limit-}"
printf '%s\n' "${targets[@]}" | xargs --max-procs="$(nproc)" --replace bash -euo pipefail -c "$action {}"
