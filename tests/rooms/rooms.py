#!/usr/bin/env python3
"""Holds includes and links against the rooms of the house: what each of them may use of the others.

usage: rooms.py SOURCE_FOLDER BUILD_FOLDER EXCEPTIONS

BUILD_FOLDER is where the sources of SOURCE_FOLDER are compiled to. EXCEPTIONS has a line "FILE OTHER" for each arrow, by
files below SOURCE_FOLDER, that is wrong and still there; one that is not needed any more is a fault.
"""

import os
import re
import subprocess
import sys

# What a room may use beside itself; whoever may use a room may use what that one may.
ARROWS = {
    "platform/base": [],
    "platform": ["platform/base"],
    "limits": [],
    "tagmodel": ["platform/base", "limits"],
    "net/http": ["platform", "limits"],
    "net/cloud": ["net/http"],
    "net": ["net/cloud"],
    "net/dicom": ["net"],
    "items": ["net/dicom", "tagmodel"],
    "volumes": ["net/dicom", "tagmodel"],
    "previews": ["volumes"],
    "tagfile": ["items", "previews", "volumes"],
    "front doors": ["tagfile"],
    "archive": ["front doors"],
    "capi": ["front doors"],
    "sample": ["platform/base"],
    "public headers": [],
    "server/http": ["public headers"],
    "server/access": ["server/dicomweb"],
    "server/dicomweb": ["server/http"],
    "server/browser": ["server/dicomweb"],
    "server/dimse": ["server/dicomweb"],
    "server": ["server/access", "server/browser", "server/dimse"],
    "tools/kdd": ["sample", "server", "public headers"],
}

# By the beginning of a file's path, the first that fits.
ROOMS = [
    ("core/kddlib/Limits.h", "limits"),
    ("core/kddlib/archive/", "archive"),
    ("core/kddlib/capi/", "capi"),
    ("core/kddlib/items/", "items"),
    ("core/kddlib/net/cloud/", "net/cloud"),
    ("core/kddlib/net/dicom/", "net/dicom"),
    ("core/kddlib/net/http/", "net/http"),
    ("core/kddlib/net/", "net"),
    ("core/kddlib/previews/", "previews"),
    ("core/kddlib/tagfile/", "tagfile"),
    ("core/kddlib/tagmodel/", "tagmodel"),
    ("core/kddlib/volumes/", "volumes"),
    ("core/kddlib/", "front doors"),
    ("platform/base/", "platform/base"),
    ("platform/", "platform"),
    ("sample/", "sample"),
    ("server/access/", "server/access"),
    ("server/browser/", "server/browser"),
    ("server/dicomweb/", "server/dicomweb"),
    ("server/dimse/", "server/dimse"),
    ("server/http/", "server/http"),
    ("server/", "server"),
    ("tools/kdd/", "tools/kdd"),
]

# They see the library as others do, through its installed headers, and are linked with what it exports.
OUTSIDE = ("server", "server/access", "server/browser", "server/dicomweb", "server/dimse", "server/http",
           "tools/kdd")

INCLUDE = re.compile(r'^\s*#\s*include\s*(?:"([^"]+)"|<(kddlib/[^>]+)>)', re.MULTILINE)
STRONG = set("TDBRG")


def room_of(path):
    for beginning, room in ROOMS:
        if path.startswith(beginning):
            return room
    return None


def reach(room):
    """The room and all that it may use."""
    seen = {room}
    waiting = [room]
    while waiting:
        for other in ARROWS[waiting.pop()]:
            if other not in seen:
                seen.add(other)
                waiting.append(other)
    return seen


REACH = {room: reach(room) for room in ARROWS}


def includes(source):
    """Pairs of files: who includes whom."""
    for folder, _, names in os.walk(source):
        for name in names:
            if not name.endswith((".h", ".cpp", ".c")):
                continue
            path = os.path.join(folder, name)
            with open(path, encoding="utf-8") as file:
                text = file.read()
            for quoted, installed in INCLUDE.findall(text):
                user = os.path.relpath(path, source)
                if installed:
                    yield user, "<" + installed + ">"
                else:
                    yield user, ("core/" if quoted.startswith("kddlib/") else "") + quoted


def objects(source, built):
    """The object files of the library, each with the source file that it was made from."""
    for folder, _, names in os.walk(built):
        place = re.fullmatch(r"(.*)/CMakeFiles/[^/]+\.dir(/.*)?", os.path.relpath(folder, built))
        for name in names if place else []:
            made_from = place[1] + (place[2] or "") + "/" + name[:-2]
            # An object of a file that is gone may still lie there.
            if name.endswith(".o") and os.path.exists(os.path.join(source, made_from)):
                yield os.path.join(folder, name), made_from


def links(source, built):
    """Pairs of source files: who needs a symbol that whom defines."""
    # What the library exports another test holds against the public headers.
    made_from = {path: file for path, file in objects(source, built) if room_of(file) not in (None, *OUTSIDE)}
    if not made_from:
        return
    output = subprocess.run(["nm", "-A", "-g", "--format=posix", *made_from], capture_output=True, text=True,
                            check=True).stdout
    needed = set()
    definer = {}
    for line in output.splitlines():
        path, symbol, kind = line.split()[:3]
        file = made_from[path.rstrip(":")]
        if kind == "U":
            needed.add((file, symbol))
        elif kind in STRONG:
            # What is weak, as all that headers define, is in every object that uses it.
            definer[symbol] = file
    for user, symbol in needed:
        if symbol in definer:
            yield user, definer[symbol]


def is_allowed(user, used):
    room = room_of(user)
    other = "public headers" if used.startswith("<") else room_of(used)
    if room is None:
        return True
    if other == "public headers":
        return room in OUTSIDE
    return other in REACH[room]


def main():
    source, built, exceptions = sys.argv[1:]
    with open(exceptions, encoding="utf-8") as file:
        known = {tuple(line.split()) for line in file if line.strip() and not line.startswith("#")}
    included = set(includes(source))
    if len(included) < 100:
        sys.exit(f"Only {len(included)} includes were found below {source}")
    linked = set(links(source, built))
    if len(linked) < 100:
        sys.exit(f"Only {len(linked)} links were found below {built}")

    faults = []
    needed = set()
    for what, arrows in (("includes", included), ("needs a symbol of", linked)):
        for user, used in sorted(arrows):
            if (user, used) in known and not is_allowed(user, used):
                needed.add((user, used))
            elif not is_allowed(user, used):
                faults.append(f"{user} ({room_of(user)}) {what} {used} ({room_of(used) or 'no room'})")
    faults += [f"{' '.join(pair)} in {exceptions} is not needed any more" for pair in sorted(known - needed)]
    print("\n".join(faults) or f"{len(included)} includes and {len(linked)} links point downwards")
    sys.exit(1 if faults else 0)


if __name__ == "__main__":
    main()
