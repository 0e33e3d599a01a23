#!/bin/sh
# needs.sh FILE SONAME LIST: the library (a program's soname is empty) has this soname and needs, at
# run time, nothing but what LIST has (one soname a line).
set -eu
dynamic=$(LC_ALL=C readelf -d "$1")
soname=$(echo "$dynamic" | sed -n 's/.*(SONAME).*\[\(.*\)\]/\1/p')
[ "$soname" = "$2" ] || { echo "soname is $soname, not $2" >&2; exit 1; }
needed=$(echo "$dynamic" | sed -n 's/.*(NEEDED).*\[\(.*\)\]/\1/p')
for name in $needed; do
    grep -qxF "$name" "$3" || { echo "$1 needs $name, which $3 does not have" >&2; exit 1; }
done
