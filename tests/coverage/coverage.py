#!/usr/bin/env python3
"""Tells which lines and branches the tests have reached, by room and by file.

    coverage.py BUILD PAGE

BUILD is that of the preset "coverage", after its tests. BUILD/coverage.txt lists all files with the lines that nothing
reached, BUILD/coverage/index.html shows them, and the table in PAGE, a page of ours, is written anew.

Branches that only an exception takes are left out: the compiler makes one for almost every call.
"""
import collections
import datetime
import json
import os
import re
import subprocess
import sys

CHECKOUT = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
sys.path.insert(0, os.path.join(CHECKOUT, "tests/rooms"))
sys.dont_write_bytecode = True
from rooms import room_of  # noqa: E402

KINDS = "line_covered", "line_total", "branch_covered", "branch_total"


def gather(build):
    """What gcovr tells of each file below src."""
    pages = os.path.join(build, "coverage")
    os.makedirs(pages, exist_ok=True)
    command = ["gcovr", "--root", CHECKOUT, "--filter", os.path.join(CHECKOUT, "src/"), "--exclude-throw-branches",
               "--exclude-unreachable-branches", "-j", str(os.cpu_count())]
    counts = os.path.join(build, "counts.json")
    subprocess.run([*command, "--json", counts, build], check=True)
    reports = ["--txt", os.path.join(build, "coverage.txt"), "--html-details", os.path.join(pages, "index.html"),
               "--json-summary", os.path.join(build, "coverage.json")]
    subprocess.run([*command, "--add-tracefile", counts, *reports], check=True)
    with open(os.path.join(build, "coverage.json"), encoding="utf-8") as file:
        return json.load(file)["files"]


def torn(build):
    """What a process that was killed in the middle of writing its counts has spoilt: who comes next tells of it."""
    with open(os.path.join(build, "Testing/Temporary/LastTest.log"), encoding="utf-8", errors="replace") as file:
        return sorted(set(re.findall(r"libgcov profiling error:(.*?\.gcda)", file.read())))


def by_room(files):
    rooms = collections.defaultdict(collections.Counter)
    for file in files:
        room = room_of(os.path.relpath(file["filename"], "src"))
        for kind in KINDS:
            rooms[room][kind] += file[kind]
            rooms["all"][kind] += file[kind]
    return rooms


def share(part, whole):
    return f"{100 * part / whole:.1f} %" if whole else ""


def table(rooms):
    rows = ["| room | lines | reached | branches | reached |", "|---|---|---|---|---|"]
    for room in [*sorted(room for room in rooms if room != "all"), "all"]:
        lines, all_lines, branches, all_branches = (rooms[room][kind] for kind in KINDS)
        rows.append(f"| {room} | {all_lines:,} | {share(lines, all_lines)} | {all_branches:,} | "
                    f"{share(branches, all_branches)} |")
    return "\n".join(rows)


def main():
    build, page = sys.argv[1:]
    if torn(build):
        sys.exit("\n".join(["These counts were spoilt, and the tests have to be run again:", *torn(build)]))
    rooms = by_room(gather(build))
    if rooms["all"]["line_total"] < 10000:
        sys.exit(f"Only {rooms['all']['line_total']} lines were found below src")
    with open(page, encoding="utf-8") as file:
        text = file.read()
    figures = f"By `./dev coverage`, {datetime.date.today()}:\n\n{table(rooms)}\n"
    text, times = re.subn(r"(?m)^By `\./dev coverage`.*\n\n(?:\|.*\n)+", lambda _: figures, text, count=1)
    if not times:
        sys.exit(f"{page} has no table to be written anew")
    with open(page, "w", encoding="utf-8") as file:
        file.write(text)
    print(table(rooms))
    print(f"\nBy file: {os.path.join(build, 'coverage.txt')}, {os.path.join(build, 'coverage/index.html')}")


if __name__ == "__main__":
    main()
