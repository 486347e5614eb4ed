# bash completion for lumacastctl: source it, or put it into ~/.local/share/bash-completion/completions/lumacastctl

_lumacastctl() {
    local word=${COMP_WORDS[COMP_CWORD]} before=${COMP_WORDS[COMP_CWORD-1]}
    local command='' part='' given i
    for ((i = 1; i < COMP_CWORD; ++i)); do
        given=${COMP_WORDS[i]}
        case $given in
            -*) ;;
            status | doctor | storage | save | usage | record | extensions | broadcast) [ -z "$command" ] && command=$given ;;
            list | purgeable | purge) [ "$command" = storage ] && [ -z "$part" ] && part=$given ;;
        esac
    done
    COMPREPLY=()
    case $command:$before in
        doctor:--exe)
            compopt -o filenames 2>/dev/null
            mapfile -t COMPREPLY < <(compgen -f -- "$word")
            return ;;
        record:--output)
            compopt -o filenames 2>/dev/null
            mapfile -t COMPREPLY < <(compgen -f -- "$word")
            return ;;
        record:--duration | broadcast:--duration | broadcast:--clip | broadcast:--set) return ;;
        broadcast:--extension)
            COMPREPLY=($(compgen -W "$(command lumacastctl extensions 2>/dev/null | awk 'NR > 1 { print $1 }')" -- "$word"))
            return ;;
        doctor:--pid)
            COMPREPLY=($(compgen -W "$(command ps -eo pid= 2>/dev/null)" -- "$word"))
            return ;;
    esac
    if [ "$command" = save ] && [[ $word != -* ]] && [ -n "$word" ]; then
        compopt -o filenames 2>/dev/null
        mapfile -t COMPREPLY < <(compgen -f -- "$word")
        return
    fi
    local words
    case $command:$part in
        :) words='status doctor storage save usage record extensions broadcast -h --help' ;;
        status:) words='--json --watch -h --help' ;;
        doctor:) words='--pid --exe -h --help' ;;
        save:) words='--json -h --help' ;;
        usage:) words='--json -h --help' ;;
        record:) words='--display --duration --output --microphone -h --help' ;;
        extensions:) words='--json -h --help' ;;
        broadcast:) words='--display --extension --set --clip --duration --microphone -h --help' ;;
        storage:) words='list purgeable purge --json -h --help' ;;
        storage:purge) words='1 2 3 --json -h --help' ;;
        storage:*) words='--json -h --help' ;;
    esac
    COMPREPLY=($(compgen -W "$words" -- "$word"))
}

complete -F _lumacastctl lumacastctl
