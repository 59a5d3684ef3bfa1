#!/usr/bin/env python3
"""Makes a viewer's package, which expects to stand at the root of its server, ready for one that has it under /viewer.

usage: prepare.py PACKAGE.tgz FOLDER

FOLDER receives the viewer's static files and our configuration of it; what was there is replaced.
"""

import gzip
import os
import re
import shutil
import sys
import tarfile

PREFIX = "package/dist/"
OWN = os.path.dirname(os.path.abspath(__file__))

# Where the page names its files, where its program does, its style sheets do, and what a browser is told of its icons.
ROOTS = {
    ".html": [(r'((?:src|href|content)="|PUBLIC_URL = \')/(?!/)', r"\1/viewer/")],
    ".js": [
        (r'(__webpack_require__\.p = ")/"', r'\1/viewer/"'),
        (r"(browserImportFunction\(['\"])/(?!/)", r"\1/viewer/"),
    ],
    ".json": [(r'("(?:src|start_url|scope)": ?")/(?!/)', r"\1/viewer/")],
    ".css": [(r"(url\(['\"]?)/(?!/)", r"\1/viewer/")],
}


def unpack(package, folder):
    count = 0
    with tarfile.open(package) as archive:
        for member in archive:
            name = member.name[len(PREFIX):]
            # Maps of the program are for its developers, and twice as large as itself.
            if not member.isfile() or not member.name.startswith(PREFIX) or name.endswith(".map"):
                continue
            path = os.path.normpath(os.path.join(folder, name))
            if not path.startswith(folder + os.sep):
                sys.exit(f"{package} holds {member.name}, which would leave {folder}")
            os.makedirs(os.path.dirname(path), exist_ok=True)
            with archive.extractfile(member) as source, open(path, "wb") as target:
                shutil.copyfileobj(source, target)
            count += 1
    return count


def move_root(folder):
    changes = 0
    for name in os.listdir(folder):
        for pattern, replacement in ROOTS.get(os.path.splitext(name)[1], []):
            path = os.path.join(folder, name)
            with open(path, encoding="utf-8") as file:
                text = file.read()
            text, count = re.subn(pattern, replacement, text)
            if count:
                with open(path, "w", encoding="utf-8") as file:
                    file.write(text)
            changes += count
    return changes


def compress(folder):
    """Puts beside each large text what a browser far away gets in its place."""
    for name in os.listdir(folder):
        path = os.path.join(folder, name)
        if os.path.splitext(name)[1] in (".js", ".css", ".wasm", ".json") and os.path.getsize(path) > 16384:
            with open(path, "rb") as source, gzip.open(path + ".gz", "wb", 6) as target:
                shutil.copyfileobj(source, target)


def main():
    package, folder = sys.argv[1:]
    folder = os.path.abspath(folder)
    shutil.rmtree(folder, ignore_errors=True)
    if unpack(package, folder) == 0 or not os.path.exists(os.path.join(folder, "index.html")):
        sys.exit(f"{package} holds no viewer ({PREFIX}index.html)")
    if move_root(folder) == 0:
        sys.exit(f"{package} does not name its files as expected; it would not be found under /viewer")
    shutil.copy(os.path.join(OWN, "app-config.js"), folder)
    compress(folder)


if __name__ == "__main__":
    main()
