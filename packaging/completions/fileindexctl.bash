# bash completion for fileindexctl

_fileindexctl_shares() {
    fileindexctl share list 2>/dev/null | awk 'NR > 1 { print $1 }'
}

_fileindexctl_folders() {
    fileindexctl folder list --sort path 2>/dev/null | awk 'NR > 1 { print $1 }'
}

# The words that may follow, by the command typed so far; file names are added by the caller.
_fileindexctl_words() {
    local settings='--name --document --no-document --audio --no-audio --video --no-video --photo
        --no-photo'
    case $1 in
        '') echo 'folder search status why pause resume services share volume queue event --help
            --version' ;;
        folder) echo 'add set get list delete reindex --help' ;;
        'folder add') echo "$settings --json --help" ;;
        'folder set') echo "$settings --json --help"; _fileindexctl_folders ;;
        'folder get' | 'folder delete' | 'folder reindex')
            echo '--json --help'; _fileindexctl_folders ;;
        'folder list') echo '--offset --limit --sort --json --help' ;;
        search) echo '--share --limit --offset --sort --paths --null --json --help' ;;
        status) echo '--watch --until-finished --json --help' ;;
        services) echo 'prepare --help' ;;
        share) echo 'list pause resume clear rename migrate check-recycle --help' ;;
        'share list') echo '--json --help' ;;
        share\ *) echo '--json --help'; _fileindexctl_shares ;;
        volume) echo 'pause resume clear --help' ;;
        queue) echo 'show --help' ;;
        event) echo 'add --help' ;;
        'event add') echo '--kind --from --dir --json --help' ;;
        *) echo '--json --help' ;;
    esac
}

_fileindexctl() {
    local current=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]}
    local command= word i
    for ((i = 1; i < COMP_CWORD; i++)); do
        word=${COMP_WORDS[i]}
        case $word in -*) continue ;; esac
        case $command in
            '') command=$word ;;
            folder | services | share | volume | queue | event) command+=" $word" ;;
        esac
    done

    local words
    case $previous in
        --kind) words='create modify delete attr rename reindex' ;;
        --share) words=$(_fileindexctl_shares) ;;
        --sort)
            case $command in
                folder*) words='name path document audio video photo' ;;
                *) words='relevance name path size modified created title year' ;;
            esac ;;
        --limit | --offset | --name) return ;;
        --from) words= ;;
        *) words=$(_fileindexctl_words "$command") ;;
    esac
    mapfile -t COMPREPLY < <(compgen -W "$words" -- "$current")

    case $command in
        why | 'folder add' | 'folder set' | 'folder get' | 'folder delete' | 'folder reindex' | \
            volume\ * | 'queue show' | 'event add' | 'share clear' | 'share migrate')
            compopt -o filenames
            local file
            while IFS= read -r file; do
                COMPREPLY+=("$file")
            done < <(compgen -f -- "$current") ;;
    esac
}

complete -F _fileindexctl fileindexctl
