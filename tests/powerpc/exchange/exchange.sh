#!/bin/sh
# exchange.sh NATIVE COMMAND...: two builds of the program `exchange`, started as NATIVE and as
# COMMAND..., write the same files, read the same in each other's, and make the same of each other's
# when they change them. Status 77: it cannot be shown here.
set -eu
native=$1
shift
[ -x "$native" ] || { echo "$native is not there; build the preset release first" >&2; exit 1; }

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
{
    echo '#!/bin/sh'
    printf 'exec'
    for word in "$@"; do printf " '%s'" "$(printf %s "$word" | sed "s/'/'\\\\''/g")"; done
    echo ' "$@"'
} > "$work/cross"
chmod +x "$work/cross"
ln -s "$native" "$work/native"

differ() {
    echo "$1:"
    cat "$work/differences"
    exit 1
}

# same WHAT A B: two trees have the same files with the same bytes, modes and attributes, and both
# builds read the same in them.
same() {
    diff -r "$work/$2" "$work/$3" > "$work/differences" || differ "$1, files"
    for command in list read; do
        "$work/native" $command "$work/$2" > "$work/expected"
        [ -s "$work/expected" ] || { echo "$1: $command finds nothing"; exit 1; }
        for build in native cross; do
            for tree in "$2" "$3"; do
                "$work/$build" $command "$work/$tree" > "$work/found"
                diff "$work/expected" "$work/found" > "$work/differences" ||
                    differ "$1, the $build build's '$command' of what $tree wrote"
            done
        done
    done
}

# Two trees of each build, one to be changed by itself and one by the other.
for build in native cross; do
    for copy in 1 2; do
        mkdir "$work/$build$copy"
        "$work/$build" write "$work/$build$copy" || exit $?
    done
done
same "written by each build" native1 cross1

for build in native cross; do
    "$work/native" change "$work/${build}1"
    "$work/cross" change "$work/${build}2"
    same "written by the $build build, changed by each" ${build}1 ${build}2
done
same "written by each build, changed by the native one" native1 cross1
