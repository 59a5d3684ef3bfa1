#!/usr/bin/env python3
"""Holds the public headers against what the shared library exports: whatever they let a program call can be linked.

usage: interface.py CLANG LIBRARY INCLUDE_FOLDER COMPILER_FLAG...

INCLUDE_FOLDER holds kddlib/ as it is installed.
"""

import json
import os
import subprocess
import sys

NAMESPACES = ("Kdd", "Kxg")
FUNCTIONS = {"FunctionDecl", "CXXMethodDecl", "CXXConstructorDecl", "CXXDestructorDecl", "CXXConversionDecl"}


def functions(node, is_public=True):
    """What a program may call, by mangled name, and whether a header defines it."""
    kind = node.get("kind")
    if kind in ("NamespaceDecl", "LinkageSpecDecl", "CXXRecordDecl") and not node.get("isImplicit"):
        access = "private" if node.get("tagUsed") == "class" else "public"
        for inner in node.get("inner", []):
            access = inner.get("access", access) if inner["kind"] == "AccessSpecDecl" else access
            yield from functions(inner, is_public and access != "private")
    elif kind in FUNCTIONS and is_public and "mangledName" in node and not node.get("isImplicit"):
        has_body = any(inner["kind"] == "CompoundStmt" for inner in node.get("inner", []))
        keys = ("inline", "constexpr", "explicitlyDefaulted", "explicitlyDeleted", "pure")
        yield node["mangledName"], has_body or any(node.get(key) for key in keys)


def syntax_trees(clang, flags, folder, namespace):
    headers = sorted(os.listdir(os.path.join(folder, "kddlib")))
    source = "".join(f"#include <kddlib/{header}>\n" for header in headers)
    command = [clang, "-std=c++17", "-fPIC", "-x", "c++", *flags, f"-I{folder}", "-fsyntax-only",
               "-Xclang", "-ast-dump=json", "-Xclang", f"-ast-dump-filter={namespace}", "-"]
    text = subprocess.run(command, input=source, capture_output=True, text=True, check=True).stdout
    while text.strip():
        tree, end = json.JSONDecoder().raw_decode(text.lstrip())
        text = text.lstrip()[end:]
        # Everything else that the filter finds stands inside one of these.
        if tree.get("kind") == "NamespaceDecl" and tree.get("name") == namespace:
            yield tree


def demangled(names):
    output = subprocess.run(["c++filt"], input="\n".join(names), capture_output=True, text=True, check=True).stdout
    return set(output.splitlines())


def main():
    clang, library, folder, *flags = sys.argv[1:]
    declared = [function for namespace in NAMESPACES for tree in syntax_trees(clang, flags, folder, namespace)
                for function in functions(tree)]
    defined = {name for name, is_defined in declared if is_defined}
    needed = {name for name, _ in declared} - defined
    if len(needed) < 100:
        sys.exit(f"Only {len(needed)} functions were found in {folder}/kddlib")
    symbols = subprocess.run(["nm", "-D", "--defined-only", "--format=posix", library],
                             capture_output=True, text=True, check=True).stdout.splitlines()
    # Of a constructor there are several, by which none is called in the end.
    missing = demangled(needed) - demangled(line.split()[0].split("@")[0] for line in symbols)
    for symbol in sorted(missing):
        print("a header declares, and the library does not export:", symbol)
    sys.exit(1 if missing else 0)


if __name__ == "__main__":
    main()
