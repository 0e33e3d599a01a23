#!/usr/bin/env python3
"""What the tool's work on many small files costs beside the same work done with plain files.

Objects with two attributes, Finder info and, every tenth, a resource fork are copied, moved and
converted between each pair of kinds of volumes, on ext4 and on tmpfs; with attributes only where
those file systems have no place for the rest. Beside each run stands one of
`cp -a`, which takes the same objects and what lies beside them for plain files. The two take turns,
so that whatever else the machine does hits both, and the table has the ratio of their medians.

`list -r` stands beside what reads the same files: find alone asks the kernel nothing of an object.
Of files without metadata it stands beside a find that asks for their sizes.
What Samba keeps of them is listed beside `getfattr -R`, and converted beside `cp -a` with attributes.

All of mavoea cp, mv and convert have written to disk what they carried before they end, so
`cp -a` is followed by `sync -f`; and where the tool moves, by `rm -r` of the source.

Runs as the superuser: the file systems are mounted where no other process sees them.
"""

import argparse
import os
import re
import shutil
import statistics
import struct
import subprocess
import sys
import tempfile
import time

KINDS = {0: '"._" files', 1: "EA directory", 2: "file EA", 7: "extended attributes"}
SAMBA = "samba"  # whose metadata is compared with what copies and reads attributes
PLAIN = 7  # where ext4 and tmpfs take attributes with names of "user." only, and no forks
PER_DIRECTORY = 100
FILE_SYSTEMS = ("ext4", "tmpfs")


# ---- Objects ------------------------------------------------------------------------------------

FINDER_INFO = b"TEXTttxt" + bytes(24)
ATTRIBUTES = [(b"user.example.colour", b"blue as the sky"), (b"user.example.origin", b"camera 1")]
FORK = bytes(range(256)) * 8


def apple_double(attributes, finder_info, fork):
    """An AppleDouble file of version 2; with attributes, those follow the Finder info."""
    at = 120 if attributes else 82
    table, values = b"", b""
    start = at + sum((11 + len(name) + 1 + 3) // 4 * 4 for name, _ in attributes)
    for name, value in attributes:
        record = struct.pack(">IIHB", start + len(values), len(value), 0, len(name) + 1)
        record += name + b"\0"
        table += record + bytes(-len(record) % 4)
        values += value
    total = start + len(values)
    head = struct.pack(">II16sH", 0x00051607, 0x00020000, b"Mac OS X        ", 2)
    head += struct.pack(">III", 9, 50, total - 50 if attributes else 32)
    head += struct.pack(">III", 2, total, len(fork)) + finder_info
    if attributes:
        head += struct.pack(">2x4s4xIII12xHH", b"ATTR", total, start, len(values), 0,
                            len(attributes))
    return head + table + values + fork


def make_tree(path, count, mac):
    """On a volume that keeps an EA directory; with Finder info and forks, or with neither."""
    stream = apple_double(ATTRIBUTES, bytes(32), b"")
    for first in range(0, count, PER_DIRECTORY):
        directory = f"{path}/d{first:06}"
        os.makedirs(f"{directory}/@eaDir")
        for i in range(first, min(first + PER_DIRECTORY, count)):
            write(f"{directory}/object {i}", f"contents of object {i}\n".encode() * 4)
            beside = f"{directory}/@eaDir/object {i}"
            write(f"{beside}@MavoEAStream", stream)
            if mac:
                fork = FORK if i % 10 == 0 else b""
                write(f"{beside}@MavoResource", apple_double([], FINDER_INFO, fork))


def write(path, contents):
    with open(path, "wb") as file:
        file.write(contents)


# ---- Volumes ------------------------------------------------------------------------------------

class Volumes:
    """Two file systems of each kind, and the same objects on the first as every kind keeps them."""

    def __init__(self, tool, room, count):
        self.tool = tool
        self.room = room
        self.count = count
        files = 40 * count + 10000
        for name in FILE_SYSTEMS:
            for which in "ab":
                point = f"{room}/{name}-{which}"
                os.mkdir(point)
                if name == "tmpfs":
                    run("mount", "-t", "tmpfs", "-o", "size=80%,nr_inodes=0", "tmpfs", point)
                else:
                    image = f"{room}/{which}.img"
                    with open(image, "wb") as file:
                        file.truncate(files * 6144 + (1 << 29))
                    run("mkfs.ext4", "-q", "-F", "-N", str(files), image)
                    run("mount", "-o", "loop", image, point)

    def path(self, file_system, which="a"):
        return f"{self.room}/{file_system}-{which}"

    def tree(self, file_system, kind, mac):
        """The objects as volumes of that kind keep them; made when they are first asked for."""
        name = f"kind{kind}" if mac else f"kind{kind}-plain"
        path = f"{self.path(file_system)}/{name}"
        if os.path.exists(path):
            return path
        if kind == 1:
            make_tree(path, self.count, mac)
        else:
            source = self.tree(file_system, 1, mac)
            run(*self.convert(source, 1, path, kind))
        run("sync", "-f", path)
        return path

    def bare_tree(self, file_system):
        """The same objects without metadata."""
        path = f"{self.path(file_system)}/bare"
        if not os.path.exists(path):
            for i in range(self.count):
                directory = f"{path}/d{i // PER_DIRECTORY:06}"
                os.makedirs(directory, exist_ok=True)
                write(f"{directory}/object {i}", f"contents of object {i}\n".encode() * 4)
            run("sync", "-f", path)
        return path

    def command(self, *volumes):
        """The tool on volumes of these kinds: pairs of a path and a kind."""
        options = [part for path, kind in volumes for part in ("--volume", f"{path}={kind}")]
        return [self.tool, *options]

    def convert(self, source, kind, target, to):
        return self.command((source, kind)) + ["convert", "-r", "--to", str(to), source, target]


def run(*command):
    """What it says goes nowhere, unless it fails."""
    result = subprocess.run(command, stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, check=False)
    if result.returncode != 0:
        said = result.stderr.decode()[:1000]
        sys.exit(f"{' '.join(command)}: status {result.returncode}\n{said}")


def seconds(*commands):
    """How long the commands take, one after the other."""
    begin = time.perf_counter()
    for command in commands:
        run(*command)
    return time.perf_counter() - begin


def calls(*commands):
    """How many system calls the commands make."""
    total = 0
    for command in commands:
        with tempfile.NamedTemporaryFile("rb") as trace:
            # Not -c: some versions cannot count calls that they do not know.
            strace = ["strace", "-f", "-qq", "-e", "signal=none", "-o", trace.name, *command]
            subprocess.run(strace, stdout=subprocess.DEVNULL, check=True)
            total += sum(b"resumed>" not in line for line in trace)
    return total


def peak(command):
    """The most memory that the command has at a time, in KiB.

    Looked at while it runs: what the kernel says at its end has this program's in it, from before
    the command began.
    """
    most = 0
    with subprocess.Popen(command, stdout=subprocess.DEVNULL) as process:
        while process.poll() is None:
            with open(f"/proc/{process.pid}/status", encoding="utf-8") as status:
                found = re.search(r"VmHWM:\s+(\d+)", status.read())
            most = int(found[1]) if found else most
            time.sleep(0.001)
    if process.returncode != 0:
        sys.exit(f"{' '.join(command)}: status {process.returncode}")
    return most


# ---- Work ---------------------------------------------------------------------------------------

class Work:
    """A command of the tool, and what it is compared with, on fresh copies of a tree."""

    def __init__(self, name, kinds, trees, ours, theirs):
        self.name = name
        self.kinds = kinds
        self.trees = trees    # (file system, volumes) -> the source, which stays as it is
        self.ours = ours      # (volumes, file system, source, target) -> a list of commands
        self.theirs = theirs

    # What is removed, or moved, is a copy.
    takes_source = False

    def prepare(self, volumes, file_system):
        source = self.trees(volumes, file_system)
        if self.takes_source:
            copy = f"{volumes.path(file_system)}/copy"
            shutil.rmtree(copy, ignore_errors=True)
            run("cp", "-a", source, copy)
            source = copy
        target = f"{volumes.path(file_system, 'b' if self.name == 'mv' else 'a')}/target"
        shutil.rmtree(target, ignore_errors=True)
        run("sync", "-f", source)
        run("sync", "-f", os.path.dirname(target))
        return source, target

    def measure(self, volumes, file_system, how):
        """`how` of our commands and of theirs."""
        return [how(*commands(volumes, *self.prepare(volumes, file_system)))
                for commands in (self.ours, self.theirs)]

    def ratio(self, volumes, file_system, rounds):
        times = [self.measure(volumes, file_system, seconds) for _ in range(rounds)]
        ours, theirs = (statistics.median(column) for column in zip(*times))
        return ours / theirs, ours, theirs


class Taking(Work):
    takes_source = True


def carrying(kind, to):
    """The work between volumes of these kinds."""
    mac = PLAIN not in (kind, to)
    kinds = f"{kind} to {to}"

    def source(volumes, file_system):
        return volumes.tree(file_system, kind, mac)

    def ours(name):
        def commands(volumes, tree, target):
            options = ["cp", "-r"] if name == "cp -r" else ["mv"]
            return [volumes.command((tree, kind), (os.path.dirname(target), to)) +
                    [*options, "-T", tree, target]]
        return commands

    def copy(volumes, tree, target):
        return [["cp", "-a", tree, target], ["sync", "-f", target]]

    def move(volumes, tree, target):
        return [*copy(volumes, tree, target), ["rm", "-r", tree]]

    def convert(volumes, tree, target):
        return [volumes.convert(tree, kind, target, to)]

    yield Work("cp -r", kinds, source, ours("cp -r"), copy)
    yield Taking("mv", kinds, source, ours("mv"), move)
    yield Work("convert", kinds, source, convert, copy)


def looking(kind):
    """The work on one volume of that kind."""
    def source(volumes, file_system):
        return volumes.tree(file_system, kind, kind != PLAIN)

    def ours(*command):
        return lambda volumes, tree, target: [[*volumes.command((tree, kind)), *command, tree]]

    def theirs(*command, tests=()):
        return lambda volumes, tree, target: [[*command, tree, *tests]]

    def reading(volumes, tree, target):
        if kind == PLAIN:
            return [["getfattr", "-R", "-d", "-m", "-", tree]]
        names = ["(", "-path", "*/@eaDir/*", "-o", "-name", "._*", ")"]
        return [["find", tree, *names, "-type", "f", "-exec", "cat", "{}", "+"]]

    def bare(volumes, file_system):
        return volumes.bare_tree(file_system)

    yield Work("list -r", str(kind), source, ours("list", "-r"), reading)
    if kind in (0, 1):
        yield Work("list -r", f"{kind} bare", bare, ours("list", "-r"),
                   theirs("find", tests=("-size", "+1G")))
    yield Taking("rm -r", str(kind), source, ours("rm", "-r"), theirs("rm", "-r"))
    if kind == 1:
        yield Work("upgrade -r", str(kind), source, ours("upgrade", "-r"), theirs("find"))


def sharing():
    """The work on a share of Samba's: nearly all of it is in attributes of the objects."""
    def source(volumes, file_system):
        return volumes.tree(file_system, SAMBA, True)

    def listing(volumes, tree, target):
        return [[*volumes.command((tree, SAMBA)), "list", "-r", tree]]

    def reading(volumes, tree, target):
        return [["getfattr", "-R", "-d", "-m", "-", tree]]

    def convert(volumes, tree, target):
        return [volumes.convert(tree, SAMBA, target, SAMBA)]

    def copy(volumes, tree, target):
        return [["cp", "-a", "--preserve=xattr", tree, target], ["sync", "-f", target]]

    yield Work("list -r", SAMBA, source, listing, reading)
    yield Work("convert", f"{SAMBA} to {SAMBA}", source, convert, copy)


def all_work():
    for kind in KINDS:
        for to in KINDS:
            yield from carrying(kind, to)
    for kind in KINDS:
        yield from looking(kind)
    yield from sharing()


# ---- The table ----------------------------------------------------------------------------------

def print_row(cells):
    print("  ".join(cell.ljust(width) for cell, width in zip(cells, (12, 8, 22, 22, 20))).rstrip(),
          flush=True)


def print_result(work, ratios, counts):
    """One line of the table for who measures: ratios, and the seconds that they are of."""
    cells = [f"{ratio:5.2f} ({ours:.3f} / {theirs:.3f} s)" for ratio, ours, theirs in ratios]
    print_row([work.name, work.kinds, *cells, "{:.0f} / {:.0f}".format(*counts) if counts else ""])


def print_markdown(results):
    """The table for docs/speed.md: a row for each kind that is copied from, or looked at."""
    columns = [*KINDS, SAMBA]
    print("| Command, kind | " + " | ".join(f"to {to}" for to in columns) + " |")
    print("|---" * (len(columns) + 1) + "|")
    rows = {}
    for work, ratios, _ in results:
        kind, _, to = work.kinds.partition(" to ")
        cell = " / ".join(f"{ratio:.1f}" for ratio, _, _ in ratios)
        rows.setdefault((work.name, kind), {})[to or kind.split()[0]] = cell
    for (name, kind), cells in sorted(rows.items(), key=lambda row: row[0][0]):
        row = [cells.get(str(to), "") for to in columns]
        print(f"| `{name}`, {kind} | " + " | ".join(row) + " |")


def calls_an_object(work, few, many):
    """By the difference between two trees: what a process and a directory take is left out."""
    less = work.measure(few, "tmpfs", calls)
    more = work.measure(many, "tmpfs", calls)
    return [(b - a) / (many.count - few.count) for a, b in zip(less, more)]


def compare(options, room):
    full = Volumes(options.tool, make_room(room, "full"), options.objects)
    few = Volumes(options.tool, make_room(room, "few"), PER_DIRECTORY)
    many = Volumes(options.tool, make_room(room, "many"), 2 * PER_DIRECTORY)
    results = []
    if not options.markdown:
        print_row(["command", "kinds", "ext4", "tmpfs", "system calls an object"])
    for work in all_work():
        if not re.search(options.only, f"{work.name} {work.kinds}"):
            continue
        ratios = [work.ratio(full, name, options.rounds) for name in FILE_SYSTEMS]
        counts = calls_an_object(work, few, many) if has_strace() else None
        results.append((work, ratios, counts))
        if not options.markdown:
            print_result(*results[-1])
    if options.markdown:
        print_markdown(results)


def has_strace():
    return shutil.which("strace") is not None


def compare_growth(options, room):
    print("\nMost memory, in MiB, and microseconds an object, of {0:,} and of {1:,} objects".format(
        options.objects, 10 * options.objects))
    wanted = ("cp -r 1 to 1", "convert 1 to 0", "list -r 1", "rm -r 1", "upgrade -r 1")
    rows = {}
    for count in (options.objects, 10 * options.objects):
        volumes = Volumes(options.tool, make_room(room, f"memory{count}"), count)
        for work in all_work():
            name = f"{work.name} {work.kinds}"
            if name not in wanted:
                continue
            [command] = work.ours(volumes, *work.prepare(volumes, "tmpfs"))
            began = time.perf_counter()
            memory = peak(command) / 1024
            took = (time.perf_counter() - began) / count * 1e6
            rows.setdefault(name, []).append((memory, took))
        for name in FILE_SYSTEMS:
            for which in "ab":
                run("umount", volumes.path(name, which))
    for name, values in rows.items():
        memory, took = zip(*values)
        print(name.ljust(20) + "".join(f"{value:8.1f}" for value in memory)
              + "".join(f"{value:8.0f}" for value in took))


def spawned(command):
    """How long a process takes that is started with as little ado as can be."""
    begin = time.perf_counter()
    nowhere = [(os.POSIX_SPAWN_OPEN, 1, "/dev/null", os.O_WRONLY, 0)]
    process = os.posix_spawnp(command[0], command, os.environ, file_actions=nowhere)
    _, status = os.waitpid(process, 0)
    if status != 0:
        sys.exit(f"{' '.join(command)}: status {os.waitstatus_to_exitcode(status)}")
    return time.perf_counter() - begin


def compare_start(options, room):
    """One small thing asked of one file: starting is most of that."""
    volumes = Volumes(options.tool, make_room(room, "start"), 1)
    path = volumes.path("ext4") + "/letter"
    write(path, b"")
    os.setxattr(path, "user.colour", b"blue")
    getfattr = ["getfattr", "--absolute-names"]
    pairs = {"list": [*getfattr, path], "get": [*getfattr, "-n", "user.colour", path]}
    for name, theirs in pairs.items():
        ours = [*volumes.command((volumes.path("ext4"), PLAIN)), name, path]
        if name == "get":
            ours.append("user.colour")
        times = [(spawned(ours), spawned(theirs)) for _ in range(100 * options.rounds)]
        mine, others = (statistics.median(column) for column in zip(*times))
        print(f"{name.ljust(5)} {mine / others:5.2f} ({mine * 1e6:.0f} / {others * 1e6:.0f} us)")


def compare_jobs(options, room):
    """The same trees, looked at and converted by one process and by two."""
    volumes = Volumes(options.tool, make_room(room, "jobs"), 2 * options.objects)
    for kind in (*KINDS, SAMBA):
        for file_system in FILE_SYSTEMS:
            tree = volumes.tree(file_system, kind, kind != PLAIN)
            command = volumes.command((tree, kind))
            target = f"{volumes.path(file_system, 'b')}/made"
            convert = ["convert", "-r", "--to", str(kind), tree, target]
            for work in (["check", "-r", tree], ["list", "-r", tree], convert):
                times = [[by_jobs(command, work, jobs, target) for jobs in "12"]
                         for _ in range(2 * options.rounds)]
                one, two = (statistics.median(column) for column in zip(*times))
                print(f"{work[0].ljust(7)} {str(kind).ljust(5)} {file_system.ljust(5)}"
                      f" {two / one:5.2f} ({two:.2f} / {one:.2f} s)")


def by_jobs(command, work, jobs, target):
    """How long so many processes take for the work; what it makes is removed."""
    took = seconds([*command, work[0], "-j", jobs, *work[1:]])
    if os.path.exists(target):
        shutil.rmtree(target)
        run("sync", "-f", os.path.dirname(target))
    return took


def make_room(room, name):
    path = f"{room}/{name}"
    os.mkdir(path)
    return path


def main():
    here = os.path.dirname(os.path.abspath(__file__))
    parser = argparse.ArgumentParser(description=__doc__,
                                     formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--objects", type=int, default=10000, metavar="N")
    parser.add_argument("--rounds", type=int, default=3, metavar="N")
    parser.add_argument("--quick", action="store_true", help="1,000 objects, one round")
    parser.add_argument("--only", default="", metavar="PATTERN",
                        help='rows such as "cp -r 1 to 0", "list -r 7"')
    parser.add_argument("--growth", action="store_true",
                        help="what ten times as many objects take, instead")
    parser.add_argument("--start", action="store_true", help="the tool's start, instead")
    parser.add_argument("--jobs", action="store_true", help="two processes beside one, instead")
    parser.add_argument("--markdown", action="store_true", help="print the table for docs/speed.md")
    parser.add_argument("--tool", default=f"{here}/../build/release/bin/mavoea", metavar="FILE")
    options = parser.parse_args()
    options.tool = os.path.abspath(options.tool)
    if options.quick:
        options.objects, options.rounds = 1000, 1
    if os.environ.get("MAVOEA_BENCH_ALONE") is None:
        os.environ["MAVOEA_BENCH_ALONE"] = "1"
        os.execvp("unshare", ["unshare", "-m", sys.executable, *sys.argv])
    room = tempfile.mkdtemp(prefix="mavoea-bench-")
    try:
        measure = (compare_growth if options.growth else compare_start if options.start
                   else compare_jobs if options.jobs else compare)
        measure(options, room)
    finally:
        subprocess.run(["umount", "-q", "-R", room], stderr=subprocess.DEVNULL, check=False)
        for point, _, _ in os.walk(room, topdown=False):
            subprocess.run(["umount", "-q", point], stderr=subprocess.DEVNULL, check=False)
        shutil.rmtree(room, ignore_errors=True)


if __name__ == "__main__":
    main()
