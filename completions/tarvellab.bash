# shellcheck shell=bash disable=SC2154
# Completion of tarvellab for bash.

# TABLES

# Completes the words from one on as a command line of their own: as bash-completion does, if that is there.
_tarvellab_command() {
  if declare -F _command_offset >/dev/null; then
    _command_offset "$1"
    return
  fi
  local i COMP_LINE=$COMP_LINE
  for ((i = 0; i < $1; i++)); do COMP_LINE=${COMP_LINE#*"${COMP_WORDS[i]}"}; done
  COMP_LINE=${COMP_LINE#"${COMP_LINE%%[![:space:]]*}"}
  local COMP_WORDS=("${COMP_WORDS[@]:$1}") COMP_CWORD=$((COMP_CWORD - $1))
  compopt -o default
  if ((COMP_CWORD == 0)); then
    mapfile -t COMPREPLY < <(compgen -c -- "${COMP_WORDS[0]}" | command sort -u)
  elif [[ $(complete -p "${COMP_WORDS[0]##*/}" 2>/dev/null) =~ ' -F '([^ ]+) ]]; then
    "${BASH_REMATCH[1]}" "${COMP_WORDS[0]}" "${COMP_WORDS[COMP_CWORD]}" "${COMP_WORDS[COMP_CWORD - 1]}"
  fi
}

_tarvellab() {
  local command=${COMP_WORDS[1]} current=${COMP_WORDS[COMP_CWORD]} values i
  COMPREPLY=()
  for ((i = 2; i < COMP_CWORD; i++)); do
    [[ $command != run || ${COMP_WORDS[i]} != -- ]] || { _tarvellab_command $((i + 1)); return; }
  done
  local option="$command ${COMP_WORDS[COMP_CWORD - 1]}"
  if ((COMP_CWORD == 1)); then
    [[ $current == -* ]] && values='--help --version' || values=${!_tarvellab_options[*]}
  elif [[ ${_tarvellab_values[$option]+known} ]]; then
    values=${_tarvellab_values[$option]}
  elif [[ $current == -* ]]; then
    values=${_tarvellab_options[$command]}
  else
    # Readline completes names of directories where nothing is offered.
    compopt -o dirnames
  fi
  mapfile -t COMPREPLY < <(compgen -W "$values" -- "$current")
}

complete -F _tarvellab tarvellab
