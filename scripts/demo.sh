#!/bin/bash
# Installs what is missing, builds the release preset and shows the library at work.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup.sh build examples
cmake --preset release
cmake --build --preset release

scratch=$(mktemp -d)
trap 'rm -r "$scratch"' EXIT

# Says what comes, shows the command, runs it.
show() {
  printf '\n# %s\n$ drctl --db registry.db %s\n' "$1" "${*:2}"
  build/release/examples/drctl/drctl --db "$scratch/registry.db" "${@:2}"
}

show "Stores this machine's mounted volumes, one row a mount point" volume scan
show "Lists them" volume list
