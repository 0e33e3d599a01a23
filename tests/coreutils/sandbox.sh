#!/bin/sh
# sandbox.sh COMMANDS SOURCE TOOL WORK JOBS: runs the tests whose files standard input names, with
# Debian's commands if COMMANDS is gnu, otherwise with the tool, by a link or a script. run.sh
# starts it in a mount namespace of its own.
#
# The tests are root's, and so is what they find wrong: here nothing can be written to but the logs
# and what is made for the tests, and of the machine's disks none can be reached.
# The tests see under /mnt
#   source    coreutils' source
#   tool      the directory that holds the tool's bin and lib
#   commands  cp, mv and rm
#   scratch   where they work, on a file system with attributes, access control lists and holes
#   tests     these scripts
#   logs      what came of them
set -eu
commands=$1
source=$2
tool=$3
work=$4
jobs=$5
here=$(cd "$(dirname "$0")" && pwd)
stage=$work/stage

# What cannot be made read-only goes away.
mount --make-rprivate /
mounts=$(cat /proc/self/mountinfo)
echo "$mounts" | while read -r _ _ _ _ point _; do
    point=$(printf '%b' "$point")
    mount -o remount,bind,ro "$point" 2>/dev/null || umount -l "$point"
done

# Nothing in /dev leads to a disk, except the loop devices, which tests mount.
node() { # NAME TYPE MAJOR MINOR MODE
    mknod -m "$5" "/dev/$1" "$2" "$3" "$4"
}
mount -t tmpfs -o mode=755 dev /dev
node null c 1 3 666
node zero c 1 5 666
node full c 1 7 666
node random c 1 8 666
node urandom c 1 9 666
node tty c 5 0 666
node loop-control c 10 237 600
for number in $(seq 0 63); do node "loop$number" b 7 "$number" 600; done
ln -s /proc/self/fd /dev/fd
ln -s fd/0 /dev/stdin
ln -s fd/1 /dev/stdout
ln -s fd/2 /dev/stderr
ln -s pts/ptmx /dev/ptmx
mkdir /dev/pts /dev/shm # a test's own
mount -t devpts -o newinstance,ptmxmode=666,mode=620,gid=5 devpts /dev/pts
mount -t tmpfs -o mode=755 run /run # mount keeps a table there

mount -t tmpfs -o mode=755 stage "$stage"
mkdir "$stage/source" "$stage/tool" "$stage/commands" "$stage/scratch" "$stage/tests" "$stage/logs"
mount --bind "$source" "$stage/source"
mount --bind "$here" "$stage/tests"
mount --bind "$work/logs" "$stage/logs"
mount -o remount,bind,rw "$stage/logs"
image=/run/scratch.img
truncate -s 4G "$image"
mkfs.ext4 -q "$image"
mount -o loop "$image" "$stage/scratch"

case $commands in
    gnu) for name in cp mv rm; do ln -s "/bin/$name" "$stage/commands/$name"; done ;;
    *)
        mount --bind "$(dirname "$tool")/.." "$stage/tool"
        program=/mnt/tool/bin/${tool##*/}
        for name in cp mv rm; do
            case $commands in
                link) ln -s "$program" "$stage/commands/$name" ;;
                script)
                    # shellcheck disable=SC2016 # the arguments are the script's own
                    printf '#!/bin/sh\nexec %s %s "$@"\n' "$program" "$name" \
                        > "$stage/commands/$name"
                    chmod 755 "$stage/commands/$name"
                    ;;
            esac
        done
        ;;
esac

# What configure would have found out of Debian's system, as far as tests ask for it.
cat > "$stage/config.h" <<'END'
#define HAVE_CAP 1
#define HAVE_LINKAT 1
#define HAVE_OPENAT 1
#define HAVE_SELINUX_SELINUX_H 1
#define HAVE_UTIMENSAT 1
#define USE_ACL 1
#define USE_XATTR 1
/* #undef LINKAT_SYMLINK_NOTSUP */
END

# edited TEST EDIT: replaces a test by one that sed has edited so that it can be run here.
edited() {
    sed "$2" "$source/tests/$1" > "$stage/edited/${1##*/}"
    mount --bind "$stage/edited/${1##*/}" "$stage/source/tests/$1"
}
mkdir "$stage/edited"
# It watches rm in gdb, by lines of rm's source, as a second line of defence against "rm -r /".
edited rm/r-root.sh 's/^USE_GDB=1/USE_GDB=0/'
# It wants a file system without user attributes, and mounts ext2 with an option for that, which
# later kernels do not know. What has no user attributes now has none of root's for symbolic links
# either.
edited cp/cp-mv-enotsup-xattr.sh "
    s/^make_fs noxattr .*/mkdir noxattr \&\& mount -t ramfs ramfs noxattr || skip_ 'no ramfs'/
    s/^txattr=.*/txattr=no.such/"

mount --move "$stage" /mnt
mount -o remount,bind,ro /mnt
cd /
exec xargs -n 1 -P "$jobs" sh /mnt/tests/test.sh "$commands"
