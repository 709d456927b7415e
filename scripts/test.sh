#!/bin/bash
# Installs what is missing, builds everything and runs all tests.
#
# usage: scripts/test.sh [PRESET] [--only LABEL,...] [--as user|container]
#
# The presets are in CMakePresets.json; "dev" without one. A label is the name of a folder of tests; what other labels
# need is not built. --as, which needs root, runs the tests with fewer rights:
#   user        as an ordinary user, with a /tmp of its own where this system allows mounts
#   container   as root with the rights that containers usually give: no mounts, no right to trace others
# Both leave out the attacks on root, for which root mounts a /tmp of its own, the tests of the package, which write to
# the build tree, and, to save time, pairs of kills and what valgrind runs. They end with the names of the tests that
# were skipped and that were left out, and fail when more than 40 were skipped.
set -euo pipefail
source "$(dirname "$0")/common.sh"

preset=dev as='' labels=''
while [ $# -gt 0 ]; do
  case $1 in
    --as) as=${2:-} && shift ;;
    --only) labels=${2:-} && shift ;;
    -*) wrong_usage "there is no option $1" ;;
    *) preset=$1 ;;
  esac
  shift || wrong_usage "an option needs a value"
done
most_skipped=40
need_mounts='^[A-Za-z]*AttackTest\.'
write_to_build='^Package\.'
repeat='(^|/)Killed[A-Za-z]*\.MayBe|^valgrind\.'
# Many tests wait for a while.
at_once=$((2 * $(nproc)))
user=(setpriv --reuid=1000 --regid=1000 --clear-groups)
container=(setpriv --inh-caps=-all --bounding-set="-all,+chown,+dac_override,+fowner,+fsetid,+kill,+setgid,+setuid,\
+setpcap,+net_bind_service,+net_raw,+sys_chroot,+mknod,+audit_write,+setfcap")

# with_own_tmp COMMAND...: the directories of this run stay visible where they are below /tmp.
with_own_tmp() {
  local dir tmp=$notes/tmp
  mkdir "$tmp"
  mount -t tmpfs -o mode=1777 tmpfs "$tmp"
  for dir in "$PWD" "$build" "$notes"; do
    [[ $dir == /tmp/* ]] || continue
    mkdir --parents "$tmp${dir#/tmp}"
    mount --bind "$dir" "$tmp${dir#/tmp}"
  done
  mount --move "$tmp" /tmp
  "$@"
}

# run_as RIGHTS...: ctest keeps its notes in a directory that the user can write to.
run_as() {
  "$@" test -r CMakePresets.json -a -x "$build/$preset" || fail "this user cannot read the tree"
  echo "subdirs(\"$build/$preset\")" >"$notes/CTestTestfile.cmake"
  "$@" ctest --test-dir "$notes" "${options[@]}" \
    --exclude-regex "$need_mounts|$write_to_build|$repeat" | tee "$notes/output"
}

# list_names WHAT: the names from the standard input, with their number.
list_names() {
  local names=()
  mapfile -t names
  printf '%s: %d tests %s\n' "$script" ${#names[@]} "$1"
  printf '  %s\n' "${names[@]}"
}

# names_of REGEX: the tests that ctest finds by it.
names_of() { ctest --test-dir "$notes" --show-only --tests-regex "$1" | sed -n 's/^ *Test *#[0-9]*: //p'; }

case $as in
  '') ;;
  user | container) [ "$(id -u)" -eq 0 ] || fail "--as $as needs root" ;;
  *) wrong_usage "--as needs 'user' or 'container', not '$as'" ;;
esac
targets=() options=(--parallel "$at_once" --output-on-failure --no-tests=error)
if [ -n "$labels" ]; then
  IFS=, read -ra targets <<<"$labels"
  targets=("${targets[@]/%/_tests}")
  options+=(--label-regex "^(${labels//,/|})$")
fi
scripts/build.sh "$preset" "${targets[@]}"
if [ -z "$as" ]; then
  # The same as the test presets, which some versions of ctest look for in build/ only.
  case $preset in
    tsan) options+=(--tests-regex '^ThreadsTest') ;;
    asan) options+=(--label-exclude '^kill$' --exclude-regex "$write_to_build") ;;
    i386-asan)
      options+=(--label-exclude '^kill$' --exclude-regex "$write_to_build")
      export ASAN_OPTIONS=quarantine_size_mb=16
      ;;
  esac
  exec ctest --test-dir "$build/$preset" "${options[@]}"
fi
notes=$(mktemp --directory)
trap 'rm -rf "$notes"' EXIT
chmod 777 "$notes"
status=0
if [ "$as" = container ]; then
  run_as "${container[@]}" || status=$?
elif unshare --mount true 2>/dev/null; then
  export -f with_own_tmp run_as fail
  export build preset notes script need_mounts write_to_build repeat
  unshare --mount bash -euo pipefail -c "options=(${options[*]@Q})"'; with_own_tmp run_as "$@"' bash "${user[@]}" || status=$?
else
  run_as "${user[@]}" || status=$?
fi
sed -n 's/^\t *[0-9]* - \(.*\) (Skipped)$/\1/p' "$notes/output" >"$notes/skipped"
list_names "skipped, at most $most_skipped may be" <"$notes/skipped"
names_of "$need_mounts" | list_names 'left out because they need mounts of root'
names_of "$write_to_build" | list_names 'left out because they write to the build tree'
names_of "$repeat" | list_names 'left out because they are the same for every user'
((status == 0 && $(wc -l <"$notes/skipped") <= most_skipped))
