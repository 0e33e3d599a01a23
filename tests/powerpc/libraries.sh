#!/bin/sh
# libraries.sh [PREFIX]: puts what the powerpc build links and includes, besides the cross compiler's
# own libraries, under PREFIX (build/powerpc-libraries). libattr and libacl are built from Debian's
# source packages, as Debian has no powerpc ones; CLI11 and nlohmann-json are headers of this
# machine's packages, without the rest of its /usr/include. With everything in place nothing is done.
#
# Needs dpkg-dev, make, gcc-powerpc-linux-gnu, libcli11-dev and nlohmann-json3-dev. The system's own
# package lists and sources are left as they are.
set -eu
here=$(cd "$(dirname "$0")" && pwd)
prefix=${1:-$here/../../build/powerpc-libraries}
mkdir -p "$prefix"
prefix=$(cd "$prefix" && pwd)
host=powerpc-linux-gnu

stamp=$(cksum < "$here/libraries.sh")
[ "$(cat "$prefix/complete" 2>/dev/null || true)" != "$stamp" ] || exit 0
mkdir -p "$prefix/include" "$prefix/share/cmake"

work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
mkdir -p "$work/apt/parts" "$work/apt/lists/partial" "$work/source"

# ---- Where Debian's sources are -------------------------------------------------------------------

# The entries of Debian's own suites with the component main, as entries for source packages.
codename=$(. /etc/os-release && echo "$VERSION_CODENAME")
suites="^($codename|stable)([-/](updates|security))*\$"
for file in /etc/apt/sources.list.d/*.sources; do
    [ -f "$file" ] || continue
    awk -v suites="$suites" '
        function end_of_entry(  i) {
            if (is_deb && is_main && debian != "" && enabled) {
                print "Types: deb-src\nSuites:" debian "\nComponents: main\n" rest
            }
            is_deb = is_main = 0; debian = rest = field = ""; enabled = 1
        }
        function take(words,  i, all) {
            for (i = split(words, all, /[ \t]+/); i > 0; --i) {
                if (field == "types" && all[i] ~ /^deb(-src)?$/) is_deb = 1
                if (field == "components" && all[i] == "main") is_main = 1
                if (field == "suites" && all[i] ~ suites) debian = debian " " all[i]
                if (field == "enabled" && tolower(all[i]) ~ /^(no|false|without|off|disable)$/) {
                    enabled = 0
                }
            }
        }
        BEGIN { enabled = 1 }
        /^[ \t]*$/ { end_of_entry(); next }
        /^#/ { next }
        /^[^ \t]/ {
            field = tolower($0)
            sub(/:.*/, "", field)
            words = $0
            sub(/^[^:]*:/, "", words)
            take(words)
        }
        /^[ \t]/ { take($0) }
        field !~ /^(types|suites|components|enabled|architectures)$/ { rest = rest $0 "\n" }
        END { end_of_entry() }' "$file" > "$work/apt/parts/$(basename "$file")"
done
for file in /etc/apt/sources.list /etc/apt/sources.list.d/*.list; do
    [ -f "$file" ] || continue
    awk -v suites="$suites" '
        $1 !~ /^deb(-src)?$/ { next }
        {
            options = ""
            line = $0
            sub(/#.*/, "", line)
            sub(/^deb(-src)?[ \t]+/, "", line)
            if (match(line, /^\[[^]]*\][ \t]*/)) {
                options = substr(line, 1, RLENGTH)
                line = substr(line, RLENGTH + 1)
                gsub(/arch[+-]?=[^] \t]*/, "", options)
                if (options ~ /^\[[ \t]*\]/) options = ""
            }
            words = split(line, word, /[ \t]+/)
            if (word[2] !~ suites) next
            for (i = 3; i <= words; ++i) {
                if (word[i] == "main") {
                    print "deb-src " options word[1], word[2], "main"
                    next
                }
            }
        }' "$file" > "$work/apt/parts/$(basename "$file")"
done

apt() {
    apt-get -q -o Dir::Etc::SourceList=/dev/null -o Dir::Etc::SourceParts="$work/apt/parts" \
        -o Dir::State::Lists="$work/apt/lists" -o Dir::Cache::pkgcache= \
        -o Dir::Cache::srcpkgcache= -o APT::Sandbox::User= -o Acquire::Languages=none "$@"
}
apt update
(cd "$work/source" && apt --only-source source attr acl)

# ---- Building -------------------------------------------------------------------------------------

# They are put in place by a copy, as configure takes no path with a blank. Each looks for the other
# where it lies itself, wherever that is.
stage=$work/stage
export LD_RUN_PATH='$ORIGIN'
build() {
    cd "$work"/source/"$1"-*/
    # Debian's patches are younger than the files generated from what they change; those need not be
    # generated again, which would take the autotools.
    touch aclocal.m4
    find . -name Makefile.in -exec touch {} +
    touch configure include/config.h.in
    ./configure --quiet --host=$host --prefix=/usr --libdir=/usr/lib --sysconfdir=/etc \
        --disable-static --disable-nls CPPFLAGS="-I$stage/usr/include" LDFLAGS="-L$stage/usr/lib"
    make -s -j 2 > make.log 2>&1 && make -s install DESTDIR="$stage" >> make.log 2>&1 ||
        { cat make.log; exit 1; }
    rm -f "$stage"/usr/lib/lib"$1".la
}
(build attr)
(build acl)
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
