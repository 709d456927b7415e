#!/bin/bash
# Fails when shellcheck has something to say about a tracked shell script.
#
# usage: scripts/check-scripts.sh
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 0 "$@"

scripts/setup.sh scripts
git ls-files -z -- '*.sh' .ci/run |
  xargs -0 shellcheck --external-sources --source-path=SCRIPTDIR
echo "$script: all shell scripts are clean"
