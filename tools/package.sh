#!/bin/sh
# package.sh [DIRECTORY]: builds Debian's packages of the library and the tool, source and binary, in
# DIRECTORY (build/packages), and has lintian look at them. Installs what the build takes. Nothing else
# in the source tree changes, and the same files make the same packages, wherever they lie.
set -eu
umask 022
# Only the default directory is emptied.
if [ $# -gt 0 ]; then
    mkdir -p "$1"
    directory=$(cd "$1" && pwd)
    [ -z "$(ls -A "$directory")" ] || { echo "$directory is not empty" >&2; exit 2; }
fi
cd "$(dirname "$0")/.."
if [ $# -eq 0 ]; then
    directory=$PWD/build/packages
    rm -rf "$directory"
    mkdir -p "$directory"
fi

sh tests/packages.sh debhelper dpkg-dev lintian
if ! dpkg-checkbuilddeps 2> /dev/null; then
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

cd "$directory"
(cd "$name-$version" && dpkg-buildpackage -us -uc)
rm -rf "${name:?}-$version"
lintian --fail-on error,warning "${name}_$revision"_*.changes

echo
echo "In $PWD:"
ls -- *.deb
echo
echo "The tool:            apt install $PWD/mavoea_${revision}_*.deb"
echo "The library, too:    apt install $PWD/*.deb"
