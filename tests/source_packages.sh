#!/bin/sh
# source_packages.sh DIRECTORY PACKAGE[=VERSION]...: fetches these source packages with apt, from where
# this machine's own entries say that Debian's packages are, and unpacks them in DIRECTORY.
#
# Needs dpkg-dev. The system's own package lists and sources are left as they are.
set -eu
directory=$(cd "$1" && pwd)
shift
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
mkdir -p "$work/apt/parts" "$work/apt/lists/partial"

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
cd "$directory"
apt --only-source source "$@"
