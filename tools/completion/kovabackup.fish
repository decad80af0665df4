# Completion of kovabackup for fish.

# The words typed so far that are no options: family, verb, arguments.
function __kovabackup_words
    set -l words (commandline -opc)
    string match --invert -- '-*' $words[2..]
end

# True when the family and verb are the given ones; with no arguments, before the family.
function __kovabackup_at
    set -l words (__kovabackup_words)
    test (count $words) -ge (count $argv); or return 1
    if test (count $argv) -eq 0
        test (count $words) -eq 0
        return
    end
    test "$words[1..$(count $argv)]" = "$argv"
end

# True when exactly these words were typed: the next one is a verb or the first argument.
function __kovabackup_after
    set -l words (__kovabackup_words)
    test (count $words) -eq (count $argv); and __kovabackup_at $argv
end

# True at the argument of the given number (from 0) of a verb.
function __kovabackup_argument
    set -l words (__kovabackup_words)
    test (count $words) -eq (math (count $argv) - 1 + $argv[1]); and __kovabackup_at $argv[2..]
end

function __kovabackup_ids
    kovabackup session list 2>/dev/null | string replace -r '\t([^\t]*)\t([^\t]*).*' '\t$1, $2'
end

function __kovabackup_tokens
    ls /tmp/kovabackup/lock 2>/dev/null
end

function __kovabackup_sections
    kovabackup option sections (__kovabackup_words)[3] 2>/dev/null
end

function __kovabackup_names
    set -l words (__kovabackup_words)
    kovabackup option list $words[3] $words[4] 2>/dev/null | string replace -r '=.*' ''
end

complete -c kovabackup -f
complete -c kovabackup -s h -l help -d 'show this help'
complete -c kovabackup -n 'not __kovabackup_at template fill' -l json -d 'print one JSON document'
complete -c kovabackup -l no-color -d 'no colours'
complete -c kovabackup -n __kovabackup_at -l version -d 'show the version'

complete -c kovabackup -n __kovabackup_at -a session -d 'Look after session directories'
complete -c kovabackup -n __kovabackup_at -a option -d 'Read and change options in section files'
complete -c kovabackup -n __kovabackup_at -a filter -d 'Try include and exclude patterns on paths'
complete -c kovabackup -n __kovabackup_at -a volume -d 'Show volumes and what a rule chooses'
complete -c kovabackup -n __kovabackup_at -a net -d 'Try the network as the services do'
complete -c kovabackup -n __kovabackup_at -a template -d 'Fill message templates'
complete -c kovabackup -n __kovabackup_at -a lock -d 'Look at the locks between writers'
complete -c kovabackup -n __kovabackup_at -a run -d 'Run a command as the services do'
complete -c kovabackup -n __kovabackup_at -a doctor -d 'Check what the services need'

# session
complete -c kovabackup -n '__kovabackup_after session' -a list -d 'List all sessions'
complete -c kovabackup -n '__kovabackup_after session' -a show -d 'Show one session'
complete -c kovabackup -n '__kovabackup_after session' -a path -d 'Print a session\'s directory'
complete -c kovabackup -n '__kovabackup_after session' -a create -d 'Make a session'
complete -c kovabackup -n '__kovabackup_after session' -a destroy -d 'Remove sessions'
complete -c kovabackup -n '__kovabackup_after session' -a prune -d 'Remove what dead processes left'
complete -c kovabackup -n '__kovabackup_at session list' -s 0 -l null -d 'end rows with NUL'
complete -c kovabackup -n '__kovabackup_at session show' -s 0 -l null -d 'end lines with NUL'
complete -c kovabackup -n '__kovabackup_at session path' -s 0 -l null -d 'end the path with NUL'
complete -c kovabackup -n '__kovabackup_at session create' -x -l volume -d 'on the volume of a rule' \
    -a 'max max-ext max-ext-btrfs same:'
complete -c kovabackup -n '__kovabackup_at session prune' -x -l older-than -d 'not loaded for so long' \
    -a '1d 7d 30d'
complete -c kovabackup -n '__kovabackup_at session prune' -l dry-run -d 'only show'
complete -c kovabackup -n '__kovabackup_at session prune' -l yes -d 'do not ask'
complete -c kovabackup -n '__kovabackup_at session prune' -s 0 -l null -d 'end rows with NUL'
complete -c kovabackup -n '__kovabackup_after session show' -a '(__kovabackup_ids)'
complete -c kovabackup -n '__kovabackup_after session path' -a '(__kovabackup_ids)'
complete -c kovabackup -n '__kovabackup_at session destroy' -a '(__kovabackup_ids)'

# option
complete -c kovabackup -n '__kovabackup_after option' -a sections -d 'List the sections of a file'
complete -c kovabackup -n '__kovabackup_after option' -a list -d 'List the options of a section'
complete -c kovabackup -n '__kovabackup_after option' -a get -d 'Print the value of an option'
complete -c kovabackup -n '__kovabackup_after option' -a set -d 'Set an option'
complete -c kovabackup -n '__kovabackup_after option' -a unset -d 'Remove an option'
for verb in sections list get
    complete -c kovabackup -n "__kovabackup_at option $verb" -s 0 -l null -d 'end names with NUL'
end
complete -c kovabackup -n '__kovabackup_at option get' -l reveal -d 'decrypt a secret and show it'
complete -c kovabackup -n '__kovabackup_at option set' -x -l type -d 'its type' -a 'string int bool list'
complete -c kovabackup -n '__kovabackup_at option set' -l secret -d 'store it encrypted'
for verb in set unset
    complete -c kovabackup -n "__kovabackup_at option $verb" -x -l lock -d 'hold this lock token' \
        -a '(__kovabackup_tokens)'
end
for verb in sections list get set unset
    complete -c kovabackup -n "__kovabackup_argument 0 option $verb" -F
end
for verb in list get set unset
    complete -c kovabackup -n "__kovabackup_argument 1 option $verb" -a '(__kovabackup_sections)'
end
for verb in get set unset
    complete -c kovabackup -n "__kovabackup_argument 2 option $verb" -a '(__kovabackup_names)'
end

# filter
complete -c kovabackup -n '__kovabackup_after filter' -a test -d 'Print the paths that are kept'
complete -c kovabackup -n '__kovabackup_at filter test' -x -l include -d 'keep what matches'
complete -c kovabackup -n '__kovabackup_at filter test' -x -l exclude -d 'leave out what matches'
complete -c kovabackup -n '__kovabackup_at filter test' -r -F -l patterns -d 'read patterns from a file'
complete -c kovabackup -n '__kovabackup_at filter test' -l explain -d 'tell which pattern decided'
complete -c kovabackup -n '__kovabackup_at filter test' -s 0 -l null -d 'paths end in NUL'

# volume
complete -c kovabackup -n '__kovabackup_after volume' -a list -d 'List the volumes'
complete -c kovabackup -n '__kovabackup_after volume' -a pick -d 'Show what a rule chooses'
complete -c kovabackup -n '__kovabackup_at volume list' -s 0 -l null -d 'end rows with NUL'
complete -c kovabackup -n '__kovabackup_at volume pick' -s 0 -l null -d 'end the path with NUL'
complete -c kovabackup -n '__kovabackup_at volume pick' -l fallback-tmp -d 'else take /tmp'
complete -c kovabackup -n '__kovabackup_after volume pick' -a 'max max-ext max-ext-btrfs same:'

# net
complete -c kovabackup -n '__kovabackup_after net' -a probe -d 'Try to connect to a TCP port'
complete -c kovabackup -n '__kovabackup_at net probe' -x -l timeout -d 'give up after so many seconds'

# template
complete -c kovabackup -n '__kovabackup_after template' -a fill -d 'Replace each {{name}} by its value'
complete -c kovabackup -n '__kovabackup_at template fill' -x -l set -d 'a value'
complete -c kovabackup -n '__kovabackup_at template fill' -r -F -l json -d 'values from a JSON file'
complete -c kovabackup -n '__kovabackup_at template fill' -l strict -d 'fail without a value'
complete -c kovabackup -n '__kovabackup_after template fill' -F

# lock
complete -c kovabackup -n '__kovabackup_after lock' -a show -d 'Show who holds a lock token'
complete -c kovabackup -n '__kovabackup_at lock show' -s 0 -l null -d 'end rows with NUL'
complete -c kovabackup -n '__kovabackup_after lock show' -a '(__kovabackup_tokens)'

# run
complete -c kovabackup -n '__kovabackup_at run' -l background -d 'start it and do not wait'
complete -c kovabackup -n '__kovabackup_at run' -l new-session -d 'in a session of its own'
complete -c kovabackup -n '__kovabackup_at run' -r -F -l stdout -d 'append its output to a file'
complete -c kovabackup -n '__kovabackup_at run' -r -F -l stderr -d 'append its errors to a file'
complete -c kovabackup -n '__kovabackup_at run' -x -l env -d 'set a variable'
complete -c kovabackup -n '__kovabackup_after run' -a '(__fish_complete_command)'

# doctor
complete -c kovabackup -n '__kovabackup_at doctor' -s 0 -l null -d 'end rows with NUL'
complete -c kovabackup -n '__kovabackup_at doctor' -x -l older-than -d 'sessions are stale after' \
    -a '1d 7d 30d'
