#!/usr/bin/env python3
"""The library beside what would be picked in its place, and beside what nothing can be faster than: whole processes, in
turn, medians.

    bench/peers.py BUILD-FOLDER [SIZES] [ROUNDS] [FOLDER-OF-DICOM-FILES]

CT studies of 100, 1,000, 5,000 and 20,000 images (SIZES, with commas) with some 200 attributes are made, and KDD_TEST_DATA is
read too where it is set. The table is printed and written to docs/benchmark.md with its plots; the figures stand in
BUILD-FOLDER/benchmark/peers.json. Whoever is not installed is named.
"""
import gzip
import json
import os
import shutil
import subprocess
import sys
import tempfile
import time

import contest
from servers import ImageTemplate, ct_slices, free_port, start_kdd, start_peer

SIDE = 64  # rows and columns: it is the headers that are asked for
READING, KEPT, START = "All headers are read", "All attributes of a kept study", "A process starts"
MERGING, SERVING, TRANSFER = "One image is added", "A server answers", "An object is fetched"
PYDICOM = """import os, sys, pydicom
count = 0
for place, _, names in os.walk(sys.argv[1]):
    for name in names:
        try:
            count += len(pydicom.dcmread(os.path.join(place, name), stop_before_pixels=True))
        except pydicom.errors.InvalidDicomError:
            pass
"""


# Where somebody else needs less, and what for.
REASONS = {
    "linked with DCMTK": "it does nothing; the tool has the library, its modules' table and Qt besides",
    "DCMTK, read and forgotten": "it stops there; `add` goes on to rows in a database that wait for the disk, to the tree with what images"
                                 " share, to what searches ask, and to the compressed file",
    "GDCM, read and forgotten": "likewise; it leaves values as they stand, without their kinds, padding and private creators",
    "pydicom, read and forgotten": "`add` decodes and draws a picture of each series besides",
    "gzip of DICOM JSON, simdjson": "`kdd stat` is its start for the most part, and wins where images are many",
    "gzip of JSON with shared values once, simdjson": "it knows one form of text without levels, VRs and bounds; `kdd stat` is its"
                                                      " start for the most part, and wins where images are many",
    "curl": "one connection straight into a file; `kdd get` takes ranges over several, which can be read in order while they"
            " come, goes on where it broke off, and pays where the way is long and not where it is this machine's memory",
    "aria2c, 8 connections": "likewise",
}


def sentence(text):
    return text[0].upper() + text[1:]


class Bench:
    def __init__(self, build, rounds):
        self.build, self.rounds, self.rows, self.sizes, self.absent = build, rounds, [], [], []
        self.kdd = os.path.join(build, "src/tools/kdd/kdd")
        self.folder = tempfile.mkdtemp(prefix="kdd-peers-", dir=os.environ.get("KDD_BENCH_FOLDER"))
        self.pydicom = self.find_pydicom()
        self.slices = ct_slices(self.kdd, self.folder)

    def find_pydicom(self):
        for python in ("/usr/bin/python3", sys.executable):
            if subprocess.run([python, "-c", "import pydicom"], stderr=subprocess.DEVNULL, check=False).returncode == 0:
                return python
        self.absent.append("pydicom (python3-pydicom)")
        return None

    def peer(self, name, package):
        path = os.path.join(self.build, "bench/peers", name)
        if os.path.exists(path):
            return path
        text = "%s (%s)" % (name, package)
        if text not in self.absent:
            self.absent.append(text)
        return None

    def env(self, store):
        return {"KDD_STORE": os.path.join(self.folder, store)}

    def without(self, store):
        return lambda: shutil.rmtree(os.path.join(self.folder, store), ignore_errors=True)

    def run(self, which):
        rows = which.run(self.rounds, self.peer("peer_floor", ""))
        self.rows += rows
        print(contest.table(rows), end="", flush=True)

    # ---- the work

    def start(self):
        which = contest.Contest(START, 1, "process")
        which.enter("kdd --version", [self.kdd, "--version"], kind="ours")
        which.enter("linked with DCMTK", [self.peer("peer_dcmtk", "")])
        which.enter("a process that does nothing", [self.peer("peer_floor", "")], kind="floor")
        self.run(which)

    def read(self, files, count, title=READING, tolerant=()):
        # Of real files some are damaged, which is told.
        which = contest.Contest(title, count, *(("files", True) if tolerant else ()))
        env = self.env("fresh")
        which.enter("kdd add: into database and tag file", [self.kdd, "--quiet", "add", *tolerant, files], env,
                    self.without("fresh"), kind="ours")
        which.enter("kdd index: into the database", [self.kdd, "--quiet", "index", *tolerant, files], env,
                    self.without("fresh"), kind="own")
        which.enter("DCMTK, read and forgotten", [self.peer("peer_dcmtk", ""), files])
        if gdcm := self.peer("peer_gdcm", "libgdcm-dev"):
            which.enter("GDCM, read and forgotten", [gdcm, files])
        if self.pydicom:
            which.enter("pydicom, read and forgotten", [self.pydicom, "-c", PYDICOM, files])
        which.enter("the first 16 KiB of each file", [self.peer("peer_floor", ""), "heads", files], kind="floor")
        self.run(which)

    def keep(self, files, study, count):
        env = self.env("kept")
        subprocess.run([self.kdd, "--quiet", "add", files], env={**os.environ, **env}, check=True)
        whole, shared = self.keep_json(study, env)
        which = contest.Contest(KEPT, count)
        which.enter("kdd stat: read whole", [self.kdd, "stat", study], env, kind="ours")
        which.enter("kdd metadata: and written as DICOM JSON", [self.kdd, "metadata", study], env, kind="own")
        if reader := self.peer("peer_json", "libsimdjson-dev"):
            which.enter("gzip of DICOM JSON, simdjson", [reader, whole])
            which.enter("gzip of JSON with shared values once, simdjson", [reader, shared])
        which.enter("DCMTK, from the files", [self.peer("peer_dcmtk", ""), files])
        which.enter("the gzip of DICOM JSON decompressed", [self.peer("peer_floor", ""), "inflate", whole], kind="floor")
        self.run(which)
        self.weigh(files, count, whole, shared)
        self.add_one(files, study, count, env)

    def keep_json(self, study, env):
        """The study as an array of its images, and with what all images say told once."""
        text = subprocess.run([self.kdd, "metadata", study], env={**os.environ, **env}, stdout=subprocess.PIPE,
                              check=True).stdout
        images = json.loads(text)
        shared = {tag: value for tag, value in images[0].items() if all(each.get(tag) == value for each in images)}
        own = [{tag: value for tag, value in each.items() if tag not in shared} for each in images]
        paths = [os.path.join(self.folder, name) for name in ("whole.json.gz", "shared.json.gz")]
        for path, content in zip(paths, (text, json.dumps({"shared": shared, "images": own}).encode())):
            with gzip.open(path, "wb", 6) as file:
                file.write(content)
        return paths

    def weigh(self, files, count, whole, shared):
        tag_files = [os.path.join(place, name) for place, _, names in os.walk(os.path.join(self.folder, "kept"))
                     for name in names if name.endswith(".tc")]
        pixels = SIDE * SIDE * 2 * count
        headers = sum(os.path.getsize(os.path.join(place, name)) for place, _, names in os.walk(files) for name in names)
        self.sizes.append({"size": count, "tag file": sum(os.path.getsize(path) for path in tag_files),
                           "gzip of JSON with shared values once": os.path.getsize(shared),
                           "gzip of DICOM JSON": os.path.getsize(whole), "headers in the files": headers - pixels})

    def add_one(self, files, study, count, env):
        """Another image comes into the study for each round."""
        folder = os.path.join(self.folder, "more")
        os.makedirs(folder, exist_ok=True)
        template = ImageTemplate(self.slices[0], SIDE)
        taken = iter(range(count, count + 1000))

        def another():
            self.write(template, folder, int(study.rpartition(".")[2]) - 1000000, next(taken))

        which = contest.Contest(MERGING, count, "images in its study")
        which.enter("kdd add", [self.kdd, "--quiet", "add", folder], env, another, kind="ours")
        which.enter("kdd --version, which does nothing", [self.kdd, "--version"], env, kind="floor")
        self.run(which)
        shutil.rmtree(folder)

    def serve(self, files, study, count):
        peer = start_peer(self.folder, files)
        servers = [start_kdd(self.kdd, self.folder.rstrip("/"), env=self.env("kept"))] + ([peer] if peer else [])
        if not peer:
            self.absent.append("Orthanc with its DICOMweb plugin (orthanc orthanc-dicomweb)")
        for name, path in (("study metadata", "/studies/%s/metadata" % study), ("list of studies", "/studies")):
            which = contest.Contest("%s (processor and memory are curl's): %s" % (SERVING, name), count)
            for server in servers:
                which.enter(server.name, ["curl", "-sfo", os.devnull, "-H", "Accept: application/dicom+json",
                                          "http://127.0.0.1:%d%s%s" % (server.port, server.prefix, path)],
                            kind="ours" if server is servers[0] else "peer")
            self.run(which)
        for server in servers:
            server.stop()

    def fetch(self, mib):
        """One object from nginx on this machine."""
        source, target = os.path.join(self.folder, "source"), os.path.join(self.folder, "target")
        os.makedirs(source)
        with open(os.path.join(source, "object"), "wb") as file:
            for _ in range(mib):
                file.write(os.urandom(1 << 20))
        port, config = free_port(), os.path.join(self.folder, "nginx.conf")
        with open(config, "w") as file:
            file.write("daemon off; pid nginx.pid; error_log stderr; events {}\n%s"
                       "http { access_log off; sendfile on; root %s; client_body_temp_path 1; proxy_temp_path 2;"
                       " fastcgi_temp_path 3; uwsgi_temp_path 4; scgi_temp_path 5; server { listen 127.0.0.1:%d; } }\n"
                       % ("user root root;\n" if os.getuid() == 0 else "", source, port))
        nginx = subprocess.Popen(["nginx", "-e", "stderr", "-c", config, "-p", self.folder], stderr=subprocess.DEVNULL)
        time.sleep(1)
        url = "http://127.0.0.1:%d/object" % port

        def empty():
            shutil.rmtree(target, ignore_errors=True)
            os.makedirs(target)

        which = contest.Contest(TRANSFER, mib, "MiB")
        which.enter("kdd get", [self.kdd, "--quiet", "get", "-o", target, url], before=empty, kind="ours")
        which.enter("curl", ["curl", "-sfo", os.path.join(target, "object"), url], before=empty)
        if shutil.which("aria2c"):
            which.enter("aria2c, 8 connections", ["aria2c", "-q", "-x8", "-s8", "-k1M", "-d", target, url], before=empty)
        else:
            self.absent.append("aria2c (aria2)")
        which.enter("the file copied", ["cp", os.path.join(source, "object"), target], before=empty, kind="floor")
        self.run(which)
        nginx.terminate()
        nginx.wait()

    # ---- the data

    def write(self, template, folder, study, number):
        with open(os.path.join(folder, "IM%05d.dcm" % number), "wb") as file:
            file.write(template.head_of(study, 1, number) + bytes(template.pixels))

    def ct(self, study, count):
        folder = os.path.join(self.folder, "ct-%d" % count)
        os.makedirs(folder)
        # Several templates: attributes that differ by image in a true series differ here.
        templates = [ImageTemplate(data, SIDE) for data in self.slices[:20]]
        for number in range(count):
            self.write(templates[number % len(templates)], folder, study, number)
        return folder, templates[0].study(study)

    def behind(self):
        """Of each that needs less time, by how much and why."""
        found = {}
        for row in self.rows:
            if row["kind"] == "peer" and not row["dies"] and row["ratio"] < 0.97:
                found.setdefault(row["who"], []).append("%s (%s, %s)" % (contest.number(row["ratio"]), row["work"].lower(),
                                                                         "{:,} {}".format(row["size"], row["unit"])))
        return ["- **%s**: %s of our time. %s." % (who, "; ".join(where), sentence(REASONS.get(who, "not explained")))
                for who, where in found.items()]

    def report(self, docs):
        target = os.path.join(self.build, "benchmark")
        os.makedirs(target, exist_ok=True)
        contest.save(self.rows, os.path.join(target, "peers.json"))
        plots = [(title, "benchmark-%s.svg" % name) for title, name in ((READING, "reading"), (KEPT, "kept"))
                 if contest.plot([row for row in self.rows if row["work"] == title], title,
                                 os.path.join(docs, "benchmark-%s.svg" % name))]
        text = ("# Benchmark\n\nWritten by `./dev bench peers`: whole processes in turn, medians of %d rounds.\n%s.\n"
                "*Slanted* is what nothing can be faster than. Absent: %s.\n"
                % (self.rounds, contest.machine(), ", ".join(self.absent) or "nobody"))
        text += "\n" + "\n".join("![%s](%s)" % plot for plot in plots) + "\n" if plots else ""
        names = [name for name in self.sizes[0] if name != "size"] if self.sizes else []
        text += "\n## Bytes\n\n| images | %s |\n| --: |%s\n" % (" | ".join(names), " --: |" * len(names))
        for row in self.sizes:
            text += "| {:,} | {} |\n".format(row["size"], " | ".join("{:,}".format(row[name]) for name in names))
        text += "\n## Time and memory\n" + contest.table(self.rows)
        text += "\n## Who is faster\n\n" + ("\n".join(self.behind()) or "Nobody.") + "\n"
        with open(os.path.join(docs, "benchmark.md"), "w") as file:
            file.write(text)
        print("\n" + text.partition("## Time")[0])


def main():
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    sizes = [int(each) for each in (sys.argv[2] if len(sys.argv) > 2 else "100,1000,5000,20000").split(",")]
    given = sys.argv[4:] + ([os.environ["KDD_TEST_DATA"]] if os.environ.get("KDD_TEST_DATA") else [])
    bench = Bench(os.path.abspath(sys.argv[1]), int(sys.argv[3]) if len(sys.argv) > 3 else 5)
    docs = os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), "docs")
    try:
        bench.start()
        for index, count in enumerate(sizes):
            files, study = bench.ct(index, count)
            bench.read(files, count)
            bench.keep(files, study, count)
            if count == 1000:
                bench.serve(files, study, count)
            bench.without("kept")()
            shutil.rmtree(files)
        for folder in given:
            count = sum(len(names) for _, _, names in os.walk(folder))
            bench.read(folder, count, "All headers of real files are read", ("--tolerant",))
        bench.fetch(512)
        bench.report(docs)
    finally:
        shutil.rmtree(bench.folder, ignore_errors=True)


if __name__ == "__main__":
    main()
