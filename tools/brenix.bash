# Completion of brenix for bash, and for zsh after: autoload -U bashcompinit && bashcompinit
_brenix_plugins() { # KIND
    brenix plugins 2>/dev/null | sed -nE "s/^([^ ]+): $1\$/\1/p"
}

_brenix() {
    local word=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]}
    local command=${COMP_WORDS[1]} words='' files=''
    case $previous in
        brenix | */brenix) words='plugins check find info read write scope keys --help --version' ;;
        -o | --option)
            # The options of the device, which stands right behind the command.
            words=$(brenix plugins "${COMP_WORDS[2]}" 2>/dev/null |
                awk '/^  (properties|(in|out)put fields):$|^  command / { exit } /^  / { print $1 "=" }')
            compopt -o nospace
            ;;
        -c | --converter) words=$(_brenix_plugins converter) files=1 ;;
        -f | --filter) words=$(_brenix_plugins filter) files=1 ;;
        --field)
            words=$(brenix plugins "${COMP_WORDS[2]}" 2>/dev/null |
                sed -nE '/^  input fields:$/,/^  [^ ]/ s/^    ([^ #]+) .*/\1/p')
            ;;
        -t | --type)
            words='double float int8 int16 int32 int64 uint8 uint16 uint32 uint64 logical'
            ;;
        --format) words=$(brenix read --help | sed -nE 's/.*--format[^{]*\{([^}]*)\}.*/\1/p' | tr , ' ') ;;
        -w | --to | -i | --from | --png | --emit-c | =) files=1 ;; # = as in FileName=
        -[nsrbp] | --counts | --seconds | --rate | --block | --property | --limit | --window | \
            --open-option) ;;
        *)
            if [[ $word == -* ]]; then
                words=$(brenix "$command" --help 2>/dev/null | grep -oE '^  -[^ ]+' | tr ',' ' ')
            elif [[ $command == keys ]]; then
                files=1
            elif [[ $command == plugins || $command == check ]]; then
                words=$(_brenix_plugins '[a-z]+') files=1
            else
                words=$(_brenix_plugins device) files=1
            fi
            ;;
    esac
    mapfile -t COMPREPLY < <(compgen -W "$words" -- "$word")
    if [[ -n $files && ${#COMPREPLY[@]} -eq 0 ]]; then
        mapfile -t COMPREPLY < <(compgen -f -- "$word")
        compopt -o filenames
    fi
}
complete -F _brenix brenix
