#!/bin/sh
# Runs the whole suite over a build that counts, and reports which lines and branches of the library
# it has run: build/coverage/report/index.html, and a summary here. Installs what that takes.
set -eu
cd "$(dirname "$0")/.."
sh tests/packages.sh g++ cmake ninja-build pkg-config libacl1-dev libattr1-dev libcli11-dev \
    nlohmann-json3-dev libgtest-dev libgmock-dev acl attr scdoc e2fsprogs xfsprogs btrfs-progs gcovr
cmake --preset coverage
cmake --build --preset coverage
find build/coverage -name '*.gcda' -delete
# Counting takes a library of its own, and the tool as another user complains that it cannot write
# its counts.
GTEST_FILTER=-CpTest.WhatMayNotBeWrittenIsToldAndLeft:CpTest.AnotherUsersProgramLosesItsRights \
    ctest --preset coverage -j 2 -E '^abi:needs$'
mkdir -p build/coverage/report
gcovr --root . --object-directory build/coverage --exclude-throw-branches \
    --exclude-unreachable-branches --html-details build/coverage/report/index.html \
    --print-summary --filter '(adouble|format|ops|path|stream|util|xattr)/' build/coverage
echo "build/coverage/report/index.html"
