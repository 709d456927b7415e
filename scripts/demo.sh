#!/bin/bash
# Installs what is missing, builds the release preset and shows the library at work. The commands that it prints can be
# pasted into bash as they are.
#
# usage: scripts/demo.sh

# shellcheck disable=SC2016  # the commands are expanded when they run
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 0 "$@"

scripts/build.sh release

scratch=$(mktemp -d)
trap 'rm -rf "$scratch" "/tmp/.kelodr_lock$scratch"' EXIT

# Says what comes, prints the command, runs it.
show() {
  printf '\n# %s\n$ %s\n' "$1" "$2"
  eval "$2" || echo "(exit status $?)"
}

printf '\n# A directory for the files, and where drctl is\n'
printf '$ cd "$(mktemp -d)"\n$ PATH=%q:$PATH\n' "$build/release/examples/drctl"
cd "$scratch"
PATH=$build/release/examples/drctl:$PATH
show "The registry of all that follows" 'export DRCTL_DB=$PWD/registry.db'

show "Adds a node: the file and its table are made on first use" \
  'drctl node add nas1 --address 192.0.2.10 --port 5566'
show "Adds another one; data is quoted where it becomes SQL" \
  $'drctl node add "o\'brien\'s nas" --address nas.example --port 5566 --state online'
show "The state changes" 'drctl node set nas1 --state syncing'
show "Lists what is online, as a table" 'drctl node list --filter state=online'
show "Lists all, as JSON, last name first" 'drctl node list --order name --desc --json'
show "Counts them" 'drctl node count'
show "Stores this machine's mounts, one row a mount point" 'drctl volume scan'
show "The largest ones" 'drctl volume list --order size_mib --desc --limit 5'
show "With --verbose, the library's own log lines" 'drctl node remove nas1 --verbose'
show "A failure is a sentence and the exit status 1" \
  $'drctl node add "o\'brien\'s nas" --address nas.example --port 1'
show "Or, with --json, the error document" \
  $'drctl node add "o\'brien\'s nas" --address nas.example --port 1 --json'
show "A wrong word is named with the nearest known one, and the exit status is 2" 'drctl nod list'
show "Reads the system's own key=value file; a value is its first word" 'drctl system info'
show "Writes the registry to a JSON file, which is replaced in one step" 'drctl export registry.json'
show "And reads it back" 'drctl import registry.json'
show "A bad document changes nothing" \
  $'echo \'{"format":"drctl registry","version":1,"volumes":[],"nodes":[{"name":"x"}]}\' | drctl import -'

show "One call of the web API on standard input, one reply on standard output" \
  $'echo \'{"api":"Node","method":"create","version":1,"name":"nas2","address":"192.0.2.11","port":5566}\' | drctl call'
show "Again: the reply names the error" \
  $'echo \'{"api":"Node","method":"create","version":1,"name":"nas2","address":"192.0.2.11","port":5566}\' | drctl call'

if [ -d /tmp/.kelodr_lock ] && [ ! -w /tmp/.kelodr_lock ]; then
  printf '\n# The rest takes locks; on this machine their directory belongs to root.\n'
  exit
fi

show "Asks for the volumes through a cache file that all processes share" \
  'drctl --verbose volume list --cached --cache-dir cache --repeat 2 2>&1 | grep answered'
show "The cache file gets old" 'touch --date=@0 cache/volumes.cached'
show "Twenty processes ask at once: one scans, the others wait for it" \
  '(for i in {1..20}; do drctl --verbose volume list --cached --cache-dir cache >/dev/null 2>answer.$i & done; wait)'
show "Where they had their answers from" 'grep --no-filename answered answer.* | sort | uniq --count'

show "A scan in the background; the reply has the task's id" \
  $'echo \'{"api":"Volume","method":"scan","version":1}\' | drctl call | tee scan.json'
show "The call that asks how far it is" \
  $'poll=\'{"api":"Volume","method":"poll","version":1,"task_id":"\'$(grep -oE "[0-9a-f-]{36}" scan.json)\'"}\'; echo "$poll"'
show "Asks until it has ended" \
  $'while drctl call <<<"$poll" | tee poll.json | grep --quiet \'"finish":false\'; do sleep 0.1; done; cat poll.json'
