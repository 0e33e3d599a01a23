#!/usr/bin/env python3
"""Shows which tests hold what the header and the documents promise.

    promises.py FILE...

splits the comments of headers, or the text of Markdown files, into sentences, and prints for each
one the tests that hold it. A test says so in lines right above it,

    // Promise: "MAVOEASRemove: 0x300"

with as many of the sentence's first words as make it the only one. A sentence is named with its
subject: the function, type, field or macro that a comment describes, or the title that the text is
under. Lists of results and codes are split at ';', and each row of a table is a sentence.

promises.txt names the sentences that have no test, indented below the reason. Fails when a sentence
has neither, and when a tag quotes no sentence any more, or a line of promises.txt none without a test.
"""

import re
import sys
from pathlib import Path

TESTS = Path(__file__).resolve().parent

COMMENT = re.compile(r"(?<!^#endif )/\*(.*?)\*/", re.S | re.M)
SUBJECT = re.compile(r"(\w+)\(|struct (\w+) \{|#define (\w+) \S|(enum) \{")
FIELD = re.compile(r"\s*(?:\w+\*? )*(\w+)(?:\[\w+\])?(?: = \w+)?[,;]?\s*$")
SECTION = re.compile(r"---- (.*?) -*$")
END = re.compile(r"(?<=[.;]) (?=[\"'`*(<A-Za-z0-9_-])|(?<=[^.][.;][)*]) ")
TABLE_HEAD = re.compile(r"^\|.*\n\|[-|]+$\n", re.M)
LABEL = re.compile(r"[A-Z][a-z]+\.")
TAG = re.compile(r'^// Promise: "(.*)"$', re.M)
TAGGED = re.compile(r"((?:^// Promise: .*\n)+)TEST\w*\(\s*(\w+),\s*(\w+)\)", re.M)


def sentences(text):
    """The sentences of a paragraph, a word in front of one included; none ends in parentheses."""
    begun = ""
    for part in filter(None, END.split(" ".join(text.split()))):
        begun = f"{begun} {part}" if begun else part
        if LABEL.fullmatch(begun) or begun.count("(") > begun.count(")"):
            continue
        yield begun.rstrip(".;")
        begun = ""
    if begun:
        yield begun


def header_sentences(text):
    """(subject, sentence) of each comment, which is behind what it describes or in front of it."""
    title = "mavoea.h"
    for comment in COMMENT.finditer(text):
        body = re.sub(r"\n \* ?", "\n", comment[1]).strip()
        if section := SECTION.match(body):
            title = section[1]
            continue
        before = FIELD.match(text[text.rfind("\n", 0, comment.start()) + 1 : comment.start()])
        behind = text[comment.end() + 1 :].split("\n\n")[0]
        found = SUBJECT.search(behind) if not behind.startswith(("\n", "/*")) else None
        subject = before[1] if before else next(filter(None, found.groups())) if found else title
        for paragraph in re.split(r"\n\s*\n|\n(?=  \S)", body):
            for sentence in sentences(paragraph):
                yield subject, sentence


def document_sentences(text):
    """(title, sentence) of each paragraph, list item, row of a table and block of code."""
    title = ""
    for block in re.split(r"\n\s*\n|\n(?=[|#-])", TABLE_HEAD.sub("", text)):
        if block.startswith("#"):
            title, _, block = block.lstrip("# ").partition("\n")
        if block.startswith("|"):
            yield title, " | ".join(cell.strip() for cell in block.strip("|\n ").split("|"))
        elif block.startswith("    "):
            yield title, block.split("\n")[0].strip()
        else:
            for sentence in sentences(block.removeprefix("- ")):
                yield title, sentence


def promises(path):
    split = header_sentences if path.suffix == ".h" else document_sentences
    return [f"{subject}: {sentence}" for subject, sentence in split(path.read_text())]


def quoted(words, sentences):
    """The sentences that begin with `words`; the one that consists of them before all others."""
    if words in sentences:
        return [words]
    end = len(words)
    return [s for s in sentences if s.startswith(words) and not s[end : end + 1].isalnum()]


def tests():
    """(test, words) of each tag; None for the test where a tag is not above one. A tag in a program
    in C is held when that is compiled."""
    for path in sorted(TESTS.glob("abi/*.c")):
        for words in TAG.findall(path.read_text()):
            yield path.name, words
    for path in sorted(TESTS.glob("*/*_test.cpp")):
        text = path.read_text()
        for tags, suite, name in TAGGED.findall(text):
            for words in TAG.findall(tags):
                yield f"{path.stem}: {suite}.{name}", words
        for words in TAG.findall(TAGGED.sub("", text)):
            yield None, f"{path.name}: {words}"


def excused():
    """(reason, words) of each indented line of promises.txt."""
    reason = ""
    for line in (TESTS / "promises.txt").read_text().splitlines():
        if line.startswith(" "):
            yield reason, line.strip()
        elif line:
            reason = line


def main(files):
    holders = {fact: [] for file in files for fact in promises(Path(file))}
    facts = list(holders)
    reasons = {}
    faults = []
    for test, words in tests():
        found = quoted(words, facts) if test else []
        if len(found) == 1:
            holders[found[0]].append(test)
        else:
            faults.append(f"{test or 'no test'}: quotes {len(found)} sentences: {words}")
    for reason, words in excused():
        found = [fact for fact in facts if fact.startswith(words)]
        reasons.update(dict.fromkeys(found, reason))
        if all(holders[fact] for fact in found):
            faults.append(f"promises.txt: quotes no sentence without a test: {words}")
    for fact, held_by in holders.items():
        print(fact)
        for holder in held_by or [reasons.get(fact, "NO TEST")]:
            print(f"    {holder}")
        faults += [] if held_by or fact in reasons else [f"no test: {fact}"]
    held = sum(1 for held_by in holders.values() if held_by)
    print(f"{len(holders)} sentences: {held} held by tests, {len(reasons)} excused")
    for fault in faults:
        print(fault, file=sys.stderr)
    return 1 if faults else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
