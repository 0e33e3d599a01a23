#!/bin/sh
# examples.sh BIN: runs the examples, BIN/example_..., and looks at what they say and leave on disk.
set -eu
bin=$1
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT
cd "$dir"

fail() { echo "examples.sh: $*" >&2; exit 1; }

: >file
test -z "$("$bin/example_list" "$dir/file")" || fail "an object without attributes lists some"
test ! -e @eaDir || fail "looking has made an EA directory"

# A shorter value replaces a longer one, bytes of the old one are not left behind.
"$bin/example_set" "$dir/file" colour blue
"$bin/example_set" "$dir/file" colour red
test "$("$bin/example_list" "$dir/file")" = colour || fail "colour is not listed"
{
    printf '\000\005\026\007\000\002\000\000Mac OS X        \000\002'
    printf '\000\000\000\011\000\000\000\062\000\000\000\135' # Finder info: at 50, 93 bytes
    printf '\000\000\000\002\000\000\000\217\000\000\000\000' # resource fork: at 143, empty
    head -c 34 /dev/zero
    printf 'ATTR\000\000\000\000\000\000\000\217\000\000\000\214\000\000\000\003'
    head -c 12 /dev/zero
    printf '\000\000\000\001'
    printf '\000\000\000\214\000\000\000\003\000\000\007colour\000\000\000'
    printf red
} >expected
cmp expected @eaDir/file@MavoEAStream || fail "the stream differs"

"$bin/example_set" "$dir/file" size large
test "$("$bin/example_list" "$dir/file")" = "colour
size" || fail "both are not listed"

# An EA directory's stream becomes a "._" file.
mkdir other
: >other/file
"$bin/example_copy" "$dir/file" "$dir/other/file"
test "$(head -c 8 other/._file | od -An -tx1)" = " 00 05 16 07 00 02 00 00" ||
    fail "no AppleDouble file at the copy"
grep -q colour other/._file && grep -q redlarge other/._file || fail "the values have not arrived"
test ! -e other/@eaDir || fail "the copy has an EA directory"

# What went wrong is told: by errno where no code is recorded, else by the code.
"$bin/example_error" "$dir/file" || fail "nothing is wrong with the stream"
if "$bin/example_error" "$dir/none" 2>said; then fail "a missing stream is opened"; fi
test "$(cat said)" = "$dir/none: No such file or directory" || fail "said: $(cat said)"
echo damaged >@eaDir/file@MavoEAStream
if "$bin/example_error" "$dir/file" 2>said; then fail "a damaged stream is opened"; fi
test "$(cat said)" = "$dir/file: Metadata could not be read, or is damaged. Look at the system log;\
 check the metadata file before writing to it." || fail "said: $(cat said)"
if "$bin/example_list" "$dir/file" 2>said; then fail "a damaged stream is listed"; fi
if "$bin/example_set" "$dir/file" colour red 2>said; then fail "a damaged stream is written"; fi
test "$(cat @eaDir/file@MavoEAStream)" = damaged || fail "the damaged stream has changed"
