# Completion of zophotos for fish.

# Prints the command in the command line, if there is one. The values of options are no commands.
function __zophotos_command
    set -l tokens (commandline -opc)
    set -l is_value no
    for token in $tokens[2..-1]
        if test $is_value = yes
            set is_value no
            continue
        end
        switch $token
            case --database --color
                set is_value yes
            case '-*'
            case '*'
                echo $token
                return 0
        end
    end
    return 1
end

# Whether the command is help, and has no argument yet.
function __zophotos_needs_topic
    contains help (__zophotos_command); and test (commandline -opc)[-1] = help
end

set -l commands status ls tree find failed check watch export help
set -l first 'not __zophotos_command >/dev/null'

complete -c zophotos -f
complete -c zophotos -l database -r -F -d 'Read this database'
complete -c zophotos -l json -d 'Print JSON'
complete -c zophotos -l color -x -a 'auto always never' -d 'Print folders in a colour'
complete -c zophotos -l escape -d 'Escape names also if the output is not a terminal'
complete -c zophotos -l version -d 'Print the version'
complete -c zophotos -s h -l help -d 'Print help'

complete -c zophotos -n $first -a status -d 'Show the database and the progress of each volume'
complete -c zophotos -n $first -a ls -d 'List a folder, or show a file'
complete -c zophotos -n $first -a tree -d 'Show all folders below a folder'
complete -c zophotos -n $first -a find -d 'Find files and folders by name'
complete -c zophotos -n $first -a failed -d 'List the photos that could not be rendered'
complete -c zophotos -n $first -a check -d 'Check the database for damage'
complete -c zophotos -n $first -a watch -d 'Print a line for each change until interrupted'
complete -c zophotos -n $first -a export -d 'Print every file with its full path'
complete -c zophotos -n $first -a help -d 'Print help, or the help of a command'
complete -c zophotos -n __zophotos_needs_topic -a "$commands"

complete -c zophotos -n 'contains status (__zophotos_command)' -s f -l follow -d 'Show the progress again after each change'
complete -c zophotos -n 'contains ls (__zophotos_command)' -s l -l long -d 'Add times, numbers of files and volumes'
complete -c zophotos -n 'contains ls (__zophotos_command)' -s 1 -d 'Print one name per line'
complete -c zophotos -n 'contains tree (__zophotos_command)' -s L -l level -x -d 'Show only so many levels'
complete -c zophotos -n 'contains find (__zophotos_command)' -s i -l ignore-case -d 'Ignore case'
complete -c zophotos -n 'contains find (__zophotos_command)' -s 0 -l null -d 'End each path with a NUL'
complete -c zophotos -n 'contains find (__zophotos_command)' -l type -x -a 'f d' -d 'Find only files or folders'
complete -c zophotos -n 'contains export (__zophotos_command)' -l csv -d 'Print comma-separated values'
complete -c zophotos -n 'contains export (__zophotos_command)' -l jsonl -d 'Print one JSON object per line'
complete -c zophotos -n 'contains export (__zophotos_command)' -l changes -r -F -d 'Print only the changes since the last export with this file'
complete -c zophotos -n 'contains export (__zophotos_command)' -l whole -d 'With --changes, print all files'
