# shellcheck shell=bash
# Every script reads this file first. It answers --help with the comment at the top of the script, goes to the
# top of the tree, and sets $build to the directory of the builds: build/, or KELODR_BUILD_DIR from the environment.

script=$(basename "$0")

help() { sed -n '2,/^\([^#]\|$\)/{/^#/s/^# \{0,1\}//p}' "$0"; }

# fail MESSAGE
fail() {
  echo "$script: $1" >&2
  exit 1
}

# wrong_usage MESSAGE
wrong_usage() {
  printf '%s: %s\n\n%s\n' "$script" "$1" "$(help)" >&2
  exit 2
}

# takes_at_most COUNT ARGUMENT...
takes_at_most() {
  (($# - 1 <= $1)) || wrong_usage "too many arguments"
}

# takes_number NAME VALUE
takes_number() {
  [[ $2 =~ ^[0-9]+$ ]] || wrong_usage "$1 is a number, not '$2'"
}

case ${1:-} in
  -h | --help)
    help
    exit
    ;;
esac
build=$(realpath --canonicalize-missing "${KELODR_BUILD_DIR:-$(dirname "$0")/../build}")
export KELODR_BUILD_DIR=$build
cd "$(dirname "$0")/.." || exit
