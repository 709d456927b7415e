#!/bin/bash
# Every file of the cookbook stands in docs/cookbook.md, as it is.
set -euo pipefail
cd "$(dirname "$0")/../.."
result=0

expected=$(mktemp)
trap 'rm "$expected"' EXIT
scripts/cookbook.sh "$expected"
diff docs/cookbook.md "$expected" || result=1

for file in examples/common/*.h examples/cookbook/*.cpp examples/cookbook/*.input examples/cookbook/*.output; do
  grep --quiet --fixed-strings "(../$file):" docs/cookbook.md && continue
  echo "docs/cookbook.md does not show $file"
  result=1
done
exit $result
