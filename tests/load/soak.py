#!/usr/bin/env python3
"""Two servers and two workers behind nginx, while clients store, search and read and everything is killed at random.

    tests/load/soak.py KDD PAGE SECONDS [SEED]

PAGE is docs/deployment.md, whose nginx configuration is used. What a client asks for has to succeed, if need be when it
asks once more; at the end whatever was told as stored is there, once, and every tag file is byte for byte what a build
of the same objects in another place makes.
"""
import collections
import email.parser
import http.client
import json
import os
import queue
import random
import shutil
import signal
import ssl
import sys
import tempfile
import threading
import time

sys.dont_write_bytecode = True
from deployedsite import DeployedSite  # noqa: E402

UPLOADERS = 3
READERS = 3
JSON = {"Accept": "application/dicom+json"}
FRAME = {"Accept": 'multipart/related; type="application/octet-stream"; transfer-syntax="*"'}
OBJECT = {"Accept": 'application/dicom; transfer-syntax="*"'}


class Clients:
    """What clients know and have seen, shared by their threads."""

    def __init__(self, site, files, seed):
        self.site, self.seed = site, seed
        self.context = ssl.create_default_context(cafile=site.certificate)
        self.files = queue.Queue()
        for path in files:
            self.files.put(path)
        self.mutex = threading.Lock()
        self.acknowledged = {}  # SOP Instance UID: its study and series
        self.faults = []
        self.counts = collections.Counter()
        self.slowest = collections.Counter()  # [ms]
        self.repeating = 0  # requests that have failed once and are not yet answered
        self.over = threading.Event()

    def fault(self, text):
        with self.mutex:
            self.faults.append(text)

    def random_image(self, randomness):
        with self.mutex:
            if not self.acknowledged:
                return None
            uid = randomness.choice(list(self.acknowledged))
            return (*self.acknowledged[uid], uid)


class Client:
    """One connection, opened anew when it breaks."""

    def __init__(self, clients, number):
        self.all = clients
        self.random = random.Random(clients.seed * 1000 + number)
        self.connection = None

    def once(self, method, path, body, headers):
        try:
            if self.connection is None:
                self.connection = http.client.HTTPSConnection("localhost", self.all.site.port, timeout=60,
                                                              context=self.all.context)
            self.connection.request(method, path, body, headers)
            answer = self.connection.getresponse()
            content = answer.read()
            if answer.status >= 500:
                # nginx reads no further request from where an upload broke off, and does not say so.
                self.connection.close()
                self.connection = None
            return answer.status, answer.headers, content
        except (OSError, http.client.HTTPException) as fault:
            self.connection = None
            return 0, {}, repr(fault).encode()

    def again(self, wait, *request):
        """After a wait [s]. No server is killed from here on: one that began to die when the second attempt began would take
        that one with it, too."""
        with self.all.mutex:
            self.all.repeating += 1
        time.sleep(wait)
        answer = self.once(*request)
        with self.all.mutex:
            self.all.repeating -= 1
        return answer

    def ask(self, kind, path, headers, method="GET", body=None, is_good=lambda status, body: status == 200):
        """The answer, of the second attempt where the first was not good. None, and a fault, where that was not either."""
        began = time.monotonic()
        path = "/dicom-web" + path
        status, got, content = self.once(method, path, body, headers)
        if not is_good(status, content):
            with self.all.mutex:
                self.all.counts[f"{kind}, asked again after {status}"] += 1
            # As the servers ask for where they say so, else as long as they need to be started.
            status, got, content = self.again(float(got.get("Retry-After", 1)), method, path, body, headers)
            if not is_good(status, content):
                self.all.fault(f"{method} {path}: {status} {content[:200]!r} twice")
                return None, None
        with self.all.mutex:
            self.all.counts[kind] += 1
            self.all.slowest[kind] = max(self.all.slowest[kind], int(1000 * (time.monotonic() - began)))
        return got, content


def stored_in(answer):
    """SOP Instance UIDs and addresses of what an answer tells as stored."""
    items = json.loads(answer).get("00081199", {}).get("Value", [])
    return {item["00081155"]["Value"][0]: item["00081190"]["Value"][0] for item in items}


def upload(clients, number):
    client = Client(clients, number)
    while not clients.over.is_set():
        parts = []
        for _ in range(client.random.randint(1, 5)):
            try:
                path = clients.files.get_nowait()
            except queue.Empty:
                break
            # It comes again later: the same object is stored once.
            clients.files.put(path)
            with open(path, "rb") as file:
                parts.append(file.read())
        body = b"".join(b"--cut\r\nContent-Type: application/dicom\r\n\r\n" + part + b"\r\n" for part in parts) + b"--cut--"
        _, answer = client.ask("store", "/studies",
                               dict(JSON, **{"Content-Type": 'multipart/related; type="application/dicom"; boundary=cut'}),
                               "POST", body, lambda status, got: status == 200 and len(stored_in(got)) == len(parts))
        for uid, address in stored_in(answer).items() if answer is not None else ():
            places = address.split("/")
            with clients.mutex:
                clients.acknowledged[uid] = (places[-5], places[-3])
            # At once, from whichever server is asked.
            found(client, (places[-5], places[-3], uid))


def found(client, image):
    study, series, uid = image
    client.ask("search for an image", f"/studies/{study}/instances?SOPInstanceUID={uid}", JSON,
               is_good=lambda status, body: status == 200 and uid.encode() in body)


def read(clients, number):
    client = Client(clients, number)
    frames = {}
    while not clients.over.is_set():
        image = clients.random_image(client.random)
        if image is None:
            clients.over.wait(0.05)
            continue
        study, series, uid = image
        place = f"/studies/{study}/series/{series}/instances/{uid}"
        what = client.random.randrange(6)
        if what == 0:
            client.ask("search for studies", "/studies?includefield=all&limit=50", JSON)
        elif what == 1:
            found(client, image)
        elif what == 2:
            client.ask("metadata of a series", f"/studies/{study}/series/{series}/metadata", JSON,
                       is_good=lambda status, body: status == 200 and isinstance(json.loads(body), list))
        elif what == 3:
            client.ask("metadata of an image", place + "/metadata", JSON,
                       is_good=lambda status, body: status == 200 and uid.encode() in body)
        elif what == 4:
            client.ask("object", place, OBJECT, is_good=lambda status, body: status == 200 and body[128:132] == b"DICM")
        else:
            # Of an object without pixels there is none.
            got, content = client.ask("frame", place + "/frames/1", FRAME, is_good=lambda status, body: status in (200, 404))
            if got is not None and got.get("Content-Type", "").startswith("multipart"):
                whole = email.parser.BytesParser().parsebytes(
                    b"Content-Type: " + got["Content-Type"].encode() + b"\r\n\r\n" + content)
                pixels = whole.get_payload()[0].get_payload(decode=True)
                if frames.setdefault(uid, pixels) != pixels:
                    clients.fault(f"{place}/frames/1 is another one than before")


def kill(clients, randomness, seconds):
    """One at a time, the next one when it is there again, and no server while a request that failed is asked again: on a busy
    machine requests may take longer than servers live."""
    end = time.monotonic() + seconds
    while time.monotonic() < end:
        clients.over.wait(randomness.uniform(0.3, 2.0))
        name = randomness.choice(["server0", "server1", "worker0", "worker1"])
        how = signal.SIGTERM if randomness.random() < 0.2 else signal.SIGKILL
        while not clients.site.signalled(name, how, clients):
            time.sleep(0.02)
        clients.site.end(name, None)
        clients.counts[f"{name[:-1]} {'stopped' if how == signal.SIGTERM else 'killed'}"] += 1
        clients.site.start(name)


def arriving(site):
    """The files of objects that are on their way."""
    return [name for folder, _, names in os.walk(os.path.join(site.store, "objects", ".incoming")) for name in names
            if name.isdigit() and os.path.basename(folder) != "locks"]


def check(site, clients):
    """Of the archive when nothing runs any more."""
    # What the killed ones left half way is looked after by the next server.
    site.start("server0")
    end = time.monotonic() + 60
    while arriving(site) and time.monotonic() < end:
        time.sleep(0.1)
    if site.end("server0") != 0:
        clients.fault("A server does not end in order")
    site.run("build", "--settle", "--quiet")
    site.run("verify", "--all", "--quiet")
    shown = collections.Counter()
    for study in json.loads(site.run("list", "--json"))["studies"]:
        for image in json.loads(site.run("metadata", study["study"])):
            shown[image["00080018"]["Value"][0]] += 1
    lost = set(clients.acknowledged) - set(shown)
    twice = [uid for uid, count in shown.items() if count != 1]
    files = collections.Counter(name for _, _, names in os.walk(os.path.join(site.store, "objects"))
                                for name in names if name.endswith(".dcm"))
    for text, uids in (("Lost", lost), ("Twice", twice), ("Files of one object", [n for n in files if files[n] != 1]),
                       ("Files of nothing", set(n[:-4] for n in files) - set(shown)), ("Left behind", arriving(site))):
        if uids:
            clients.fault(f"{text}: {sorted(uids)[:5]}, {len(uids)} in all")
    other = os.path.join(site.folder, "other")
    elsewhere = {"KDD_STORE": other, "KDD_DATABASE": "sqlite:" + os.path.join(other, "kdd.sqlite")}
    objects = os.path.join(site.store, "objects")
    site.run("index", "--quiet", *(os.path.join(objects, name) for name in sorted(os.listdir(objects)) if name[0] != "."),
             **elsewhere)
    site.run("build", "--quiet", **elsewhere)
    ours, scratch = site.tag_files(), site.tag_files(other)
    differing = [name for name in sorted(set(ours) | set(scratch)) if ours.get(name) != scratch.get(name)]
    if differing or not ours:
        clients.fault(f"Not what a build from scratch makes: {differing[:5]}, {len(differing)} of {len(ours)}")
    return len(shown), len(ours)


def soak(kdd, page, seconds, seed, folder):
    day = os.path.join(folder, "day")
    site = DeployedSite(kdd, page, folder)
    try:
        site.run("sample", day, "--quiet", "--images", str(max(120, min(4000, 15 * seconds))), "--seed", str(seed))
        files = [os.path.join(root, name) for root, _, names in os.walk(day) for name in sorted(names) if ".vol" not in name]
        random.Random(seed).shuffle(files)
        for name in ("server0", "server1", "worker0", "worker1"):
            site.start(name)
        clients = Clients(site, files, seed)
        threads = [threading.Thread(target=upload if number < UPLOADERS else read, args=(clients, number))
                   for number in range(UPLOADERS + READERS)]
        for thread in threads:
            thread.start()
        kill(clients, random.Random(seed), seconds)
        clients.over.set()
        for thread in threads:
            thread.join()
        for name in ("server0", "server1", "worker0", "worker1"):
            if site.end(name) != 0:
                clients.fault(f"{name} does not end in order")
        images, studies = check(site, clients)
    finally:
        site.close()
    for what in sorted(clients.counts):
        slowest = f", the slowest in {clients.slowest[what]} ms" if what in clients.slowest else ""
        print(f"{clients.counts[what]:8} {what}{slowest}")
    print(f"{len(clients.acknowledged):8} objects told as stored, {images} there, in {studies} studies")
    for text in clients.faults[:20]:
        print(text)
    return not clients.faults


def main():
    if len(sys.argv) not in (4, 5):
        raise SystemExit(__doc__)
    if not all(shutil.which(name, path=os.environ["PATH"] + ":/usr/sbin") for name in ("nginx", "openssl", "setpriv")):
        print("Skipped: there is no nginx, openssl or setpriv")
        raise SystemExit(77)
    seed = int(sys.argv[4]) if len(sys.argv) == 5 else 1
    with tempfile.TemporaryDirectory(prefix="kddsoak") as folder:
        is_good = soak(sys.argv[1], sys.argv[2], int(sys.argv[3]), seed, folder)
        if not is_good and os.path.exists(folder):
            shutil.copy(os.path.join(folder, "log"), "soak.log")
    raise SystemExit(0 if is_good else 1)


if __name__ == "__main__":
    main()
