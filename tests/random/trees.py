#!/usr/bin/env python3
"""Has the tool carry, remove and mend random trees, and holds it to what it promises.

    trees.py TOOL [--rounds N] [--seed N] [--disk DIR]

A round follows from its seed. One that goes wrong is made smaller while it goes wrong in the same
way, and printed. As the superuser if possible: others set no modes, and dry runs foresee less for
them.
"""

import argparse
import os
import sys

from growing import Grower
from judging import Judge
from world import World, Wrong

MOST_TRIES = 200  # at making a round smaller


def play(world, round_):
    """What goes wrong, in one line; None when nothing does."""
    world.fill(round_.volumes, round_.steps)
    try:
        for command in round_.commands:
            Judge(world, command).judge()
    except Wrong as wrong:
        return str(wrong)
    return None


def way(wrong):
    """The words before the first path or value."""
    return wrong.split(" b'")[0].split(' b"')[0]


def smaller(world, round_, wrong):
    """The round without what it does not need to go wrong like that."""
    tries = 0
    for part in ("commands", "steps"):
        at = len(getattr(round_, part))
        while at > 0 and tries < MOST_TRIES:
            at, tries = at - 1, tries + 1
            rest = [*getattr(round_, part)]
            del rest[at]
            trial = round_._replace(**{part: rest})
            found = play(world, trial)
            if found is not None and way(found) == way(wrong):
                round_ = trial
    return round_


def report(world, seed, round_):
    round_ = smaller(world, round_, play(world, round_))
    print(f"seed {seed}: {play(world, round_)}")
    for name, volume in round_.volumes.items():
        print(f"  volume {name}: {volume.kind}, {volume.where}")
    for step in round_.steps:
        words = " ".join(str(argument)[:60] for argument in step.args)
        print(f"  {step.what} {step.volume}:{step.path} {words}")
    for words, (status, output, errors) in world.history:
        print(f"  {' '.join(os.fsdecode(word) for word in words)}\n    status {status}")
        for line in (output + errors).splitlines():
            print(f"    {line}")
    if not world.history or len(world.history) < len(round_.commands):
        print(f"  {round_.commands[len(world.history)]}")


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("tool")
    parser.add_argument("--rounds", type=int, default=100)
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--disk", help="a directory on a disk")
    given = parser.parse_args()
    world = World(os.path.abspath(given.tool), given.disk)
    failures = 0
    try:
        for seed in range(given.seed, given.seed + given.rounds):
            round_ = Grower(seed).round()
            if play(world, round_) is not None:
                failures += 1
                report(world, seed, round_)
    finally:
        world.close()
    print(f"{given.rounds} rounds, {failures} wrong")
    return 1 if failures else 0


if __name__ == "__main__":
    sys.exit(main())
