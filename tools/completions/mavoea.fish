# fish's completion of mavoea, which says itself what may stand where.

function __mavoea_complete
    set -l words (commandline -opc)
    set -l program $words[1]
    set -e words[1]
    set -l current (commandline -ct)
    set -l bare (string unescape -- $current; or string replace -r '^[\'"]' '' -- $current)
    set -l asked (string replace -r '^~/' "$HOME/" -- $words $bare)
    set -l answer ($program --complete $asked 2>/dev/null)
    set -l rest $answer[1]
    set -e answer[1]
    string join \n -- $answer
    set -l path (string replace -r '^--[^=]*=' '' -- $bare)
    switch "$rest"
        case files
            __fish_complete_path $path
        case directories
            __fish_complete_directories $path ''
    end
end

complete -c mavoea -f -a '(__mavoea_complete)'
