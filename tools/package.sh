#!/bin/sh
# package.sh [--host ARCHITECTURE] [DIRECTORY [COMMAND...]]: builds Debian's packages of the library and
# the tool, source and binary, in DIRECTORY (build/packages), and has lintian look at them. Installs what
# the build takes. Nothing else in the source tree changes, and the same files make the same packages,
# wherever they lie. With --host they are for another architecture, such as i386, and are built in a
# system of their own (tools/cross.sh, which says what COMMAND is for), without their tests; DIRECTORY is
# build/packages-ARCHITECTURE then.
set -eu
umask 022
host=
given=
if [ "${1:-}" = --host ]; then
    host=$2
    shift 2
fi
# Only the default directory is emptied.
if [ $# -gt 0 ]; then
    mkdir -p "$1"
    directory=$(cd "$1" && pwd)
    [ -z "$(ls -A "$directory")" ] || { echo "$directory is not empty" >&2; exit 2; }
    shift
    [ $# -eq 0 ] || [ -n "$host" ] || { echo "COMMAND is for --host" >&2; exit 2; }
    given=yes
fi
cd "$(dirname "$0")/.."
if [ -z "$given" ]; then
    directory=$PWD/build/packages${host:+-$host}
    rm -rf "$directory"
    mkdir -p "$directory"
fi

sh tests/packages.sh debhelper dpkg-dev lintian
if [ -z "$host" ] && ! dpkg-checkbuilddeps 2> /dev/null; then
    apt-get update -q
    DEBIAN_FRONTEND=noninteractive apt-get build-dep -q -y --no-install-recommends "$PWD"
fi

name=$(dpkg-parsechangelog -S Source)
revision=$(dpkg-parsechangelog -S Version)
version=${revision%-*}
grep -q "^project($name VERSION $version " CMakeLists.txt ||
    { echo "debian/changelog and CMakeLists.txt have different versions" >&2; exit 1; }
SOURCE_DATE_EPOCH=$(dpkg-parsechangelog -S Timestamp)
export SOURCE_DATE_EPOCH

# The files of the project as they are: what git does not ignore; without it, what no build has made.
files() {
    if git ls-files --error-unmatch CMakeLists.txt > /dev/null 2>&1; then
        git ls-files -z --cached --others --exclude-standard
    else
        find . \( -path ./build -o -path './build-*' -o -path ./.git -o -name .cache \
            -o -name __pycache__ \) -prune -o -type f ! -name compile_commands.json -printf '%P\0'
    fi
}
tarball=$directory/${name}_$version.orig.tar.xz
files | grep -zv '^debian/' | LC_ALL=C sort -z | tar -c --null --no-recursion -T - \
    --transform "s,^,$name-$version/," --mtime="@$SOURCE_DATE_EPOCH" --owner=0 --group=0 \
    --numeric-owner --mode=u=rwX,go=rX --format=gnu | xz -T1 > "$tarball"
tar -C "$directory" -xf "$tarball"
cp -r debian "$directory/$name-$version"

cross=$PWD/tools/cross.sh
cd "$directory"
if [ -z "$host" ]; then
    (cd "$name-$version" && dpkg-buildpackage -us -uc)
else
    dpkg-source -b "$name-$version"
    sh "$cross" "$host" "${name}_$revision.dsc" "$@"
fi
rm -rf "${name:?}-$version"
lintian --fail-on error,warning "${name}_$revision"_*.changes

echo
echo "In $PWD:"
ls -- *.deb
echo
echo "The tool:            apt install $PWD/mavoea_${revision}_*.deb"
echo "The library, too:    apt install $PWD/*.deb"
