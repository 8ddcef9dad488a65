# Completion of qzaclfck in fish: the options that are not there yet, users behind -u, and files behind -f, which with
# -u are those in the user's home.

function __qzaclfck_files
    set -l words (commandline -opc)
    set -l place (contains -i -- -u $words)
    and set -l home (getent passwd $words[(math $place + 1)] | cut -d: -f6)
    and cd $home 2>/dev/null
    and __fish_complete_path (commandline -ct)
    or __fish_complete_path (commandline -ct)
end

complete -c qzaclfck -f
complete -c qzaclfck -s c -n 'not __fish_contains_opt -s c' -d 'Go on after bad lines and duplicates'
complete -c qzaclfck -s f -n 'not __fish_contains_opt -s f' -x -a '(__qzaclfck_files)' -d 'Check this ACL file'
complete -c qzaclfck -s h -n 'not __fish_contains_opt -s h' -d 'Show the help'
complete -c qzaclfck -s s -n 'not __fish_contains_opt -s s' -d 'Compile the file into FILE.cacl'
complete -c qzaclfck -s u -n 'not __fish_contains_opt -s u' -x -a '(__fish_complete_users)' \
    -d 'The file is in the home of this user'
complete -c qzaclfck -s v -n 'not __fish_contains_opt -s v' -d 'Show each entry'
