#!/bin/bash
# Every file of the tree that a document links to is there, and so is every script that it names.
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
while IFS=: read -r document script; do
  [ -f "$script" ] && continue
  echo "$document: there is no $script"
  result=1
done < <(grep --only-matching 'scripts/[a-z0-9-]*\.sh' ./*.md docs/*.md)
exit $result
