#!/usr/bin/python3
"""The tool on the shares of a real smbd: it reads what clients have written, clients find what it
writes, and whatever it does with an object leaves to clients what they had.
"""

import json
import os
import plistlib
import subprocess
import unittest

import private_smbd

if __name__ == "__main__":
    private_smbd.alone()

import layouts_test
from layouts_test import (
    AFP_INFO,
    AFP_RESOURCE,
    FINDER_INFO,
    OTHER_FINDER_INFO,
    RECORD,
    afp_info,
    mac_file,
)
from mac_client import ARCHIVE, DIRECTORY, HIDDEN, NORMAL, READ_ONLY, SYSTEM, Mac, SessionError

TOOL = os.environ["MAVOEA_TOOL"]
TYPES = {"netatalk": "samba", "stream": "samba-stream", "all-streams": "samba-all-streams"}

FINDER_INFO_NAME = "com.apple.FinderInfo"
FORK_NAME = "com.apple.ResourceFork"
LOCKED = "mavoea.locked"

TIME = 0x01DD79132202DA28
MARKS = HIDDEN | SYSTEM | ARCHIVE

# What the tool calls an attribute, what a client calls its stream, and a value.
NAMES = {
    "com.example.colour": ("com.example.colour", b"red"),
    "a:b": ("a\uf022b", b"\0colon\0"),
    'all "*:<>?\\|': ("all \uf020\uf021\uf022\uf023\uf024\uf025\uf026\uf027", b"\0"),
    "\x01\x1f": ("\uf001\uf01f", b"control"),
    " blanks and a dot .": (" blanks and a dot .", b"\xff" * 1000),
    "umläut \u65e5\u672c": ("umläut \u65e5\u672c", b"v" * 300),
    "n" * 234: ("n" * 234, b"long"),
}

server = None


def setUpModule():
    global server
    server = unittest.enterModuleContext(private_smbd.Smbd())
    layouts_test.server = server


class ToolTest(layouts_test.ShareTest):
    maxDiff = 4000

    def open(self, share):
        self.share = share
        super().open(share)

    def client_s(self, path=None, mac=None):
        """All that a client sees of an object."""
        path, mac = path or self.name, mac or self.mac
        attributes, created, streams = mac.look(path)
        values = {name: mac.read(f"{path}:{name}") for name in streams}
        self.assertEqual(streams, {name: len(value) for name, value in values.items()})
        data = None if attributes & DIRECTORY else mac.read(path)
        return [attributes, created, values, data]

    def start(self, *arguments, value=b""):
        volumes = (f"--volume={server.share(share)}={kind}" for share, kind in TYPES.items())
        return subprocess.run(
            [TOOL, *volumes, *arguments], input=value, capture_output=True, check=False
        )

    def tool(self, *arguments, value=b""):
        """What the tool prints; it has nothing to say besides."""
        result = self.start(*arguments, value=value)
        self.assertEqual((0, b""), (result.returncode, result.stderr[:2000]), arguments)
        return result.stdout

    def listed(self, path=None):
        found = json.loads(self.tool("list", "--json", "-l", path or self.path))
        return found["attributes"]

    def set(self, name, value):
        self.tool("set", self.path, name, value=value)

    def get_by_tool(self, name, path=None):
        return self.tool("get", path or self.path, name)

    def make_directory(self):
        self.make()
        os.remove(self.path)
        self.mac.mkdir(self.name)

    def fill(self, finder_info=FINDER_INFO, fork=b"the fork", marks=NORMAL, names=NAMES):
        """As a client does it."""
        for stream, value in (names or {}).values():
            self.write(stream, value)
        self.write("AFP_AfpInfo", afp_info(finder_info))
        if fork and os.path.isfile(self.path):
            self.write("AFP_Resource", fork)
        self.mac.set_attributes(self.name, marks, TIME)


def on_each_share(test):
    def on_all(self):
        for share in TYPES:
            with self.subTest(share):
                self.open(share)
                test(self)

    return on_all


def on_each_object(marks=NORMAL, shares=tuple(TYPES)):
    """A file and a directory of each share that a client has filled, and what it sees of them."""

    def with_each(test):
        def on_all(self):
            for share in shares:
                for make in (self.make, self.make_directory):
                    with self.subTest(share=share, make=make.__name__):
                        self.open(share)
                        make()
                        if os.path.isfile(self.path):
                            self.mac.write(self.name, b"data")
                        self.fill(marks=marks)
                        test(self, self.client_s())

        return on_all

    return with_each


# ---- What clients have written ------------------------------------------------------------------


class ReadTest(ToolTest):
    @on_each_object()
    def test_all_that_a_client_has_written_is_there(self, _):
        items = {name: value for name, (_, value) in NAMES.items()}
        items[FINDER_INFO_NAME] = FINDER_INFO
        if os.path.isfile(self.path):
            items[FORK_NAME] = b"the fork"
        found = self.listed()
        self.assertEqual(
            {name: len(value) for name, value in items.items()},
            {one["name"]: one["size"] for one in found},
        )
        for name, value in items.items():
            self.assertEqual(value, self.get_by_tool(name), name)
        spelled = {one["name"]: (one["file"], one.get("attribute")) for one in found}
        for name, (stream, _) in NAMES.items():
            self.assertEqual((self.path, f"user.DosStream.{stream}:$DATA"), spelled[name])
        keeps = RECORD if self.share == "netatalk" else AFP_INFO
        self.assertEqual((self.path, keeps), spelled[FINDER_INFO_NAME])
        if os.path.isfile(self.path):
            beside = self.share != "all-streams"
            self.assertEqual(
                (self.double, None) if beside else (self.path, AFP_RESOURCE), spelled[FORK_NAME]
            )
        where = json.loads(self.tool("where", "--json", self.path))
        self.assertEqual(TYPES[self.share], where["type"])
        if os.path.isfile(self.path):  # a fork tells more
            self.assertEqual(TYPES[self.share], where["found"]["type"])

    @on_each_object(shares=("netatalk",))
    def test_a_client_s_record_is_shown(self, _):
        (found,) = json.loads(self.tool("dump", "--record", "--json", self.path))
        self.assertEqual(
            (402, FINDER_INFO.hex(), [], []),
            (found["size"], found["finderInfo"], found["notes"], found["violations"]),
        )
        dates = next(entry["dates"] for entry in found["entries"] if entry["id"] == 8)
        created = int.from_bytes(self.get(RECORD)[354:358], "big", signed=True)
        self.assertEqual(created, dates["created"]["seconds"])
        self.assertEqual("unknown", dates["backedUp"]["time"])

    @on_each_object(READ_ONLY)
    def test_read_only_is_locked(self, _):
        self.assertEqual(b"1", self.get_by_tool(LOCKED))
        self.mac.set_attributes(self.name, MARKS)
        self.assertEqual(b"0", self.get_by_tool(LOCKED))

    def test_a_mac_s_own_file_is_read_before_and_behind_its_conversion(self):
        self.open("netatalk")
        values = {"com.example.a": b"one", "a:b": b"\0two"}
        self.put_double(mac_file(values))
        for _ in range(3):
            self.assertEqual(
                {*values, FINDER_INFO_NAME, FORK_NAME}, {one["name"] for one in self.listed()}
            )
            for name, value in values.items():
                self.assertEqual(value, self.get_by_tool(name))
            self.assertEqual(FINDER_INFO, self.get_by_tool(FINDER_INFO_NAME))
            self.assertEqual(b"the fork", self.get_by_tool(FORK_NAME))
            try:
                self.read("AFP_AfpInfo")
            except SessionError:
                pass  # the first open converts

    def test_a_record_of_403_bytes_is_told_until_a_client_replaces_it(self):
        self.open("netatalk")
        self.put(RECORD, layouts_test.record(size=403))
        result = self.start("set", self.path, FINDER_INFO_NAME, value=OTHER_FINDER_INFO)
        self.assertEqual(2, result.returncode)
        self.assertIn(b"its netatalk record is damaged", result.stderr)
        self.write("AFP_AfpInfo", afp_info())
        self.set(FINDER_INFO_NAME, OTHER_FINDER_INFO)
        self.assertEqual(afp_info(OTHER_FINDER_INFO), self.read("AFP_AfpInfo"))


# ---- What the tool has written ------------------------------------------------------------------


class WriteTest(ToolTest):
    @on_each_share
    def test_clients_find_what_is_set_and_may_change_it(self):
        for make in (self.make, self.make_directory):
            with self.subTest(make.__name__):
                make()
                self.set_and_change(with_fork=make == self.make)

    def set_and_change(self, with_fork):
        for name, (_, value) in NAMES.items():
            self.set(name, value)
        self.set(FINDER_INFO_NAME, FINDER_INFO)
        streams = dict(NAMES.values())
        streams["AFP_AfpInfo"] = afp_info()
        if with_fork:
            self.set(FORK_NAME, b"the fork")
            streams["AFP_Resource"] = b"the fork"
        self.expect_at_each_open(streams)

        self.write("AFP_AfpInfo", afp_info(OTHER_FINDER_INFO))
        self.mac.replace(self.stream("a\uf022b"), b"a client's")
        self.mac.remove(self.stream("com.example.colour"))
        self.assertEqual(OTHER_FINDER_INFO, self.get_by_tool(FINDER_INFO_NAME))
        self.assertEqual(b"a client's", self.get_by_tool("a:b"))
        self.assertEqual(1, self.start("get", self.path, "com.example.colour").returncode)
        if with_fork:
            self.write("AFP_Resource", b"a longer one of a client")
            self.assertEqual(b"a longer one of a client", self.get_by_tool(FORK_NAME))

        self.set(FINDER_INFO_NAME, FINDER_INFO)
        self.set("a:b", b"the tool's")
        self.set("com.example.colour", b"blue")
        streams["a\uf022b"] = b"the tool's"
        streams["com.example.colour"] = b"blue"
        if with_fork:
            self.set(FORK_NAME, b"short")
            streams["AFP_Resource"] = b"short"
        self.expect_at_each_open(streams)

        for name in (*NAMES, FINDER_INFO_NAME, *([FORK_NAME] if with_fork else [])):
            self.tool("remove", self.path, name)
        self.expect_at_each_open({})
        self.assertEqual([], self.listed())

    def expect_at_each_open(self, streams):
        for _ in range(3):
            self.assertEqual(streams, self.client_s()[2])

    def test_a_fork_is_changed_where_it_is(self):
        self.open("all-streams")
        self.write("AFP_Resource", b"a client's")
        volume = f"--volume={self.folder}=samba-stream"  # which keeps others in "._" files
        self.tool(volume, "set", self.path, FORK_NAME, value=b"the tool's")
        self.assertFalse(os.path.exists(self.double))
        self.assertEqual({"AFP_Resource": b"the tool's"}, self.client_s()[2])
        self.tool(volume, "remove", self.path, FORK_NAME)
        self.assertEqual({}, self.client_s()[2])

    @on_each_share
    def test_what_is_locked_clients_may_not_change(self):
        self.mac.write(self.name, b"data")
        self.fill()
        before = self.client_s()
        self.tool("lock", self.path)
        self.assertEqual([READ_ONLY, *before[1:]], self.client_s())
        denied = layouts_test.ACCESS_DENIED
        self.assert_fails(denied, self.mac.write, self.name, b"other")
        self.assert_fails(denied, self.write, "com.example.colour", b"other")
        self.assert_fails(layouts_test.CANNOT_DELETE, self.mac.remove, self.name)
        self.tool("unlock", self.path)
        self.assertEqual(before, self.client_s())
        self.mac.write(self.name, b"other")

    def test_the_time_of_creation_stays_when_there_was_no_record(self):
        self.open("netatalk")
        for name, value in ((FINDER_INFO_NAME, FINDER_INFO), ("colour", b"red")):
            self.make()
            os.utime(self.path, (10**9, 10**9))
            created = self.mac.creation_time(self.name)
            self.set(name, value)
            self.write("another", b"value")  # then smbd takes it from the record
            self.assertEqual(created, self.mac.creation_time(self.name))

    def test_a_plain_colon_is_replaced_by_what_clients_can_call(self):
        self.open("netatalk")
        self.put("user.DosStream.a:b:$DATA", b"plain\0")
        self.assertEqual(b"plain", self.get_by_tool("a:b"))
        self.set("a:b", b"mapped")
        self.assertEqual({"a\uf022b": b"mapped"}, self.client_s()[2])
        self.put("user.DosStream.a:b:$DATA", b"plain\0")
        self.tool("remove", self.path, "a:b")
        self.assertEqual({}, self.streams_on_disk())

    def test_a_backup_time_makes_nobody_younger(self):
        """A record has all four dates, and smbd takes an unknown one for one in 2068."""
        self.open("stream")
        self.mac.write(self.name, b"data")
        self.write("AFP_AfpInfo", afp_info(FINDER_INFO, bytes.fromhex("11223344")))
        for created in (TIME, None):
            self.mac.set_attributes(self.name, NORMAL, created or 0)
            if created is None:
                os.removexattr(self.path, "user.DOSATTRIB")
            copy = f"{self.name}-{created}"
            self.tool("cp", "-p", self.path, os.path.join(server.share("netatalk"), copy))
            with Mac(server, "netatalk") as there:
                there.write(f"{copy}:a", b"value")  # then smbd takes it from the record
                shown = there.creation_time(copy)
                self.assertEqual(FINDER_INFO, there.read(f"{copy}:AFP_AfpInfo")[16:48])
            if created is None:
                self.assertLessEqual(shown, self.mac.creation_time(self.name))
            else:
                self.assertEqual(created // 10**7, shown // 10**7)

    def test_an_empty_attribute_is_kept_and_clients_do_not_find_it(self):
        self.open("netatalk")
        result = self.start("set", self.path, "empty")
        self.assertEqual(0, result.returncode)
        self.assertIn(b"Samba's clients do not see such attributes", result.stderr)
        self.assertEqual({b"user.DosStream.empty:$DATA": b"\0"}, self.streams_on_disk())
        self.assert_no_stream("empty")
        self.assertEqual(b"", self.get_by_tool("empty"))
        self.write("empty", b"a client's")
        self.assertEqual(b"a client's", self.get_by_tool("empty"))


class MacsFileTest(ToolTest):
    """A "._" file that a Mac has written itself, and that no client has opened since."""

    VALUES = {"com.example.a": b"one", "b": b"two", "c": b"three"}

    def setUp(self):
        self.open("netatalk")
        self.put_double(mac_file(self.VALUES))
        self.left = {**self.VALUES, "AFP_AfpInfo": afp_info(), "AFP_Resource": b"the fork"}

    def expect(self):
        """What there is to be, from the second open on."""
        try:
            self.read("AFP_AfpInfo")
        except SessionError as error:
            self.assertEqual(layouts_test.NAME_NOT_FOUND, error.get_error_code())
        for _ in range(3):
            self.assertEqual(self.left, self.client_s()[2])

    def test_nothing_else_is_lost_when_an_attribute_is_set(self):
        self.set("b", b"another")
        self.left["b"] = b"another"
        self.expect()

    def test_nothing_else_is_lost_when_an_attribute_becomes_empty(self):
        self.assertEqual(0, self.start("set", self.path, "b").returncode)
        del self.left["b"]
        self.expect()

    def test_nothing_else_is_lost_when_attributes_are_removed(self):
        for name in self.VALUES:
            self.tool("remove", self.path, name)
            del self.left[name]
        self.expect()

    def test_finder_info_that_is_set_stays(self):
        self.set(FINDER_INFO_NAME, OTHER_FINDER_INFO)
        self.left["AFP_AfpInfo"] = afp_info(OTHER_FINDER_INFO)
        self.expect()

    def test_finder_info_that_is_removed_stays_away(self):
        self.tool("remove", self.path, FINDER_INFO_NAME)
        del self.left["AFP_AfpInfo"]
        self.expect()

    def test_a_fork_that_is_set_is_found(self):
        self.set(FORK_NAME, b"a longer one than before")
        self.left["AFP_Resource"] = b"a longer one than before"
        self.expect()

    def test_nothing_else_is_lost_when_the_fork_is_removed(self):
        self.tool("remove", self.path, FORK_NAME)
        del self.left["AFP_Resource"]
        self.expect()

    def test_a_lock_changes_nothing_else(self):
        self.tool("lock", self.path)
        self.tool("unlock", self.path)
        self.expect()

    def test_a_copy_is_whole_at_its_first_open(self):
        for command in ("cp", "mv"):
            self.make()
            self.put_double(mac_file(self.VALUES))
            copy = f"{self.name}-copy"
            self.tool(command, self.path, os.path.join(self.folder, copy))
            self.name = copy
            if command == "mv":  # its metadata goes as it is
                self.expect()
            else:
                self.assertEqual(self.left, self.client_s()[2])


# ---- What commands leave of it ------------------------------------------------------------------


class CommandTest(ToolTest):
    @on_each_object(READ_ONLY | MARKS)
    def test_looking_changes_nothing(self, before):
        self.listed()
        self.get_by_tool(FINDER_INFO_NAME)
        self.tool("where", self.path)
        self.start("dump", "--record", self.path)
        self.assertEqual(before, self.client_s())

    @on_each_object(MARKS)
    def test_another_attribute_is_all_that_is_set(self, before):
        self.set("another", b"value")
        before[2]["another"] = b"value"
        self.assertEqual(before, self.client_s())
        self.tool("remove", self.path, "another")
        del before[2]["another"]
        self.assertEqual(before, self.client_s())

    @on_each_object(MARKS)
    def test_lock_and_unlock_change_nothing_else(self, before):
        self.tool("lock", self.path)
        self.assertEqual([before[0] | READ_ONLY, *before[1:]], self.client_s())
        self.tool("unlock", self.path)
        self.assertEqual(before, self.client_s())

    @on_each_object(MARKS)
    def test_copies_are_whole(self, before):
        self.tool("cp", "-r", self.path, f"{self.path}-copy")
        self.assertEqual(before, self.client_s())
        self.assertEqual(before, self.client_s(f"{self.name}-copy"))
        self.tool("cp", "-r", "-T", f"{self.path}-copy", self.path)  # over what is there
        self.assertEqual(before, self.client_s())

    @on_each_object(READ_ONLY | MARKS)
    def test_what_is_locked_is_locked_as_a_copy(self, before):
        self.tool("cp", "-r", self.path, f"{self.path}-copy")
        self.assertEqual(before, self.client_s(f"{self.name}-copy"))

    @on_each_object(MARKS)
    def test_what_is_moved_is_whole(self, before):
        self.tool("mv", self.path, f"{self.path}-moved")
        self.assertEqual(before, self.client_s(f"{self.name}-moved"))
        self.assertFalse(os.path.exists(self.double))

    @on_each_object(MARKS)
    def test_copies_on_other_shares_are_whole(self, before):
        for share in TYPES.keys() - {self.share}:
            copy = f"{self.name}-from-{self.share}"
            self.tool("cp", "-r", self.path, os.path.join(server.share(share), copy))
            with Mac(server, share) as there:
                self.assertEqual(before, self.client_s(copy, there))

    @on_each_share
    def test_clients_and_the_library_agree_on_what_is_hidden_and_to_be_archived(self):
        """On a volume of the library's own, which is a share."""
        volume = f"--volume={self.folder}=eadir"
        word = "user.mavo.attributes"
        for make in (self.make, self.make_directory):
            make()
            for marks, copied in ((HIDDEN, 5), (READ_ONLY, 1), (HIDDEN | ARCHIVE, 5)):
                self.mac.set_attributes(self.name, marks)
                copy = f"{self.path}-{marks}"
                self.tool(volume, "cp", "-r", self.path, copy)
                self.assertEqual(copied, os.getxattr(copy, word)[3], marks)
                seen = self.mac.attributes(os.path.basename(copy))
                self.assertEqual(marks & MARKS, seen & MARKS)
            self.mac.set_attributes(self.name, HIDDEN)
            self.put(word, bytes(4))
            self.tool(volume, "mv", self.path, f"{self.path}-moved")
            seen = self.mac.attributes(f"{self.name}-moved")
            self.assertEqual(HIDDEN | ARCHIVE, seen & MARKS)

    @on_each_object(MARKS)
    def test_care_and_exchange_leave_what_clients_have(self, before):
        archive = f"{self.path}.adf"
        away = f"{self.path}-away"
        for command in (
            ("list", "-r", self.path),
            ("upgrade", "-r", self.path),
            ("repair", "-r", self.path),
            ("clean", "-r", self.folder),
            ("export", self.path, archive),
            ("import", archive, self.path),
            ("convert", "-r", "--to", TYPES[self.share], self.path, away),
            ("diff", "-r", "--data", self.path, away),
            ("carry", "-r", self.path, away),
        ):
            with self.subTest(command[0]):
                result = self.start(*command)
                # There is no EA directory to work on, and no place for some of it in an archive.
                may_fail = command[0] in ("upgrade", "repair", "export")
                self.assertIn(result.returncode, (0, 2) if may_fail else (0,), result)
                self.assertEqual(before, self.client_s())
        self.assertEqual(before, self.client_s(f"{self.name}-away"))

    @on_each_object(MARKS)
    def test_what_is_removed_is_gone(self, _):
        self.tool("rm", "-r", self.path)
        self.assert_fails(layouts_test.NAME_NOT_FOUND, self.mac.attributes, self.name)
        self.assertFalse(os.path.lexists(self.double))


class DepotTest(ToolTest):
    def test_streams_that_are_kept_elsewhere_are_told_and_nothing_is_written_beside_them(self):
        self.open("depot")
        self.fill(fork=b"the fork")
        before = self.client_s()
        for volume in ([], [f"--volume={self.folder}=samba-all-streams"]):
            for command in ("list", self.path), ("set", self.path, "a", "b"), ("lock", self.path):
                result = self.start(*volume, *command)
                self.assertEqual((2, b""), (result.returncode, result.stdout), command)
                self.assertIn(f"by {self.folder}/.streams".encode(), result.stderr)
        where = json.loads(self.tool("where", "--json", self.path))
        self.assertEqual(f"{self.folder}/.streams", where["unknownStreams"])
        self.assertEqual(before, self.client_s())


# ---- Conversions --------------------------------------------------------------------------------


class ConvertTest(ToolTest):
    OBJECTS = 200
    KINDS = ("0", "1", "2", "samba", "samba-stream", "samba-all-streams", "netatalk",
             "netatalk-samba", "linux")  # fmt: skip

    # What a Mac keeps of tags and comments, and afpd in a record besides: a word and a comment.
    INFO = {
        name: (name.replace(":", "\uf022"), plistlib.dumps(value, fmt=plistlib.FMT_BINARY))
        for name, value in {
            "com.apple.metadata:_kMDItemUserTags": ["Home", "Red\n6"],
            "com.apple.metadata:kMDItemFinderComment": "a client's",
        }.items()
    }

    def make_tree(self):
        """A tenth of it directories, which the files are in."""
        root = f"{self._testMethodName}-tree"
        self.mac.mkdir(root)
        self.names = []
        directory = root
        for number in range(self.OBJECTS):
            self.name = f"{directory}/object {number}"
            self.path = os.path.join(self.folder, self.name)
            if number % 10 == 0:
                self.name = f"{root}/directory {number}"
                self.path = os.path.join(self.folder, self.name)
                directory = self.name
                self.mac.mkdir(self.name)
            else:
                self.mac.write(self.name, b"data %d" % number)
            self.fill(
                finder_info=b"TEXTttxt" + bytes([0, number % 7 * 2]) + bytes(22),
                fork=b"fork %d" % number if number % 3 else b"",
                marks=(NORMAL, HIDDEN, SYSTEM, ARCHIVE, READ_ONLY)[number % 5],
                names=dict([*NAMES.items()][number % 7 :: 4]) | (self.INFO if number % 4 else {}),
            )
            if self.share == "netatalk" and number % 3 == 0:
                self.add_to_record()
            self.names.append(self.name.removeprefix(root + "/"))
        self.root = root

    def add_to_record(self):
        record = bytearray(self.get(RECORD))
        record[37] = len(b"afpd's")
        record[154:160] = b"afpd's"
        record[370:374] = bytes.fromhex("00000400")
        self.put(RECORD, bytes(record))

    def convert(self, kind, source, source_kind, to, no_place_for=()):
        """Everything arrives, but for what there is no place for; that is named."""
        result = self.start(
            f"--volume={source}={source_kind}", "convert", "-r", "--to", kind, source, to
        )
        told = result.stderr.decode().splitlines()
        others = [line for line in told if not any(item in line for item in no_place_for)]
        self.assertEqual([], others)
        self.assertEqual(2 if told else 0, result.returncode)

    def diff(self, one, its_kind, other, other_kind, no_place_for=()):
        """Both have the same, but for that."""
        result = self.start(
            f"--volume={one}={its_kind}", f"--volume={other}={other_kind}",
            "diff", "-r", "--data", one, other,
        )
        told = result.stdout.decode().splitlines()
        self.assertEqual("", result.stderr.decode())
        items = {item for line in told for item in line.split(" differ: ", 1)[1].split(", ")}
        lost = {f"AppleDouble {item} only in the first" for item in no_place_for}
        self.assertLessEqual(items, lost)
        self.assertEqual(1 if told else 0, result.returncode)

    def on_disk(self, name, without=()):
        """What smbd keeps, but for the dates in its records, and what there was no place for."""
        self.name = name
        self.path = os.path.join(self.folder, name)
        self.double = os.path.join(os.path.dirname(self.path), f"._{os.path.basename(name)}")
        found = {one: os.getxattr(self.path, one) for one in os.listxattr(self.path)}
        if RECORD in found:
            record = found[RECORD]
            found[RECORD] = record[:38] + record[50:354] + record[370:]
            if "comment" in without:
                found[RECORD] = record[:34] + bytes(4) + record[50:154] + bytes(204)
        if os.path.exists(self.double):
            found["._"] = self.get_double()
        return found

    @on_each_share
    def test_a_tree_comes_back_from_every_kind_of_place(self):
        self.make_tree()
        own = TYPES[self.share]
        tree = os.path.join(self.folder, self.root)
        shown = {name: self.client_s(f"{self.root}/{name}") for name in self.names[::4]}
        for kind in self.KINDS:
            if kind == own:
                continue
            with self.subTest(kind=kind):
                share = next((one for one in TYPES if TYPES[one] == kind), "stream")
                away = os.path.join(server.share(share), f"away-{own}-{kind}")
                # A "._" file has no place for them beside attributes.
                lacks = ("comment", "file dates", "AFP file info") if kind == "0" else ()
                self.convert(kind, tree, own, away, no_place_for=lacks)
                self.diff(tree, own, away, kind, no_place_for=lacks)
                if TYPES[share] == kind:
                    with Mac(server, share) as there:
                        for name, seen in shown.items():
                            at = f"{os.path.basename(away)}/{name}"
                            self.assertEqual(seen, self.client_s(at, there))
                to = f"{self.root}-from-{kind}"
                back = os.path.join(self.folder, to)
                self.convert(own, away, kind, back)
                self.diff(tree, own, back, own, no_place_for=lacks)
                for name in self.names:
                    self.assertEqual(
                        self.on_disk(f"{self.root}/{name}", lacks),
                        self.on_disk(f"{to}/{name}", lacks),
                        name,
                    )
                for name, seen in shown.items():  # which takes a while
                    self.assertEqual(seen, self.client_s(f"{to}/{name}"), name)


if __name__ == "__main__":
    unittest.main()
