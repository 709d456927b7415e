#!/bin/bash
# Draws the pictures of docs/ from their sources, and builds the API documentation into
# build/docs/html; a warning of Doxygen is an error.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup.sh docs
for source in docs/*.dot; do
  dot -Tsvg "$source" -o "${source%.dot}.svg"
done
mkdir -p build/docs
doxygen docs/Doxyfile
echo "The documentation is in build/docs/html/index.html"
