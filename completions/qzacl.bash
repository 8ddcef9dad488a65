# shellcheck shell=bash
# Completion of qzacl in bash: the verb, its options, values that are known, and files.

_qzacl() {
    local word verb='' i options values='' current=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]}
    for ((i = 1; i < COMP_CWORD; i++)); do
        word=${COMP_WORDS[i]}
        case $word in
        --permissions | --handler | --order | --wait | -[gmw]) ((++i)) ;;
        -*) ;;
        *) verb=$word && break ;;
        esac
    done
    options='--help --json --permissions'
    case $verb in
    ask) options="-g -m -w --handler --order $options" ;;
    test) options="--handler --order $options" ;;
    grant | remove | revoke | set) options="-s --check --wait $options" ;;
    edit) options="-s --wait $options" ;;
    esac
    case $previous in
    --order) values='closest sum' ;;
    --handler) values='hba2=domain hba2=exact hba2=none unix=domain unix=exact unix=none' ;;
    -m) values='hba2 unix' ;;
    -g) mapfile -t COMPREPLY < <(compgen -g -- "$current") && return ;;
    -w | --wait) COMPREPLY=() && return ;;
    *)
        if [[ $current == -* ]]; then
            values=$options
        elif [[ ! $verb && $previous != --permissions ]]; then
            values='ask cache diff edit grant lint remove revoke set show test who'
        fi
        ;;
    esac
    if [[ $values ]]; then
        mapfile -t COMPREPLY < <(compgen -W "$values" -- "$current")
    else
        mapfile -t COMPREPLY < <(compgen -f -- "$current")
        compopt -o filenames 2>/dev/null
    fi
}

complete -F _qzacl qzacl
