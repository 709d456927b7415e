#!/bin/bash
# The long storms, and 200 cuts of a disk's power: five minutes in all. Each prints a line of
# figures; the first that finds anything wrong ends it.
#
# usage: scripts/storm.sh [--soak] [SEED]       1 without one
#
# --soak runs the soak alone, for an hour and with pauses that leave most of the machine to others.
set -euo pipefail
source "$(dirname "$0")/common.sh"
soak=''
if [[ ${1:-} == --soak ]]; then soak=1 && shift; fi
takes_at_most 1 "$@"
seed=${1:-1}
takes_number SEED "$seed"

scripts/build.sh storm
# A kill loses nothing that was written, on a disk or not; in memory more happens in the time.
if [[ -z ${TMPDIR:-} && -w /dev/shm ]]; then export TMPDIR=/dev/shm; fi
storm() { nice "$build/storm/tests/storm" "$@" "seed=$seed"; }

if [[ -n $soak ]]; then
  storm soak processes=16 seconds=3600 pause=40
  exit
fi
storm soak processes=16 seconds=60
storm holders processes=8 count=10000
storm expiries processes=50 count=200
storm readers processes=5 count=5000000
nice "$build/storm/tests/power/power" 200 "$seed"
