#!/bin/sh
# test.sh COMMANDS FILE [USER]: runs a test of coreutils, within sandbox.sh, as coreutils' own
# Makefile would: as root and as an ordinary user. It has passed if it passes as one of the two, and
# does not fail as the other. With USER, runs it as that user, and the status is the test's.
set -eu
commands=$1
file=$2
name=${file%.*}
log=/mnt/logs/$commands/$name
seconds=60
# What GNU calls expensive takes some seconds; what it calls very expensive is left out.
export RUN_EXPENSIVE_TESTS=yes

# In namespaces of its own: what it has mounted or started ends with it.
as() {
    echo "==== $file as $1"
    unshare --mount --pid --fork --kill-child sh /mnt/tests/test.sh "$commands" "$file" "$1"
}

# 77 is the status of a test that has skipped itself.
result() {
    result=skipped
    for user in root user; do
        as $user && status=0 || status=$?
        echo "==== status $status"
        case $status in
            0) [ $result = failed ] || result=passed ;;
            77) ;;
            *) result=failed ;;
        esac
    done
    echo "==== $result"
    echo $result > "$log.result"
}
if [ $# -eq 2 ]; then
    # One that waits for something in a loop tells of it without end.
    result 2>&1 < /dev/null | tail -c 4M > "$log.log"
    exit 0
fi

# ---- In its namespaces ---------------------------------------------------------------------------

user=$3
mount -t proc -o ro proc /proc
mount -t tmpfs -o mode=1777 shm /dev/shm
mount -t tmpfs -o mode=1777 tmp /tmp
# One test looks for a file of somebody else's in a directory with the sticky bit.
(umask 077 && echo "root's" > /tmp/of-root)

build=/mnt/scratch/$(echo "$name" | tr / -).$user
mkdir "$build"
ln -s /mnt/commands "$build/src"
ln -s /mnt/source/tests "$build/tests"

PATH=/usr/sbin:/usr/bin:/sbin:/bin
# shellcheck source=/dev/null # the source is not the project's
. /mnt/source/tests/lang-default
# shellcheck source=/dev/null
. /mnt/source/tests/envvar-check || true # its last condition does not hold, which is well
umask 022
built_programs=$(dpkg -L coreutils | sed -n 's|^/.*bin/||p' | tr '\n' ' ')
# What tests compare with the version that the commands themselves state.
PACKAGE_VERSION=$(/mnt/commands/rm --version 2>/dev/null | sed -n '1s/.* //p')
host_triplet=$(uname -m)-pc-linux-gnu
CU_TEST_NAME=coreutils,$(echo "$name" | tr / -)
export PATH built_programs PACKAGE_VERSION host_triplet CU_TEST_NAME
export VERSION="$PACKAGE_VERSION" VERBOSE=yes fail=0 TMPDIR=/tmp HOME="$build" SHELL=/bin/bash
export LOCALE_FR=none LOCALE_FR_UTF8=none EXEEXT=''
export CC=gcc AWK=awk EGREP='grep -E' PERL=perl MAKE=make
export abs_top_builddir="$build" abs_top_srcdir=/mnt/source abs_srcdir=/mnt/source
export srcdir=/mnt/source top_srcdir=/mnt/source host_os=linux-gnu
export CONFIG_HEADER=/mnt/config.h
PATH=$build/src:$PATH
# One test copies cp to where it does not find its libraries.
[ "$commands" = gnu ] || export LD_LIBRARY_PATH=/mnt/tool/lib

cd "$build"
case $file in
    *.sh) set -- bash "tests/$file" ;;
    *)
        set -- -I/mnt/source/tests -MCuSkip -MCoreutils "-MCuTmpdir qw(${name##*/})" "tests/$file"
        case $file in
            *.pl) set -- perl -w "$@" ;;
            *.xpl) set -- perl -wT "$@" ;;
        esac
        ;;
esac
# Without a terminal of its own such a test would skip itself.
if grep -q require_controlling_input_terminal_ "/mnt/source/tests/$file"; then
    set -- script --quiet --return --command "$*" /dev/null
fi
if [ "$user" = user ]; then
    chown nobody:nogroup "$build"
    set -- setpriv --reuid=nobody --regid=nogroup --groups=nogroup,users --inh-caps=-all "$@"
fi
# The shell stays, as the namespace's first process is no ordinary one.
timeout --kill-after=10 $seconds "$@" 9>&2 && status=0 || status=$?
[ "$status" != 124 ] || echo "stopped after $seconds s"
exit "$status"
