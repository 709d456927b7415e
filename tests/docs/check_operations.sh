#!/bin/bash
# docs/operations.md names every exported operation, an overridden one once, and no other.
set -euo pipefail
cd "$(dirname "$0")/../.."
export LC_ALL=C
result=0

# What follows the class in each exported symbol, without constructors and the reader of a template.
exported=$(sed -n 's/<.*>(/(/; s/^\(.* \)\{0,1\}KeloDRCore::\([A-Za-z]*\)::\([A-Za-z]*\)(.*/\2 \3/p' \
  tests/package/exported_symbols.txt | awk '$1 != $2 && $2 != "FindForReading" { print $2 }' | sort -u)
for operation in $exported; do
  grep --quiet "::$operation\`" docs/operations.md && continue
  echo "docs/operations.md does not tell of $operation"
  result=1
done
# shellcheck disable=SC2016  # the backticks are Markdown's
for name in $(grep --only-matching '`[A-Za-z:]*`' docs/operations.md | tr -d '`'); do
  grep --quiet --word-regexp --recursive "${name##*::}" include && continue
  echo "docs/operations.md tells of $name, which no header has"
  result=1
done
exit $result
