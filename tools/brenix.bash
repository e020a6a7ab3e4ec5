# Completion of brenix for bash, and for zsh after: autoload -U bashcompinit && bashcompinit
_brenix() {
    local word=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]}
    local command=${COMP_WORDS[1]}
    COMPREPLY=()
    if ((COMP_CWORD == 1)); then
        mapfile -t COMPREPLY < <(compgen -W \
            'plugins check info read write scope --help --version' -- "$word")
        return
    fi
    case $previous in
        -o | --option)
            # The options of the device, which stands right behind the command.
            mapfile -t COMPREPLY < <(compgen -W "$(brenix plugins "${COMP_WORDS[2]}" 2>/dev/null |
                awk '/^  properties:/ { exit } /^  / { print $1 "=" }')" -- "$word")
            compopt -o nospace
            return
            ;;
        -w | --to | -i | --from | --png | --emit-c)
            mapfile -t COMPREPLY < <(compgen -f -- "$word")
            return
            ;;
        --format)
            mapfile -t COMPREPLY < <(compgen -W 'csv raw wav' -- "$word")
            return
            ;;
    esac
    if [[ $word == -* ]]; then
        mapfile -t COMPREPLY < <(compgen -W "$(brenix "$command" --help 2>/dev/null |
            grep -oE '^  -[^ ]+' | tr ',' ' ')" -- "$word")
    else
        mapfile -t COMPREPLY < <(compgen -W "$(brenix plugins --names 2>/dev/null)" -- "$word")
        if ((${#COMPREPLY[@]} == 0)); then
            mapfile -t COMPREPLY < <(compgen -f -- "$word")
        fi
    fi
}
complete -F _brenix brenix
