# bash completion for imgfile: commands, options, values of options, and file names.
_imgfile()
{
    local word=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]} command='' i
    local commands='info check convert preview stats compare create'
    # bash splits --option=value into three words; the value may be missing.
    if [[ $word == = ]]; then
        word=''
    elif [[ $previous == = ]]; then
        previous=${COMP_WORDS[COMP_CWORD - 2]}
    fi
    for ((i = 1; i < COMP_CWORD; ++i)); do
        case " $commands " in
        *" ${COMP_WORDS[i]} "*)
            command=${COMP_WORDS[i]}
            break
            ;;
        esac
    done

    local options='--help --quiet' choices=''
    case $command in
    '') options='--help --quiet --version' choices=$commands ;;
    info) options+=' --json' ;;
    convert) options+=' --band --format --overwrite --stretch --tile --window' ;;
    preview) options+=' --band --overwrite --raw --size' ;;
    stats) options+=' --histogram --json --overwrite' ;;
    create) options+=' --bands --bytes --lines --overwrite --pattern --samples --tile --type' ;;
    esac
    case $previous in
    --format) options='' choices='vitec helava pgm ppm png tiff' ;;
    --type) options='' choices='vitec helava' ;;
    --tile) options='' choices='none 64 128 256 512' ;;
    --bytes) options='' choices='1 2' ;;
    --band | --bands | --lines | --samples | --size | --window)
        COMPREPLY=()
        return
        ;;
    esac

    [[ $word == -* ]] && choices=$options
    if [[ -n $choices ]]; then
        mapfile -t COMPREPLY < <(compgen -W "$choices" -- "$word")
    else
        mapfile -t COMPREPLY < <(compgen -f -- "$word")
        compopt -o filenames 2>/dev/null
    fi
}
complete -F _imgfile imgfile
