"""An smbd of one's own, in namespaces that hold its processes, its network and its volume.

    private_smbd.alone()                     # first of all: starts the program again in there
    with private_smbd.Smbd() as server: ...  # server.share(NAME) is a share's directory

All of it ends with the program, however that ends: the program is its namespace's first process.
"""

import fcntl
import os
import secrets
import shutil
import socket
import struct
import subprocess
import sys
import tempfile
import time

SKIPPED = 77
NEEDS = ("smbd", "smbpasswd", "setpriv", "unshare", "mkfs.ext4", "mount")

# How smbd keeps what a Mac stores with a file, by share.
SHARES = {
    "netatalk": {"fruit:metadata": "netatalk", "fruit:resource": "file"},
    "stream": {"fruit:metadata": "stream", "fruit:resource": "file"},
    "all-streams": {"fruit:metadata": "stream", "fruit:resource": "stream"},
    "native": {"fruit:metadata": "netatalk", "fruit:resource": "file", "fruit:encoding": "native"},
    "depot": {"fruit:metadata": "stream", "fruit:resource": "stream",
              "vfs objects": "catia fruit streams_depot"},
    "xattr": {"fruit:metadata": "netatalk", "fruit:resource": "xattr"},
}

ALONE = "MAVOEA_SMBD_ALONE"
ISOLATED = ["unshare", "--mount", "--net", "--pid", "--fork", "--kill-child"]
WITH_ITS_PARENT = ["setpriv", "--pdeathsig", "KILL"]  # SIGTERM is nothing to unshare
STARTED_WITHIN = 60  # seconds; it takes less than one


def skip(why):
    print(f"skipped: {why}")
    sys.exit(SKIPPED)


def alone():
    """Continues where nobody else is. Ends with SKIPPED where that cannot be."""
    if ALONE in os.environ:
        del os.environ[ALONE]
        return
    os.environ["PATH"] += os.pathsep + "/usr/sbin"
    for program in NEEDS:
        if shutil.which(program) is None:
            skip(f"there is no {program}")
    try:
        import impacket  # noqa: F401
    except ImportError:
        skip("there is no impacket")
    if subprocess.run([*ISOLATED, "true"], stderr=subprocess.DEVNULL, check=False).returncode:
        skip("namespaces take the superuser")
    os.environ[ALONE] = "1"
    command = [*WITH_ITS_PARENT, *ISOLATED, sys.executable, *sys.argv]
    sys.exit(subprocess.run(command, check=False).returncode)


def _run(*command, **options):
    result = subprocess.run(
        command, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, check=False, **options
    )
    if result.returncode:
        raise RuntimeError(f"{command}: {result.stdout.decode(errors='replace')}")


def _loopback_up():
    """The network is new, and its only interface down."""
    IFF_UP, SIOCGIFFLAGS, SIOCSIFFLAGS = 1, 0x8913, 0x8914
    with socket.socket(socket.AF_INET, socket.SOCK_DGRAM) as any_socket:
        request = struct.pack("16sH14x", b"lo", 0)
        flags = struct.unpack("16sH14x", fcntl.ioctl(any_socket, SIOCGIFFLAGS, request))[1]
        request = struct.pack("16sH14x", b"lo", flags | IFF_UP)
        fcntl.ioctl(any_socket, SIOCSIFFLAGS, request)


class Smbd:
    name = "SAMBA"
    address = "127.0.0.1"
    port = 445
    user = "root"

    def __init__(self):
        self.password = secrets.token_hex(8)
        self._smbd = None

    def share(self, name):
        return os.path.join(self._volume, name)

    def log(self):
        with open(self._log, errors="replace") as file:
            return file.read()

    def __enter__(self):
        self._room = tempfile.mkdtemp(prefix="mavoea-smbd-")
        try:
            _run("mount", "-t", "tmpfs", "-o", "mode=755", "none", self._room)
            self._make_volume()
            _loopback_up()
            self._start()
        except BaseException:
            self.__exit__()
            raise
        return self

    def __exit__(self, *_):
        if self._smbd is not None:
            self._smbd.terminate()
            self._smbd.wait()
        for path in (os.path.join(self._room, "volume"), self._room):
            if os.path.ismount(path):
                _run("umount", "-l", path)
        os.rmdir(self._room)

    def _make_volume(self):
        """On a file system that has values of up to 64 KiB."""
        disk = os.path.join(self._room, "disk")
        self._volume = os.path.join(self._room, "volume")
        with open(disk, "wb") as file:
            file.truncate(256 << 20)
        os.mkdir(self._volume)
        _run("mkfs.ext4", "-q", "-b", "4096", "-O", "ea_inode", disk)
        try:
            _run("mount", "-o", "loop", disk, self._volume)
        except RuntimeError as error:
            skip(f"nothing can be mounted: {error}")
        for name in SHARES:
            os.mkdir(self.share(name))

    def _start(self):
        configuration = os.path.join(self._room, "smb.conf")
        self._log = os.path.join(self._room, "log")
        settings = {
            "netbios name": self.name,
            "server role": "standalone server",
            "passdb backend": f"smbpasswd:{self._room}/smbpasswd",
            "interfaces": "lo",
            "bind interfaces only": "yes",
            "smb ports": self.port,
            "disable netbios": "yes",
            "load printers": "no",
            "printcap name": "/dev/null",
            "vfs objects": "catia fruit streams_xattr",
            "fruit:veto_appledouble": "no",
        }
        for folder in ("private", "state", "lock", "pid", "cache", "ncalrpc"):
            path = os.path.join(self._room, folder)
            os.mkdir(path, 0o700 if folder == "private" else 0o755)
            settings[folder + (" dir" if folder in ("private", "ncalrpc") else " directory")] = path
        with open(configuration, "w") as file:
            sections = {"global": settings}
            for name, options in SHARES.items():
                sections[name] = {"path": self.share(name), "read only": "no", **options}
            for section, values in sections.items():
                lines = (f"{name} = {value}" for name, value in values.items())
                print(f"[{section}]", *lines, sep="\n", file=file)
        secret = f"{self.password}\n" * 2
        _run("smbpasswd", "-c", configuration, "-L", "-a", "-s", self.user, input=secret.encode())
        with open(self._log, "w") as log:
            self._smbd = subprocess.Popen(
                ["smbd", "-s", configuration, "--foreground", "--no-process-group",
                 "--debug-stdout"],
                stdin=subprocess.DEVNULL, stdout=log, stderr=log,
                start_new_session=True,  # it ends its whole process group
            )
        deadline = time.monotonic() + STARTED_WITHIN
        while True:
            try:
                socket.create_connection((self.address, self.port)).close()
                return
            except OSError:
                if self._smbd.poll() is not None or time.monotonic() > deadline:
                    raise RuntimeError(f"smbd does not answer:\n{self.log()}") from None
                time.sleep(0.02)
