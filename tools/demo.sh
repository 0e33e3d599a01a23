#!/bin/sh
# Builds the tool and shows its main job on a real file: named attributes, a resource fork and Finder
# info, stored beside the file, listed, read back and removed; then a "._" file imported, a file
# locked and an earlier layout converted. Installs what the build takes.
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

echo
echo "A \"._\" file as a Mac leaves it on a stick, here with one attribute, becomes a file's metadata:"
echo "Dear friend" > note.txt
{
    printf '\000\005\026\007\000\002\000\000Mac OS X        \000\002' # header, two entries:
    printf '\000\000\000\011\000\000\000\062\000\000\000\152'         # Finder info at 50, 106 bytes
    printf '\000\000\000\002\000\000\000\234\000\000\000\004'         # resource fork at 156, 4 bytes
    printf 'TEXTttxt'
    head -c 26 /dev/zero
    printf 'ATTR\000\000\000\000\000\000\000\234'                      # total size 156
    printf '\000\000\000\230\000\000\000\004'                          # values at 152, 4 bytes
    head -c 14 /dev/zero
    printf '\000\001\000\000\000\230\000\000\000\004\000\000\023com.example.colour\000\000\000'
    printf 'bluefork'
} > from-a-mac.bin
run import from-a-mac.bin note.txt
run list -l note.txt

echo
echo "A Mac may not change a locked file:"
run lock note.txt || true # not every file system can keep it
run list note.txt
run unlock note.txt

echo
echo "An earlier version kept each attribute in a file of its own:"
mkdir -p old/@eaDir/report.txt
echo "Annual report" > old/report.txt
printf 'green' > old/@eaDir/report.txt/com.example.colour
run upgrade -r old
run list -l old/report.txt
run get old/report.txt com.example.colour
echo
