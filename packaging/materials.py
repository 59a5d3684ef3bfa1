#!/usr/bin/env python3
"""What the built programs stand on, with versions and licences, as a bill of materials (CycloneDX 1.4, JSON).

    packaging/materials.py BUILD-FOLDER

Every Debian package that has a library which the tool, the library, the decoder or one of the modules loads, directly or not, or headers that
are compiled in. Licences are the names that the packages' copyright files give; one that has no such list is told so.
"""
import glob
import json
import os
import re
import subprocess
import sys

HEADERS = ["libboost1.74-dev", "libcli11-dev", "nlohmann-json3-dev"]
DRIVERS = ["libqt5sql5-sqlite", "libqt5sql5-psql"]  # which Qt loads by itself


def lines(*command):
    return subprocess.run(command, check=True, stdout=subprocess.PIPE, text=True).stdout.splitlines()


def built(folder):
    found = [os.path.join(folder, name) for name in ("src/tools/kdd/kdd", "src/core/kddlib/libkdd.so")]
    found += glob.glob(os.path.join(folder, "kddlib/*.so")) + [os.path.join(folder, "kddlib/kdd-decoder")]
    if not all(map(os.path.exists, found)) or len(found) < 3:
        sys.exit(f"{folder} holds no whole build of release")
    return found


def libraries(programs):
    """The real paths of what is loaded, and not built here."""
    found = {os.path.realpath(path) for program in programs for line in lines("ldd", program)
             for path in re.findall(r"(/\S+) \(0x", line)}
    return found - {os.path.realpath(program) for program in programs}


def package_of(path):
    # A system whose /lib leads to /usr/lib knows some files by the shorter name only.
    for name in (path, path.removeprefix("/usr")):
        found = subprocess.run(["dpkg-query", "-S", name], stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, text=True)
        if found.returncode == 0:
            return found.stdout.split(":")[0]
    sys.exit(f"{path} belongs to no package")


def licences(package):
    try:
        with open(f"/usr/share/doc/{package}/copyright", encoding="utf-8") as file:
            text = file.read()
    except OSError:
        return []
    if not text.startswith("Format:"):
        return []
    return sorted({name.strip() for name in re.findall(r"^License: *(\S[^\n]*)", text, re.MULTILINE)})


def component(package):
    version, source = lines("dpkg-query", "-W", "-f=${Version}\n${source:Package}", package)[:2]
    named = [{"license": {"name": name}} for name in licences(package)]
    return {"type": "library", "name": package, "version": version, "group": source,
            "purl": f"pkg:deb/debian/{package}@{version.replace('+', '%2B').replace(':', '%3A')}",
            "licenses": named or [{"license": {"name": f"see /usr/share/doc/{package}/copyright"}}]}


def main():
    if len(sys.argv) != 2:
        sys.exit(__doc__)
    programs = built(sys.argv[1])
    packages = {package_of(path) for path in libraries(programs)}
    packages |= {each for each in HEADERS + DRIVERS if os.path.exists(f"/var/lib/dpkg/info/{each}.list") or
                 glob.glob(f"/var/lib/dpkg/info/{each}:*.list")}
    version = lines(programs[0], "--version")[0].split()[-1]
    json.dump({"bomFormat": "CycloneDX", "specVersion": "1.4", "version": 1,
               "metadata": {"component": {"type": "application", "name": "kdd", "version": version}},
               "components": [component(each) for each in sorted(packages)]}, sys.stdout, indent=1)
    print()


if __name__ == "__main__":
    main()
