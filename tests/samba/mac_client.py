"""A client of an SMB server that does what a Mac does: it says that it is one, and opens a file's
metadata as streams of the file."""

import struct

from impacket.smb3 import SessionError
from impacket.smb3structs import (
    DELETE,
    FILE_DELETE_ON_CLOSE,
    FILE_DIRECTORY_FILE,
    FILE_OPEN,
    FILE_OPEN_IF,
    FILE_OVERWRITE_IF,
    FILE_READ_ATTRIBUTES,
    FILE_READ_DATA,
    FILE_SHARE_DELETE,
    FILE_SHARE_READ,
    FILE_SHARE_WRITE,
    FILE_WRITE_ATTRIBUTES,
    FILE_WRITE_DATA,
    SMB2_DIALECT_21,
    SMB2_FILE_BASIC_INFO,
    SMB2_FILE_STREAM_INFO,
    SMB2CreateContext,
)
from impacket.smbconnection import SMBConnection

READ_ONLY, HIDDEN, SYSTEM, DIRECTORY, ARCHIVE, NORMAL = 0x1, 0x2, 0x4, 0x10, 0x20, 0x80
SHARED = FILE_SHARE_READ | FILE_SHARE_WRITE | FILE_SHARE_DELETE
STATUS_END_OF_FILE = 0xC0000011
PIECE = 65536  # what every dialect takes in one request


class _Apple:
    """The create context by which a Mac tells that it is one: a query of what the server can."""

    def getData(self):  # impacket's name
        context = SMB2CreateContext()
        context["Next"] = 0
        context["NameOffset"] = 16
        context["NameLength"] = 4
        context["DataOffset"] = 24
        context["DataLength"] = 24
        context["Buffer"] = b"AAPL" + bytes(4) + struct.pack("<IIQQ", 1, 0, 7, 7)
        return context.getData()


class Mac:
    """A session on one share. Paths are relative to it; a stream is "FILE:NAME"."""

    def __init__(self, server, share):
        self._connection = SMBConnection(
            server.name, server.address, sess_port=server.port, preferredDialect=SMB2_DIALECT_21
        )
        self._connection.login(server.user, server.password)
        self._smb = self._connection.getSMBServer()
        self._tree = self._connection.connectTree(share)
        self._smb.close(self._tree, self._open("", FILE_READ_ATTRIBUTES, contexts=[_Apple()]))

    def close(self):
        self._connection.close()

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    # ---- Data and streams ---------------------------------------------------------------------

    def read(self, path):
        with self._opened(path, FILE_READ_DATA) as file:
            data = b""
            while True:  # behind its end, AFP_AfpInfo begins again
                try:
                    piece = self._smb.read(self._tree, file, len(data), PIECE)
                except SessionError as error:
                    if error.get_error_code() != STATUS_END_OF_FILE:
                        raise
                    return data
                data += piece
                if len(piece) < PIECE:
                    return data

    def write(self, path, data):
        """Over what is there, which keeps what it has behind the data."""
        with self._opened(path, FILE_WRITE_DATA, FILE_OPEN_IF) as file:
            self._write(file, data)

    def replace(self, path, data):
        with self._opened(path, FILE_WRITE_DATA, FILE_OVERWRITE_IF) as file:
            self._write(file, data)

    def mkdir(self, path):
        with self._opened(path, FILE_READ_ATTRIBUTES, FILE_OPEN_IF, FILE_DIRECTORY_FILE):
            pass

    def remove(self, path):
        with self._opened(path, DELETE, FILE_OPEN, FILE_DELETE_ON_CLOSE):
            pass

    def streams(self, path):
        """The named streams and their sizes, without the data itself."""
        with self._opened(path, FILE_READ_ATTRIBUTES) as file:
            return self._streams(file)

    # ---- Attributes ---------------------------------------------------------------------------

    def attributes(self, path):
        with self._opened(path, FILE_READ_ATTRIBUTES) as file:
            return self._basic_info(file)[4]

    def creation_time(self, path):
        """In 100 ns from 1601-01-01."""
        with self._opened(path, FILE_READ_ATTRIBUTES) as file:
            return self._basic_info(file)[0]

    def look(self, path):
        """Attributes, creation time and streams."""
        with self._opened(path, FILE_READ_ATTRIBUTES) as file:
            created, _, _, _, attributes = self._basic_info(file)
            return attributes, created, self._streams(file)

    def set_attributes(self, path, attributes, creation_time=0):
        """An attribute word of 0 leaves the attributes, a time of 0 the time; NORMAL is none."""
        with self._opened(path, FILE_WRITE_ATTRIBUTES) as file:
            info = struct.pack("<QQQQII", creation_time, 0, 0, 0, attributes, 0)
            self._smb.setInfo(self._tree, file, info, fileInfoClass=SMB2_FILE_BASIC_INFO)

    # ---- Inside -------------------------------------------------------------------------------

    def _basic_info(self, file):
        info = self._smb.queryInfo(self._tree, file, fileInfoClass=SMB2_FILE_BASIC_INFO)
        return struct.unpack_from("<QQQQI", info)

    def _streams(self, file):
        info = self._smb.queryInfo(self._tree, file, fileInfoClass=SMB2_FILE_STREAM_INFO)
        found = {}
        while info:
            following, length, size, _ = struct.unpack_from("<IIQQ", info)
            name = info[24 : 24 + length].decode("utf-16le")
            found[name[1:].removesuffix(":$DATA")] = size
            info = info[following:] if following else b""
        found.pop("", None)
        return found

    def _write(self, file, data):
        for at in range(0, len(data), PIECE):
            piece = data[at : at + PIECE]
            written = self._smb.write(self._tree, file, piece, at, len(piece))
            assert written == len(piece), (written, len(piece))

    def _open(self, path, access, disposition=FILE_OPEN, options=0, contexts=None):
        return self._smb.create(
            self._tree, path, access, SHARED, options, disposition, 0, createContexts=contexts
        )

    def _opened(self, *arguments):
        return _Opened(self._smb, self._tree, self._open(*arguments))


class _Opened:
    def __init__(self, smb, tree, file):
        self._smb, self._tree, self._file = smb, tree, file

    def __enter__(self):
        return self._file

    def __exit__(self, *_):
        self._smb.close(self._tree, self._file)
