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
#   fuzz      the fuzzing compiler
#   coverage  the coverage report
set -euo pipefail
cd "$(dirname "$0")/.."

packages_of() {
  case $1 in
    build) echo g++ cmake ninja-build libsqlite3-dev libjsoncpp-dev uuid-runtime ;;
    test) echo libgtest-dev libgmock-dev locales pkgconf valgrind lighttpd curl ;;
    examples) echo libcli11-dev ;;
    format) echo clang-format ;;
    package) echo abigail-tools dpkg-dev file ;;
    scripts) echo shellcheck ;;
    lint) echo clang clang-tidy ;;
    i386) echo g++-multilib googletest ;;
    docs) echo doxygen graphviz ;;
    bench) echo libbenchmark-dev libsqlitecpp-dev libsoci-dev libboost-dev gnuplot-nox python3 ;;
    fuzz) echo clang libclang-rt-14-dev ;;
    coverage) echo gcovr ;;
    *) echo "setup.sh: there is no group '$1'; scripts/setup.sh without one lists them" >&2; return 1 ;;
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
    echo "setup.sh: missing: ${missing[*]}" >&2
    echo "setup.sh: run this as root, or install them with apt-get first" >&2
    exit 1
  fi
  echo "setup.sh: installing ${missing[*]}"
  if apt_install --simulate >/dev/null 2>&1 && apt_install; then
    return
  fi
  apt-get update --quiet --quiet
  apt_install
}

if [ $# -eq 0 ]; then
  sed -n '/^# usage/,/^set/{/^#/s/^# \{0,1\}//p}' "$0" >&2
  exit 2
fi

missing=()
for group in "$@"; do
  packages=$(packages_of "$group")
  for package in $packages; do
    is_installed "$package" || missing+=("$package")
  done
done

if [ ${#missing[@]} -gt 0 ]; then
  install_missing
else
  echo "setup.sh: nothing to install for: $*"
fi
