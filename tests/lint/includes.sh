#!/bin/sh
# Includes point one way: ops -> adouble, stream, xattr -> path -> format -> util -> platform.
# A folder includes itself, what stands below it and the public header; nothing beside it. The same
# holds for the rooms of the tool: cli -> care, exchange, show, move -> transfer -> walk -> store ->
# place -> say, below which is the library.
set -eu
cd "$(dirname "$0")/../.."
status=0
check() { # FOLDER ALLOWED...
    folder=$1
    shift
    for file in $(find "$folder" -name '*.cpp' -o -name '*.h'); do
        for include in $(sed -n 's/^#include "\(.*\)"$/\1/p' "$file"); do
            allowed=no
            for to in "$folder" include "$@"; do
                case $include in "$to"/*) allowed=yes ;; esac
            done
            [ $allowed = yes ] || { echo "$file may not include $include" >&2; status=1; }
        done
    done
}
check platform
check util platform
check format util platform
check path format util platform
for folder in adouble stream xattr; do
    [ -d $folder ] && check $folder path format util platform
done
[ -d ops ] && check ops adouble stream xattr path format util platform
below="adouble stream format util platform"
# shellcheck disable=SC2086: lists of words
for room in say place store walk transfer; do
    check tools/$room $below
    below="$below tools/$room"
done
# shellcheck disable=SC2086: lists of words
for room in care exchange show move; do check tools/$room $below; done
# shellcheck disable=SC2086: lists of words
check tools/cli $below tools/care tools/exchange tools/show tools/move
[ -z "$(find tools -maxdepth 1 -name '*.cpp' -o -maxdepth 1 -name '*.h')" ] ||
    { echo "tools/ has rooms for its files" >&2; status=1; }
exit $status
