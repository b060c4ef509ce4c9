# bash completion for fileindexctl. The program itself knows what may follow.

_fileindexctl() {
    local current=${COMP_WORDS[COMP_CWORD]} line files=
    COMPREPLY=()
    while IFS= read -r line; do
        case $line in
            :files) files=yes ;;
            *) COMPREPLY+=("$(printf '%q' "${line%%$'\t'*}")") ;;
        esac
    done < <(fileindexctl --complete "${COMP_WORDS[@]:1:COMP_CWORD}" 2>/dev/null)
    [ -n "$files" ] || return 0
    compopt -o filenames 2>/dev/null
    while IFS= read -r line; do
        COMPREPLY+=("$line")
    done < <(compgen -f -- "$current")
}

complete -F _fileindexctl fileindexctl
