# Completion of qzacl in fish: the verb, its options, values that are known, and files.

set -l verbs ask cache diff edit grant lint remove revoke set show test who

complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -f
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a ask -d 'What a party would be granted, and why'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a cache -d 'What services read, and whether it is right'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a diff -d 'What changes from one ACL to another'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a edit -d 'An editor on the file'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a grant -d 'Add letters to an entry, or the entry'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a lint -d 'What a check lets through and nobody meant'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a remove -d 'Take an entry out'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a revoke -d 'Take letters away from an entry'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a set -d 'Make an entry what it is to be'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a show -d 'The entries as a text'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a test -d 'Whether an ACL grants what cases say'
complete -c qzacl -n "not __fish_seen_subcommand_from $verbs" -a who -d 'The entries that hold all of some letters'
complete -c qzacl -s h -l help -d 'Show the help'
complete -c qzacl -l json -d 'Print JSON objects, one a line'
complete -c qzacl -l permissions -r -F -d 'Letters of a service'
complete -c qzacl -n '__fish_seen_subcommand_from ask' -s g -x -a '(__fish_complete_groups)' -d 'A group of the party'
complete -c qzacl -n '__fish_seen_subcommand_from ask' -s m -x -a 'hba2 unix' -d 'The mechanism of the identity'
complete -c qzacl -n '__fish_seen_subcommand_from ask' -s w -x -d 'Whether these letters are granted'
complete -c qzacl -n '__fish_seen_subcommand_from ask test' -l handler -x \
    -a 'unix=domain unix=exact unix=none' -d 'How user-expanded entries are compared'
complete -c qzacl -n '__fish_seen_subcommand_from ask test' -l order -x -a 'closest sum' -d 'Which answers count'
complete -c qzacl -n '__fish_seen_subcommand_from edit grant remove revoke set' -s s -d 'Compile, so that the cache counts'
complete -c qzacl -n '__fish_seen_subcommand_from grant remove revoke set' -l check -d 'Show what would change'
complete -c qzacl -n '__fish_seen_subcommand_from edit grant remove revoke set' -l wait -x -d 'Seconds to wait for another edit'
