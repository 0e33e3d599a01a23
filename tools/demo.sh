#!/bin/sh
# Builds the tool and shows its main job on a real file: named attributes, a resource fork and Finder
# info, stored beside the file, listed, read back and removed; then a "._" file imported, a file
# locked, an earlier layout converted, and a file carried from one kind of volume to the next.
# Installs what the build takes.
set -eu
cd "$(dirname "$0")/.."
sh tests/packages.sh g++ cmake ninja-build libacl1-dev libattr1-dev libcli11-dev libplist-dev \
    nlohmann-json3-dev
# Without optimisation it is there in little more than half the time.
cmake --preset release -DCMAKE_BUILD_TYPE=Debug -DMAVOEA_TESTS=OFF -DMAVOEA_BENCH=OFF \
    -DMAVOEA_MANUAL=OFF -DMAVOEA_WERROR=OFF -B build/demo
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

echo
echo "A file and its metadata go from an EA-directory volume to a file-EA volume, on to an"
echo "AppleDouble volume and back:"
mkdir eadir fileea appledouble
run() {
    echo
    echo "\$ mavoea $*"
    "$mavoea" --volume "$share/eadir=eadir" --volume "$share/fileea=fileea" \
        --volume "$share/appledouble=appledouble" "$@"
}
echo "Dear reader" > eadir/book.txt
run set eadir/book.txt com.example.colour red
printf 'a fork' | run set eadir/book.txt com.apple.ResourceFork
run set eadir/book.txt com.apple.FinderInfo --hex \
    5445585474747874000000000000000000000000000000000000000000000000
run list -l eadir/book.txt
run mv eadir/book.txt fileea || {
    echo "A file-EA volume takes a file system that keeps extended attributes of users."
    exit 0
}
run list -l fileea/book.txt
run mv fileea/book.txt appledouble
run list -l appledouble/book.txt
run mv appledouble/book.txt eadir
run list -l eadir/book.txt
echo
echo "Left behind on the two others: $(ls -A fileea appledouble | tr '\n' ' ')"
