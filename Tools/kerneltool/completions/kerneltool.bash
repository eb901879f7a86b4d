# Completion of kerneltool for bash.
_kerneltool()
{
    local cur="${COMP_WORDS[COMP_CWORD]}" prev="${COMP_WORDS[COMP_CWORD-1]}" words=""
    COMPREPLY=()
    case "$prev" in
        --progress) COMPREPLY=($(compgen -W "auto always never" -- "$cur")); return ;;
        --session) COMPREPLY=($(compgen -W "full incremental rewrite export" -- "$cur")); return ;;
        --level) COMPREPLY=($(compgen -W "store default min max" -- "$cur")); return ;;
        --predictor) COMPREPLY=($(compgen -W "none 8 16 32" -- "$cur")); return ;;
    esac
    if [ "$COMP_CWORD" -eq 1 ]; then
        words="archive stream text --help --version"
    elif [ "$COMP_CWORD" -eq 2 ]; then
        case "$prev" in
            archive) words="create put rm ls cat extract info history verify test scratch recover streamline thumbnail --help" ;;
            stream) words="dump check --help" ;;
            text) words="sort convert detect chars --help" ;;
        esac
    elif [[ "$cur" == -* ]]; then
        case "${COMP_WORDS[1]}/${COMP_WORDS[2]}" in
            archive/create) words="--help --uid --reference --json --progress" ;;
            archive/put) words="--help --tree --prefix --session --scratch --level --predictor --striped --user-data --verify --json --progress" ;;
            archive/rm) words="--help --session --scratch --level --predictor --striped --user-data --verify --json --progress" ;;
            archive/ls) words="--help --at --json --progress" ;;
            archive/cat) words="--help --at --progress" ;;
            archive/extract) words="--help --at --json --progress" ;;
            archive/info) words="--help --at --json --progress" ;;
            archive/history) words="--help --at --json --progress" ;;
            archive/verify) words="--help --at --json --progress" ;;
            archive/test) words="--help --json --progress" ;;
            archive/scratch) words="--help --json --progress" ;;
            archive/recover) words="--help --to --json --progress" ;;
            archive/streamline) words="--help --to --overwrite --no-verify --json --progress" ;;
            archive/thumbnail) words="--help --set --get --json --progress" ;;
            stream/dump) words="--help --zlib --json --progress" ;;
            stream/check) words="--help --zlib --json --progress" ;;
            text/sort) words="--help --locale --numeric --json" ;;
            text/convert) words="--help --from --to --json" ;;
            text/detect) words="--help --json" ;;
            text/chars) words="--help --json" ;;
        esac
    else
        compopt -o filenames 2>/dev/null
        COMPREPLY=($(compgen -f -- "$cur"))
        return
    fi
    COMPREPLY=($(compgen -W "$words" -- "$cur"))
}
complete -F _kerneltool kerneltool
