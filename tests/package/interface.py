#!/usr/bin/env python3
"""Holds the public headers against what the shared library exports.

usage: interface.py CLANG LIBRARY INCLUDE_FOLDER COMPILER_FLAG...

Whatever a public header lets a program call is exported, whatever is exported stands in a public header, and the types
of what can be called can be had. INCLUDE_FOLDER holds kddlib/ as it is installed.
"""

import json
import os
import re
import subprocess
import sys

NAMESPACES = ("Kdd", "Kxg")

# Types that programs hold and hand on, or give as null, and need not look into.
OPAQUE = {
    "Kdd::KxCurlDownloadStreambuf",
    "Kdd::KxCurlUploadStreambuf",
}

FUNCTIONS = {"FunctionDecl", "CXXMethodDecl", "CXXConstructorDecl", "CXXDestructorDecl", "CXXConversionDecl"}


class Interface:
    """What the public headers declare, by qualified and demangled name."""

    def __init__(self):
        self.declared = {}  # mangled name -> demangled later
        self.callable = {}  # mangled name -> where, of what needs a definition in the library
        self.inline = set()
        self.templates = set()
        self.types = set()
        self.forward = set()
        self.signatures = []  # (qualified name, type) of what is public
        self.scopes = {}  # by the compiler's number of a class, for what is defined outside of it

    def walk(self, node, scope, is_public):
        kind = node.get("kind", "")
        scope = self.scopes.get(node.get("parentDeclContextId"), scope)
        name = "::".join(filter(None, [scope, node.get("name")]))
        self.scopes[node.get("id")] = name
        if kind in ("NamespaceDecl", "LinkageSpecDecl"):
            for inner in node.get("inner", []):
                self.walk(inner, name, True)
        elif kind == "CXXRecordDecl":
            self.record(node, name, is_public)
        elif kind == "EnumDecl":
            # One with a fixed type has all its values at its declaration; without any it is only named.
            (self.types if node.get("inner") else self.forward).add(name)
        elif kind in ("FunctionTemplateDecl", "ClassTemplateDecl"):
            self.templates.add(name)
            self.types.add(name)
        elif kind == "VarDecl" and "mangledName" in node:
            self.declared[node["mangledName"]] = name
        elif kind in FUNCTIONS:
            self.function(node, name, is_public)

    def record(self, node, name, is_public):
        if node.get("isImplicit"):
            return
        if not node.get("completeDefinition"):
            self.forward.add(name)
            return
        self.types.add(name)
        access = "private" if node.get("tagUsed") == "class" else "public"
        for inner in node.get("inner", []):
            if inner["kind"] == "AccessSpecDecl":
                access = inner["access"]
            else:
                self.walk(inner, name, is_public and access != "private")

    def function(self, node, name, is_public):
        if node.get("isImplicit") or "mangledName" not in node:
            return
        mangled = node["mangledName"]
        self.declared[mangled] = name
        if is_public and not node.get("explicitlyDeleted"):
            self.signatures.append((name, node["type"]["qualType"]))
        has_body = any(inner["kind"] == "CompoundStmt" for inner in node.get("inner", []))
        if has_body or node.get("inline") or node.get("constexpr"):
            self.inline.add(mangled)
        elif is_public and not any(node.get(key) for key in ("explicitlyDefaulted", "explicitlyDeleted", "pure")):
            self.callable[mangled] = name


def syntax_trees(clang, flags, folder, namespace):
    headers = sorted(os.listdir(os.path.join(folder, "kddlib")))
    if not headers:
        sys.exit(f"There are no headers in {folder}/kddlib")
    source = "".join(f"#include <kddlib/{header}>\n" for header in headers)
    command = [clang, "-std=c++17", "-fPIC", "-x", "c++", *flags, f"-I{folder}", "-fsyntax-only",
               "-Xclang", "-ast-dump=json", "-Xclang", f"-ast-dump-filter={namespace}", "-"]
    text = subprocess.run(command, input=source, capture_output=True, text=True, check=True).stdout
    decoder = json.JSONDecoder()
    at = 0
    while at < len(text):
        tree, at = decoder.raw_decode(text, at)
        yield tree
        while at < len(text) and text[at].isspace():
            at += 1


def read_headers(clang, folder, flags):
    interface = Interface()
    for namespace in NAMESPACES:
        for tree in syntax_trees(clang, flags, folder, namespace):
            # Everything else that the filter finds stands inside one of these.
            if tree.get("kind") == "NamespaceDecl" and tree.get("name") == namespace:
                interface.walk(tree, "", True)
    return interface


def demangled(names):
    output = subprocess.run(["c++filt"], input="\n".join(names), capture_output=True, text=True, check=True).stdout
    return output.splitlines()


def exported(library):
    lines = subprocess.run(["nm", "-D", "--defined-only", "--format=posix", library],
                           capture_output=True, text=True, check=True).stdout.splitlines()
    return [line.split()[0].split("@")[0] for line in lines]


def undeclared(symbol, interface, declared):
    """Whether a symbol, demangled, belongs to nothing that a header declares."""
    of = re.match(r"(?:typeinfo|typeinfo name|vtable|VTT|guard variable|(?:non-)?virtual thunk) (?:for|to) (.*)",
                  symbol)
    if of and of[1] in interface.types:
        return False
    if (of[1] if of else symbol) in declared:
        return False
    # The instances of a template, which begin with the type they return.
    return not any(re.search(rf"(?:^| ){re.escape(name)}[<(]", symbol) for name in interface.templates)


def main():
    clang, library, folder, *flags = sys.argv[1:]
    interface = read_headers(clang, folder, flags)
    if len(interface.callable) < 100:
        sys.exit(f"Only {len(interface.callable)} functions were found in {folder}/kddlib")
    mangled = exported(library)
    symbols = set(demangled(mangled))
    faults = []

    names = list(interface.callable)
    for symbol in sorted(set(demangled([name for name in names if name not in interface.inline]))):
        if symbol not in symbols:
            faults.append(f"a header declares, and the library does not export: {symbol}")

    declared = set(demangled(list(interface.declared)))
    for symbol in sorted(symbols):
        if "::" in symbol and undeclared(symbol, interface, declared):
            faults.append(f"exported, but no header declares it: {symbol}")

    opaque = interface.forward - interface.types - OPAQUE
    for name, signature in sorted(set(interface.signatures)):
        for kind in opaque:
            if re.search(rf"\b{kind.rpartition('::')[2]}\b", signature):
                faults.append(f"no header defines {kind}, which is named by {name}: {signature}")

    print("\n".join(faults) or f"{len(names)} functions are declared and exported")
    sys.exit(1 if faults else 0)


if __name__ == "__main__":
    main()
