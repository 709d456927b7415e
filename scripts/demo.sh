#!/bin/bash
# Installs what is missing, builds the release preset and shows the library at work.
#
# usage: scripts/demo.sh
set -euo pipefail
source "$(dirname "$0")/common.sh"
takes_at_most 0 "$@"

scripts/build.sh release

drctl=$build/release/examples/drctl/drctl
scratch=$(mktemp -d)
trap 'rm -rf "$scratch" "/tmp/.kelodr_lock$scratch"' EXIT

# Says what comes, shows the command, runs it.
show() {
  printf '\n# %s\n$ drctl --db registry.db %s\n' "$1" "${*:2}"
  "$drctl" --db "$scratch/registry.db" "${@:2}"
}

show "Adds a node: the file and its table are made on first use" \
  node add nas1 --address 192.0.2.10 --port 5566
show "Adds another; data is quoted where it becomes SQL" \
  node add "o'brien's nas" --address nas.example --port 5566 --state online
show "The state changes" node set nas1 --state syncing
show "Lists what is online, as a table" node list --filter state=online
show "Lists all, as JSON, last name first" node list --order name --desc --json
show "Counts them" node count
show "Stores this machine's mounts, one row a mount point" volume scan
show "The largest ones" volume list --order size_mib --desc --limit 5
show "With --verbose, the library's own log lines" --verbose node remove nas1

printf '\n# A failure prints the error document and exits with 1\n'
show "A name that is taken" node add "o'brien's nas" --address nas.example --port 1 ||
  echo "exit status $?"

show "Reads the system's own key=value file; a value is its first word" system info

exported=$scratch/registry.json
show "Writes the registry to a JSON file, which is replaced in one step" export "$exported"
show "And reads it back; a bad document changes nothing" import "$exported"
echo '{"format":"drctl registry","version":1,"volumes":[],"nodes":[{"name":"x"}]}' >"$scratch/bad.json"
show "As here" import "$scratch/bad.json" || echo "exit status $?"

cache=(--cached --cache-dir "$scratch/cache")
show "Asks for the volumes through a cache file that all processes share" \
  --verbose volume list "${cache[@]}" --repeat 2 2>&1 | grep -E '^[#$]|answered'

printf '\n# The cache file gets old, and 20 processes ask at once\n'
touch --date=@0 "$scratch/cache/volumes.cached"
for i in {1..20}; do
  "$drctl" --verbose volume list "${cache[@]}" >/dev/null 2>"$scratch/answer.$i" &
done
wait
echo "$(grep -l "answered from a fresh scan" "$scratch"/answer.* | wc -l) of them scanned," \
  "$(grep -l "answered from the cache file" "$scratch"/answer.* | wc -l) waited for it and read the file"

# Says what comes, shows the call, makes it; keeps the reply.
call() {
  printf '\n# %s\n$ echo %s | drctl --db registry.db call\n' "$1" "'$2'"
  local status=0
  reply=$("$drctl" --db "$scratch/registry.db" call <<<"$2") || status=$?
  echo "$reply"
  [ "$status" -eq 0 ] || echo "exit status $status"
}
call "One call of the web API on standard input, one reply on standard output" \
  '{"api":"Node","method":"create","version":1,"name":"nas2","address":"192.0.2.11","port":5566}'
call "Again: the reply names the error" \
  '{"api":"Node","method":"create","version":1,"name":"nas2","address":"192.0.2.11","port":5566}'
call "A scan in the background, to be polled by its task id" \
  '{"api":"Volume","method":"scan","version":1}'
id=$(grep -oE '[0-9a-f-]{36}' <<<"$reply")
while
  call "How far is it?" '{"api":"Volume","method":"poll","version":1,"task_id":"'"$id"'"}'
  [[ $reply == *'"finish":false'* ]]
do sleep 0.1; done
