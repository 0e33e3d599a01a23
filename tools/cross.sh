#!/bin/sh
# cross.sh ARCHITECTURE SOURCE.dsc [COMMAND...]: builds Debian's packages of a source package for
# another architecture, by Debian's cross compilers, and leaves them beside it. COMMAND is run then,
# with the packages in $MAVOEA_PACKAGES and the system that built them, not entered, in $MAVOEA_ROOT.
#
# That system is made for it and goes with it, as what it takes would mix two architectures in this one.
# Needs root and mounts. Installs mmdebstrap, and takes Debian's packages from where apt has them here.
set -eu
architecture=$1
source=$(cd "$(dirname "$2")" && pwd)/${2##*/}
shift 2
here=$(cd "$(dirname "$0")" && pwd)
if [ "${MAVOEA_OWN_MOUNTS:-}" != "$architecture" ]; then
    [ "$(id -u)" -eq 0 ] && unshare --mount true 2> /dev/null ||
        { echo "building for $architecture takes root and mounts" >&2; exit 77; }
    MAVOEA_OWN_MOUNTS=$architecture exec unshare --mount --propagation private \
        sh "$here/cross.sh" "$architecture" "$source" "$@"
fi
sh "$here/../tests/packages.sh" mmdebstrap

work=$(mktemp -d)
root=$work/root
trap 'umount -l "$root/proc" 2> /dev/null || true; rm -rf --one-file-system "$work"' EXIT
trap 'exit 1' HUP INT TERM

# The release alone: both architectures have the same versions there, which libraries that lie side by
# side must have. Updates do not reach all of them at once.
codename=$(. /etc/os-release && echo "$VERSION_CODENAME")
apt-get indextargets --format 'deb $(REPO_URI) $(RELEASE) $(COMPONENT)' "Created-By: Packages" \
    "Origin: Debian" "Codename: $codename" | grep ' main$' | sort -u > "$work/sources"
[ -s "$work/sources" ] || { echo "apt has no list of Debian's packages" >&2; exit 1; }
mmdebstrap --quiet --mode=root --variant=minbase --skip=check/empty,cleanup/apt \
    --architectures="$(dpkg --print-architecture),$architecture" \
    --include="crossbuild-essential-$architecture,debhelper" \
    --aptopt='APT::Sandbox::User "root"' --dpkgopt=force-unsafe-io "$codename" "$root" "$work/sources"
mount -t proc proc "$root/proc"
[ ! -e /etc/resolv.conf ] || cp /etc/resolv.conf "$root/etc"
[ ! -e /etc/hosts ] || cp /etc/hosts "$root/etc"

inside() {
    env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin HOME=/root LC_ALL=C.UTF-8 DEBIAN_FRONTEND=noninteractive \
        DEB_BUILD_OPTIONS="nocheck ${DEB_BUILD_OPTIONS:-}" DEB_BUILD_PROFILES="cross nocheck" \
        DPKG_GENSYMBOLS_CHECK_LEVEL="${DPKG_GENSYMBOLS_CHECK_LEVEL:-1}" chroot "$root" "$@"
}

mkdir "$root/build"
if [ -z "$(find "$root/var/lib/apt/lists" -name "*_binary-${architecture}_Packages*")" ]; then
    mkdir "$root/build/libraries"
    sh "$here/../tests/source_packages.sh" "$root/build/libraries" attr acl libplist
    cp "$here/cross_libraries.sh" "$root/build/libraries"
    inside sh /build/libraries/cross_libraries.sh "$architecture"
fi
dpkg-source --no-check -x "$source" "$root/build/source" > /dev/null
inside sh -c 'cd /build/source
    apt-get build-dep -q -y --no-install-recommends --host-architecture "$0" . &&
    dpkg-buildpackage -us -uc -b --host-arch "$0"' "$architecture"
cp "$root"/build/*_"$architecture".* "${source%/*}"

[ $# -gt 0 ] || exit 0
MAVOEA_PACKAGES=${source%/*} MAVOEA_ROOT=$root "$@"
