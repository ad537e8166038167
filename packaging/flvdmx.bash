# bash completion for flvdmx

_flvdmx() {
    local cur prev words cword
    local split
    _init_completion -s || return

    local -A options=(
        [info]="--help --json"
        [frames]="--help --count --follow --from --json --separate-audio --stream --timeout --to"
        [seek]="--help --count --end-on-miss --json --mode --play --relative --retry-backward --separate-audio"
        [extract]="--help --output --stream"
        [check]="--help --jobs --json --jump"
        [plot]="--help --output"
    )
    local command=""
    [[ $cword -lt 2 ]] || command=${words[1]}
    case $prev in
    --stream) COMPREPLY=($(compgen -W "video audio" -- "$cur")) ;;
    --mode) COMPREPLY=($(compgen -W "auto backward forward" -- "$cur")) ;;
    --count | --from | --jobs | --jump | --play | --timeout | --to) ;; # numbers and times
    -o | --output) _filedir ;;
    *)
        if [[ -z $command ]]; then
            COMPREPLY=($(compgen -W "${!options[*]} --help --version" -- "$cur"))
        elif [[ $cur == -* ]]; then
            COMPREPLY=($(compgen -W "${options[$command]-}" -- "$cur"))
        else
            _filedir flv
        fi
        ;;
    esac
} && complete -F _flvdmx flvdmx
