#!/bin/sh
# Builds the tool and shows its main job on a real file: named attributes, a resource fork and Finder
# info, stored beside the file, listed, read back and removed. Installs what the build takes.
set -eu
cd "$(dirname "$0")/.."
sh tests/packages.sh g++ cmake ninja-build libacl1-dev libcli11-dev nlohmann-json3-dev
cmake --preset release -DMAVOEA_TESTS=OFF -DMAVOEA_BENCH=OFF -B build/demo
cmake --build build/demo

share=$(mktemp -d)
trap 'rm -rf "$share"' EXIT
mavoea=$PWD/build/demo/bin/mavoea
cd "$share"

run() {
    echo
    echo "\$ mavoea $*"
    # The directory is declared to be an EA-directory volume, whatever filesystem it is on.
    "$mavoea" --volume "$share=eadir" "$@"
}

echo "Dear diary" > letter.txt
echo
echo "A file on a share: $(ls)"
run where letter.txt
run set letter.txt com.example.colour blue
run set letter.txt com.example.rating '*****'
printf 'resource fork bytes' | run set letter.txt com.apple.ResourceFork
run set letter.txt com.apple.FinderInfo --hex \
    5445585474747874000000000000000000000000000000000000000000000000
echo
echo "Its metadata lies beside it: $(ls -A | tr '\n' ' ')/ $(ls @eaDir | tr '\n' ' ')"
run list -l letter.txt
run get letter.txt com.example.colour
echo
run get --hex letter.txt com.apple.FinderInfo
run dump @eaDir/letter.txt@MavoEAStream
run remove letter.txt com.example.colour
run list letter.txt
