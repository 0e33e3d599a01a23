#!/bin/sh
# run_paths.sh CMAKE BUILD BINDIR LIBDIR MOVES [EMULATOR...]: no program and no library of the build
# tree, and of what is installed from it into BINDIR and LIBDIR (absolute paths), has a run path with
# an element that is empty or relative, which means the working directory, or lies in the build tree.
# MOVES is yes where run paths are built in: programs then run from a copy of bin and lib, too.
set -eu
cmake=$1
build=$2
bindir=$3
libdir=$4
moves=$5
shift 5

newline='
'
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
status=0

fail() {
    echo "$*" >&2
    status=1
}

# check FILE: one ELF file.
check() {
    paths=$(LC_ALL=C readelf -dW "$1" | sed -nE 's/.*\((RPATH|RUNPATH)\).*\[(.*)\]$/\2:/p')
    while [ -n "$paths" ]; do
        element=${paths%%:*}
        paths=${paths#*:}
        paths=${paths#"$newline"}
        case $element in
            \$ORIGIN | \$ORIGIN/*) ;;
            "$build"/* | [!/]* | '')
                fail "$1 looks for libraries in '$element'"
                return
                ;;
        esac
    done
}

# check_all DIRECTORY...: every ELF file below.
check_all() {
    find "$@" -type f > "$work/files"
    count=0
    while read -r file; do
        if [ "$(head -c 4 "$file" | tr '\177' '.')" = .ELF ]; then
            check "$file"
            count=$((count + 1))
        fi
    done < "$work/files"
    [ $count -gt 0 ] || fail "no program and no library in $*"
}

# runs PROGRAM ARGUMENT EMULATOR...: it finds its libraries, and does not look for them in the working
# directory. An empty argument is none.
runs() {
    program=$1
    argument=$2
    shift 2
    # shellcheck disable=SC2086: none where it is empty
    (cd "$work/elsewhere" && env -u LD_LIBRARY_PATH "$@" "$program" $argument > /dev/null) ||
        fail "$program does not run"
}

check_all "$build/bin" "$build/lib"
DESTDIR="$work/installed" "$cmake" --install "$build" > "$work/log" 2>&1 ||
    { cat "$work/log" >&2; exit 1; }
check_all "$work/installed"

if [ "$moves" = yes ]; then
    mkdir "$work/elsewhere" "$work/copy" "$work/copy/bin" "$work/copy/lib"
    for library in "$build"/lib/lib*.so.[0-9]; do
        : > "$work/elsewhere/$(basename "$library")"
    done
    cp -P "$build"/lib/lib*.so.* "$work/copy/lib"
    cp "$build/bin/mavoea" "$build/bin/c_client_test" "$work/copy/bin"
    runs "$work/copy/bin/mavoea" --version "$@"
    runs "$work/copy/bin/c_client_test" "" "$@"
    if [ $# -eq 0 ]; then # libraries of an emulated machine are not all installed
        runs "$work/installed$bindir/mavoea" --version
        [ -e "$work/installed$libdir/libmavoea.so.5" ] || fail "no libmavoea.so.5 in $libdir"
    fi
fi
exit $status
