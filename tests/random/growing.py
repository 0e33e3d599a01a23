"""Random shares: what is on them, and what is then done with them.

A round is a pair of volumes, the steps that fill them, and one to three commands. It follows from
its seed alone. Whatever has contents has a token in them that nothing else has, "<data7>" for
example, so that it can be found again wherever it is carried.
"""

import os
import random
from typing import NamedTuple

KINDS = ["appledouble", "eadir", "fileea", "samba", "samba-stream", "samba-all-streams", "netatalk",
         "netatalk-samba", "linux"]
FORK, FINDER_INFO = b"com.apple.ResourceFork", b"com.apple.FinderInfo"

OTHER_NAMES = [
    b"y", b"Y", b"._y", b"z", b"dir", b"@eaDir", b"@MavoResource", b".mavoea-abc", b".DS_Store",
    b"__MACOSX", b".AppleDouble", b"._", b"._.", b"x@y", b"a;b", b"..x", b"e\xcc\x81",
    b"L" * 254 + b"1", b"L" * 254 + b"2", b"L" * 243 + b"a", b"N" * 255, b"\xef\x80\xa2q",
    b"._.DS_Store",
]
ATTRIBUTES = [
    b"com.example.colour", b"com.example.colour", b"com.x", b"com.X", b"a:b", b"na\xc3\xafve",
    b"w\nl", b"sp ace", b"user.q", b"k" * 100, b"k" * 240, b"com.apple.metadata:kMDItemWhereFroms",
    b"com.apple.quarantine", b"a/b", b"a\xef\x80\xa2b", b"trailing.", b'q*?"<>|',
]
OWN_ATTRIBUTES = ["user.foo", "user.bar", "user.DosStream.zz:$DATA", "user.com.x"]
COPIES = [["-r"], ["-a"], ["-a"], ["-rp"], ["-dR"], ["-rP"]]


class Volume(NamedTuple):
    """`where`: "disk", "memory", or "below": a directory of the other volume."""

    where: str
    kind: str


class Step(NamedTuple):
    """One thing to put on a volume: `args` depend on `what`. Steps that cannot be done are not."""

    what: str
    volume: str
    path: bytes
    args: tuple = ()


class Command(NamedTuple):
    """Paths are pairs of a volume and a path on it."""

    name: str
    options: list
    sources: list
    destination: tuple | None = None


class Round(NamedTuple):
    volumes: dict
    steps: list
    commands: list


class Grower:
    def __init__(self, seed):
        self.random = random.Random(seed)
        self.tokens = 0
        self.names = []

    def round(self):
        kind = self.random.choice(KINDS)
        volumes = {"s": Volume(self.random.choice(["disk", "memory"]), kind)}
        layout = self.random.random()
        if layout < 0.2:
            volumes["d"] = Volume("below", kind)
        else:
            other = self.random.choice(KINDS) if layout > 0.4 else kind
            volumes["d"] = Volume(self.random.choice(["disk", "memory"]), other)
        steps = []
        sources = [path for path in self.tree("s", b"t", self.random.randint(1, 12), steps)
                   if not path.endswith(b"/@eaDir")]  # goes when what is beside it goes
        destinations = []
        if self.random.random() < 0.5:
            root = self.random.choice([b"t", b"t", b"e"])
            destinations = self.tree("d", root, self.random.randint(1, 8), steps)
        commands = [self.command(sources, destinations, volumes["d"].kind)
                    for _ in range(self.random.choice([1, 1, 1, 2, 3]))]
        return Round(volumes, steps, commands)

    # ---- What is on a volume ----

    def token(self, kind):
        self.tokens += 1
        return b"<%s%d>" % (kind, self.tokens)

    def some_names(self):
        """Few, and near each other, so that they meet at the destination."""
        choice = self.random.choice
        base = choice([b"x", b"a b", b"\xc3\xa9", b"nl\nq", b"c:o", b"\x01k", b"-n", b"\xff\xfe",
                       b"back\\sl", b"report.pdf", b"L" * self.random.randint(236, 255),
                       b"\xc3\xa9" * self.random.randint(118, 127)])
        near = [b"._" + base, b"._._" + base, base.upper(), base.lower(), base + b"~", base + b"2",
                base + b".~1~", base + b"@MavoEAStream", b".mavoea-kept-._" + base]
        names = [base, *self.random.sample(near, self.random.randint(1, 4)),
                 *self.random.sample(OTHER_NAMES, self.random.randint(1, 5))]
        return [name for name in names if len(name) <= 255]

    def value(self, kind=b"value"):
        token, chance = self.token(kind), self.random.random()
        if chance < 0.75:
            return token
        if chance < 0.85:
            return token + b"\0"
        if chance < 0.95:
            return token + self.random.randbytes(self.random.choice([50, 300, 4000]))
        return token + b"y" * self.random.choice([60000, 140000])

    def tree(self, volume, root, count, steps):
        """Adds a tree's steps; the paths of its objects."""
        if not self.names or self.random.random() < 0.3:
            self.names = self.some_names()
        steps.append(Step("directory", volume, root))
        directories, files, objects = [root], [], [root]
        for _ in range(count):
            path = self.random.choice(directories) + b"/" + self.random.choice(self.names)
            if path in objects or len(path) > 1500:
                continue
            chance = self.random.random()
            if chance < 0.6:
                data = b"" if chance < 0.05 else self.value(b"data")
                steps.append(Step("file", volume, path, (data,)))
                files.append(path)
            elif chance < 0.84:
                steps.append(Step("directory", volume, path))
                directories.append(path)
            elif chance < 0.9:
                prefix = self.random.choice([b"/nowhere/", b""])
                steps.append(Step("link", volume, path, (prefix + self.token(b"link"),)))
            elif chance < 0.97 and files:
                steps.append(Step("name", volume, path, (self.random.choice(files),)))
                files.append(path)
            else:
                steps.append(Step("pipe", volume, path))
            objects.append(path)
        for path in objects:
            # An EA directory's own attributes go with it.
            if not path.endswith(b"/@eaDir") and self.random.random() < 0.65:
                for _ in range(self.random.choice([1, 1, 2, 3])):
                    steps.append(self.metadata(volume, path))
        if self.random.random() < 0.4:
            for _ in range(self.random.randint(1, 3)):
                steps.append(self.stray(volume, self.random.choice(objects)))
        for path in objects:
            if self.random.random() < 0.15 and os.geteuid() == 0:
                mode = self.random.choice([0o444, 0o400, 0o000, 0o555, 0o2755, 0o600])
                steps.append(Step("mode", volume, path, (mode,)))
            if self.random.random() < 0.3:
                steps.append(Step("time", volume, path, (self.random.randrange(10**9, 2 * 10**9),)))
        return objects[1:]

    def metadata(self, volume, path):
        chance = self.random.random()
        if chance < 0.45:
            return Step("set", volume, path, (self.random.choice(ATTRIBUTES), self.value()))
        if chance < 0.6:
            return Step("set", volume, path, (FORK, self.value()))
        if chance < 0.68:
            return Step("set", volume, path, (FINDER_INFO, b"TEXT%-4d" % self.tokens + bytes(24)))
        if chance < 0.88:
            comment, tag = self.token(b"comment").decode(), self.token(b"tag").decode()
            return Step("set-info", volume, path, tuple(self.random.choice([
                ["--type", "TEXT"], ["--label", "red"], ["--flags", "invisible"],
                ["--flags", "stationery"], ["--comment", comment], ["--tags", tag + ":red"],
                ["--created", "2020-05-01T09:30:00Z"]])))
        if chance < 0.93:
            return Step("lock", volume, path)
        return Step("attribute", volume, path,
                    (self.random.choice(OWN_ATTRIBUTES), self.token(b"own")))

    def stray(self, volume, path):
        """Something where metadata might be, that no command of the tool has put there."""
        parent, name = os.path.split(path)
        beside, hidden = parent + b"/._" + name, parent + b"/@eaDir/"
        token = self.token(b"stray")
        return self.random.choice([
            Step("file", volume, beside, (token,)),
            Step("file", volume, parent + b"/._gone", (token,)),
            Step("file", volume, hidden + b"readme", (token,)),
            Step("file", volume, hidden + name + b"@OtherThumbnail", (token,)),
            Step("file", volume, hidden + name[:230] + b"@MavoEAStream", (token,)),
            Step("file", volume, hidden + b"sub/gone", (token,)),
            Step("file", volume, parent + b"/.mavoea-ABCDef", (token,)),
            Step("directory", volume, parent + b"/@eaDir"),
            Step("directory", volume, beside),
            Step("link", volume, beside, (token,)),
            Step("mac", volume, beside, (token, self.token(b"value"))),
            Step("mac", volume, beside, (token, self.token(b"value"))),
        ])

    # ---- What is done with it ----

    def command(self, sources, destinations, kind):
        name = self.random.choice(
            ["cp"] * 4 + ["mv"] * 4 + ["convert"] * 3 +
            ["rm", "upgrade", "repair", "check", "clean", "import", "mv here"])
        whole = ("s", b"t")
        if name in ("cp", "mv"):
            return self.carrying(name, sources, destinations)
        if name == "mv here":
            source = self.random.choice([whole, *(("s", path) for path in sources)])
            target = self.random.choice([b"t2", b"t/" + self.random.choice(self.names)])
            return Command("mv", self.some_of([("-T", 0.3), ("-f", 0.3), ("-n", 0.1), ("-b", 0.2)]),
                           [source], ("s", target))
        if name == "convert":
            workers = self.random.choice([[], ["-j", "2"]])
            return Command(name, ["-r", *workers, "--to", kind], [whole], self.target(destinations))
        if name == "rm":
            some = self.random.sample(sources, min(len(sources), 2))
            return Command(name, ["-rf"], [("s", path) for path in some] or [whole])
        options = {"check": ["-r", "--repair", "--yes"], "clean": ["-r", "--yes", "--wait", "0"],
                   "import": ["-r", "--keep"]}
        return Command(name, options.get(name, ["-r"]), [whole])

    def carrying(self, name, sources, destinations):
        taken = [b"t"]
        if sources and self.random.random() < 0.5:
            taken = self.random.sample(sources, min(len(sources), self.random.randint(1, 3)))
            taken = [path for path in taken
                     if not any(path.startswith(other + b"/") for other in taken)]
        options = self.some_of([("-b", 0.1), ("--backup=numbered", 0.1), ("-n", 0.1),
                                ("-u", 0.1)])[:1]
        if name == "cp":
            options += self.random.choice(COPIES)
            options += self.some_of([("-f", 0.15), ("--atomic", 0.2),
                                     ("--remove-destination", 0.1)])
        target = self.target(destinations)
        if len(taken) > 1:
            target = ("d", self.random.choice([b"", b"t", b"e"]))
        elif self.random.random() < 0.2:
            options.append("-T")
        return Command(name, options, [("s", path) for path in taken], target)

    def target(self, destinations):
        path = self.random.choice([b"", b"new", b"new", b"t", b"e"])
        if destinations and self.random.random() < 0.2:
            path = self.random.choice(destinations)
        return ("d", path)

    def some_of(self, options):
        return [option for option, chance in options if self.random.random() < chance]
