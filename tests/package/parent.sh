#!/bin/bash
# Configures, builds, tests and installs a project that takes this tree in, without presets. Its
# tests and what it installs are its own.
#
# usage: parent.sh add_subdirectory|FetchContent WORK CMAKE-OPTION...
set -euo pipefail
how=$1 work=$2
source_dir=$(cd "$(dirname "$0")" && pwd)
rm -rf "$work"

cmake -S "$source_dir/parent" -B "$work/build" -DHOW="$how" -DTREE="$source_dir/../.." "${@:3}"
cmake --build "$work/build"
(cd "$work/build" && ctest --output-on-failure)
[ "$(cd "$work/build" && ctest --show-only | sed -n 's/^Total Tests: //p')" = 1 ]
cmake --install "$work/build" --prefix "$work/installed"
[ "$(cd "$work/installed" && find . -type f)" = ./bin/program ]
