#compdef tarvellab
# Completion of tarvellab for zsh.

# TABLES

local end=$words[(i)--]
if [[ $words[2] == run ]] && (( end < CURRENT )); then
  shift $end words
  (( CURRENT -= end ))
  _normal
  return
fi

local curcontext=$curcontext state line
local -A opt_args
_arguments -C '(-)'{--help,--version} '(-)1: :->command' '(-)*:: :->arguments' && return
case $state in
  command) compadd -- ${(ko)specs} ;;
  arguments)
    local -a known=(${(Q)${(z)specs[$words[1]]}})
    _arguments $known '1:directory:_files -/'
    ;;
esac
