#!/usr/bin/env python3
"""man_pages.py SOURCE: every function of mavoea.h is in the NAME and the SYNOPSIS of one page, with
the header's prototype, and each example in a page is a file of examples/."""

import pathlib
import re
import sys

source = pathlib.Path(sys.argv[1])
header = (source / "include/mavoea.h").read_text()
prototypes = {}
for text in re.findall(r"^MAVOEA_API (.*?;)", header, re.S | re.M):
    prototypes[re.search(r"(\w+)\(", text)[1]] = " ".join(text.split())
examples = {path.read_text(): path.name for path in (source / "examples").glob("*.c")}

wrong = [] if len(prototypes) == 53 else [f"{len(prototypes)} functions in the header"]
named, shown = [], set()
for path in sorted((source / "docs/man").glob("mavoea-*.3.scd")):
    page = path.read_text()
    own, *names = re.search(r"# NAME\n\n(.*?) - ", page, re.S)[1].split(", ")
    if own != path.name.removesuffix(".3.scd"):
        wrong.append(f"{path.name}: its name is not its own")
    synopsis = re.search(r"# SYNOPSIS\n.*?```\n(.*?)\n```", page, re.S)[1].split("\n")
    named += names
    if synopsis != [prototypes.get(name) for name in names]:
        wrong.append(f"{path.name}: the synopsis is not the header's")
    # In a literal block, too, a backslash takes another in front.
    for example in re.findall(r"# EXAMPLE\n\n```\n(.*?)```\n", page, re.S):
        example = re.sub(r"\\(.)", r"\1", example)
        if example not in examples:
            wrong.append(f"{path.name}: the example is not in examples/")
        shown.add(examples.get(example))
if sorted(named) != sorted(prototypes):
    wrong.append(f"not in one page: {set(named) ^ set(prototypes) or 'named twice'}")
if shown != set(examples.values()):
    wrong.append(f"examples that no page shows: {set(examples.values()) - shown}")
print("\n".join(wrong))
sys.exit(bool(wrong))
