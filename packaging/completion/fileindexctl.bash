# Completion of fileindexctl for bash. The program itself knows what can follow.
# shellcheck shell=bash

_fileindexctl() {
  local current=${COMP_WORDS[COMP_CWORD]} word words=() candidates
  # A value behind "=" comes as a word of its own, like one behind a blank.
  for word in "${COMP_WORDS[@]:1:COMP_CWORD-1}"; do
    [[ $word == = ]] || words+=("$word")
  done
  [[ $current != = ]] || current=''
  words+=("$(printf %s "$current" | sed 's/^["'\'']//; s/\\\(.\)/\1/g')") # as it will be without quotes
  mapfile -t candidates < <("$1" help --complete -- "${words[@]}" 2>/dev/null)
  COMPREPLY=()
  for word in "${candidates[@]:1}"; do
    case $current in
      [\"\']*) COMPREPLY+=("$word") ;;
      *) COMPREPLY+=("$(printf %q "$word")") ;;
    esac
  done
  case ${candidates[0]} in
    files) compopt -o default ;;
    directories) compopt -o plusdirs ;;
  esac 2>/dev/null
}

complete -F _fileindexctl fileindexctl
