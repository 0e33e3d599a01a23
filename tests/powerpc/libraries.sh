#!/bin/sh
# libraries.sh [PREFIX]: puts what the powerpc build links and includes, besides the cross compiler's
# own libraries, under PREFIX (build/powerpc-libraries). libattr, libacl and libplist are built from
# Debian's source packages, as Debian has no powerpc ones; CLI11 and nlohmann-json are headers of this
# machine's packages, without the rest of its /usr/include. With everything in place nothing is done.
#
# Needs dpkg-dev, make, autoconf, automake, libtool, pkg-config, gcc-powerpc-linux-gnu,
# g++-powerpc-linux-gnu, libcli11-dev and nlohmann-json3-dev. The system's own package lists and
# sources are left as they are.
set -eu
here=$(cd "$(dirname "$0")" && pwd)
prefix=${1:-$here/../../build/powerpc-libraries}
mkdir -p "$prefix"
prefix=$(cd "$prefix" && pwd)
host=powerpc-linux-gnu

stamp=$(cat "$here/libraries.sh" "$here/../source_packages.sh" | cksum)
[ "$(cat "$prefix/complete" 2>/dev/null || true)" != "$stamp" ] || exit 0
mkdir -p "$prefix/include" "$prefix/share/cmake"

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
mkdir "$work/source"
sh "$here/../source_packages.sh" "$work/source" attr acl libplist

# ---- Building -------------------------------------------------------------------------------------

# They are put in place by a copy, as configure takes no path with a blank. Each looks for the other
# where it lies itself, wherever that is.
stage=$work/stage
export LD_RUN_PATH='$ORIGIN'
build() {
    package=$1
    shift
    cd "$work"/source/"$package"-*/
    # Debian's patches are younger than the files generated from what they change; those need not be
    # generated again, which would take the autotools.
    if [ -f configure ]; then
        touch aclocal.m4
        find . -name Makefile.in -exec touch {} +
        touch configure include/config.h.in
    else
        autoreconf --force --install > autoreconf.log 2>&1 || { cat autoreconf.log; exit 1; }
    fi
    # Compilers are named, as libplist takes clang where nobody does. libacl looks at files, and
    # refuses those with dates after 2038 unless its times are like those of what calls it.
    ./configure --quiet --host=$host CC=$host-gcc CXX=$host-g++ --prefix=/usr --libdir=/usr/lib \
        --sysconfdir=/etc --disable-static --disable-nls \
        CPPFLAGS="-I$stage/usr/include -D_FILE_OFFSET_BITS=64 -D_TIME_BITS=64" \
        LDFLAGS="-L$stage/usr/lib" "$@"
    make -s -j 2 > make.log 2>&1 && make -s install DESTDIR="$stage" >> make.log 2>&1 ||
        { cat make.log; exit 1; }
    rm -f "$stage"/usr/lib/*.la
}
(build attr)
(build acl)
(build libplist --without-cython)
rm -f "$stage"/usr/lib/libplist++*
rm -rf "$prefix/lib"
mkdir "$prefix/lib"
cp -P "$stage"/usr/lib/lib*.so* "$prefix/lib"
cp -R "$stage"/usr/include/* "$prefix/include"

# ---- Headers --------------------------------------------------------------------------------------

for name in CLI nlohmann; do
    ln -sfn /usr/include/$name "$prefix/include/$name"
done
cp -R /usr/share/cmake/CLI11 /usr/share/cmake/nlohmann_json "$prefix/share/cmake"

echo "$stamp" > "$prefix/complete"
