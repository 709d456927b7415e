#!/bin/bash
# The README's figures are five, and each is a row of docs/performance.md.
set -euo pipefail
cd "$(dirname "$0")/../.."

# figures FILE: the rows of a table as "operation|work|time|beside|ratio", without blanks around.
figures() {
  sed -n 's/ *| */|/g; s/^|\([^|]*|[^|]*|[^|]*|[^|]*|[0-9.]*\)[ |].*/\1/p' "$1"
}

readme=$(figures README.md)
[ "$(wc -l <<<"$readme")" -eq 5 ]
! grep --invert-match --line-regexp --fixed-strings --file=<(figures docs/performance.md) <<<"$readme"
