# bash-completion of mavoea, which says itself what may stand where.

# Sets `bare` to what a word means, without its quotes. Nothing in it is run or looked up.
_mavoea_bare() {
    local word=$1 quote= letter i
    bare=
    if [[ $word == '~/'* ]]; then
        bare=$HOME
        word=${word:1}
    fi
    for ((i = 0; i < ${#word}; ++i)); do
        letter=${word:i:1}
        case $quote$letter in
            \\ | \"\\)
                ((++i))
                letter=${word:i:1}
                [[ -z $quote || $letter == [\"\\\$\`] ]] || bare+=\\
                bare+=$letter
                ;;
            \' | \") quote=$letter ;;
            \'\' | \"\") quote= ;;
            *) bare+=$letter ;;
        esac
    done
}

_mavoea() {
    local cur words cword bare program word begun
    local -a asked=() lines=()
    _get_comp_words_by_ref -n =: cur words cword || return
    _mavoea_bare "${words[0]}"
    program=$bare
    for word in "${words[@]:1:cword-1}"; do
        _mavoea_bare "$word"
        asked+=("$bare")
    done
    _mavoea_bare "$cur"
    mapfile -t lines < <("$program" --complete "${asked[@]}" "$bare" 2> /dev/null)

    # What readline takes for a word of its own begins behind these.
    begun=
    [[ $cur == [\"\']* ]] || begun=${cur%"${cur##*[=:]}"}
    COMPREPLY=()
    for word in "${lines[@]:1}"; do
        word=${word%%$'\t'*}
        if [[ $cur != [\"\']* ]]; then
            printf -v word %q "$word"
            word=${word#"$begun"}
        fi
        COMPREPLY+=("$word")
    done
    [[ $cur == --*=* ]] && cur=${cur#*=}
    case ${lines[0]} in
        files) _filedir ;;
        directories) _filedir -d ;;
    esac
} && complete -F _mavoea mavoea
