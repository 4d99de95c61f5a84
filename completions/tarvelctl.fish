# Completion of tarvelctl for fish.

# Prints the command word, in lower case; the global options may stand before it.
function __tarvelctl_command
    set -l words (commandline -opc)
    set -e words[1]
    while contains -- "$words[1]" -f -w
        set words $words[3..]
    end
    string lower -- $words[1]
end

function __tarvelctl_wants_command
    test -z "$(__tarvelctl_command)"
end

function __tarvelctl_runs
    test "$(__tarvelctl_command)" = $argv[1]
end

complete -c tarvelctl -f
complete -c tarvelctl -o f -r -F
complete -c tarvelctl -o w -x
# TABLES
