#!/bin/bash
# Runs all tests on a build that counts what is executed, and reports the lines and branches of src/,
# platform/ and posix/. Branches that only an exception takes are left out, the choice between a handler and
# the next one outside included; what else is left out is marked in the source, with the reason.
#
# usage: scripts/coverage.sh [MINIMUM]      fails below MINIMUM percent of lines or of branches
#
# What is not covered is printed; build/coverage/report/index.html shows it in the source.
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 1 "$@"
minimum=${1:-0}
takes_number MINIMUM "$minimum"

scripts/build.sh coverage
find "$build/coverage" -name '*.gcda' -delete
# Children of other users write their counts into the same files.
(umask 0 && find "$build/coverage/tests" -type f -name '*_test' -exec {} --gtest_list_tests \;) >/dev/null
g++ -shared -fPIC -o "$build/coverage/exit.so" scripts/coverage_exit.cpp

# Left out are the tests of what is installed, exported and imported, which is something else in this build; the second
# run under valgrind; storms and losses of power, which kill at random: counts that are cut off while they are written
# spoil all others; and the test that a child ends by _exit().
LD_PRELOAD=$build/coverage/exit.so ctest --preset coverage --test-dir "$build/coverage" --parallel "$(nproc)" \
  --exclude-regex '^(Package|LayoutTest|valgrind|FaultCallsTest|storm|power)\.|(^|/)Killed|RunsNoExitHandler'

report=$build/coverage/report
mkdir -p "$report"
gcovr --root . --filter src/ --filter platform/ --filter posix/ --exclude-throw-branches \
  --exclude-unreachable-branches --exclude-branches-by-pattern '^ *\} catch \(.*' --json "$report/counts.json" "$build/coverage"/{src,platform,posix}
gcovr --root . --add-tracefile "$report/counts.json" --html-details "$report/index.html"
gcovr --root . --add-tracefile "$report/counts.json" --branches
gcovr --root . --add-tracefile "$report/counts.json" --print-summary \
  --fail-under-line "$minimum" --fail-under-branch "$minimum"
