#!/bin/sh
# types.sh LIBRARY HEADERS DESCRIPTION: what the library exports, with the types of its functions, is
# what is described. DESCRIPTION is made anew, after a change that is meant, with `--write` in front.
set -eu
write=no
if [ "$1" = --write ]; then
    write=yes
    shift
fi
library=$1
headers=$2
description=$3
if [ $write = yes ]; then
    abidw --exported-interfaces-only --drop-private-types --drop-undefined-syms \
        --headers-dir "$headers" --type-id-style hash --no-corpus-path --no-comp-dir-path \
        --no-show-locs --no-elf-needed "$library" |
        sed "s|path='$(cd "$headers/.." && pwd)/|path='|" > "$description"
else
    abidiff --fail-no-debug-info --drop-private-types --headers-dir2 "$headers" "$description" \
        "$library"
fi
