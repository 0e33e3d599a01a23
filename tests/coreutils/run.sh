#!/bin/sh
# run.sh [OPTION]... [TEST]...: runs the tests of GNU coreutils for cp, mv and rm against the tool.
# A TEST is named like cp/same-file; without any all are run.
#
#   --gnu             run them with Debian's own cp, mv and rm only
#   --wrapper=KIND    how the tool is started: by a symbolic link of the command's name (link, which
#                     is the default), or by a script that names the subcommand (script)
#   --source=DIR      coreutils' source is DIR; otherwise it is fetched into build/coreutils, once
#   -j N              run N tests at a time (2)
#   -v                show the end of the log of each test that does not pass as it should, as is
#                     done with single tests anyway
#
# Each test is run with Debian's commands first. What passes with those has to pass with the tool,
# except for the tests that known.txt names; those have to fail. MAVOEA_TOOL is the tool
# (build/release/bin/mavoea). Logs are kept in build/coreutils/logs. The status is 0 if everything
# is as it has to be, 77 where nothing can be mounted, and 1 otherwise.
set -eu
here=$(cd "$(dirname "$0")" && pwd)
project=$(cd "$here/../.." && pwd)
work=$project/build/coreutils
version=9.1-1
# Fewer tests than this pass with Debian's commands only if these scripts are broken.
reference_at_least=140

# ---- Arguments -----------------------------------------------------------------------------------

usage() {
    sed -n '2,/^set/s/^# \{0,1\}//p' "$0" >&2
    exit 2
}

only_gnu=no
wrapper='link'
source=
jobs=2
verbose=no
while [ $# -gt 0 ]; do
    case $1 in
        --gnu) only_gnu=yes ;;
        --wrapper=link | --wrapper=script) wrapper=${1#*=} ;;
        --source=?*) source=$(cd "${1#*=}" && pwd) ;;
        -j)
            [ $# -gt 1 ] || usage
            jobs=$2
            shift
            ;;
        -j?*) jobs=${1#-j} ;;
        -v) verbose=yes ;;
        -*) usage ;;
        *) break ;;
    esac
    shift
done
tool=${MAVOEA_TOOL:-$project/build/release/bin/mavoea}

# ---- What it takes -------------------------------------------------------------------------------

# What sandbox.sh is going to do has to be allowed.
if ! unshare --mount --pid --fork --kill-child sh -c 'mount --make-rprivate / &&
        mount -t tmpfs test /mnt && mknod /mnt/null c 1 3 && : > /mnt/null &&
        test -e /dev/loop-control' 2>/dev/null; then
    echo "skipped: tests/coreutils: nothing can be mounted here, or no device made" >&2
    exit 77
fi
if [ $only_gnu = no ] && ! [ -x "$tool" ]; then
    echo "$tool is not there" >&2
    exit 1
fi

sh "$project/tests/packages.sh" acl attr bsdutils dpkg-dev e2fsprogs gcc libc6-dev libcap2-bin \
    patch perl python3 strace util-linux valgrind xz-utils

mkdir -p "$work/stage"
if [ -z "$source" ]; then
    source=$work/coreutils-${version%-*}
    if ! [ -d "$source" ]; then
        mkdir -p "$work/fetched"
        sh "$project/tests/source_packages.sh" "$work/fetched" "coreutils=$version"
        mv "$work/fetched/coreutils-${version%-*}" "$source" # complete, if it is there at all
        rm -rf "$work/fetched"
    fi
fi

# The files of the tests to be run: those named in the arguments, or all.
files() {
    (cd "$source/tests" && find cp mv rm -name '*.sh' -o -name '*.pl' -o -name '*.xpl') |
        sort > "$work/all"
    [ $# -gt 0 ] || { cat "$work/all"; return; }
    for test in "$@"; do
        awk -v test="$test" '{ name = $0; sub(/\.[a-z]*$/, "", name) }
            name == test || $0 == test { print; found = 1 }
            END { exit !found }' "$work/all" || { echo "there is no test $test" >&2; return 1; }
    done
}
files "$@" > "$work/files"
[ $# -eq 0 ] || verbose=yes

# ---- Running -------------------------------------------------------------------------------------

# run KIND: runs the tests, in a namespace of their own, with the commands of this kind. The log of
# each is logs/KIND/TEST.log, and TEST.result the one word that came of it.
run() {
    mkdir -p "$work/logs"
    rm -rf "${work:?}/logs/$1"
    while read -r file; do mkdir -p "$work/logs/$1/${file%/*}"; done < "$work/files"
    unshare --mount sh "$here/sandbox.sh" "$1" "$source" "$tool" "$work" "$jobs" < "$work/files"
    while read -r file; do
        name=${file%.*}
        echo "$name $(cat "$work/logs/$1/$name.result" 2>/dev/null || echo failed)"
    done < "$work/files" > "$work/logs/$1/results"
}

# show KIND TEST: what led to the end of each of its runs that did not pass, if that is asked for.
show() {
    [ $verbose = yes ] || return 0
    awk -v most=25 -v skipped="$(grep -cx skipped "$work/logs/$1/$2.result")" '
        /^\+ Exit / { ended = 1 } # what follows is tidied up
        /^==== .* as / { count = ended = 0 }
        /^==== status / {
            if ($3 == 0 || ($3 == 77 && !skipped)) next
            for (i = count > most ? count - most : 0; i < count; ++i) print "    " line[i]
            print "    " $0
        }
        !ended { line[count++] = $0 }' "$work/logs/$1/$2.log"
}

# with KIND RESULT: the tests of which RESULT came.
with() {
    awk -v result="$2" '$2 == result { print $1 }' "$work/logs/$1/results"
}

# why_skipped TEST: what the test itself said of it, with Debian's commands, as root and not.
why_skipped() {
    sed -n '/^+/d; s/.*: skipped test: //p; s/: skipping.*//p' "$work/logs/gnu/$1.log" | uniq |
        paste -s -d ';'
}

run gnu
with gnu passed > "$work/reference"
if [ $only_gnu = yes ]; then
    for name in $(with gnu failed); do
        echo "$name: fails"
        show gnu "$name"
    done
    for name in $(with gnu skipped); do echo "$name: skipped: $(why_skipped "$name")"; done
    echo "$(with gnu passed | wc -l) passed, $(with gnu failed | wc -l) failed," \
        "$(with gnu skipped | wc -l) skipped"
    exit 0
fi
passing=$(wc -l < "$work/reference")
if [ $# -eq 0 ] && [ "$passing" -lt $reference_at_least ]; then
    echo "only $passing tests pass with Debian's own commands; see $work/logs/gnu" >&2
    exit 1
fi

run "$wrapper"

# ---- What came of it -----------------------------------------------------------------------------

status=0
passed=0
failed=0
skipped=0
while read -r name result; do
    if [ "$result" = passed ]; then
        passed=$((passed + 1))
    elif grep -qx "$name" "$work/reference"; then
        failed=$((failed + 1))
    else
        skipped=$((skipped + 1))
    fi
    reason=$(sed -n "s|^$name ||p" "$here/known.txt")
    if [ "$result" = passed ]; then
        [ -n "$reason" ] || continue
        echo "$name: known.txt names it, and it passes"
    elif ! grep -qx "$name" "$work/reference"; then
        continue
    elif [ -n "$reason" ]; then
        continue
    else
        echo "$name: $result; it passes with GNU's commands"
        show "$wrapper" "$name"
    fi
    status=1
done < "$work/logs/$wrapper/results"

sed -n 's/^\([^# ][^ ]*\) .*/\1/p' "$here/known.txt" | while read -r name; do
    grep -q "^$name\.[a-z]*\$" "$work/all" ||
        echo "$name: known.txt names it, and there is no such test"
done > "$work/unknown"
if [ -s "$work/unknown" ]; then
    cat "$work/unknown"
    status=1
fi
echo "$passed passed, $failed failed, $skipped skipped"
exit $status
