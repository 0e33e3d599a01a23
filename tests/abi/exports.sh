#!/bin/sh
# exports.sh LIBRARY LIST: the library exports exactly the names in LIST (sorted, one a line).
set -eu
names=$(nm -D --defined-only "$1" | awk '$2 != "A" { sub(/@.*/, "", $3); print $3 }' | LC_ALL=C sort)
if [ "$names" != "$(cat "$2")" ]; then
    echo "$1 does not export what $2 lists:" >&2
    echo "$names" | diff "$2" - >&2 || true
    exit 1
fi
