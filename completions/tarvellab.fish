# Completion of tarvellab for fish.

function __tarvellab_wants_command
    test (count (commandline -opc)) = 1
end

# Whether the command word is this one and no other command's words have begun.
function __tarvellab_runs
    set -l words (commandline -opc)
    test "$words[2]" = $argv[1]; and not __tarvellab_is_behind
end

# Whether the words of the command that is run have begun.
function __tarvellab_is_behind
    set -l words (commandline -opc)
    test "$words[2]" = run; and contains -- -- $words
end

function __tarvellab_command
    set -l words (commandline -opc)
    set -l end (contains -i -- -- $words)
    complete -C (string join -- ' ' (string escape -- $words[(math $end + 1)..]) (commandline -ct))
end

complete -c tarvellab -f
complete -c tarvellab -n __tarvellab_wants_command -l help -d 'what there is to know'
complete -c tarvellab -n __tarvellab_wants_command -l version
complete -c tarvellab -n 'not __tarvellab_wants_command; and not __tarvellab_is_behind' \
    -a '(__fish_complete_directories (commandline -ct) "")'
complete -c tarvellab -n __tarvellab_is_behind -a '(__tarvellab_command)'
# TABLES
