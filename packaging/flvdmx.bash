# bash completion for flvdmx

_flvdmx() {
    local cur prev words cword
    local split
    _init_completion -s || return

    local -A options=(
        [info]="--help --json --scan"
        [frames]="--help --count --csv --follow --from --json --keyframes --separate-audio --stream --timeout --to"
        [seek]="--help --count --end-on-miss --json --mode --play --relative --retry-backward --separate-audio"
        [extract]="--help --force --output --stream"
        [check]="--help --jobs --json --jump --max-gap"
        [plot]="--help --force --output"
        [repair]="--help --dry-run --force --keep-times --output"
        [index]="--help --dry-run --force --output"
        [cut]="--help --dry-run --force --from --keep-times --output --to"
        [help]="--help"
    )
    local command="" word
    for word in "${words[@]:1:cword-1}"; do # --verbose may come first
        [[ $word == -* ]] || { command=$word; break; }
    done
    case $prev in
    --stream) COMPREPLY=($(compgen -W "video audio" -- "$cur")) ;;
    --mode) COMPREPLY=($(compgen -W "auto backward forward" -- "$cur")) ;;
    --count | --from | --jobs | --jump | --max-gap | --play | --timeout | --to) ;; # numbers and times
    -o | --output) _filedir ;;
    *)
        if [[ -z $command ]]; then
            COMPREPLY=($(compgen -W "${!options[*]} --help --verbose --version" -- "$cur"))
        elif [[ $cur == -* ]]; then
            COMPREPLY=($(compgen -W "${options[$command]-}" -- "$cur"))
        elif [[ $command == help ]]; then
            COMPREPLY=($(compgen -W "${!options[*]}" -- "$cur"))
        else
            _filedir flv
        fi
        ;;
    esac
} && complete -F _flvdmx flvdmx
