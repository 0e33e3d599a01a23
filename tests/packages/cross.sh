#!/bin/sh
# cross.sh ARCHITECTURE [DIRECTORY]: the packages that `sh tools/package.sh --host ARCHITECTURE` makes,
# beside those for this machine, as `sh tools/package.sh` has made them in DIRECTORY (build/packages):
# lintian finds nothing; they have the same files, rights, symbols and needs; everything in them is of
# that architecture; they install beside this machine's libraries; and where it, or an emulator, runs such
# programs they pass debian/tests, the compiler being the other architecture's.
#
# Ends with 77 where there is no root, or nothing can be mounted.
set -eu
architecture=$1
native=$(cd "${2:-$(dirname "$0")/../../build/packages}" && pwd)
cd "$(dirname "$0")/../.."

fail() {
    echo "$*" >&2
    exit 1
}

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
trap 'exit 1' HUP INT TERM
own=$(dpkg --print-architecture)
own_triplet=$(dpkg-architecture -q DEB_HOST_MULTIARCH)
triplet=$(dpkg-architecture -a "$architecture" -q DEB_HOST_MULTIARCH 2> /dev/null)

# What a package is, but for sizes, dates, and what the architecture is called.
described() {
    dpkg-deb --fsys-tarfile "$1" | tar -tv | awk '{ $3 = $4 = $5 = ""; print }'
    dpkg-deb --info "$1" symbols 2> /dev/null || true
    dpkg-deb --field "$1" Package Version Multi-Arch Provides Conflicts Replaces Section
    dpkg-deb --field "$1" Depends | sed 's/ (>= [^)]*)//g'
}

# Called once they are built, with the system in which that was done.
if [ -n "${MAVOEA_ROOT:-}" ]; then
    for package in "$native"/*_"$own".deb; do
        other=${package##*/}
        other=$MAVOEA_PACKAGES/${other%_*}_$architecture.deb
        [ -e "$other" ] || fail "there is no ${other##*/}"
        case $package in *-dbgsym_*) continue ;; esac # their files are called by their content
        described "$package" | sed "s/$own_triplet/TRIPLET/g" > "$work/own"
        described "$other" | sed "s/$triplet/TRIPLET/g" > "$work/other"
        diff "$work/own" "$work/other" || fail "${other##*/} is unlike ${package##*/}"
        mkdir "$work/files"
        dpkg-deb -x "$other" "$work/files"
        # What is no ELF file has no class.
        find "$work/files" -type f -exec readelf -h {} + 2> /dev/null |
            sed -n 's/^ *Machine: *//p' | sort -u >> "$work/machines"
        rm -r "$work/files"
    done
    readelf -h "$MAVOEA_ROOT/usr/lib/$triplet/libc.so.6" |
        sed -n 's/^ *Machine: *//p' > "$work/machine"
    sort -u "$work/machines" | diff "$work/machine" - || fail "built for another machine"

    inside() {
        env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin HOME=/root LC_ALL=C.UTF-8 \
            DEBIAN_FRONTEND=noninteractive chroot "$MAVOEA_ROOT" "$@"
    }
    mkdir "$MAVOEA_ROOT/packages"
    cp "$MAVOEA_PACKAGES"/*_"$architecture".deb "$MAVOEA_ROOT/packages"
    rm "$MAVOEA_ROOT"/packages/*-dbgsym_*
    inside sh -c 'apt-get install -q -y --no-install-recommends /packages/*.deb' > "$work/log" 2>&1 ||
        { cat "$work/log" >&2; fail "they do not install"; }
    [ "$(inside dpkg-query -W -f '${Architecture}' mavoea)" = "$architecture" ] ||
        fail "the tool that was installed is another one"
    type=$(dpkg-architecture -a "$architecture" -q DEB_HOST_GNU_TYPE 2> /dev/null)
    try() {
        inside sh -c "cd /build/source && $1" > "$work/log" 2>&1 || { cat "$work/log" >&2; fail "$2"; }
    }
    # Their loader is a program of that architecture.
    loader=$(readelf -p .interp "$MAVOEA_ROOT/usr/bin/mavoea" | sed -n 's,^.* \(/lib.*\)$,\1,p')
    case $architecture in
        powerpc) emulator=qemu-ppc ;;
        *) emulator= ;;
    esac
    if inside "$loader" --version > /dev/null 2>&1; then
        try debian/tests/tool "the tool fails"
        try "apt-get install -q -y --no-install-recommends pkgconf:$architecture" "no pkg-config"
        try "DEB_HOST_GNU_TYPE=$type debian/tests/program" "programs fail"
    elif [ -n "$emulator" ]; then
        try "apt-get install -q -y --no-install-recommends qemu-user" "no emulator"
        mkdir -p "$MAVOEA_ROOT/usr/local/bin"
        printf '#!/bin/sh\nexec %s -L /usr/%s /usr/bin/mavoea "$@"\n' $emulator "$type" \
            > "$MAVOEA_ROOT/usr/local/bin/mavoea"
        chmod 755 "$MAVOEA_ROOT/usr/local/bin/mavoea"
        try 'PATH=/usr/local/bin:$PATH debian/tests/tool' "the tool fails"
        try "$type-gcc -o /tmp/program tests/abi/installed/program.c -lmavoea -lmavocore &&
            $emulator -L /usr/$type /tmp/program | grep '^/volume/@eaDir/file@MavoEAStream '" \
            "a program fails"
    else
        echo "programs of $architecture do not run here"
        exit 0
    fi
    echo "all passed"
    exit 0
fi

mkdir "$work/packages"
status=0
DPKG_GENSYMBOLS_CHECK_LEVEL=4 sh tools/package.sh --host "$architecture" \
    "$work/packages" sh "$PWD/tests/packages/cross.sh" "$architecture" "$native" > "$work/log" 2>&1 ||
    status=$?
[ $status -eq 0 ] || cat "$work/log" >&2
grep -x -e 'all passed' -e 'programs of .* do not run here' "$work/log" || [ $status -ne 0 ] ||
    fail "they have not been tried"
exit $status
