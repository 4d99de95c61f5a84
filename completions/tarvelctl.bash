# shellcheck shell=bash disable=SC2154
# Completion of tarvelctl for bash.

# TABLES

_tarvelctl() {
  local command='' previous='' values word i words=() rest=$COMP_LINE
  # Bash splits words at characters such as "=" and ":". What stands together in the line is one word here.
  for ((i = 0; i <= COMP_CWORD; i++)); do
    word=${COMP_WORDS[i]}
    if ((i == 0)) || [[ $rest == [[:space:]]* ]]; then
      words+=("$word")
    else
      words[-1]+=$word
    fi
    rest=${rest#"${rest%%[![:space:]]*}"}
    rest=${rest#"$word"}
  done

  # The command, and the word whose value is to be completed, if it takes one.
  local last=$((${#words[@]} - 1))
  for ((i = 1; i < last; i++)); do
    case ${words[i]} in
      -f | -w) if ((++i == last)); then previous=${words[last - 1]}; fi ;;
      *)
        previous=${words[i]}
        command=${command:-${previous,,}}
        ;;
    esac
  done

  COMPREPLY=()
  local current=${words[last]}
  # Readline completes names of files where nothing is offered.
  [[ $previous != -f ]] || return 0
  compopt +o default
  [[ $previous != -w ]] || return 0
  if [[ ! $command ]]; then
    [[ $current == -* ]] && values='-f -w' || values=${!_tarvelctl_options[*]}
    mapfile -t COMPREPLY < <(compgen -W "$values" -- "${current,,}")
    return 0
  fi

  [[ $current != --*=* ]] || previous=${current%%=*} current=${current#*=}
  # Of letters in one word, the first that takes a value takes the rest of it, or the next word.
  while [[ $previous == -[!-]?* && ! ${_tarvelctl_values["$command ${previous:0:2}"]+known} ]]; do
    previous=-${previous:2}
  done
  if [[ ${_tarvelctl_values["$command $previous"]+known} ]]; then
    values=${_tarvelctl_values["$command $previous"]}
  elif [[ $current == -* ]]; then
    values="${_tarvelctl_options[$command]}-f -w"
  else
    values=${_tarvelctl_values[$command]}
  fi
  if [[ $values == @* ]]; then
    [[ $values == @addresses ]] || current=${current^^}
    mapfile -t words < <("_tarvelctl_${values#@}")
    values=${words[*]%%$'\t'*}
  fi
  mapfile -t COMPREPLY < <(compgen -W "$values" -- "$current")
  # Of an address, Bash replaces what stands behind the last ":".
  [[ $COMP_WORDBREAKS != *:* ]] || COMPREPLY=("${COMPREPLY[@]#"${current%"${current##*:}"}"}")
}

complete -o default -F _tarvelctl tarvelctl
