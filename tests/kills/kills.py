#!/usr/bin/env python3
"""Sends objects to servers that are killed all the while, and looks at what became of them.

    kills.py KDD [--uploads N] [--senders N] [--servers N] [--seed N] [--database sqlite|postgresql] [--folder FOLDER]

Several servers share one archive. Several senders take what is to be sent from one list, in which some objects stand twice
and some have another one of the same UID, and send again whatever was not told as stored, until it is: half of them by
STOW-RS, half over associations. Some requests are broken off by their sender, some senders killed. Servers, and a worker
that builds what waits, are killed at random moments and started anew. In the end every object that was told as stored has to
be there, once, as it was sent; nothing may be left over; and every tag file has to be byte for byte what a build of all files
makes.

The seed decides what is sent and in which order. When what is killed is a matter of the machine, too.
"""
import argparse
import collections
import hashlib
import http.client
import json
import os
import random
import re
import shutil
import signal
import struct
import subprocess
import sys
import tempfile
import threading
import time

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "../../bench"))
sys.dont_write_bytecode = True
from servers import ImageTemplate, ct_slices, start_postgres  # noqa: E402
from senders import Association, Sender, Stow, object_of  # noqa: E402

SIDE = 64  # rows and columns
IMAGES_PER_SERIES, SERIES_PER_STUDY = 25, 2

Upload = collections.namedtuple("Upload", "study series number content")


def plan(count, seed):
    """What is sent, in order: images of some studies at a time, one of ten twice, one of thirty with another content too."""
    chance = random.Random(seed)
    per_study = IMAGES_PER_SERIES * SERIES_PER_STUDY
    uploads, image = [], 0
    while len(uploads) < count:
        study, place = divmod(image, per_study)
        upload = Upload(study, place // IMAGES_PER_SERIES, place % IMAGES_PER_SERIES, 0)
        uploads.append(upload)
        if chance.random() < 0.1:
            uploads.append(upload)
        if chance.random() < 0.033:
            uploads.append(upload._replace(content=1))
        image += 1
    del uploads[count:]
    # Studies meet, and what comes twice comes at once or later.
    place_of = [at + chance.uniform(0, 4 * per_study) for at in range(count)]
    return collections.deque(uploads[at] for at in sorted(range(count), key=place_of.__getitem__))


class Server:
    """One that is started again after each of its ends, at another port."""

    def __init__(self, archive, name):
        self.archive, self.name, self.port, self.dicom, self.process = archive, name, None, None, None
        self.start()

    def start(self):
        self.process = self.archive.begin("--json", "serve", "--stow", "--listen", "127.0.0.1:0", "--dicom", "127.0.0.1:0",
                                          stdout=subprocess.PIPE)
        said = self.process.stdout.readline()
        if not said:
            raise RuntimeError("%s does not start: see %s" % (self.name, self.archive.log.name))
        self.dicom = json.loads(said)["dicom"].rpartition(":")[2]
        self.port = int(json.loads(said)["address"].rpartition(":")[2])

    def kill(self):
        self.port, self.dicom = None, None
        self.process.kill()
        self.process.wait()
        self.process.stdout.close()

    def stop(self):
        self.process.send_signal(signal.SIGTERM)
        code = self.process.wait()
        self.process.stdout.close()
        if code != 0:
            raise RuntimeError("%s ended with %d" % (self.name, code))


class Archive:
    """A store of its own, and the programs that work on it."""

    def __init__(self, kdd, folder, database):
        self.kdd, self.folder = kdd, folder
        self.env = {**os.environ, "KDD_STORE": self.path("store"), "KDD_FREE_SPACE": "0", "KDD_SETTLE_SECONDS": "2"}
        if database:
            self.env["KDD_DATABASE"] = database
        self.log = open(self.path("log"), "ab")

    def path(self, *names):
        return os.path.join(self.folder, *names)

    def begin(self, *arguments, **options):
        return subprocess.Popen([self.kdd, *arguments], env=self.env, stderr=self.log, **options)

    def run(self, *arguments):
        """What it prints."""
        done = subprocess.run([self.kdd, *arguments], env=self.env, stdout=subprocess.PIPE, stderr=self.log)
        if done.returncode != 0:
            raise Fault("kdd %s ended with %d: %s" % (" ".join(arguments), done.returncode, done.stdout.decode()[-2000:]))
        return done.stdout

    def tag_files(self):
        """A digest of each, by name."""
        digests = {}
        for place, _, names in os.walk(self.path("store", "meta")):
            for name in names:
                if name.endswith(".tc"):
                    with open(os.path.join(place, name), "rb") as file:
                        digests[os.path.join(place, name)] = hashlib.sha256(file.read()).hexdigest()
        return digests


class Fault(Exception):
    """What may not be."""


class Ledger:
    """What was sent, and what was told of it."""

    def __init__(self):
        self.lock = threading.Lock()
        self.sent = collections.defaultdict(set)  # contents, by the image without its content
        self.stored = collections.defaultdict(set)
        self.faults = []
        self.counts = collections.Counter()

    def note(self, upload, outcome):
        with self.lock:
            self.counts[outcome] += 1
            if outcome == "stored":
                self.stored[upload._replace(content=0)].add(upload.content)

    def begin(self, uploads):
        with self.lock:
            self.counts["sent"] += len(uploads)
            for upload in uploads:
                self.sent[upload._replace(content=0)].add(upload.content)

    def fault(self, text):
        with self.lock:
            self.faults.append(text)


class Killer(threading.Thread):
    def __init__(self, archive, servers, ledger, chance):
        super().__init__()
        self.archive, self.servers, self.ledger, self.chance = archive, servers, ledger, chance
        self.ended = threading.Event()

    def run(self):
        worker = None
        try:
            while not self.ended.wait(self.chance.uniform(0.02, 0.8)):
                if worker is not None:
                    worker.kill()
                    worker.wait()
                    worker = None
                    continue
                if self.chance.random() < 0.15:
                    worker = self.archive.begin("--quiet", "build", "--settle", stdout=subprocess.DEVNULL)
                    continue
                server = self.chance.choice(self.servers)
                server.kill()
                self.ledger.counts["kills"] += 1
                self.ended.wait(self.chance.uniform(0, 0.3))
                server.start()
        except Exception as fault:
            self.ledger.fault("the killer ended: %r" % fault)
        if worker is not None:
            worker.wait()


def dataset_of(file):
    """What stands behind the meta information, which is the receiver's own of what comes over an association."""
    return file[144 + struct.unpack_from("<I", file, 140)[0]:]


def look_at_files(archive, template, ledger):
    """Each object that was sent is there once, as it was told; nothing else is."""
    objects = archive.path("store", "objects")
    expected = {}
    for image, stored in ledger.stored.items():
        if len(stored) > 1:
            ledger.fault("two objects of one UID were told as stored: %s" % (image,))
        path = os.path.join(template.study(image.study), template.series(image.study, image.series),
                            template.uid(*image[:3]) + ".dcm")
        expected[path] = dataset_of(object_of(template, image._replace(content=min(stored))))
    for image in ledger.sent:
        if image not in ledger.stored:
            ledger.fault("nobody was told that it is stored, and nobody sends it any more: %s" % (image,))
    for place, folders, names in os.walk(objects):
        if place == objects:
            folders.remove(".incoming")
        for name in names:
            # One that a killed server had put there, of another content, may have had the name without a number.
            path = os.path.relpath(os.path.join(place, re.sub(r"_\d{4}\.dcm$", ".dcm", name)), objects)
            wanted = expected.pop(path, None)
            if wanted is None:
                ledger.fault("nobody was told of %s, or it is there twice" % os.path.join(place, name))
                continue
            with open(os.path.join(place, name), "rb") as file:
                if dataset_of(file.read()) != wanted:
                    ledger.fault("not what was told as stored: " + path)
    for path in expected:
        ledger.fault("told as stored, and lost: " + path)
    left = [name for name in os.listdir(os.path.join(objects, ".incoming")) if name != "locks"]
    if left:
        ledger.fault("left in .incoming: %s" % left)


def look_at_archive(archive, template, ledger):
    """Searches name every object once."""
    server = Server(archive, "the last server")
    studies = collections.defaultdict(list)
    for image in ledger.stored:
        studies[image.study].append(template.uid(*image[:3]))
    link = http.client.HTTPConnection("127.0.0.1", server.port)
    for study, uids in studies.items():
        link.request("GET", "/dicom-web/studies/%s/instances?limit=20000" % template.study(study))
        answer = link.getresponse()
        body = answer.read()
        found = [each["00080018"]["Value"][0] for each in json.loads(body)] if answer.status == 200 else []
        if sorted(found) != sorted(uids):
            ledger.fault("study %s: told as stored %d, found %d, of which %d are other" % (
                template.study(study), len(uids), len(found), len(set(found) ^ set(uids))))
    link.close()
    server.stop()


def look_at_tag_files(archive, ledger):
    """What stands there once everything has settled is what a build of all files makes."""
    archive.run("--quiet", "build", "--all", "--settle")
    archive.run("--quiet", "verify", "--all")
    settled = archive.tag_files()
    archive.run("--quiet", "build", "--all", "--again")
    built = archive.tag_files()
    if len(settled) != len({image.study for image in ledger.stored}):
        ledger.fault("there are %d tag files" % len(settled))
    for name in sorted(settled.keys() | built.keys()):
        if settled.get(name) != built.get(name):
            ledger.fault("another one when it is built from scratch: " + name)


def run(options, folder, database):
    chance = random.Random(options.seed)
    archive = Archive(os.path.abspath(options.kdd), folder, database)
    template = ImageTemplate(ct_slices(archive.kdd, folder)[0], SIDE)
    # What is random in them is the same in each run.
    template.pixels = random.Random(options.seed).randbytes(len(template.pixels))
    uploads = plan(options.uploads, options.seed)
    ledger = Ledger()
    servers = [Server(archive, "server %d" % number) for number in range(options.servers)]
    own = lambda: random.Random(chance.getrandbits(32))
    ways = [Association(template, own(), archive.path("sender%d" % number)) if number % 2 else Stow(template, own())
            for number in range(options.senders)]
    senders = [Sender(way, uploads, servers, ledger, own()) for way in ways]
    killer = Killer(archive, servers, ledger, own())
    start = time.monotonic()
    for thread in [*senders, killer]:
        thread.start()
    for sender in senders:
        sender.join()
    seconds = time.monotonic() - start
    killer.ended.set()
    killer.join()
    for server in servers:
        server.kill()
    # Takes in what those have left that were killed.
    last = Server(archive, "the last server")
    last.stop()
    if not ledger.faults:
        look_at_tag_files(archive, ledger)
        look_at_files(archive, template, ledger)
        look_at_archive(archive, template, ledger)
    told = ", ".join("%s %d" % each for each in sorted(ledger.counts.items()))
    print("%s, seed %d: %d uploads in %.0f s: %s" % (options.database, options.seed, options.uploads, seconds, told))
    return ledger.faults


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n", 1)[0])
    parser.add_argument("kdd")
    for name, default in (("uploads", 1000), ("senders", 6), ("servers", 2), ("seed", 1)):
        parser.add_argument("--" + name, type=int, default=default)
    parser.add_argument("--database", choices=("sqlite", "postgresql"), default="sqlite")
    parser.add_argument("--folder", help="is made, and kept when something is wrong")
    options = parser.parse_args()
    folder = options.folder or tempfile.mkdtemp(prefix="kdd-kills-")
    os.makedirs(folder, exist_ok=True)
    postgres = None
    try:
        database = None
        if options.database == "postgresql":
            postgres, database = start_postgres(folder)
        faults = run(options, folder, database)
    finally:
        if postgres is not None:
            postgres.terminate()
            postgres.wait()
    for fault in faults[:20]:
        print(fault)
    if faults:
        sys.exit("%d faults; everything is left in %s" % (len(faults), folder))
    shutil.rmtree(folder)


if __name__ == "__main__":
    main()
