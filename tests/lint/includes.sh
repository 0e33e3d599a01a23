#!/bin/sh
# Includes point one way: ops -> adouble, stream, xattr -> path -> format -> util -> platform.
# A folder includes itself, what stands below it and the public header; nothing beside it.
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
exit $status
