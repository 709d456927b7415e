#!/bin/bash
# Types that no field and no reader takes: the compiler refuses them with one message, which names
# the types that there are.
#
# usage: refused_types.sh COMPILER FLAG...
set -euo pipefail

# Compiles statements in which an insert, an update, a value, a record and variables are at hand.
compile() {
  "${compiler[@]}" -std=c++17 -fsyntax-only -x c++ - 2>&1 <<END
#include <kelodrcore/sqlite_command.h>
using namespace KeloDRCore;
enum Old { kOld };
enum class Kind { kNew };
void Use(InsertCommand& insert, UpdateCommand& update, const SqliteValue& value,
         const SqliteValueList& record, unsigned short small, unsigned long large,
         unsigned long long huge, long long wide, Kind kind, double real, int number) {
$*
}
END
}

# refuse CALL MESSAGE ARGUMENT...: each argument, of a type of its own, is one error.
refuse() {
  local call=$1 message=$2 argument statements=() output errors
  shift 2
  for argument; do statements+=("$call$argument);"); done
  output=$(compile "${statements[@]}") && echo "accepted: $call" && exit 1
  errors=$(grep 'error:' <<<"$output")
  if [ "$(wc -l <<<"$errors")" != $# ] || grep -vF "$message" <<<"$errors"; then
    echo "$call: not $# times \"$message\":" && echo "$output" && exit 1
  fi
}

compiler=("$@")
fields="AddFieldValue takes std::string, const char*, bool, int, unsigned int and long"
readers="GetValue reads bool, int, unsigned int, long, unsigned long, long long, unsigned long long"
readers+=" and std::string"

compile 'insert.AddFieldValue("a", number); update.AddFieldValue("a", "text");' \
  'value.GetValue(wide); record.GetValue("a", huge);'
for command in insert update; do
  refuse "$command.AddFieldValue(\"a\", " "$fields" \
    small large huge wide kind kOld real 1.5F "'c'" value '&number' '(void*)0'
done
for call in 'value.GetValue(' 'record.GetValue("a", '; do
  refuse "$call" "$readers" small kind real
done
