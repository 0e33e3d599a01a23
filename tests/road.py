#!/usr/bin/env python3
"""The commands of a document, run one after the other: what each prints is what the document says.

    road.py [--write] DOCUMENT

In blocks, a line that begins with "$ " is a command, and what stands behind it up to the next one is
what it prints. With --write the document is given what they print now. They run as the superuser, in
/srv of a mount namespace of their own, where that and /etc/mavoea are empty but for the share that
SHARE makes. MAVOEA_TOOL is the tool. Ends with 77 where nothing can be mounted.
"""

import difflib
import os
import pathlib
import subprocess
import sys
import tempfile

INDENT = "    "
PROMPT = INDENT + "$ "
SHARE = r"""
mkdir -p old/letters
echo "the year in numbers" > old/report
echo "Dear friend" > old/letters/first.txt
echo "not yet" > old/draft
export MAVOEA="mavoea --volume /srv/old=eadir"
$MAVOEA set old/report com.example.colour blue
$MAVOEA set old/report com.apple.ResourceFork --file old/letters/first.txt
$MAVOEA set-info --comment "for the board" --type TEXT old/report
$MAVOEA set old/letters/first.txt com.example.colour red
$MAVOEA set old/draft com.example.colour green
rm old/draft
"""


def shell(command):
    result = subprocess.run(["sh", "-c", command], cwd="/srv", text=True, check=False,
                            stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                            stderr=subprocess.STDOUT)
    return result.stdout


def as_it_runs(text):
    """The document with what its commands print now."""
    lines = []
    in_block = False  # of what a command has printed
    former = text.splitlines()
    for line, below in zip(former, [*former[1:], ""]):
        if line.startswith(PROMPT):
            command = line[len(PROMPT):]
            lines.append(line)
            lines += [(INDENT + said).rstrip() for said in shell(command).splitlines()]
            in_block = True
        else:
            is_text = below if line == "" else line  # an empty line may have been printed
            in_block = in_block and is_text.startswith(INDENT) and not is_text.startswith(PROMPT)
            if not in_block:
                lines.append(line)
    return "\n".join(lines) + "\n"


def main():
    arguments = sys.argv[1:]
    document = pathlib.Path(arguments[-1]).resolve()
    if os.environ.get("MAVOEA_OWN_MOUNTS") != "yes":
        own = ["unshare", "--mount", "--propagation", "private"]
        if os.geteuid() != 0 or subprocess.run([*own, "true"], check=False).returncode != 0:
            print("nothing can be mounted here")
            sys.exit(77)
        os.environ["MAVOEA_OWN_MOUNTS"] = "yes"
        os.execvp("unshare", [*own, sys.executable, *sys.argv])
    bin_directory = tempfile.mkdtemp()
    os.symlink(os.path.abspath(os.environ["MAVOEA_TOOL"]), f"{bin_directory}/mavoea")
    os.environ["PATH"] = f"{bin_directory}:{os.environ['PATH']}"
    os.makedirs("/etc/mavoea", exist_ok=True)
    room = tempfile.mkdtemp(dir="/var/tmp")  # where files have attributes
    os.mkdir(f"{room}/srv")
    os.mkdir(f"{room}/etc")
    subprocess.run(["mount", "--bind", f"{room}/srv", "/srv"], check=True)
    subprocess.run(["mount", "--bind", f"{room}/etc", "/etc/mavoea"], check=True)
    try:
        said = shell(SHARE)
        if said:
            sys.exit(f"the share could not be made: {said}")
        text = document.read_text(encoding="utf-8")
        now = as_it_runs(text)
    finally:
        subprocess.run(["umount", "/srv", "/etc/mavoea"], check=True)
        subprocess.run(["rm", "-rf", room, bin_directory], check=True)
    if "--write" in arguments:
        document.write_text(now, encoding="utf-8")
    difference = list(difflib.unified_diff(text.splitlines(), now.splitlines(), str(document),
                                           "what the commands print", lineterm=""))
    print("\n".join(difference))
    sys.exit(1 if difference else 0)


if __name__ == "__main__":
    main()
