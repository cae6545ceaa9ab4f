# bash completion for alarmsearch and alarmsearch-sim. Commands and options are read from the
# program's own --help, so they follow whatever the installed version offers.

# Prints one line per option of "$@ --help": the long name, then its value's name if it takes one.
_alarmsearch_options()
{
    "$@" --help 2>/dev/null |
        sed -nE 's/^  (-[^-][^ ,]*, )?(--[A-Za-z0-9-]+)( <([^>]*)>)?.*/\2 \4/p'
}

_alarmsearch()
{
    local cur prev words cword
    _init_completion || return

    local program=${words[0]} command="" i
    local -a commands
    mapfile -t commands < <("$program" --help 2>/dev/null |
        sed -nE '/^Commands:/,/^$/s/^  ([a-z][a-z0-9-]*) .*/\1/p')

    # The command is the first word that is neither an option nor an option's value.
    local -A value
    local name placeholder
    while read -r name placeholder; do
        value[$name]=$placeholder
    done < <(_alarmsearch_options "$program")
    for ((i = 1; i < cword; i++)); do
        if [[ ${words[i]} == -* ]]; then
            [[ -n ${value[${words[i]}]-} ]] && ((i++))
        elif [[ " ${commands[*]} " == *" ${words[i]} "* ]]; then
            command=${words[i]}
            break
        fi
    done
    if [[ -n $command ]]; then
        while read -r name placeholder; do
            value[$name]=$placeholder
        done < <(_alarmsearch_options "$program" "$command")
    fi

    if [[ -n ${value[$prev]-} ]]; then
        case ${value[$prev]} in
            *path* | *file*) _filedir ;;
        esac
        return
    fi
    if [[ $cur == -* ]]; then
        mapfile -t COMPREPLY < <(compgen -W "${!value[*]}" -- "$cur")
    elif [[ -z $command && ${#commands[@]} -gt 0 ]]; then
        mapfile -t COMPREPLY < <(compgen -W "${commands[*]}" -- "$cur")
    fi
}
complete -F _alarmsearch alarmsearch alarmsearch-sim
