#!/bin/bash
# Fails when a tracked C++ file is not formatted as .clang-format says.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup.sh format
git ls-files -z -- '*.h' '*.cpp' | xargs -0 clang-format --dry-run -Werror
echo "check-format.sh: all C++ files are formatted"
