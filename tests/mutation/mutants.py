#!/usr/bin/env python3
"""Changes the library's own code, one place at a time, and sees whether the tests notice.

    mutants.py BUILD_DIR [--count N] [--jobs N] [--only TEXT] [--again]

BUILD_DIR is a build tree whose tests are built. All mutants are compiled into one set of objects,
each behind a switch, and the test programs are linked against those: MAVOEA_MUTANT=n in the
environment makes mutant n the code. A run without one tells which programs come upon which mutants;
these are then run with each in turn, until one fails.

A mutant is a comparison that is changed (== and !=, < and <=, > and >=) or a statement that is
dropped. Which are taken of all that there are depends on their text alone, so that a change
elsewhere leaves the choice as it is. Survivors that survivors.txt does not give a reason for, or
fewer killed than 90 of 100, make the run fail. Those that it does name are not tried again, but
with --again: a mutant that survives takes every test there is.
"""

import argparse
import concurrent.futures
import dataclasses
import hashlib
import json
import os
import pathlib
import re
import shlex
import shutil
import subprocess
import sys
import time

ROOT = pathlib.Path(__file__).resolve().parents[2]
FOLDERS = ("adouble", "format", "ops", "path", "stream", "util", "xattr")
SURVIVORS = ROOT / "tests/mutation/survivors.txt"
LEAST_KILLED = 90  # of 100

# They take long and look for what the others do not: crashes, and bounds of time and memory.
LEFT_OUT = {"made_files_test", "stream_random_test", "sweep_test", "two_processes_test"}

SWITCH_HEADER = """#ifdef __cplusplus
extern "C" {
#endif
extern int mavoea_mutant;
extern unsigned char mavoea_reached[];
#ifdef __cplusplus
}
#endif
#define MAVOEA_MUTANT(n) ((mavoea_reached[n] = 1), mavoea_mutant == (n))
"""

# What was reached is written by a process that ends in whatever way but a signal.
SWITCH_SOURCE = """#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>
int mavoea_mutant = 0;
unsigned char mavoea_reached[%d];
static int first_process;
__attribute__((constructor)) static void start(void) {
    const char* const mutant = getenv("MAVOEA_MUTANT");
    if (mutant != NULL) mavoea_mutant = atoi(mutant);
    first_process = (int)getpid();
}
__attribute__((destructor)) static void end(void) {
    const char* const name = getenv("MAVOEA_REACHED");
    FILE* file = name != NULL && first_process == (int)getpid() ? fopen(name, "w") : NULL;
    if (file == NULL) return;
    for (unsigned i = 1; i < sizeof mavoea_reached; ++i) {
        if (mavoea_reached[i]) fprintf(file, "%%u\\n", i);
    }
    fclose(file);
}
"""

CHANGED = {"==": "!=", "!=": "==", "<": "<=", "<=": "<", ">": ">=", ">=": ">"}
COMPARISON = re.compile(r" (==|!=|<=|>=|<|>) ")
CONDITION = re.compile(r"^(\s*(?:\} else )?(?:if|while) \()(.*)$")
RETURN = re.compile(r"^(\s*(?:if \(.*\) )?return )(.*)(;)$")
STATEMENT = re.compile(r"^\s+(?:\(void\))?[a-z_+*][\w>.:\[\]+*()-]*( [|&+-]?= .*|\(.*\)|)?;$")
# What declares a name is not dropped: the program would not compile, or an owner would end early.
NO_STATEMENT = re.compile(
    r"^\s*(return|break|continue|case|default|using|static_assert|const |constexpr |static |auto |"
    r"struct |std::\w+[<\w:, >*]* \w+[;({= ]|(unsigned |char |int |bool |mode_t |ssize_t )|"
    r"[A-Z]\w*(<.*>)?[&*]* \w+[;({= ]|[A-Z]\w* \w+\(|\w+_t \w+)")


@dataclasses.dataclass(frozen=True)
class Mutant:
    file: str
    line: int
    text: str  # of the line, without indentation
    what: str  # how it is changed
    mutated: str  # the line with its switch; {} is the mutant's number

    def name(self):
        return f"{self.file}: {self.text}  [{self.what}]"


def balanced(text):
    """The length of `text` up to the parenthesis that closes one opened before it; -1 when there is
    none."""
    depth = 1
    for i, c in enumerate(text):
        depth += (c == "(") - (c == ")")
        if depth == 0:
            return i
    return -1


def switched(expression, start, end, operator):
    changed = expression[:start] + CHANGED[operator] + expression[end:]
    return "(MAVOEA_MUTANT({}) ? (%s) : (%s))" % (
        changed.replace("{", "{{").replace("}", "}}"),
        expression.replace("{", "{{").replace("}", "}}"))


def escaped(text):
    return text.replace("{", "{{").replace("}", "}}")


def mutants_of_line(file, number, line):
    stripped = line.strip()
    if stripped.startswith(("//", "#", "*")) or '"' in stripped and "//" in stripped:
        return
    parts = None
    if match := CONDITION.match(line):
        size = balanced(match[2])
        if size > 0 and ";" not in match[2][:size] and "const " not in match[2][:size]:
            parts = match[1], match[2][:size], match[2][size:]
    if parts is None and (match := RETURN.match(line)):
        if balanced(match[2] + ")") == len(match[2]) and "{" not in match[2]:
            parts = match[1], match[2], match[3]
    if parts is not None:
        before, expression, after = parts
        for found in COMPARISON.finditer(expression):
            yield Mutant(file, number, stripped,
                         f"{found[1]} -> {CHANGED[found[1]]} at {found.start(1)}",
                         escaped(before) + switched(expression, found.start(1), found.end(1),
                                                    found[1]) + escaped(after))
    if (STATEMENT.match(line) and not NO_STATEMENT.match(line)
            and line.count("(") == line.count(")")):
        indent = line[:len(line) - len(line.lstrip())]
        yield Mutant(file, number, stripped, "dropped",
                     "%sif (!MAVOEA_MUTANT({})) { %s }".replace("{ %s }", "{{ %s }}")
                     % (indent, escaped(stripped)))


def all_mutants():
    for folder in FOLDERS:
        for path in sorted((ROOT / folder).glob("*.cpp")):
            file = str(path.relative_to(ROOT))
            for number, line in enumerate(path.read_text().splitlines(), 1):
                yield from mutants_of_line(file, number, line)


def chosen(mutants, count):
    """At most one mutant a line, the same ones each time."""
    ranked = sorted(mutants, key=lambda m: hashlib.sha256(m.name().encode()).digest())
    lines = set()
    for mutant in ranked:
        if (mutant.file, mutant.line) in lines:
            continue
        lines.add((mutant.file, mutant.line))
        yield mutant
        count -= 1
        if count == 0:
            return


class Workshop:
    def __init__(self, build, jobs):
        self.build = build.resolve()
        self.out = self.build / "mutants"
        (self.out / "tmp").mkdir(parents=True, exist_ok=True)
        self.jobs = jobs
        commands = json.loads((self.build / "compile_commands.json").read_text())
        self.commands = {os.path.relpath(c["file"], ROOT): shlex.split(c["command"])
                         for c in commands
                         if "mavoea_objects.dir" in c["command"]
                         or "mavoea_foreign_format.dir" in c["command"]
                         or "mavoea_format.dir" in c["command"]}

    def object_of(self, file):
        return self.out / (file.replace("/", "_") + ".o")

    def compile(self, file, mutants):
        """Compiles a file with its mutants; returns those that the compiler takes."""
        while True:
            lines = (ROOT / file).read_text().splitlines()
            for number, mutant in mutants.items():
                lines[mutant.line - 1] = mutant.mutated.format(number)
            source = self.out / file
            source.parent.mkdir(parents=True, exist_ok=True)
            source.write_text("\n".join(lines) + "\n")
            command = list(self.commands[file])
            command[command.index("-c") + 1] = str(source)
            command[command.index("-o") + 1] = str(self.object_of(file))
            command = [c for c in command if c not in ("-Werror", "-MD")]
            command += ["-w", "-O1", "-include", str(self.out / "switch.h"),
                        "-I", str(ROOT / pathlib.Path(file).parent)]
            done = subprocess.run(command, capture_output=True, text=True, cwd=self.build)
            if done.returncode == 0:
                return mutants
            wrong = {int(n) for n in re.findall(re.escape(str(source)) + r":(\d+):\d+: error",
                                                done.stderr)}
            kept = {n: m for n, m in mutants.items() if m.line not in wrong}
            if len(kept) == len(mutants):
                sys.exit(f"{file} does not compile:\n{done.stderr}")
            mutants = kept

    def make(self, mutants):
        (self.out / "switch.h").write_text(SWITCH_HEADER)
        (self.out / "switch.c").write_text(SWITCH_SOURCE % (len(mutants) + 1))
        subprocess.run(["cc", "-O1", "-c", str(self.out / "switch.c"), "-o",
                        str(self.out / "switch.o")], check=True)
        numbered = dict(enumerate(mutants, 1))
        by_file = {file: {} for file in self.commands}
        for number, mutant in numbered.items():
            by_file[mutant.file][number] = mutant
        with concurrent.futures.ThreadPoolExecutor(self.jobs) as pool:
            results = list(pool.map(self.compile, by_file.keys(), by_file.values()))
        support = sorted((self.build / "tests/CMakeFiles/mavoea_test_support.dir").rglob("*.o"))
        library = self.out / "libmavoea_test_support.a"
        library.unlink(missing_ok=True)
        subprocess.run(["ar", "rcs", str(library), *map(str, support), str(self.out / "switch.o"),
                        *(str(self.object_of(file)) for file in self.commands)], check=True)
        return {n: m for result in results for n, m in result.items()}

    def link(self, program):
        commands = subprocess.run(["ninja", "-t", "commands", "-s", program], cwd=self.build,
                                  capture_output=True, text=True, check=True).stdout
        command = commands.strip().splitlines()[-1]
        command = command.replace("lib/libmavoea_test_support.a",
                                  "mutants/libmavoea_test_support.a")
        command = command.replace(f"-o {program} ", f"-o mutants/{pathlib.Path(program).name} ")
        subprocess.run(command, shell=True, cwd=self.build, check=True)
        return self.out / pathlib.Path(program).name

    def programs(self):
        tests = sorted(p.stem for folder in ("unit", "faults", "hostile", "crash")
                       for p in (ROOT / "tests" / folder).glob("*_test.cpp")
                       if p.stem not in LEFT_OUT)
        names = [f"bin/{test}" for test in tests]
        with concurrent.futures.ThreadPoolExecutor(self.jobs) as pool:
            return list(pool.map(self.link, names))


# A mutant may remove what it should not: it runs where only temporary folders can be changed, and
# whatever it has started ends with it.
SANDBOX = ["unshare", "--mount", "--pid", "--fork", "--kill-child", "--mount-proc", "sh", "-c",
           'mount --bind "$1" "$1" && mount -o remount,bind,ro / && mount -t tmpfs tmpfs "$1/tmp" && '
           'mount -t tmpfs tmpfs /dev/shm && export TMPDIR="$1/tmp" && cd "$TMPDIR" && shift && '
           'ulimit -v 4000000 && "$@"', "sandbox"]


def run(program, environment, limit, folder=None):
    """Whether the program ends well in time, with `folder` as all that it can change."""
    try:
        done = subprocess.run([*SANDBOX, str(folder or program.parent), str(program),
                               "--gtest_brief=1", "--gtest_fail_fast"],
                              env={**os.environ, **environment}, timeout=limit,
                              stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL,
                              start_new_session=True)
        return done.returncode == 0
    except subprocess.TimeoutExpired:
        return False


def survey(programs, out, jobs):
    """The programs that come upon each mutant, the quickest first."""
    def reached_by(program):
        reached = out / (program.name + ".reached")
        reached.unlink(missing_ok=True)
        started = time.monotonic()
        if not run(program, {"MAVOEA_REACHED": str(reached)}, 300):
            sys.exit(f"{program.name} fails without any mutant")
        # A program with none of the code that has mutants tells of none.
        numbers = reached.read_text().split() if reached.exists() else ()
        return time.monotonic() - started, program, numbers

    seen = {}
    with concurrent.futures.ThreadPoolExecutor(jobs) as pool:
        for seconds, program, numbers in pool.map(reached_by, programs):
            for number in numbers:
                seen.setdefault(int(number), []).append((seconds, program))
    return {number: sorted(found) for number, found in seen.items()}


def known_survivors():
    """Name -> reason. Each survivor is a line with its name and an indented one with the reason."""
    known = {}
    name = None
    for line in SURVIVORS.read_text().splitlines() if SURVIVORS.exists() else ():
        if line.startswith("    "):
            known[name] = (known.get(name, "") + " " + line.strip()).strip()
        elif line and not line.startswith("#"):
            name = line
    return known


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    parser.add_argument("build", type=pathlib.Path)
    parser.add_argument("--count", type=int, default=300)
    parser.add_argument("--jobs", type=int, default=2)
    parser.add_argument("--only", default="", help="mutants whose name has this text")
    parser.add_argument("--again", action="store_true", help="known survivors too")
    options = parser.parse_args()
    known = known_survivors()
    workshop = Workshop(options.build, options.jobs)
    if not run(pathlib.Path(shutil.which("true")), {}, 60, workshop.out):
        print("mutants: none tried: this machine gives them no namespace of their own")
        return

    candidates = [m for m in all_mutants() if options.only in m.name()]
    # Some are refused by the compiler: more are compiled than wanted.
    compiled = workshop.make(list(chosen(candidates, options.count * 5 // 4)))
    mutants = dict(sorted(compiled.items())[:options.count])
    programs = workshop.programs()
    seen = survey(programs, workshop.out, options.jobs)

    def killer(number):
        if mutants[number].name() in known and not options.again:
            return None
        for seconds, program in seen.get(number, ()):
            if not run(program, {"MAVOEA_MUTANT": str(number)}, 10 + 5 * seconds):
                return program.name
        print(f"survived: {mutants[number].name()}", file=sys.stderr, flush=True)
        return None

    with concurrent.futures.ThreadPoolExecutor(options.jobs) as pool:
        killers = dict(zip(mutants, pool.map(killer, mutants)))

    unexplained = []
    survivors = 0
    for number, mutant in mutants.items():
        if killers[number]:
            continue
        survivors += 1
        reason = known.get(mutant.name())
        if reason is None:
            unexplained.append(mutant)
        where = "" if number in seen else " (no test comes upon it)"
        print(f"survived: {mutant.name()} line {mutant.line}{where}\n    {reason or 'unexplained'}")
    killed = len(mutants) - survivors
    print(f"mutants: {len(mutants)} of {len(candidates)} tried, {killed} killed, "
          f"{survivors} survived")
    if not mutants or killed * 100 < LEAST_KILLED * len(mutants) or unexplained:
        sys.exit(1)


if __name__ == "__main__":
    main()
