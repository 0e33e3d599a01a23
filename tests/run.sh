#!/bin/sh
# Builds everything and passes the whole test suite: optimised, under the sanitizers, on an emulated
# PowerPC, against hostile inputs, and against changes of the library that they must notice; and the
# checks of style. Installs what that takes. Prints what it runs.
set -eu
cd "$(dirname "$0")/.."
root=$PWD
begun=$(date +%s)

step() {
    echo
    echo "==== $* ($(($(date +%s) - begun)) s)"
}

# build_and_test PRESET [OPTION]
build_and_test() {
    step "build: $1"
    cmake --preset "$@"
    cmake --build --preset "$1"
    step "test: $1"
    ctest --preset "$1" -j 3 # some wait for a disk
}

step packages
sh tests/packages.sh g++ cmake ninja-build pkg-config libacl1-dev libattr1-dev libcli11-dev \
    nlohmann-json3-dev libgtest-dev libgmock-dev libbenchmark-dev acl attr binutils \
    e2fsprogs xfsprogs btrfs-progs clang-format clang-tidy clang libclang-rt-14-dev cppcheck git \
    python3 abigail-tools util-linux g++-powerpc-linux-gnu gcc-powerpc-linux-gnu qemu-user \
    googletest dpkg-dev make autoconf automake libtool libplist-dev samba samba-vfs-modules \
    smbclient python3-impacket scdoc man-db mandoc bash-completion zsh fish

build_and_test release
step "coreutils' tests of cp, mv and rm"
sh tests/coreutils/run.sh -v || [ $? -eq 77 ] # nothing can be mounted here
# What tests the tool runs it as a process: the programs of one build can test the tool of each.
tool_tests=-DMAVOEA_TOOL_TESTS="$root/build/release/bin"
build_and_test sanitize "$tool_tests"

step "Debian's packages"
sh tools/package.sh
sh tests/packages/run.sh build/packages || [ $? -eq 77 ] # nothing can be mounted here

step "libraries: powerpc"
sh tests/powerpc/libraries.sh
build_and_test powerpc "$tool_tests"

step "build: fuzz"
cmake --preset fuzz
cmake --build --preset fuzz
step "fuzz targets"
sh fuzz/run.sh build/fuzz

step "style: formatting"
files=$(git ls-files '*.c' '*.cpp' '*.h' 2>/dev/null || true)
[ -n "$files" ] || files=$(find include path stream xattr adouble ops format util platform tools \
    tests bench fuzz -name '*.c' -o -name '*.cpp' -o -name '*.h' 2>/dev/null)
# shellcheck disable=SC2086: a list of words
clang-format --dry-run --Werror $files

step "style: includes point one way"
sh tests/lint/includes.sh

step "static analysis: clang-tidy"
here=$(printf %s "$root" | sed 's/[][\\.*^$+?(){}|]/\\&/g') # nothing but itself in a pattern
run-clang-tidy -quiet -j 2 -p build/release \
    "^$here/(path|stream|xattr|adouble|ops|format|util|platform|tools)/.*\.cpp\$" \
    > build/clang-tidy.log 2>&1 || { cat build/clang-tidy.log; exit 1; }
echo "no findings"

step "static analysis: cppcheck"
cppcheck --quiet --error-exitcode=1 -j 2 --std=c++20 --language=c++ --inline-suppr \
    --enable=warning,performance,portability --suppress=missingInclude \
    -I . adouble ops path stream xattr format util platform
echo "no findings"

# in_time SECONDS STEP COMMAND...: the step, unless a slow machine has taken that long until now.
in_time() {
    if [ $(($(date +%s) - begun)) -ge "$1" ]; then
        step "$2: left out, the rest took too long"
        return
    fi
    step "$2"
    shift 2
    "$@"
}
in_time 4700 mutants python3 tests/mutation/mutants.py build/release
in_time 4300 "Debian's packages: i386" sh tests/packages/cross.sh i386 || [ $? -eq 77 ]

step "all passed"
