#!/usr/bin/env python3
"""man_pages.py SOURCE: the pages of the library's functions say what include/mavoea.h says.

Every function is on one page, with the header's declaration. DESCRIPTION has the header's sentences
and no others: what tells of results may be missing there. RETURN VALUE, ERRORS and CODES have an
entry for each function, CODES with exactly the codes that the header names for it, and ERRORS with
each errno. The example of a page is a file of examples/, each of which is on one page. libmavoea(3)
has the header's constants and types, and what else callers need, as it is declared."""

import pathlib
import re
import sys

PROTOTYPE = re.compile(r"^MAVOEA_API (.*?;)", re.S | re.M)
COMMENT = re.compile(r"/\*((?:(?!\*/).)*)\*/\n(?=(.?))", re.S)
CODE = re.compile(r"0x[0-9A-F]+")
ERRNO = re.compile(r"\bE[A-Z]{3,}\b")
DEFINITION = re.compile(
    r"^(?:(?:typedef struct \w+|enum) \{.*?^\}.*?;$|#define MAVOEA_(?!H_|API|VERSION)\w+ .*?$)",
    re.S | re.M,
)
# A sentence of the header that may stand in another section than DESCRIPTION.
RESULT = re.compile(r"0x|-\d|\b[01]\b|errno|\breturns?\b|\bcodes?\b|NULL|\bfail|logged", re.I)
ENTRY = re.compile(r"^(\*\w+\*\(\)(?:, \*\w+\*\(\))*)\n((?:\t.*\n|\n(?=\t))+)", re.M)


def words(text):
    """What a text says: without its marks, and with blanks around each word."""
    text = re.sub(r"\\(.)", r"\1", text)
    text = text.replace("*mavoea-formats*(5)", "docs/formats.md")
    text = re.sub(r"(\w)\*?\(\d\)", r"\1", text)
    found = (word.strip("_") for word in re.findall(r"-?\d\w*|\w+", text))
    return f" {' '.join(filter(None, found))} "


def parts(text, end):
    return filter(str.strip, re.split(rf"(?<=[{end}])\s+", text))


class Header:
    def __init__(self, text):
        self.prototypes = {}
        self.comments = {}  # of functions
        self.general = {}  # of a function: what is said of all of its section
        general = ""
        comment = ""
        for found in re.finditer(rf"{COMMENT.pattern}|{PROTOTYPE.pattern}", text, re.S | re.M):
            body, behind, prototype = found.groups()
            if prototype:
                name = re.search(r"(\w+)\(", prototype)[1]
                self.prototypes[name] = " ".join(prototype.split())
                self.comments[name] = comment
                self.general[name] = general
                continue
            body = re.sub(r"\n \* ?", "\n", body).strip()
            if body.startswith("----"):
                general = ""
            elif behind == "M":
                comment = body
            elif behind == "\n":
                general = body


def section(page, title):
    found = re.search(rf"^# {title}\n(.*?)(?=^# |\Z)", page, re.S | re.M)
    return found[1] if found else ""


def entries(text):
    """[(function, its entry)] of a section, and what stands in front of the first one."""
    found = []
    for names, body in ENTRY.findall(text):
        found += [(name, body) for name in re.findall(r"\w+", names)]
    first = ENTRY.search(text)
    return found, text[: first.start()] if first else text


def described(text):
    """[(functions, text)] of DESCRIPTION, the text for all of them first."""
    head, *rest = re.split(r"^## (.*)\n", text, flags=re.M)
    titles = [re.findall(r"\w+", title) for title in rest[::2]]
    return [([], head), *zip(titles, rest[1::2])]


def faults_of_description(names, header, page):
    texts = described(section(page, "DESCRIPTION"))
    if [name for titles, _ in texts for name in titles] != names:
        yield "DESCRIPTION does not have each function once, in the order of NAME"
        return
    for titles, text in texts:
        whole = header.comments[titles[0]] if titles else header.general[names[0]]
        about = titles[0] if titles else "all"
        for part in parts(text, ".;:"):
            if words(part) not in words(whole):
                yield f"DESCRIPTION, {about}: not in the header: {' '.join(part.split())}"
        for part in parts(whole, "."):
            if not RESULT.search(part) and words(part) not in words(text):
                yield f"DESCRIPTION, {about}: only in the header: {' '.join(part.split())}"


def faults_of_results(names, header, page):
    for title in ("RETURN VALUE", "ERRORS", "CODES"):
        if sorted(name for name, _ in entries(section(page, title))[0]) != sorted(names):
            yield f"{title} does not have each function once"
    codes, for_all = entries(section(page, "CODES"))
    codes, errors = dict(codes), dict(entries(section(page, "ERRORS"))[0])
    sets = [(header.general[names[0]], for_all, "all")]
    # Functions under one comment share its codes.
    for comment in dict.fromkeys(header.comments[name] for name in names):
        under = [name for name in names if header.comments[name] == comment]
        sets.append((comment, "".join(codes.get(name, "") for name in under), ", ".join(under)))
        for name in ERRNO.findall(comment):
            if not any(name in errors.get(function, "") for function in under):
                yield f"ERRORS, {', '.join(under)}: {name} is missing"
    for comment, text, about in sets:
        if differing := set(CODE.findall(comment)) ^ set(CODE.findall(text)):
            yield f"CODES, {about}: only in the header or only here: {sorted(differing)}"


def faults_of_definitions(source):
    page = (source / "docs/man/libmavoea.3.scd").read_text()
    ours = (source / "include/mavoea.h").read_text()
    both = ours + (source / "platform/include/mavocore.h").read_text()
    declared = " ".join(both.replace("MAVOCORE_API ", "").split())
    shown = []
    for block in re.findall(r"^```\n(.*?)^```$", page, re.S | re.M):
        shown += [" ".join(part.split()) for part in re.split(r"\n\n|\n(?=#)", block)]
    for part in shown:
        if part not in declared:
            yield f"libmavoea.3.scd: in no header: {part}"
    for definition in DEFINITION.findall(ours):
        part = " ".join(definition.split())
        # libmavoea-errors(7) has the codes.
        if part not in shown and "MAVOEA_ERR_" not in part:
            yield f"libmavoea.3.scd: only in the header: {part}"


def faults(source):
    yield from faults_of_definitions(source)
    header = Header((source / "include/mavoea.h").read_text())
    if len(header.prototypes) != 53:
        yield f"{len(header.prototypes)} functions in the header"
    examples = {path.read_text(): path.name for path in (source / "examples").glob("*.c")}
    named, shown = [], []
    for path in sorted((source / "docs/man").glob("mavoea-*.3.scd")):
        page = path.read_text()
        own, *names = re.search(r"# NAME\n\n(.*?) - ", page, re.S)[1].split(", ")
        if own != path.name.removesuffix(".3.scd"):
            yield f"{path.name}: its name is not its own"
        named += names
        # In a literal block, too, a backslash takes another in front.
        example = re.fullmatch(r"\n```\n(.*?)```\n\n", section(page, "EXAMPLE"), re.S)
        text = re.sub(r"\\(.)", r"\1", example[1]) if example else None
        if text not in examples:
            yield f"{path.name}: the example is not in examples/"
        else:
            shown.append(examples[text])
        synopsis = re.search(r"# SYNOPSIS\n.*?```\n(.*?)\n```", page, re.S)[1]
        declared = [" ".join(part.split()) for part in synopsis.split(";")]
        if declared != [header.prototypes.get(name, "").rstrip(";") for name in names] + [""]:
            yield f"{path.name}: the synopsis is not the header's"
            continue
        for fault in faults_of_description(names, header, page):
            yield f"{path.name}: {fault}"
        for fault in faults_of_results(names, header, page):
            yield f"{path.name}: {fault}"
    if sorted(named) != sorted(header.prototypes):
        yield f"not on one page: {set(named) ^ set(header.prototypes) or 'named twice'}"
    if sorted(shown) != sorted(examples.values()):
        yield f"examples not on one page: {set(examples.values()) ^ set(shown) or 'shown twice'}"


wrong = list(faults(pathlib.Path(sys.argv[1])))
print("\n".join(wrong))
sys.exit(bool(wrong))
