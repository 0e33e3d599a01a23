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

# Finder info and resource fork: the file is made, of two entries, and its fork is replaced.
fork() { "$bin/example_finder_info_and_fork" "$@"; }
resource() { # resource FORK LENGTH: the file, of TEXT and ttxt, with that fork; the length in octal
    printf '\000\005\026\007\000\002\000\000Mac OS X        \000\002'
    printf '\000\000\000\011\000\000\000\062\000\000\000\040' # Finder info: at 50, 32 bytes
    printf '\000\000\000\002\000\000\000\122\000\000\000%b' "\\0$2" # resource fork: at 82
    printf TEXTttxt
    head -c 24 /dev/zero
    printf %s "$1"
}
if fork "$dir/file" 2>said; then fail "a resource file that is missing is shown"; fi
test "$(cat said)" = "$dir/file: No such file or directory" || fail "said: $(cat said)"
test ! -e @eaDir/file@MavoResource || fail "looking has made a resource file"
test "$(fork "$dir/file" TEXT ttxt 'a long fork')" = \
    "type TEXT, creator ttxt, a fork of 11 bytes" || fail "the fork is not shown"
resource 'a long fork' 013 >expected
cmp expected @eaDir/file@MavoResource || fail "the resource file differs"
fork "$dir/file" TEXT ttxt fork >said || fail "the fork is not replaced"
resource fork 004 >expected
cmp expected @eaDir/file@MavoResource || fail "the resource file differs once its fork is shorter"
: >@eaDir/other@MavoResource # as a crash may leave it
fork "$dir/other" TEXT ttxt fork >said || fail "an empty resource file is not written"
cmp expected @eaDir/other@MavoResource || fail "the resource file that was empty differs"
rm @eaDir/other@MavoResource
# A fork that is not the last one cannot change its length.
{ resource fork 004; printf more; } >@eaDir/other@MavoResource
cp @eaDir/other@MavoResource expected
if fork "$dir/other" TEXT ttxt longer 2>said; then fail "a fork in the midst is replaced"; fi
cmp expected @eaDir/other@MavoResource || fail "what is behind a fork has changed"
rm @eaDir/other@MavoResource

# An EA directory's stream and resource file become a "._" file.
mkdir other
: >other/file
"$bin/example_copy" "$dir/file" "$dir/other/file"
{
    printf '\000\005\026\007\000\002\000\000Mac OS X        \000\002'
    printf '\000\000\000\011\000\000\000\062\000\000\000\162' # Finder info: at 50, 114 bytes
    printf '\000\000\000\002\000\000\000\244\000\000\000\004' # resource fork: at 164, 4 bytes
    printf TEXTttxt
    head -c 26 /dev/zero
    printf 'ATTR\000\000\000\000\000\000\000\244\000\000\000\234\000\000\000\010' # 164, 156, 8
    head -c 12 /dev/zero
    printf '\000\000\000\002'
    printf '\000\000\000\234\000\000\000\003\000\000\007colour\000\000\000'
    printf '\000\000\000\237\000\000\000\005\000\000\005size\000'
    printf redlargefork
} >expected
cmp expected other/._file || fail "the AppleDouble file differs"
test ! -e other/@eaDir || fail "the copy has an EA directory"
if "$bin/example_copy" "$dir/file" "$dir/none/file" 2>said; then fail "a copy to nowhere"; fi
test "$(cat said)" = "$dir/none/file: the metadata could not be copied: see the system log" ||
    fail "said: $(cat said)"

# Names of 253 bytes are the longest that have a "._" file; those of 243 and more are shortened.
test "$("$bin/example_paths" /v/file)" = "/v/@eaDir/file@MavoEAStream
/v/@eaDir/file@MavoResource
/v/._file" || fail "the paths differ"
a242=$(printf %0242d 0)
if "$bin/example_paths" "/v/${a242}ABCDEFGHIJKL" >said 2>message; then
    fail "254 bytes have a path"
fi
test "$(cat message)" = "/v/${a242}ABCDEFGHIJKL: no path: The name or path is too long" ||
    fail "said: $(cat message)"

mkdir -p shown/@eaDir shown/@tmp
: >shown/letter
: >shown/._letter
: >shown/.DS_Store
: >shown/.profile
test "$("$bin/example_names" shown | LC_ALL=C sort)" = ".profile
letter" || fail "other names are shown"
if "$bin/example_names" missing 2>said; then fail "a missing directory is shown"; fi
test "$(cat said)" = "missing: No such file or directory" || fail "said: $(cat said)"

# One of an earlier version's attribute files cannot be read into a stream: it stays.
mkdir @eaDir/old
: >old
printf blue >@eaDir/old/colour
test "$("$bin/example_upgrade" "$dir/old")" = "MavoEAStream: converted
MavoResource: nothing there" || fail "an attribute file is not converted"
test ! -e @eaDir/old || fail "the legacy folder is still there"
test "$("$bin/example_list" "$dir/old")" = colour || fail "the attribute has not arrived"
test "$("$bin/example_upgrade" "$dir/old")" = "MavoEAStream: current
MavoResource: nothing there" || fail "a stream is converted twice"
mkdir -p @eaDir/left/size
: >left
printf blue >@eaDir/left/colour
if "$bin/example_upgrade" "$dir/left" >said 2>message; then fail "what has stayed is not told"; fi
test "$(cat message)" = "$dir/left: MavoEAStream: Metadata could not be read, or is damaged" ||
    fail "said: $(cat message)"
test "$("$bin/example_list" "$dir/left")" = colour || fail "what could be read has not arrived"

# A record of one entry, the comment: at 38, 5 bytes. The block of a resource file has 741.
{
    printf '\000\005\026\007\000\002\000\000'
    head -c 16 /dev/zero
    printf '\000\001\000\000\000\004\000\000\000\046\000\000\000\005hello'
    head -c 698 /dev/zero
} >@eaDir/noted@MavoResource
test "$(wc -c <@eaDir/noted@MavoResource)" -eq 741
test "$("$bin/example_record" "$dir/noted")" = hello || fail "the comment is not shown"
test -z "$("$bin/example_record" "$dir/file")" || fail "an object without a record has a comment"
printf x | dd of=@eaDir/noted@MavoResource conv=notrunc status=none
if "$bin/example_record" "$dir/noted" 2>said; then fail "a damaged record is shown"; fi
test "$(cat said)" = "$dir/noted: Metadata could not be read, or is damaged" ||
    fail "said: $(cat said)"

# Not every file system has attributes.
if setfattr -n user.colour -v blue file 2>said; then
    test "$("$bin/example_xattr" "$dir/file" user.colour)" = blue || fail "the value is not shown"
    if "$bin/example_xattr" "$dir/file" user.size 2>said; then fail "no value is shown"; fi
    test "$(cat said)" = "$dir/file: user.size: No data available" || fail "said: $(cat said)"
fi
if "$bin/example_xattr" "$dir" com.apple.ResourceFork 2>said; then fail "a directory has a fork"; fi
test "$(cat said)" = "$dir: com.apple.ResourceFork: There is no resource fork" ||
    fail "said: $(cat said)"

# What could not be written out is a failure.
printf hello | dd of=@eaDir/noted@MavoResource conv=notrunc bs=1 seek=38 status=none
printf '\000' | dd of=@eaDir/noted@MavoResource conv=notrunc status=none
for shown in list:file paths:file names:shown record:noted upgrade:file finder_info_and_fork:file; do
    "$bin/example_${shown%:*}" "$dir/${shown#*:}" >said || fail "$shown ends with a failure"
    test -s said || fail "$shown says nothing"
    if "$bin/example_${shown%:*}" "$dir/${shown#*:}" >/dev/full 2>said; then
        fail "$shown does not look whether it could say it"
    fi
done

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
