#compdef fileindexctl
# zsh completion for fileindexctl. The program itself knows what may follow.

local line word files
local -a candidates
for line in "${(@f)$(fileindexctl --complete "${(@Q)words[2,CURRENT]}" 2>/dev/null)}"; do
    case $line in
        '') ;;
        :files) files=yes ;;
        *)
            word=${line%%$'\t'*}
            candidates+=("${word//:/\\:}:${line#*$'\t'}") ;;
    esac
done
(( $#candidates == 0 )) || _describe fileindexctl candidates
[[ -z $files ]] || _files
