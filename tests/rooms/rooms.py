#!/usr/bin/env python3
"""Holds includes against the rooms of the house: what each of them may use of the others.

usage: rooms.py SOURCE_FOLDER
"""

import os
import re
import sys

# The beginning of its files' paths, of which the first that fits counts, and what a room may use beside itself; whoever
# may use a room may use what that one may.
ROOMS = {
    "limits": ("core/kddlib/Limits.h", []),
    "archive": ("core/kddlib/archive/", ["front doors"]),
    "capi": ("core/kddlib/capi/", ["front doors"]),
    "items": ("core/kddlib/items/", ["net/dicom", "tagmodel"]),
    "net/cloud": ("core/kddlib/net/cloud/", ["net/http"]),
    "net/dicom": ("core/kddlib/net/dicom/", ["net"]),
    "net/http": ("core/kddlib/net/http/", ["platform", "limits"]),
    "net": ("core/kddlib/net/", ["net/cloud"]),
    "previews": ("core/kddlib/previews/", ["volumes"]),
    "tagfile": ("core/kddlib/tagfile/", ["items", "previews", "volumes"]),
    "tagmodel": ("core/kddlib/tagmodel/", ["platform/base", "limits"]),
    "volumes": ("core/kddlib/volumes/", ["net/dicom", "tagmodel"]),
    "front doors": ("core/kddlib/", ["tagfile"]),
    "platform/base": ("platform/base/", []),
    "platform": ("platform/", ["platform/base"]),
    "sample": ("sample/", ["platform/base"]),
    "tools/kdd": ("tools/kdd/", ["sample", "public headers"]),
    "public headers": ("<", []),
}

INCLUDE = re.compile(r'^\s*#\s*include\s*(?:"([^"]+)"|(<kddlib/[^>]+>))', re.MULTILINE)


def room_of(path):
    return next((room for room, (start, _) in ROOMS.items() if path.startswith(start)), None)


def reach(room):
    """The room and all that it may use."""
    return {room}.union(*(reach(other) for other in ROOMS[room][1]))


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
                used = installed or ("core/" if quoted.startswith("kddlib/") else "") + quoted
                yield os.path.relpath(path, source), used


def main():
    included = set(includes(sys.argv[1]))
    if len(included) < 100:
        sys.exit(f"Only {len(included)} includes were found below {sys.argv[1]}")
    faults = [f"{user} ({room_of(user)}) includes {used} ({room_of(used) or 'no room'})"
              for user, used in sorted(included)
              if room_of(user) is not None and room_of(used) not in reach(room_of(user))]
    print("\n".join(faults) or f"{len(included)} includes point downwards")
    sys.exit(1 if faults else 0)


if __name__ == "__main__":
    main()
