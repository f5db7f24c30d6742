# Completion of the tavo command for bash: subcommands, verbs and options, as the command's own help lists them.
_tavo() {
    local current=${COMP_WORDS[COMP_CWORD]} words=() word
    for word in "${COMP_WORDS[@]:1:COMP_CWORD-1}"; do
        [[ $word == -- ]] && break
        # Only the words that lead to a help text: subcommands and verbs come before everything else.
        [[ $word == -* ]] && continue
        "${COMP_WORDS[0]}" "${words[@]}" --help 2>/dev/null | sed -n '/^Subcommands:/,$p' | grep -q "^  $word " || break
        words+=("$word")
    done
    local help
    help=$("${COMP_WORDS[0]}" "${words[@]}" --help 2>/dev/null) || return
    local choices
    choices=$(sed -n '/^Subcommands:/,$s/^  \([a-z]*\) .*/\1/p' <<<"$help")
    [[ $current == -* ]] && choices=$(grep -oE '^ .*--[a-z]+' <<<"$help" | grep -oE -- '--[a-z]+' | sort -u)
    mapfile -t COMPREPLY < <(compgen -W "$choices" -- "$current")
}
complete -o bashdefault -o default -F _tavo tavo
