#!/bin/bash
# Reads off a built library what it is hardened with. Fails naming what is missing.
#
# usage: hardening.sh LIBRARY
set -euo pipefail
library=$1
segments=$(readelf --wide --segments "$library")
dynamic=$(readelf --wide --dynamic "$library")
symbols=$(nm --dynamic --undefined-only "$library")
failed=0

# expect WHAT TEXT PATTERN: a line of the text must match.
expect() {
  if grep -qE "$3" <<<"$2"; then
    echo "ok: $1"
  else
    echo "missing: $1"
    failed=1
  fi
}

expect "read-only relocations (RELRO)" "$segments" 'GNU_RELRO'
expect "bound at start (BIND_NOW)" "$dynamic" 'BIND_NOW|FLAGS.*NOW'
expect "non-executable stack" "$segments" 'GNU_STACK .* RW +0x'
expect "stack protector" "$symbols" '__stack_chk_fail'
expect "fortified calls" "$symbols" '__(syslog|snprintf|vsnprintf|fprintf|memcpy|read|realpath)_chk'
if grep -q 'TEXTREL' <<<"$dynamic"; then
  echo "found: text relocations"
  failed=1
else
  echo "ok: no text relocations"
fi
exit $failed
