# shellcheck shell=bash disable=SC2154
# Completion of tarvelexport for bash.

# TABLES

_tarvelexport() {
  local command=${COMP_WORDS[1]} current=${COMP_WORDS[COMP_CWORD]} values
  local option="$command ${COMP_WORDS[COMP_CWORD - 1]}"
  COMPREPLY=()
  if ((COMP_CWORD == 1)); then
    [[ $current == -* ]] && values='--help --version' || values=${!_tarvelexport_options[*]}
  elif [[ $option == 'json -o' || $option == 'json --capture' ]]; then
    compopt -o default
  elif [[ ${_tarvelexport_values[$option]+known} ]]; then
    values=${_tarvelexport_values[$option]}
  elif [[ $current == -* ]]; then
    values=${_tarvelexport_options[$command]}
  else
    values=${_tarvelexport_values[$command]}
  fi
  mapfile -t COMPREPLY < <(compgen -W "$values" -- "$current")
}

complete -F _tarvelexport tarvelexport
