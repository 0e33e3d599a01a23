#!/bin/sh
# cross_libraries.sh ARCHITECTURE: for an architecture that Debian has no packages of, installs what the
# build takes. cross.sh runs it in the system that it has made for that; the source packages attr, acl
# and libplist lie beside this script, unpacked.
#
# attr and acl are built as Debian has them. libplist's packages would take Python for the architecture:
# the library and its headers are packed by hand. So are the C library and gcc's, which come with the
# cross compilers under other names.
set -eu
architecture=$1
cd "$(dirname "$0")"
here=$PWD
type=$(dpkg-architecture -a "$architecture" -q DEB_HOST_GNU_TYPE)
libraries=usr/lib/$(dpkg-architecture -a "$architecture" -q DEB_HOST_MULTIARCH)
# libacl looks at files, and refuses those with dates after 2038 unless its times are wide.
wide="-D_FILE_OFFSET_BITS=64 -D_TIME_BITS=64"

# pack PACKAGE VERSION [FIELD]...: what is in packed/PACKAGE.
pack() {
    package=$1
    version=$2
    shift 2
    mkdir -p "packed/$package/DEBIAN"
    printf '%s\n' "Package: $package" "Version: $version" "Architecture: $architecture" \
        "Multi-Arch: same" "Maintainer: nobody <nobody@mavoea.invalid>" "Description: $package" "$@" \
        > "packed/$package/DEBIAN/control"
    dpkg-deb --root-owner-group --build "packed/$package" "$package.deb"
}

# Of the same version as this machine's, beside which they lie.
for package in libc6 libgcc-s1 libstdc++6; do
    mkdir -p "packed/$package/DEBIAN" "packed/$package/$libraries"
    dpkg-query -L "$package-$architecture-cross" | grep '/lib/[^/]*\.so\.[^/]*$' |
        while read -r file; do
            cp -P "$file" "packed/$package/$libraries"
        done
    sed "s/:$architecture//" "/var/lib/dpkg/info/$package-$architecture-cross.shlibs" \
        > "packed/$package/DEBIAN/shlibs"
    native=$package:$(dpkg --print-architecture)
    pack "$package" "$(dpkg-query -W -f '${Version}' "$native")"
done
pack libc6-dev "$(dpkg-query -W -f '${Version}' "libc6:$(dpkg --print-architecture)")"
dpkg -i ./libc6.deb ./libgcc-s1.deb ./libstdc++6.deb ./libc6-dev.deb

for package in attr acl; do
    (
        cd "$package"-*/
        apt-get build-dep -q -y --no-install-recommends --host-architecture "$architecture" .
        DEB_BUILD_OPTIONS="nocheck noautodbgsym" DEB_CPPFLAGS_APPEND=$wide \
            dpkg-buildpackage -us -uc -B --host-arch "$architecture"
    )
    dpkg -i "./lib${package}1_"*.deb "./lib${package}1-dev_"*.deb
done

apt-get install -q -y --no-install-recommends autoconf autoconf-archive automake libtool pkgconf
(
    cd libplist-*/
    [ -e configure ] || autoreconf --force --install
    ./configure --quiet --host="$type" CC="$type-gcc" CXX="$type-g++" --prefix=/usr \
        --libdir="/$libraries" --disable-static --without-cython CPPFLAGS="$wide"
    make -s -j 2
    make -s install DESTDIR="$here/plist"
)
mkdir -p packed/libplist3/DEBIAN "packed/libplist3/$libraries" "packed/libplist-dev/$libraries"
cp -P "plist/$libraries"/libplist-2.0.so.* "packed/libplist3/$libraries"
cp -P "plist/$libraries/libplist-2.0.so" "packed/libplist-dev/$libraries"
cp -r plist/usr/include packed/libplist-dev/usr
version=$(cd libplist-*/ && dpkg-parsechangelog -S Version)
echo "libplist-2.0 3 libplist3 (>= ${version%-*})" > packed/libplist3/DEBIAN/shlibs
pack libplist3 "$version"
pack libplist-dev "$version"
dpkg -i ./libplist3.deb ./libplist-dev.deb
