"""What is done while the power is cut, and what has to be true of a state that it leaves."""
import collections
import contextlib
import glob
import http.client
import json
import os
import shutil
import signal
import sqlite3
import subprocess
import sys

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "../crash"))
from crash import OPERATIONS, Operation, Site, can_trace  # noqa: E402,F401

JOURNAL_HEADER = 20  # bytes in front of the content
COMMANDS = OPERATIONS + [Operation("restore", ["add DAY", "BACKUP", "qa EDIT --study STUDY --image IMAGE",
                                               "delete STUDY --image IMAGE2", "RESTORE"], "build --restored")]


class PowerSite(Site):
    def prepare(self, command):
        database, kept = os.path.join(self.store, "kdd.sqlite"), os.path.join(self.folder, "backup")
        if command == "BACKUP":
            with contextlib.closing(sqlite3.connect(database)) as source, contextlib.closing(sqlite3.connect(kept)) as target:
                source.backup(target)
        elif command == "RESTORE":
            shutil.copy(kept, database)
        else:
            super().prepare(command)

    def begin(self, operation):
        super().begin(operation)
        if not os.listdir(self.store):
            os.rmdir(self.store)

    def is_database_whole(self):
        path = os.path.join(self.store, "kdd.sqlite")
        if not os.path.exists(path):
            return True
        with contextlib.closing(sqlite3.connect(path)) as database:
            return database.execute("PRAGMA integrity_check").fetchall() == [("ok",)]

    def files(self, pattern):
        found = {}
        for path in glob.glob(os.path.join(self.store, pattern), recursive=True):
            with open(path, "rb") as file:
                found[path] = file.read()
        return found

    def tag_files(self):
        return self.files("meta/**/*.tc")

    def volumes(self):
        return self.files("**/*.vol")

    def objects(self):
        """What arrived, by UID."""
        return {os.path.basename(path)[:-len(".dcm")]: content for path, content in self.files("objects/**/*.dcm").items()}


class Command:
    """An operation of the command line: done when it has ended with 0."""

    def __init__(self, site, operation, is_flushed):
        self.site, self.operation, self.is_flushed = site, operation, is_flushed
        self.counts = collections.Counter()
        self.arguments = (["--flush"] if is_flushed else []) + site.arguments(operation.command)

    def begin(self):
        self.site.begin(self.operation)
        self.before, self.files_before = self.site.images(), self.site.tag_files()

    def record(self, strace):
        code = self.site.run(*self.arguments, strace=strace).returncode
        if code != self.operation.code:
            raise SystemExit(f"{self.operation.name} ends with {code} when nothing disturbs it")

    def note(self, unlinked):
        """What is there where nothing disturbs it."""
        self.after = self.site.images()
        # Each content that a tag file had as a whole: those in between stood in journals.
        self.contents = [*self.files_before.items(), *self.site.tag_files().items()]
        self.contents += [(path[:-len(".journal")], content[JOURNAL_HEADER:]) for path, content in unlinked
                          if path.endswith(".tc.journal")]
        self.volumes = self.site.volumes()
        self.verified = self.site.run("verify", "--all", "--json").stdout
        self.again_code = self.site.run(*self.arguments).returncode
        self.whole = self.site.heal()

    def done_at(self, calls):
        """The numbers of calls after which something was told as done."""
        return [len(calls)] if self.operation.code == 0 else []

    def look(self, done):
        """What is wrong on the state that is there, when so much was told as done; else nothing."""
        seen = self.site.images()
        if not self.site.is_database_whole():
            return "the database is damaged"
        torn = self.torn()
        if self.is_flushed and (torn or isinstance(seen, str)):
            return f"torn: {torn} {seen if isinstance(seen, str) else ''}"
        if torn:
            self.counts["states with a torn tag file"] += 1
            self.counts["of which it could be read"] += not isinstance(seen, str)
        if torn and self.site.run("verify", "--all").returncode == 0:
            return f"verify takes for whole what is torn: {torn}"
        if not isinstance(seen, str):
            for uid, image in seen.items():
                if image not in (self.before.get(uid), self.after.get(uid)):
                    return f"image {uid} is neither as before nor as after"
        if self.is_flushed:
            lost = [uid for uid in self.before if uid in self.after and uid not in seen]
            if lost:
                return f"lost: {lost}"
            if done and seen != self.after:
                return "ended with 0, and is not there"
            if done and self.site.volumes() != self.volumes:
                return "ended with 0, and volumes are not there"
            if done and self.site.run("verify", "--all", "--json").stdout != self.verified:
                return "ended with 0, and verify tells something else"
        again = self.site.run(*self.arguments)
        if self.is_flushed and again.returncode not in (self.operation.code, self.again_code):
            return f"the repeat ends with {again.returncode}: {again.stderr.decode()[-300:]}"
        if not self.is_flushed:
            # What was lost of an end that was told is not known to the database.
            self.site.run("build", "--all")
            self.site.run(*self.arguments)
        state = self.site.heal()
        differing = [key for key in sorted(set(state) | set(self.whole)) if state.get(key) != self.whole.get(key)]
        return f"after the repeat differ {differing}" if differing else ""

    def torn(self):
        """Tag files, their journals applied by those who read them, that are nothing that was ever written as a whole."""
        return [path for path, content in self.site.tag_files().items() if content.strip(b"\0") and not any(
            path == each and content.startswith(whole) for each, whole in self.contents)]


class Arrival:
    """Objects that are sent to a server, each of which is done when its answer was sent; these are flushed always."""

    def __init__(self, site, is_strict):
        self.site, self.is_strict = site, is_strict
        self.counts = collections.Counter()
        files = sorted(glob.glob(site.original + "/*/*/*.dcm"))
        # Alone, and several in one request.
        self.requests = [files[:1], files[1:4], files[4:5], files[5:]]

    def begin(self):
        self.site.begin(Operation("nothing", [], ""))

    def serve(self, requests, strace=()):
        """Has a server take the objects. Whether all was told as stored."""
        command = [*strace, self.site.kdd, "--quiet", "--json", "serve", "--stow", "--listen", "127.0.0.1:0"]
        environment = dict(self.site.environment, KDD_FREE_SPACE="0")
        with subprocess.Popen(command, env=environment, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL) as server:
            said = server.stdout.readline()
            try:
                port = int(json.loads(said)["address"].rpartition(":")[2])
                is_stored = all([self.send(port, each) for each in requests])
            finally:
                # Of strace it is the child that is to end.
                os.kill(child_of(server.pid) if strace else server.pid, signal.SIGTERM)
                server.wait()
        return is_stored and server.returncode == 0

    @staticmethod
    def send(port, paths):
        body = b""
        for path in paths:
            with open(path, "rb") as file:
                body += b"--limit\r\nContent-Type: application/dicom\r\n\r\n" + file.read() + b"\r\n"
        link = http.client.HTTPConnection("127.0.0.1", port, timeout=120)
        link.request("POST", "/dicom-web/studies", body + b"--limit--\r\n", {
            "Content-Type": 'multipart/related; type="application/dicom"; boundary=limit'})
        answer = link.getresponse()
        answer.read()
        link.close()
        return answer.status == 200

    def record(self, strace):
        if not self.serve(self.requests, strace):
            raise SystemExit("objects are refused when nothing disturbs it")

    def note(self, _):
        self.serve(self.requests)
        self.whole = self.site.heal()
        self.objects = self.site.objects()
        self.by_request = []
        for paths in self.requests:
            contents = [open(path, "rb").read() for path in paths]
            self.by_request.append([name for name, content in self.objects.items() if content in contents])
            if len(self.by_request[-1]) != len(paths):
                raise SystemExit("objects are stored as something else")

    @staticmethod
    def done_at(calls):
        return [number for number, call in enumerate(calls, 1) if any(b"HTTP/1.1 200" in each.text for each in call.arguments)]

    def look(self, done):
        if not self.serve([]):
            return "the server does not start"
        if not self.site.is_database_whole():
            return "the database is damaged"
        told = [name for each in self.by_request[:done] for name in each]
        objects = self.site.objects()
        torn = [name for name, content in objects.items() if content not in self.objects.values()]
        if self.is_strict:
            # An object gets its place before it is flushed, and what its name in .incoming is for, which it had before, is to tell
            # of that. Where file systems keep the second name and lose the first, a file is left of which nothing knows.
            torn = [name for name in torn if name in self.site.images()]
        lost = [name for name in told if self.objects[name] not in objects.values()]
        if torn or lost:
            return f"torn: {torn}, told as stored and lost: {lost}"
        self.site.run("build", "--all")
        if any(name not in self.site.images() for name in told):
            return "told as stored and not shown"
        if not self.serve(self.requests):
            return "the repeat is refused"
        state = self.site.heal()
        if not self.is_strict and self.site.objects() != self.objects:
            return "after the repeat the objects are others"
        # Beside such a file the object has another name, which its tag file tells.
        compared = {"images", "verify"} if self.is_strict else set(state) | set(self.whole)
        differing = [key for key in sorted(compared) if state.get(key) != self.whole.get(key)]
        return f"after the repeat differ {differing}" if differing else ""


def child_of(process):
    with open(f"/proc/{process}/task/{process}/children", encoding="ascii") as children:
        return int(children.read().split()[0])
