#!/bin/bash
# The arrows of docs/architecture.dot are the includes among the families, no more and no fewer.
set -euo pipefail
cd "$(dirname "$0")/../.."
export LC_ALL=C

# "from -> to", one a line, for "from -> {to to}" as well.
drawn() {
  sed -n 's/\[.*//; s/^ *\([a-z_]*\) -> {\{0,1\}\([a-z_ ]*\)}\{0,1\} *$/\1 \2/p' docs/architecture.dot |
    awk '{ for (i = 2; i <= NF; ++i) print $1 " -> " $i }' | sort -u
}

# Not drawn: helpers that are a header only, and the parts of one family among themselves.
included() {
  grep --only-matching '#include [<"][a-z_/]*\.h' src/*.cpp src/*.h include/kelodrcore/*.h |
    sed 's|^.*/\([a-z_]*\)\.[a-z]*:#include .\(kelodrcore/\)\{0,1\}|\1 |; s|\.h$||
         s/^validator /utils /; s/ kelo\(core\|random\)$/ platform/' |
    awk -v families="$(basename -s .cpp -a src/*.cpp) platform" '
      BEGIN { split(families, names, /[ \n]/); for (i in names) isFamily[names[i]] = 1 }
      $1 != $2 && isFamily[$1] && isFamily[$2] { print $1 " -> " $2 }' | sort -u
}

diff --label docs/architecture.dot <(drawn) --label "the sources' includes" <(included)
