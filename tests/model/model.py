#!/usr/bin/env python3
"""Long random sequences of everything that can be done to an archive, held against a model of it after each step.

    model.py KDD LIBRARY [--steps N] [--seconds N] [--seed N] [--length N] [--database sqlite|postgresql] [--locales FOLDER]
             [--folder FOLDER] [--replay FILE|FOLDER] [--pairs PAGE [--every N]]

Each sequence has an archive of its own, which is worked on by `kdd`, by a server over HTTP and associations, and through the C
interface; files, tag files, clocks and settings change beside that, commands meet and are killed. After each step the lists,
the metadata, the searches and `kdd verify` have to say what the model says; in the end tag files have to be byte for byte what
a build makes. A sequence that fails is shortened as far as it goes and printed, one step a line; --replay runs such a file, or
those of a folder.

--pairs PAGE does each operation after each other one, and tells how many of the cells of the page's tables that covers: all,
or it fails. With --every 7 each seventh pair is done, from the one that --seed numbers.
"""
import argparse
import itertools
import os
import subprocess
import sys
import tempfile
import time

sys.dont_write_bytecode = True
import pairs  # noqa: E402
from chances import random_sequence  # noqa: E402
from comparison import compare_with_build  # noqa: E402
from frontdoors import Database, Difference, Site  # noqa: E402
from steps import Sequence  # noqa: E402


class Machine:
    """Runs sequences, each over an empty archive."""

    def __init__(self, wanted, folder):
        self.wanted, self.folder = wanted, folder
        self.database = Database(wanted.database, folder)
        self.steps = 0

    def run(self, lines):
        """What differed, and at which line; nothing where nothing did."""
        site = Site(os.path.abspath(self.wanted.kdd), os.path.abspath(self.wanted.library), os.path.join(self.folder, "site"),
                    self.database, self.wanted.locales)
        sequence, at = Sequence(site), 0
        try:
            site.make()
            for at, line in enumerate(lines):
                sequence.run(line)
            at = len(lines)
            compare_with_build(sequence)
        except (Difference, subprocess.TimeoutExpired) as difference:
            return str(difference), at
        finally:
            self.steps += sequence.count
            site.close()
        return None

    def shrink(self, lines):
        """Leaves out whatever can be left out so that something still differs: halves first, then ever fewer."""
        size = len(lines) // 2
        while size > 0:
            at, is_shorter = 0, False
            while at < len(lines):
                shorter = lines[:at] + lines[at + size:]
                found = self.run(shorter)
                if found:
                    lines, is_shorter = shorter[:found[1] + 1], True
                else:
                    at += size
            size = size // 2 if not is_shorter or size > 1 else size
        return lines

    def report(self, lines, found, name):
        print("%s differs: %s" % (name, found[0]), flush=True)
        lines = self.shrink(lines[:found[1] + 1])
        found = self.run(lines) or ("only now and then", 0)
        print("Shortened to (model.py KDD LIBRARY --replay FILE):\n%s\n%s" % ("\n".join(lines), found[0]), flush=True)


def sequences(wanted):
    """Their names and lines."""
    if wanted.replay:
        folder = wanted.replay if os.path.isdir(wanted.replay) else ""
        for name in sorted(os.listdir(folder)) if folder else [wanted.replay]:
            with open(os.path.join(folder, name), encoding="utf-8") as text:
                yield name, [line.strip() for line in text if line.strip() and line[0] != "#"]
    elif wanted.pairs:
        yield from list(pairs.sequences())[wanted.seed - 1::wanted.every]
    else:
        for seed in itertools.count(wanted.seed):
            yield "The sequence of seed %d" % seed, random_sequence(seed, wanted.length)


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("kdd")
    parser.add_argument("library")
    parser.add_argument("--steps", type=int, default=2000)
    parser.add_argument("--seconds", type=int, default=10 ** 9)
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--length", type=int, default=40)
    parser.add_argument("--database", choices=("sqlite", "postgresql"), default="sqlite")
    parser.add_argument("--locales")
    parser.add_argument("--folder")
    parser.add_argument("--replay")
    parser.add_argument("--pairs")
    parser.add_argument("--every", type=int, default=1)
    parser.add_argument("--faults", type=int, default=1, help="how many are looked for before it ends")
    wanted = parser.parse_args()
    began, faults, done = time.monotonic(), 0, set()
    with tempfile.TemporaryDirectory(prefix="kddmodel", dir=wanted.folder) as folder:
        machine = Machine(wanted, folder)
        try:
            for name, lines in sequences(wanted):
                is_random = not wanted.pairs and not wanted.replay
                if time.monotonic() - began > wanted.seconds or (is_random and wanted.steps <= machine.steps):
                    break
                found = machine.run(lines)
                done.add(name)
                if found:
                    faults += 1
                    machine.report(lines, found, name)
                    if faults >= wanted.faults:
                        break
        finally:
            machine.database.close()
    if wanted.pairs:
        cells, untold, undone = pairs.told(wanted.pairs)
        print("%d of %d cells of the page were done; it does not tell of: %s; nothing does: %s" % (
            len(cells & pairs.cells_of(done)), len(cells), untold, undone))
        faults += len(untold) + len(undone)
    seconds = time.monotonic() - began
    print("%d %s, %d steps, %d differences, %.0f s, %.1f steps a second, %s, from seed %d" % (
        len(done), "pairs" if wanted.pairs else "sequences", machine.steps, faults, seconds, machine.steps / seconds,
        wanted.database, wanted.seed))
    raise SystemExit(1 if faults else 0)


if __name__ == "__main__":
    main()
