#!/bin/bash
# Every file of the tree that a document links to is there.
set -euo pipefail
cd "$(dirname "$0")/../.."
result=0

for document in *.md docs/*.md; do
  # shellcheck disable=SC2016  # the backticks are Markdown's
  while IFS= read -r target; do
    [ -e "$(dirname "$document")/$target" ] && continue
    echo "$document: there is no $target"
    result=1
  done < <(sed -n '/^```/,/^```/!p' "$document" | grep --only-matching '\](\([^)#]*\)' | sed 's/^](//' |
    grep --invert-match --extended-regexp '^(https?:|$)')
done
exit $result
