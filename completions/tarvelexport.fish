# Completion of tarvelexport for fish.

function __tarvelexport_wants_command
    test (count (commandline -opc)) = 1
end

function __tarvelexport_runs
    set -l words (commandline -opc)
    test "$words[2]" = $argv[1]
end

complete -c tarvelexport -f
complete -c tarvelexport -n __tarvelexport_wants_command -l help -d 'what there is to know'
complete -c tarvelexport -n __tarvelexport_wants_command -l version
# TABLES
complete -c tarvelexport -n '__tarvelexport_runs json' -s o -r -F
complete -c tarvelexport -n '__tarvelexport_runs json' -l capture -r -F
