# Completion of kovabackup for fish. The command itself knows what can follow.

function __kovabackup_complete
    set -l typed (commandline -ct)
    set -l words (commandline -opc)[2..] "$typed"
    set -l lines (kovabackup __complete -- $words 2>/dev/null)
    switch "$lines[1]"
        case 'files*' # after so many bytes of the word
            set -l skipped (string replace -r '^files ?' '' $lines[1])
            set -l before (string sub -l "0$skipped" -- "$typed")
            printf '%s\n' "$before"(__fish_complete_path (string sub -s (math "0$skipped" + 1) -- "$typed"))
        case 'command *' # another command line, beginning at the word of that number
            set -l first (math (string replace 'command ' '' $lines[1]) + 1)
            complete -C (string join -- ' ' (string escape -- $words[$first..-2]) "$typed")
        case '*'
            printf '%s\n' $lines[2..]
    end
end

complete -c kovabackup -f -a '(__kovabackup_complete)'
