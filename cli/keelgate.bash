# SPDX-License-Identifier: Apache-2.0
# Completion of keelgate for bash. It has no list of its own: options come from the command's help,
# names from what it describes.

_keelgate_options() {
  "$1" ${2:+"$2"} --help 2>/dev/null | command grep -oE -- '--[a-z0-9-]+' | sort -u
}

# The values under a key of `describe --json`, which has one of them on each line.
_keelgate_values() {
  "$1" describe --json 2>/dev/null | command sed -n "s/^ *\"$2\": \"\\([^\"]*\\)\".*/\\1/p" |
    sort -u
}

# The names of everything that `describe` shows: values, and the keys of the named tables.
_keelgate_names() {
  local key
  for key in record unpacker service; do _keelgate_values "$1" "$key"; done
  "$1" describe --json 2>/dev/null | command sed -n 's/^    "\([^"]*\)": [[{].*/\1/p'
}

_keelgate_subcommands() {
  "$1" --help 2>/dev/null | command sed -n '/^Subcommands:/,/^$/s/^  \([a-z]*\) .*/\1/p'
}

_keelgate_complete() {
  mapfile -t COMPREPLY < <(compgen -W "$1" -- "$current")
}

_keelgate() {
  local command=$1 current=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]}
  local subcommand="" i
  for ((i = 1; i < COMP_CWORD; ++i)); do
    case ${COMP_WORDS[i]} in
      -*) ;;
      *) subcommand=${COMP_WORDS[i]}; break ;;
    esac
  done

  case $previous in
    --record) _keelgate_complete "$(_keelgate_values "$command" record)"; return ;;
    --service) _keelgate_complete "$(_keelgate_values "$command" service)"; return ;;
    --command)
      _keelgate_complete "$("$command" describe --json 2>/dev/null |
        command sed -n 's/^ *"command": \([0-9]*\).*/\1/p' | sort -u)"
      return
      ;;
    --isolation) _keelgate_complete "rewind fork"; return ;;
    --log-level) _keelgate_complete "none error warning"; return ;;
    --service-path | --connect | --files0-from | --metrics)
      mapfile -t COMPREPLY < <(compgen -f -- "$current"); return ;;
    --processes | --messages-per-process | --time-limit | --max-message) return ;;
  esac

  case $subcommand:$current in
    *:-*) _keelgate_complete "$(_keelgate_options "$command" "$subcommand")" ;;
    :*) _keelgate_complete "$(_keelgate_subcommands "$command")" ;;
    unpack:* | check:*) mapfile -t COMPREPLY < <(compgen -f -- "$current") ;;
    describe:*) _keelgate_complete "$(_keelgate_names "$command")" ;;
  esac
}

complete -o filenames -F _keelgate keelgate
