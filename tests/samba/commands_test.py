#!/usr/bin/python3
"""Each command of the tool on trees of a share, of each type that lies in attributes: behind each
one smbd serves what it has served before, but for exactly what the command was to change.
"""

import base64
import copy
import json
import os
import types
import unittest

import private_smbd

if __name__ == "__main__":
    private_smbd.alone()

import tool_test
from layouts_test import FINDER_INFO, OTHER_FINDER_INFO, afp_info, mac_file
from mac_client import ARCHIVE, DIRECTORY, HIDDEN, READ_ONLY, SYSTEM
from tool_test import FINDER_INFO_NAME, FORK_NAME, LOCKED, TIME

MARKS = READ_ONLY | HIDDEN | SYSTEM | ARCHIVE

# The share that a tree of each type lies on, and what clients see there of what it keeps.
KINDS = {
    "samba": ("netatalk", "all"),
    "samba-stream": ("stream", "all"),
    "samba-all-streams": ("all-streams", "all"),
    "netatalk": ("netatalk", "Finder info and fork"),
    "linux": ("stream", "nothing"),
}
FORKS_BESIDE = ("samba", "samba-stream", "netatalk")

VALUES = {"com.example.colour": b"red", "a:b": b"\0colon\0", "long": b"v" * 300}


def setUpModule():
    tool_test.setUpModule()


def labelled(finder_info, number):
    return finder_info[:9] + bytes([finder_info[9] & ~0xE | number << 1]) + finder_info[10:]


class TreeTest(tool_test.ToolTest):
    """`self.model` has what each object below `self.root` is to have, by its path there."""

    def open_tree(self, kind):
        self.kind = kind
        share, self.visible = KINDS[kind]
        self.open(share)
        self.root_name = f"{self.name}-{kind}"
        self.root = os.path.join(self.folder, self.root_name)
        self.mac.mkdir(self.root_name)
        self.model = {}
        for name in ("a", "dir", "dir/b", "dir/sub", "dir/sub/c"):
            self.add(name)
        self.add("plain", filled=False)

    def add(self, name, filled=True):
        """An object that a client has made, and has filled where it can."""
        self.at(name)
        is_file = os.path.basename(name) not in ("dir", "sub")
        if is_file:
            self.mac.write(self.name, name.encode())
        else:
            self.mac.mkdir(self.name)
        values = {}
        if filled:
            values = VALUES | {FINDER_INFO_NAME: FINDER_INFO}
            if is_file:
                values[FORK_NAME] = b"the fork of " + name.encode()
            by_client = self.streams(values)
            for stream, value in by_client.items():
                self.write(stream, value)
            for one, value in values.items():
                if self.stream_of(one) not in by_client:
                    self.set(one, value)
        self.mac.set_attributes(self.name, ARCHIVE | (HIDDEN if filled else 0), TIME)
        attributes, created, _, data = self.client_s()
        self.model[name] = types.SimpleNamespace(
            values=values, marks=attributes & MARKS, created=created, data=data,
            is_file=is_file, locked=False, had_fork=False,
        )  # fmt: skip

    def at(self, name):
        """Further on it is about that object."""
        self.name = os.path.join(self.root_name, name)
        self.path = os.path.join(self.folder, self.name)
        self.double = os.path.join(os.path.dirname(self.path), f"._{os.path.basename(name)}")

    def start(self, *arguments, value=b""):
        return super().start(f"--volume={self.root}={self.kind}", *arguments, value=value)

    def stream_of(self, name):
        known = {FINDER_INFO_NAME: "AFP_AfpInfo", FORK_NAME: "AFP_Resource"}
        return known.get(name, name.replace(":", "\uf022"))

    def streams(self, values):
        """What clients see of such values."""
        if self.visible == "nothing":
            return {}
        seen = {}
        for name, value in values.items():
            if self.visible == "all" or name in (FINDER_INFO_NAME, FORK_NAME):
                is_info = name == FINDER_INFO_NAME
                seen[self.stream_of(name)] = afp_info(value) if is_info else value
        return seen

    def expect(self, after=None):
        """Names, what clients see of each object, and what the tool says of it."""
        names = {*self.model}
        if self.kind in FORKS_BESIDE:
            for name, one in self.model.items():
                if FORK_NAME in one.values or one.had_fork:
                    names.add(os.path.join(os.path.dirname(name), f"._{os.path.basename(name)}"))
        found = {
            os.path.relpath(os.path.join(directory, name), self.root)
            for directory, directories, files in os.walk(self.root)
            for name in (*directories, *files)
        }
        self.assertEqual(names, found, after)
        for name, one in self.model.items():
            self.at(name)
            attributes, created, streams, data = self.client_s()
            self.assertEqual(
                (name, one.marks, one.is_file, one.created, self.streams(one.values), one.data),
                (name, attributes & MARKS, not attributes & DIRECTORY, created, streams, data),
                after,
            )
        listed = self.start("list", "--json", "-l", "-r", "--values", self.root)
        self.assertEqual((0, b""), (listed.returncode, listed.stderr), after)
        told = {}
        for line in listed.stdout.splitlines():
            entry = json.loads(line)
            name = os.path.relpath(entry["path"], self.root)
            told[name] = {a["name"]: base64.b64decode(a["base64"]) for a in entry["attributes"]}
        wanted = {name: dict(one.values) for name, one in self.model.items()}
        for name, one in self.model.items():
            if one.locked:
                wanted[name][LOCKED] = b"1"
        self.assertEqual({**wanted, ".": {}}, told, after)

    def on_disk(self):
        """Names, bytes, modes, owners, attributes and times, without those of access."""
        found = {}
        for directory, directories, files in os.walk(self.root):
            for name in (*directories, *files):
                path = os.path.join(directory, name)
                status = os.lstat(path)
                data = None
                if name in files:
                    with open(path, "rb") as file:
                        data = file.read()
                found[path] = (
                    data, status.st_mode, status.st_uid, status.st_gid, status.st_mtime_ns,
                    status.st_ctime_ns, {one: os.getxattr(path, one) for one in os.listxattr(path)},
                )  # fmt: skip
        return found

    def copied(self, source, target):
        """A tree's models once more."""
        for name, one in list(self.model.items()):
            if name == source or name.startswith(source + "/"):
                self.model[target + name.removeprefix(source)] = copied = copy.deepcopy(one)
                copied.had_fork = False

    def gone(self, source):
        for name in list(self.model):
            if name == source or name.startswith(source + "/"):
                del self.model[name]

    def in_root(self, name):
        return os.path.join(self.root, name)


def on_each_kind(test):
    def on_all(self):
        for kind in KINDS:
            with self.subTest(kind):
                self.open_tree(kind)
                self.expect()
                test(self)

    return on_all


class LookingTest(TreeTest):
    @on_each_kind
    def test_looking_changes_nothing(self):
        a, plain, away = self.in_root("a"), self.in_root("plain"), f"{self.root}-away"
        os.mkdir(away)
        beside = self.kind in FORKS_BESIDE
        keeps_records = self.kind in ("samba", "netatalk")
        for status, *command in (
            (0, "where", a),
            (0, "where", "--json", self.root),
            (0, "list", "-l", a, plain),
            (0, "list", "-r0", self.root),
            (0, "list", "--json", "-r", "--values", self.root),
            (0, "show", a),
            (0, "show", "-r", self.root),
            (0, "get", a, "com.example.colour"),
            (0, "get", a, FINDER_INFO_NAME),
            (0, "get", a, FORK_NAME),
            (0, "get", a, LOCKED),
            (1, "get", plain, FINDER_INFO_NAME),
            (0, "check", a),
            (0, "check", "-r", self.root),
            (0, "save", a),
            (0, "save", "-r", self.root),
            (0, "diff", a, a),
            (1, "diff", a, plain),
            (1, "diff", "-r", "--data", self.in_root("dir"), self.in_root("dir/sub")),
            (0, "clean", "-r", "--wait", "0", self.root),
            (0 if keeps_records else 1, "dump", "--record", a),
            (0, "dump", "--attributes", a),
            *([(0, "dump", self.in_root("._a"))] if beside else []),
            (2, "export", a, f"{away}/adf"),  # no format has a place for marks
            (2, "export", "--format", "applesingle", a, f"{away}/as"),
            (2, "export", "--format", "macbinary", a, f"{away}/bin"),
            (2, "export", "--format", "binhex", a, f"{away}/hqx"),
            (0, "salvage", a, f"{away}/salvaged"),
            (2, "upgrade", "-r", self.root),  # there is no EA directory
            (2, "repair", "-r", self.root),
            (0, "import", "-r", self.root),  # and no Mac's file
            (0, "unlock", "-r", self.root),  # and nothing locked
            (0, f"--volume={away}=eadir", "cp", "-r", self.root, f"{away}/tree"),
            (0, f"--volume={away}=linux",
             "convert", "-r", "--to", "linux", self.root, f"{away}/converted"),
            (0, f"--volume={away}/tree=eadir", "diff", "-r", self.root, f"{away}/tree"),
            (0, f"--volume={away}/tree=eadir", "carry", "-r", self.root, f"{away}/tree"),
        ):  # fmt: skip
            with self.subTest(command[0] if command[0][:2] != "--" else command[1]):
                before = self.on_disk()
                result = self.start(*command)
                self.assertEqual(status, result.returncode, (command, result))
                self.assertEqual(before, self.on_disk())
                self.expect()


class ChangingTest(TreeTest):
    """Steps that go on with what the one before has left."""

    def test_of_each_kind(self):
        for kind in KINDS:
            with self.subTest(kind):
                self.open_tree(kind)
                self.expect()
                for step in STEPS:
                    step(self)
                    self.expect(step.__name__)

    def run_on(self, command, *names, more=(), value=b""):
        self.tool(command, *(self.in_root(name) for name in names), *more, value=value)

    def lock_of(self, *names, locked):
        """Clients see the one that is theirs."""
        for name in names:
            one = self.model[name]
            one.locked = locked
            if self.kind.startswith("samba"):
                one.marks = one.marks & ~READ_ONLY | (READ_ONLY if locked else 0)

    def set_values(self):
        for name, value in (
            ("com.example.colour", b"blue"),
            ("new", b"attribute"),
            (FINDER_INFO_NAME, OTHER_FINDER_INFO),
            (FORK_NAME, b"another fork"),
        ):
            self.run_on("set", "a", more=(name,), value=value)
            self.model["a"].values[name] = value

    def set_on_directory(self):
        self.run_on("set", "dir", more=("new",), value=b"value")
        self.model["dir"].values["new"] = b"value"

    def set_what_was_not_there(self):
        self.run_on("set", "plain", more=("a:b",), value=b"first")
        self.model["plain"].values["a:b"] = b"first"

    def set_info(self):
        self.run_on("set-info", "a", "dir", more=("--label", "red"))
        for name in ("a", "dir"):
            values = self.model[name].values
            values[FINDER_INFO_NAME] = labelled(values[FINDER_INFO_NAME], 6)

    def set_time_of_creation(self):
        if self.kind in ("netatalk", "linux"):
            return  # which is the record's there
        self.run_on("set-info", "a", more=("--created", "2001-02-03T04:05:06Z"))
        self.model["a"].created = 126256467060000000

    def remove(self):
        self.run_on("remove", "a", more=("long",))
        self.run_on("remove", "dir", more=(FINDER_INFO_NAME,))
        self.run_on("remove", "dir/b", more=(FORK_NAME,))
        for name, item in (("a", "long"), ("dir", FINDER_INFO_NAME), ("dir/b", FORK_NAME)):
            del self.model[name].values[item]
        self.model["dir/b"].had_fork = True  # smbd, too, leaves the file

    def lock(self):
        self.run_on("lock", "dir/b")
        self.lock_of("dir/b", locked=True)

    def unlock(self):
        self.run_on("unlock", "dir/b")
        self.lock_of("dir/b", locked=False)

    def lock_tree(self):
        self.run_on("lock", "dir", more=("-r",))
        self.lock_of("dir", "dir/b", "dir/sub", "dir/sub/c", locked=True)

    def unlock_tree(self):
        self.run_on("unlock", "dir", more=("-r",))
        self.lock_of("dir", "dir/b", "dir/sub", "dir/sub/c", locked=False)

    def restore_what_was_saved(self):
        text = self.tool("save", "-r", "--absolute-names", self.root)
        self.tool("restore", "--absolute-names", value=text)

    def restore_after_changes(self):
        text = self.tool("save", "-r", "--absolute-names", self.in_root("dir"))
        for name in ("com.example.colour", FINDER_INFO_NAME):
            self.run_on("remove", "dir/b", more=(name,))
        self.run_on("set", "dir/sub/c", more=("a:b",), value=b"lost")
        self.tool("restore", "--absolute-names", value=text)

    def import_file(self):
        archive = f"{self.root}.adf"
        with open(archive, "wb") as file:
            file.write(mac_file({"imported": b"value", "a:b": b"imported"}, b"its fork"))
        self.tool("import", archive, self.in_root("a"))
        self.model["a"].values |= {
            "imported": b"value", "a:b": b"imported",
            FINDER_INFO_NAME: FINDER_INFO, FORK_NAME: b"its fork",
        }  # fmt: skip

    def import_tree(self):
        """What Macs have left of a file and of a directory."""
        for directory, name in (("", "plain"), ("dir", "sub")):
            with open(self.in_root(os.path.join(directory, f"._{name}")), "wb") as file:
                file.write(mac_file({"imported": b"value"}, b""))
            path = os.path.join(directory, name)
            self.model[path].values |= {"imported": b"value", FINDER_INFO_NAME: FINDER_INFO}
        self.tool("import", "-r", self.root)

    def copy(self):
        self.tool("cp", "-p", self.in_root("a"), self.in_root("copy"))
        self.copied("a", "copy")

    def copy_tree(self):
        self.tool("cp", "-rp", self.in_root("dir"), self.in_root("tree"))
        self.copied("dir", "tree")

    def copy_over(self):
        self.tool("cp", "-p", self.in_root("dir/b"), self.in_root("copy"))
        self.copied("dir/b", "copy")

    def move(self):
        self.tool("mv", self.in_root("copy"), self.in_root("moved"))
        self.copied("copy", "moved")
        self.gone("copy")

    def move_over(self):
        self.tool("mv", self.in_root("tree/b"), self.in_root("moved"))
        self.copied("tree/b", "moved")
        self.gone("tree/b")

    def move_tree(self):
        self.tool("mv", self.in_root("tree"), self.in_root("dir/tree"))
        self.copied("tree", "dir/tree")
        self.gone("tree")

    def carry(self):
        self.tool("carry", self.in_root("a"), self.in_root("moved"))
        data = self.model["moved"].data
        self.copied("a", "moved")
        self.model["moved"].data = data

    def carry_tree(self):
        self.run_on("remove", "dir/tree/sub/c", more=("long",))
        self.tool("carry", "-r", self.in_root("dir/sub"), self.in_root("dir/tree/sub"))
        self.copied("dir/sub", "dir/tree/sub")

    def convert_tree(self):
        self.tool(
            "convert", "-r", "--to", self.kind, self.in_root("dir"), self.in_root("converted")
        )
        self.copied("dir", "converted")

    def clean(self):
        os.rename(self.in_root("moved"), self.in_root("away"))
        self.tool("clean", "-r", "--yes", "--wait", "0", self.root)
        os.rename(self.in_root("away"), self.in_root("moved"))
        if self.kind in FORKS_BESIDE:
            self.model["moved"].values.pop(FORK_NAME, None)

    def remove_file(self):
        self.tool("rm", self.in_root("moved"))
        self.gone("moved")

    def remove_tree(self):
        self.tool("rm", "-r", self.in_root("converted"), self.in_root("dir/tree"))
        self.gone("converted")
        self.gone("dir/tree")


STEPS = (
    ChangingTest.set_values,
    ChangingTest.set_on_directory,
    ChangingTest.set_what_was_not_there,
    ChangingTest.set_info,
    ChangingTest.set_time_of_creation,
    ChangingTest.remove,
    ChangingTest.lock,
    ChangingTest.unlock,
    ChangingTest.lock_tree,
    ChangingTest.unlock_tree,
    ChangingTest.restore_what_was_saved,
    ChangingTest.restore_after_changes,
    ChangingTest.import_file,
    ChangingTest.import_tree,
    ChangingTest.copy,
    ChangingTest.copy_tree,
    ChangingTest.copy_over,
    ChangingTest.move,
    ChangingTest.move_over,
    ChangingTest.move_tree,
    ChangingTest.carry,
    ChangingTest.carry_tree,
    ChangingTest.convert_tree,
    ChangingTest.clean,
    ChangingTest.remove_file,
    ChangingTest.remove_tree,
)


if __name__ == "__main__":
    unittest.main()
