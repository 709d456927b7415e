#!/bin/bash
# Installs the Debian packages that are missing for one or more purposes.
#
# usage: scripts/setup.sh GROUP...
#
#   build     compiler, CMake, SQLite and JsonCpp
#   test      what the tests link and run
#   examples  what the example programs link
#   format    the formatter
#   package   what makes and checks Debian packages
#   scripts   the checker of shell scripts
#   lint      the static checkers
#   i386      the 32-bit compiler runtime (scripts/setup-i386.sh installs it, too)
#   docs      the API documentation's generator
#   bench     the benchmark library, the libraries it compares with, the plotter
#   fuzz      clang and its run-time libraries, for the fuzz targets and the sanitizers
#   coverage  the coverage report
#   systems   what makes the systems of scripts/test-on.sh
set -euo pipefail
source "$(dirname "$0")/common.sh"

packages_of() {
  case $1 in
    build) echo g++ cmake ninja-build libsqlite3-dev libjsoncpp-dev uuid-runtime ;;
    test) echo libgtest-dev libgmock-dev e2fsprogs locales pkgconf valgrind lighttpd curl python3 ;;
    examples) echo libcli11-dev ;;
    format) echo clang-format ;;
    package) echo abigail-tools dpkg-dev file lintian man-db ;;
    scripts) echo shellcheck ;;
    lint) echo clang clang-tidy ;;
    i386) echo g++-multilib googletest ;;
    docs) echo doxygen graphviz ;;
    bench) echo libbenchmark-dev libsqlitecpp-dev libsoci-dev libboost-dev gnuplot-nox python3 ;;
    fuzz) echo clang libclang-rt-dev ;;
    coverage) echo gcovr ;;
    systems) echo debootstrap ;;
    *) wrong_usage "there is no group '$1'" ;;
  esac
}

is_installed() {
  [ "$(dpkg-query --show --showformat='${db:Status-Status}' "$1" 2>/dev/null)" = installed ]
}

apt_install() {
  DEBIAN_FRONTEND=noninteractive \
    apt-get install --yes --quiet --quiet --no-install-recommends "$@" "${missing[@]}" </dev/null
}

# The package lists are fetched only when they are absent, or too old to be served any more.
install_missing() {
  if [ "$(id -u)" -ne 0 ]; then
    fail "packages are missing; install them with
sudo apt-get install --no-install-recommends ${missing[*]}"
  fi
  echo "$script: installing ${missing[*]}"
  if apt_install --simulate >/dev/null 2>&1 && apt_install 2>/dev/null; then
    return
  fi
  local log
  log=$(mktemp)
  if apt-get update --quiet --quiet 2>"$log" && apt_install 2>>"$log"; then
    rm "$log"
    return
  fi
  if grep --quiet 'Temporary failure resolving\|Could not connect\|Cannot initiate the connection' "$log"; then
    rm "$log"
    fail "the package servers cannot be reached; is there a network? Missing: ${missing[*]}"
  fi
  cat "$log" >&2
  rm "$log"
  fail "these packages could not be installed: ${missing[*]}"
}

[ $# -gt 0 ] || wrong_usage "name at least one group"
groups=("$@")
missing=()
for group in "${groups[@]}"; do
  packages=$(packages_of "$group")
  for package in $packages; do
    is_installed "$package" || missing+=("$package")
  done
done

if [ ${#missing[@]} -gt 0 ]; then
  install_missing
else
  echo "$script: nothing to install for: $*"
fi
