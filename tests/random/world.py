"""Two volumes on real file systems: filling them, running the tool on them, and what they hold."""

import base64
import json
import os
import re
import shutil
import stat
import struct
import subprocess
import tempfile

TOKEN = re.compile(rb"<[a-z]+\d+>")
SECONDS = 20  # that a command may take before it counts as hanging


class Wrong(Exception):
    """Something that the tool has promised is not so."""


class Thing:
    """What lstat(2), the contents and the extended attributes tell of one name."""

    def __init__(self, path):
        status = os.lstat(path)
        self.mode, self.inode = status.st_mode, (status.st_dev, status.st_ino)
        self.owner = (status.st_uid, status.st_gid)
        self.modified, self.changed = status.st_mtime_ns, status.st_ctime_ns
        self.data = None
        if stat.S_ISREG(self.mode):
            with open(path, "rb") as file:
                self.data = file.read()
        elif stat.S_ISLNK(self.mode):
            self.data = os.readlink(path)
        try:
            self.attributes = {name: os.getxattr(path, name, follow_symlinks=False)
                               for name in os.listxattr(path, follow_symlinks=False)}
        except OSError:
            self.attributes = {}

    def is_directory(self):
        return stat.S_ISDIR(self.mode)

    def is_link(self):
        return stat.S_ISLNK(self.mode)


def is_below(path, root):
    return path == root or path.startswith(root + b"/")


def apple_double(attribute, fork):
    """As Macs write it, with one attribute."""
    name = b"com.mac.note\0"
    start = 120 + (11 + len(name) + 3) // 4 * 4
    record = struct.pack(">IIHB", start, len(attribute), 0, len(name)) + name
    record += bytes(start - 120 - len(record))
    total = start + len(attribute)
    head = struct.pack(">II16sH", 0x00051607, 0x00020000, b"Mac OS X        ", 2)
    head += struct.pack(">IIIIII", 9, 50, total - 50, 2, total, len(fork)) + bytes(32)
    head += struct.pack(">2x4s4xIII12xHH", b"ATTR", total, start, len(attribute), 0, 1)
    return head + record + attribute + fork


class World:
    def __init__(self, tool, disk):
        self.tool = tool
        self.places = {"disk": tempfile.mkdtemp(prefix="mavoea-random-", dir=disk).encode(),
                       "memory": tempfile.mkdtemp(prefix="mavoea-random-", dir="/dev/shm").encode()}
        self.roots, self.declared, self.history = {}, [], []

    def close(self):
        for place in self.places.values():
            shutil.rmtree(place, ignore_errors=True)

    # ---- Filling ----

    def fill(self, volumes, steps):
        for place in self.places.values():
            shutil.rmtree(place)
            os.mkdir(place)
        self.declared, self.history = [], []
        for name, volume in volumes.items():
            if volume.where == "below":
                self.roots[name] = self.roots["s"] + b"/below"
            else:
                self.roots[name] = self.places[volume.where] + b"/" + name.encode()
                self.declared += ["--volume", self.roots[name] + b"=" + volume.kind.encode()]
            os.mkdir(self.roots[name])
        for step in steps:
            try:
                self.put(step)
            except OSError:
                pass  # a name twice, a directory where a file is

    def path(self, volume, path):
        return self.roots[volume] + (b"/" + path if path else b"")

    def put(self, step):
        path = self.path(step.volume, step.path)
        if step.what in ("file", "mac", "directory", "link"):
            os.makedirs(os.path.dirname(path), exist_ok=True)
        match step.what, *step.args:
            case "directory", :
                os.mkdir(path)
            case "file", data:
                with open(path, "xb") as file:
                    file.write(data)
            case "mac", attribute, fork:
                with open(path, "xb") as file:
                    file.write(apple_double(attribute, fork))
            case "link", target:
                os.symlink(target, path)
            case "name", other:
                os.link(self.path(step.volume, other), path, follow_symlinks=False)
            case "pipe", :
                os.mkfifo(path)
            case "set", name, value:
                self.run("set", "--", path, name, given=value)
            case "set-info", *words:
                self.run("set-info", *words, "--", path)
            case "lock", :
                self.run("lock", "--", path)
            case "attribute", name, value:
                os.setxattr(path, name, value, follow_symlinks=False)
            case "mode", mode:
                if not os.path.islink(path):
                    os.chmod(path, mode)
            case "time", seconds:
                os.utime(path, (seconds, seconds), follow_symlinks=False)

    # ---- Running ----

    def run(self, *words, given=b""):
        """(status, output, errors)"""
        argv = [self.tool, *self.declared, *words]
        try:
            done = subprocess.run(argv, input=given, capture_output=True, timeout=SECONDS,
                                  check=False)
        except subprocess.TimeoutExpired as expired:
            raise Wrong(f"hangs: {words}") from expired
        if done.returncode < 0 or done.returncode > 2:
            raise Wrong(f"ends with {done.returncode}: {words}: {done.stderr[-400:]}")
        return done.returncode, done.stdout, done.stderr

    def separate(self):
        """The volumes that are no part of another."""
        return [self.roots["s"], *([] if is_below(self.roots["d"], self.roots["s"])
                                   else [self.roots["d"]])]

    # ---- What there is ----

    def things(self):
        """All names, metadata files among them, those beside the volumes as well."""
        found = {}
        for place in self.places.values():
            todo = [place]
            while todo:
                path = todo.pop()
                found[path] = Thing(path)
                if found[path].is_directory():
                    todo += [path + b"/" + name for name in os.listdir(path)]
        return found

    def metadata(self):
        """{path: {name: value}} of all objects, as the tool shows it."""
        found = {}
        for root in self.separate():
            for line in self.json("list", "-r", "-j", "1", "--json", "--values", root):
                if "attributes" in line:
                    found[path_of(line)] = {name_of(one): value_of(one)
                                            for one in line["attributes"] if "problem" not in one}
        return found

    def information(self):
        """{path: {what: value}} of what the tool shows of Finder info, comments and tags."""
        found = {}
        for root in self.separate():
            for line in self.json("show", "-r", "-j", "1", "--json", root):
                if "kind" in line:
                    shown = {key: line[key] for key in ("comment", "afpComment", "tags")
                             if key in line}
                    if "finderInfo" in line:
                        shown["finderInfo"] = line["finderInfo"]["hex"]
                    found[path_of(line)] = shown
        return found

    def json(self, *words):
        return [json.loads(line) for line in self.run(*words)[1].splitlines()]


def path_of(line):
    return bytes.fromhex(line["pathHex"]) if "pathHex" in line else os.fsencode(line["path"])


def name_of(attribute):
    if "nameHex" in attribute:
        return bytes.fromhex(attribute["nameHex"])
    return attribute["name"].encode()


def value_of(attribute):
    pieces = attribute.get("base64", "")
    pieces = [pieces] if isinstance(pieces, str) else pieces
    return b"".join(base64.b64decode(piece) for piece in pieces)
