#!/bin/bash
# Compares the library's exported symbols, demangled, with the list that was agreed on.
#
# usage: symbols.sh LIBRARY LIST            fails on any difference and shows it
#        symbols.sh --update LIBRARY LIST   writes the list anew
set -euo pipefail

# "vtable for X", "X::f(...)": names alone, without addresses and kinds. Constructors and
# destructors have several symbols with one name.
exported() {
  nm --dynamic --defined-only --demangle "$1" | cut -d ' ' -f 3- | LC_ALL=C sort -u
}

if [ "$1" = --update ]; then
  exported "$2" >"$3"
else
  diff -u "$2" <(exported "$1") && echo "$(wc -l <"$2") exported symbols, as agreed on"
fi
