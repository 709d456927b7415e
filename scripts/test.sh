#!/bin/bash
# Installs what is missing, builds everything and runs all tests.
#
# usage: scripts/test.sh [PRESET] [--as user|container]
#
# The presets are in CMakePresets.json; "dev" without one. --as, which needs root, runs the tests with fewer rights:
#   user        as an ordinary user, with a /tmp of its own where this system allows mounts
#   container   as root with the rights that containers usually give: no mounts, no right to trace others
# Both leave out the tests of the package, which write to the build tree, and those in which root mounts a root directory
# of its own to be attacked there; the user's run also leaves out those of changed ids and of root's directories. They
# list the skipped tests, and fail when more than 40 are skipped.
set -euo pipefail
source "$(dirname "$0")/common.sh"

preset=dev as=''
while [ $# -gt 0 ]; do
  case $1 in
    --as) as=${2:-} && shift ;;
    -*) wrong_usage "there is no option $1" ;;
    *) preset=$1 ;;
  esac
  shift || wrong_usage "--as needs 'user' or 'container'"
done
most_skipped=40
left_out='Package|LockDirectoryTest|[A-Za-z]*AttackTest'
[ "$as" != user ] || left_out+='|PrivilegeTest|FileDirRootTest'
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
  "$@" ctest --test-dir "$notes" --parallel "$(nproc)" --output-on-failure --no-tests=error \
    --exclude-regex "^($left_out)\." | tee "$notes/output"
}

case $as in
  '') ;;
  user | container) [ "$(id -u)" -eq 0 ] || fail "--as $as needs root" ;;
  *) wrong_usage "--as needs 'user' or 'container', not '$as'" ;;
esac
scripts/build.sh "$preset"
if [ -z "$as" ]; then
  # The same as the test presets, which some versions of ctest look for in build/ only.
  options=()
  case $preset in
    tsan) options=(--tests-regex '^ThreadsTest') ;;
    i386-asan)
      export ASAN_OPTIONS=quarantine_size_mb=16
      options=(--label-exclude '^kill$')
      ;;
  esac
  exec ctest --test-dir "$build/$preset" --output-on-failure --no-tests=error \
    --parallel "$(nproc)" "${options[@]}"
fi
notes=$(mktemp --directory)
trap 'rm -rf "$notes"' EXIT
chmod 777 "$notes"
status=0
if [ "$as" = container ]; then
  run_as "${container[@]}" || status=$?
elif unshare --mount true 2>/dev/null; then
  export -f with_own_tmp run_as fail
  export build preset notes script left_out
  unshare --mount bash -euo pipefail -c 'with_own_tmp run_as "$@"' bash "${user[@]}" || status=$?
else
  run_as "${user[@]}" || status=$?
fi
skipped=$(grep -c '(Skipped)$' "$notes/output" || true)
echo "$script: $skipped tests skipped, which are listed above; at most $most_skipped may be"
((status == 0 && skipped <= most_skipped))
