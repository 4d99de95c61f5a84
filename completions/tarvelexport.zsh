#compdef tarvelexport
# Completion of tarvelexport for zsh.

# TABLES

local curcontext=$curcontext state line
local -A opt_args
_arguments -C '(-)'{--help,--version} '(-)1: :->command' '(-)*:: :->arguments' && return
case $state in
  command) compadd -- ${(ko)specs} ;;
  arguments)
    local -a known=(${(Q)${(z)specs[$words[1]]}})
    # Tables may be repeated, and these two take names of files.
    known=("${(@)known/#1:/*:}")
    known=("${(@)known/%:(o|capture): /:file:_files}")
    _arguments $known
    ;;
esac
