# shellcheck shell=bash
# Completion of qzaclfck in bash: options not given yet, users after -u, and files after -f; with -u, files in that
# user's home directory.

# Prints what a path begun as $2 may become, seen from the folder $1.
_qzaclfck_files() { (cd -- "$1" 2>/dev/null && compgen -f -- "$2"); }

_qzaclfck() {
    local word letter given='' wanted='' user='' home=. i current=${COMP_WORDS[COMP_CWORD]}
    for ((i = 1; i < COMP_CWORD; i++)); do
        word=${COMP_WORDS[i]}
        case $wanted in
        u) user=$word ;;
        esac
        if [[ $wanted ]]; then
            wanted=
            continue
        fi
        [[ $word == -?* ]] || continue
        word=${word#-}
        while [[ $word ]]; do
            letter=${word:0:1} word=${word:1}
            given+=$letter
            case $letter in
            u) user=$word ;;&
            f | u)
                [[ $word ]] || wanted=$letter
                break
                ;;
            esac
        done
    done

    local IFS=$'\n'
    case $wanted in
    f)
        [[ ! $user ]] || home=$(getent passwd "$user" | cut -d: -f6)
        mapfile -t COMPREPLY < <(_qzaclfck_files "${home:-.}" "$current")
        compopt -o filenames 2>/dev/null
        ;;
    u) mapfile -t COMPREPLY < <(compgen -u -- "$current") ;;
    *)
        COMPREPLY=()
        for letter in c f h s u v; do
            [[ $given == *$letter* || "-$letter" != "$current"* ]] || COMPREPLY+=("-$letter")
        done
        ;;
    esac
}

complete -F _qzaclfck qzaclfck
