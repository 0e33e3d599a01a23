#!/bin/sh
# install_test.sh CMAKE BUILD SOURCE VERSION PREFIX LIBDIR CC: what is installed from the build tree BUILD
# into PREFIX and LIBDIR (absolute paths) is all that a program takes that is compiled with pkg-config
# or in a CMake project, with the shared library and the static one; in the place that it was installed
# for, below a system root, and in one that it was copied to. No file in it knows where it was built.
set -eu
cmake=$1
build=$2
source=$3
version=$4
prefix=$5
libdir=$6
cc=$7

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
expected="/volume/@eaDir/file@MavoEAStream @eaDir 3328 $version"
status=0

fail() {
    echo "$*" >&2
    status=1
}

# quietly COMMAND...: shows what it has written when it fails.
quietly() {
    "$@" > "$work/log" 2>&1 || { cat "$work/log" >&2; fail "failed: $*"; return 1; }
}

# prints_expected PROGRAM
prints_expected() {
    printed=$("$1") || fail "$1 does not run"
    [ "$printed" = "$expected" ] || fail "$1 has printed '$printed'"
}

# needs PROGRAM LIBRARY: whether it loads that shared library.
needs() {
    LC_ALL=C readelf -d "$1" | grep -qF "Shared library: [$2.so."
}

# compiles LIBRARIES: with pkg-config as the environment sets it up, which finds libraries in LIBRARIES.
# The flags are words.
compiles() {
    # shellcheck disable=SC2046
    quietly "$cc" -o "$work/shared" "$source/tests/abi/installed/program.c" \
        $(pkg-config --cflags --libs mavoea) -Wl,-rpath-link,"$1" || return 0
    needs "$work/shared" libmavoea || fail "pkg-config --libs gives another library than the shared one"
    LD_LIBRARY_PATH=$1 prints_expected "$work/shared"
    # shellcheck disable=SC2046
    quietly "$cc" -static -o "$work/static" "$source/tests/abi/installed/program.c" \
        $(pkg-config --static --cflags --libs mavoea) || return 0
    prints_expected "$work/static"
    [ "$(pkg-config --modversion mavoea)" = "$version" ] || fail "mavoea.pc has another version"
}

root=$work/root
DESTDIR=$root quietly "$cmake" --install "$build" || exit 1
found=$(grep -rlF -e "$source" -e "$build" "$root" || true)
[ -z "$found" ] || fail "the place of the build is in" "$found"

(
    export PKG_CONFIG_SYSROOT_DIR="$root" PKG_CONFIG_LIBDIR="$root$libdir/pkgconfig"
    compiles "$root$libdir"
    exit $status
) || status=1

copy=$work/copy
mv "$root$prefix" "$copy"
libraries=$copy/${libdir#"$prefix"/}
(
    export PKG_CONFIG_PATH="$libraries/pkgconfig"
    compiles "$libraries"
    exit $status
) || status=1

major=${version%%.*}
quietly "$cmake" -S "$source/tests/abi/installed" -B "$work/project" -DCMAKE_PREFIX_PATH="$copy" \
    -DCMAKE_C_COMPILER="$cc" -DWANTED="$major" \
    -DOTHERS="$((major - 1));${version%.*}.99;$((major + 1))" &&
    quietly "$cmake" --build "$work/project" && {
    prints_expected "$work/project/shared"
    prints_expected "$work/project/static"
    needs "$work/project/shared" libmavoea || fail "mavoea::mavoea is not the shared library"
    ! needs "$work/project/static" libmavoea || fail "mavoea::mavoea_static is the shared library"
}
exit $status
