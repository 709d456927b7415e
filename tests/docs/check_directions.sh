#!/bin/bash
# Includes point down only: a folder includes the headers of the folders that are listed for it.
# posix/ knows no log and no JSON either.
set -euo pipefail
cd "$(dirname "$0")/../.."

# The folder that a header belongs to; nothing for one of the system.
folder_of() {
  case $1 in
    posix/*) echo posix ;;
    kelodrcore/*) echo include ;;
    *)
      for folder in src platform; do
        if [ -e "$folder/$1" ]; then echo "$folder"; fi
      done
      ;;
  esac
}

# check FOLDER ALLOWED...
check() {
  local folder=$1 file header to
  while IFS=: read -r file header; do
    to=$(folder_of "$header")
    [[ -z $to || " $* " == *" $to "* ]] || echo "$file includes $header of $to/"
    [[ $folder != posix || $header != @(syslog.h|json/*) ]] || echo "$file includes $header"
  done < <(grep --recursive --only-matching --perl-regexp '^ *# *include *[<"]\K[^>"]+' "$folder")
}

wrong=$(
  check posix
  check platform posix
  check include
  check src platform posix include
  check examples include
)
[ -z "$wrong" ] || { echo "$wrong" && exit 1; }
