#!/usr/bin/env python3
"""Kills each operation at every call that changes a file, in turn, and has each such call fail in turn.

    crash.py KDD [--database sqlite|postgresql] [--operation NAME]... [--kind CALL]... [--every N] [--folder FOLDER]

A process is killed as it enters the N-th call of its kind (write, truncate, rename, link, lock, remove, flush, send to the
database), for every kind and every N that the operation comes to; then as often the call fails, as on a full disk or a broken
one. What is there afterwards is read: each image has to be as it was before or after, whole, and as after where the operation
ended with 0. Then the operation is repeated, what waits is built, and the archive has to be the same as where nothing happened:
what is told of each image, the lists, and, all studies built again, each tag file byte for byte.

With --every 7 each seventh call is taken. Calls are counted for each thread by itself; strace puts the faults in.
"""
import argparse
import collections
import glob
import json
import os
import shutil
import subprocess
import sys
import tempfile

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "../../bench"))
sys.dont_write_bytecode = True
from servers import start_postgres  # noqa: E402

KINDS = """write pwrite64 writev pwritev rename renameat renameat2 link linkat unlink unlinkat truncate ftruncate fallocate mkdir
mkdirat rmdir fsync fdatasync flock fcntl sendto sync_file_range copy_file_range""".split()

# What a disk answers. Locks and what goes to the database fail otherwise, which other tests look at.
FAULTS = dict.fromkeys("write pwrite64 fallocate mkdir link linkat ftruncate".split(), ["ENOSPC", "EIO"])
FAULTS.update(dict.fromkeys("fsync fdatasync rename unlink".split(), ["EIO"]))

JOB = """<Job><Timestamp>20240131120000</Timestamp><Login>anna</Login><Substitutions%s>
<Tag Group='%s' Element='%s'><Value>%s</Value></Tag></Substitutions></Job>"""

# Undisturbed it ends with `code`.
Operation = collections.namedtuple("Operation", "name before command code", defaults=[0])
OPERATIONS = [
    Operation("first", [], "add DAY"),
    Operation("add", ["index NOTHING"], "add DAY"),
    Operation("index", ["index NOTHING"], "index DAY"),
    Operation("build", ["index DAY"], "build"),
    Operation("merge", ["add MOST"], "add DAY"),
    Operation("settle", ["add MOST", "add DAY"], "build --settle"),
    Operation("rebuild", ["add DAY"], "build --all --again"),
    Operation("stack", ["UNSTACK", "add DAY"], "stack --again"),
    Operation("sync", ["add FIRST", "index DAY"], "sync STUDY"),
    Operation("edit", ["add DAY"], "qa EDIT --study STUDY --image IMAGE --image IMAGE2"),
    Operation("move", ["add DAY"], "qa MOVE --study OTHER --image IMAGE --image IMAGE2"),
    Operation("image", ["add DAY"], "delete STUDY --image IMAGE"),
    Operation("study", ["add DAY"], "delete STUDY"),
    Operation("replace", ["add DAY", "CHANGE"], "add DAY"),
    Operation("vanish", ["add DAY", "REMOVE"], "build --all --again", 1),
]


class Site:
    """An archive at one place, which is put back to what it was before an operation as often as one likes."""

    def __init__(self, kdd, folder, database):
        self.kdd, self.folder = kdd, folder
        self.store, self.kept = os.path.join(folder, "store"), os.path.join(folder, "kept")
        self.day = os.path.join(folder, "day")
        self.postgres = None
        address = "sqlite:" + os.path.join(self.store, "kdd.sqlite")
        if database == "postgresql":
            self.postgres, address = start_postgres(folder)
            self.admin = address.replace("/kdd?", "/postgres?")
        self.environment = dict(os.environ, KDD_STORE=self.store, KDD_DATABASE=address, KDD_SETTLE_SECONDS="3600",
                                LC_ALL="C.UTF-8")
        self.original = os.path.join(folder, "original")
        self.run("sample", os.path.join(folder, "sample"), "--images", "6", "--seed", "5", "--quiet")
        for study in ("CT-1", "MR-1"):
            shutil.copytree(os.path.join(folder, "sample", study), os.path.join(self.original, study))
        self.words = {"DAY": self.day, "FIRST": os.path.join(self.day, "CT-1/2"),
                      # Of a study without volumes, so that the rest is merged.
                      "MOST": os.path.join(self.day, "MR-1/1"), "NOTHING": os.path.join(folder, "nothing")}
        os.mkdir(self.words["NOTHING"])
        self.restore_files()
        self.run("add", self.day, "--quiet")
        (ct, images), (mr, _) = [(each["study"], json.loads(self.run("metadata", each["study"]).stdout)) for each in sorted(
            json.loads(self.run("list", "--json").stdout)["studies"], key=lambda each: each["modalities"])]
        places = sorted((image["00200032"]["Value"], image["00080018"]["Value"][0]) for image in images if "00200032" in image)
        self.words.update(STUDY=ct, OTHER=mr, IMAGE=places[0][1], IMAGE2=places[1][1],
                          EDIT=self.job("edit", JOB % ("", "0010", "0010", "Roe^Richard")),
                          MOVE=self.job("move", JOB % (f" OldSUID='{ct}'", "0020", "000e", "1.2.3.4")))

    def job(self, name, text):
        path = os.path.join(self.folder, name + ".xml")
        with open(path, "w", encoding="utf-8") as file:
            file.write(text)
        return path

    def restore_files(self):
        shutil.rmtree(self.day, ignore_errors=True)
        shutil.copytree(self.original, self.day)

    def sql(self, *commands):
        subprocess.run(["psql", "-q", self.admin, *(word for command in commands for word in ("-c", command))], check=True,
                       stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)

    def begin(self, operation):
        """Empty, but for what has to be there before the operation, and keeps that."""
        self.restore_files()
        shutil.rmtree(self.store, ignore_errors=True)
        if self.postgres:
            self.sql("DROP DATABASE kdd WITH (FORCE)", "CREATE DATABASE kdd")
        for command in operation.before:
            self.prepare(command)
        shutil.rmtree(self.kept, ignore_errors=True)
        os.makedirs(self.store, exist_ok=True)
        shutil.copytree(self.store, self.kept)
        if self.postgres:
            self.sql("DROP DATABASE IF EXISTS kept WITH (FORCE)", "CREATE DATABASE kept TEMPLATE kdd")

    def prepare(self, command):
        if command == "CHANGE":
            self.change_file()
        elif command == "UNSTACK":
            # What others have stacked is not stacked again.
            for path in glob.glob(self.day + "/*/*/*.vol"):
                os.unlink(path)
        elif command == "REMOVE":
            os.unlink(self.some_file())
        elif self.run(*self.arguments(command)).returncode != 0:
            raise SystemExit(f"{command} fails, which has to be done before")

    def some_file(self):
        return os.path.join(self.day, "CT-1/2/IM0002.dcm")

    def change_file(self):
        """As if the image had been sent anew: its description is another one, of the same length."""
        path = self.some_file()
        with open(path, "rb") as file:
            data = file.read()
        at = data.index(b"\x08\x00\x3e\x10LO")
        length = int.from_bytes(data[at + 6:at + 8], "little")
        with open(path, "wb") as file:
            file.write(data[:at + 8] + b"Another".ljust(length)[:length] + data[at + 8 + length:])
        os.utime(path, (1700000000, 1700000000))

    def put_back(self):
        shutil.rmtree(self.store, ignore_errors=True)
        shutil.copytree(self.kept, self.store)
        if self.postgres:
            self.sql("DROP DATABASE kdd WITH (FORCE)", "CREATE DATABASE kdd TEMPLATE kept")

    def arguments(self, command):
        return [self.words.get(word, word) for word in command.split()]

    def run(self, *arguments, strace=()):
        return subprocess.run([*strace, self.kdd, *arguments], env=self.environment, capture_output=True, check=False,
                              timeout=300)

    def heal(self):
        """Builds what waits, and tells all that users can see then, and the bytes of all tag files built again."""
        seen = {"build": self.run("build").returncode, "images": self.images(),
                "verify": self.run("verify", "--all", "--json").stdout,
                "again": self.run("build", "--all", "--again").returncode, "list": self.run("list", "--json").stdout}
        for path in glob.glob(self.store + "/meta/**/*", recursive=True):
            if os.path.isfile(path):
                with open(path, "rb") as file:
                    seen[os.path.relpath(path, self.store)] = file.read()
        return seen

    def images(self):
        """What is told of each image of the studies that are built, by SOP Instance UID."""
        told = {}
        answer = self.run("list", "--json")
        for study in json.loads(answer.stdout)["studies"] if answer.returncode == 0 else []:
            if study["bytes"] == 0:
                continue
            metadata = self.run("metadata", study["study"])
            if metadata.returncode != 0:
                return metadata.stderr.decode()
            told.update((image["00080018"]["Value"][0], image) for image in json.loads(metadata.stdout))
        return told

    def close(self):
        if self.postgres:
            self.postgres.terminate()
            self.postgres.wait()


class Attack:
    """One operation at one site."""

    def __init__(self, site, operation):
        self.site, self.operation = site, operation
        self.arguments = site.arguments(operation.command)
        site.begin(operation)
        self.before = site.images()
        self.calls = self.count_calls()
        if self.code != operation.code:
            raise SystemExit(f"{operation.name} ends with {self.code} when nothing disturbs it")
        self.after = site.images()
        self.again_code = site.run(*self.arguments).returncode
        self.whole = site.heal()
        self.faults = []

    def count_calls(self):
        """Of each kind, at most in one thread, in an undisturbed run."""
        log = os.path.join(self.site.folder, "calls")
        done = self.site.run(*self.arguments, strace=("strace", "-f", "-qq", "-o", log, "-e", "trace=" + ",".join(KINDS)))
        self.code = done.returncode
        counts = collections.Counter()
        with open(log, encoding="utf-8", errors="replace") as lines:
            for line in lines:
                thread, call = line.split(None, 1)
                kind = call.split("(", 1)[0]
                if kind in KINDS:
                    counts[thread, kind] += 1
        most = collections.Counter()
        for (_, kind), count in counts.items():
            most[kind] = max(most[kind], count)
        return most

    def run(self, kind, number, fault):
        """What went wrong, or nothing."""
        self.site.put_back()
        what = "signal=KILL" if fault == "KILL" else "error=" + fault
        done = self.site.run(*self.arguments, strace=(
            "strace", "-f", "-qq", "-o", "/dev/null", "--seccomp-bpf", "-e", "trace=" + kind, "-e",
            f"inject={kind}:{what}:when={number}"))
        if done.returncode not in (0, 1, -9, 137):
            return f"ends with {done.returncode}: {done.stderr.decode()[-300:]}"
        seen = self.site.images()
        if isinstance(seen, str):
            return "a study cannot be read: " + seen
        for uid, image in seen.items():
            if image not in (self.before.get(uid), self.after.get(uid)):
                return f"image {uid} is neither as before nor as after"
        if done.returncode == 0 and seen != self.after:
            return "ended with 0, and has not done all"
        again = self.site.run(*self.arguments)
        if again.returncode not in (self.code, self.again_code):
            return f"the repeat ends with {again.returncode}: {again.stderr.decode()[-300:]}"
        state = self.site.heal()
        differing = [key for key in sorted(set(state) | set(self.whole)) if state.get(key) != self.whole.get(key)]
        return f"after the repeat differ {differing}" if differing else ""

    def all(self, kinds, every):
        runs, index = 0, 0
        for kind in kinds:
            for number in range(1, self.calls[kind] + 1):
                for fault in ["KILL"] + FAULTS.get(kind, []):
                    index += 1
                    if index % every != 0:
                        continue
                    runs += 1
                    wrong = self.run(kind, number, fault)
                    if wrong:
                        self.faults.append(f"{self.operation.name}: {fault} at {kind} {number}: {wrong}")
                        print(self.faults[-1], flush=True)
        return runs


def can_trace():
    return shutil.which("strace") and subprocess.run(["strace", "--seccomp-bpf", "-f", "-o", "/dev/null", "true"],
                                                     stderr=subprocess.DEVNULL, check=False).returncode == 0


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("kdd")
    parser.add_argument("--database", choices=("sqlite", "postgresql"), default="sqlite")
    parser.add_argument("--operation", action="append", choices=[each.name for each in OPERATIONS])
    parser.add_argument("--kind", action="append", choices=KINDS)
    parser.add_argument("--every", type=int, default=1)
    parser.add_argument("--folder")
    wanted = parser.parse_args()
    if not can_trace():
        print("Skipped: there is no strace, or it may not trace here")
        raise SystemExit(77)
    faults = 0
    with tempfile.TemporaryDirectory(prefix="kddcrash", dir=wanted.folder) as folder:
        site = Site(os.path.abspath(wanted.kdd), folder, wanted.database)
        try:
            for operation in OPERATIONS:
                if wanted.operation and operation.name not in wanted.operation:
                    continue
                attack = Attack(site, operation)
                runs = attack.all(wanted.kind or KINDS, wanted.every)
                faults += len(attack.faults)
                print(f"{operation.name}: {sum(attack.calls.values())} calls, {runs} faults put in, {len(attack.faults)} found",
                      flush=True)
        finally:
            site.close()
    raise SystemExit(1 if faults else 0)


if __name__ == "__main__":
    main()
