# fish completion for fileindexctl. The program itself knows what may follow.

function __fileindexctl_candidates
    set -l words (commandline -opc)
    set -e words[1]
    fileindexctl --complete $words (commandline -ct) 2>/dev/null
end

complete -c fileindexctl -f -a '(__fileindexctl_candidates | string match -v -- :files)'
complete -c fileindexctl -F -n '__fileindexctl_candidates | string match -q -- :files'
