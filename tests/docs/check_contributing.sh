#!/bin/bash
# CONTRIBUTING.md names every script and every preset.
set -euo pipefail
cd "$(dirname "$0")/../.."
result=0

# shellcheck disable=SC2016  # the backticks are Markdown's
presets=$(cmake --list-presets=configure | sed -n 's/^ *"\([^"]*\)".*/`\1`/p')
for name in scripts/* $presets; do
  grep --quiet --fixed-strings -e "$name" CONTRIBUTING.md && continue
  echo "CONTRIBUTING.md does not tell of $name"
  result=1
done
exit $result
