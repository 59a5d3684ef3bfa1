#!/usr/bin/env python3
"""Puts small faults into the code that decides, one at a time, and looks whether the tests notice.

    mutants.py [COUNT] [--seed N] [--area AREA] [--folder FOLDER]

A copy of the checkout in FOLDER (build/mutants without) is built once. Then COUNT faults, chosen by the seed and as many of
each area, are each put into it, compiled, and the tests that hold the file are run until one fails. What crashes or hangs is
noticed too. What does not compile is no fault, and another one takes its place.

A fault that no test notices is told, and is the failure of the whole run: a test is missing. Or it changes nothing that
anyone could see: then harmless.txt has it with the reason.
"""
import argparse
import collections
import os
import random
import resource
import shutil
import signal
import subprocess
import sys
import tempfile
import time

sys.dont_write_bytecode = True
from operators import mutants_of  # noqa: E402

HERE = os.path.dirname(os.path.abspath(__file__))
CHECKOUT = os.path.dirname(os.path.dirname(HERE))
CORE = "src/core/kddlib/"

# By area: the files, a folder for all in it, and the tests that hold them, quick ones first.
TREE_TESTS = [("tagmodel_test", "*"), ("tagfile_test", "*")]
SEQUENCES = [("archive_test", "ArchiveSequence.*")]
CORRECTION_TESTS = [("corrections_test", "*"), ("tagfile_test", "*"), ("corrected_test", "*")]
AREAS = {
    "placement": ([CORE + "tagmodel/TagMapOptimize.cpp", CORE + "tagmodel/HeldValues.h",
                   CORE + "tagmodel/TagMapTree.cpp", CORE + "tagmodel/OwnAttributes.cpp"], TREE_TESTS + SEQUENCES),
    "merge": ([CORE + "tagfile/StudyMerge.cpp", CORE + "tagfile/StoredStudyMerge.cpp", CORE + "tagfile/StudyTree.cpp",
               CORE + "tagfile/NodeAttributes.cpp"], TREE_TESTS[1:] + CORRECTION_TESTS[:1] + SEQUENCES),
    "correction": ([CORE + "tagfile/qa/"], CORRECTION_TESTS + SEQUENCES),
    "ranges": ([CORE + "net/http/ByteRange.cpp", CORE + "net/http/KxCurlDownloadRequest.cpp",
                CORE + "net/http/KxCurlDownloadMulti.cpp", CORE + "net/http/KxCurlDownloadStreambuf.cpp",
                CORE + "net/http/HeaderReceiver.cpp", CORE + "net/dicom/RemoteFile.cpp"],
               [("dicomurl_test", "*"), ("net_test", "*"), ("archive_test", "ObjectInput.*")]),
    "registering": (["src/platform/database/FileRegistration.cpp", "src/platform/database/CorrectionRows.cpp",
                     CORE + "archive/Registration.cpp"],
                    [("database_test", "*"), ("corrections_test", "*"), ("archive_test", "*"), ("server_test", "StoreTest.*")]),
}

MEMORY = 8 << 30  # [bytes], of a test that a fault makes insatiable
FILE_SIZE = 2 << 30  # [bytes]


class Tree:
    """The copy, and what is built of it."""

    def __init__(self, folder):
        self.folder = os.path.join(folder, "source")
        self.build = os.path.join(self.folder, "build/release")
        self.limits = {}
        listed = subprocess.run(["git", "ls-files", "-z", "--cached", "--others", "--exclude-standard"], cwd=CHECKOUT,
                                capture_output=True, text=True, check=True).stdout.split("\0")
        self.files = [path for path in listed if os.path.isfile(os.path.join(CHECKOUT, path))]

    def update(self):
        """Only what differs is copied, so that the build goes on where it was, and what is gone is removed."""
        for folder, names, files in os.walk(self.folder):
            if folder == self.folder and "build" in names:
                names.remove("build")
            for name in files:
                path = os.path.relpath(os.path.join(folder, name), self.folder)
                if not os.path.exists(os.path.join(CHECKOUT, path)):
                    os.remove(os.path.join(folder, name))
        for path in self.files:
            content = self.original(path)
            if not os.path.exists(self.path(path)) or self.read(path) != content:
                os.makedirs(os.path.dirname(self.path(path)), exist_ok=True)
                shutil.copy(os.path.join(CHECKOUT, path), self.path(path))
        # What costs with each fault is its link: without debug information and without what is made of all objects.
        subprocess.run(["cmake", "--preset", "release", "-DKDD_LATE_LIBRARIES=OFF",
                        f"-DCMAKE_CXX_COMPILER_LAUNCHER={self.path('tests/mutants/compile.sh')}",
                        "-DCMAKE_EXE_LINKER_FLAGS=-fuse-ld=gold -Wl,-S",
                        "-DCMAKE_CXX_ARCHIVE_CREATE=<CMAKE_AR> qcT <TARGET> <LINK_FLAGS> <OBJECTS>"],
                       cwd=self.folder, stdout=subprocess.DEVNULL, check=True)

    def path(self, path):
        return os.path.join(self.folder, path)

    def original(self, path):
        with open(os.path.join(CHECKOUT, path), "rb") as file:
            return file.read()

    def read(self, path):
        with open(self.path(path), "rb") as file:
            return file.read()

    def write(self, path, content):
        with open(self.path(path), "wb") as file:
            file.write(content)

    def make(self, *targets, **environment):
        return subprocess.run(["cmake", "--build", self.build, "--target", *targets], env={**os.environ, **environment},
                              stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True, check=False)

    def passes(self, test, limit):
        """Whether the test passes in time; `limit` [s]."""
        name, chosen = test
        program = next(os.path.join(folder, name) for folder, _, files in os.walk(os.path.join(self.build, "tests"))
                       if name in files)
        scratch = tempfile.mkdtemp(prefix="kdd-mutant")
        os.chmod(scratch, 0o755)  # PostgreSQL runs as somebody else
        environment = {**os.environ, "LC_ALL": "C.UTF-8", "KDD_TEST_DECIMAL_POINT": ".", "TMPDIR": scratch}
        run = subprocess.Popen([program, f"--gtest_filter={chosen}", "--gtest_fail_fast"], cwd=scratch, env=environment,
                               stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL, preexec_fn=bounded)
        try:
            return run.wait(limit) == 0
        except subprocess.TimeoutExpired:
            return False
        finally:
            try:
                os.killpg(run.pid, signal.SIGKILL)
            except ProcessLookupError:
                pass
            run.wait()
            shutil.rmtree(scratch, ignore_errors=True)

    def prove(self, tests):
        """All tests pass as the sources are. How long each may take is told by how long it takes so."""
        made = self.make(*{name for name, _ in tests})
        if made.returncode:
            sys.exit(made.stdout)
        for test in tests:
            started = time.monotonic()
            if not self.passes(test, None):
                sys.exit(f"{test[0]} fails without any fault put in")
            self.limits[test] = 30 + 5 * (time.monotonic() - started)

    def judge(self, mutant, tests):
        """The name of the test that noticed, "" for none, None for what is no fault."""
        original = self.original(mutant.path)
        lines = original.decode().split("\n")
        lines[mutant.line - 1] = mutant.new
        self.write(mutant.path, "\n".join(lines).encode())
        environment = {"KDD_MUTANT": "-w -O0 -g0"}
        try:
            for test in tests:
                if self.make(test[0], **environment).returncode:
                    return None
                if not self.passes(test, self.limits[test]):
                    return test[0]
            return ""
        finally:
            self.write(mutant.path, original)


def bounded():
    os.setsid()
    resource.setrlimit(resource.RLIMIT_AS, (MEMORY, MEMORY))
    resource.setrlimit(resource.RLIMIT_FSIZE, (FILE_SIZE, FILE_SIZE))
    resource.setrlimit(resource.RLIMIT_CORE, (0, 0))


def candidates(tree, places):
    paths = [path for path in tree.files if any(path == place or place.endswith("/") and path.startswith(place) and
                                                path.endswith(".cpp") for place in places)]
    return [mutant for path in paths for mutant in mutants_of(path, tree.original(path).decode())]


def harmless():
    """By file, line as it is and line as it would be: blocks of these three, the lines behind "- " and "+ "."""
    known, path, old = set(), "", ""
    with open(os.path.join(HERE, "harmless.txt"), encoding="utf-8") as file:
        for line in file.read().splitlines():
            if line.startswith("src/"):
                path = line
            elif line.startswith("- "):
                old = line[2:]
            elif line.startswith("+ "):
                known.add((path, old, line[2:]))
    return known


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("count", nargs="?", type=int, default=50)
    parser.add_argument("--seed", type=int, default=random.randrange(1 << 16))
    parser.add_argument("--area", choices=AREAS)
    parser.add_argument("--folder", default=os.path.join(CHECKOUT, "build/mutants"))
    options = parser.parse_args()
    areas = {options.area: AREAS[options.area]} if options.area else AREAS
    print(f"{options.count} faults, seed {options.seed}", flush=True)
    tree = Tree(options.folder)
    tree.update()
    tree.prove(list(dict.fromkeys(test for _, tests in areas.values() for test in tests)))

    known = harmless()
    figures = collections.Counter()
    survivors = []
    for at, (area, (places, tests)) in enumerate(areas.items()):
        wanted = options.count * (at + 1) // len(areas) - options.count * at // len(areas)
        waiting = candidates(tree, places)
        random.Random(options.seed).shuffle(waiting)
        while wanted > 0 and waiting:
            mutant = waiting.pop()
            if (mutant.path, mutant.old.strip(), mutant.new.strip()) in known:
                verdict = "harmless"
            else:
                noticed = tree.judge(mutant, tests)
                if noticed is None:
                    continue
                verdict = "noticed" if noticed else "NOT NOTICED"
            wanted -= 1
            figures[area, verdict] += 1
            text = f"{mutant.path}:{mutant.line}\n- {mutant.old.strip()}\n+ {mutant.new.strip()}"
            print(f"{verdict}, {area}: {text}", flush=True)
            if verdict == "NOT NOTICED":
                survivors.append(text)
    for area in areas:
        print(f"{area}: {figures[area, 'noticed']} noticed, {figures[area, 'harmless']} harmless, "
              f"{figures[area, 'NOT NOTICED']} not noticed")
    if survivors:
        sys.exit("\n\n".join(["\nNo test noticed:", *survivors]))


if __name__ == "__main__":
    main()
