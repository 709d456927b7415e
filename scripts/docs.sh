#!/bin/bash
# Builds the API documentation into build/docs/html; a warning of Doxygen is an error.
set -euo pipefail
cd "$(dirname "$0")/.."

scripts/setup.sh docs
mkdir -p build/docs
doxygen docs/Doxyfile
echo "The documentation is in build/docs/html/index.html"
