#!/bin/bash
# Installs what is missing, builds the benchmarks, runs them, and prints one table of ratios.
#
# usage: scripts/bench.sh [PATTERN]   the benchmarks whose names match; all without one
#        scripts/bench.sh --docs      all, and writes the table and the curves into docs, and the README's figures
#        scripts/bench.sh --once      each benchmark once, only to see that it works
#
# The measurements go to build/bench/results, a JSON file for each comparison.
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 1 "$@"

mode=table pattern=.
case ${1:-} in
  --once | --docs) mode=${1#--} ;;
  -*) wrong_usage "there is no option $1" ;;
  ?*) pattern=$1 ;;
esac
bench=$build/bench/bench/kelodrcore_bench
results=$build/bench/results

scripts/build.sh bench

if [ "$mode" = once ]; then
  # Without the largest rows and values, which take minutes.
  "$bench" --benchmark_min_time=0.001 '--benchmark_filter=-^growth.*/(1[0]{5,6}|1[0-9]{7}|67108864)/'
  exit
fi

# The contestants of one comparison run in one process, their repetitions in random turns: what the
# machine does besides strikes all of them alike.
compare() {
  local repetitions=15
  case $1 in
    growth*/1000000) repetitions=1 ;;
    growth*) repetitions=3 ;;
    InsertRecord* | Select*) repetitions=41 ;;  # near their bounds
  esac
  echo "$script: $1" >&2
  "$bench" "--benchmark_filter=^$1/" --benchmark_min_time=0.02 \
    --benchmark_repetitions=$repetitions --benchmark_enable_random_interleaving \
    "--benchmark_out=$results/${1//[^[:alnum:]]/_}.json" >"$results/log" 2>&1 ||
    { cat "$results/log" >&2; return 1; }
}

comparisons=$("$bench" --benchmark_list_tests | cut -d/ -f1,2 | awk '!seen[$0]++' |
  grep -E -- "$pattern") || fail "no benchmark matches $pattern"
rm -rf "$results"
mkdir -p "$results"
while read -r comparison; do compare "$comparison" </dev/null; done <<<"$comparisons"

if [ "$mode" = docs ]; then
  bench/report.py "$results" .
else
  bench/report.py "$results"
fi
