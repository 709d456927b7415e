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
# version.h is made when the library is built; the version stands in CMakeLists.txt alone.
version=$(sed -n 's/^project(KeloDRCore VERSION \([0-9.]*\).*/\1/p' CMakeLists.txt)
IFS=. read -r major minor patch <<<"$version"
mkdir -p "$build/docs/include/kelodrcore"
sed "s/@PROJECT_VERSION@/$version/; s/@PROJECT_VERSION_MAJOR@/$major/
  s/@PROJECT_VERSION_MINOR@/$minor/; s/@PROJECT_VERSION_PATCH@/$patch/" \
  include/kelodrcore/version.h.in >"$build/docs/include/kelodrcore/version.h"
rm -rf "$build/docs/html"
VERSION=$version OUTPUT=$build/docs doxygen docs/Doxyfile
# The pages are whole in themselves.
if grep --recursive --include='*.html' --only-matching 'href="\.\./[^"]*"' "$build/docs/html"; then
  fail "these links lead out of the documentation"
fi
echo "The documentation is in $build/docs/html/index.html"
