#!/bin/bash
# Draws the pictures of docs/ from their sources, and builds the API documentation into
# build/docs/html. A warning of Doxygen is an error.
#
# usage: scripts/docs.sh
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 0 "$@"

scripts/setup.sh docs
mkdir -p "$build/docs"
for source in docs/*.dot; do
  name=$(basename "$source" .dot).svg
  dot -Tsvg "$source" -o "$build/docs/$name"
  cmp --silent "$build/docs/$name" "docs/$name" || cp "$build/docs/$name" docs/
done
OUTPUT=$build/docs doxygen docs/Doxyfile
echo "The documentation is in $build/docs/html/index.html"
