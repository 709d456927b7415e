#!/bin/bash
# Fails when shellcheck has something to say about a tracked shell script.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup.sh scripts
git ls-files -z -- '*.sh' .ci/run | xargs -0 shellcheck
echo "check-scripts.sh: all shell scripts are clean"
