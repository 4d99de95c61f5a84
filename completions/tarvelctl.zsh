#compdef tarvelctl
# Completion of tarvelctl for zsh.

# TABLES

# Offers the live list that the last argument names, in upper case as it is printed, and says what each is.
_tarvelctl_offer() {
  local -a lines=(${(f)"$(_tarvelctl_$argv[-1])"})
  local -a names=(${lines%%$'\t'*}) shown=(${lines/$'\t'/  })
  shift -p
  compadd -M 'm:{a-f}={A-F}' -l -d shown "$@" -a names
}

local curcontext=$curcontext state line
local -A opt_args
local -a globals=('*-f:file:_files' '*-w:seconds: ')

_arguments -C $globals '(-)1: :->command' '(-)*:: :->arguments' && return
case $state in
  command) compadd -M 'm:{A-Z}={a-z}' -- ${(ko)specs} ;;
  arguments)
    local -a known=(${(Q)${(z)specs[${(L)words[1]}]}})
    [[ $words[CURRENT] == -[^-]* ]] && globals=()  # which go by themselves, not together with other letters
    _arguments -s $globals $known
    ;;
esac
