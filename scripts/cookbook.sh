#!/bin/bash
# Puts the cookbook's files into docs/cookbook.md: the code block below a line that ends with a link
# to one of them and a colon becomes that file.
#
# usage: scripts/cookbook.sh [OUTPUT]      docs/cookbook.md itself is changed without one
set -euo pipefail
output=$(realpath --canonicalize-missing -- "${1:-$(dirname "$0")/../docs/cookbook.md}")
source "$(dirname "$0")/common.sh"
takes_at_most 1 "$@"
cd docs

text=$(awk '
  match($0, /\(\.\.\/examples\/(cookbook|common)\/[^)]*\):$/) { file = substr($0, RSTART + 1, RLENGTH - 3) }
  /^```/ && inside { inside = 0; skip = 0 }
  !skip { print }
  /^```[a-z]/ {
    inside = 1
    if (file != "") {
      while ((got = (getline line < file)) > 0) print line
      if (got < 0) { print "cookbook.sh: cannot read " file > "/dev/stderr"; exit 1 }
      file = ""
      skip = 1
    }
  }
' cookbook.md)
printf '%s\n' "$text" >"$output"
