#!/usr/bin/python3
"""Every item that a client or the tool can store with an object of a share: what the one writes the
other finds, at each further open too, whoever has changed it in between, and nothing else changes.
"""

import base64
import copy
import dataclasses
import datetime
import json
import os
import plistlib
import struct
import unittest

import private_smbd

if __name__ == "__main__":
    private_smbd.alone()

import tool_test
from layouts_test import FINDER_INFO, OTHER_FINDER_INFO, RECORD, afp_info, mac_file
from mac_client import ARCHIVE, HIDDEN, NORMAL, READ_ONLY, SYSTEM, Mac
from tool_test import FINDER_INFO_NAME, FORK_NAME, NAMES, TYPES, on_each_share

TAGS_NAME = "com.apple.metadata:_kMDItemUserTags"
TAGS_STREAM = TAGS_NAME.replace(":", "\uf022")
COMMENT_NAME = "com.apple.metadata:kMDItemFinderComment"
COMMENT_STREAM = COMMENT_NAME.replace(":", "\uf022")

ANOTHER = "imported"
STREAMS = {name: stream for name, (stream, _) in NAMES.items()} | {
    TAGS_NAME: TAGS_STREAM,
    COMMENT_NAME: COMMENT_STREAM,
    FINDER_INFO_NAME: "AFP_AfpInfo",
    FORK_NAME: "AFP_Resource",
    ANOTHER: ANOTHER,
}

UNKNOWN = bytes.fromhex("80000000")  # of dates

MARKS = {READ_ONLY: "locked", HIDDEN: "hidden", ARCHIVE: "archive", SYSTEM: "system"}


def setUpModule():
    tool_test.setUpModule()


def ticks(date):
    """As SMB has a date, in 100 ns from 1601-01-01."""
    since = datetime.datetime.fromisoformat(date.removesuffix("Z")) - datetime.datetime(1601, 1, 1)
    return (since.days * 86400 + since.seconds) * 10**7


def property_list(value):
    return plistlib.dumps(value, fmt=plistlib.FMT_BINARY)


def labelled(finder_info, number):
    return finder_info[:9] + bytes([finder_info[9] & ~0xE | number << 1]) + finder_info[10:]


@dataclasses.dataclass
class Model:
    """All that an object has, in the tool's names, and as clients see it."""

    values: dict
    marks: int
    created: int
    keeps_record: bool
    backed_up: bytes = UNKNOWN

    def put(self, name, value):
        self.values.pop(name, None)
        if value is not None:
            self.values[name] = value

    def in_stream(self):
        """The backup time as clients see it: of records smbd shows none."""
        return UNKNOWN if self.keeps_record else self.backed_up

    def streams(self):
        found = {STREAMS[name]: value for name, value in self.values.items()}
        if FINDER_INFO_NAME in self.values:
            found["AFP_AfpInfo"] = afp_info(self.values[FINDER_INFO_NAME], self.in_stream())
        return found


class ItemTest(tool_test.ToolTest):
    def fill_with_everything(self):
        """As a client does it."""
        values = {name: value for name, (_, value) in NAMES.items()}
        values[TAGS_NAME] = property_list(["Red\n6", "Home"])
        values[COMMENT_NAME] = property_list("a client's")
        values[FINDER_INFO_NAME] = labelled(FINDER_INFO, 6)
        if os.path.isfile(self.path):
            values[FORK_NAME] = b"the fork"
        self.model = Model(values, ARCHIVE, tool_test.TIME, self.share == "netatalk")
        for name, value in self.model.streams().items():
            self.write(name, value)
        self.mac.set_attributes(self.name, ARCHIVE, tool_test.TIME)

    def expect(self):
        """Both see the same, the client at each of its opens and of its sessions."""
        with Mac(tool_test.server, self.share) as another:
            for mac in (self.mac, another):
                attributes, created, streams, _ = self.client_s(mac=mac)
                self.assertEqual(self.model.streams(), streams)
                self.assertEqual(self.model.marks, attributes & sum(MARKS))
                self.assertEqual(self.model.created, created)
                self.expect_of_tool()

    def expect_of_tool(self):
        listed = json.loads(self.tool("list", "--json", "-l", "--values", self.path))
        found = {one["name"]: base64.b64decode(one["base64"]) for one in listed["attributes"]}
        locked = {"mavoea.locked": b"1"} if self.model.marks & READ_ONLY else {}
        self.assertEqual({**self.model.values, **locked}, found)
        shown = json.loads(self.tool("show", "--json", self.path))
        marks = {name for mark, name in MARKS.items() if self.model.marks & mark}
        self.assertEqual(marks, {*shown["marks"]})
        self.assertEqual(self.model.created // 10**7, self.shown_date(shown, "createdForSmb"))
        backed_up = int.from_bytes(self.model.backed_up, "big", signed=True)
        if backed_up == -0x80000000:
            self.assertNotIn("backedUp", shown["dates"])
        else:
            from_2000 = self.shown_date(shown, "backedUp") - ticks("2000-01-01T00:00:00") // 10**7
            self.assertEqual(backed_up, from_2000)
        for name, item in ((COMMENT_NAME, "comment"), (TAGS_NAME, "tags")):
            encoded = self.model.values.get(name)
            expected = encoded and plistlib.loads(encoded)
            if item == "tags":
                expected = [tag.split("\n")[0] for tag in expected or ()]
                self.assertEqual(expected, [tag["name"] for tag in shown.get(item, ())])
            else:
                self.assertEqual(expected, shown.get(item))

    def shown_date(self, shown, which):
        return ticks(shown["dates"][which].split(".")[0]) // 10**7

    # ---- Who writes what --------------------------------------------------------------------

    def client_puts(self, name, value):
        stream = STREAMS[name]
        if name == FINDER_INFO_NAME:  # which has one size
            self.write(stream, afp_info(value or bytes(32), self.model.in_stream()))
        elif value is None:
            self.mac.remove(self.stream(stream))
        else:
            self.mac.replace(self.stream(stream), value)
        self.model.put(name, value)

    def client_marks(self, marks):
        self.mac.set_attributes(self.name, marks or NORMAL)
        self.model.marks = marks

    def client_creates(self, created):
        self.mac.set_attributes(self.name, 0, created)
        self.model.created = created

    def tool_puts(self, name, value):
        if value is None:
            self.tool("remove", self.path, name)
        else:
            self.set(name, value)
        self.model.put(name, value)

    def set_info(self, *options):
        self.tool("set-info", self.path, *options)

    def finder_info_becomes(self, finder_info):
        self.model.values[FINDER_INFO_NAME] = finder_info

    def restore(self, *lines):
        """Such a text, of this object, on this object."""
        text = "\n".join((f"# file: {self.name}", *lines, "", ""))
        self.tool("restore", "--directory", self.folder, value=text.encode())

    def tool_restores_marks(self, marks):
        self.restore(*(f'user.mavoea.{name}="1"' for mark, name in MARKS.items() if marks & mark))
        self.model.marks |= marks

    def tool_tags(self, tags, label, *encoded):
        self.set_info("--tags", tags)
        self.model.values[TAGS_NAME] = property_list([*encoded])
        self.finder_info_becomes(labelled(self.model.values[FINDER_INFO_NAME], label))

    def tool_comments(self, comment):
        self.set_info("--comment", comment)
        self.model.put(COMMENT_NAME, property_list(comment) if comment else None)

    def tool_creates(self, date):
        self.set_info("--created", date)
        self.model.created = ticks(date)

    def tool_restores_created(self, created):
        self.restore(f'user.mavoea.created="{created}"')
        self.model.created = created

    def tool_types(self, type_, creator):
        self.set_info("--type", type_, "--creator", creator)
        there = self.model.values[FINDER_INFO_NAME]
        self.finder_info_becomes((type_ + creator).encode() + there[8:])

    def tool_flags(self, flags, to_set, to_clear):
        self.set_info("--flags", flags)
        there = self.model.values[FINDER_INFO_NAME]
        (word,) = struct.unpack_from(">H", there, 8)
        self.finder_info_becomes(
            there[:8] + struct.pack(">H", (word | to_set) & ~to_clear) + there[10:]
        )

    def tool_labels(self, name, number):
        self.set_info("--label", name)
        self.finder_info_becomes(labelled(self.model.values[FINDER_INFO_NAME], number))

    def tool_locks(self, locked):
        self.tool("lock" if locked else "unlock", self.path)
        self.model.marks = self.model.marks & ~READ_ONLY | (READ_ONLY if locked else 0)


def on_all_objects(test):
    """A file and a directory of each share that a client has given everything."""

    def on_all(self):
        for share in TYPES:
            for make in (self.make, self.make_directory):
                with self.subTest(share=share, make=make.__name__):
                    self.open(share)
                    make()
                    self.fill_with_everything()
                    self.expect()
                    test(self)

    return on_all


class ValueTest(ItemTest):
    ITEMS = {
        "com.example.colour": (b"blue", b"a longer one " * 9, b"r"),
        "a:b": (b"\0", b"b" * 3000, b"colon\0"),
        "umläut \u65e5\u672c": (b"1", b"2", b"3" * 700),
        TAGS_NAME: tuple(property_list([tag]) for tag in ("Blue\n4", "Work", "T" * 200)),
        COMMENT_NAME: tuple(property_list(comment) for comment in ("one", "zwö" * 50, "3")),
        FINDER_INFO_NAME: (OTHER_FINDER_INFO, labelled(FINDER_INFO, 2), FINDER_INFO),
        FORK_NAME: (b"short", b"longer " * 400, b"the third"),
    }  # fmt: skip

    @on_all_objects
    def test_either_changes_what_the_other_has_written(self):
        for name, (one, two, three) in self.ITEMS.items():
            if name == FORK_NAME and FORK_NAME not in self.model.values:
                continue
            for put, value in (
                (self.tool_puts, one),
                (self.client_puts, two),
                (self.tool_puts, three),
                (self.client_puts, None if name != FORK_NAME else one),  # smbd keeps that file
                (self.tool_puts, two),
                (self.tool_puts, None),
                (self.client_puts, one),
            ):
                with self.subTest(item=name, put=put.__name__, value=value):
                    put(name, value)
                    self.expect()


class InfoTest(ItemTest):
    @on_all_objects
    def test_what_is_set_in_words_and_what_clients_make_of_it(self):
        of_files = (
            (self.tool_types, "APPL", "mine"),
            (self.client_puts, FINDER_INFO_NAME, FINDER_INFO),
            (self.tool_types, "ttxt", "TEXT"),
        )
        for step, *arguments in (
            *(of_files if os.path.isfile(self.path) else ()),
            (self.tool_labels, "orange", 7),
            (self.client_puts, FINDER_INFO_NAME, labelled(FINDER_INFO, 1)),
            (self.tool_labels, "none", 0),
            (self.tool_flags, "invisible,-stationery", 0x4000, 0x0800),
            (self.client_puts, FINDER_INFO_NAME, OTHER_FINDER_INFO),
            (self.tool_flags, "-invisible,stationery", 0x0800, 0x4000),
            (self.tool_tags, "Green:green,Ämter", 2, "Green\n2", "Ämter"),
            (self.client_puts, TAGS_NAME, property_list(["Work\n4"])),
            (self.tool_tags, "Home", 0, "Home"),
            (self.client_puts, TAGS_NAME, None),
            (self.tool_tags, "Purple:purple", 3, "Purple\n3"),
            (self.tool_comments, "the tool's"),
            (self.client_puts, COMMENT_NAME, property_list("a client's, ö")),
            (self.tool_comments, ""),
            (self.client_puts, COMMENT_NAME, property_list("another")),
            (self.tool_comments, "ä" * 99),
        ):
            with self.subTest(step=step.__name__, arguments=arguments):
                step(*arguments)
                self.expect()

    @on_all_objects
    def test_marks_and_the_time_of_creation(self):
        for step, argument in (
            (self.client_marks, HIDDEN | ARCHIVE),
            (self.tool_locks, True),
            (self.client_marks, SYSTEM | READ_ONLY),
            (self.tool_locks, False),
            (self.client_marks, 0),
            (self.tool_locks, True),
            (self.tool_locks, False),
            (self.tool_restores_marks, HIDDEN),
            (self.client_marks, SYSTEM),
            (self.tool_restores_marks, READ_ONLY),
            (self.client_marks, ARCHIVE),
            (self.tool_restores_marks, SYSTEM | HIDDEN),
            (self.tool_creates, "2001-02-03T04:05:06Z"),
            (self.client_creates, 0x01C0000000000000),
            (self.client_marks, READ_ONLY),
            (self.tool_creates, "2011-02-03T04:05:06Z"),
            (self.tool_locks, False),
            (self.tool_restores_created, 0x01D0123456789ABC),
            (self.client_creates, tool_test.TIME),
        ):
            with self.subTest(step=step.__name__, argument=argument):
                step(argument)
                self.expect()

    @on_all_objects
    def test_backup_dates(self):
        """Clients see them where the Finder info is a stream of its own."""
        dates = {"2021-01-02T03:04:05Z": "27829f25", "1999-12-31T23:59:59Z": "ffffffff"}
        in_stream = self.share != "netatalk"
        for date, encoded in dates.items():
            self.set_info("--backup-date", date)
            self.model.backed_up = bytes.fromhex(encoded)
            self.expect()
            self.client_puts(FINDER_INFO_NAME, OTHER_FINDER_INFO)
            self.expect()
            self.tool_puts(FINDER_INFO_NAME, FINDER_INFO)
            self.tool_labels("yellow", 5)
            self.expect()
            self.tool_puts(FINDER_INFO_NAME, None)
            self.expect()
        if in_stream:
            self.model.backed_up = bytes.fromhex("11223344")
            self.client_puts(FINDER_INFO_NAME, OTHER_FINDER_INFO)
            self.expect()


class SavedTest(ItemTest):
    @on_all_objects
    def test_what_was_saved_comes_back_whatever_a_client_has_made_of_it(self):
        saved = copy.deepcopy(self.model)
        text = self.tool("save", "--absolute-names", self.path)
        self.client_puts(FINDER_INFO_NAME, OTHER_FINDER_INFO)
        self.client_puts("com.example.colour", b"another, and longer")
        self.client_puts("a:b", None)
        self.client_puts(TAGS_NAME, None)
        if FORK_NAME in saved.values:
            self.client_puts(FORK_NAME, b"a longer one than it was before")
        self.client_creates(0x01C0000000000000)
        self.client_marks(0)
        self.expect()
        self.tool("restore", "--absolute-names", value=text)
        self.model = copy.deepcopy(saved)
        self.expect()
        self.client_puts("a:b", b"and once more")
        self.client_marks(HIDDEN)
        self.expect()
        self.tool("restore", "--absolute-names", value=text)
        self.model = copy.deepcopy(saved)
        self.model.marks |= HIDDEN  # a mark that is not in the text stays
        self.expect()


class ImportTest(ItemTest):
    VALUES = {"com.example.colour": b"a Mac's", ANOTHER: b"value", "a:b": b"imported"}

    @on_all_objects
    def test_what_a_mac_has_left_beside_it_replaces_what_it_has(self):
        fork = b"a Mac's fork" if os.path.isfile(self.path) else b""
        for _ in range(2):
            self.import_it(fork)
            self.model.values |= {**self.VALUES, FINDER_INFO_NAME: FINDER_INFO}
            if fork:
                self.model.values[FORK_NAME] = fork
            self.expect()
            self.client_puts(ANOTHER, b"a client's")
            self.client_puts(FINDER_INFO_NAME, OTHER_FINDER_INFO)
            self.client_puts("a:b", None)
            self.expect()
            self.tool_puts("a:b", b"the tool's")
            self.expect()

    def import_it(self, fork):
        with open(self.double, "wb") as file:
            file.write(mac_file(self.VALUES, fork))
        self.tool("import", "-r", self.folder)


class RecordTest(ItemTest):
    """What afpd keeps in the record besides, which clients of smbd do not see."""

    COMMENT, WORD = b"afpd's", bytes.fromhex("00000400")  # no copy
    DATES = bytes.fromhex("25a01a25 25a01a26 27829f25 25a01a27")

    def test_it_stays_whoever_changes_something_else(self):
        for make in (self.make, self.make_directory):
            with self.subTest(make.__name__):
                self.open("netatalk")
                make()
                self.fill_with_everything()
                record = bytearray(self.get(RECORD))
                record[154 : 154 + len(self.COMMENT)] = self.COMMENT
                record[34:38] = struct.pack(">I", len(self.COMMENT))
                record[354:374] = self.DATES + self.WORD
                self.put(RECORD, bytes(record))
                self.model.backed_up = self.DATES[8:12]
                self.expect()
                for step, *arguments in (
                    (self.client_puts, FINDER_INFO_NAME, OTHER_FINDER_INFO),
                    (self.tool_puts, FINDER_INFO_NAME, FINDER_INFO),
                    (self.client_puts, "com.example.colour", b"blue"),
                    (self.tool_puts, "com.example.colour", None),
                    (self.tool_labels, "green", 2),
                    (self.tool_locks, True),
                    (self.tool_locks, False),
                    (self.tool_tags, "Home", 0, "Home"),
                    (self.client_marks, HIDDEN | ARCHIVE),
                    (self.tool_restores_marks, SYSTEM),
                    (self.tool_puts, FINDER_INFO_NAME, None),
                    (self.client_puts, FINDER_INFO_NAME, FINDER_INFO),
                ):
                    step(*arguments)
                    self.expect()
                    shown = json.loads(self.tool("show", "--json", self.path))
                    self.assertEqual(self.COMMENT.decode(), shown["afpComment"], step.__name__)
                    found = self.get(RECORD)
                    self.assertEqual(
                        (self.COMMENT.ljust(200, b"\0"), self.DATES, self.WORD),
                        (found[154:354], found[354:370], found[370:374]),
                        step.__name__,
                    )


class HostVolumeTest(ItemTest):
    """A volume of the library's own, which is a share: clients' marks are the library's."""

    @on_each_share
    def test_either_changes_the_marks_that_the_other_has_set(self):
        self.volume = f"--volume={self.folder}=eadir"
        for make in (self.make, self.make_directory):
            make()
            both = HIDDEN | ARCHIVE
            for client, restored in (
                (HIDDEN, 0),
                (ARCHIVE, HIDDEN),
                (0, HIDDEN),
                (SYSTEM, HIDDEN),
                (SYSTEM | HIDDEN | ARCHIVE, 0),
                (0, 0),
            ):
                with self.subTest(make=make.__name__, client=client, restored=restored):
                    self.mac.set_attributes(self.name, client or NORMAL, tool_test.TIME)
                    self.expect_marks(client)
                    text = [f"# file: {self.name}", 'user.colour="red"']
                    text += ['user.mavoea.hidden="1"'] if restored else []
                    text = "\n".join((*text, "", "")).encode()
                    self.tool(self.volume, "restore", "--directory", self.folder, value=text)
                    self.expect_marks(client | restored)

    def expect_marks(self, marks):
        """At the second and at the third open, too."""
        for _ in range(2):
            with Mac(tool_test.server, self.share) as mac:
                attributes, created, _ = mac.look(self.name)
            self.assertEqual((marks, tool_test.TIME), (attributes & sum(MARKS), created))
            shown = json.loads(self.tool(self.volume, "show", "--json", self.path))
            known = {MARKS[mark] for mark in MARKS if marks & mark}
            self.assertEqual(known, {*shown["marks"]})


class SizeTest(ItemTest):
    @on_all_objects
    def test_a_value_has_the_room_that_smbd_gives_it(self):
        for size in (65534, 65535):
            self.tool_puts("com.example.colour", b"v" * size)
            self.expect()
            self.client_puts("com.example.colour", b"w" * (size - 1))
            self.expect()
        result = self.start("set", self.path, "com.example.colour", value=b"x" * 65536)
        self.assertEqual(2, result.returncode)
        self.assertIn(b"no room for its 65536 bytes: a value has 65535 bytes", result.stderr)
        self.expect()


if __name__ == "__main__":
    unittest.main()
