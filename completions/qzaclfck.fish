# Completion of qzaclfck in fish: options not given yet, users after -u, and files after -f; with -u, files in that
# user's home directory.

function __qzaclfck_files
    set -l words (commandline -opc)
    if set -l place (contains -i -- -u $words)
        and set -l home (getent passwd $words[(math $place + 1)] | cut -d: -f6)
        for file in $home/(commandline -ct)*
            string replace -- $home/ '' $file
        end
    else
        __fish_complete_path (commandline -ct)
    end
end

# Whether an option may come here, or its argument, if it is the last word.
function __qzaclfck_may
    not contains -- $argv[1] (commandline -opc)[..-2]
end

complete -c qzaclfck -f
complete -c qzaclfck -s c -n 'not __fish_contains_opt -s c' -d 'Continue after bad lines and duplicates'
complete -c qzaclfck -s f -n '__qzaclfck_may -f' -x -a '(__qzaclfck_files)' -d 'Check this ACL file'
complete -c qzaclfck -s h -n 'not __fish_contains_opt -s h' -d 'Show the help'
complete -c qzaclfck -s s -n 'not __fish_contains_opt -s s' -d 'Compile the file into FILE.cacl'
complete -c qzaclfck -s u -n '__qzaclfck_may -u' -x -a '(__fish_complete_users)' -d 'The file is in the home of this user'
complete -c qzaclfck -s v -n 'not __fish_contains_opt -s v' -d 'Show each entry'
