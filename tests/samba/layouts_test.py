#!/usr/bin/python3
"""What Samba's smbd keeps on disk of what a Mac stores with a file, and what it serves of files
that others have prepared: the layouts of such shares as they really are.
"""

import os
import struct
import time
import unittest

import private_smbd

if __name__ == "__main__":
    private_smbd.alone()

from mac_client import ARCHIVE, DIRECTORY, HIDDEN, NORMAL, READ_ONLY, SYSTEM, Mac, SessionError

RECORD = "user.org.netatalk.Metadata"
AFP_INFO = "user.DosStream.AFP_AfpInfo:$DATA"
AFP_RESOURCE = "user.DosStream.AFP_Resource:$DATA"
DOS_ATTRIBUTES = "user.DOSATTRIB"

ACCESS_DENIED = 0xC0000022
CANNOT_DELETE = 0xC0000121
FILE_SYSTEM_LIMITATION = 0xC0000427
INVALID_PARAMETER = 0xC000000D
NAME_NOT_FOUND = 0xC0000034
NOT_FOUND = 0xC0000225
NOT_SUPPORTED = 0xC00000BB

FINDER_INFO = b"TEXTttxt" + bytes(range(0x40, 0x58))
OTHER_FINDER_INFO = b"APPLmine" + bytes(24)
MAC_FILLER = b"Mac OS X        "
NETATALK_FILLER = b"Netatalk        "

h = bytes.fromhex

server = None


def setUpModule():
    global server
    server = unittest.enterModuleContext(private_smbd.Smbd())


# ---- What lies on disk --------------------------------------------------------------------------


def afp_info(finder_info=FINDER_INFO, backup_time=h("80000000"), prodos=bytes(6)):
    """A client's AFP_AfpInfo stream, of 60 bytes."""
    return b"AFP\0" + h("00000100 00000000") + backup_time + finder_info + prodos + bytes(6)


RECORD_ENTRIES = (
    (4, 154, 0), (8, 354, 16), (9, 122, 32), (14, 370, 4), (0x80444556, 374, 0),
    (0x80494E4F, 382, 0), (0x8053594E, 390, 0), (0x8053567E, 398, 0),
)  # fmt: skip


def record(entries=RECORD_ENTRIES, size=402, magic=0x00051607, version=0x00020000,
           filler=bytes(16)):
    """A netatalk record with Finder info."""
    head = struct.pack(">II16sH", magic, version, filler, len(entries))
    head += b"".join(struct.pack(">III", *entry) for entry in entries)
    return (head.ljust(122, b"\0") + FINDER_INFO).ljust(size, b"\0")[:size]


def with_entry(index, identity, offset, length):
    entries = list(RECORD_ENTRIES)
    entries[index] = (identity, offset, length)
    return record(entries)


def apple_double(filler=NETATALK_FILLER, finder_info=bytes(32), fork=b"the fork", fork_offset=82,
                 fork_length=None, fork_first=True):
    """A "._" file without attributes."""
    length = len(fork) if fork_length is None else fork_length
    entries = [struct.pack(">III", 2, fork_offset, length), struct.pack(">III", 9, 50, 32)]
    if not fork_first:
        entries.reverse()
    head = struct.pack(">II16sH", 0x00051607, 0x00020000, filler, 2) + b"".join(entries)
    return (head + finder_info).ljust(fork_offset, b"\0") + fork


def mac_file(attributes, fork=b"the fork", filler=MAC_FILLER):
    """A "._" file with Finder info, attributes and fork as Mac OS X writes it."""
    names = [name.encode() + b"\0" for name in attributes]
    start = 120 + sum(11 + len(name) + 3 & ~3 for name in names)
    table = values = b""
    for name, value in zip(names, attributes.values()):
        entry = struct.pack(">IIHB", start + len(values), len(value), 0, len(name)) + name
        table += entry.ljust(len(entry) + 3 & ~3, b"\0")
        values += value
    total = start + len(values)
    return (
        struct.pack(">II16sH", 0x00051607, 0x00020000, filler, 2)
        + struct.pack(">III", 9, 50, total - 50)
        + struct.pack(">III", 2, total, len(fork))
        + FINDER_INFO
        + b"\0\0ATTR"
        + struct.pack(">IIII12xHH", 0, total, start, len(values), 0, len(names))
        + table + values + fork
    )  # fmt: skip


class ShareTest(unittest.TestCase):
    """A client on the share that a test is about, and a file on it."""

    files = 0

    def open(self, share):
        self.mac = Mac(server, share)
        self.addCleanup(self.mac.close)
        self.folder = server.share(share)
        self.make()

    def make(self):
        """Goes on with another file, which is new to the server."""
        self.files += 1
        self.name = f"{self._testMethodName}-{self.files}"
        self.path = os.path.join(self.folder, self.name)
        self.double = os.path.join(self.folder, f"._{self.name}")
        with open(self.path, "wb"):
            pass

    def put(self, attribute, value):
        os.setxattr(self.path, attribute, value)

    def get(self, attribute):
        """None where there is none."""
        try:
            return os.getxattr(self.path, attribute)
        except OSError:
            return None

    def streams_on_disk(self):
        return {
            os.fsencode(name): os.getxattr(self.path, name)
            for name in os.listxattr(self.path)
            if name.startswith("user.DosStream")
        }

    def put_double(self, data):
        with open(self.double, "wb") as file:
            file.write(data)

    def get_double(self):
        with open(self.double, "rb") as file:
            return file.read()

    def stream(self, name):
        return f"{self.name}:{name}"

    def read(self, stream):
        return self.mac.read(self.stream(stream))

    def write(self, stream, data):
        self.mac.write(self.stream(stream), data)

    def assert_fails(self, status, call, *arguments):
        with self.assertRaises(SessionError) as failed:
            call(*arguments)
        self.assertEqual(f"{status:#x}", f"{failed.exception.get_error_code():#x}")

    def assert_no_stream(self, name):
        self.assertNotIn(name, self.mac.streams(self.name))
        self.assert_fails(NAME_NOT_FOUND, self.read, name)


# ---- Finder info --------------------------------------------------------------------------------


class RecordTest(ShareTest):
    def setUp(self):
        self.open("netatalk")

    def test_a_client_s_finder_info_makes_a_fresh_record(self):
        before = int(time.time())
        self.write("AFP_AfpInfo", afp_info())
        after = int(time.time())
        found = self.get(RECORD)
        created, modified, backup, accessed = struct.unpack(">iiii", found[354:370])
        self.assertEqual((created, created, -0x80000000), (modified, accessed, backup))
        self.assertTrue(before <= created + 946684800 <= after)
        self.assertEqual(
            h("00051607 00020000" + "00" * 16 + "0008"
              "00000004 0000009a 00000000"  # comment
              "00000008 00000162 00000010"  # dates
              "00000009 0000007a 00000020"  # Finder info
              "0000000e 00000172 00000004"  # AFP file info
              "80444556 00000176 00000000"  # device
              "80494e4f 0000017e 00000000"  # inode
              "8053594e 00000186 00000000"  # sync
              "8053567e 0000018e 00000000")  # id
            + FINDER_INFO + bytes(200) + found[354:370] + bytes(32),
            found,
        )  # fmt: skip

    def test_only_finder_info_comes_back(self):
        self.write("AFP_AfpInfo", afp_info(FINDER_INFO, h("11223344"), h("000400002000")))
        self.assertEqual(afp_info(), self.read("AFP_AfpInfo"))

    def test_finder_info_is_changed_in_place(self):
        commented = with_entry(0, 4, 154, 7)
        commented = commented[:154] + b"comment" + commented[161:]
        commented = commented[:370] + h("000001a0") + commented[374:]
        self.put(RECORD, commented)
        self.write("AFP_AfpInfo", afp_info(OTHER_FINDER_INFO))
        found = self.get(RECORD)
        self.assertEqual(commented[:122] + OTHER_FINDER_INFO + commented[154:354], found[:354])
        self.assertEqual(commented[370:], found[370:])

    def test_finder_info_of_zeros_removes_the_record(self):
        self.write("AFP_AfpInfo", afp_info())
        self.write("AFP_AfpInfo", afp_info(bytes(32), h("11223344")))
        self.assertIsNone(self.get(RECORD))

    def test_a_record_is_served(self):
        for what, data in {
            "fresh": record(),
            "filler": record(filler=NETATALK_FILLER),
            "order": record(RECORD_ENTRIES[2:3] + RECORD_ENTRIES[:2] + RECORD_ENTRIES[3:]),
            "full comment": with_entry(0, 4, 154, 200),
            "no dates": with_entry(1, 8, 354, 0),
            "long Finder info": with_entry(2, 9, 122, 33),
            "no AFP info": with_entry(3, 14, 370, 0),
            "device": with_entry(4, 0x80444556, 374, 8),
        }.items():
            with self.subTest(what):
                self.make()
                self.put(RECORD, data)
                self.assertEqual({"AFP_AfpInfo": 60}, self.mac.streams(self.name))
                self.assertEqual(afp_info(), self.read("AFP_AfpInfo"))
                self.assertEqual(data, self.get(RECORD))

    def test_a_record_that_cannot_be_parsed_is_removed(self):
        for what, data in {
            "401 bytes": record(size=401),
            "empty": b"",
            "zeros": bytes(402),
            "7 entries": record(RECORD_ENTRIES[:7]),
            "9 entries": record(RECORD_ENTRIES + ((1, 398, 0),)),
            "magic": record(magic=0x00051600),
            "version": record(version=0x00010000),
            "no offset": with_entry(0, 4, 0, 0),
            "long comment": with_entry(0, 4, 154, 201),
            "half of the dates": with_entry(1, 8, 354, 8),
            "short Finder info": with_entry(2, 9, 122, 31),
            "half of the AFP info": with_entry(3, 14, 370, 2),
            "half of the device": with_entry(4, 0x80444556, 374, 4),
        }.items():
            with self.subTest(what):
                self.make()
                self.put(RECORD, data)
                self.assert_no_stream("AFP_AfpInfo")
                self.assertIsNone(self.get(RECORD))

    def test_a_record_of_403_bytes_is_ignored_until_a_client_writes(self):
        self.put(RECORD, record(size=403))
        self.assert_no_stream("AFP_AfpInfo")
        self.assertEqual(record(size=403), self.get(RECORD))
        self.write("AFP_AfpInfo", afp_info(OTHER_FINDER_INFO))
        self.assertEqual(402, len(self.get(RECORD)))
        self.assertEqual(OTHER_FINDER_INFO, self.get(RECORD)[122:154])

    def test_a_record_with_no_finder_info_cannot_take_any(self):
        self.put(RECORD, with_entry(2, 9, 122, 0))
        self.assertEqual(afp_info(bytes(32)), self.read("AFP_AfpInfo"))
        self.assert_fails(NOT_FOUND, self.write, "AFP_AfpInfo", afp_info())

    def test_a_time_of_creation_that_is_not_known_is_in_2068_unless_dates_have_no_length(self):
        unknown = record()[:354] + h("80000000") * 4 + record()[370:]
        none = with_entry(1, 8, 354, 0)
        for data, created in ((unknown, 946684800 + 0x80000000), (none, 10**9)):
            self.make()
            os.utime(self.path, (10**9, 10**9))
            self.put(RECORD, data)
            self.write("a", b"value")
            self.assertEqual(created, self.mac.creation_time(self.name) // 10**7 - 11644473600)

    def test_the_afp_word_locks_nothing(self):
        data = record()[:370] + h("000001a0") + bytes(28)
        self.put(RECORD, data)
        self.mac.write(self.name, b"data")
        self.assertEqual(0, self.mac.attributes(self.name) & READ_ONLY)


class AfpInfoTest(ShareTest):
    def setUp(self):
        self.open("stream")

    def test_a_client_s_stream_is_kept_as_it_is_and_a_nul(self):
        self.write("AFP_AfpInfo", afp_info(FINDER_INFO, h("11223344"), h("000400002000")))
        self.assertEqual(
            h("41465000 00000100 00000000 11223344")
            + FINDER_INFO
            + h("0004 00002000 000000000000 00"),
            self.get(AFP_INFO),
        )
        self.assertIsNone(self.get(RECORD))

    def test_finder_info_of_zeros_removes_the_stream(self):
        self.write("AFP_AfpInfo", afp_info())
        self.write("AFP_AfpInfo", afp_info(bytes(32), h("11223344"), h("000400002000")))
        self.assertIsNone(self.get(AFP_INFO))

    def test_what_is_no_such_stream_is_refused(self):
        self.write("AFP_AfpInfo", afp_info())
        for status, data in (
            (INVALID_PARAMETER, b"XFP\0" + afp_info(OTHER_FINDER_INFO)[4:]),
            (NOT_SUPPORTED, b"AFP\0" + h("00000200") + afp_info(OTHER_FINDER_INFO)[8:]),
        ):
            self.assert_fails(status, self.write, "AFP_AfpInfo", data)
            self.assertEqual(afp_info() + b"\0", self.get(AFP_INFO))

    def test_sixty_bytes_and_one_are_served(self):
        for last in (b"\0", b"x"):
            self.make()
            data = afp_info(FINDER_INFO, h("11223344"), h("000400002000"))
            self.put(AFP_INFO, data + last)
            self.assertEqual({"AFP_AfpInfo": 60}, self.mac.streams(self.name))
            self.assertEqual(data, self.read("AFP_AfpInfo"))

    def test_a_value_of_another_size_is_removed(self):
        for data in (afp_info()[:40], afp_info(), afp_info() + bytes(2)):
            with self.subTest(size=len(data)):
                self.make()
                self.put(AFP_INFO, data)
                self.assert_no_stream("AFP_AfpInfo")
                self.assertIsNone(self.get(AFP_INFO))


# ---- The resource fork --------------------------------------------------------------------------


class ForkFileTest(ShareTest):
    EMPTY = (
        "00051607 00020000 4e65746174616c6b2020202020202020 0002"
        "00000002 00000052 00000000"
        "00000009 00000032 00000020" + "00" * 32
    )

    def setUp(self):
        self.open("netatalk")

    def test_a_client_s_fork_makes_a_file_with_finder_info_of_zeros(self):
        for share in ("netatalk", "stream"):
            with self.subTest(share):
                self.open(share)
                self.write("AFP_AfpInfo", afp_info())
                self.write("AFP_Resource", b"fork")
                self.assertEqual(
                    h("00051607 00020000 4e65746174616c6b2020202020202020 0002"
                      "00000002 00000052 00000004"
                      "00000009 00000032 00000020" + "00" * 32)
                    + b"fork",
                    self.get_double(),
                )  # fmt: skip
                self.assertEqual(b"fork", self.read("AFP_Resource"))

    def test_a_fork_that_is_cut_to_nothing_leaves_the_file(self):
        self.write("AFP_Resource", b"fork")
        self.mac.replace(self.stream("AFP_Resource"), b"")
        self.assertEqual(h(self.EMPTY), self.get_double())
        self.assertEqual({}, self.mac.streams(self.name))

    def test_a_fork_that_is_removed_stays(self):
        self.write("AFP_Resource", b"fork")
        self.mac.remove(self.stream("AFP_Resource"))
        self.assertEqual(b"fork", self.read("AFP_Resource"))

    def test_the_file_goes_with_its_object(self):
        self.write("AFP_Resource", b"fork")
        self.mac.remove(self.name)
        self.assertFalse(os.path.exists(self.double))

    def test_a_file_is_served(self):
        for what, data in {
            "as smbd writes it": apple_double(),
            "Finder info first": apple_double(fork_first=False),
            "fork behind a gap": apple_double(fork_offset=4096),
            "length beyond the end": apple_double(fork_length=1000),
            "a Mac's": apple_double(MAC_FILLER),
        }.items():
            with self.subTest(what):
                self.make()
                self.put_double(data)
                self.assertEqual({"AFP_Resource": 8}, self.mac.streams(self.name))
                self.assertEqual(b"the fork", self.read("AFP_Resource"))
                self.assertEqual(data, self.get_double())

    def test_any_other_file_is_ignored(self):
        good = apple_double()
        third = struct.pack(">III", 4, 94, 0)
        for what, data in {
            "version 1": good[:4] + h("00010000") + good[8:],
            "three entries": good[:24] + h("0003") + good[26:50] + third + good[50:],
            "Finder info elsewhere": good.replace(h("00000009 00000032"), h("00000009 00000030")),
            "31 bytes of Finder info": good.replace(h("00000032 00000020"), h("00000032 0000001f")),
            "cut short": good[:49],
            "an attribute without a value": mac_file({"a": b"one", "empty": b""}),
            "more attributes than fit": mac_file({"a": bytes(70000)}),
        }.items():
            with self.subTest(what):
                self.make()
                self.put_double(data)
                self.assertEqual({}, self.mac.streams(self.name))
                self.assert_fails(INVALID_PARAMETER, self.read, "AFP_Resource")
                self.assertEqual({}, self.mac.streams(self.name))
                self.assertEqual({}, self.streams_on_disk())
                self.assertEqual(data, self.get_double())


class ForkStreamTest(ShareTest):
    def setUp(self):
        self.open("all-streams")

    def test_a_client_s_fork_is_a_stream(self):
        self.write("AFP_Resource", b"fork")
        self.assertEqual(b"fork\0", self.get(AFP_RESOURCE))
        self.assertFalse(os.path.exists(self.double))

    def test_a_fork_is_served(self):
        self.put(AFP_RESOURCE, b"fork\0")
        self.assertEqual({"AFP_Resource": 4}, self.mac.streams(self.name))
        self.assertEqual(b"fork", self.read("AFP_Resource"))

    def test_a_fork_has_room_for_65535_bytes(self):
        self.write("AFP_Resource", b"f" * 65535)
        self.assertEqual(b"f" * 65535 + b"\0", self.get(AFP_RESOURCE))
        self.make()
        self.assert_fails(FILE_SYSTEM_LIMITATION, self.write, "AFP_Resource", b"f" * 65536)


class ConversionTest(ShareTest):
    """A file that a Mac has written itself, when the server comes upon it."""

    def setUp(self):
        self.open("netatalk")

    def test_the_first_open_fails_and_converts(self):
        data = mac_file({"com.example.a": b"one", "b": b"\0two"})
        self.put_double(data)
        self.assert_fails(NAME_NOT_FOUND, self.read, "AFP_AfpInfo")
        self.assertEqual(afp_info(), self.read("AFP_AfpInfo"))
        self.assertEqual(
            {
                b"user.DosStream.com.example.a:$DATA": b"one\0",
                b"user.DosStream.b:$DATA": b"\0two\0",
            },
            self.streams_on_disk(),
        )
        self.assertEqual(
            h("00051607 00020000 4e65746174616c6b2020202020202020 0002"
              "00000002 00000052 00000008"
              "00000009 00000032 00000020")
            + FINDER_INFO + b"the fork",
            self.get_double(),
        )  # fmt: skip
        self.assertEqual(FINDER_INFO, self.get(RECORD)[122:154])

    def test_without_a_fork_the_descriptor_points_behind_the_file(self):
        data = mac_file({"com.example.a": b"one"}, fork=b"")
        self.put_double(data)
        self.assert_fails(NAME_NOT_FOUND, self.read, "AFP_AfpInfo")
        self.assertEqual(
            h("00051607 00020000 4e65746174616c6b2020202020202020 0002"
              "00000002 00000097 00000000"
              "00000009 00000032 00000020")
            + FINDER_INFO,
            self.get_double(),
        )  # fmt: skip
        self.assertEqual(b"one", self.read("com.example.a"))
        self.assert_fails(INVALID_PARAMETER, self.read, "AFP_Resource")

    def test_attributes_are_converted_under_either_filler(self):
        self.put_double(mac_file({"a": b"one"}, filler=NETATALK_FILLER))
        self.assert_fails(NAME_NOT_FOUND, self.read, "AFP_AfpInfo")
        self.assertEqual({b"user.DosStream.a:$DATA": b"one\0"}, self.streams_on_disk())
        self.assert_no_stream("AFP_AfpInfo")  # its Finder info is not taken

    def test_finder_info_is_taken_from_a_mac_s_file_only(self):
        for filler, taken in ((MAC_FILLER, True), (NETATALK_FILLER, False), (bytes(16), False)):
            with self.subTest(filler):
                self.make()
                self.put_double(apple_double(filler, FINDER_INFO))
                self.assert_fails(NAME_NOT_FOUND, self.read, "AFP_AfpInfo")
                if taken:
                    self.assertEqual(afp_info(), self.read("AFP_AfpInfo"))
                else:
                    self.assert_no_stream("AFP_AfpInfo")

    def test_a_mac_s_file_with_nothing_to_convert_wins_at_every_open(self):
        for filler, winner in ((MAC_FILLER, FINDER_INFO), (NETATALK_FILLER, OTHER_FINDER_INFO)):
            with self.subTest(filler):
                self.make()
                data = apple_double(filler, FINDER_INFO)
                self.put_double(data)
                self.write("AFP_AfpInfo", afp_info(OTHER_FINDER_INFO))
                self.assertEqual(afp_info(winner), self.read("AFP_AfpInfo"))
                self.assertEqual(data, self.get_double())

    def test_one_name_that_is_too_long_leaves_the_file_as_it_is(self):
        for length, converted in ((234, True), (235, False)):
            with self.subTest(length):
                self.make()
                data = mac_file({"n" * length: b"one"})
                self.put_double(data)
                self.assert_fails(NAME_NOT_FOUND, self.read, "AFP_AfpInfo")
                self.assertEqual(converted, self.get_double() != data)
                self.assertEqual(1 if converted else 0, len(self.streams_on_disk()))

    def test_forbidden_characters_become_a_client_s(self):
        for share, name in (("netatalk", "a\uf022b\uf020\uf001"), ("native", 'a:b"\x01')):
            with self.subTest(share):
                self.open(share)
                self.put_double(mac_file({'a:b"\x01': b"one"}))
                self.assert_fails(NAME_NOT_FOUND, self.read, "AFP_AfpInfo")
                self.assertEqual(
                    {f"user.DosStream.{name}:$DATA".encode(): b"one\0"}, self.streams_on_disk()
                )
                self.assertEqual(b"one", self.read("a\uf022b\uf020\uf001"))


# ---- Other streams ------------------------------------------------------------------------------


class StreamTest(ShareTest):
    def setUp(self):
        self.open("netatalk")

    def test_a_value_has_a_nul_behind_it(self):
        self.write("example.a", b"value")
        self.assertEqual({b"user.DosStream.example.a:$DATA": b"value\0"}, self.streams_on_disk())

    def test_an_empty_one_is_a_nul_and_clients_do_not_find_it(self):
        self.write("a", b"")
        self.assertEqual({b"user.DosStream.a:$DATA": b"\0"}, self.streams_on_disk())
        self.assert_no_stream("a")
        self.assertEqual({b"user.DosStream.a:$DATA": b"\0"}, self.streams_on_disk())

    def test_a_removed_one_leaves_nothing(self):
        self.write("a", b"value")
        self.mac.remove(self.stream("a"))
        self.assertEqual({}, self.streams_on_disk())

    def test_the_last_byte_is_never_served(self):
        for value in (b"abc\0", b"abcd", b"abc\1"):
            self.make()
            self.put("user.DosStream.a:$DATA", value)
            self.assertEqual({"a": 3}, self.mac.streams(self.name))
            self.assertEqual(b"abc", self.read("a"))

    def test_a_value_does_not_go_on_in_another_attribute(self):
        self.put("user.DosStream.a:$DATA", b"abc\1")
        self.put("user.DosStreamExt.1.a:$DATA", b"def\0")
        self.assertEqual({"a": 3}, self.mac.streams(self.name))
        self.assertEqual(b"abc", self.read("a"))

    def test_a_value_has_65535_bytes_at_most(self):
        self.write("a", b"v" * 65535)
        self.assertEqual({b"user.DosStream.a:$DATA": b"v" * 65535 + b"\0"}, self.streams_on_disk())
        self.make()
        for size in (65536, 200000):
            self.assert_fails(FILE_SYSTEM_LIMITATION, self.write, "a", b"v" * size)
            self.assertEqual({b"user.DosStream.a:$DATA": b"\0"}, self.streams_on_disk())

    def test_a_name_without_its_type_cannot_be_opened(self):
        for name in ("user.DosStream.a", "user.DosStream.a:$data"):
            self.make()
            self.put(name, b"value\0")
            self.assert_fails(NAME_NOT_FOUND, self.read, "a")

    def test_names_are_as_the_client_sent_them(self):
        private = [chr(0xF000 + low) for low in (*range(1, 0x20), *range(0x20, 0x2A))]
        for character in private + list('"*<>?|\x01\x1f .'):
            with self.subTest(character):
                self.make()
                self.write(f"a{character}", b"v")
                on_disk = f"user.DosStream.a{character}:$DATA".encode()
                self.assertEqual({on_disk: b"v\0"}, self.streams_on_disk())
                self.assertEqual({f"a{character}": 1}, self.mac.streams(self.name))

    def test_a_plain_colon_is_listed_and_cannot_be_called(self):
        for name in ("a:b", "a\\b", "a/b"):
            self.make()
            self.put(f"user.DosStream.{name}:$DATA", b"v\0")
            self.assertEqual({name: 1}, self.mac.streams(self.name))
            with self.assertRaises(SessionError):
                self.read(name)
            self.assert_fails(NAME_NOT_FOUND, self.read, "a\uf022b")

    def test_with_native_encoding_names_are_plain(self):
        self.open("native")
        plain = "".join(chr(code) for code in range(1, 0x20)) + '"*:<>?\\|'
        for low, character in enumerate(plain, 1):
            with self.subTest(character):
                self.make()
                self.write(f"a{chr(0xF000 + low)}", b"v")
                on_disk = f"user.DosStream.a{character}:$DATA".encode()
                self.assertEqual({on_disk: b"v\0"}, self.streams_on_disk())
                self.assertEqual({f"a{chr(0xF000 + low)}": 1}, self.mac.streams(self.name))

    def test_with_native_encoding_mapped_names_are_not_found(self):
        self.open("native")
        self.put("user.DosStream.a\uf022b:$DATA", b"v\0")
        self.assert_no_stream("a\uf022b")


# ---- DOS attributes -----------------------------------------------------------------------------


class DosAttributesTest(ShareTest):
    TIME = 0x01DD79132202DA28
    HEAD = "0000 0500 0500 0000 1100 0000"
    TAIL = "28da0222 1379dd01"

    def setUp(self):
        self.open("netatalk")

    def expect(self, attributes, creation_time):
        self.assertEqual(
            h(self.HEAD) + struct.pack("<IQ", attributes, creation_time), self.get(DOS_ATTRIBUTES)
        )

    def test_a_new_file_is_to_be_archived(self):
        os.remove(self.path)
        self.mac.write(self.name, b"data")
        self.assertEqual(ARCHIVE, self.mac.attributes(self.name))
        self.expect(0x20, self.mac.creation_time(self.name))

    def test_a_new_directory_is_one(self):
        os.remove(self.path)
        self.mac.mkdir(self.name)
        self.expect(0x10, self.mac.creation_time(self.name))

    def test_a_directory_with_finder_info_is_to_be_archived_and_seems_to_be_none(self):
        os.remove(self.path)
        self.mac.mkdir(self.name)
        created = self.mac.creation_time(self.name)
        self.write("AFP_AfpInfo", afp_info())
        self.expect(0x20, created)
        self.assertEqual(DIRECTORY | ARCHIVE, self.mac.attributes(self.name))

    def test_attributes_are_set_and_the_creation_time_stays(self):
        self.mac.set_attributes(self.name, NORMAL, self.TIME)
        self.mac.set_attributes(self.name, READ_ONLY | HIDDEN | SYSTEM | ARCHIVE)
        self.assertEqual(
            h("0000 0500 0500 0000 1100 0000 2700 0000 28da0222 1379dd01"), self.get(DOS_ATTRIBUTES)
        )
        self.mac.set_attributes(self.name, NORMAL)
        self.expect(0, self.TIME)

    def test_a_creation_time_is_set_and_the_attributes_stay(self):
        self.mac.set_attributes(self.name, HIDDEN)
        self.mac.set_attributes(self.name, 0, self.TIME)
        self.expect(HIDDEN, self.TIME)

    def test_the_mode_says_nothing(self):
        for mode in (0o000, 0o444, 0o644, 0o755, 0o777):
            os.chmod(self.path, mode)
            self.assertEqual(NORMAL, self.mac.attributes(self.name))
        self.assertIsNone(self.get(DOS_ATTRIBUTES))

    def test_what_is_read_only_is_locked(self):
        self.put(DOS_ATTRIBUTES, h(self.HEAD + "01000000" + self.TAIL))
        self.assert_fails(ACCESS_DENIED, self.mac.write, self.name, b"data")
        self.assert_fails(ACCESS_DENIED, self.write, "a", b"value")
        self.assert_fails(CANNOT_DELETE, self.mac.remove, self.name)

    LONG = "44332211 0807060504030201 1817161514131211"

    def test_every_version_is_served_and_replaced_by_version_5(self):
        for what, value, has_time in (
            ("5", self.HEAD + "23000000" + self.TAIL, True),
            ("5, no time", "0000 0500 0500 0000 01000000 23000000" + self.TAIL, False),
            ("5, only time", "0000 0500 0500 0000 10000000 23000000" + self.TAIL, True),
            ("5, more", self.HEAD + "23000000" + self.TAIL + "aabb", True),
            ("5, text", "30783100 0500 0500 11000000 23000000" + self.TAIL, True),
            ("4", "0000 0400 0400 0000 11000000 23000000 0807060504030201" + self.TAIL, True),
            ("3", "3078323300 00 0300 0300 0000 11000000 23000000" + self.LONG + self.TAIL
             + "2827262524232221", True),
            ("2", "3078323300 00 0200 0200 0000 bbaa0000 23000000" + self.LONG + self.TAIL
             + "28272625242322214847464544434241 6e00", False),
            ("1", "3078323300 00 0100 0100 0000 23000000" + self.LONG + self.TAIL
             + "2827262524232221", True),
            ("text", "30783233", False),
            ("text and NUL", "3078323300", False),
            ("digits", "3233", False),
        ):  # fmt: skip
            with self.subTest(what):
                self.make()
                self.put(DOS_ATTRIBUTES, h(value))
                self.assertEqual(0x23, self.mac.attributes(self.name))
                self.assertEqual(has_time, self.mac.creation_time(self.name) == self.TIME)
                self.assertEqual(h(value), self.get(DOS_ATTRIBUTES))
                created = self.mac.creation_time(self.name)
                self.mac.set_attributes(self.name, HIDDEN)
                self.expect(HIDDEN, created)

    def test_256_bytes_are_read(self):
        self.put(DOS_ATTRIBUTES, h(self.HEAD + "23000000" + self.TAIL).ljust(256, b"\0"))
        self.assertEqual(READ_ONLY | HIDDEN | ARCHIVE, self.mac.attributes(self.name))

    def test_anything_else_is_no_attributes(self):
        good = self.HEAD + "23000000" + self.TAIL
        for what, value in {
            "cut short": good[:-2],
            "version 6": good.replace("0500", "0600"),
            "two versions": good.replace("0500 0500", "0500 0400"),
            "empty": "",
            "two NULs": "0000",
            "257 bytes": good + "00" * 233,
        }.items():
            with self.subTest(what):
                self.make()
                self.put(DOS_ATTRIBUTES, h(value))
                self.assertEqual(NORMAL, self.mac.attributes(self.name))


# ---- What the tool does not know ----------------------------------------------------------------


class DepotTest(ShareTest):
    def setUp(self):
        self.open("depot")

    def test_streams_are_files_of_a_directory_in_the_share_s_root_and_the_object_says_so(self):
        self.write("colour", b"red")
        self.write("AFP_AfpInfo", afp_info())
        self.write("AFP_Resource", b"the fork")
        (first,) = os.listdir(os.path.join(self.folder, ".streams"))
        (second,) = os.listdir(os.path.join(self.folder, ".streams", first))
        for digits in (first, second):
            self.assertRegex(digits, "^[0-9A-F]{2}$")
        (of_object,) = os.listdir(os.path.join(self.folder, ".streams", first, second))
        streams = os.path.join(self.folder, ".streams", first, second, of_object)
        self.assertEqual(
            {":colour:$DATA", ":AFP_AfpInfo:$DATA", ":AFP_Resource:$DATA"}, {*os.listdir(streams)}
        )
        self.assertEqual(b"1", self.get("user.SAMBA_STREAMS"))
        self.assertEqual({}, self.streams_on_disk())
        self.assertFalse(os.path.exists(self.double))


class ForkInAttributeTest(ShareTest):
    def test_clients_cannot_store_a_fork_in_an_attribute_and_nothing_is_on_disk(self):
        self.open("xattr")
        before = os.listxattr(self.path)
        self.assert_fails(NOT_SUPPORTED, self.write, "AFP_Resource", b"the fork")
        self.assertEqual(before, os.listxattr(self.path))
        self.assertFalse(os.path.exists(self.double))


class NativeEncodingTest(ShareTest):
    """Names with characters that SMB forbids, where they are stored as they are."""

    PLAIN, MAPPED = "user.DosStream.a:b:$DATA", "user.DosStream.a\uf022b:$DATA"

    def setUp(self):
        self.open("native")

    def test_a_client_s_name_is_stored_as_it_is_meant(self):
        self.write("a\uf022b", b"value")
        self.assertEqual({os.fsencode(self.PLAIN): b"value\0"}, self.streams_on_disk())

    def test_only_that_spelling_is_read(self):
        self.put(self.MAPPED, b"mapped\0")
        self.assert_fails(NAME_NOT_FOUND, self.read, "a\uf022b")
        self.put(self.PLAIN, b"plain\0")
        self.assertEqual(b"plain", self.read("a\uf022b"))
        os.removexattr(self.path, self.PLAIN)
        self.assert_fails(NAME_NOT_FOUND, self.read, "a\uf022b")


if __name__ == "__main__":
    unittest.main()
