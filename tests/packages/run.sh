#!/bin/sh
# run.sh [DIRECTORY]: Debian's packages, as `sh tools/package.sh` makes them or has made them in
# DIRECTORY: lintian finds nothing; a second build elsewhere gives the same bytes; in a bare system of
# their own they install with what they say they need, pass debian/tests, give way to the platform's
# libraries, and leave nothing behind when they go; and what README has its readers type works there, as
# it stands.
#
# Ends with 77 where there is no root, or nothing can be mounted. Installs mmdebstrap, and takes
# Debian's packages from where apt has them on this machine.
set -eu
[ $# -eq 0 ] || set -- "$(cd "$1" && pwd)"
cd "$(dirname "$0")/../.."
source=$PWD

# Mounts are this run's own, and go with it.
if [ "${MAVOEA_OWN_MOUNTS:-}" != yes ]; then
    [ "$(id -u)" -eq 0 ] && unshare --mount true 2> /dev/null ||
        { echo "packages cannot be installed elsewhere without root and mounts"; exit 77; }
    MAVOEA_OWN_MOUNTS=yes exec unshare --mount --propagation private sh tests/packages/run.sh "$@"
fi
sh tests/packages.sh mmdebstrap

begun=$(date +%s)
say() {
    echo "== $* ($(($(date +%s) - begun)) s)"
}
work=$(mktemp -d)
root=$work/root
trap 'umount -l "$root/proc" 2> /dev/null || true; rm -rf --one-file-system "$work"' EXIT
trap 'exit 1' HUP INT TERM

fail() {
    echo "$*" >&2
    exit 1
}

# quietly COMMAND...: shows what it has written when it fails.
quietly() {
    "$@" > "$work/log" 2>&1 || { cat "$work/log" >&2; fail "failed: $*"; }
}

if [ $# -gt 0 ]; then
    packages=$1
else
    packages=$work/packages
    say "packages"
    quietly sh tools/package.sh "$packages"
fi
say "lintian"
lintian --fail-on error,warning "$packages"/*.changes

say "the same again, elsewhere, in another time zone and language, without tests"
mkdir -p "$work/another/longer path"
dpkg-source --no-check -x "$packages"/mavoea_*.dsc "$work/another/longer path/source" > /dev/null
(
    cd "$work/another/longer path/source"
    umask 077
    export TZ=Pacific/Kiritimati LC_ALL=C.UTF-8 DEB_BUILD_OPTIONS=nocheck
    quietly dpkg-buildpackage -us -uc -b
)
for package in "$packages"/*.deb; do
    cmp "$package" "$work/another/longer path/${package##*/}"
done

say "a bare system"
codename=$(. /etc/os-release && echo "$VERSION_CODENAME")
apt-get indextargets --format 'deb $(REPO_URI) $(RELEASE) $(COMPONENT)' \
    "Created-By: Packages" "Origin: Debian" | sort -u > "$work/sources"
grep -q . "$work/sources" || fail "apt has no lists of Debian's packages"
quietly mmdebstrap --mode=root --variant=minbase --skip=check/empty,cleanup/apt \
    --aptopt='APT::Sandbox::User "root"' --aptopt='APT::Get::Assume-Yes "true"' --dpkgopt=force-unsafe-io "$codename" "$root" "$work/sources"
cp /etc/resolv.conf /etc/hosts "$root/etc"
printf '#!/bin/sh\nexit 101\n' > "$root/usr/sbin/policy-rc.d"
chmod 755 "$root/usr/sbin/policy-rc.d"
cp -a "$root" "$work/untouched"
mount -t proc proc "$root/proc"
mkdir "$root/packages"
cp "$packages"/*.deb "$root/packages"

inside() {
    env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin HOME=/root LC_ALL=C.UTF-8 \
        DEBIAN_FRONTEND=noninteractive chroot "$root" "$@"
}

# install WHAT...: packages of the archive, or files.
install() {
    quietly inside apt-get install -q -y --no-install-recommends "$@"
}

# deb PACKAGE...: their files, as they are called inside.
deb() {
    for package in "$@"; do
        (cd "$root" && echo ./packages/"${package}"_*.deb)
    done
}

# installed PACKAGE
installed() {
    [ "$(inside dpkg-query -W -f '${db:Status-Status}' "$1" 2> /dev/null || true)" = installed ]
}

# files: all that there are, but for what dpkg, apt and the loader write for themselves.
files() {
    (cd "$root" && find . -xdev \( -path ./proc -o -path ./packages -o -path ./var/lib/dpkg \
        -o -path ./var/lib/apt -o -path ./var/cache -o -path ./var/log -o -path ./tmp \) -prune \
        -o -print | grep -vx './etc/ld.so.cache' | LC_ALL=C sort)
}

# passes TEST: one of debian/tests, after what it depends on, where a copy of the source is.
passes() {
    depends=$(awk -v test="$1" 'BEGIN { RS = ""; FS = "\n" }
        $1 == "Tests: " test { for (i = 2; i <= NF; ++i) if (sub(/^Depends: /, "", $i)) print $i }' \
        "$source/debian/tests/control" | tr -d ,)
    [ -n "$depends" ] || fail "debian/tests/control says nothing of $1"
    # shellcheck disable=SC2086: a list of words
    install $depends
    quietly inside sh -c "cd /tmp/source && debian/tests/$1"
}
mkdir -p "$root/tmp/source/debian" "$root/tmp/source/tests/abi"
cp -r debian/tests "$root/tmp/source/debian"
cp -r tests/abi/installed "$root/tmp/source/tests/abi"

# needs PACKAGE: what dpkg would have installed before it.
needs() {
    dpkg-deb -f "$root/$(deb "$1")" Depends | tr , '\n' | sed 's/ *(.*//; s/ *|.*//; s/ //g'
}

say "the tool alone"
# What it needs comes first, so that what is left of it does not count.
# shellcheck disable=SC2046: a list of words
install $(needs mavoea)
files > "$work/before"
install "$(deb mavoea)"
! installed libmavoea5 || fail "the tool takes the library along"
passes tool
quietly inside apt-get purge -q -y mavoea
files > "$work/after"
diff "$work/before" "$work/after" || fail "the tool has left something"

say "programs"
# What they are compiled with comes first, so that what is left of it does not count.
install cmake gcc libacl1-dev libc6-dev make pkgconf
files > "$work/before"
# shellcheck disable=SC2046: a list of words
install $(deb libmavoea5 libmavoea-host1 libmavoea-dev)
passes program

say "the platform's own libraries"
# Packages of their names, with nothing in them.
for name in libmavocore1 libmavoacl1; do
    mkdir -p "$work/$name/DEBIAN"
    printf '%s\n' "Package: $name" "Version: 1.0" "Architecture: $(dpkg --print-architecture)" \
        "Multi-Arch: same" "Maintainer: nobody <nobody@mavoea.invalid>" "Description: $name" \
        > "$work/$name/DEBIAN/control"
    quietly dpkg-deb --root-owner-group --build "$work/$name" "$root/packages/$name.deb"
done
quietly inside apt-get remove -q -y libmavoea-dev
install ./packages/libmavocore1.deb ./packages/libmavoacl1.deb
! installed libmavoea-host1 || fail "libmavoea-host1 stays beside the platform's libraries"
installed libmavoea5 || fail "the library does not take the platform's libraries"

quietly inside apt-get purge -q -y 'libmavo*'
files > "$work/after"
diff "$work/before" "$work/after" || fail "the libraries have left something"

# newcomer: a system in which nobody has done anything yet, and a clone there.
newcomer() {
    umount "$root/proc"
    root=$(mktemp -d "$work/newcomer.XXX")
    cp -a "$work/untouched/." "$root"
    mount -t proc proc "$root/proc"
    dpkg-source --no-check -x "$packages"/mavoea_*.dsc "$root/root/clone" > /dev/null
}

# typed PART: the first commands that README has in that part, typed by the superuser in the clone. Prints
# what the last of them does.
typed() {
    awk -v part="## $1" '/^## / { within = $0 == part; next }
        within && /^    / { print substr($0, 5); there = 1; next }
        there { exit }' README.md > "$root/root/typed"
    [ -s "$root/root/typed" ] || fail "README has no commands for: $1"
    sed '$s/.*/{ & ; } > \/root\/said/' "$root/root/typed" > "$root/root/script"
    quietly inside sh -c 'cd /root/clone && sh -eux /root/script'
    cat "$root/root/said"
}

say "README: I have files"
newcomer
typed "I have files" > "$work/said"
[ "$(head -n 1 "$work/said")" = /root/clone/README.md ] && grep -q 'volume type: ' "$work/said" ||
    { cat "$work/said" >&2; fail "the tool says nothing of README.md"; }
say "README: I write a service"
newcomer
mkdir -p "$root/root/clone/build/packages"
cp "$packages"/*.deb "$root/root/clone/build/packages"
[ "$(typed "I write a service")" = blue ] || fail "README's first program has not set the attribute"
say "all passed"
