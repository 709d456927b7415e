# Completion of drctl's command line for bash.

_drctl() {
  local current=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]}
  local with_file="--db --file --cache-dir --state-dir"
  local with_value="$with_file --address --port --state --filter --order --limit --offset --max-age --repeat"
  local command="" commands="" options="" i
  COMPREPLY=()

  # The words of the command: neither options nor their values.
  for ((i = 1; i < COMP_CWORD; ++i)); do
    if [[ " $with_value " == *" ${COMP_WORDS[i]} "* ]]; then
      ((++i))
    elif [[ ${COMP_WORDS[i]} != -* ]]; then
      command+="${COMP_WORDS[i]} "
    fi
  done

  case ${command#help } in
    "") commands="node volume system export import call help" ;;
    "node ") commands="add set remove list count" ;;
    "volume ") commands="scan list" ;;
    "system ") commands="info" ;;
    "node add "* | "node set "*) options="--address --port --state" ;;
    "node list "*) options="--filter --order --desc --limit --offset" ;;
    "volume list "*)
      options="--filter --order --desc --limit --offset --cached --cache-dir --max-age --repeat"
      ;;
    "system info "*) options="--file" ;;
    "call "*) options="--file --cgi --cache-dir --state-dir --max-age" ;;
  esac

  if [[ " $with_file " == *" $previous "* || $command == "export " || $command == "import " ]] &&
    [[ $current != -* ]]; then
    compopt -o filenames 2>/dev/null
    mapfile -t COMPREPLY < <(compgen -f -- "$current")
  elif [[ " $with_value " == *" $previous "* ]]; then
    return
  elif [[ $current == -* ]]; then
    mapfile -t COMPREPLY < <(
      compgen -W "$options --db --json --verbose --version --help" -- "$current"
    )
  else
    mapfile -t COMPREPLY < <(compgen -W "$commands" -- "$current")
  fi
}

complete -F _drctl drctl
