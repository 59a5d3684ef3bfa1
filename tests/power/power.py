#!/usr/bin/env python3
"""Cuts the power at every point of every operation, and looks at what the disk may have kept.

    power.py KDD [--operation NAME]... [--every N] [--states N] [--seed N] [--journaled] [--flush | --no-flush] [--folder FOLDER]

An operation is recorded once: what it asked of the disk, in order (recording.py). Up to each of these calls the disk is then put
together as it may be after a loss of power (disk.py): without all that was not flushed, with all of it, and with some of it, in
any order, by sectors. On each of these states: the database opens, and each image is as before the operation or as after it. Where
the operation had ended with 0, or an answer had told of an object as stored, that is there. Then the operation is repeated, and
everything has to become what it is where nothing happened, tag files byte for byte. With --flush nothing may be torn. Without it
no half-written tag file may pass for a whole one: it is refused or told by `kdd verify`, and `kdd build --all` cures it.

The engine is SQLite, whose files are part of the disk; PostgreSQL answers for its own. Everything that is random comes from --seed.
"""
import argparse
import hashlib
import os
import random
import shutil
import sys
import tempfile

sys.dont_write_bytecode = True
import disk  # noqa: E402
import recording  # noqa: E402
from operations import COMMANDS, Arrival, Command, PowerSite, can_trace  # noqa: E402


def run(subject, name, wanted):
    """The states of one operation. How many, and what was wrong."""
    chance = random.Random(f"{wanted.seed} {name}")
    site = subject.site
    subject.begin()
    replayed, whole = (disk.Disk(site.store, not wanted.journaled) for _ in range(2))
    replayed.load()
    whole.load()
    log = os.path.join(site.folder, "calls")
    subject.record(recording.command(log))
    calls = recording.read(log)
    for number, call in enumerate(calls):
        whole.take(number, call)
    replayed.times = whole.compare()
    subject.note(whole.unlinked)
    done_at = subject.done_at(calls)
    seen, faults, points = set(), [], 0
    for number, call in enumerate(calls, 1):
        done = sum(each <= number for each in done_at)
        if not replayed.take(number - 1, call) and number not in done_at:
            continue
        points += 1
        if points % wanted.every and number not in done_at:
            continue
        states = [replayed.nothing_more(), replayed.everything()]
        states += [replayed.something(chance, chance.choice((512, 4096))) for _ in range(wanted.states)]
        for index, state in enumerate(states):
            mark = hashlib.sha256(repr((done, [each[:2] for each in state])).encode()).digest()
            if mark in seen:
                continue
            seen.add(mark)
            replayed.put(state)
            wrong = subject.look(done)
            if wrong:
                kind = ("nothing more", "everything", "something")[min(index, 2)]
                faults.append(f"{name}: {kind} kept after call {number} of {len(calls)}, {call.name}: {wrong}")
                print(faults[-1], flush=True)
                if wanted.keep:
                    replayed.put(state)
                    raise SystemExit(f"left in {site.folder}")
    told = "".join(f", {what} {count}" for what, count in subject.counts.items())
    print(f"{name}: {points} points, {len(seen)} states{told}, {len(faults)} faults", flush=True)
    return len(faults)


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("kdd")
    names = [each.name for each in COMMANDS] + ["arrival"]
    parser.add_argument("--operation", action="append", choices=names)
    parser.add_argument("--every", type=int, default=1)
    parser.add_argument("--states", type=int, default=3, help="with some of it kept, at each point")
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--journaled", action="store_true", help="names are kept as journaling file systems do")
    parser.add_argument("--flush", action=argparse.BooleanOptionalAction, help="only with, only without")
    parser.add_argument("--keep", action="store_true", help="end at the first fault, and leave the state there")
    parser.add_argument("--folder")
    wanted = parser.parse_args()
    if not can_trace():
        print("Skipped: there is no strace, or it may not trace here")
        raise SystemExit(77)
    faults = 0
    # Nothing is to be learned from the disk below: one in memory is faster.
    beneath = wanted.folder or ("/dev/shm" if os.access("/dev/shm", os.W_OK) else None)
    folder = tempfile.mkdtemp(prefix="kddpower", dir=beneath)
    site = PowerSite(os.path.abspath(wanted.kdd), folder, "sqlite")
    operations = [each for each in COMMANDS if wanted.operation is None or each.name in wanted.operation]
    for is_flushed in (True, False) if wanted.flush is None else (wanted.flush,):
        for operation in operations:
            faults += run(Command(site, operation, is_flushed), operation.name + (" --flush" if is_flushed else ""), wanted)
    if wanted.operation is None or "arrival" in wanted.operation:
        faults += run(Arrival(site, not wanted.journaled), "arrival", wanted)
    shutil.rmtree(folder)
    raise SystemExit(1 if faults else 0)


if __name__ == "__main__":
    main()
