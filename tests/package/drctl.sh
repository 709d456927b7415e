#!/bin/bash
# The installed drctl finds the library beside it, without any environment.
#
# usage: drctl.sh PREFIX
set -euo pipefail
scratch=$(mktemp -d)
trap 'rm -r "$scratch"' EXIT
env --ignore-environment "$1/bin/drctl" --db "$scratch/registry.db" node add nas1 --address 192.0.2.10 --port 5566
library=$(ldd "$1/bin/drctl" | sed -n 's/.*libkelodrcore.* => \(.*\) (.*/\1/p')
[[ $(realpath "$library") == "$(realpath "$1")"/* ]]
