"""What must be so whatever a command meets.

Looking, and saying what would be done, change nothing. What is there before a command is there
afterwards, at whatever place, unless the command was told to remove or replace it. A copy or move
to where nothing was has, with status 0, all that its source had. A dry run says what the real run
says.
"""

import os
import re

from growing import FINDER_INFO
from world import TOKEN, Wrong, is_below

BLANK = bytes(32)
TEMPORARY = re.compile(rb"\.mavoea-[A-Za-z0-9]{8}\b")
HIDDEN = b"/@eaDir/"
SAYING = ("cp", "mv", "rm", "convert", "upgrade", "repair", "import", "check")


class Holdings:
    """All that two volumes hold, before or after a command."""

    def __init__(self, world):
        self.things = world.things()
        self.metadata = world.metadata()
        self.information = world.information()

    def facts(self):
        """{fact: paths that have it}. A fact is a kind and what has a token."""
        found = {}

        def add(kind, text, path):
            text = text if isinstance(text, bytes) else str(text).encode()
            if TOKEN.search(text):
                found.setdefault((kind, text), set()).add(path)

        for path, thing in self.things.items():
            if thing.data is not None and not is_record(thing.data):
                add(b"target" if thing.is_link() else b"data", thing.data, path)
            for value in thing.attributes.values():
                if TOKEN.fullmatch(value) and value.startswith(b"<own"):
                    add(b"own attribute", value, path)
        for path, values in self.metadata.items():
            for name, value in values.items():
                add(name, value, path)
        for path, shown in self.information.items():
            for what, value in shown.items():
                add(what.encode(), value, path)
        return found

    def bytes(self):
        """Everything in which a token may be."""
        return b"\0".join(part for path, thing in self.things.items()
                          for part in (path, thing.data or b"", *thing.attributes.values()))


def is_record(data):
    return data.startswith(b"\0\5\x16\7")


def owners(path):
    """The path, and those of all objects that what lies there may belong to by its name."""
    found = [path]
    parent, hidden, rest = path.partition(HIDDEN)
    if hidden:
        ends = [at for at, byte in enumerate(rest) if byte in b"@/"] + [len(rest)]
        found += [parent + b"/" + rest[:end] for end in ends]
    parent, name = os.path.split(path)
    if name.startswith(b"._"):
        found.append(parent + b"/" + name[2:])
    return found


def targets(world, command, before):
    """{path at the destination: path of its source}, of everything in the sources."""
    if command.name not in ("cp", "mv", "convert"):
        return {}
    destination = world.path(*command.destination)
    into = (command.name != "convert" and "-T" not in command.options and
            os.path.isdir(destination))
    if into and before.things.get(destination) and before.things[destination].is_link():
        destination = os.path.realpath(destination)
    found = {}
    for source in command.sources:
        root = world.path(*source)
        to = destination + b"/" + os.path.basename(root) if into else destination
        for path in before.things:
            if is_below(path, root) and not is_below(path, to):
                found.setdefault(to + path[len(root):], path)
    return found


class Judge:
    def __init__(self, world, command):
        self.world, self.command = world, command
        self.sources = [world.path(*source) for source in command.sources]
        self.words = [command.name, *command.options, "--", *self.sources]
        if command.destination:
            self.words.append(world.path(*command.destination))

    def judge(self):
        before = self.look()
        self.targets = targets(self.world, self.command, before)
        dry = self.dry_run(before)
        saying = ["-v"] if self.command.name in SAYING else []
        real = self.world.run(self.command.name, *saying, *self.words[1:])
        self.world.history.append((self.words, real))
        self.agree(dry, real)
        after = Holdings(self.world)
        self.nothing_lost(before, after)
        self.sources_stay(before, after)
        if real[0] == 0:
            self.all_arrived(before, after)

    # ---- Looking ----

    def look(self):
        before = self.world.things()
        source = self.sources[0]
        kind = self.world.declared[-1].rpartition(b"=")[2]
        for root in self.world.separate():
            for words in (["list", "-lr"], ["show", "-r"], ["check", "-r"], ["save", "-r"],
                          ["clean", "-r"]):
                self.world.run(*words, "--", root)
        self.world.run("where", "--", source)
        if self.command.destination:
            to = self.world.path(*self.command.destination)
            self.world.run("diff", "-r", "--data", "--", source, to)
            self.world.run("plan", "-r", "--to", kind, "--", source, to)
        holdings = Holdings(self.world)
        self.same("looking", before, holdings.things)
        return holdings

    def dry_run(self, before):
        option = "--dry-run" if self.command.name in ("cp", "mv") else "-n"
        saying = ["-v"] if self.command.name in SAYING else []
        said = self.world.run(self.command.name, option, *saying, *self.words[1:])
        self.same("a dry run", before.things, self.world.things())
        return said

    def same(self, what, before, after):
        for path in before.keys() | after.keys():
            one, other = before.get(path), after.get(path)
            if one is None or other is None or vars(one) != vars(other):
                raise Wrong(f"{what} changes {path}")

    def agree(self, dry, real):
        if os.geteuid() != 0:
            return  # what a user may not do is foreseen only in part
        # Where not all arrives, the numbers of what does may differ.
        for what, one, other in zip(("status", "output", "errors"), dry, real):
            if isinstance(one, bytes):
                one, other = (TEMPORARY.sub(b".mavoea-TEMPORARY", text) for text in (one, other))
            if one != other:
                raise Wrong(f"the dry run of {self.command.name} has another {what}:\n"
                            f"{one}\nand not\n{other}")
            if real[0] != 0:
                return

    # ---- Losses ----

    def nothing_lost(self, before, after):
        facts, there, everything = before.facts(), after.facts(), None
        for fact, paths in facts.items():
            if fact in there or all(self.may_go(path, fact, before) for path in paths):
                continue
            everything = everything or after.bytes()
            kind, text = fact
            if all(token in everything for token in TOKEN.findall(text)):
                if self.may_be_elsewhere(kind):
                    continue
                raise Wrong(f"{self.command.name} hides {kind} {text[:40]} of {sorted(paths)}")
            raise Wrong(f"{self.command.name} loses {kind} {text[:40]} of {sorted(paths)}")

    def may_be_elsewhere(self, kind):
        """What was data may be metadata now, an own attribute may be an attribute of the Mac's."""
        return kind in (b"data", b"own attribute", b"comment", b"afpComment")

    def may_go(self, path, fact, before):
        """Whether the command was told to remove or replace what is at the path."""
        name, options = self.command.name, self.command.options
        if name == "rm":
            return any(is_below(owner, source) for owner in owners(path)
                       for source in self.sources)
        if name == "clean":  # what is left over
            return fact[0] in (b"data", b"target") and b"stray" in fact[1]
        if name == "import":  # of two values, the "._" file's
            return path in before.metadata and fact[0] in before.metadata[path]
        if not {"-n", "-b", "--backup=numbered"} & {*options} or self.merged(path, before):
            return (self.is_replaced(path, before) or
                    any(owner in self.targets for owner in owners(path)[1:]))
        return False

    def merged(self, path, before):
        source = self.targets.get(path)
        return (source is not None and "-n" not in self.command.options and
                before.things[source].is_directory())

    def is_replaced(self, path, before):
        there = before.things.get(path)
        replaced = {before.things[to].inode for to in self.targets if to in before.things}
        return path in self.targets and there is not None or (
            there is not None and not there.is_directory() and there.inode in replaced)

    def sources_stay(self, before, after):
        if self.command.name not in ("cp", "convert"):
            return
        roots = {os.path.commonpath([to, self.world.path(*self.command.destination)])
                 for to in self.targets}
        for path, thing in before.things.items():
            if not any(is_below(path, source) for source in self.sources):
                continue
            if any(is_below(path, root) or is_below(root, path) for root in roots):
                continue
            if path not in after.things or vars(after.things[path]) != vars(thing):
                raise Wrong(f"{self.command.name} changes its source {path}")

    # ---- Arrival ----

    def all_arrived(self, before, after):
        if {"-n", "-u"} & {*self.command.options}:
            return
        inodes = {}
        for to, source in self.targets.items():
            if to in before.things or HIDDEN in source or self.meets(to, before):
                continue
            thing = before.things[source]
            if source not in before.metadata:
                continue  # metadata itself, or none of the tool's objects
            if to not in after.things:
                raise Wrong(f"status 0, and {source} is not at {to}")
            copy = after.things[to]
            if (thing.mode ^ copy.mode) & 0o170000 or thing.data != copy.data:
                raise Wrong(f"status 0, and {to} has not what {source} had")
            self.same_metadata(source, to, before, after)
            inodes.setdefault(thing.inode, set()).add(copy.inode)
        if "-a" in self.command.options and any(len(copies) > 1 for copies in inodes.values()):
            raise Wrong("status 0, and names of one file are names of several")

    def meets(self, to, before):
        """Whether something else is, or was, at the destination, or on the way there."""
        sources = [one for other, one in self.targets.items() if other == to]
        ways = (other for other in self.targets if other in before.things and is_below(to, other))
        return len(sources) > 1 or any(not before.things[way].is_directory() for way in ways)

    def same_metadata(self, source, to, before, after):
        was, now = before.metadata[source], after.metadata.get(to, {})
        for name, value in was.items():
            if now.get(name) != value and not (name == FINDER_INFO and value == BLANK):
                raise Wrong(f"status 0, and {to} has not {name} of {source}: {value[:40]}, "
                            f"{now.get(name, b'')[:40]}")
        shown, arrived = before.information.get(source, {}), after.information.get(to, {})
        for what, value in shown.items():
            if arrived.get(what) != value:
                raise Wrong(f"status 0, and {to} shows another {what} than {source}: {value}, "
                            f"{arrived.get(what)}")
        own = {value for value in before.things[source].attributes.values()
               if TOKEN.fullmatch(value) and value.startswith(b"<own")}
        there = {*after.things[to].attributes.values(), *now.values()}
        if not own <= there and self.keeps_attributes():
            raise Wrong(f"status 0, and {to} has not {own - there} of {source}")

    def keeps_attributes(self):
        return self.command.name != "cp" or "-a" in self.command.options
