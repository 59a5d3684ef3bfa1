#!/usr/bin/env python3
"""Writes what lets libraries be loaded when something of them is first called.

usage: late_calls.py FOLDER NM ARCHIVE[,ARCHIVE...] NAME=MODULE=FILE[,FILE...]...

NAME is that of a LateLibrary, FILE a library or an object file that its module links. What the archives need of them is
written to FOLDER: LateCalls.S with the jumps, LateTables.cpp with what is known of them, and MODULE.c for each module with
the addresses.
"""

import hashlib
import os
import subprocess
import sys

FUNCTIONS = set("TWi")


def symbols(nm, options, files):
    """Pairs of name and kind, without versions."""
    output = subprocess.run([nm, "--format=posix", *options, *files], capture_output=True, text=True, check=True).stdout
    for line in output.splitlines():
        fields = line.split()
        # Members of archives have lines of their own.
        if len(fields) >= 2 and not fields[-1].endswith(":"):
            yield fields[0].split("@")[0], fields[1]


def defined(nm, file):
    options = ["--extern-only"] if file.endswith(".o") else ["--dynamic"]
    return dict(symbols(nm, [*options, "--defined-only"], [file]))


def called(nm, needed, files):
    """What is needed of a module, in order."""
    found = {}
    for file in files:
        for name, kind in defined(nm, file).items():
            if name in needed:
                found.setdefault(name, kind)
    data = sorted(name for name, kind in found.items() if kind not in FUNCTIONS)
    if data:
        sys.exit(f"Of a library that is loaded late only functions can be used: {', '.join(data)}")
    return sorted(found)


def write(path, lines):
    """Only what is another text, so that nothing is built anew for what is the same."""
    text = "\n".join([*lines, ""])
    if os.path.exists(path):
        with open(path, encoding="utf-8") as file:
            if file.read() == text:
                return
    with open(path, "w", encoding="utf-8") as file:
        file.write(text)


def module_source(names, digest):
    # The compiler need not know what they are to take their addresses.
    return ["typedef void Function(void);",
            *[f"extern Function {name};" for name in names],
            f"static Function* const functions[] = {{{', '.join(names)}}};",
            "struct LateModule {",
            "    const char* digest;",
            "    Function* const* functions;",
            "};",
            "extern const struct LateModule kddLateModule;",
            '__attribute__((visibility("default")))',
            f'const struct LateModule kddLateModule = {{"{digest}", functions}};']


def main():
    folder, nm, archives, *modules = sys.argv[1:]
    needed = {name for name, kind in symbols(nm, ["--undefined-only"], archives.split(",")) if kind == "U"}
    calls, rows = [], []
    for module in modules:
        library, file, links = module.split("=")
        names = [name for name in called(nm, needed, links.split(",")) if name not in calls]
        digest = hashlib.sha256(" ".join(names).encode()).hexdigest()[:16]
        write(os.path.join(folder, file + ".c"), module_source(names, digest))
        rows.append(f'    {{LateLibrary::{library}, "{file}.so", "{digest}", {len(calls)}, {len(names)}}},')
        calls += names
    write(os.path.join(folder, "LateCalls.S"),
          ['#include "platform/late/LateCall.inc"',
           *[f"late_call {name} {place}" for place, name in enumerate(calls)],
           f"late_calls {len(calls)}"])
    write(os.path.join(folder, "LateTables.cpp"),
          ['#include "platform/late/LateTable.h"',
           "namespace Kdd",
           "{",
           "namespace",
           "{",
           "const LateTable kTables[] = {",
           *rows,
           "};",
           "}  // namespace",
           "const LateTable* const kLateTables = &kTables[0];",
           f"const std::size_t kLateTableCount = {len(rows)};",
           "}  // namespace Kdd"])


if __name__ == "__main__":
    main()
