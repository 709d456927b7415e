#!/bin/bash
# Fails when a tracked C++ file is not formatted as .clang-format says.
#
# usage: scripts/check-format.sh
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 0 "$@"

scripts/setup.sh format
git ls-files -z -- '*.h' '*.cpp' | xargs -0 clang-format --dry-run -Werror
echo "$script: all C++ files are formatted"
