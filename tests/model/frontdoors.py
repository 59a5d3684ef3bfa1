"""The doors of an archive: `kdd`, `kdd serve` over HTTP and associations, and the C interface. Each tells what it was told."""
import contextlib
import hashlib
import http.client
import json
import os
import shutil
import signal
import subprocess
import sys

from dicomfile import bytes_of

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.insert(0, os.path.join(HERE, "../../bench"))
from servers import start_postgres  # noqa: E402

PATIENCE = 120  # [s]
SETTINGS = ["--stow", "--corrections", "--deletions", "--listen", "127.0.0.1:0", "--dicom", "127.0.0.1:0"]


class Database:
    """A database server for one archive after the other; with SQLite none is needed."""

    def __init__(self, kind, folder):
        self.process = None
        if kind == "postgresql":
            self.process, self.address = start_postgres(folder)
            self.admin = self.address.replace("/kdd?", "/postgres?")

    def fresh(self, store):
        if self.process is None:
            return "sqlite:" + os.path.join(store, "kdd.sqlite")
        subprocess.run(["psql", "-q", self.admin, "-c", "DROP DATABASE IF EXISTS kdd WITH (FORCE)", "-c", "CREATE DATABASE kdd"],
                       check=True, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        return self.address

    def close(self):
        if self.process is not None:
            self.process.send_signal(signal.SIGINT)
            self.process.wait()


class Site:
    """An archive in a folder of its own, which is empty at first. Its server runs once it is asked."""

    def __init__(self, kdd, library, folder, database, locales):
        self.kdd, self.library, self.folder = kdd, library, folder
        shutil.rmtree(folder, ignore_errors=True)
        self.store, self.files = os.path.join(folder, "store"), os.path.join(folder, "files")
        self.objects = os.path.join(self.store, "objects")
        for name in ("a", "b"):
            os.makedirs(os.path.join(self.files, name))
        os.makedirs(self.store)
        self.environment = dict(
            os.environ, KDD_STORE=self.store, KDD_DATABASE=database.fresh(self.store), KDD_FREE_SPACE="0",
            KDD_META_FOLDER=os.path.join(self.store, "meta"), KDD_SETTLE_SECONDS="1000000", LC_ALL="C.UTF-8",
            **({"LOCPATH": locales} if locales else {}))
        self.log = open(os.path.join(folder, "log"), "ab")
        self.server = self.link = None
        self.jobs = 0

    def make(self):
        """An archive of nothing."""
        self.run("index", self.files)

    def close(self):
        self.stop(signal.SIGKILL)
        self.log.close()

    # ---- kdd

    def begin(self, *arguments, stderr=subprocess.PIPE, **more):
        return subprocess.Popen([self.kdd, *arguments], env=dict(self.environment, **more), stdout=subprocess.PIPE,
                                stderr=stderr)

    def run(self, *arguments, **more):
        """Exit code, output and messages."""
        return self.finish(self.begin(*arguments, **more), arguments)

    def finish(self, process, arguments):
        out, err = process.communicate(timeout=PATIENCE)
        if process.returncode not in (0, 1):
            raise Difference("kdd %s ends with %d: %s" % (" ".join(arguments), process.returncode, err.decode()[-500:]))
        return process.returncode, out, err.decode()

    def job(self, text):
        self.jobs += 1
        path = os.path.join(self.folder, "job%d" % self.jobs)
        with open(path, "w", encoding="utf-8") as file:
            file.write(text)
        return path

    # ---- the server

    def start(self):
        self.server = self.begin("--json", "serve", *SETTINGS, stderr=self.log)
        said = self.server.stdout.readline()
        if not said:
            raise Difference("the server does not start; see " + self.log.name)
        told = json.loads(said)
        self.dicom, self.port = told["dicom"].rpartition(":")[2], int(told["address"].rpartition(":")[2])

    def stop(self, how=signal.SIGTERM):
        if self.link is not None:
            self.link.close()
        self.link = None
        if self.server is not None:
            self.server.send_signal(how)
            code = self.server.wait(PATIENCE)
            self.server.stdout.close()
            self.server = None
            if how == signal.SIGTERM and code != 0:
                raise Difference("the server ends with %d" % code)

    def set(self, name, value):
        """For every program from now on."""
        self.environment[name] = value
        self.stop()

    def request(self, method, path, body=None, headers=None):
        """Status and content."""
        if self.server is None:
            self.start()
        for attempt in range(2):
            try:
                if self.link is None:
                    self.link = http.client.HTTPConnection("127.0.0.1", self.port, timeout=PATIENCE)
                self.link.request(method, "/dicom-web" + path, body, headers or {"Accept": "application/dicom+json"})
                answer = self.link.getresponse()
                return answer.status, answer.read()
            except (OSError, http.client.HTTPException):
                # One that rested for long is closed by the server.
                self.link = None
                if attempt or self.server.poll() is not None:
                    raise Difference("the server does not answer %s %s" % (method, path)) from None

    def get(self, path):
        """What it says in JSON; none where it does not say 200."""
        status, content = self.request("GET", path)
        return json.loads(content) if status == 200 else None

    def store_by_http(self, file):
        """Whether it is told as stored."""
        return self.request("POST", "/studies", bytes_of(file),
                            {"Content-Type": "application/dicom", "Accept": "application/dicom+json"})[0] == 200

    def store_by_association(self, file):
        if self.server is None:
            self.start()
        path = os.path.join(self.folder, "sent")
        with open(path, "wb") as out:
            out.write(bytes_of(file))
        done = subprocess.run(["storescu", "-v", "-nh", "-aec", "KDD", "127.0.0.1", self.dicom, path], stdout=subprocess.PIPE,
                              stderr=subprocess.STDOUT, timeout=PATIENCE, check=False)
        return b"Received Store Response (Success)" in done.stdout

    def find_by_association(self, study):
        """How many images the study is said to have; none when it is not found."""
        if self.server is None:
            self.start()
        done = subprocess.run(["findscu", "-S", "-aec", "KDD", "-k", "0008,0052=STUDY", "-k", "0020,000D=" + study,
                               "-k", "0020,1208", "127.0.0.1", self.dicom], stdout=subprocess.PIPE, stderr=subprocess.STDOUT,
                              timeout=PATIENCE, check=False)
        for line in done.stdout.decode("latin-1").splitlines():
            if "(0020,1208)" in line and "[" in line and "Find Response" not in line:
                return int(line.split("[", 1)[1].split("]", 1)[0])
        return None

    # ---- the C interface

    def call(self, *arguments):
        """What a function gives to a process of its own, for logging is set up once for each."""
        done = subprocess.run([sys.executable, os.path.join(HERE, "cinterface.py"), self.library,
                               self.environment["KDD_DATABASE"], *arguments], env=self.environment, stdout=subprocess.PIPE,
                              stderr=subprocess.PIPE, timeout=PATIENCE, check=False)
        if done.returncode != 0:
            raise Difference("%s of the C interface ends with %d: %s"
                             % (arguments[0], done.returncode, done.stderr.decode()[-500:]))
        return int(done.stdout)

    # ---- files

    def tag_file(self, study):
        name = hashlib.md5(study.encode() + b"\n").hexdigest()
        return os.path.join(self.environment["KDD_META_FOLDER"], name[:2], name[2:4], name[4:] + ".tc")

    def stored_objects(self):
        return {os.path.join(folder, name) for folder, _, names in os.walk(self.objects) for name in names
                if "/.incoming" not in folder and name.endswith(".dcm")}


class Difference(Exception):
    """Between what is and what should be."""


def content_of(path):
    with contextlib.suppress(OSError), open(path, "rb") as file:
        return file.read()
    return None


def put_content(path, content):
    os.makedirs(os.path.dirname(path), exist_ok=True)
    with open(path, "wb") as file:
        file.write(content)
