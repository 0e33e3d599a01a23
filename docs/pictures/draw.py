#!/usr/bin/env python3
"""Draws the pictures of the documents: draw.py [--check].

Without --check the SVG files beside this script are written anew; with it they are compared with what
would be written. Places and widths are counted here, and no font is asked, so that the files are the
same on every machine. Colours follow the reader's light or dark scheme.
"""

import sys
from html import escape
from pathlib import Path

STYLE = """
  .paper { fill: #ffffff; stroke: #d5dae1 }
  .band { fill: #f4f6f9 }
  .box { fill: #ffffff; stroke: #b4bcc8 }
  .open { fill: none; stroke: #8a94a3; stroke-dasharray: 4 3 }
  .line { fill: none; stroke: #8a94a3; stroke-width: 1.5 }
  .head { fill: #8a94a3 }
  text { fill: #1d2430; font: 13px system-ui, -apple-system, "Segoe UI", "DejaVu Sans", sans-serif }
  .strong { font-weight: 600 }
  .big { font-weight: 600; font-size: 15px }
  .soft { fill: #5c6674; font-size: 12px }
  .mono { font: 12px ui-monospace, "DejaVu Sans Mono", Menlo, Consolas, monospace }
  .chip text { font-size: 11px; text-anchor: middle }
  .attribute rect { fill: #cfe3fb; stroke: #6ea3dd } .attribute text { fill: #123e6e }
  .finder rect { fill: #fde3b3; stroke: #d9a441 } .finder text { fill: #5f4006 }
  .fork rect { fill: #cdeccf; stroke: #6cb472 } .fork text { fill: #1b4f21 }
  .record rect { fill: #e3d7f7; stroke: #a287d0 } .record text { fill: #432a72 }
  .marks rect { fill: #f9d3d6; stroke: #d98890 } .marks text { fill: #6b1f27 }
  .maybe rect { stroke-dasharray: 3 2 }
  .good { fill: #6cb472 }
  .pale { fill: #cdeccf }
  .source { fill: #6ea3dd }
  @media (prefers-color-scheme: dark) {
    .paper { fill: #161b22; stroke: #343c47 }
    .band { fill: #1f262f }
    .box { fill: #161b22; stroke: #56606e }
    text { fill: #e3e8ef }
    .soft { fill: #9aa5b4 }
    .attribute rect { fill: #17395f; stroke: #4f86c2 } .attribute text { fill: #cfe3fb }
    .finder rect { fill: #523a0b; stroke: #b98a2f } .finder text { fill: #fde3b3 }
    .fork rect { fill: #1c4722; stroke: #559a5c } .fork text { fill: #cdeccf }
    .record rect { fill: #3b2a5e; stroke: #8a6fc0 } .record text { fill: #e3d7f7 }
    .marks rect { fill: #5b2127; stroke: #b8666f } .marks text { fill: #f9d3d6 }
    .good { fill: #559a5c }
    .pale { fill: #1c4722; }
    .source { fill: #4f86c2 }
  }
"""

# What a file has besides its data: the word on a chip, its class and width, and what it stands for.
ITEMS = {
    "A": ("attributes", "attribute", 68, "named attributes"),
    "F": ("Finder", "finder", 48, "Finder info"),
    "R": ("fork", "fork", 38, "resource fork"),
    "C": ("record", "record", 48, "comment, dates, AFP word"),
    "M": ("marks", "marks", 46, "locked, hidden, archived"),
    "L": ("locked", "marks", 48, ""),
}
MONO = 7.25  # of 12 px, a character
CHIP_GAP = 4
LINE = 30
PADDING = 10

# A row: the type, what it is for, and what lies in the object's own attributes, in a file beside it
# and in "@eaDir": names, each with its items; a small letter: not always. N is the object's name.
OWN = ("The library's own types", "places", [
    ("appledouble", "FAT, NTFS, SMB, NFS", [("mode", "L")], [("._N", "AFRc")], []),
    ("eadir", "ext4, XFS, tmpfs", [("user.mavo.attributes", "M")], [],
     [("N@MavoEAStream", "A"), ("N@MavoResource", "FRC")]),
    ("eadir, legacy", "as earlier versions had it", [("user.mavo.attributes", "M")], [],
     [("N/NAME", "A"), ("N/MAVO:Resource", "FRC")]),
    ("fileea", "btrfs", [("user.netatalk.Metadata", "FC"), ("user.mavo.attributes", "M")], [],
     [("N@MavoEAStream", "A"), ("N@MavoResource", "R")]),
    ("xattr", "HFS+",
     [("NAME", "A"), ("com.apple.FinderInfo", "F"), ("com.apple.ResourceFork", "R"), ("mode", "L")],
     [], []),
])
OTHERS = ("Other programs' types", "places-of-others", [
    ("samba", "fruit's defaults",
     [("user.DosStream.NAME:$DATA", "A"), ("user.org.netatalk.Metadata", "FC"),
      ("user.DOSATTRIB", "M")], [("._N", "R")]),
    ("samba-stream", "metadata = stream",
     [("user.DosStream.NAME:$DATA", "A"), ("user.DosStream.AFP_AfpInfo:$DATA", "F"),
      ("user.org.netatalk.Metadata", "C"), ("user.DOSATTRIB", "M")], [("._N", "R")]),
    ("samba-all-streams", "resource = stream, too",
     [("user.DosStream.NAME:$DATA", "A"), ("user.DosStream.AFP_AfpInfo:$DATA", "F"),
      ("user.DosStream.AFP_Resource:$DATA", "R"), ("user.org.netatalk.Metadata", "C"),
      ("user.DOSATTRIB", "M")], []),
    ("netatalk", "ea = sys", [("user.NAME", "A"), ("user.org.netatalk.Metadata", "FCM")],
     [("._N", "R")]),
    ("netatalk-samba", "ea = samba",
     [("user.NAME, and a NUL", "A"), ("user.org.netatalk.Metadata", "FCM")], [("._N", "R")]),
    ("linux", "copies by rsync -X",
     [("user.NAME", "A"), ("user.com.apple.FinderInfo", "F"), ("user.com.apple.ResourceFork", "R"),
      ("user.org.netatalk.Metadata", "C"), ("user.DOSATTRIB", "M"), ("mode", "L")], []),
])
LANES = ("on N itself: extended attributes, mode", "beside it", "in @eaDir beside it")


def number(value):
    return f"{value:.1f}".removesuffix(".0")


class Picture:
    def __init__(self, title):
        self.title = title
        self.parts = []

    def rect(self, kind, x, y, width, height, corner=6):
        self.parts.append(f'<rect class="{kind}" x="{number(x)}" y="{number(y)}" width="{number(width)}"'
                          f' height="{number(height)}" rx="{corner}"/>')

    def text(self, kind, x, y, text, anchor="", length=0):
        more = f' text-anchor="{anchor}"' if anchor else ""
        if length:
            more += f' textLength="{number(length)}" lengthAdjust="spacingAndGlyphs"'
        self.parts.append(f'<text class="{kind}" x="{number(x)}" y="{number(y)}"{more}>'
                          f'{escape(text, quote=False)}</text>')

    def chip(self, x, y, item):
        word, kind, width, _ = ITEMS[item.upper()]
        maybe = " maybe" if item.islower() else ""
        self.parts.append(
            f'<g class="chip {kind}{maybe}"><rect x="{number(x)}" y="{number(y)}" width="{width}"'
            f' height="18" rx="9"/><text x="{number(x + width / 2)}" y="{number(y + 13)}">{word}</text></g>')
        return width

    def svg(self, width, height):
        return "\n".join([
            f'<svg xmlns="http://www.w3.org/2000/svg" width="{number(width)}" height="{number(height)}"'
            f' viewBox="0 0 {number(width)} {number(height)}" role="img">',
            f"<title>{escape(self.title, quote=False)}</title>",
            f"<style>{STYLE}</style>",
            *self.parts, "</svg>", ""])


def holder_width(holder):
    name, items = holder
    chips = sum(ITEMS[item.upper()][2] + CHIP_GAP for item in items)
    return PADDING + len(name) * MONO + PADDING + chips - CHIP_GAP + 6


def places(title, rows):
    """A row for each type, a lane for each kind of place, a box for each name with what it holds."""
    lanes = len(rows[0]) - 2
    widths = [max([holder_width(holder) for row in rows for holder in row[2 + lane]]
                  + [6.6 * len(LANES[lane])]) for lane in range(lanes)]
    left = 20 + max(max(9.2 * len(row[0]), 6.6 * len(row[1])) for row in rows) + 16
    begins = [left + sum(widths[:lane]) + 18 * lane for lane in range(lanes)]
    keys = [(item, value) for item, value in ITEMS.items() if value[3]]
    key_width = 20 + sum(value[2] + 8 + 6.6 * len(value[3]) + 18 for _, value in keys)
    width = max(begins[-1] + widths[-1] + 20, key_width)

    picture = Picture(f"{title}: where the metadata of an object N lies")
    y = 20
    picture.text("big", 20, y + 12, f"{title}: where the metadata of an object N lies")
    y += 32
    x = 20
    for item, (_, _, _, meaning) in keys:
        x += picture.chip(x, y, item) + 8
        picture.text("soft", x, y + 13, meaning)
        x += 6.6 * len(meaning) + 18
    y += 44
    for lane in range(lanes):
        picture.text("soft", begins[lane], y, LANES[lane])
    y += 12
    for index, (name, used_for, *holders) in enumerate(rows):
        height = max(2, *map(len, holders)) * LINE + 8
        if index % 2 == 0:
            picture.rect("band", 8, y, width - 16, height)
        picture.text("strong", 20, y + 23, name)
        picture.text("soft", 20, y + 42, used_for)
        for lane, there in enumerate(holders):
            for line, holder in enumerate(there):
                file_name, items = holder
                top = y + 4 + line * LINE + 2
                picture.rect("box", begins[lane], top, holder_width(holder), LINE - 4, 5)
                picture.text("mono", begins[lane] + PADDING, top + 17, file_name,
                             length=len(file_name) * MONO)
                x = begins[lane] + 2 * PADDING + len(file_name) * MONO
                for item in items:
                    x += picture.chip(x, top + 4, item) + CHIP_GAP
        y += height
    if any(item.islower() for row in rows for there in row[2:] for _, items in there for item in items):
        picture.text("soft", 20, y + 22, "Dashed: only while the file holds no attributes.")
        y += 22
    height = y + 14
    picture.parts.insert(0, f'<rect class="paper" x="0.5" y="0.5" width="{number(width - 1)}" '
                            f'height="{number(height - 1)}" rx="10"/>')
    return picture.svg(width, height)


# What is done, and how things are when that fails or is stopped.
STEPS = (
    ("read", ("what is there, in", "any layout"), ("nothing has changed",)),
    ("write", ("a file of no name,", "its rights at once"), ("a file that nobody", "sees goes by itself")),
    ("read back", ("compared with the", "source, each byte"), ("what differs is", "named: status 2")),
    ("name", ("in one step, over", "what was there"), ("the old file or the", "new one, never half")),
    ("sync", ("all that has been", "copied, at once"), ("both are there, the", "same command goes on")),
    ("remove", ("mv: the source, if", "it is still the same"), ("the copy is on disk:", "again, the rest goes")),
)
NOTES = (
    "A plain cp writes into a file that is there; with --atomic it is replaced like this. What replaces "
    "something, or is on a file system",
    "without nameless files, has a temporary name until it gets its own.",
)


def copying():
    """The steps of a copy from left to right; how long either end is there; and what is left."""
    left, step, gap = 96, 164, 8
    width = left + len(STEPS) * step + 20 - gap
    picture = Picture("What cp, mv and convert do with each file and its metadata")
    picture.text("big", 20, 32, picture.title)
    top = 54
    for index, (name, does, _) in enumerate(STEPS):
        x = left + index * step
        box = step - gap
        picture.parts.append(
            f'<path class="box" d="M{x} {top} h{box - 12} l12 40 l-12 40 h-{box - 12} '
            + ("z" if index == 0 else "l12 -40 z") + '"/>')
        inset = 14 if index == 0 else 22
        picture.text("strong", x + inset, top + 24, name)
        for line, words in enumerate(does):
            picture.text("soft", x + inset, top + 44 + 16 * line, words)
    y = top + 104
    end = left + len(STEPS) * step - gap
    picture.text("strong", 20, y + 14, "source")
    removed = left + 5 * step
    picture.rect("source", left, y + 4, removed - left, 14, 7)
    picture.rect("open", removed + 4, y + 4, end - removed - 4, 14, 7)
    picture.text("soft", (removed + end) / 2, y + 36, "mv: goes, file by file", "middle")
    y += 44
    picture.text("strong", 20, y + 14, "copy")
    made, named, synced = (left + step * index for index in (1, 3, 4))
    picture.rect("open", made, y + 4, named - made - 4, 14, 7)
    picture.rect("pale", named, y + 4, synced + step / 2 - named, 14, 7)
    picture.rect("good", synced + step / 2, y + 4, end - synced - step / 2, 14, 7)
    picture.text("soft", (made + named) / 2, y + 36, "no name yet", "middle")
    picture.text("soft", (named + synced + step / 2) / 2, y + 36, "has its name", "middle")
    picture.text("soft", (synced + step / 2 + end) / 2, y + 36, "on disk", "middle")
    y += 56
    picture.rect("band", 8, y, width - 16, 52)
    picture.text("strong", 20, y + 22, "fails or")
    picture.text("strong", 20, y + 38, "stops")
    for index, (_, _, left_over) in enumerate(STEPS):
        for line, words in enumerate(left_over):
            picture.text("soft", left + index * step + 6, y + 22 + 16 * line, words)
    for line, words in enumerate(NOTES):
        picture.text("soft", 20, y + 74 + 16 * line, words)
    height = y + 66 + 16 * len(NOTES) + 8
    picture.parts.insert(0, f'<rect class="paper" x="0.5" y="0.5" width="{number(width - 1)}" '
                            f'height="{number(height - 1)}" rx="10"/>')
    return picture.svg(width, height)


def main():
    directory = Path(__file__).resolve().parent
    pictures = {f"{name}.svg": places(title, rows) for title, name, rows in (OWN, OTHERS)}
    pictures["copying.svg"] = copying()
    if sys.argv[1:] != ["--check"]:
        for name, drawn in pictures.items():
            (directory / name).write_text(drawn, encoding="utf-8")
        return
    there = {path.name for path in directory.glob("*.svg")}
    wrong = [name for name, drawn in pictures.items()
             if name not in there or (directory / name).read_bytes() != drawn.encode()]
    wrong += sorted(there - pictures.keys())
    if wrong:
        sys.exit(f"{', '.join(wrong)}: not what draw.py draws")


if __name__ == "__main__":
    main()
