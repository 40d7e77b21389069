# Completion of orloctl in bash, for the bash-completion package.
_orloctl() {
    local cur prev words cword word
    _get_comp_words_by_ref -n := cur prev words cword
    COMPREPLY=()
    while IFS=$'\t' read -r word _; do
        case $word in
            :files) _filedir ;;
            :directories) _filedir -d ;;
            *)
                printf -v word %q "$word"
                COMPREPLY+=("$word")
                ;;
        esac
    done < <("$1" --complete "${words[@]:1:cword}" 2>/dev/null)
    # What a further word is typed onto gets no blank.
    [[ ${#COMPREPLY[@]} -eq 1 && ${COMPREPLY[0]} == *[/=] ]] && compopt -o nospace
    __ltrim_colon_completions "$cur"
}
complete -F _orloctl orloctl
