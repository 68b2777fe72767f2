# client/privanectl.bash: completion in bash; what may stand next is asked of privanectl itself.
_privanectl() {
    local typed=${COMP_LINE:0:COMP_POINT} words current before

    # bash has split the line at "=", "@" and ":" too: here a word is what blanks part.
    read -ra words <<<"$typed"
    [[ $typed != *[[:blank:]] ]] || words+=("")
    current=${words[-1]}
    mapfile -t COMPREPLY < <("${words[0]}" complete -- "${words[@]:1}" 2>/dev/null)

    if [[ ${COMPREPLY[*]} == *:files ]]; then
        before=${COMPREPLY[0]%:files}
        compopt -o filenames 2>/dev/null
        current=${current#"$before"}
        mapfile -t COMPREPLY < <(compgen -f -- "${current:-/}")
        return
    fi
    [[ ${COMPREPLY[*]} != *= ]] || compopt -o nospace 2>/dev/null

    # Where bash has split the word, it replaces only what stands behind the split.
    before=${current%"${current##*["${COMP_WORDBREAKS//[!=@:]/}"]}"}
    COMPREPLY=("${COMPREPLY[@]#"$before"}")
}
complete -F _privanectl privanectl
